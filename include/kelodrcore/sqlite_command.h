/// @file
/// Builders of SQL statements.
///
/// A command is filled step by step and prints one statement; it never touches a database. Table
/// names, field names and condition texts are written exactly as given. Data is escaped only where
/// it becomes a literal (`SqliteValue::ToFormatedValue`). The fields of an INSERT and an UPDATE
/// stand in the order of their `SqliteValueList`, byte by byte by name. A command copies what it is
/// given.
///
/// Deliberate, and frozen because statements and log lines are compared with it: a dump has no
/// opening bracket, " * " brings a second blank behind SELECT, INSERT and DELETE end in ";" and the
/// others do not, the default sort direction is descending, only a SELECT logs an empty condition,
/// and names keep their spelling (`ToFormatedInsertValues`, `SetReplacable`).

#ifndef KELODRCORE_SQLITE_COMMAND_H_
#define KELODRCORE_SQLITE_COMMAND_H_

#include <sstream>
#include <string>
#include <type_traits>
#include <vector>

#include "kelodrcore/export.h"
#include "kelodrcore/sqlite_condition.h"
#include "kelodrcore/sqlite_table_handler.h"
#include "kelodrcore/sqlite_value.h"

namespace KeloDRCore {

/// What all commands have in common: the table that they act on.
class KELODR_EXPORT SqliteCommand {
 public:
  SqliteCommand();  ///< No table.

  /// Copies the table.
  /// @{
  SqliteCommand(const SqliteCommand& other);
  SqliteCommand& operator=(const SqliteCommand& other);
  /// @}
  virtual ~SqliteCommand();

  /// The statement. When `IsValid()` is false: the empty text, with a line at ERR.
  virtual std::string GetCommand() const = 0;

  /// True when a statement can be made: there is a table name, and what else the command needs.
  [[nodiscard]] virtual bool IsValid() const = 0;

  /// Appends the command's parameters to the stream, as log lines show them.
  virtual void DumpParam(std::stringstream& stream) const = 0;

  /// A dump for log lines: the table's name, "]" and what `DumpParam` writes.
  [[nodiscard]] std::string ToStr() const;

  /// False for an empty table name, with a line at ERR; the old table stays.
  bool SetTable(const SqliteTableHandler& handler);

  /// The table that the statement acts on.
  [[nodiscard]] const SqliteTableHandler& GetTable() const { return table; }

 protected:
  /// The value that `AddFieldValue` sets.
  template <typename T>
  static SqliteValue ToFieldValue(const T& value) {
    constexpr bool kIsTaken = std::is_same_v<T, std::string> || std::is_same_v<T, bool> ||
                              std::is_same_v<T, int> || std::is_same_v<T, unsigned int> ||
                              std::is_same_v<T, long> ||
                              std::is_convertible_v<const T&, const char*>;
    static_assert(kIsTaken,
                  "AddFieldValue takes std::string, const char*, bool, int, unsigned int and long");
    if constexpr (kIsTaken) {
      return value;
    } else {
      return {};  // so that the message above stands alone
    }
  }

 private:
  SqliteTableHandler table;
};

/// INSERT INTO table (names) VALUES (literals); valid with at least one field.
class KELODR_EXPORT InsertCommand : public SqliteCommand {
 public:
  InsertCommand();  ///< No fields, not replacing.

  std::string GetCommand() const override;
  [[nodiscard]] bool IsValid() const override;
  void DumpParam(std::stringstream& stream) const override;

  /// Replaces all fields; nothing is checked.
  void SetFieldValues(const SqliteValueList& list);

  /// True makes the statement INSERT OR REPLACE INTO.
  void SetReplacable(bool newReplacable);

  /// Sets one field; an earlier value of that name is replaced. False for an empty name or a null
  /// text, with a line at ERR. T is `std::string`, `const char*`, `bool`, `int`, `unsigned int` or
  /// `long`.
  template <typename T>
  bool AddFieldValue(const std::string& field, const T& value) {
    return AddField(field, ToFieldValue(value));
  }

