// Values and records.

#ifndef KELODRCORE_TESTS_MODEL_VALUES_H_
#define KELODRCORE_TESTS_MODEL_VALUES_H_

#include <sqlite3.h>

#include <cstdint>
#include <limits>
#include <map>
#include <optional>
#include <string>
#include <vector>

#include "kelodrcore/sqlite_value.h"
#include "model/twin.h"

namespace Model {

class Value {
 public:
  Value() = default;
  Value(int number) : valid(true), value(number) {}
  Value(bool truth) : valid(true), value(truth) {}
  Value(unsigned int number) : valid(true), value(number) {}
  Value(long number) : valid(true), value(Json::Int64(number)) {}
  Value(unsigned long number) : valid(true), value(Json::UInt64(number)) {}
  Value(long long number) : valid(true), value(Json::Int64(number)) {}
  Value(unsigned long long number) : valid(true), value(Json::UInt64(number)) {}
  Value(const std::string& text) : valid(true), value(text) {}
  Value(const char* text)
      : valid(text != nullptr), value(text ? Json::Value(text) : Json::Value()) {}
  Value(const Value&) = default;

  Value& operator=(const Value& other) {
    value = other.value;
    return *this;
  }

  bool IsValid() const {
    return valid && (value.isString() || value.isBool() || value.isIntegral());
  }

  std::string ToFormatedValue() const {
    if (value.isString()) {
      std::string literal = "'";
      for (const char c : value.asString()) literal += c == '\'' ? "''" : std::string(1, c);
      return literal + "'";
    }
    if (value.isBool()) return value.asBool() ? "1" : "0";
    if (value.isInt()) return std::to_string(value.asInt64());
    if (value.isUInt()) return std::to_string(value.asUInt64());
    return "";
  }

  template <typename T>
  bool GetValue(T& out) const {
    return Read(out) || Warned(Type(out));
  }

  // Whether SQLite has such a value: an integer has 63 bits and a sign.
  bool IsStorable() const { return value.isString() || value.isBool() || value.isInt64(); }

  // Gives a value that can be stored to a statement as it is.
  void Bind(sqlite3_stmt* statement, int place) const {
    if (value.isString()) {
      const std::string text = value.asString();
      sqlite3_bind_text(statement, place, text.data(), static_cast<int>(text.size()),
                        SQLITE_TRANSIENT);
    } else {
      sqlite3_bind_int64(statement, place, value.asInt64());
    }
  }

 private:
  static const char* Type(const bool& /*out*/) { return "bool"; }
  static const char* Type(const std::string& /*out*/) { return "string"; }
  template <typename T>
  static const char* Type(const T& /*out*/) {
    return "int";
  }
  bool Warned(const char* type) const {
    Trace::Log(Warn, "sqlite_value.cpp", "GetValue", "[%s] is not %s", ToText(value).c_str(), type);
    return false;
  }

  bool Read(std::string& out) const {
    if (value.isString()) out = value.asString();
    return value.isString();
  }
  bool Read(bool& out) const {
    const bool isTruth =
        value.isBool() || (value.isInt() && (value.asInt() == 0 || value.asInt() == 1));
    if (isTruth) out = value.asBool();
    return isTruth;
  }
  bool Read(long& out) const {
    if (!value.isInt64()) return false;
    out = static_cast<int32_t>(value.asInt64());
    return true;
  }
  bool Read(unsigned long& out) const {
    if (!value.isUInt64()) return false;
    out = static_cast<uint32_t>(value.asUInt64());
    return true;
  }
  template <typename T>
  bool Read(T& out) const {
    const bool fits = std::is_signed_v<T> ? (sizeof(T) == 4 ? value.isInt() : value.isInt64())
                                          : (sizeof(T) == 4 ? value.isUInt() : value.isUInt64());
    if (fits) {
      out =
          std::is_signed_v<T> ? static_cast<T>(value.asInt64()) : static_cast<T>(value.asUInt64());
    }
    return fits;
  }

  bool valid = false;
  Json::Value value;
};

class ValueList {
 public:
  bool AddValue(const std::string& field, const Value& value) {
    if (field.empty() || !value.IsValid()) {
      Trace::Log(Err, kFile, "AddValue", "Bad Field[%s] or value [%s]", field.c_str(),
                 value.ToFormatedValue().c_str());
      return false;
    }
    const auto found = values.find(field);
    if (found != values.end()) {
      found->second = value;
    } else {
      values.insert({field, value});
    }
    return true;
  }

  ValueList& operator+=(const ValueList& other) {
    for (const auto& [field, value] : std::map(other.values)) AddValue(field, value);
    return *this;
  }

  const Value& GetValue(const std::string& field) const {
    if (field.empty()) {
      Trace::Log(Err, kFile, "GetValue", "Invalid field [%s]", field.c_str());
      return nullValue;
    }
    const auto found = values.find(field);
    if (found != values.end()) return found->second;
    Trace::Log(Warn, kFile, "GetValue", "Failed to find field [%s]", field.c_str());
    return nullValue;
  }

  template <typename T>
  bool GetValue(const std::string& field, T& out) const {
    if (field.empty()) {
      Trace::Log(Err, kFile, "GetValue", "Invalid field [%s]", field.c_str());
      return false;
    }
    const auto found = values.find(field);
    if (found != values.end()) return found->second.GetValue(out);
    Trace::Log(Debug, kFile, "GetValue", "field [%s] is not existed", field.c_str());
    return false;
  }

