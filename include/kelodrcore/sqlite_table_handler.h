/// @file
/// The description of one table.

#ifndef KELODRCORE_SQLITE_TABLE_HANDLER_H_
#define KELODRCORE_SQLITE_TABLE_HANDLER_H_

#include <string>

#include "kelodrcore/export.h"

namespace KeloDRCore {

/// A table's name and the text that defines its columns: a plain value that checks nothing.
/// `SqliteCommand` and `SqliteDB` say what an empty field means to them.
class KELODR_EXPORT SqliteTableHandler {
 public:
  /// Both fields empty.
  SqliteTableHandler();

  /// Copies the two texts.
  SqliteTableHandler(const std::string& newTableName, const std::string& newColumnDefs);

  /// Copies both fields.
  /// @{
  SqliteTableHandler(const SqliteTableHandler& other);
  SqliteTableHandler& operator=(const SqliteTableHandler& other);
  /// @}

  virtual ~SqliteTableHandler();

  /// The table's name, written into every statement unchanged: it is neither quoted nor escaped.
  std::string tableName;

  /// What stands between the parentheses of CREATE TABLE, in SQLite's own syntax; not parsed.
  /// Empty for a table that the caller does not own: creating it is then a successful no-op.
  std::string columnDefs;
};

}  // namespace KeloDRCore

#endif  // KELODRCORE_SQLITE_TABLE_HANDLER_H_
