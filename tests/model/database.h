// The database handle, under faults of SQLite.

#ifndef KELODRCORE_TESTS_MODEL_DATABASE_H_
#define KELODRCORE_TESTS_MODEL_DATABASE_H_

#include <sqlite3.h>

#include <filesystem>
#include <fstream>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "kelodrcore/err.h"
#include "kelodrcore/sqlite_db.h"
#include "kelodrcore/sqlite_transaction.h"
#include "kelodrcore/utils.h"
#include "model/commands.h"

namespace Model {

class ErrRecorder {
 public:
  virtual ~ErrRecorder() = default;
  virtual std::string GetErrCodeStr(int /*code*/) const { return ""; }
  Json::Value GetErr() const {
    Json::Value document;
    document["err_code"] = errCode;
    const std::string name = GetErrCodeStr(errCode);
    if (!name.empty()) document["err_code_str"] = name;
    if (!errMsg.isNull()) document["err_msg"] = errMsg;
    return document;
  }

  int errCode = 0;
  Json::Value errMsg;
};

class SqliteDB : public ErrRecorder {
 public:
  SqliteDB(const std::string& path, unsigned int retries, const std::string& label)
      : dbPath(path), retryLimit(retries), logLabel(label) {}
  ~SqliteDB() override { Close(); }

  bool Open() {
    if (dbHandle != nullptr) return true;
    if (sqlite3_open(dbPath.c_str(), &dbHandle) != SQLITE_OK) {
      Close();
      Trace::Log(Warn, kFile, "Open", "Failed to open db[%s]", dbPath.c_str());
      return false;
    }
    if (sqlite3_busy_timeout(dbHandle, 1000) != SQLITE_OK) {
      Trace::Log(Warn, kFile, "Open", "Failed to set busy timeout with error");
      return false;
    }
    return true;
  }

  void Close() {
    if (dbHandle != nullptr) sqlite3_close(dbHandle);
    dbHandle = nullptr;
  }

  bool IsInTransaction() const {
    return dbHandle != nullptr && sqlite3_get_autocommit(dbHandle) == 0;
  }
  void RollBack() { sqlite3_exec(dbHandle, "ROLLBACK", nullptr, nullptr, nullptr); }

  bool IsExisted() const { return std::filesystem::exists(Calls::Place(dbPath)); }

  bool DoExecSqliteCommand(const std::string& sql) {
    return !HasNul(sql, "DoExecSqliteCommand") && ExecOnce(sql);
  }
  bool DoSelectSqliteRecord(const std::string& sql, ValueList& record) {
    return !HasNul(sql, "DoSelectSqliteRecord") && SelectOnce(sql, Into(record));
  }
  bool DoSelectSqliteRecords(const std::string& sql, std::vector<ValueList>& records) {
    return !HasNul(sql, "DoSelectSqliteRecords") && SelectOnce(sql, Into(records));
  }

  bool Exec(const std::string& sql) {
    SetErr(407);
    if (sql.empty()) {
      SetErr(401);
      return Failed("Exec", "empty command to exec db[%s]", dbPath);
    }
    if (HasNul(sql, "Exec")) return false;
    if (!Open()) {
      SetErr(404);
      return Failed("Exec", "Failed to open db [%s]", dbPath);
    }
    if (dbHandle == nullptr) {
      SetErr(403);
      return Failed("Exec", "DB[%s] is not opened", dbPath);
    }
    unsigned int retries = 0;
    if (!Retried(retries, [&] { return ExecOnce(sql); })) {
      return GaveUp("Exec", "exec command ", retries, sql);
    }
    SetErr(0);
    if (retries > 0) {
      Trace::Log(Info, kFile, "Exec", "After retry [%u] times, success to exec command [%s]",
                 retries, sql.c_str());
    }
    return true;
  }

