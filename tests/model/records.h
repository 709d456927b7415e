// The handle: tables, commands and many records at once, on a connection; and transactions.

#ifndef KELODRCORE_TESTS_MODEL_RECORDS_H_
#define KELODRCORE_TESTS_MODEL_RECORDS_H_

#include <sqlite3.h>

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "model/commands.h"
#include "model/connection.h"
#include "model/values.h"

namespace Model {

class SqliteDB : public Connection {
 public:
  using Connection::Connection;
  using Connection::Exec;

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

  bool InsertRecords(const Table& table, const std::vector<ValueList>& records) {
    return InsertAll("InsertRecords", "INSERT", table, records);
  }
  bool InsertOrReplaceRecords(const Table& table, const std::vector<ValueList>& records) {
    return InsertAll("InsertOrReplaceRecords", "INSERT OR REPLACE", table, records);
  }

 private:
  // A statement for records with the fields of this one.
  static std::string InsertText(const std::string& verb, const Table& table,
                                const ValueList& record) {
    const std::vector<std::string> names = NamesOf(record);
    const std::vector<std::string> marks(names.size(), "?");
    return verb + " INTO " + table.tableName + " (" + Join(names, ",") + ") VALUES (" +
           Join(marks, ",") + ");";
  }
  static std::vector<std::string> NamesOf(const ValueList& record) {
    std::vector<std::string> names;
    for (const auto& [name, value] : record.GetValues()) names.push_back(name);
    return names;
  }

  bool InsertAll(const char* function, const std::string& verb, const Table& table,
                 const std::vector<ValueList>& records) {
    if (records.empty()) return true;
    bool isValid = !table.tableName.empty();
    for (const ValueList& record : records) isValid = isValid && !record.GetValues().empty();
    if (!isValid) {
      SetErr(401);
      return Failed(function, "invalid records for table [%s]", table.tableName);
    }
    const std::string sql = InsertText(verb, table, records[0]);
    if (HasNul(sql, function)) return false;
    Trace::Log(Info, kFile, function, "%s Exec cmd: %s", logLabel.c_str(), sql.c_str());
    SetErr(404);
    if (!CreateTable(table)) {
      return Failed(function, "Failed to create table [%s]", table.tableName);
    }
    if (!OpenToWrite(function)) return false;
    unsigned int retries = 0;
    if (!Retried(retries, [&] { return InsertAllOnce(verb, table, records); })) {
      return GaveUp(function, "exec command ", retries, sql);
    }
    SetErr(0);
    Trace::Log(Info, kFile, function, "%s Exec cmd success", logLabel.c_str());
    return true;
  }

  // All or none: a failure leaves the transaction that was open before as it was, or none.
  bool InsertAllOnce(const std::string& verb, const Table& table,
                     const std::vector<ValueList>& records) {
    const bool wasFree = !IsInTransaction();
    const bool isBegun = ExecOnce("SAVEPOINT all_records");
    if (isBegun && InsertRuns(verb, table, records) && ExecOnce("RELEASE all_records")) return true;
    const char* const undo = "ROLLBACK TO all_records; RELEASE all_records";
    if (!IsInTransaction() || (!wasFree && !isBegun)) return false;
    if (wasFree || sqlite3_exec(dbHandle, undo, nullptr, nullptr, nullptr) != SQLITE_OK) RollBack();
    return false;
  }

  // One statement for each run of records with the same fields.
  bool InsertRuns(const std::string& verb, const Table& table,
                  const std::vector<ValueList>& records) {
    for (size_t begin = 0, end = 0; begin < records.size(); begin = end) {
      while (end < records.size() && NamesOf(records[end]) == NamesOf(records[begin])) ++end;
      const std::string sql = InsertText(verb, table, records[begin]);
      if (sql.find('\0') != std::string::npos) {
        SetErr(401);
        return false;
      }
      sqlite3_stmt* statement = nullptr;
      const int code = sqlite3_prepare_v2(dbHandle, sql.c_str(), -1, &statement, nullptr);
      const std::shared_ptr<sqlite3_stmt> owner(statement, sqlite3_finalize);
      SetDBErr(code, nullptr);
      if (code != SQLITE_OK) return false;
      for (size_t i = begin; i < end; ++i) {
        if (!InsertOne(statement, records[i])) return false;
      }
    }
    return true;
  }

  bool InsertOne(sqlite3_stmt* statement, const ValueList& record) {
    int place = 0;
    for (const auto& [name, value] : record.GetValues()) {
      if (!value.IsStorable()) {
        SetErr(401);
        return false;
      }
      value.Bind(statement, ++place);
    }
    const int code = sqlite3_step(statement);
    if (code == SQLITE_DONE) return sqlite3_reset(statement) == SQLITE_OK;
    SetDBErr(code, nullptr);
    return false;
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

#endif  // KELODRCORE_TESTS_MODEL_RECORDS_H_
