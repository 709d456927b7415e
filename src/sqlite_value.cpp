#include "kelodrcore/sqlite_value.h"

#include <cstdint>
#include <cstring>
#include <utility>

#include "kelodrcore/json_value.h"
#include "log.h"
#include "value_access.h"

namespace KeloDRCore {
namespace {

// The one place where integers become JSON: Json::Value has no unambiguous constructor for long or
// long long across 32 and 64 bits.
Json::Value ToJson(long long number) { return Json::Value(static_cast<Json::Int64>(number)); }
Json::Value ToJson(unsigned long long number) {
  return Json::Value(static_cast<Json::UInt64>(number));
}

// Doubles each quote, byte for byte as replacing with a regular expression would.
void AppendQuoted(std::string& text, const char* at, const char* end) {
  text.reserve(text.size() + static_cast<size_t>(end - at) + 2);
  text += '\'';
  while (const void* const quote = std::memchr(at, '\'', static_cast<size_t>(end - at))) {
    const char* const next = static_cast<const char*>(quote) + 1;
    text.append(at, next);
    text += '\'';
    at = next;
  }
  text.append(at, end);
  text += '\'';
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
  ValueAccess::AppendLiteral(text, *this);
  return text;
}

void ValueAccess::AppendLiteral(std::string& text, const SqliteValue& value) {
  const Json::Value& payload = value.value;
  if (payload.isString()) {
    const char* begin = nullptr;
    const char* end = nullptr;
    payload.getString(&begin, &end);
    AppendQuoted(text, begin, end);
  } else if (payload.isBool()) {
    text += payload.asBool() ? '1' : '0';
  } else if (payload.isInt()) {
    text += std::to_string(payload.asInt());
  } else if (payload.isUInt()) {
    text += std::to_string(payload.asUInt());
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
    ValueAccess::AppendLiteral(text, fieldValue);
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