  bool SelectByCommand(const std::string& sql, ValueList& record) {
    if (!OpenFor(sql, "Empty command to select record")) return false;
    unsigned int retries = 0;
    if (!Retried(retries, [&] { return SelectOnce(sql, Into(record)); })) {
      return GaveUp("SelectByCommand", "select command", retries, sql);
    }
    if (retries > 0) {
      Trace::Log(Info, kFile, "SelectByCommand",
                 "After retry [%u] times, success to exec command [%s]", retries, sql.c_str());
    }
    return true;
  }

  bool SelectByCommand(const std::string& sql, std::vector<ValueList>& records) {
    bool isHandedOver = false;
    return SelectRows(sql, Into(records), isHandedOver);
  }

  void SetDBErr(int code, const char* message) {
    if (code == SQLITE_OK) return;
    errMsg = message != nullptr ? message : sqlite3_errmsg(dbHandle);
    errCode = code;
  }
  void SetDBErr(const ErrRecorder& raw) {
    Json::Value details;
    if (raw.errCode != 0) details["sqlite_errcode"] = raw.errCode;
    if (!raw.errMsg.isNull()) details["sqlite_errmsg"] = raw.errMsg;
    errCode = raw.errCode == SQLITE_BUSY || raw.errCode == SQLITE_LOCKED ? 405 : 404;
    errMsg = details;
  }

  bool IsTableExisted(const std::string& name) {
    std::vector<ValueList> rows;
    SelectByCommand("SELECT 1 FROM sqlite_master WHERE type='table' AND name='" + name + "';",
                    rows);
    return !rows.empty();
  }

  bool GetCount(const Table& table, int& count) {
    const std::string sql = "SELECT count() as count FROM '" + table.tableName + "';";
    std::vector<ValueList> rows;
    SelectByCommand(sql, rows);
    if (rows.empty()) return Failed("GetCount", "Record is empty on command [%s]", sql);
    if (rows[0].GetValue("count", count)) return true;
    return Failed("GetCount", "Record error [%s]", rows[0].ToStr());
  }

  bool CreateTable(const Table& table) {
    if (table.columnDefs.empty()) return true;
    if (table.tableName.empty()) return Failed("CreateTable", "Invalid table [%s]", "");
    if (IsTableExisted(table.tableName)) return true;
    if (Exec("CREATE TABLE IF NOT EXISTS " + table.tableName + " (" + table.columnDefs + ")")) {
      return true;
    }
    return Failed("CreateTable", "Failed to create table [%s] with cmd[%s]", table.tableName,
                  table.columnDefs);
  }

  bool Exec(const Command& command) {
    SetErr(407);
    const std::string sql = command.GetCommand();
    Trace::Log(Info, kFile, "Exec", "%s Exec cmd: %s", logLabel.c_str(), sql.c_str());
    if (!command.IsValid()) {
      SetErr(401);
      return false;
    }
    if (HasNul(sql, "Exec")) return false;
    SetErr(404);
    if (!CreateTable(command.GetTable())) {
      return Failed("Exec", "Failed to create table [%s]", command.GetTable().tableName);
    }
    if (!Exec(sql)) return Failed("Exec", "Failed to exec [%s] in db[%s]", sql, dbPath);
    Trace::Log(Info, kFile, "Exec", "%s Exec cmd success", logLabel.c_str());
    SetErr(0);
    return true;
  }

  bool InsertRecord(const InsertCommand& command) { return Exec(command); }
  bool UpdateRecord(const UpdateCommand& command) { return Exec(command); }
  bool DeleteRecord(const DeleteCommand& command) { return !IsExisted() || Exec(command); }
  bool DeleteRecord(const std::string& condition, const Table& table) {
    if (condition.empty()) {
      SetErr(401);
      return Failed("DeleteRecord", "invalid delete command: condition[%s]", condition);
    }
    DeleteCommand command;
    command.SetTable(table);
    command.SetCondition(condition);
    return DeleteRecord(command);
  }
  bool DeleteAllRecords(const Table& table) {
    DeleteCommand command;
    command.SetTable(table);
    command.DeleteAll();
    return DeleteRecord(command);
  }

