// A connection: opened on demand, statements given as text, the rows of queries, the retries.

#ifndef KELODRCORE_TESTS_MODEL_CONNECTION_H_
#define KELODRCORE_TESTS_MODEL_CONNECTION_H_

#include <sqlite3.h>

#include <filesystem>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "model/values.h"

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

class Connection : public ErrRecorder {
 public:
  Connection(const std::string& path, unsigned int retries, const std::string& label)
      : dbPath(path), retryLimit(retries), logLabel(label) {}
  ~Connection() override { Close(); }

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
    if (HasNul(sql, "Exec") || !OpenToWrite("Exec")) return false;
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

 protected:
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

  bool OpenToWrite(const char* function) {
    if (!Open()) {
      SetErr(404);
      return Failed(function, "Failed to open db [%s]", dbPath);
    }
    if (dbHandle == nullptr) {
      SetErr(403);
      return Failed(function, "DB[%s] is not opened", dbPath);
    }
    return true;
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
      if (errCode == 401) return false;  // nothing that SQLite was given
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

  sqlite3* dbHandle = nullptr;
  std::string dbPath;
  unsigned int retryLimit;
  std::string logLabel;
};

}  // namespace Model

#endif  // KELODRCORE_TESTS_MODEL_CONNECTION_H_
