#include "kelodrcore/sqlite_value.h"

#include <cstdint>
#include <cstring>
#include <utility>

#include "kelodrcore/json_value.h"
#include "log.h"
#include "value_access.h"

namespace KeloDRCore {
namespace {

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

// Reads a payload that JsonCpp has as a `Stored`. What does not fit in `Kept` is cut off.
template <typename Stored, typename Kept = Stored, typename T>
bool ReadAs(const Json::Value& payload, T& out) {
  if (!payload.is<Stored>()) return false;
  out = static_cast<Kept>(payload.as<Stored>());
  return true;
}

bool ReadPayload(const Json::Value& payload, int& out) { return ReadAs<Json::Int>(payload, out); }
bool ReadPayload(const Json::Value& payload, unsigned int& out) {
  return ReadAs<Json::UInt>(payload, out);
}
bool ReadPayload(const Json::Value& payload, long& out) {
  return ReadAs<Json::Int64, int32_t>(payload, out);
}
bool ReadPayload(const Json::Value& payload, unsigned long& out) {
  return ReadAs<Json::UInt64, uint32_t>(payload, out);
}
bool ReadPayload(const Json::Value& payload, long long& out) {
  return ReadAs<Json::Int64>(payload, out);
}
bool ReadPayload(const Json::Value& payload, unsigned long long& out) {
  return ReadAs<Json::UInt64>(payload, out);
}
bool ReadPayload(const Json::Value& payload, std::string& out) {
  return ReadAs<Json::String>(payload, out);
}
bool ReadPayload(const Json::Value& payload, bool& out) {
  if (payload.isInt() && (payload.asInt() == 0 || payload.asInt() == 1)) {
    out = payload.asInt() == 1;
    return true;
  }
  return ReadAs<bool>(payload, out);
}

template <typename T>
constexpr const char* TypeName() {
  if (std::is_same_v<T, bool>) return "bool";
  return std::is_integral_v<T> ? "int" : "string";
}

// Logs in the name of `function` when there is no name.
bool RequireName(const std::string& field, const char* function) {
  if (!field.empty()) return true;
  KELODR_LOG(ERR, function, "Invalid field [%s]", field.c_str());
  return false;
}

}  // namespace

SqliteValue::SqliteValue() : valid(false) {}
SqliteValue::SqliteValue(int number) : valid(true), value(number) {}
SqliteValue::SqliteValue(bool truth) : valid(true), value(truth) {}
SqliteValue::SqliteValue(unsigned int number) : valid(true), value(number) {}
// Json::Value takes neither a long nor a long long on both 32 and 64 bits.
SqliteValue::SqliteValue(long number) : valid(true), value(Json::Int64{number}) {}
SqliteValue::SqliteValue(unsigned long number) : valid(true), value(Json::UInt64{number}) {}
SqliteValue::SqliteValue(long long number) : valid(true), value(Json::Int64{number}) {}
SqliteValue::SqliteValue(unsigned long long number) : valid(true), value(Json::UInt64{number}) {}
SqliteValue::SqliteValue(const std::string& text) : valid(true), value(text) {}
SqliteValue::SqliteValue(const char* text)
    : valid(text != nullptr), value(valid ? Json::Value(text) : Json::Value()) {}

SqliteValue::SqliteValue(const SqliteValue& other) = default;
SqliteValue::~SqliteValue() = default;

SqliteValue& SqliteValue::operator=(const SqliteValue& other) {
  value = other.value;
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
bool SqliteValue::Read(T& out) const {
  if (ReadPayload(value, out)) return true;
  KELODR_LOG(WARN, "GetValue", "[%s] is not %s", JsonValue::toString(value).c_str(), TypeName<T>());
  return false;
}

SqliteValueList::SqliteValueList() = default;
SqliteValueList::SqliteValueList(const SqliteValueList& other) = default;
SqliteValueList::SqliteValueList(SqliteValueList&& other) noexcept { values.swap(other.values); }
SqliteValueList::~SqliteValueList() = default;

SqliteValueList& SqliteValueList::operator=(const SqliteValueList& other) {
  values = other.values;
  return *this;
}

SqliteValueList& SqliteValueList::operator=(SqliteValueList&& other) noexcept {
  values = std::exchange(other.values, {});
  return *this;
}

bool SqliteValueList::AddValue(const std::string& field, const SqliteValue& fieldValue) {
  if (field.empty() || !fieldValue.IsValid()) {
    KELODR_LOG(ERR, __func__, "Bad Field[%s] or value [%s]", field.c_str(),
               fieldValue.ToFormatedValue().c_str());
    return false;
  }
  values.insert_or_assign(field, fieldValue);
  return true;
}

SqliteValueList& SqliteValueList::operator+=(const SqliteValueList& other) {
  for (const auto& [field, fieldValue] : other.values) AddValue(field, fieldValue);
  return *this;
}

const SqliteValue& SqliteValueList::GetValue(const std::string& field) const {
  if (!RequireName(field, __func__)) return nullValue;
  const auto found = values.find(field);
  if (found != values.end()) return found->second;
  KELODR_LOG(WARN, __func__, "Failed to find field [%s]", field.c_str());
  return nullValue;
}

const SqliteValue* SqliteValueList::FindForReading(const std::string& field) const {
  if (!RequireName(field, "GetValue")) return nullptr;
  const auto found = values.find(field);
  if (found != values.end()) return &found->second;
  KELODR_LOG(DEBUG, "GetValue", "field [%s] is not existed", field.c_str());
  return nullptr;
}

bool SqliteValueList::HasField(const std::string& field) const {
  if (!RequireName(field, __func__)) return false;
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

template KELODR_EXPORT bool SqliteValue::Read(bool& out) const;
template KELODR_EXPORT bool SqliteValue::Read(int& out) const;
template KELODR_EXPORT bool SqliteValue::Read(unsigned int& out) const;
template KELODR_EXPORT bool SqliteValue::Read(long& out) const;
template KELODR_EXPORT bool SqliteValue::Read(unsigned long& out) const;
template KELODR_EXPORT bool SqliteValue::Read(long long& out) const;
template KELODR_EXPORT bool SqliteValue::Read(unsigned long long& out) const;
template KELODR_EXPORT bool SqliteValue::Read(std::string& out) const;

}  // namespace KeloDRCore