  bool SelectRecord(const SelectCommand& command, ValueList& record) {
    return Prepared(command, "SelectRecord") &&
           Cleared(SelectByCommand(command.GetCommand(), record));
  }
  bool SelectRecords(const SelectCommand& command, std::vector<ValueList>& records) {
    return Prepared(command, "SelectRecords") &&
           Cleared(SelectByCommand(command.GetCommand(), records));
  }
  bool SelectEach(const SelectCommand& command, const std::function<bool(const ValueList&)>& take) {
    bool isHandedOver = false;
    const auto takeOne = [&](const ValueList& row) {
      isHandedOver = true;
      return take(row);
    };
    return Prepared(command, "SelectEach") &&
           Cleared(SelectRows(command.GetCommand(), takeOne, isHandedOver));
  }

 private:
  static constexpr const char* kFile = "sqlite_db.cpp";
  using Take = std::function<bool(const ValueList&)>;  // false: no more rows

  static Take Into(ValueList& record) {
    return [&](const ValueList& row) {
      record = row;
      return false;
    };
  }
  static Take Into(std::vector<ValueList>& records) {
    return [&](const ValueList& row) {
      records.push_back(row);
      return true;
    };
  }

  template <typename... Arguments>
  static bool Failed(const char* function, const char* format, const Arguments&... arguments) {
    Trace::Log(Err, kFile, function, format, std::string(arguments).c_str()...);
    return false;
  }

  void SetErr(int code) {
    errCode = code;
    errMsg = Json::nullValue;
  }

  bool HasNul(const std::string& sql, const char* function) {
    if (sql.find('\0') == std::string::npos) return false;
    SetErr(401);
    Failed(function, "NUL byte in command [%s]", sql);
    return true;
  }

  bool GaveUp(const char* function, const char* what, unsigned int retries,
              const std::string& sql) {
    return Failed(function, "Reach retry limit [%s], failed to %s[%s] with err [%s]",
                  std::to_string(retries), what, sql, ToText(GetErr()));
  }

  bool OpenFor(const std::string& sql, const char* emptyMessage) {
    if (sql.empty()) {
      SetErr(401);
      return Failed("SelectByCommand", emptyMessage);
    }
    if (HasNul(sql, "SelectByCommand")) return false;
    return Open() || Failed("SelectByCommand", "Failed to open db [%s]", dbPath);
  }

  bool ExecOnce(const std::string& sql) {
    const bool wasFree = !IsInTransaction();
    char* text = nullptr;
    const int code = sqlite3_exec(dbHandle, sql.c_str(), nullptr, nullptr, &text);
    if (code != SQLITE_OK) SetDBErr(code, text);
    if (text != nullptr) sqlite3_free(text);
    if (code != SQLITE_OK && wasFree && IsInTransaction()) RollBack();
    return code == SQLITE_OK;
  }

  // `take` is given each row until it has enough, which is a success.
  bool SelectOnce(const std::string& sql, const Take& take) {
    SetErr(404);
    sqlite3_stmt* statement = nullptr;
    int code = sqlite3_prepare_v2(dbHandle, sql.c_str(), -1, &statement, nullptr);
    const std::shared_ptr<sqlite3_stmt> owner(statement, sqlite3_finalize);
    if (code == SQLITE_OK) {
      do {
        code = sqlite3_step(statement);
      } while (code == SQLITE_ROW && take(ParseRecord(statement)));
      if (code == SQLITE_ROW || code == SQLITE_DONE) {
        SetErr(0);
        return true;
      }
    }
    SetDBErr(code, nullptr);
    return false;
  }

