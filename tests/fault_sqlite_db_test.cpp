// SQLite's own calls and memory fail as well as the library's.

#include <sqlite3.h>
#include <unistd.h>

#include <algorithm>
#include <functional>

#include "kelodrcore/sqlite_db.h"
#include "support/fault.h"

using Fault::Outcome;
using KeloDRCore::DeleteCommand;
using KeloDRCore::InsertCommand;
using KeloDRCore::SelectCommand;
using KeloDRCore::SqliteDB;
using KeloDRCore::SqliteTableHandler;
using KeloDRCore::SqliteValueList;
using KeloDRCore::UpdateCommand;

namespace {

constexpr unsigned int kRetries = 1;

sqlite3_mem_methods sqliteMemory;

void* SqliteMalloc(int size) {
  if (Fault::Hits("sqlite3_malloc", {Fault::kNoMemory})) return nullptr;
  const Fault::Suspension suspension;
  return sqliteMemory.xMalloc(size);
}

void* SqliteRealloc(void* memory, int size) {
  if (Fault::Hits("sqlite3_realloc", {Fault::kNoMemory})) return nullptr;
  const Fault::Suspension suspension;
  return sqliteMemory.xRealloc(memory, size);
}

// Before the first connection, which fixes the configuration.
const bool isConfigured = [] {
  sqlite3_config(SQLITE_CONFIG_GETMALLOC, &sqliteMemory);
  sqlite3_mem_methods failing = sqliteMemory;
  failing.xMalloc = SqliteMalloc;
  failing.xRealloc = SqliteRealloc;
  return sqlite3_config(SQLITE_CONFIG_MALLOC, &failing) == SQLITE_OK &&
         sqlite3_initialize() == SQLITE_OK;
}();

using Rows = std::vector<std::string>;

const Rows kBefore = {"1 one", "2 two"};

class SqliteDBFaultTest : public FaultTest {
 protected:
  void SetUp() override {
    FaultTest::SetUp();
    ASSERT_TRUE(isConfigured);
    path = Path("base");
    memoryBefore = sqlite3_memory_used();
  }

  void RemoveFile() const;
  // The file with kBefore in its table.
  void MakeFile() const;

  // Runs `action` with an object of its own; what `action` answers must agree with its error.
  bool With(const std::function<bool(SqliteDB&)>& action);

  // The rows of the table as SQLite itself reads them, once it has recovered the file.
  Rows Read() const;

  // Sweeps an operation that turns the rows that the file has after `prepare` into `after`.
  void SweepWriting(const std::function<void()>& prepare,
                    const std::function<bool(SqliteDB&)>& action, const Rows& after);
  // Sweeps one that gives `rows` into `found`, which it begins by emptying.
  void SweepReading(const std::function<bool(SqliteDB&)>& action, const Rows& rows);

  bool TookAsMissing(const Outcome& outcome) const;

