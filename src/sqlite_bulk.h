// Many records as rows of one table.

#ifndef KELODRCORE_SRC_SQLITE_BULK_H_
#define KELODRCORE_SRC_SQLITE_BULK_H_

#include <string>
#include <vector>

#include "kelodrcore/sqlite_value.h"

struct sqlite3;

namespace KeloDRCore {

// Refers to its arguments. `verb` is "INSERT" or "INSERT OR REPLACE".
class BulkInsert {
 public:
  // Beside SQLite's result codes: a record that SQLite cannot be given.
  static constexpr int kInvalidRecord = -1;

  BulkInsert(const char* insertVerb, const std::string& tableName,
             const std::vector<SqliteValueList>& rows)
      : verb(insertVerb), table(tableName), records(rows) {}

  bool IsEmpty() const { return records.empty(); }

  // True when the table has a name and each record has fields.
  bool IsValid() const;

  // The statement for the fields of a record, with "?" for the values.
  std::string CommandFor(const SqliteValueList& record) const;
  std::string FirstCommand() const { return CommandFor(records.front()); }

  // Inserts the records until one fails. Returns SQLite's result code or `kInvalidRecord`;
  // `message` tells a failure of SQLite.
  int Run(sqlite3* db, std::string& message) const;

 private:
  const char* verb;
  const std::string& table;
  const std::vector<SqliteValueList>& records;
};

}  // namespace KeloDRCore

#endif  // KELODRCORE_SRC_SQLITE_BULK_H_