  static ValueList ParseRecord(sqlite3_stmt* statement) {
    ValueList record;
    for (int i = 0; i < sqlite3_column_count(statement); ++i) {
      const char* const name = sqlite3_column_name(statement, i);
      const int type = sqlite3_column_type(statement, i);
      if (type == SQLITE_INTEGER) {
        record.AddValue(name, static_cast<long long>(sqlite3_column_int64(statement, i)));
      } else if (type == SQLITE_TEXT) {
        const auto* const text = reinterpret_cast<const char*>(sqlite3_column_text(statement, i));
        record.AddValue(name, std::string(text != nullptr ? text : ""));
      } else if (type == SQLITE_NULL) {
        Trace::Log(Warn, kFile, "ParseRecord", "field [%s] has null value", name);
      } else {
        Trace::Log(Warn, kFile, "ParseRecord", "Not supported type [%d] with field [%s]", type,
                   name);
      }
    }
    return record;
  }

  template <typename Attempt>
  bool Retried(unsigned int& retries, const Attempt& attempt, const bool& isFinal = false) {
    while (!attempt()) {
      const ErrRecorder raw = *this;
      SetDBErr(raw);
      if (raw.errCode != SQLITE_BUSY && raw.errCode != SQLITE_LOCKED) return false;
      if (isFinal) return false;
      if (++retries > retryLimit) return false;
      Trace::Add("pause of 1000 to 2000 ms");
    }
    return true;
  }

  // Rows that were handed over are not handed over again.
  bool SelectRows(const std::string& sql, const Take& take, const bool& isHandedOver) {
    if (!OpenFor(sql, "Empty command to select records")) return false;
    unsigned int retries = 0;
    if (!Retried(
            retries, [&] { return SelectOnce(sql, take); }, isHandedOver)) {
      return GaveUp("SelectByCommand", "exec command ", retries, sql);
    }
    if (retries > 0) {
      Trace::Log(Info, kFile, "SelectByCommand",
                 "After retry [%u] times, success to select command", retries);
    }
    return true;
  }

  bool Prepared(const SelectCommand& command, const char* function) {
    if (!command.IsValid()) {
      SetErr(401);
      return Failed(function, "invalid select command [%s]", command.ToStr());
    }
    if (!IsExisted() || HasNul(command.GetCommand(), "SelectByCommand")) return false;
    SetErr(404);
    return CreateTable(command.GetTable()) || Failed(function, "Failed to create table");
  }

  bool Cleared(bool isSelected) {
    if (isSelected) SetErr(0);
    return isSelected;
  }

  sqlite3* dbHandle = nullptr;
  std::string dbPath;
  unsigned int retryLimit;
  std::string logLabel;
};

class Transaction {
 public:
  explicit Transaction(SqliteDB& db) : handle(db), isBegun(db.Exec("BEGIN IMMEDIATE")) {}
  Transaction(const Transaction&) = delete;
  Transaction& operator=(const Transaction&) = delete;
  ~Transaction() { Rollback(); }
  bool IsOpen() const { return isBegun && handle.IsInTransaction(); }
  bool Commit() {
    isBegun = !handle.Exec("COMMIT");
    return !isBegun;
  }
  void Rollback() {
    if (IsOpen()) handle.RollBack();
  }

 private:
  SqliteDB& handle;
  bool isBegun;
};

}  // namespace Model

// Handles that name their codes, if they are told to.
template <typename Handle>
class Naming : public Handle {
 public:
  Naming(const std::string& path, unsigned int retries, const std::string& label, bool names)
      : Handle(path, retries, label), isNaming(names) {}
  std::string GetErrCodeStr(int code) const override {
    return isNaming ? KeloDRCore::ERR::ToString(code) : "";
  }

 private:
  bool isNaming;
};

class Database {
 public:
  Database(const std::string& itsDir, Commands& itsCommands) : dir(itsDir), commands(itsCommands) {
    std::filesystem::create_directories(dir + "/own");
    std::filesystem::create_directories(dir + "/twin");
  }

