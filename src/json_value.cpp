#include "kelodrcore/json_value.h"

#include <charconv>
#include <cmath>
#include <new>
#include <stdexcept>

#include "document_file.h"
#include "json_reader.h"

namespace KeloDRCore::JsonValue {
namespace {

template <typename... Format>
void AppendNumber(std::string& text, Format... format) {
  char buffer[32];
  text.append(buffer, std::to_chars(buffer, buffer + sizeof buffer, format...).ptr);
}

void AppendDouble(std::string& text, double number) {
  if (std::isnan(number)) {
    text += "null";
  } else if (std::isinf(number)) {
    text += number < 0 ? "-1e+9999" : "1e+9999";
  } else {
    const size_t start = text.size();
    AppendNumber(text, number, std::chars_format::general, 17);
    // It must read back as a double.
    if (text.find_first_of(".e", start) == std::string::npos) text += ".0";
  }
}

void AppendEscaped(std::string& text, char c) {
  static const char kBytes[] = "\"\\\b\f\n\r\t";
  static const char kNames[] = "\"\\bfnrt";
  static const char kHex[] = "0123456789abcdef";
  for (size_t i = 0; kBytes[i] != '\0'; ++i) {
    if (kBytes[i] != c) continue;
    text += '\\';
    text += kNames[i];
    return;
  }
  text += "\\u00";
  text += kHex[(c >> 4) & 0xF];
  text += kHex[c & 0xF];
}

void AppendString(std::string& text, const char* at, const char* end) {
  text += '"';
  while (at != end) {
    const char* run = at;
    while (at != end && static_cast<unsigned char>(*at) >= 0x20 && *at != '"' && *at != '\\') ++at;
    text.append(run, at);
    if (at != end) AppendEscaped(text, *at++);
  }
  text += '"';
}

void AppendString(std::string& text, const Json::Value& value) {
  const char* start = nullptr;
  const char* end = nullptr;
  value.getString(&start, &end);
  AppendString(text, start, end);
}

void Append(std::string& text, const Json::Value& value);

void AppendArray(std::string& text, const Json::Value& array) {
  const Json::ArrayIndex size = array.size();
  text += '[';
  for (Json::ArrayIndex i = 0; i < size; ++i) {  // by index: an array may have gaps, which are null
    if (i > 0) text += ',';
    Append(text, array[i]);
  }
  text += ']';
}

void AppendObject(std::string& text, const Json::Value& object) {
  char separator = '{';
  for (auto member = object.begin(); member != object.end(); ++member) {
    const char* end = nullptr;
    const char* name = member.memberName(&end);
    text += separator;
    AppendString(text, name, end);
    text += ':';
    Append(text, *member);
    separator = ',';
  }
  text += object.empty() ? "{}" : "}";
}

void Append(std::string& text, const Json::Value& value) {
  switch (value.type()) {
    case Json::nullValue:
      text += "null";
      break;
    case Json::intValue:
      AppendNumber(text, value.asLargestInt());
      break;
    case Json::uintValue:
      AppendNumber(text, value.asLargestUInt());
      break;
    case Json::realValue:
      AppendDouble(text, value.asDouble());
      break;
    case Json::stringValue:
      AppendString(text, value);
      break;
    case Json::booleanValue:
      text += value.asBool() ? "true" : "false";
      break;
    case Json::arrayValue:
      AppendArray(text, value);
      break;
    default:  // an object
      AppendObject(text, value);
      break;
  }
}

}  // namespace

std::string toString(const Json::Value& value) try {
  std::string text;
  Append(text, value);
  return text;
} catch (const std::length_error&) {
  // A text of 2 GiB, on 32 bits: elsewhere no machine has memory for one that is too long.
  throw std::bad_alloc();  // GCOVR_EXCL_LINE
}

bool fromString(Json::Value& value, const std::string& text) {
  Json::Value parsed;
  try {
    if (!JsonReader(text).Read(parsed)) return false;
  } catch (const Json::Exception&) {
    return false;  // a text or name longer than a value can hold
  }
  value.swap(parsed);
  return true;
}

bool fromFile(Json::Value& value, const std::string& path) {
  return ReadDocument(value, path, Whose::kAnybodys);
}

bool toFile(const Json::Value& value, const std::string& path) {
  return ReplaceDocument(value, path, Whose::kAnybodys);
}

}  // namespace KeloDRCore::JsonValue
