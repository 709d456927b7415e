/// @file
/// Builders of SQL statements.
///
/// A command is filled step by step and prints one statement; it never touches a database. Table
/// names, field names and condition texts are written exactly as given; data is escaped only where
/// it becomes a literal (`SqliteValue::ToFormatedValue`). Fields of a `SqliteValueList` appear in
/// its order, byte by byte by name. A command copies what it is given.

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

/// What all commands have in common: the table they act on.
class KELODR_EXPORT SqliteCommand {
 public:
  SqliteCommand();                                       ///< No table.
  SqliteCommand(const SqliteCommand& other);             ///< Copies.
  SqliteCommand& operator=(const SqliteCommand& other);  ///< Copies.
  virtual ~SqliteCommand();

  /// The statement; the empty text, with a line at ERR, when `IsValid()` is false.
  virtual std::string GetCommand() const = 0;

  /// True when a statement can be made: there is a table name, and what the command needs besides.
  [[nodiscard]] virtual bool IsValid() const = 0;

  /// Appends the command's parameters to the stream, as log lines show them.
  virtual void DumpParam(std::stringstream& stream) const = 0;

  /// A dump for log lines: the table's name, "]" and what `DumpParam` writes. There is no opening
  /// bracket, deliberately: log readers match on it.
  [[nodiscard]] std::string ToStr() const;

  /// False for an empty table name, with a line at ERR; the old table stays.
  bool SetTable(const SqliteTableHandler& handler);

  /// The table that the statement acts on.
  [[nodiscard]] const SqliteTableHandler& GetTable() const { return table; }

 private:
  SqliteTableHandler table;
};

/// The type of a field value that can be added to a command directly.
template <typename T>
using EnableFieldType =
    std::enable_if_t<std::is_same_v<T, std::string> || std::is_same_v<T, bool> ||
                     std::is_same_v<T, int> || std::is_same_v<T, unsigned int> ||
                     std::is_same_v<T, long>>;

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
  void SetReplacable(bool isReplacable);

  /// @{
  /// Sets one field, over an earlier value of that name.
  /// False for an empty name or a null text, with a line at ERR. T is `std::string`, `bool`, `int`,
  /// `unsigned int` or `long`.
  template <typename T, typename = EnableFieldType<T>>
  bool AddFieldValue(const std::string& field, const T& value);
  bool AddFieldValue(const std::string& field, const char* value);
  /// @}

  /// A literal 0 of another integer type would be a null text.
  bool AddFieldValue(const std::string& field, long long number) = delete;

  /// The part of the statement with columns and values: "(names) VALUES (literals)". A literal that
  /// is the empty text (an integer outside 32 bits) in the first place is followed by no comma; the
  /// database refuses such a statement.
  [[nodiscard]] std::string ToFormatedInsertValues() const;

 private:
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

  /// @{
  /// Sets one field, as `InsertCommand::AddFieldValue` does.
  template <typename T, typename = EnableFieldType<T>>
  bool AddFieldValue(const std::string& field, const T& value);
  bool AddFieldValue(const std::string& field, const char* value);
  /// @}

  /// A literal 0 of another integer type would be a null text.
  bool AddFieldValue(const std::string& field, long long number) = delete;

  /// False for an empty text, without a line.
  bool SetCondition(const std::string& text);

  /// False for an invalid condition, with a line at ERR; otherwise as for its text.
  bool SetCondition(const SqliteCondition& sqliteCondition);

 private:
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

  /// Selects one more column, in the order added, duplicates included, and no longer all of them.
  /// False for an empty name.
  bool AddField(const std::string& field);

  /// Sorts by one more column. False for an empty name.
  bool AddOrderField(const std::string& field);

  /// Selects every column, in place of the ones added.
  void SelectAll();

  /// Sorts ascending.
  void SetOrderByASC();

  /// Sorts descending, which is the default. One direction is written, after the last order field;
  /// SQLite applies it to that field, and sorts by those before it in ascending order.
  void SetOrderByDESC();

  /// Skips `first` rows and reads at most `count`. False, with nothing changed, for a `first` below
  /// 0 or a `count` below 1.
  bool SetLimit(int first, int count);

  /// Reads at most `count` rows; the offset keeps its value. False for a `count` below 1.
  bool SetLimit(int count);

  /// False for an empty text, with a line at ERR.
  bool SetCondition(const std::string& text);

  /// False for an invalid condition, with a line at ERR; otherwise as for its text.
  bool SetCondition(const SqliteCondition& sqliteCondition);

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

  /// Permits a statement without a condition. A condition that is there is kept and used.
  void DeleteAll();

  /// Also takes the permission of `DeleteAll` back. False for an empty text, without a line.
  bool SetCondition(const std::string& text);

  /// False for an invalid condition, with a line at ERR; otherwise as for its text.
  bool SetCondition(const SqliteCondition& sqliteCondition);

 private:
  bool deleteAll = false;
  std::string condition;
};

}  // namespace KeloDRCore

#endif  // KELODRCORE_SQLITE_COMMAND_H_
