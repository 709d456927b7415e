/// @file
/// Typed SQL values and the records made of them.

#ifndef KELODRCORE_SQLITE_VALUE_H_
#define KELODRCORE_SQLITE_VALUE_H_

#include <json/json.h>

#include <map>
#include <string>
#include <type_traits>
#include <vector>

#include "kelodrcore/export.h"

namespace KeloDRCore {

/// One typed SQL value that prints itself as an SQL literal. Its payload is a JSON value, whose
/// JSON type is the value's type.
///
/// There is no value for a real number and none for an explicit NULL: a default-constructed value
/// marks the absence of a value.
class KELODR_EXPORT SqliteValue {
 public:
  /// No value: invalid, and rendered as the empty text.
  SqliteValue();

  // NOLINTBEGIN(google-explicit-constructor)
  /// @{
  /// A value of the argument's type.
  /// Implicit, so that a literal can stand wherever a value is asked for. An integer outside 32
  /// bits is stored whole, but rendered as the empty text (see `ToFormatedValue`).
  SqliteValue(int number);
  SqliteValue(bool truth);
  SqliteValue(unsigned int number);
  SqliteValue(long number);
  SqliteValue(unsigned long number);
  SqliteValue(long long number);
  SqliteValue(unsigned long long number);
  SqliteValue(const std::string& text);
  /// @}

  /// A text up to its terminating NUL; a null pointer gives no value, as the default constructor.
  SqliteValue(const char* text);

  /// Other pointers would turn into a bool.
  template <typename T, typename = std::enable_if_t<!std::is_same_v<std::remove_const_t<T>, char>>>
  SqliteValue(T* pointer) = delete;

  /// Real numbers would lose their fraction.
  SqliteValue(double number) = delete;
  // NOLINTEND(google-explicit-constructor)

  /// @{
  /// Copies or moves payload and validity.
  SqliteValue(const SqliteValue& other);
  SqliteValue(SqliteValue&& other) noexcept;
  /// @}

  ~SqliteValue();

  /// @{
  /// Takes over the other's payload only.
  /// The validity stays as it was, deliberately: assigning into a default-constructed value keeps
  /// it invalid.
  SqliteValue& operator=(const SqliteValue& other);
  SqliteValue& operator=(SqliteValue&& other) noexcept;
  /// @}

  /// True when the value was constructed from something and its payload is a text, a bool or an
  /// integer.
  [[nodiscard]] bool IsValid() const;

  /// The SQL literal of the value, whether it is valid or not: a text in single quotes with every
  /// single quote in it doubled and nothing else escaped, "1" or "0" for a bool, decimal digits for
  /// an integer within 32 bits (signed or unsigned). The empty text, deliberately, for anything
  /// else: no value, and integers outside 32 bits. (The name's spelling is the interface's own, as
  /// in `ToFormatedInsertValues` and `SetReplacable`.)
  [[nodiscard]] std::string ToFormatedValue() const;

  /// Reads the payload into `out`. T is one of `bool`, `int`, `unsigned int`, `long`, `unsigned
  /// long`, `long long`, `unsigned long long` and `std::string`; other types do not link.
  ///
  /// An integer type takes any integer that fits it; `long` and `unsigned long` take any 64-bit
  /// integer of their sign and keep its low 32 bits, on 64-bit systems too. `bool` takes a bool and
  /// the integers 0 and 1. Validity is not asked. On failure `out` is untouched, a line at WARN
  /// ("[...] is not int", "... bool" or "... string") is logged, and the result is false.
  template <typename T>
  bool GetValue(T& out) const;

 private:
  friend class ValueAccess;  // binds payloads, and appends literals to a statement

  bool valid;
  Json::Value value;
};

/// A record: field names and their values, ordered byte by byte by name. Each name stands in it at
/// most once.
class KELODR_EXPORT SqliteValueList {
 public:
  /// An empty record.
  SqliteValueList();

  /// @{
  /// Copies or moves the fields.
  SqliteValueList(const SqliteValueList& other);
  SqliteValueList(SqliteValueList&& other) noexcept;
  SqliteValueList& operator=(const SqliteValueList& other);
  SqliteValueList& operator=(SqliteValueList&& other) noexcept;
  /// @}

  virtual ~SqliteValueList();

  /// @{
  /// Sets a field, over an earlier value of that name.
  /// False for an empty name or an invalid value: a line at ERR ("Bad Field[...] or value [...]"),
  /// and the record is unchanged.
  bool AddValue(const std::string& field, const SqliteValue& fieldValue);
  bool AddValue(const std::string& field, SqliteValue&& fieldValue);
  /// @}

  /// Sets every field of `other` here too; what cannot be set is only logged.
  SqliteValueList& operator+=(const SqliteValueList& other);

  /// The value of a field. For an empty name (a line at ERR) or a missing field (a line at WARN) a
  /// reference to an invalid value that lives as long as the record.
  const SqliteValue& GetValue(const std::string& field) const;

  /// Reads a field into `out` as `SqliteValue::GetValue` does, for the same types. False with `out`
  /// untouched also for an empty name (a line at ERR) or a missing field (a line at DEBUG).
  template <typename T>
  bool GetValue(const std::string& field, T& out) const;

  /// True when the field is there; false for an empty name, with a line at ERR.
  bool HasField(const std::string& field) const;

  /// All fields and their values.
  [[nodiscard]] const std::map<std::string, SqliteValue>& GetValues() const { return values; }

  /// The record on one line for log messages: "name:literal" for each field, joined with ", ".
  [[nodiscard]] std::string ToStr() const;

 private:
  friend class ValueAccess;  // sets fields in place, which halves the cost of a selected row

  SqliteValue nullValue;
  std::map<std::string, SqliteValue> values;
};

/// Base of the record types that a program defines for itself: tells its columns, turns itself into
/// a `SqliteValueList` and reads itself back from one. Not deleted through this base.
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
