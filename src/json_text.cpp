#include "json_text.h"

#include <json/reader.h>
#include <json/version.h>
#include <json/writer.h>
#include <locale.h>

#include <algorithm>
#include <charconv>
#include <locale>
#include <memory>
#include <new>
#include <sstream>
#include <stdexcept>
#include <string_view>
#include <system_error>

namespace KeloDRCore {
namespace {

constexpr int kLevelsOfText = 1000;
constexpr int kLevelsOfFile = kLevelsOfText + 10;

// The length of the comment with which `text` begins; 0 when there is none, npos for one that does
// not end.
size_t CommentLength(std::string_view text) {
  const std::string_view start = text.substr(0, 2);
  if (start == "//") return std::min(text.find_first_of("\r\n"), text.size());
  if (start != "/*") return 0;
  const size_t end = text.find("*/", 2);
  return end == std::string_view::npos ? end : end + 2;
}

bool IsBlank(std::string_view text) {
  while (true) {
    text.remove_prefix(std::min(text.find_first_not_of(" \t\r\n"), text.size()));
    if (text.empty()) return true;
    const size_t comment = CommentLength(text);
    if (comment == 0 || comment == std::string_view::npos) return false;
    text.remove_prefix(comment);
  }
}

#if JSONCPP_VERSION_HEXA < 0x01090700
// JsonCpp reads numbers in the locale of std::locale::global, where 1.5 may be an error or 15. No
// locale has another meaning for 15e-1: the points are taken out. This section goes away when
// JsonCpp 1.9.7 is required.

std::string NumberWithoutPoint(std::string_view number) {
  const size_t point = number.find('.');
  if (point == std::string_view::npos) return std::string(number);
  const std::string_view fraction =
      number.substr(point + 1, number.find_first_of("eE", point) - point - 1);
  std::string_view exponent = number.substr(point + 1 + fraction.size());
  const std::string digits = std::string(number.substr(0, point)).append(fraction);
  if (exponent.empty()) exponent = "e0";
  const char* const start = exponent.data() + (exponent.substr(1, 1) == "+" ? 2 : 1);
  int power = 0;
  const auto result = std::from_chars(start, exponent.data() + exponent.size(), power);
  // Not a number, or one beyond all fractions.
  if (result.ec != std::errc()) return digits + std::string(exponent);
  return digits + "e" +
         std::to_string(static_cast<long long>(power) - static_cast<long long>(fraction.size()));
}

size_t NumberLength(std::string_view text) {
  const auto skipDigits = [text](size_t at) {
    return std::min(text.find_first_not_of("0123456789", at), text.size());
  };
  const auto isOneOf = [text](size_t at, const char* set) {
    return text.substr(at, 1).find_first_of(set) != std::string_view::npos;
  };
  size_t end = skipDigits(1);
  if (isOneOf(end, ".")) end = skipDigits(end + 1);
  if (isOneOf(end, "eE")) end = skipDigits(end + (isOneOf(end + 1, "+-") ? 2 : 1));
  return end;
}

size_t QuotedLength(std::string_view text) {
  size_t end = 1;
  while (end < text.size() && text[end] != '"') end += text[end] == '\\' ? 2 : 1;
  return std::min(end + 1, text.size());
}

std::string WithoutPoints(std::string_view text) {
  constexpr std::string_view kNumberStart = "0123456789+-";
  std::string result;
  while (!text.empty()) {
    const bool isNumber = kNumberStart.find(text[0]) != std::string_view::npos;
    size_t length = std::max<size_t>(1, CommentLength(text));
    if (text[0] == '"') length = QuotedLength(text);
    if (isNumber) length = NumberLength(text);
    const std::string_view piece = text.substr(0, length);
    if (isNumber) {
      result += NumberWithoutPoint(piece);
    } else {
      result += piece;
    }
    text.remove_prefix(piece.size());
  }
  return result;
}

// `text` itself in the classic locale, otherwise what it was changed to.
std::string_view InAnyLocale(std::string_view text, std::string& changed) {
  if (std::locale() == std::locale::classic()) return text;
  return changed = WithoutPoints(text);
}
#else
std::string_view InAnyLocale(std::string_view text, std::string& /*changed*/) { return text; }
#endif

Json::CharReaderBuilder ReaderSettings(int levels) {
  Json::CharReaderBuilder builder;
  builder["collectComments"] = false;
  builder["skipBom"] = false;
  builder["stackLimit"] = levels;
  return builder;
}

Json::StreamWriterBuilder WriterSettings() {
  Json::StreamWriterBuilder builder;
  builder["commentStyle"] = "None";
  builder["emitUTF8"] = true;
  builder["indentation"] = "";
  builder["precision"] = 17;
  return builder;
}

locale_t NewClassicLocale() {
  const locale_t classic = newlocale(LC_ALL_MASK, "C", nullptr);
  if (classic == nullptr) throw std::bad_alloc();
  return classic;
}

struct Settings {
  const Json::CharReaderBuilder forText = ReaderSettings(kLevelsOfText);
  const Json::CharReaderBuilder forFile = ReaderSettings(kLevelsOfFile);
  const Json::StreamWriterBuilder forWriter = WriterSettings();
  const locale_t classic = NewClassicLocale();
};

const Settings* NewSettings() { return std::make_unique<Settings>().release(); }

// Made once and never destroyed: other destructors may read and write documents when the process
// ends.
const Settings& GetSettings() {
  static const Settings* const settings = NewSettings();  // GCOVR_EXCL_BR_LINE: the guard unwinds
  return *settings;
}

bool Parse(Json::Value& value, std::string_view text, Origin origin) {
  const Settings& settings = GetSettings();
  const auto& builder = origin == Origin::kText ? settings.forText : settings.forFile;
  const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
  return reader->parse(text.data(), text.data() + text.size(), &value, nullptr) &&
         IsBlank(text.substr(static_cast<size_t>(value.getOffsetLimit())));
}

// The C locale of this thread while it lives. JsonCpp has printf write doubles, and knows no
// decimal point but "." and ",".
class PlainNumbers {
 public:
  PlainNumbers() = default;
  PlainNumbers(const PlainNumbers&) = delete;
  PlainNumbers& operator=(const PlainNumbers&) = delete;
  ~PlainNumbers() { uselocale(before); }

