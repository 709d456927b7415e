#include "json_reader.h"

#include <locale.h>

#include <cmath>
#include <cstdlib>
#include <cstring>
#include <new>

namespace KeloDRCore {
namespace {

constexpr int kMaxDepth = 1000;

bool IsDigit(char c) { return c >= '0' && c <= '9'; }

int HexDigit(char c) {
  if (IsDigit(c)) return c - '0';
  if (c >= 'a' && c <= 'f') return c - 'a' + 10;
  if (c >= 'A' && c <= 'F') return c - 'A' + 10;
  return -1;
}

// `number` comes in as 0.
bool DecodeHex(const char*& at, const char* end, unsigned& number) {
  if (end - at < 4) return false;
  for (int i = 0; i < 4; ++i) {
    const int digit = HexDigit(*at++);
    if (digit < 0) return false;
    number = number * 16 + static_cast<unsigned>(digit);
  }
  return true;
}

// The digits behind "\u", and the second escape of a pair. What follows a high surrogate need not
// be a low one, and a low one may stand alone: JsonCpp does not ask either.
bool DecodeCodePoint(const char*& at, const char* end, unsigned& point) {
  if (!DecodeHex(at, end, point)) return false;
  if (point < 0xD800 || point > 0xDBFF) return true;
  unsigned second = 0;
  if (end - at < 6 || *at++ != '\\' || *at++ != 'u') return false;
  if (!DecodeHex(at, end, second)) return false;
  point = 0x10000 + ((point & 0x3FF) << 10) + (second & 0x3FF);
  return true;
}

void AppendUtf8(std::string& text, unsigned point) {
  const auto append = [&text](unsigned byte) { text += static_cast<char>(byte); };
  const auto tail = [&](int shift) { append(0x80 | ((point >> shift) & 0x3F)); };
  if (point < 0x80) {
    append(point);
  } else if (point < 0x800) {
    append(0xC0 | (point >> 6));
    tail(0);
  } else if (point < 0x10000) {
    append(0xE0 | (point >> 12));
    tail(6);
    tail(0);
  } else {
    append(0xF0 | (point >> 18));
    tail(12);
    tail(6);
    tail(0);
  }
}

bool AppendEscaped(std::string& text, const char*& at, const char* end) {
  static const char kNames[] = "\"/\\bfnrt";
  static const char kBytes[] = "\"/\\\b\f\n\r\t";
  const char name = *at++;
  if (name == 'u') {
    unsigned point = 0;
    if (!DecodeCodePoint(at, end, point)) return false;
    AppendUtf8(text, point);
    return true;
  }
  const char* found = name == '\0' ? nullptr : std::strchr(kNames, name);
  if (found == nullptr) return false;
  text += kBytes[found - kNames];
  return true;
}

// The text between the quotes of a token.
bool DecodeString(const char* at, const char* end, std::string& text) {
  text.clear();
  while (at != end) {
    const char* run = at;
    while (at != end && *at != '\\') ++at;
    text.append(run, at);
    if (at != end && !AppendEscaped(text, ++at, end)) return false;
  }
  return true;
}

bool DecodeString(const char* start, const char* end, Json::Value& value) {
  std::string text;
  if (!DecodeString(start, end, text)) return false;
  value = text;
  return true;
}

locale_t ClassicLocale() {
  const locale_t classic = newlocale(LC_ALL_MASK, "C", nullptr);
  if (classic == nullptr) throw std::bad_alloc();
  return classic;
}

// A number with a fraction, an exponent or too many digits. An overflow is an error, an underflow
// is not.
bool DecodeDouble(const char* start, const char* end, Json::Value& value) {
  // The compiler's own branches: whether it is made already, by whom, and what a failure undoes.
  static const locale_t classic = ClassicLocale();  // GCOVR_EXCL_BR_LINE
  char* stop = nullptr;
  const double number = strtod_l(start, &stop, classic);
  if (stop != end || std::isinf(number)) return false;
  value = number;
  return true;
}

// Integers are kept as such up to the limits of 64 bits; JsonCpp takes a lone minus for 0.
bool DecodeNumber(const char* start, const char* end, Json::Value& value) {
  const bool negative = *start == '-';
  const Json::LargestUInt limit =
      negative ? Json::LargestUInt{1} << 63 : Json::Value::maxLargestUInt;
  Json::LargestUInt number = 0;
  for (const char* at = start + (negative ? 1 : 0); at != end; ++at) {
    if (!IsDigit(*at)) return DecodeDouble(start, end, value);
    const auto digit = static_cast<Json::LargestUInt>(*at - '0');
    if (number > (limit - digit) / 10) return DecodeDouble(start, end, value);
    number = number * 10 + digit;
  }
  if (negative) {
    value = static_cast<Json::LargestInt>(-number);
  } else if (number <= static_cast<Json::LargestUInt>(Json::Value::maxLargestInt)) {
    value = static_cast<Json::LargestInt>(number);
  } else {
    value = number;
  }
  return true;
}

}  // namespace

bool JsonReader::Read(Json::Value& root) {
  SkipByteOrderMark();
  return ReadValue(root, 1) && NextBeyondComments().kind == Kind::kEnd;
}

void JsonReader::SkipSpaces() {
  while (current != end &&
         (*current == ' ' || *current == '\t' || *current == '\r' || *current == '\n')) {
    ++current;
  }
}

void JsonReader::SkipDigits() {
  while (current != end && IsDigit(*current)) ++current;
}

bool JsonReader::SkipWord(const char* word) {
  const size_t length = std::strlen(word);
  if (static_cast<size_t>(end - current) < length) return false;
  if (std::memcmp(current, word, length) != 0) return false;
  current += length;
  return true;
}

bool JsonReader::SkipString() {
  while (current != end) {
    const char c = *current++;
    if (c == '"') return true;
    if (c == '\\') Take();
  }
  return false;
}

bool JsonReader::SkipComment() {
  const char second = Take();
  if (second == '/') {
    while (current != end && *current != '\n' && *current != '\r') ++current;
    return true;
  }
  if (second != '*') return false;
  while (current != end) {
    if (*current++ == '*' && current != end && *current == '/') {
      ++current;
      return true;
    }
  }
  return false;
}

// What stands behind the first digit or the sign; whether it is a number is seen when it is
// decoded.
void JsonReader::SkipNumber() {
  SkipDigits();
  if (current != end && *current == '.') {
    ++current;
    SkipDigits();
  }
  if (current != end && (*current == 'e' || *current == 'E')) {
    ++current;
    if (current != end && (*current == '+' || *current == '-')) ++current;
    SkipDigits();
  }
}

JsonReader::Kind JsonReader::Scan() {
  if (current == end) return Kind::kEnd;
  const auto checked = [](bool ok, Kind kind) { return ok ? kind : Kind::kError; };
  const char c = *current++;
  switch (c) {
    case '{':
      return Kind::kObjectBegin;
    case '}':
      return Kind::kObjectEnd;
    case '[':
      return Kind::kArrayBegin;
    case ']':
      return Kind::kArrayEnd;
    case ':':
      return Kind::kColon;
    case ',':
      return Kind::kComma;
    case '"':
      return checked(SkipString(), Kind::kString);
    case '/':
      return checked(SkipComment(), Kind::kComment);
    case 't':
      return checked(SkipWord("rue"), Kind::kTrue);
    case 'f':
      return checked(SkipWord("alse"), Kind::kFalse);
    case 'n':
      return checked(SkipWord("ull"), Kind::kNull);
    default:
      if (!IsDigit(c) && c != '-' && c != '+') return Kind::kError;
      SkipNumber();
      return Kind::kNumber;
  }
}

JsonReader::Token JsonReader::Next() {
  SkipSpaces();
  Token token = {Kind::kEnd, current, current};
  token.kind = Scan();
  token.end = current;
  return token;
}

JsonReader::Token JsonReader::NextBeyondComments() {
  Token token = Next();
  while (token.kind == Kind::kComment) token = Next();
  return token;
}

bool JsonReader::ReadValue(Json::Value& value, int depth) {
  if (depth > kMaxDepth) return false;
  const Token token = NextBeyondComments();
  switch (token.kind) {
    case Kind::kObjectBegin:
      return ReadObject(value, depth);
    case Kind::kArrayBegin:
      return ReadArray(value, depth);
    case Kind::kNumber:
      return DecodeNumber(token.start, token.end, value);
    case Kind::kString:
      return DecodeString(token.start + 1, token.end - 1, value);
    case Kind::kTrue:
      value = true;
      return true;
    case Kind::kFalse:
      value = false;
      return true;
    case Kind::kNull:
      value = Json::Value::nullSingleton();
      return true;
    default:
      return false;
  }
}

// A comma before the closing brace is accepted, a comment before the colon is not. Behind a comment
// JsonCpp takes any token for the comma.
bool JsonReader::ReadObject(Json::Value& value, int depth) {
  value = Json::Value(Json::objectValue);
  std::string name;
  while (true) {
    const Token first = NextBeyondComments();
    if (first.kind == Kind::kObjectEnd) return true;
    if (first.kind != Kind::kString) return false;
    if (!DecodeString(first.start + 1, first.end - 1, name)) return false;
    if (Next().kind != Kind::kColon) return false;
    if (!ReadValue(value[name], depth + 1)) return false;
    Token separator = Next();
    const bool commented = separator.kind == Kind::kComment;
    if (commented) separator = NextBeyondComments();
    if (separator.kind == Kind::kObjectEnd) return true;
    if (separator.kind != Kind::kComma && !commented) return false;
  }
}

// A comma before the closing bracket is accepted, but no comment right before it or in an empty
// array.
bool JsonReader::ReadArray(Json::Value& value, int depth) {
  value = Json::Value(Json::arrayValue);
  while (true) {
    SkipSpaces();
    if (current != end && *current == ']') {
      ++current;
      return true;
    }
    if (!ReadValue(value.append(Json::Value()), depth + 1)) return false;
    const Token separator = NextBeyondComments();
    if (separator.kind == Kind::kArrayEnd) return true;
    if (separator.kind != Kind::kComma) return false;
  }
}

}  // namespace KeloDRCore
