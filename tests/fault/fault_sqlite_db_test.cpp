// SQLite's own calls and memory fail as well as the library's: those of the C library, and those of
// SQLite's interface to the system.

#include <sqlite3.h>
#include <unistd.h>

#include <algorithm>
#include <functional>

#include "fault/failing_vfs.h"
#include "fault/fault.h"
#include "kelodrcore/err.h"
#include "kelodrcore/sqlite_transaction.h"

using Fault::Outcome;
using KeloDRCore::DeleteCommand;
using KeloDRCore::InsertCommand;
using KeloDRCore::SelectCommand;
using KeloDRCore::SqliteDB;
using KeloDRCore::SqliteTableHandler;
using KeloDRCore::SqliteTransaction;
using KeloDRCore::SqliteValueList;
using KeloDRCore::UpdateCommand;

namespace {

constexpr unsigned int kRetries = 1;

// How often SQLite asks for a lock within the busy time-out of a second.
constexpr int kLocksOfOneAttempt = 20;

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
         FailingVfs::Register() == SQLITE_OK;
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

  // The same file as a writer leaves it that is killed in the middle: changed, and its old pages in
  // the journal. Made once.
  void MakeUnfinishedFile();

  // Runs `action` with an object of its own; what `action` answers must agree with its error.
  bool With(const std::function<bool(SqliteDB&)>& action);

  // The rows of the table as SQLite itself reads them, once it has recovered the file.
  Rows Read() const;

  // Sweeps an operation that turns the rows that the file has after `prepare` into `after`.
  void SweepWriting(const std::function<void()>& prepare,
                    const std::function<bool(SqliteDB&)>& action, const Rows& after);
  // Sweeps one that gives `rows` into `found`, which it begins by emptying.
  void SweepReading(const std::function<bool(SqliteDB&)>& action, const Rows& rows);

  // Sweeps the calls of SQLite's interface to the system.
  void SweepFileCalls(const Fault::Operation& operation);
  // A lock that another has is waited for: in one attempt, or in two.
  void SweepBusyLocks(const Fault::Operation& operation);
  void SweepAll(const Fault::Operation& operation);

  void CheckError(const Outcome& outcome) const;
  bool TookAsMissing(const Outcome& outcome) const;