 private:
  const locale_t before = uselocale(GetSettings().classic);
};

}  // namespace

bool ParseJson(Json::Value& value, const std::string& text, Origin origin) {
  constexpr std::string_view kByteOrderMark = "\xEF\xBB\xBF";
  // JsonCpp takes a NUL byte for the end of the text.
  if (text.find('\0') != std::string::npos) return false;
  std::string_view document = text;
  // JsonCpp would skip it as well, but its offsets would not count it.
  if (document.substr(0, 3) == kByteOrderMark) document.remove_prefix(3);
  Json::Value parsed;
  std::string changed;
  try {
    if (!Parse(parsed, InAnyLocale(document, changed), origin)) return false;
  } catch (const Json::Exception& error) {
    // Too many levels, or a text or name longer than a value can hold; memory has no type of its
    // own.
    const std::string_view reason = error.what();
    if (reason.find("Failed to allocate") != std::string_view::npos) throw std::bad_alloc();
    return false;
  }
  value.swap(parsed);
  return true;
}

std::string WriteJson(const Json::Value& value) {
  std::ostringstream text;
  text.exceptions(std::ios::badbit);  // otherwise memory that runs out cuts the text
  try {
    const PlainNumbers plain;
    const std::unique_ptr<Json::StreamWriter> writer(GetSettings().forWriter.newStreamWriter());
    writer->write(value, &text);
    return text.str();
  } catch (const std::length_error&) {
    throw std::bad_alloc();  // GCOVR_EXCL_LINE: 2 GiB on 32 bits
  }
}

}  // namespace KeloDRCore
