/// @file
/// WHERE conditions.
///
/// A condition renders itself into SQL text when its operands are set, and keeps that text. Values
/// are rendered with `SqliteValue::ToFormatedValue`, so texts are quoted and escaped; a left side
/// is written exactly as given. Every `SetValue` answers false on failure, with a line at ERR, and
/// leaves the text as it was, unless its comment says otherwise. A constructor with operands is the
/// default constructor followed by `SetValue`; where that fails, the text stays empty.
///
/// Deliberate, and frozen because statements are compared with it: AND and OR append to the text
/// that is there, `SqliteIsNull::SetValue` always returns false, and the validity of IN and NOT IN
/// is that of their keyword, whatever their text.

#ifndef KELODRCORE_SQLITE_CONDITION_H_
#define KELODRCORE_SQLITE_CONDITION_H_

#include <initializer_list>
#include <string>
#include <vector>

#include "kelodrcore/export.h"
#include "kelodrcore/sqlite_value.h"

namespace KeloDRCore {

// No destructor is virtual: nothing is deleted through a base.
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wnon-virtual-dtor"

/// A condition as text, and the base of all others. A plain value; not deleted through this base.
class KELODR_EXPORT SqliteCondition {
 public:
  /// No condition.
  SqliteCondition();

  /// The given text, unchanged and unchecked. Implicit: a text is a condition.
  SqliteCondition(const std::string& newText);  // NOLINT(google-explicit-constructor)

  /// True when there is a text.
  [[nodiscard]] virtual bool IsValid() const;

  /// The text as it stands in a statement; empty when there is no condition.
  [[nodiscard]] const std::string& GetText() const { return text; }

 protected:
  std::string text;  ///< What `GetText` returns.
};

/// lvalue=literal, without blanks.
class KELODR_EXPORT SqliteEqual : public SqliteCondition {
 public:
  SqliteEqual();                                                     ///< No operands.
  SqliteEqual(const std::string& lvalue, const SqliteValue& value);  ///< Calls `SetValue`.

  /// Replaces the text. Fails for an empty lvalue or an invalid value.
  bool SetValue(const std::string& lvalue, const SqliteValue& value);
};

/// lvalue!=literal, without blanks.
class KELODR_EXPORT SqliteNotEqual : public SqliteCondition {
 public:
  SqliteNotEqual();                                                     ///< No operands.
  SqliteNotEqual(const std::string& lvalue, const SqliteValue& value);  ///< Calls `SetValue`.

  /// Replaces the text. Fails for an empty lvalue or an invalid value.
  bool SetValue(const std::string& lvalue, const SqliteValue& value);
};

/// (left) AND (right)
class KELODR_EXPORT SqliteAnd : public SqliteCondition {
 public:
  SqliteAnd();                                                   ///< No operands.
  SqliteAnd(const std::string& left, const std::string& right);  ///< Calls `SetValue`.
  /// Calls `SetValue` with the two texts; the operands' `IsValid` is not asked.
  SqliteAnd(const SqliteCondition& left, const SqliteCondition& right);

  /// Appends the group directly behind the text that is there. Fails when a side is empty.
  bool SetValue(const std::string& left, const std::string& right);
};

/// (left) OR (right)
class KELODR_EXPORT SqliteOr : public SqliteCondition {
 public:
  SqliteOr();                                                   ///< No operands.
  SqliteOr(const std::string& left, const std::string& right);  ///< Calls `SetValue`.
  /// Calls `SetValue` with the two texts; the operands' `IsValid` is not asked.
  SqliteOr(const SqliteCondition& left, const SqliteCondition& right);

  /// Appends the group directly behind the text that is there. Fails when a side is empty.
  bool SetValue(const std::string& left, const std::string& right);
};

/// lvalue IS NULL
class KELODR_EXPORT SqliteIsNull : public SqliteCondition {
 public:
  SqliteIsNull();                                    ///< No operands.
  explicit SqliteIsNull(const std::string& lvalue);  ///< Calls `SetValue`.