  void Step() {
    if (db.library == nullptr || Draw::Once(isUsual ? 60 : 10)) Renew();
    if (Draw::Once(2)) DrawFault();
    if (Draw::Once(12)) Calls::Hold(dir + "/own/db");
    Table table;
    switch (Draw::Below(11)) {
      case 0:
        OfConnection();
        break;
      case 1:
      case 2:
        OfText();
        break;
      case 3:
        OfTable();
        break;
      case 4:
        OfErr();
        break;
      case 5:
        OfDeletes();
        break;
      case 6:
        OfTransaction();
        break;
      default:
        OfCommand();
    }
    Calls::fault = {};
    Calls::LetGo();
    if (Draw::Once(30)) {
      Do("what the database holds", [](auto /*side*/) { return Calls::DumpDatabase(); });
    }
  }

 private:
  using Table = TableTwin;

  // Another handle, on the same file or a new one, or on what is no database.
  void Renew() {
    static const std::vector<std::string> odd = {"none/db", "garbage", "."};
    static const std::vector<std::string> labels = {"", "label", "%s", "[backup]"};
    isUsual = !Draw::Once(4);
    const std::string path = dir + "/own/" + (isUsual ? "db" : Draw::Of(odd));
    const auto retries = static_cast<unsigned int>(Draw::Below(4));
    const std::string& label = Draw::Of(labels);
    const bool isNaming = Draw::Once(3);
    const bool isNew = Draw::Once(2);
    Do("a new handle", [&](auto side) {
      side(db) = nullptr;
      if (isNew) std::filesystem::remove(Calls::Place(dir + "/own/db"));
      std::ofstream(Calls::Place(dir + "/own/garbage")) << std::string(2000, 'g');
      using Handle = typename std::decay_t<decltype(side(db))>::element_type;
      side(db) = std::make_unique<Handle>(path, retries, label, isNaming);
      return Show(side(db)->GetErr());
    });
  }

  void DrawFault() {
    static const std::vector<std::string> kinds = {"open",    "busy_timeout", "exec", "exec",
                                                   "prepare", "step",         "step", "text"};
    static const std::vector<int> codes = {5,  5,  5,  6,  6,   1,   7, 8,   10,  11, 13,
                                           14, 17, 21, 26, 100, 101, 0, 261, 517, 266};
    Calls::Fault& fault = Calls::fault;
    fault = {Draw::Of(kinds), Draw::Once(2) ? 0 : int(Draw::Below(4)), int(Draw::Below(4)) + 1,
             Draw::Of(codes), Draw::Once(3)};
    // A prepared statement without one, and a row without a statement, are no answers of SQLite.
    const bool isRow = fault.code == 0 || fault.code == 100 || fault.code == 101;
    if (fault.kind == "prepare" && isRow) fault.code = SQLITE_ERROR;
    if (fault.kind == "step" && fault.code == 100) fault.code = SQLITE_IOERR;
    if (fault.kind == "open" || fault.kind == "busy_timeout") {
      fault.first = 0;
      if (Draw::Once(3)) fault.code = SQLITE_OK;  // an open without a connection
      Do("close", [&](auto side) {
        side(db)->Close();
        return "";
      });
    }
  }