  bool missingIsNotTold = false;
  bool isUnfinished = false;  // a journal that seems to end early has nothing more to give back
  Json::Value error;          // of the last operation, null when it succeeded or threw
  std::string path;
  sqlite3_int64 memoryBefore = 0;
  Rows found;
  std::string unfinishedFile;
  std::string unfinishedJournal;
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

void SqliteDBFaultTest::MakeUnfinishedFile() {
  const std::string journal = path + "-journal";
  if (unfinishedFile.empty()) {
    MakeFile();
    sqlite3* db = nullptr;
    ASSERT_EQ(sqlite3_open(path.c_str(), &db), SQLITE_OK);
    ASSERT_EQ(sqlite3_exec(db, "BEGIN; UPDATE t SET s = 'torn'", nullptr, nullptr, nullptr), 0);
    ASSERT_EQ(sqlite3_db_cacheflush(db), SQLITE_OK);
    unfinishedFile = ReadText(path);
    unfinishedJournal = ReadText(journal);
    sqlite3_close(db);
  }
  RemoveFile();
  WriteText(path, unfinishedFile);
  WriteText(journal, unfinishedJournal);
}

bool SqliteDBFaultTest::With(const std::function<bool(SqliteDB&)>& action) {
  error = Json::Value();
  SqliteDB db(path, kRetries, "label");
  const auto expectNothingBegun = [&db] {
    if (db.IsExisted()) {
      EXPECT_TRUE(db.Exec("BEGIN; ROLLBACK")) << "a transaction was left open";
    }
  };
  try {
    const bool isDone = action(db);
    const Fault::Suspension suspension;
    if (!isDone) error = db.GetErr();
    expectNothingBegun();
    return isDone;
  } catch (const std::bad_alloc&) {
    const Fault::Suspension suspension;
    expectNothingBegun();
    throw;
  }
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

// What SQLite said is classified: busy and locked apart from the rest.
void SqliteDBFaultTest::CheckError(const Outcome& outcome) const {
  const Json::Value& details = error["err_msg"];
  if (!details.isObject()) return;
  const bool isBusy = details["sqlite_errcode"] == SQLITE_BUSY;
  EXPECT_EQ(error["err_code"],
            isBusy ? KeloDRCore::ERR::ERR_DATABASE_LOCK : KeloDRCore::ERR::ERR_DATABASE_OPERATION);
  EXPECT_NE(details["sqlite_errmsg"], "");
  if (outcome.error == FailingVfs::kFull) {
    EXPECT_EQ(details["sqlite_errcode"], SQLITE_FULL);
  }
}

void SqliteDBFaultTest::SweepBusyLocks(const Fault::Operation& operation) {
  const auto checkDone = [&](const Outcome& outcome) {
    operation.check(outcome);
    EXPECT_TRUE(outcome.succeeded);
  };
  const auto checkTold = [&](const Outcome& outcome) {
    operation.check(outcome);
    EXPECT_EQ(outcome.succeeded, outcome.failures == 0);
    EXPECT_EQ(outcome.succeeded, error.isNull());
    if (outcome.succeeded) return;
    EXPECT_EQ(error["err_code"], KeloDRCore::ERR::ERR_DATABASE_LOCK);
    EXPECT_TRUE(std::any_of(outcome.log.begin(), outcome.log.end(), [](const LogLine& line) {
      return line.message.find("Reach retry limit [2], failed to ") == 0;
    }));
  };
  Sweep({operation.prepare, operation.run, checkDone}, FailingVfs::kBusy, Fault::kOnce);
  Sweep({operation.prepare, operation.run, checkDone}, FailingVfs::kBusy, kLocksOfOneAttempt);
  Sweep({operation.prepare, operation.run, checkTold}, FailingVfs::kBusy, Fault::kForGood);
}

void SqliteDBFaultTest::SweepFileCalls(const Fault::Operation& operation) {
  for (const int failure : {FailingVfs::kError, FailingVfs::kFull, FailingVfs::kShortRead}) {
    if (failure == FailingVfs::kShortRead && isUnfinished) continue;
    Sweep(operation, failure, Fault::kOnce);
    Sweep(operation, failure, Fault::kForGood);
  }
  SweepBusyLocks(operation);
}

void SqliteDBFaultTest::SweepAll(const Fault::Operation& operation) {
  SweepCalls(operation);
  SweepMemory(operation);
  SweepTransfers(operation);
  SweepFileCalls(operation);
}

void SqliteDBFaultTest::SweepWriting(const std::function<void()>& prepare,
                                     const std::function<bool(SqliteDB&)>& action,
                                     const Rows& after) {
  prepare();
  const Rows before = Read();
  const auto run = [&] { return With(action); };
  const auto check = [&](const Outcome& outcome) {
    EXPECT_EQ(sqlite3_memory_used(), memoryBefore);
    CheckError(outcome);
    const Rows rows = Read();
    const bool mayBeUndone = !outcome.succeeded || TookAsMissing(outcome);
    EXPECT_TRUE(rows == after || (mayBeUndone && rows == before)) << testing::PrintToString(rows);
    EXPECT_TRUE(outcome.succeeded || outcome.threw || !outcome.log.empty());
  };
  SweepAll({prepare, run, check});
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
    CheckError(outcome);
    if (outcome.succeeded) {
      EXPECT_EQ(found, rows);
    } else {
      EXPECT_TRUE(outcome.threw || TookAsMissing(outcome) || !outcome.log.empty());
    }
    EXPECT_EQ(Read(), kBefore);
  };
  SweepAll({[] {}, run, check});
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

TEST_F(SqliteDBFaultTest, AnUnfinishedWriteIsUndoneWholeBeforeTheNext) {
  isUnfinished = true;
  MakeUnfinishedFile();
  ASSERT_NE(unfinishedFile.find("torn"), std::string::npos);
  const auto action = [](SqliteDB& db) { return db.Exec("REPLACE INTO t VALUES (3, 'three')"); };
  SweepWriting([this] { MakeUnfinishedFile(); }, action, {"1 one", "2 two", "3 three"});
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

TEST_F(SqliteDBFaultTest, ATextOfATransactionIsDoneWholeOrNotAtAll) {
  const auto action = [](SqliteDB& db) {
    return db.Exec(
        "BEGIN IMMEDIATE; REPLACE INTO t VALUES (3, 'three');"
        "REPLACE INTO t VALUES (4, 'four'); COMMIT");
  };
  SweepWriting([this] { MakeFile(); }, action, {"1 one", "2 two", "3 three", "4 four"});
}

// Two runs of records with the same fields.
std::vector<SqliteValueList> ManyRecords() {
  std::vector<SqliteValueList> records(4);
  const char* const texts[] = {"three", "four", "five"};
  for (int i = 0; i < 3; ++i) {
    records[static_cast<size_t>(i)].AddValue("n", i + 3);
    records[static_cast<size_t>(i)].AddValue("s", texts[i]);
  }
  records[3].AddValue("s", "six");
  records[3].AddValue("rowid", 6);
  return records;
}

const Rows kAfterMany = {"1 one", "2 two", "3 three", "4 four", "5 five", "6 six"};

TEST_F(SqliteDBFaultTest, ManyRecordsAreInsertedOrNone) {
  const std::vector<SqliteValueList> records = ManyRecords();
  SweepWriting([this] { MakeFile(); },
               [&](SqliteDB& db) { return db.InsertOrReplaceRecords(table, records); }, kAfterMany);
  SweepWriting([this] { RemoveFile(); },
               [&](SqliteDB& db) { return db.InsertOrReplaceRecords(table, records); },
               Rows(kAfterMany.begin() + 2, kAfterMany.end()));
}

TEST_F(SqliteDBFaultTest, ATransactionIsKeptWholeOrNotAtAll) {
  const std::vector<SqliteValueList> records = ManyRecords();
  const auto action = [&](SqliteDB& db) {
    SqliteTransaction transaction(db);
    return transaction.IsOpen() && db.Exec("UPDATE t SET s = 'new' WHERE n = 1") &&
           db.InsertOrReplaceRecords(table, records) && transaction.Commit();
  };
  Rows after = kAfterMany;
  after[0] = "1 new";
  SweepWriting([this] { MakeFile(); }, action, after);
}

// What an insert of many leaves behind when it fails inside a transaction that is committed then.
TEST_F(SqliteDBFaultTest, ATransactionHoldsNoPartOfAFailedInsert) {
  const std::vector<SqliteValueList> records = ManyRecords();
  MakeFile();
  const auto run = [&] {
    error = Json::Value();
    SqliteDB db(path, 0, "label");
    SqliteTransaction transaction(db);
    bool isDone = false;
    try {
      isDone = transaction.IsOpen() && db.InsertOrReplaceRecords(table, records);
    } catch (const std::bad_alloc&) {
    }
    const Fault::Suspension suspension;
    transaction.Commit();
    return isDone;
  };
  const auto check = [&](const Outcome& outcome) {
    EXPECT_EQ(sqlite3_memory_used(), memoryBefore);
    const Rows rows = Read();
    EXPECT_EQ(rows, outcome.succeeded ? kAfterMany : kBefore);
  };
  const Fault::Operation operation = {[this] { MakeFile(); }, run, check};
  SweepMemory(operation);
  for (const int failure : {FailingVfs::kError, FailingVfs::kFull}) {
    Sweep(operation, failure, Fault::kOnce);
    Sweep(operation, failure, Fault::kForGood);
  }
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

TEST_F(SqliteDBFaultTest, RowsAreHandedOverWholeOrNotAtAll) {
  missingIsNotTold = true;
  SelectCommand select;
  select.SetTable(table);
  select.SelectAll();
  const auto action = [&](SqliteDB& db) {
    return db.SelectEach(select, [&](const SqliteValueList& record) {
      const Fault::Suspension suspension;
      found.push_back(record.ToStr());
      return true;
    });
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
