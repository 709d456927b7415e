/// @file
/// Typed SQL values and the records made of them.
///
/// Deliberate, and frozen because callers and databases rely on it: assignment leaves a value's
/// validity alone, integers outside 32 bits are rendered as the empty text, and names keep their
/// spelling (`ToFormatedValue`).

#ifndef KELODRCORE_SQLITE_VALUE_H_
#define KELODRCORE_SQLITE_VALUE_H_

#include <json/json.h>

#include <map>
#include <string>
#include <type_traits>
#include <vector>

#include "kelodrcore/export.h"

namespace KeloDRCore {

/// One typed SQL value. Its payload is a JSON value, whose JSON type is the value's type.
///
/// There is no value for a real number and none for NULL: a default-constructed value marks the
/// absence of a value. A value is copied and never moved from.
class KELODR_EXPORT SqliteValue {
 public:
  /// No value: invalid, and rendered as the empty text.
  SqliteValue();

  // NOLINTBEGIN(google-explicit-constructor)
  /// A value of the argument's type. Implicit: a literal can stand wherever a value is asked for.
  /// @{
  SqliteValue(int number);
  SqliteValue(bool truth);
  SqliteValue(unsigned int number);
  SqliteValue(long number);
  SqliteValue(unsigned long number);
  SqliteValue(long long number);
  SqliteValue(unsigned long long number);
  SqliteValue(const std::string& text);
  /// @}

  /// The text up to its terminating NUL. A null pointer gives no value, as the default constructor.
  SqliteValue(const char* text);

  /// Other pointers would turn into a bool.
  template <typename T, typename = std::enable_if_t<!std::is_same_v<std::remove_const_t<T>, char>>>
  SqliteValue(T* pointer) = delete;

  /// Real numbers would lose their fraction.
  SqliteValue(double number) = delete;
  // NOLINTEND(google-explicit-constructor)

  /// Copies payload and validity.
  SqliteValue(const SqliteValue& other);

  ~SqliteValue();

  /// Copies the payload only. The validity stays: a default-constructed value stays invalid.
  SqliteValue& operator=(const SqliteValue& other);

  /// True when the value was constructed from something and its payload is a text, a bool or an
  /// integer.
  [[nodiscard]] bool IsValid() const;

  /// The SQL literal of the payload; validity is not asked. A text stands in single quotes, with
  /// every single quote in it doubled and nothing else escaped. A bool is "1" or "0". An integer
  /// within 32 bits, signed or unsigned, is written in decimal. Everything else is the empty text.
  [[nodiscard]] std::string ToFormatedValue() const;

  /// Reads the payload into `out`; validity is not asked. T is `bool`, `int`, `unsigned int`,
  /// `long`, `unsigned long`, `long long`, `unsigned long long` or `std::string`.
  ///
  /// An integer type takes any integer that fits it; `long` and `unsigned long` take any 64-bit
  /// integer of their sign and keep its low 32 bits. `bool` takes a bool and the integers 0 and 1.
  /// On failure the result is false, `out` is untouched, and a line at WARN is logged ("[...] is
  /// not int", "... bool" or "... string").
  template <typename T>
  bool GetValue(T& out) const {
    static_assert(kIsReadable<T>,
                  "GetValue reads bool, int, unsigned int, long, unsigned long, long long, "
                  "unsigned long long and std::string");
    return Read(out);
  }

 private:
  friend class ValueAccess;  // reads payloads and appends literals for the library's sources

  template <typename T>
  static constexpr bool kIsReadable =
      std::is_same_v<T, bool> || std::is_same_v<T, int> || std::is_same_v<T, unsigned int> ||
      std::is_same_v<T, long> || std::is_same_v<T, unsigned long> || std::is_same_v<T, long long> ||
      std::is_same_v<T, unsigned long long> || std::is_same_v<T, std::string>;

  template <typename T>
  bool Read(T& out) const;

  bool valid;
  Json::Value value;
};

/// A record: field names and their values, ordered byte by byte by name. Each name stands in it at
/// most once.
class KELODR_EXPORT SqliteValueList {
 public:
  /// An empty record.
  SqliteValueList();

  /// Copies the fields, or takes them: a record that was moved from is empty.
  /// @{
  SqliteValueList(const SqliteValueList& other);
  SqliteValueList(SqliteValueList&& other) noexcept;
  SqliteValueList& operator=(const SqliteValueList& other);
  SqliteValueList& operator=(SqliteValueList&& other) noexcept;
  /// @}

  virtual ~SqliteValueList();

  /// Sets a field; an earlier value of that name is replaced. False for an empty name or an invalid
  /// value, with a line at ERR; the record is then unchanged.
  bool AddValue(const std::string& field, const SqliteValue& fieldValue);

  /// Adds every field of `other` with `AddValue`. Failures are only logged.
  SqliteValueList& operator+=(const SqliteValueList& other);

  /// The value of a field. For an empty name (a line at ERR) or a missing field (a line at WARN) a
  /// reference to an invalid value that lives as long as the record.
  const SqliteValue& GetValue(const std::string& field) const;

  /// Reads a field into `out` as `SqliteValue::GetValue` does, for the same types. An empty name (a
  /// line at ERR) or a missing field (a line at DEBUG) gives false too, with `out` untouched.
  template <typename T>
  bool GetValue(const std::string& field, T& out) const {
    const SqliteValue* const found = FindForReading(field);
    return found != nullptr && found->GetValue(out);
  }

  /// True when the field is there. False for an empty name, with a line at ERR.
  bool HasField(const std::string& field) const;

  /// All fields and their values.
  [[nodiscard]] const std::map<std::string, SqliteValue>& GetValues() const { return values; }

  /// The record on one line for log messages: "name:literal" for each field, joined with ", ".
  [[nodiscard]] std::string ToStr() const;

 private:
  friend class ValueAccess;  // sets fields in place, which saves a fifth of a select

  const SqliteValue* FindForReading(const std::string& field) const;

  SqliteValue nullValue;
  std::map<std::string, SqliteValue> values;
};

/// Base of the record types that a program defines for itself. A record type names its columns,
/// turns itself into a `SqliteValueList` and reads itself back from one. It is not deleted through
/// this base.
class KELODR_EXPORT SqliteRecord {
 public:
  /// The values of the named columns.
  [[nodiscard]] virtual SqliteValueList ConvertColumns(
      const std::vector<std::string>& columns) const = 0;

  /// Takes the record's values from a selected row; false when it does not fit. The library never
  /// calls it.
  virtual bool FromSqliteRecord(const SqliteValueList& record) = 0;

  /// The names of the record's columns.
  [[nodiscard]] virtual std::vector<std::string> GetColumns() const = 0;

  /// `ConvertColumns` of `GetColumns`.
  [[nodiscard]] SqliteValueList ToSqliteRecord() const;

 protected:
  ~SqliteRecord() = default;
};

}  // namespace KeloDRCore

#endif  // KELODRCORE_SQLITE_VALUE_H_