  static std::string Sql() {
    static const std::vector<std::string> texts = {
        "CREATE TABLE IF NOT EXISTS t (id INTEGER PRIMARY KEY, name TEXT, a, b INTEGER, x REAL)",
        "INSERT INTO t (name, a, x) VALUES ('n', x'00', 1.5)",
        "INSERT INTO t (id) VALUES (1)",
        "INSERT INTO t (name, a) VALUES ('it''s', 1 << 40); DELETE FROM t WHERE id > 8",
        "SELECT * FROM t",
        "SELECT * FROM t",
        "SELECT id AS a, a AS id, NULL AS n, 1.5 FROM t",
        "SELECT 'a' || char(0) || 'b' AS nul, '' AS empty, x'' AS blob, -1 AS n",
        "SELECT 1 AS one, 'two' AS one",
        "SELECT 1 AS ''",
        "DELETE FROM t WHERE 0",
        "",
        " ",
        "-- nothing",
        "no such statement",
        "SELECT no FROM t",
        "BEGIN",
        "COMMIT",
        "ROLLBACK;",
        "BEGIN IMMEDIATE; INSERT INTO t (name) VALUES ('in'); no such statement",
        "BEGIN; INSERT INTO t (name) VALUES ('kept'); COMMIT",
        "SAVEPOINT s; INSERT INTO t",
        "INSERT INTO t (name) VALUES ('%s%n'); SELECT x FROM nowhere",
        "PRAGMA user_version",
        "SELECT abs(-9223372036854775808) FROM t",
        "SELECT id FROM t ORDER BY id DESC; no such",
        std::string("SELECT 1\0; DROP TABLE t", 23),
        std::string("\0", 1)};
    return Draw::Of(texts);
  }

  // What an operation left, with the recorded error.
  template <typename Handle, typename... Left>
  static std::string End(bool result, const Handle& handle, const Left&... left) {
    std::string shown = Show(result, handle->GetErr());
    ((shown += " " + ShowList(left)), ...);
    return shown;
  }
  template <typename Handle, typename List>
  static std::string End(bool result, const Handle& handle, const std::vector<List>& rows) {
    std::string shown = Show(result, handle->GetErr());
    for (const List& row : rows) shown += " " + ShowList(row);
    return shown;
  }

  void OfConnection() {
    const size_t kind = Draw::Below(4);
    Do("the connection", [&](auto side) {
      if (kind == 0) side(db)->Close();
      if (kind == 3) return Show(side(db)->IsExisted());
      return End(side(db)->Open(), side(db));
    });
  }

  void OfText() {
    const std::string sql = Sql();
    const size_t kind = Draw::Below(6);
    const bool isAttempt = kind < 3;
    if (isAttempt && Calls::fault.kind == "open") Calls::fault = {};
    if (rows.model.size() > 20) rows = {};
    Do("run: " + sql, [&](auto side) {
      auto& handle = *side(db);
      if (isAttempt && !handle.Open()) return End(false, side(db));
      switch (kind) {
        case 0:
          return End(handle.DoExecSqliteCommand(sql), side(db));
        case 1:
          return End(handle.DoSelectSqliteRecord(sql, side(row)), side(db), side(row));
        case 2:
          return End(handle.DoSelectSqliteRecords(sql, side(rows)), side(db), side(rows));
        case 3:
          return End(handle.Exec(sql), side(db));
        case 4:
          return End(handle.SelectByCommand(sql, side(row)), side(db), side(row));
        default:
          return End(handle.SelectByCommand(sql, side(rows)), side(db), side(rows));
      }
    });
  }

  void OfTable() {
    Table table = DrawTable();
    const size_t kind = Draw::Below(3);
    Do("table " + table.model.tableName, [&](auto side) {
      auto& handle = *side(db);
      int count = -5;
      switch (kind) {
        case 0:
          return End(handle.IsTableExisted(table.model.tableName), side(db));
        case 1:
          return End(handle.CreateTable(side(table)), side(db));
        default:
          const bool isCounted = handle.GetCount(side(table), count);
          return Show(count) + End(isCounted, side(db));
      }
    });
  }

  void OfErr() {
    static const std::vector<int> codes = {0, 1, 5, 6, 7, 21, 404, -1};
    const int code = Draw::Of(codes);
    const std::string text = Draw::Text();
    const size_t kind = Draw::Below(4);
    Do("SetDBErr", [&](auto side) {
      if (kind == 0) side(db)->SetDBErr(code, nullptr);
      if (kind == 1) side(db)->SetDBErr(code, text.c_str());
      if (kind == 2) side(db)->SetDBErr(*side(db));
      if (kind == 3) side(db)->SetDBErr(*side(other));
      return Show(side(db)->GetErr());
    });
    Do("copy the recorder", [&](auto side) {
      *side(other) = *side(db);
      return Show(side(other)->GetErr());
    });
  }