  bool missingIsNotTold = false;
  std::string path;
  sqlite3_int64 memoryBefore = 0;
  Rows found;
  const SqliteTableHandler table{"t", "n INTEGER PRIMARY KEY, s TEXT"};
};

void SqliteDBFaultTest::RemoveFile() const {
  for (const std::string& name : NamesIn(dir)) unlink(Path(name).c_str());
}

void SqliteDBFaultTest::MakeFile() const {
  RemoveFile();
  SqliteDB db(path, 0, "label");
  ASSERT_TRUE(
      db.Exec("CREATE TABLE t (n INTEGER PRIMARY KEY, s TEXT); INSERT INTO t VALUES (1, 'one');"
              "INSERT INTO t VALUES (2, 'two')"));
}

bool SqliteDBFaultTest::With(const std::function<bool(SqliteDB&)>& action) {
  SqliteDB db(path, kRetries, "label");
  return action(db);
}

int AddRow(void* rows, int /*columns*/, char** values, char** /*names*/) {
  static_cast<Rows*>(rows)->push_back(std::string(values[0]) + " " + values[1]);
  return 0;
}

Rows SqliteDBFaultTest::Read() const {
  if (access(path.c_str(), F_OK) != 0) return {};
  sqlite3* db = nullptr;
  Rows rows;
  Rows check;
  EXPECT_EQ(sqlite3_open_v2(path.c_str(), &db, SQLITE_OPEN_READWRITE, nullptr), SQLITE_OK);
  EXPECT_EQ(sqlite3_exec(db, "SELECT 'is', * FROM pragma_integrity_check", AddRow, &check, nullptr),
            SQLITE_OK);
  EXPECT_EQ(check, Rows{"is ok"});
  sqlite3_exec(db, "SELECT n, s FROM t ORDER BY n", AddRow, &rows, nullptr);
  sqlite3_close(db);
  return rows;
}

// Whether the database counted as missing, which is not told: it could not be looked at.
bool SqliteDBFaultTest::TookAsMissing(const Outcome& outcome) const {
  const bool statFailed =
      std::any_of(outcome.failed.begin(), outcome.failed.end(),
                  [](const std::string& call) { return call.find("stat") != std::string::npos; });
  return missingIsNotTold && statFailed && outcome.log.empty();
}

void SqliteDBFaultTest::SweepWriting(const std::function<void()>& prepare,
                                     const std::function<bool(SqliteDB&)>& action,
                                     const Rows& after) {
  prepare();
  const Rows before = Read();
  const auto run = [&] { return With(action); };
  const auto check = [&](const Outcome& outcome) {
    EXPECT_EQ(sqlite3_memory_used(), memoryBefore);
    const Rows rows = Read();
    const bool mayBeUndone = !outcome.succeeded || TookAsMissing(outcome);
    EXPECT_TRUE(rows == after || (mayBeUndone && rows == before)) << testing::PrintToString(rows);
    EXPECT_TRUE(outcome.succeeded || outcome.threw || !outcome.log.empty());
  };
  SweepCalls({prepare, run, check});
  SweepMemory({prepare, run, check});
  SweepTransfers({prepare, run, check});
  EXPECT_EQ(NamesIn(dir), std::vector<std::string>{"base"});
}

void SqliteDBFaultTest::SweepReading(const std::function<bool(SqliteDB&)>& action,
                                     const Rows& rows) {
  MakeFile();
  const auto run = [&] {
    found.clear();
    return With(action);
  };
  const auto check = [&](const Outcome& outcome) {
    EXPECT_EQ(sqlite3_memory_used(), memoryBefore);
    if (outcome.succeeded) {
      EXPECT_EQ(found, rows);
    } else {
      EXPECT_TRUE(outcome.threw || TookAsMissing(outcome) || !outcome.log.empty());
    }
    EXPECT_EQ(Read(), kBefore);
  };
  SweepCalls({[] {}, run, check});
  SweepMemory({[] {}, run, check});
  SweepTransfers({[] {}, run, check});
}

Rows ToRows(const std::vector<SqliteValueList>& records) {
  Rows rows;
  for (const SqliteValueList& record : records) rows.push_back(record.ToStr());
  return rows;
}

}  // namespace

TEST_F(SqliteDBFaultTest, AStatementIsDoneWholeOrNotAtAll) {
  const auto action = [](SqliteDB& db) { return db.Exec("REPLACE INTO t VALUES (3, 'three')"); };
  SweepWriting([this] { MakeFile(); }, action, {"1 one", "2 two", "3 three"});
}

TEST_F(SqliteDBFaultTest, AnInsertMakesFileTableAndRowOrFails) {
  InsertCommand insert;
  insert.SetTable(table);
  insert.SetReplacable(true);
  insert.AddFieldValue("n", 3);
  insert.AddFieldValue("s", "three");
  SweepWriting([this] { RemoveFile(); }, [&](SqliteDB& db) { return db.InsertRecord(insert); },
               {"3 three"});
}

