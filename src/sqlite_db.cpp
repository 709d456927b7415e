#include "kelodrcore/sqlite_db.h"

#include <sqlite3.h>

#include <memory>
#include <new>
#include <optional>
#include <utility>

#include "kelocore.h"
#include "kelodrcore/err.h"
#include "kelodrcore/json_value.h"
#include "kelodrcore/utils.h"
#include "log.h"
#include "value_access.h"

namespace KeloDRCore {
namespace {

constexpr int kBusyTimeoutInMSec = 1000;

// Every command asks for its table: the query is built without growing.
constexpr size_t kTableQueryRoom = 64;

struct Finalizer {
  void operator()(sqlite3_stmt* stmt) const { sqlite3_finalize(stmt); }
};
using Statement = std::unique_ptr<sqlite3_stmt, Finalizer>;

Statement Prepare(sqlite3* db, const std::string& sql, int& code) {
  sqlite3_stmt* stmt = nullptr;
  code = sqlite3_prepare_v2(db, sql.c_str(), -1, &stmt, nullptr);
  return Statement(stmt);
}

// A library in C throws nothing, which the compiler cannot know.
int Step(const Statement& stmt) noexcept { return sqlite3_step(stmt.get()); }

bool IsBusyOrLocked(int code) { return code == SQLITE_BUSY || code == SQLITE_LOCKED; }

// JsonCpp reports memory that it cannot get as an error of its own.
template <typename Action>
auto ThrowOnlyBadAlloc(const Action& action) {
  try {
    return action();
  } catch (const Json::Exception&) {
    throw std::bad_alloc();
  }
}

// SQLite answers null for a name only when it has no memory for it.
const char* ColumnName(sqlite3_stmt* stmt, int column) {
  const char* const name = sqlite3_column_name(stmt, column);
  if (name == nullptr) throw std::bad_alloc();
  return name;
}

// A null text is an empty one, but for the one that SQLite has no memory for.
const char* ColumnText(sqlite3_stmt* stmt, int column) {
  const auto* const text = reinterpret_cast<const char*>(sqlite3_column_text(stmt, column));
  if (text != nullptr) return text;
  if (sqlite3_errcode(sqlite3_db_handle(stmt)) == SQLITE_NOMEM) throw std::bad_alloc();
  return "";
}

// Turns the rows of one statement into records. Made at a row: before the first one the statement
// may still be prepared anew, with other columns.
class RowReader {
 public:
  RowReader(sqlite3_stmt* statement, const char* operation) : stmt(statement), function(operation) {
    const int columns = sqlite3_column_count(stmt);
    names.reserve(static_cast<size_t>(columns));
    for (int column = 0; column < columns; ++column) {
      names.emplace_back(ColumnName(stmt, column));
    }
  }

  // Fills a record that is empty.
  void Read(SqliteValueList& record) const {
    ThrowOnlyBadAlloc([&] {
      int column = 0;
      for (const std::string& name : names) AddColumn(record, name, column++);
    });
  }

 private:
  void AddColumn(SqliteValueList& record, const std::string& name, int column) const {
    const int type = sqlite3_column_type(stmt, column);
    switch (type) {
      case SQLITE_INTEGER:
        Add(record, name, static_cast<long long>(sqlite3_column_int64(stmt, column)));
        break;
      case SQLITE_TEXT:
        Add(record, name, ColumnText(stmt, column));
        break;
      case SQLITE_NULL:
        KELODR_LOG(WARN, function, "field [%s] has null value", name.c_str());
        break;
      default:
        KELODR_LOG(WARN, function, "Not supported type [%d] with field [%s]", type, name.c_str());
    }
  }

  template <typename Payload>
  static void Add(SqliteValueList& record, const std::string& name, const Payload& payload) {
    if (name.empty()) {
      record.AddValue(name, payload);  // refuses and logs
    } else {
      ValueAccess::SetField(record, name, payload);
    }
  }