  bool HasField(const std::string& field) const {
    if (field.empty()) Trace::Log(Err, kFile, "HasField", "Invalid field [%s]", field.c_str());
    return !field.empty() && values.count(field) > 0;
  }

  const std::map<std::string, Value>& GetValues() const { return values; }

  std::string ToStr() const {
    std::string dump;
    for (const auto& [field, value] : values) {
      dump += (dump.empty() ? "" : ", ") + field + ":" + value.ToFormatedValue();
    }
    return dump;
  }

 private:
  static constexpr const char* kFile = "sqlite_value.cpp";
  Value nullValue;
  std::map<std::string, Value> values;
};

}  // namespace Model

using ValueTwin = Twin<KeloDRCore::SqliteValue, Model::Value>;
using ListTwin = Twin<KeloDRCore::SqliteValueList, Model::ValueList>;

// A value of either side; the number behind an empty literal is asked for.
template <typename V>
std::string ShowValue(const V& value) {
  long long number = 0;
  unsigned long long natural = 0;
  std::string shown = Show(value.IsValid()) + " " + value.ToFormatedValue();
  if (value.IsValid() && value.ToFormatedValue().empty()) {
    shown += Show(value.GetValue(number), number) + Show(value.GetValue(natural), natural);
  }
  return shown;
}
template <typename L>
std::string ShowList(const L& list) {
  std::string shown = list.ToStr() + " {";
  for (const auto& [field, value] : list.GetValues()) shown += field + "=" + ShowValue(value) + ";";
  return shown + "}";
}

// Reads a value, or a field of a list when there is a name, as any of the types.
template <typename T, typename From, typename... Field>
std::string ReadAs(const From& from, T out, const Field&... field) {
  const bool isRead = from.GetValue(field..., out);
  return Show(isRead, out);
}
template <typename From, typename... Field>
std::string ReadAs(size_t type, const From& from, const Field&... field) {
  switch (type) {
    case 0:
      return ReadAs(from, false, field...);
    case 1:
      return ReadAs(from, 77, field...);
    case 2:
      return ReadAs(from, 77U, field...);
    case 3:
      return ReadAs(from, 77L, field...);
    case 4:
      return ReadAs(from, 77UL, field...);
    case 5:
      return ReadAs(from, 77LL, field...);
    case 6:
      return ReadAs(from, 77ULL, field...);
    default:
      return ReadAs(from, std::string("old"), field...);
  }
}

// The same value on both sides.
inline ValueTwin DrawValue() {
  static const std::vector<long long> numbers = {
      0,         1,          2,         -1,           7,         100,      INT32_MAX,
      INT32_MIN, UINT32_MAX, 1LL << 32, -(1LL << 40), INT64_MAX, INT64_MIN};
  const auto of = [](const auto& argument) { return ValueTwin{argument, argument}; };
  const long long number = Draw::Of(numbers);
  switch (Draw::Below(10)) {
    case 0:
      return of(static_cast<int>(number));
    case 1:
      return of(number > 0);
    case 2:
      return of(static_cast<unsigned int>(number));
    case 3:
      return of(static_cast<long>(number));
    case 4:
      return of(static_cast<unsigned long>(number));
    case 5:
      return of(number);
    case 6:
      return of(static_cast<unsigned long long>(number));
    case 7:
      return Draw::Once(4) ? ValueTwin{} : of(Draw::Text().c_str());
    default:
      return of(Draw::Text());
  }
}

class Values {
 public:
  void Step() {
    std::optional<ValueTwin>& value = Draw::Once(2) ? first : second;
    ListTwin& list = Draw::Once(2) ? left : right;
    ListTwin& other = Draw::Once(2) ? left : right;
    const std::string field = Draw::Name();
    const size_t type = Draw::Below(8);
    switch (Draw::Below(12)) {
      case 0:
      case 1:
        value.emplace(DrawValue());
        Do("a new value", [&](auto side) { return ShowValue(side(*value)); });
        break;
      case 2:
        Do("assign a value", [&](auto side) {
          side(*first) = side(*second);
          return ShowValue(side(*first));
        });
        break;
      case 3:
        Do("SqliteValue::GetValue", [&](auto side) { return ReadAs(type, side(*value)); });
        break;
      case 4:
      case 5:
      case 6:
        Do("AddValue", [&](auto side) {
          const bool result = side(list).AddValue(field, side(*value));
          return Show(result, ShowList(side(list)));
        });
        break;
      case 7:
        Do("operator+=", [&](auto side) {
          return Show(&(side(list) += side(other)) == &side(list), ShowList(side(list)));
        });
        break;
      case 8:
        Do("GetValue of a name", [&](auto side) { return ShowValue(side(list).GetValue(field)); });
        break;
      case 9:
        Do("GetValue<T> of a name", [&](auto side) { return ReadAs(type, side(list), field); });
        break;
      case 10:
        Do("HasField", [&](auto side) { return Show(side(list).HasField(field)); });
        break;
      default:
        Do("assign a list", [&](auto side) {
          side(list) = side(other);
          return ShowList(side(list));
        });
        if (Draw::Once(2)) list = {};
    }
  }

  // A copy of one of the lists.
  ListTwin AnyList() const { return Draw::Once(2) ? left : right; }

 private:
  std::optional<ValueTwin> first = ValueTwin{};
  std::optional<ValueTwin> second = ValueTwin{};
  ListTwin left;
  ListTwin right;
};

#endif  // KELODRCORE_TESTS_MODEL_VALUES_H_
