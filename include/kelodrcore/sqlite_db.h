/// @file
/// The handle on one SQLite database file, and its error holder. What reads as an oddity here is
/// deliberate: programs and log readers rely on it.

#ifndef KELODRCORE_SQLITE_DB_H_
#define KELODRCORE_SQLITE_DB_H_

#include <json/json.h>

#include <functional>
#include <string>
#include <vector>

#include "kelodrcore/export.h"
#include "kelodrcore/sqlite_command.h"
#include "kelodrcore/sqlite_table_handler.h"
#include "kelodrcore/sqlite_value.h"

struct sqlite3;

namespace KeloDRCore {

class BulkInsert;

// No destructor is virtual: nothing is deleted through a base.
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wnon-virtual-dtor"

/// Holds the last error: a code of `ERR` (0 for none) and its details. Not deleted through this
/// base.
class KELODR_EXPORT ErrRecorder {
 public:
  /// No error.
  ErrRecorder();

  /// The current error as an object: "err_code" (int); "err_code_str" when `GetErrCodeStr` gives a
  /// text; "err_msg" when there are details.
  [[nodiscard]] virtual Json::Value GetErr() const;

  /// The name of a code for "err_code_str". Empty here; a recorder that wants names overrides it,
  /// for instance with `ERR::ToString`.
  [[nodiscard]] virtual std::string GetErrCodeStr(int code) const;

 protected:
  friend class SqliteDB;  // copies a recorder and classifies what the copy holds

  mutable int errCode;         ///< 0, a code of `ERR`, or for a moment a raw SQLite result code.
  mutable Json::Value errMsg;  ///< Null, SQLite's message, or an object with the details.
};

/// The handle on one SQLite database file.
///
/// Opened by the first statement and kept open until `Close` or destruction. A statement that finds
/// the database busy or locked is tried again, at most `retries` times, after a random pause of 1
/// to 2 s each, on top of SQLite's own wait of up to 1 s in each attempt; any other failure ends at
/// once.
///
/// Failure is a false result, a line in the log, and the error in `GetErr()`: 401 for a bad
/// argument, 403 when there is no connection although it was opened, 404 for a failed operation and
/// 405 for a database that stayed busy or locked, the last two with "sqlite_errcode" and
/// "sqlite_errmsg" in "err_msg" where SQLite refused. A statement, query or command that succeeds
/// clears the error. Throws `std::bad_alloc`, what a subclass's `GetErrCodeStr` throws, and what
/// the function given to `SelectEach` throws, nothing else.
///
/// Statements, table names, column definitions, field names and conditions given as text are SQL
/// and run as they are. Before the call: none of them holds data that somebody else wrote; such
/// data goes into a `SqliteValue`. A text with a NUL byte fails with 401 and a line at ERR, and
/// does not run: SQLite would run only its start.
///
/// What an operation acknowledged survives the end of the process. When the power fails, SQLite's
/// default may lose the last acknowledged commit; after `Exec("PRAGMA synchronous=EXTRA")` on an
/// open handle it does not, for one more sync in each commit.
///
/// One handle is used by one thread at a time; `const` operations write the error too. A handle
/// that is open must not be used, closed or destroyed in the child of a `fork`: the child opens a
/// handle of its own.
class KELODR_EXPORT SqliteDB : public ErrRecorder {
 public:
  /// Stores the arguments; opens nothing. `label` stands in front of the lines that commands log.
  SqliteDB(const std::string& path, unsigned int retries, const std::string& label);

  SqliteDB(const SqliteDB&) = delete;
  SqliteDB& operator=(const SqliteDB&) = delete;

  /// Closes the connection.
  virtual ~SqliteDB();

  /// Opens the connection if it is closed, creating a missing file, and sets the busy time-out of
  /// 1000 ms. False with a line at WARN when either fails; after a failed time-out the connection
  /// stays open. The error in `GetErr()` is not touched.
  bool Open();

  /// Closes the connection if it is open. A transaction that is open is rolled back.
  void Close();

  /// True when the database file exists.
  [[nodiscard]] bool IsExisted() const;

  /// One attempt on the open connection. No retry, and no line but for a NUL byte. A
  /// failure is recorded raw: SQLite's own result code and message.
  /// @{

  /// Runs the statements and discards their rows. Success leaves the recorded error as it was.
  /// A transaction that a failed attempt began is rolled back.
  bool DoExecSqliteCommand(const std::string& sql);

  /// Puts the first row into `record`, in place of what it held; with no row it succeeds and leaves
  /// `record` alone.
  bool DoSelectSqliteRecord(const std::string& sql, SqliteValueList& record);

  /// Appends all rows to `records`, also those read before a failure.
  bool DoSelectSqliteRecords(const std::string& sql, std::vector<SqliteValueList>& records);
  /// @}

  /// Opens the database and runs the statements, discarding their rows. Fails with 401 for an empty
  /// text, without opening the file.
  ///
  /// Each attempt runs the whole text. A transaction that a failed attempt began is rolled back.
  /// Statements that ran outside a transaction before the database was found locked run again with
  /// the next attempt: use `SqliteTransaction` for statements that belong together.
  bool Exec(const std::string& sql);

  /// Opens the database and reads the rows of a query.
  /// Integers and texts become fields under their column names; a NULL, a real or a blob is left
  /// out with a line at WARN. Fails with 401 for an empty text; when the file cannot be opened the
  /// recorded error stays as it was.
  /// @{

  /// Reads the first row into `record`, as `DoSelectSqliteRecord` does.
  bool SelectByCommand(const std::string& sql, SqliteValueList& record);

