#include "kelodrcore/sqlite_db.h"

#include <sqlite3.h>

#include <memory>
#include <new>
#include <utility>

#include "kelocore.h"
#include "kelodrcore/err.h"
#include "kelodrcore/json_value.h"
#include "kelodrcore/utils.h"
#include "log.h"
#include "sqlite_attempt.h"
#include "sqlite_bulk.h"
#include "sqlite_query.h"
#include "value_access.h"

namespace KeloDRCore {
namespace {

constexpr int kBusyTimeoutInMSec = 1000;

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

template <typename Payload>
void AddField(SqliteValueList& record, const std::string& name, const Payload& payload) {
  if (name.empty()) {
    record.AddValue(name, payload);  // refuses and logs
  } else {
    ValueAccess::SetField(record, name, payload);
  }
}

SqliteValueList ParseRecord(Query& query) {
  SqliteValueList record;
  int column = 0;
  for (const std::string& name : query.Names()) {
    const int type = query.Type(column);
    if (type == SQLITE_INTEGER) {
      AddField(record, name, query.Integer(column));
    } else if (type == SQLITE_TEXT) {
      AddField(record, name, query.Text(column));
    } else if (type == SQLITE_NULL) {
      KELODR_LOG(WARN, __func__, "field [%s] has null value", name.c_str());
    } else {
      KELODR_LOG(WARN, __func__, "Not supported type [%d] with field [%s]", type, name.c_str());
    }
    ++column;
  }
  return record;
}

SqliteValueList Row(Query& query) {
  return ThrowOnlyBadAlloc([&] { return ParseRecord(query); });
}

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

void LogSelectRetried(unsigned int retries) {
  if (retries == 0) return;
  KELODR_LOG(INFO, "SelectByCommand", "After retry [%u] times, success to select command", retries);
}

}  // namespace

ErrRecorder::ErrRecorder() : errCode(0) {}

Json::Value ErrRecorder::GetErr() const {
  const std::string name = GetErrCodeStr(errCode);
  return ThrowOnlyBadAlloc([&] {
    Json::Value err;
    err["err_code"] = errCode;
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

bool SqliteDB::IsInTransaction() const {
  return dbHandle != nullptr && sqlite3_get_autocommit(dbHandle) == 0;
}

// A transaction that cannot even be rolled back, for lack of memory, ends with the connection: what
// comes after it must not become a part of it.
void SqliteDB::AbandonTransaction() {
  sqlite3_exec(dbHandle, "ROLLBACK", nullptr, nullptr, nullptr);
  if (IsInTransaction()) Close();
}

// True, with the error and a line, for a text of which SQLite would run only the start.
bool SqliteDB::RefuseNul(const std::string& sql, const char* function) const {
  if (sql.find('\0') == std::string::npos) return false;
  SetErr(ERR::BAD_PARAMETER);
  KELODR_LOG(ERR, function, "NUL byte in command [%s]", sql.c_str());
  return true;
}

bool SqliteDB::DoExecSqliteCommand(const std::string& sql) {
  if (RefuseNul(sql, __func__)) return false;
  Attempt attempt(*this);
  char* errText = nullptr;
  const int code = sqlite3_exec(dbHandle, sql.c_str(), nullptr, nullptr, &errText);
  const std::unique_ptr<char, void (*)(void*)> owner(errText, sqlite3_free);
  SetDBErr(code, errText);
  if (code == SQLITE_OK) attempt.Keep();
  return code == SQLITE_OK;
}

bool SqliteDB::DoSelectSqliteRecord(const std::string& sql, SqliteValueList& record) {
  if (RefuseNul(sql, __func__)) return false;
  SetErr(ERR::ERR_DATABASE_OPERATION);
  Query query(dbHandle, sql);
  if (query.Next()) record = Row(query);
  return SetQueryEnd(query.Code());
}

bool SqliteDB::DoSelectSqliteRecords(const std::string& sql,
                                     std::vector<SqliteValueList>& records) {
  if (RefuseNul(sql, __func__)) return false;
  SetErr(ERR::ERR_DATABASE_OPERATION);
  Query query(dbHandle, sql);
  while (query.Next()) records.push_back(Row(query));
  return SetQueryEnd(query.Code());
}

bool SqliteDB::TrySelectEach(const std::string& sql, const RecordTaker& take, bool& isHandedOver) {
  SetErr(ERR::ERR_DATABASE_OPERATION);
  Query query(dbHandle, sql);
  while (query.Next()) {
    isHandedOver = true;
    if (!take(Row(query))) break;
  }
  return SetQueryEnd(query.Code());
}

// Records how a query ended that SQLite left with this code.
bool SqliteDB::SetQueryEnd(int code) const {
  if (code == SQLITE_ROW || code == SQLITE_DONE) {
    SetErr(0);
    return true;
  }
  SetDBErr(code, nullptr);
  return false;
}

// Gives the failure of an attempt its place among the codes, which what SQLite was not given has
// already. True when it was another one's lock.
bool SqliteDB::ClassifyErr() const {
  if (errCode == ERR::BAD_PARAMETER) return false;
  const ErrRecorder raw = ThrowOnlyBadAlloc([this] { return ErrRecorder(*this); });
  SetDBErr(raw);
  return IsBusyOrLocked(raw.errCode);
}

// False when the limit is reached. `retries` counts one past it then, and is what the lines show.
bool SqliteDB::PauseBeforeRetry(unsigned int& retries) const {
  if (++retries > retryLimit) return false;
  RandomSleepInMSec(1000, 2000);
  return true;
}

bool SqliteDB::OpenForExec(const char* function) {
  if (!Open()) {
    SetErr(ERR::ERR_DATABASE_OPERATION);
    KELODR_LOG(ERR, function, "Failed to open db [%s]", dbPath.c_str());
    return false;
  }
  if (dbHandle == nullptr) {
    SetErr(ERR::ERR_NULL_POINTER);
    KELODR_LOG(ERR, function, "DB[%s] is not opened", dbPath.c_str());
    return false;
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
  if (RefuseNul(sql, __func__) || !OpenForExec(__func__)) return false;
  unsigned int retries = 0;
  while (!DoExecSqliteCommand(sql)) {
    if (ClassifyErr() && PauseBeforeRetry(retries)) continue;
    LogExecFailed(__func__, retries, sql, GetErr());
    return false;
  }
  SetErr(0);
  LogExecRetried(__func__, retries, sql);
  return true;
}

// How all queries begin. Other than Exec, they leave the error of a failed Open as it was and do
// not look at the handle after it.
bool SqliteDB::OpenForQuery(const std::string& sql, const char* emptyMessage) {
  const char* const function = "SelectByCommand";
  if (sql.empty()) {
    SetErr(ERR::BAD_PARAMETER);
    KELODR_LOG(ERR, function, "%s", emptyMessage);
    return false;
  }
  if (RefuseNul(sql, function)) return false;
  if (Open()) return true;
  KELODR_LOG(ERR, function, "Failed to open db [%s]", dbPath.c_str());
  return false;
}

bool SqliteDB::SelectByCommand(const std::string& sql, SqliteValueList& record) {
  if (!OpenForQuery(sql, "Empty command to select record")) return false;
  unsigned int retries = 0;
  while (!DoSelectSqliteRecord(sql, record)) {
    if (ClassifyErr() && PauseBeforeRetry(retries)) continue;
    KELODR_LOG(ERR, __func__, "Reach retry limit [%u], failed to select command[%s] with err [%s]",
               retries, sql.c_str(), JsonValue::toString(GetErr()).c_str());
    return false;
  }
  LogExecRetried(__func__, retries, sql);
  return true;
}

bool SqliteDB::SelectByCommand(const std::string& sql, std::vector<SqliteValueList>& records) {
  if (!OpenForQuery(sql, "Empty command to select records")) return false;
  unsigned int retries = 0;
  while (!DoSelectSqliteRecords(sql, records)) {
    if (ClassifyErr() && PauseBeforeRetry(retries)) continue;
    LogExecFailed(__func__, retries, sql, GetErr());
    return false;
  }
  LogSelectRetried(retries);
  return true;
}

bool SqliteDB::IsTableExisted(const std::string& tableName) {
  std::vector<SqliteValueList> rows;
  SelectByCommand("SELECT 1 FROM sqlite_master WHERE type='table' AND name='" + tableName + "';",
                  rows);
  return !rows.empty();
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
  const bool wasInTransaction = IsInTransaction();
  if (IsTableExisted(table.tableName)) return true;
  // A failed query may have ended the transaction: what follows must not be kept without it.
  const bool isLost = wasInTransaction && !IsInTransaction();
  const std::string sql =
      "CREATE TABLE IF NOT EXISTS " + table.tableName + " (" + table.columnDefs + ")";
  if (isLost || !Exec(sql)) {
    KELODR_LOG(ERR, __func__, "Failed to create table [%s] with cmd[%s]", table.tableName.c_str(),
               table.columnDefs.c_str());
    return false;
  }
  return true;
}

bool SqliteDB::Exec(const SqliteCommand& cmd) {
  SetErr(ERR::ERR_UNKNOWN);
  std::string sql = cmd.GetCommand();
  KELODR_LOG(INFO, __func__, "%s Exec cmd: %s", logLabel.c_str(), sql.c_str());
  if (!cmd.IsValid()) {
    SetErr(ERR::BAD_PARAMETER);
    return false;
  }
  if (RefuseNul(sql, __func__)) return false;
  SetErr(ERR::ERR_DATABASE_OPERATION);
  if (!CreateTable(cmd.GetTable())) {
    KELODR_LOG(ERR, __func__, "Failed to create table [%s]", cmd.GetTable().tableName.c_str());
    return false;
  }
  sql = cmd.GetCommand();
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

// How the selects with a command begin, in the name of each.
bool SqliteDB::PrepareSelect(const SelectCommand& cmd, const char* function) {
  if (!cmd.IsValid()) {
    SetErr(ERR::BAD_PARAMETER);
    KELODR_LOG(ERR, function, "invalid select command [%s]", cmd.ToStr().c_str());
    return false;
  }
  if (!IsExisted()) return false;
  if (RefuseNul(cmd.GetCommand(), "SelectByCommand")) return false;
  SetErr(ERR::ERR_DATABASE_OPERATION);
  if (!CreateTable(cmd.GetTable())) {
    KELODR_LOG(ERR, function, "%s", "Failed to create table");
    return false;
  }
  return true;
}

bool SqliteDB::SelectRecord(const SelectCommand& cmd, SqliteValueList& record) {
  if (!PrepareSelect(cmd, __func__)) return false;
  return SelectByCommand(cmd.GetCommand(), record);
}

bool SqliteDB::SelectRecords(const SelectCommand& cmd, std::vector<SqliteValueList>& records) {
  if (!PrepareSelect(cmd, __func__)) return false;
  return SelectByCommand(cmd.GetCommand(), records);
}

bool SqliteDB::SelectEach(const SelectCommand& cmd, const RecordTaker& take) {
  if (!PrepareSelect(cmd, __func__)) return false;
  const std::string sql = cmd.GetCommand();
  if (!OpenForQuery(sql, "Empty command to select records")) return false;
  unsigned int retries = 0;
  bool isHandedOver = false;
  while (!TrySelectEach(sql, take, isHandedOver)) {
    if (ClassifyErr() && !isHandedOver && PauseBeforeRetry(retries)) continue;
    LogExecFailed("SelectByCommand", retries, sql, GetErr());
    return false;
  }
  LogSelectRetried(retries);
  return true;
}

bool SqliteDB::InsertRecords(const SqliteTableHandler& table,
                             const std::vector<SqliteValueList>& records) {
  return InsertAll(BulkInsert("INSERT", table.tableName, records), table, __func__);
}

bool SqliteDB::InsertOrReplaceRecords(const SqliteTableHandler& table,
                                      const std::vector<SqliteValueList>& records) {
  return InsertAll(BulkInsert("INSERT OR REPLACE", table.tableName, records), table, __func__);
}

bool SqliteDB::InsertAll(const BulkInsert& insert, const SqliteTableHandler& table,
                         const char* function) {
  if (insert.IsEmpty()) return true;
  if (!insert.IsValid()) {
    SetErr(ERR::BAD_PARAMETER);
    KELODR_LOG(ERR, function, "invalid records for table [%s]", table.tableName.c_str());
    return false;
  }
  const std::string sql = insert.FirstCommand();
  if (RefuseNul(sql, function)) return false;
  KELODR_LOG(INFO, function, "%s Exec cmd: %s", logLabel.c_str(), sql.c_str());
  if (!CreateTable(table)) {
    KELODR_LOG(ERR, function, "Failed to create table [%s]", table.tableName.c_str());
    return false;
  }
  if (!OpenForExec(function)) return false;
  unsigned int retries = 0;
  while (!TryInsertAll(insert)) {
    if (ClassifyErr() && PauseBeforeRetry(retries)) continue;
    LogExecFailed(function, retries, sql, GetErr());
    return false;
  }
  SetErr(0);
  KELODR_LOG(INFO, function, "%s Exec cmd success", logLabel.c_str());
  return true;
}

bool SqliteDB::TryInsertAll(const BulkInsert& insert) {
  Attempt attempt(*this);
  if (!attempt.SetSavepoint()) return false;
  std::string message;
  const int code = insert.Run(dbHandle, message);
  if (code == BulkInsert::kInvalidRecord) {
    SetErr(ERR::BAD_PARAMETER);
  } else {
    SetDBErr(code, message.c_str());
  }
  return code == SQLITE_OK && attempt.ReleaseSavepoint();
}

}  // namespace KeloDRCore