  /// The part of the statement with columns and values: "(names) VALUES (literals)". An empty
  /// literal in the first place (an integer outside 32 bits) is followed by no comma: the database
  /// refuses such a statement.
  [[nodiscard]] std::string ToFormatedInsertValues() const;

 private:
  bool AddField(const std::string& field, const SqliteValue& value);

  bool replacable = false;
  SqliteValueList fieldValues;
};

/// UPDATE table SET name=literal,... [WHERE condition]; valid with at least one field. Without a
/// condition it sets every row.
class KELODR_EXPORT UpdateCommand : public SqliteCommand {
 public:
  UpdateCommand();  ///< No fields, no condition.

  std::string GetCommand() const override;
  [[nodiscard]] bool IsValid() const override;
  void DumpParam(std::stringstream& stream) const override;

  /// Replaces all fields; nothing is checked.
  void SetFieldValues(const SqliteValueList& list);

  /// Sets one field, as `InsertCommand::AddFieldValue` does.
  template <typename T>
  bool AddFieldValue(const std::string& field, const T& value) {
    return AddField(field, ToFieldValue(value));
  }

  /// Sets the condition. False for an empty text, without a line.
  bool SetCondition(const std::string& text);

  /// Sets the condition's text as above. False for an invalid condition, with a line at ERR.
  bool SetCondition(const SqliteCondition& newCondition);

 private:
  bool AddField(const std::string& field, const SqliteValue& value);

  std::string condition;
  SqliteValueList fieldValues;
};

/// SELECT names FROM table [WHERE condition] [ORDER BY names ASC|DESC] [LIMIT offset, count]; valid
/// with at least one field, or with all.
class KELODR_EXPORT SelectCommand : public SqliteCommand {
 public:
  SelectCommand();  ///< No fields, no condition, no order, no limit.

  std::string GetCommand() const override;
  [[nodiscard]] bool IsValid() const override;
  void DumpParam(std::stringstream& stream) const override;

  /// Selects one more column; a name that is there already is selected twice. Ends `SelectAll`.
  /// False for an empty name.
  bool AddField(const std::string& field);

  /// Sorts by one more column. False for an empty name.
  bool AddOrderField(const std::string& field);

  /// Selects every column. The columns that were added are dropped.
  void SelectAll();

  /// Sorts ascending.
  void SetOrderByASC();

  /// Sorts descending, which is the default. The direction is written once, behind the last order
  /// field. SQLite applies it to that field and sorts by the fields before it in ascending order.
  void SetOrderByDESC();

  /// Skips `newOffset` rows and reads at most `count`. False, with nothing changed, for a
  /// `newOffset` below 0 or a `count` below 1.
  bool SetLimit(int newOffset, int count);

  /// Reads at most `count` rows; the offset keeps its value. False for a `count` below 1.
  bool SetLimit(int count);

  /// Sets the condition. False for an empty text, with a line at ERR.
  bool SetCondition(const std::string& text);

  /// Sets the condition's text as above. False for an invalid condition, with a line at ERR.
  bool SetCondition(const SqliteCondition& newCondition);

 private:
  bool selectAll = false;
  bool orderByASC = false;
  int offset = 0;
  int limit = -1;
  std::vector<std::string> fields;
  std::vector<std::string> orderFields;
  std::string condition;
};

/// DELETE FROM table [WHERE condition]; valid with a condition, or with `DeleteAll`.
class KELODR_EXPORT DeleteCommand : public SqliteCommand {
 public:
  DeleteCommand();  ///< No condition, and no permission to delete all rows.

  std::string GetCommand() const override;
  [[nodiscard]] bool IsValid() const override;
  void DumpParam(std::stringstream& stream) const override;

  /// Permits a statement without a condition. A condition that was set is kept and used.
  void DeleteAll();

  /// Sets the condition and takes the permission of `DeleteAll` back. False for an empty text,
  /// without a line.
  bool SetCondition(const std::string& text);

  /// Sets the condition's text as above. False for an invalid condition, with a line at ERR.
  bool SetCondition(const SqliteCondition& newCondition);

 private:
  bool deleteAll = false;
  std::string condition;
};

}  // namespace KeloDRCore

#endif  // KELODRCORE_SQLITE_COMMAND_H_