  /// Appends the rows to `records`, which is never emptied: rows of an attempt that failed stay,
  /// also when it is tried again.
  bool SelectByCommand(const std::string& sql, std::vector<SqliteValueList>& records);
  /// @}

  /// Records a raw SQLite failure; a null `msg` stands for the connection's own message. Nothing
  /// for code 0.
  void SetDBErr(int code, const char* msg) const;

  /// Records `raw` classified: 405 when its code is SQLite's busy (5) or locked (6), else 404, with
  /// code and message as details.
  void SetDBErr(const ErrRecorder& raw) const;

  /// True when the table exists. A failure reads as an absent table; its error stays recorded. The
  /// name is not escaped.
  bool IsTableExisted(const std::string& tableName);

  /// Counts the rows of a table. False, with `count` untouched and a line at ERR, when it cannot be
  /// counted, for instance because it is missing. Creates no table. The name is not escaped.
  bool GetCount(const SqliteTableHandler& table, int& count);

  /// Creates the table if it is missing. Without column definitions this is a successful no-op.
  /// False with a line at ERR for an empty name, which leaves the recorded error as it was, and for
  /// a refused statement.
  bool CreateTable(const SqliteTableHandler& table);

  /// Creates the command's table if it is missing, then runs the command and discards its rows.
  /// Logs the statement, and its success, at INFO. Fails with 401 for an invalid command, whose
  /// empty statement is logged too.
  bool Exec(const SqliteCommand& cmd);

  /// `Exec`: a missing file is created.
  bool InsertRecord(const InsertCommand& cmd);

  /// `Exec`: a missing file is created.
  bool UpdateRecord(const UpdateCommand& cmd);

  /// `Exec`, but a missing file is a success that touches nothing.
  bool DeleteRecord(const DeleteCommand& cmd);

  /// Deletes the rows that meet the condition. An empty condition fails with 401: it never deletes
  /// every row.
  bool DeleteRecord(const std::string& condition, const SqliteTableHandler& table);

  /// Deletes every row.
  bool DeleteAllRecords(const SqliteTableHandler& table);

  /// Creates the command's table if it is missing, then reads the selected rows.
  /// Fails with 401 for an invalid command. A missing file fails without a line and without
  /// touching the recorded error: nothing is selected.
  /// @{

  /// Reads the first row, as `SelectByCommand` does.
  bool SelectRecord(const SelectCommand& cmd, SqliteValueList& record);

  /// Appends the rows, as `SelectByCommand` does.
  bool SelectRecords(const SelectCommand& cmd, std::vector<SqliteValueList>& records);

  /// Hands the rows to `take` one by one, in memory that does not grow with their number. `take`
  /// answers false to stop, which is a success. The statement is not tried again once a row has
  /// been handed over. What `take` throws passes after the statement is released.
  ///
  /// Before the call: `take` holds a function. It may use this handle, but not close it. Other
  /// connections cannot commit while it runs, unless the database is in WAL mode.
  bool SelectEach(const SelectCommand& cmd,
                  const std::function<bool(const SqliteValueList& record)>& take);
  /// @}

  /// Creates the table if it is missing, then inserts all records or none.
  /// The records are one transaction, or a savepoint inside an open one, which is tried again as a
  /// whole while the database is busy or locked. Values are bound, not rendered: integers of 64
  /// bits and texts with NUL bytes are stored whole, though reading such a text ends at the NUL.
  /// Logs the first record's statement, with "?" for the values, and the success at INFO; a failure
  /// at ERR.
  ///
  /// Fails with 401 and stores nothing for an empty table name, an empty record, or an unsigned
  /// integer above 63 bits. No records are a success that does not touch the file or the recorded
  /// error.
  /// @{

  /// A row that breaks a constraint fails them all.
  bool InsertRecords(const SqliteTableHandler& table, const std::vector<SqliteValueList>& records);

  /// A row replaces those with the same unique values.
  bool InsertOrReplaceRecords(const SqliteTableHandler& table,
                              const std::vector<SqliteValueList>& records);
  /// @}

 private:
  friend class SqliteTransaction;
  class Attempt;
  using RecordTaker = std::function<bool(const SqliteValueList& record)>;

  KELODR_LOCAL void SetErr(int code) const;  // a code without details
  KELODR_LOCAL bool RefuseNul(const std::string& sql, const char* function) const;
  KELODR_LOCAL bool OpenForExec(const char* function);
  KELODR_LOCAL bool OpenForQuery(const std::string& sql, const char* emptyMessage);
  KELODR_LOCAL bool ClassifyErr() const;
  KELODR_LOCAL bool PauseBeforeRetry(unsigned int& retries) const;
  KELODR_LOCAL bool SetQueryEnd(int code) const;
  KELODR_LOCAL bool PrepareSelect(const SelectCommand& cmd, const char* function);
  KELODR_LOCAL bool TrySelectEach(const std::string& sql, const RecordTaker& take,
                                  bool& isHandedOver);
  KELODR_LOCAL bool InsertAll(const BulkInsert& insert, const SqliteTableHandler& table,
                              const char* function);
  KELODR_LOCAL bool TryInsertAll(const BulkInsert& insert);
  KELODR_LOCAL bool IsInTransaction() const;
  KELODR_LOCAL void AbandonTransaction();

  sqlite3* dbHandle;
  std::string dbPath;
  unsigned int retryLimit;
  std::string logLabel;
};

#pragma GCC diagnostic pop

}  // namespace KeloDRCore

#endif  // KELODRCORE_SQLITE_DB_H_