  sqlite3_stmt* stmt;
  const char* function;
  std::vector<std::string> names;
};

// What Exec says when its attempts end. Each of the two queries shares one of these lines and has
// one of its own: they cross their wordings, as log readers know them.

void LogExecFailed(const char* function, unsigned int retries, const std::string& sql,
                   const Json::Value& err) {
  KELODR_LOG(ERR, function, "Reach retry limit [%u], failed to exec command [%s] with err [%s]",
             retries, sql.c_str(), JsonValue::toString(err).c_str());
}

void LogExecRetried(const char* function, unsigned int retries, const std::string& sql) {
  if (retries == 0) return;
  KELODR_LOG(INFO, function, "After retry [%u] times, success to exec command [%s]", retries,
             sql.c_str());
}

}  // namespace

ErrRecorder::ErrRecorder() : errCode(0) {}

Json::Value ErrRecorder::GetErr() const {
  return ThrowOnlyBadAlloc([this] {
    Json::Value err;
    err["err_code"] = errCode;
    const std::string name = GetErrCodeStr(errCode);
    if (!name.empty()) err["err_code_str"] = name;
    if (!errMsg.isNull()) err["err_msg"] = errMsg;
    return err;
  });
}

std::string ErrRecorder::GetErrCodeStr(int /*code*/) const { return ""; }

SqliteDB::SqliteDB(const std::string& path, unsigned int retries, const std::string& label)
    : dbHandle(nullptr), dbPath(path), retryLimit(retries), logLabel(label) {}

SqliteDB::~SqliteDB() { Close(); }

bool SqliteDB::Open() {
  if (dbHandle != nullptr) return true;
  if (sqlite3_open(dbPath.c_str(), &dbHandle) != SQLITE_OK) {
    Close();
    KELODR_LOG(WARN, __func__, "Failed to open db[%s]", dbPath.c_str());
    return false;
  }
  if (sqlite3_busy_timeout(dbHandle, kBusyTimeoutInMSec) != SQLITE_OK) {
    KELODR_LOG(WARN, __func__, "%s", "Failed to set busy timeout with error");
    return false;
  }
  return true;
}

void SqliteDB::Close() {
  if (dbHandle == nullptr) return;
  sqlite3_close(dbHandle);
  dbHandle = nullptr;
}

bool SqliteDB::IsExisted() const { return KLIBCFileExist(dbPath.c_str()) == 1; }

void SqliteDB::SetErr(int code) const {
  errCode = code;
  if (!errMsg.isNull()) errMsg = Json::Value();
}

void SqliteDB::SetDBErr(int code, const char* msg) const {
  if (code == SQLITE_OK) return;
  ThrowOnlyBadAlloc([&] { errMsg = Json::Value(msg != nullptr ? msg : sqlite3_errmsg(dbHandle)); });
  errCode = code;
}

void SqliteDB::SetDBErr(const ErrRecorder& raw) const {
  Json::Value details = ThrowOnlyBadAlloc([&] {
    Json::Value value;
    if (raw.errCode != 0) value["sqlite_errcode"] = raw.errCode;
    if (!raw.errMsg.isNull()) value["sqlite_errmsg"] = raw.errMsg;
    return value;
  });
  errCode = IsBusyOrLocked(raw.errCode) ? ERR::ERR_DATABASE_LOCK : ERR::ERR_DATABASE_OPERATION;
  errMsg = std::move(details);
}

bool SqliteDB::DoExecSqliteCommand(const std::string& sql) {
  char* errText = nullptr;
  const int code = sqlite3_exec(dbHandle, sql.c_str(), nullptr, nullptr, &errText);
  const std::unique_ptr<char, void (*)(void*)> owner(errText, sqlite3_free);
  SetDBErr(code, errText);
  return code == SQLITE_OK;
}

// One attempt: hands each row to `takeRow` until that answers false or no row is left.
template <typename TakeRow>
bool SqliteDB::TrySelect(const std::string& sql, const TakeRow& takeRow) {
  SetErr(ERR::ERR_DATABASE_OPERATION);
  int code = SQLITE_OK;
  const Statement stmt = Prepare(dbHandle, sql, code);
  if (code == SQLITE_OK) code = Step(stmt);
  while (code == SQLITE_ROW) {
    // Each kind of `takeRow` always answers the same: each copy of this lacks one way on.
    if (!takeRow(stmt.get())) break;  // GCOVR_EXCL_BR_LINE
    code = Step(stmt);
  }
  if (code != SQLITE_ROW && code != SQLITE_DONE) {
    SetDBErr(code, nullptr);
    return false;
  }
  SetErr(0);
  return true;
}

bool SqliteDB::TrySelectFirst(const std::string& sql, SqliteValueList& record,
                              const char* function) {
  return TrySelect(sql, [&](sqlite3_stmt* stmt) {
    SqliteValueList row;
    RowReader(stmt, function).Read(row);
    record = std::move(row);
    return false;
  });
}

bool SqliteDB::TrySelectAll(const std::string& sql, std::vector<SqliteValueList>& records,
                            const char* function) {
  std::optional<RowReader> reader;
  return TrySelect(sql, [&](sqlite3_stmt* stmt) {
    if (!reader) reader.emplace(stmt, function);
    records.emplace_back();
    try {
      reader->Read(records.back());
    } catch (...) {
      records.pop_back();
      throw;
    }
    return true;
  });
}

bool SqliteDB::DoSelectSqliteRecord(const std::string& sql, SqliteValueList& record) {
  return TrySelectFirst(sql, record, __func__);
}

bool SqliteDB::DoSelectSqliteRecords(const std::string& sql,
                                     std::vector<SqliteValueList>& records) {
  return TrySelectAll(sql, records, __func__);
}

// Makes attempts until one succeeds, one fails otherwise than by a lock, or the limit is reached.
// Leaves the classified error of the last one behind. `retries` counts one past the limit when the
// limit ends the loop, and is what the callers' messages show; it comes in as 0.
template <typename Attempt>
bool SqliteDB::RetryWhileLocked(const Attempt& attempt, unsigned int& retries) {
  while (!attempt()) {
    const ErrRecorder raw = ThrowOnlyBadAlloc([this] { return ErrRecorder(*this); });
    SetDBErr(raw);
    if (!IsBusyOrLocked(raw.errCode) || ++retries > retryLimit) return false;
    RandomSleepInMSec(1000, 2000);
  }
  return true;
}

bool SqliteDB::Exec(const std::string& sql) {
  SetErr(ERR::ERR_UNKNOWN);
  if (sql.empty()) {
    SetErr(ERR::BAD_PARAMETER);
    KELODR_LOG(ERR, __func__, "empty command to exec db[%s]", dbPath.c_str());
    return false;
  }
  if (!Open()) {
    SetErr(ERR::ERR_DATABASE_OPERATION);
    KELODR_LOG(ERR, __func__, "Failed to open db [%s]", dbPath.c_str());
    return false;
  }
  if (dbHandle == nullptr) {
    SetErr(ERR::ERR_NULL_POINTER);
    KELODR_LOG(ERR, __func__, "DB[%s] is not opened", dbPath.c_str());
    return false;
  }
  unsigned int retries = 0;
  if (!RetryWhileLocked([&] { return DoExecSqliteCommand(sql); }, retries)) {
    LogExecFailed(__func__, retries, sql, GetErr());
    return false;
  }
  SetErr(0);
  LogExecRetried(__func__, retries, sql);
  return true;
}

// How both queries begin. Other than Exec, they leave the error of a failed Open as it was and do
// not look at the handle after it.
bool SqliteDB::OpenForQuery(const std::string& sql, const char* emptyMessage) {
  const char* const function = "SelectByCommand";
  if (sql.empty()) {
    SetErr(ERR::BAD_PARAMETER);
    KELODR_LOG(ERR, function, "%s", emptyMessage);
    return false;
  }
  if (Open()) return true;
  KELODR_LOG(ERR, function, "Failed to open db [%s]", dbPath.c_str());
  return false;
}

bool SqliteDB::SelectByCommand(const std::string& sql, SqliteValueList& record) {
  if (!OpenForQuery(sql, "Empty command to select record")) return false;
  unsigned int retries = 0;
  if (!RetryWhileLocked([&] { return TrySelectFirst(sql, record, "SelectByCommand"); }, retries)) {
    KELODR_LOG(ERR, __func__, "Reach retry limit [%u], failed to select command[%s] with err [%s]",
               retries, sql.c_str(), JsonValue::toString(GetErr()).c_str());
    return false;
  }
  LogExecRetried(__func__, retries, sql);
  return true;
}

// All attempts of a query for many rows, in the name of SelectByCommand.
template <typename Attempt>
bool SqliteDB::SelectRows(const std::string& sql, const Attempt& attempt) {
  const char* const function = "SelectByCommand";
  if (!OpenForQuery(sql, "Empty command to select records")) return false;
  unsigned int retries = 0;
  if (!RetryWhileLocked(attempt, retries)) {
    LogExecFailed(function, retries, sql, GetErr());
    return false;
  }
  if (retries > 0) {
    KELODR_LOG(INFO, function, "After retry [%u] times, success to select command", retries);
  }
  return true;
}

bool SqliteDB::SelectByCommand(const std::string& sql, std::vector<SqliteValueList>& records) {
  return SelectRows(sql, [&] { return TrySelectAll(sql, records, "SelectByCommand"); });
}

bool SqliteDB::IsTableExisted(const std::string& tableName) {
  std::string sql;
  sql.reserve(kTableQueryRoom + tableName.size());
  sql.append("SELECT 1 FROM sqlite_master WHERE type='table' AND name='").append(tableName);
  sql += "';";
  bool isFound = false;
  const auto takeRow = [&isFound](sqlite3_stmt* /*stmt*/) { return isFound = true; };
  SelectRows(sql, [&] { return TrySelect(sql, takeRow); });
  return isFound;
}

bool SqliteDB::GetCount(const SqliteTableHandler& table, int& count) {
  const std::string sql = "SELECT count() as count FROM '" + table.tableName + "';";
  std::vector<SqliteValueList> rows;
  SelectByCommand(sql, rows);
  if (rows.empty()) {
    KELODR_LOG(ERR, __func__, "Record is empty on command [%s]", sql.c_str());
    return false;
  }
  if (!rows.front().GetValue("count", count)) {
    KELODR_LOG(ERR, __func__, "Record error [%s]", rows.front().ToStr().c_str());
    return false;
  }
  return true;
}

bool SqliteDB::CreateTable(const SqliteTableHandler& table) {
  if (table.columnDefs.empty()) return true;
  if (table.tableName.empty()) {
    KELODR_LOG(ERR, __func__, "Invalid table [%s]", table.tableName.c_str());
    return false;
  }
  if (IsTableExisted(table.tableName)) return true;
  if (!Exec("CREATE TABLE IF NOT EXISTS " + table.tableName + " (" + table.columnDefs + ")")) {
    KELODR_LOG(ERR, __func__, "Failed to create table [%s] with cmd[%s]", table.tableName.c_str(),
               table.columnDefs.c_str());
    return false;
  }
  return true;
}

bool SqliteDB::Exec(const SqliteCommand& cmd) {
  SetErr(ERR::ERR_UNKNOWN);
  KELODR_LOG(INFO, __func__, "%s Exec cmd: %s", logLabel.c_str(), cmd.GetCommand().c_str());
  if (!cmd.IsValid()) {
    SetErr(ERR::BAD_PARAMETER);
    return false;
  }
  SetErr(ERR::ERR_DATABASE_OPERATION);
  if (!CreateTable(cmd.GetTable())) {
    KELODR_LOG(ERR, __func__, "Failed to create table [%s]", cmd.GetTable().tableName.c_str());
    return false;
  }
  const std::string sql = cmd.GetCommand();
  if (!Exec(sql)) {
    KELODR_LOG(ERR, __func__, "Failed to exec [%s] in db[%s]", sql.c_str(), dbPath.c_str());
    return false;
  }
  KELODR_LOG(INFO, __func__, "%s Exec cmd success", logLabel.c_str());
  return true;
}

bool SqliteDB::InsertRecord(const InsertCommand& cmd) { return Exec(cmd); }

bool SqliteDB::UpdateRecord(const UpdateCommand& cmd) { return Exec(cmd); }

bool SqliteDB::DeleteRecord(const DeleteCommand& cmd) {
  if (!IsExisted()) return true;
  return Exec(cmd);
}

bool SqliteDB::DeleteRecord(const std::string& condition, const SqliteTableHandler& table) {
  if (condition.empty()) {
    SetErr(ERR::BAD_PARAMETER);
    KELODR_LOG(ERR, __func__, "invalid delete command: condition[%s]", condition.c_str());
    return false;
  }
  DeleteCommand cmd;
  cmd.SetTable(table);
  cmd.SetCondition(condition);
  return DeleteRecord(cmd);
}

bool SqliteDB::DeleteAllRecords(const SqliteTableHandler& table) {
  DeleteCommand cmd;
  cmd.SetTable(table);
  cmd.DeleteAll();
  return DeleteRecord(cmd);
}

template <typename Rows>
bool SqliteDB::SelectWithCommand(const SelectCommand& cmd, Rows& rows, const char* function) {
  if (!cmd.IsValid()) {
    SetErr(ERR::BAD_PARAMETER);
    KELODR_LOG(ERR, function, "invalid select command [%s]", cmd.ToStr().c_str());
    return false;
  }
  if (!IsExisted()) return false;
  SetErr(ERR::ERR_DATABASE_OPERATION);
  if (!CreateTable(cmd.GetTable())) {
    KELODR_LOG(ERR, function, "%s", "Failed to create table");
    return false;
  }
  return SelectByCommand(cmd.GetCommand(), rows);
}

bool SqliteDB::SelectRecord(const SelectCommand& cmd, SqliteValueList& record) {
  return SelectWithCommand(cmd, record, __func__);
}

bool SqliteDB::SelectRecords(const SelectCommand& cmd, std::vector<SqliteValueList>& records) {
  return SelectWithCommand(cmd, records, __func__);
}

}  // namespace KeloDRCore