  /// Replaces the text; fails for an empty lvalue. Returns false in both cases: ask `IsValid`.
  bool SetValue(const std::string& lvalue);
};

/// lvalue KEYWORD ( list ), where the keyword is "IN" or "NOT IN".
class KELODR_EXPORT SqliteInFamily : public SqliteCondition {
 public:
  /// Sets the keyword only; any other than "IN" or "NOT IN" makes every setter fail.
  explicit SqliteInFamily(const std::string& newKeyword);

  /// Sets the keyword, then calls `SetValue`.
  /// @{
  SqliteInFamily(const std::string& newKeyword, const std::string& lvalue,
                 const std::vector<SqliteValue>& values);
  SqliteInFamily(const std::string& newKeyword, const std::string& lvalue,
                 std::initializer_list<SqliteValue> values);
  template <typename T>
  SqliteInFamily(const std::string& newKeyword, const std::string& lvalue,
                 std::initializer_list<T> values)
      : SqliteInFamily(newKeyword, lvalue, std::vector<SqliteValue>(values.begin(), values.end())) {
  }
  SqliteInFamily(const std::string& newKeyword, const std::string& lvalue,
                 const std::string& value);
  /// @}

  /// True when the keyword is exactly "IN" or "NOT IN". A condition whose operands were refused is
  /// valid and empty.
  [[nodiscard]] bool IsValid() const override;

  /// Replaces the text with a list of the literals, which may be empty. Fails for an invalid
  /// keyword, an empty lvalue or an invalid value; the last leaves the text empty. Values in braces
  /// are always a list, one text in braces too.
  /// @{
  bool SetValue(const std::string& lvalue, const std::vector<SqliteValue>& values);
  bool SetValue(const std::string& lvalue, std::initializer_list<SqliteValue> values);
  template <typename T>
  bool SetValue(const std::string& lvalue, std::initializer_list<T> values) {
    return SetValue(lvalue, std::vector<SqliteValue>(values.begin(), values.end()));
  }
  /// @}

  /// Replaces the text with a list of `value` as given: a sub-query, or literals that the caller
  /// has rendered. Fails for an invalid keyword, an empty lvalue or an empty value.
  bool SetValue(const std::string& lvalue, const std::string& value);

  /// "IN", "NOT IN", or what the constructor was given.
  [[nodiscard]] const std::string& GetKeyword() const { return keyword; }

 protected:
  std::string keyword;  ///< What `GetKeyword` returns.
};

/// lvalue IN ( list )
class KELODR_EXPORT SqliteIn : public SqliteInFamily {
 public:
  SqliteIn();  ///< No operands.

  /// Calls `SetValue`.
  /// @{
  SqliteIn(const std::string& lvalue, const std::vector<SqliteValue>& values);
  SqliteIn(const std::string& lvalue, std::initializer_list<SqliteValue> values);
  template <typename T>
  SqliteIn(const std::string& lvalue, std::initializer_list<T> values)
      : SqliteIn(lvalue, std::vector<SqliteValue>(values.begin(), values.end())) {}
  SqliteIn(const std::string& lvalue, const std::string& value);
  /// @}
};

/// lvalue NOT IN ( list )
class KELODR_EXPORT SqliteNotIn : public SqliteInFamily {
 public:
  SqliteNotIn();  ///< No operands.

  /// Calls `SetValue`.
  /// @{
  SqliteNotIn(const std::string& lvalue, const std::vector<SqliteValue>& values);
  SqliteNotIn(const std::string& lvalue, std::initializer_list<SqliteValue> values);
  template <typename T>
  SqliteNotIn(const std::string& lvalue, std::initializer_list<T> values)
      : SqliteNotIn(lvalue, std::vector<SqliteValue>(values.begin(), values.end())) {}
  SqliteNotIn(const std::string& lvalue, const std::string& value);
  /// @}
};

#pragma GCC diagnostic pop

}  // namespace KeloDRCore

#endif  // KELODRCORE_SQLITE_CONDITION_H_
