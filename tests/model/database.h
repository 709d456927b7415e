// Random operations on the database handle, under faults of SQLite.

#ifndef KELODRCORE_TESTS_MODEL_DATABASE_H_
#define KELODRCORE_TESTS_MODEL_DATABASE_H_

#include <sqlite3.h>

#include <filesystem>
#include <fstream>
#include <memory>
#include <string>
#include <vector>

#include "kelodrcore/err.h"
#include "kelodrcore/sqlite_db.h"
#include "kelodrcore/sqlite_transaction.h"
#include "model/records.h"

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
    switch (Draw::Below(13)) {
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
      case 7:
      case 8:
        OfRecords();
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
  using BatchTwin = Twin<std::vector<KeloDRCore::SqliteValueList>, std::vector<Model::ValueList>>;

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
    RefuseFalseSuccess();
    TableTwin table = DrawTable();
    BatchTwin batch = DrawBatch();
    Do("a transaction that ends by " + std::to_string(end), [&](auto side) {
      std::string shown;
      {
        auto transaction = Begin(side, *side(db));
        shown = Show(transaction.IsOpen(), side(db)->GetErr());
        side(db)->InsertRecord(side(commands.insert));
        side(db)->InsertRecords(side(table), side(batch));
        if (end == 0) side(db)->Close();
        if (end == 1) transaction.Rollback();
        if (end == 2 && transaction.IsOpen()) shown += Show(transaction.Commit());
        shown += Show(transaction.IsOpen(), side(db)->GetErr());
      }
      return shown + Show(side(db)->GetErr()) + Calls::DumpDatabase();
    });
  }

  // Many records: most of them have the fields of the one before, and most can be stored. (A number
  // that cannot ends a run: whether the next statement is prepared before is nobody's concern.)
  static BatchTwin DrawBatch() {
    BatchTwin batch;
    std::vector<std::string> names;
    for (size_t i = Draw::Below(6); i > 0; --i) {
      const bool isNewRun = names.empty() || Draw::Once(4);
      const bool mayFail = !isNewRun || batch.model.empty();
      if (isNewRun) names = DrawNames();
      ListTwin record;
      for (const std::string& name : names) {
        const int small = static_cast<int>(Draw::Below(50));
        ValueTwin value = DrawValue();
        const bool isKept = value.model.IsStorable() || (value.model.IsValid() && mayFail);
        // Behind the largest id there are only random ones.
        if (!isKept || name == "id" || !Draw::Once(4)) value = ValueTwin{small, small};
        record.library.AddValue(name, value.library);
        record.model.AddValue(name, value.model);
      }
      batch.library.push_back(record.library);
      batch.model.push_back(record.model);
    }
    if (Draw::Once(20)) batch = {{{}}, {{}}};
    return batch;
  }
  static std::vector<std::string> DrawNames() {
    static const std::vector<std::string> usual = {"a", "b", "name", "x"};
    static const std::vector<std::string> odd = {"id", "id", "none", "%s%n",
                                                 std::string("n\0z", 3)};
    std::vector<std::string> names = {Draw::Of(usual), Draw::Of(usual)};
    if (Draw::Once(3)) names.push_back(Draw::Of(odd));
    return names;
  }

  // A success of what was not done is no answer of SQLite.
  static void RefuseFalseSuccess() {
    Calls::Fault& fault = Calls::fault;
    const bool isSuccess = fault.code == SQLITE_OK || fault.code == SQLITE_DONE;
    if ((fault.kind == "exec" || fault.kind == "step") && isSuccess) fault.code = SQLITE_ERROR;
  }

  void OfRecords() {
    RefuseFalseSuccess();
    TableTwin table = DrawTable();
    BatchTwin batch = DrawBatch();
    const bool isReplacing = Draw::Once(3);
    Do(std::to_string(batch.model.size()) + " records for " + table.model.tableName,
       [&](auto side) {
         auto& handle = *side(db);
         const bool result = isReplacing ? handle.InsertOrReplaceRecords(side(table), side(batch))
                                         : handle.InsertRecords(side(table), side(batch));
         return End(result, side(db)) + Calls::DumpDatabase();
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
  BatchTwin rows;
};

#endif  // KELODRCORE_TESTS_MODEL_DATABASE_H_
