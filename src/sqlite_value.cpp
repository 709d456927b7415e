#include "kelodrcore/sqlite_value.h"

#include <endian.h>

#include <algorithm>
#include <charconv>
#include <cstdint>
#include <cstring>
#include <utility>

#include "kelodrcore/json_value.h"
#include "log.h"

namespace KeloDRCore {
namespace {

// The one place where integers become JSON: Json::Value has no unambiguous constructor for long or
// long long across 32 and 64 bits.
Json::Value ToJson(long long number) { return Json::Value(static_cast<Json::Int64>(number)); }
Json::Value ToJson(unsigned long long number) {
  return Json::Value(static_cast<Json::UInt64>(number));
}

// Quotes are rare when there is less than one in so many bytes.
constexpr size_t kRare = 64;

// In blocks whose count fits a byte, so that the compiler can take many bytes at a time.
size_t CountQuotes(const char* at, const char* end) {
  size_t count = 0;
  while (at != end) {
    const char* const stop = at + std::min<std::ptrdiff_t>(end - at, 255);
    unsigned char inBlock = 0;
    for (; at != stop; ++at) inBlock = static_cast<unsigned char>(inBlock + (*at == '\''));
    count += inBlock;
  }
  return count;
}

// Run by run, for texts in which quotes are rare.
char* CopyRuns(const char* at, const char* end, char* out) {
  while (const void* const found = std::memchr(at, '\'', static_cast<size_t>(end - at))) {
    const char* const next = static_cast<const char*>(found) + 1;
    out = std::copy(at, next, out);
    *out++ = '\'';
    at = next;
  }
  return std::copy(at, end, out);
}

// Eight bytes at a time: all eight are copied, and those from a quote on once more, a byte farther.
// `out` has room for the result. What is written beyond that of one word is overwritten by the next
// word's, so the last words go byte by byte.
char* CopyWords(const char* at, const char* end, char* out) {
  constexpr uint64_t kLowBits = 0x7F7F7F7F7F7F7F7F;
  constexpr uint64_t kQuotes = 0x2727272727272727;
  constexpr std::ptrdiff_t kWord = sizeof(uint64_t);
  for (; end - at >= 2 * kWord; at += kWord, out += kWord) {
    uint64_t word = 0;
    std::memcpy(&word, at, kWord);
    std::memcpy(out, &word, kWord);
    word = le64toh(word);
    const uint64_t other = word ^ kQuotes;
    uint64_t quotes = ~(((other & kLowBits) + kLowBits) | other | kLowBits);  // their high bits
    for (; quotes != 0; quotes &= quotes - 1) {
      const int place = __builtin_ctzll(quotes) / 8;
      const uint64_t rest = htole64(word >> (8 * place));
      ++out;
      std::memcpy(out + place, &rest, kWord);
    }
  }
  for (; at != end; ++at) {
    *out++ = *at;
    if (*at == '\'') *out++ = '\'';
  }
  return out;
}

// Doubles each quote, byte for byte as a regular expression would; two passes over the bytes cost a
// small part of it.
void AppendQuoted(std::string& text, const char* begin, const char* end) {
  const auto length = static_cast<size_t>(end - begin);
  const void* const first = std::memchr(begin, '\'', length);
  if (first == nullptr) {
    text.reserve(text.size() + length + 2);
    text += '\'';
    text.append(begin, length);
    text += '\'';
    return;
  }
  const size_t quotes = CountQuotes(static_cast<const char*>(first), end);
  const size_t start = text.size();
  text.resize(start + length + quotes + 2);
  char* out = &text[start];
  *out++ = '\'';
  out = quotes * kRare < length ? CopyRuns(begin, end, out) : CopyWords(begin, end, out);
  *out = '\'';
}

template <typename Integer>
void AppendDecimal(std::string& text, Integer number) {
  char digits[24];
  const char* const end = std::to_chars(digits, digits + sizeof(digits), number).ptr;
  text.append(digits, static_cast<size_t>(end - digits));
}

// Convert: true and `out` written when the payload can be read as that type.

bool Convert(const Json::Value& value, int& out) {
  if (!value.isInt()) return false;
  out = value.asInt();
  return true;
}

bool Convert(const Json::Value& value, unsigned int& out) {
  if (!value.isUInt()) return false;
  out = value.asUInt();
  return true;
}

bool Convert(const Json::Value& value, long long& out) {
  if (!value.isInt64()) return false;
  out = value.asLargestInt();
  return true;
}

bool Convert(const Json::Value& value, unsigned long long& out) {
  if (!value.isUInt64()) return false;
  out = value.asLargestUInt();
  return true;
}

bool Convert(const Json::Value& value, long& out) {
  if (!value.isInt64()) return false;
  out = static_cast<int32_t>(value.asLargestInt());
  return true;
}

bool Convert(const Json::Value& value, unsigned long& out) {
  if (!value.isUInt64()) return false;
  out = static_cast<uint32_t>(value.asLargestUInt());
  return true;
}

bool Convert(const Json::Value& value, bool& out) {
  if (!value.isBool() && !(value.isInt() && (value.asInt() == 0 || value.asInt() == 1))) {
    return false;
  }
  out = value.asBool();
  return true;
}

bool Convert(const Json::Value& value, std::string& out) {
  if (!value.isString()) return false;
  out = value.asString();
  return true;
}

template <typename T>
constexpr const char* TypeName() {
  if (std::is_same_v<T, bool>) return "bool";
  return std::is_integral_v<T> ? "int" : "string";
}

template <typename Value>
bool SetField(std::map<std::string, SqliteValue>& values, const std::string& field,
              Value&& fieldValue) {
  if (field.empty() || !fieldValue.IsValid()) {
    KELODR_LOG(ERR, "AddValue", "Bad Field[%s] or value [%s]", field.c_str(),
               fieldValue.ToFormatedValue().c_str());
    return false;
  }
  const auto [place, isNew] = values.try_emplace(field, std::forward<Value>(fieldValue));
  // A failed try_emplace has not moved from its argument.
  if (!isNew) place->second = std::forward<Value>(fieldValue);
  return true;
}

// Logs in the name of `function` when the text cannot name a field.
bool IsName(const std::string& field, const char* function) {
  if (!field.empty()) return true;
  KELODR_LOG(ERR, function, "Invalid field [%s]", field.c_str());
  return false;
}

}  // namespace

SqliteValue::SqliteValue() : valid(false) {}
SqliteValue::SqliteValue(int number) : valid(true), value(number) {}
SqliteValue::SqliteValue(bool truth) : valid(true), value(truth) {}
SqliteValue::SqliteValue(unsigned int number) : valid(true), value(number) {}
SqliteValue::SqliteValue(long number)
    : valid(true), value(ToJson(static_cast<long long>(number))) {}
SqliteValue::SqliteValue(unsigned long number)
    : valid(true), value(ToJson(static_cast<unsigned long long>(number))) {}
SqliteValue::SqliteValue(long long number) : valid(true), value(ToJson(number)) {}
SqliteValue::SqliteValue(unsigned long long number) : valid(true), value(ToJson(number)) {}
SqliteValue::SqliteValue(const std::string& text) : valid(true), value(text) {}
SqliteValue::SqliteValue(const char* text)
    : valid(text != nullptr), value(valid ? Json::Value(text) : Json::Value()) {}

SqliteValue::SqliteValue(const SqliteValue& other) = default;
SqliteValue::SqliteValue(SqliteValue&& other) noexcept = default;
SqliteValue::~SqliteValue() = default;

SqliteValue& SqliteValue::operator=(const SqliteValue& other) {
  value = other.value;
  return *this;
}

SqliteValue& SqliteValue::operator=(SqliteValue&& other) noexcept {
  value = std::move(other.value);
  return *this;
}

bool SqliteValue::IsValid() const {
  return valid && (value.isString() || value.isBool() || value.isIntegral());
}

std::string SqliteValue::ToFormatedValue() const {
  std::string text;
  AppendFormatedValue(text);
  return text;
}

void SqliteValue::AppendFormatedValue(std::string& text) const {
  const Json::ValueType type = value.type();
  if (type == Json::stringValue) {
    const char* begin = nullptr;
    const char* end = nullptr;
    value.getString(&begin, &end);
    AppendQuoted(text, begin, end);
  } else if (type == Json::booleanValue) {
    text += value.asBool() ? '1' : '0';
  } else if (value.isInt()) {
    AppendDecimal(text, value.asLargestInt());
  } else if (value.isUInt()) {
    AppendDecimal(text, value.asLargestUInt());
  }
}

template <typename T>
bool SqliteValue::GetValue(T& out) const {
  if (Convert(value, out)) return true;
  KELODR_LOG(WARN, __func__, "[%s] is not %s", JsonValue::toString(value).c_str(), TypeName<T>());
  return false;
}

SqliteValueList::SqliteValueList() = default;
SqliteValueList::SqliteValueList(const SqliteValueList& other) = default;
SqliteValueList::SqliteValueList(SqliteValueList&& other) noexcept
    : values(std::move(other.values)) {}
SqliteValueList::~SqliteValueList() = default;

SqliteValueList& SqliteValueList::operator=(const SqliteValueList& other) {
  values = other.values;
  return *this;
}

SqliteValueList& SqliteValueList::operator=(SqliteValueList&& other) noexcept {
  values.swap(other.values);  // other than a move, also right for a list given to itself
  return *this;
}

bool SqliteValueList::AddValue(const std::string& field, const SqliteValue& fieldValue) {
  return SetField(values, field, fieldValue);
}

bool SqliteValueList::AddValue(const std::string& field, SqliteValue&& fieldValue) {
  return SetField(values, field, std::move(fieldValue));
}

SqliteValueList& SqliteValueList::operator+=(const SqliteValueList& other) {
  for (const auto& [field, fieldValue] : other.values) AddValue(field, fieldValue);
  return *this;
}

const SqliteValue& SqliteValueList::GetValue(const std::string& field) const {
  if (!IsName(field, __func__)) return nullValue;
  const auto found = values.find(field);
  if (found == values.end()) {
    KELODR_LOG(WARN, __func__, "Failed to find field [%s]", field.c_str());
    return nullValue;
  }
  return found->second;
}

template <typename T>
bool SqliteValueList::GetValue(const std::string& field, T& out) const {
  if (!IsName(field, __func__)) return false;
  const auto found = values.find(field);
  if (found == values.end()) {
    KELODR_LOG(DEBUG, __func__, "field [%s] is not existed", field.c_str());
    return false;
  }
  return found->second.GetValue(out);
}

bool SqliteValueList::HasField(const std::string& field) const {
  if (!IsName(field, __func__)) return false;
  return values.count(field) != 0;
}

std::string SqliteValueList::ToStr() const {
  std::string text;
  for (const auto& [field, fieldValue] : values) {
    if (!text.empty()) text += ", ";
    text += field;
    text += ':';
    fieldValue.AppendFormatedValue(text);
  }
  return text;
}

SqliteValueList SqliteRecord::ToSqliteRecord() const { return ConvertColumns(GetColumns()); }

template KELODR_EXPORT bool SqliteValue::GetValue(bool& out) const;
template KELODR_EXPORT bool SqliteValue::GetValue(int& out) const;
template KELODR_EXPORT bool SqliteValue::GetValue(unsigned int& out) const;
template KELODR_EXPORT bool SqliteValue::GetValue(long& out) const;
template KELODR_EXPORT bool SqliteValue::GetValue(unsigned long& out) const;
template KELODR_EXPORT bool SqliteValue::GetValue(long long& out) const;
template KELODR_EXPORT bool SqliteValue::GetValue(unsigned long long& out) const;
template KELODR_EXPORT bool SqliteValue::GetValue(std::string& out) const;

template KELODR_EXPORT bool SqliteValueList::GetValue(const std::string& field, bool& out) const;
template KELODR_EXPORT bool SqliteValueList::GetValue(const std::string& field, int& out) const;
template KELODR_EXPORT bool SqliteValueList::GetValue(const std::string& field,
                                                      unsigned int& out) const;
template KELODR_EXPORT bool SqliteValueList::GetValue(const std::string& field, long& out) const;
template KELODR_EXPORT bool SqliteValueList::GetValue(const std::string& field,
                                                      unsigned long& out) const;
template KELODR_EXPORT bool SqliteValueList::GetValue(const std::string& field,
                                                      long long& out) const;
template KELODR_EXPORT bool SqliteValueList::GetValue(const std::string& field,
                                                      unsigned long long& out) const;
template KELODR_EXPORT bool SqliteValueList::GetValue(const std::string& field,
                                                      std::string& out) const;

}  // namespace KeloDRCore