TEST_F(SqliteDBFaultTest, AnUpdateIsDoneWholeOrNotAtAll) {
  UpdateCommand update;
  update.SetTable(table);
  update.AddFieldValue("s", "new");
  SweepWriting([this] { MakeFile(); }, [&](SqliteDB& db) { return db.UpdateRecord(update); },
               {"1 new", "2 new"});
}

TEST_F(SqliteDBFaultTest, ADeletionIsDoneWholeOrNotAtAll) {
  missingIsNotTold = true;
  SweepWriting([this] { MakeFile(); },
               [&](SqliteDB& db) { return db.DeleteRecord("n = 2", table); }, {"1 one"});
  SweepWriting([this] { MakeFile(); }, [&](SqliteDB& db) { return db.DeleteAllRecords(table); },
               {});
}

TEST_F(SqliteDBFaultTest, ATableIsThereOrItsFailureTold) {
  const auto action = [&](SqliteDB& db) {
    if (!db.CreateTable(table)) return false;
    const Fault::Suspension suspension;
    EXPECT_TRUE(db.IsTableExisted("t"));
    return true;
  };
  SweepWriting([this] { RemoveFile(); }, action, {});
}

TEST_F(SqliteDBFaultTest, RowsComeWholeOrNotAtAll) {
  const auto selectOne = [this](SqliteDB& db) {
    SqliteValueList record;
    const bool selected = db.SelectByCommand("SELECT * FROM t ORDER BY n", record);
    const Fault::Suspension suspension;
    found = {record.ToStr()};
    return selected;
  };
  const auto selectAll = [this](SqliteDB& db) {
    std::vector<SqliteValueList> records;
    const bool selected = db.SelectByCommand("SELECT * FROM t ORDER BY n", records);
    const Fault::Suspension suspension;
    found = ToRows(records);
    return selected;
  };
  SweepReading(selectOne, {"n:1, s:'one'"});
  SweepReading(selectAll, {"n:1, s:'one'", "n:2, s:'two'"});
}

// Such a text, and a name like it, is converted when it is asked for.
TEST_F(SqliteDBFaultTest, AWideTextComesWholeOrNotAtAll) {
  const std::string base = Path("wide");
  const std::string text(3000, 'x');
  ASSERT_TRUE(SqliteDB(base, 0, "label")
                  .Exec("PRAGMA encoding = 'UTF-16'; CREATE TABLE t (s TEXT);"
                        "INSERT INTO t VALUES ('" +
                        text + "')"));
  std::string selected;
  const auto run = [&] {
    SqliteDB db(base, kRetries, "label");
    SqliteValueList record;
    if (!db.SelectByCommand("SELECT s FROM t", record)) return false;
    const Fault::Suspension suspension;
    selected.clear();
    EXPECT_TRUE(record.GetValue("s", selected));
    return true;
  };
  const auto check = [&](const Outcome& outcome) {
    EXPECT_EQ(sqlite3_memory_used(), memoryBefore);
    if (outcome.succeeded) {
      EXPECT_EQ(selected, text);
    }
  };
  SweepMemory({[] {}, run, check});
  SweepTransfers({[] {}, run, check});
}

TEST_F(SqliteDBFaultTest, RecordsComeWholeOrNotAtAll) {
  missingIsNotTold = true;
  SelectCommand select;
  select.SetTable(table);
  select.SelectAll();
  const auto action = [&](SqliteDB& db) {
    std::vector<SqliteValueList> records;
    const bool selected = db.SelectRecords(select, records);
    const Fault::Suspension suspension;
    found = ToRows(records);
    return selected;
  };
  SweepReading(action, {"n:1, s:'one'", "n:2, s:'two'"});
}

TEST_F(SqliteDBFaultTest, ACountIsRightOrItsFailureTold) {
  const auto action = [&](SqliteDB& db) {
    int count = -1;
    const bool counted = db.GetCount(table, count);
    const Fault::Suspension suspension;
    found = {std::to_string(count)};
    return counted;
  };
  SweepReading(action, {"2"});
}