  static KeloDRCore::SqliteTransaction Begin(Library /*side*/, KeloDRCore::SqliteDB& handle) {
    return KeloDRCore::SqliteTransaction(handle);
  }
  static Model::Transaction Begin(Modelled /*side*/, Model::SqliteDB& handle) {
    return Model::Transaction(handle);
  }

  void OfTransaction() {
    const size_t end = Draw::Below(4);
    Do("a transaction that ends by " + std::to_string(end), [&](auto side) {
      std::string shown;
      {
        auto transaction = Begin(side, *side(db));
        shown = Show(transaction.IsOpen(), side(db)->GetErr());
        side(db)->InsertRecord(side(commands.insert));
        if (end == 0) side(db)->Close();
        if (end == 1) transaction.Rollback();
        if (end == 2 && transaction.IsOpen()) shown += Show(transaction.Commit());
        shown += Show(transaction.IsOpen(), side(db)->GetErr());
      }
      return shown + Show(side(db)->GetErr()) + Calls::DumpDatabase();
    });
  }

  void OfDeletes() {
    Table table = DrawTable();
    const std::string condition = DrawCondition();
    const size_t kind = Draw::Below(3);
    Do("delete from " + table.model.tableName, [&](auto side) {
      auto& handle = *side(db);
      if (kind == 0) return End(handle.DeleteAllRecords(side(table)), side(db));
      if (kind == 1) return End(handle.DeleteRecord(side(commands.erase)), side(db));
      return End(handle.DeleteRecord(condition, side(table)), side(db));
    });
  }

  void OfCommand() {
    const size_t kind = Draw::Below(7);
    const size_t most = Draw::Below(4);
    Do("run a command", [&](auto side) {
      auto& handle = *side(db);
      switch (kind) {
        case 0:
        case 1:
          return End(handle.InsertRecord(side(commands.insert)), side(db));
        case 2:
          return End(handle.UpdateRecord(side(commands.update)), side(db));
        case 3:
          return End(handle.Exec(side(commands.select)), side(db));
        case 4:
          return End(handle.SelectRecord(side(commands.select), side(row)), side(db), side(row));
        case 5:
          return End(handle.SelectRecords(side(commands.select), side(rows)), side(db), side(rows));
        default:
          return Each(side, most);
      }
    });
  }

  // SelectEach: takes some rows, and throws in place of taking a third.
  template <typename Side>
  std::string Each(Side side, size_t most) {
    std::string taken;
    const auto take = [&](const auto& record) {
      taken += ShowList(record) + ";";
      if (most == 3 && taken.size() > 60) throw Json::LogicError("enough");
      return taken.size() < most * 30;
    };
    const bool result = side(db)->SelectEach(side(commands.select), take);
    return taken + End(result, side(db));
  }

  std::string dir;
  Commands& commands;
  bool isUsual = true;  // the handle is on a database that can be opened
  Twin<std::unique_ptr<Naming<KeloDRCore::SqliteDB>>, std::unique_ptr<Naming<Model::SqliteDB>>> db;
  Twin<std::unique_ptr<KeloDRCore::ErrRecorder>, std::unique_ptr<Model::ErrRecorder>> other = {
      std::make_unique<KeloDRCore::ErrRecorder>(), std::make_unique<Model::ErrRecorder>()};
  ListTwin row;
  Twin<std::vector<KeloDRCore::SqliteValueList>, std::vector<Model::ValueList>> rows;
};

#endif  // KELODRCORE_TESTS_MODEL_DATABASE_H_
