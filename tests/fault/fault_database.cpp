#include "fault/fault_database.h"

#include <unistd.h>

#include <algorithm>

#include "fault/failing_vfs.h"
#include "kelodrcore/err.h"

namespace {

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

}  // namespace

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

void DatabaseFaultTest::SetUp() {
  FaultTest::SetUp();
  ASSERT_TRUE(isConfigured);
  path = Path("base");
  memoryBefore = sqlite3_memory_used();
  interruptedStride = 0;
}

void DatabaseFaultTest::RemoveFile() const {
  for (const std::string& name : NamesIn(dir)) unlink(Path(name).c_str());
}

void DatabaseFaultTest::MakeFile() const {
  RemoveFile();
  SqliteDB db(path, 0, "label");
  ASSERT_TRUE(
      db.Exec("CREATE TABLE t (n INTEGER PRIMARY KEY, s TEXT); INSERT INTO t VALUES (1, 'one');"
              "INSERT INTO t VALUES (2, 'two')"));
}

void DatabaseFaultTest::MakeUnfinishedFile() {
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

bool DatabaseFaultTest::With(const std::function<bool(SqliteDB&)>& action) {
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

namespace {

int AddRow(void* rows, int /*columns*/, char** values, char** /*names*/) {
  static_cast<Rows*>(rows)->push_back(std::string(values[0]) + " " + values[1]);
  return 0;
}

}  // namespace

Rows DatabaseFaultTest::Read() const {
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
bool DatabaseFaultTest::TookAsMissing(const Outcome& outcome) const {
  const bool statFailed =
      std::any_of(outcome.failed.begin(), outcome.failed.end(),
                  [](const std::string& call) { return call.find("stat") != std::string::npos; });
  return missingIsNotTold && statFailed && outcome.log.empty();
}

// What SQLite said is classified: busy and locked apart from the rest.
void DatabaseFaultTest::CheckError(const Outcome& outcome) const {
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

void DatabaseFaultTest::SweepBusyLocks(const Fault::Operation& operation) {
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

void DatabaseFaultTest::SweepFileCalls(const Fault::Operation& operation) {
  for (const int failure : {FailingVfs::kError, FailingVfs::kFull, FailingVfs::kShortRead}) {
    if (failure == FailingVfs::kShortRead && isUnfinished) continue;
    Sweep(operation, failure, Fault::kOnce);
    Sweep(operation, failure, Fault::kForGood);
  }
  SweepBusyLocks(operation);
}

void DatabaseFaultTest::SweepAll(const Fault::Operation& operation) {
  SweepCalls(operation);
  SweepMemory(operation);
  SweepTransfers(operation);
  SweepFileCalls(operation);
}

void DatabaseFaultTest::SweepWriting(const std::function<void()>& prepare,
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

void DatabaseFaultTest::SweepReading(const std::function<bool(SqliteDB&)>& action,
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
