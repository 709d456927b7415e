// Processes that share a database file, and files that resist.

#include <fcntl.h>
#include <gmock/gmock.h>
#include <sqlite3.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>

#include "kelodrcore/sqlite_db.h"
#include "support/database.h"

namespace {

using testing::ElementsAre;
using testing::IsEmpty;

const Json::Value kBusy = Error(405, 5, "database is locked");

// For a Holder: takes an exclusive lock that ends with the process.
bool LockExclusively(const std::string& path) {
  sqlite3* db = nullptr;
  return sqlite3_open(path.c_str(), &db) == SQLITE_OK &&
         sqlite3_exec(db, "BEGIN EXCLUSIVE", nullptr, nullptr, nullptr) == SQLITE_OK;
}

class SqliteDBProcessTest : public DatabaseTest {
 protected:
  void SetUp() override {
    DatabaseTest::SetUp();
    ASSERT_TRUE(db->Exec("CREATE TABLE t (n); INSERT INTO t VALUES (1)"));
    db->Close();
  }

  static void SkipSleep() {}
};

TEST_F(SqliteDBProcessTest, EachAttemptReallyWaitsOneSecond) {
  const Holder holder([this] { return LockExclusively(path); });
  Pauses::Start();
  const auto start = std::chrono::steady_clock::now();
  EXPECT_FALSE(db->Exec("INSERT INTO t VALUES (2)"));
  EXPECT_GE(std::chrono::steady_clock::now() - start, std::chrono::seconds(1));
  EXPECT_EQ(Pauses::SqliteWait(), 1000U);
  Pauses::ExpectCount(0);
  EXPECT_EQ(db->GetErr(), kBusy);
  ExpectLog({ExecFailed("Exec", 1, "INSERT INTO t VALUES (2)", kBusy)});
}

TEST_F(SqliteDBProcessTest, ALockForGoodEndsOnePastTheLimit) {
  const Holder holder([this] { return LockExclusively(path); });
  for (const unsigned int limit : {0U, 1U, 3U}) {
    SqliteDB patient(path, limit, "");
    const auto expectWaits = [&] {
      Pauses::ExpectCount(limit);
      EXPECT_EQ(Pauses::SqliteWait(), 1000 * (limit + 1)) << "not one wait an attempt";
      EXPECT_EQ(patient.GetErr(), kBusy);
    };
    Pauses::Start(nullptr, SkipSleep);
    EXPECT_FALSE(patient.Exec("DELETE FROM t"));
    expectWaits();
    Pauses::Start(nullptr, SkipSleep);
    EXPECT_FALSE(patient.SelectByCommand("SELECT n FROM t", record));
    expectWaits();
    Pauses::Start(nullptr, SkipSleep);
    EXPECT_FALSE(patient.SelectByCommand("SELECT n FROM t", records));
    expectWaits();
    ExpectLog({ExecFailed("Exec", limit + 1, "DELETE FROM t", kBusy),
               SelectFailed(limit + 1, "SELECT n FROM t", kBusy),
               ExecFailed("SelectByCommand", limit + 1, "SELECT n FROM t", kBusy)});
  }
}

TEST_F(SqliteDBProcessTest, ALockReleasedInTheFirstPauseIsSurvived) {
  SqliteDB patient(path, 1, "");
  Holder holder([this] { return LockExclusively(path); });
  Pauses::Start([&] { holder.Kill(); }, SkipSleep);
  EXPECT_TRUE(patient.Exec("INSERT INTO t VALUES (2)"));
  EXPECT_EQ(patient.GetErr(), Error(0));
  EXPECT_EQ(Pauses::SqliteWait(), 1000U);
  ExpectLog({Info(kFile, "Exec",
                  "After retry [1] times, success to exec command [INSERT INTO t VALUES (2)]")});
  EXPECT_THAT(Rows(patient, "SELECT n FROM t"), ElementsAre("n:1", "n:2"));
}

TEST_F(SqliteDBProcessTest, ALockReleasedInTheLastPauseIsSurvived) {
  SqliteDB patient(path, 3, "");
  Holder holder([this] { return LockExclusively(path); });
  const auto releaseInThird = [&] {
    if (Pauses::Lengths().size() == 3) holder.Kill();
  };
  Pauses::Start(releaseInThird, SkipSleep);
  EXPECT_TRUE(patient.SelectByCommand("SELECT n FROM t", records));
  EXPECT_THAT(Texts(records), ElementsAre("n:1"));
  ExpectLog({Info(kFile, "SelectByCommand", "After retry [3] times, success to select command")});
}

TEST_F(SqliteDBProcessTest, ALockReleasedWithinTheBusyTimeoutIsNoRetry) {
  Holder holder([this] { return LockExclusively(path); });
  Pauses::Start(nullptr, [&] { holder.Kill(); });
  EXPECT_TRUE(db->Exec("INSERT INTO t VALUES (2)"));
  EXPECT_GT(Pauses::SqliteWait(), 0U);
  Pauses::ExpectCount(0);
}

TEST_F(SqliteDBProcessTest, ALockedTableOfASharedCacheIsRetriedAsLocked) {
  ASSERT_EQ(sqlite3_enable_shared_cache(1), SQLITE_OK);
  SqliteDB writer(path, 0, "");
  SqliteDB patient(path, 1, "");
  ASSERT_TRUE(writer.Open() && patient.Open());
  sqlite3_enable_shared_cache(0);
  ASSERT_TRUE(writer.Exec("BEGIN; INSERT INTO t VALUES (2)"));
  const std::string sql = "SELECT n FROM t";
  const Json::Value locked = Error(405, 6, "database table is locked: t");
  EXPECT_FALSE(patient.SelectByCommand(sql, record));
  EXPECT_EQ(patient.GetErr(), locked);
  ExpectLog({SelectFailed(2, sql, locked)});
  Pauses::Start([&] { EXPECT_TRUE(writer.Exec("COMMIT")); });
  EXPECT_TRUE(patient.SelectByCommand(sql, record));
  ExpectLog({Info(kFile, "SelectByCommand",
                  "After retry [1] times, success to exec command [" + sql + "]")});
}

TEST_F(SqliteDBProcessTest, AnInsertOnALockedFileFailsAtTheTable) {
  const Holder holder([this] { return LockExclusively(path); });
  Pauses::Start(nullptr, SkipSleep);
  EXPECT_FALSE(db->InsertRecord(InsertOf(SqliteTableHandler("t", "n"), "n", 2)));
  EXPECT_EQ(db->GetErr(), kBusy);
  ExpectLog({Info(kFile, "Exec", "label Exec cmd: INSERT INTO t (n) VALUES (2);"),
             ExecFailed("SelectByCommand", 1,
                        "SELECT 1 FROM sqlite_master WHERE type='table' AND name='t';", kBusy),
             ExecFailed("Exec", 1, "CREATE TABLE IF NOT EXISTS t (n)", kBusy),
             Err(kFile, "CreateTable", "Failed to create table [t] with cmd[n]"),
             Err(kFile, "Exec", "Failed to create table [t]")});
}

// Inserts 200 rows of its own once `gate` reaches its end.
int WriteRows(const std::string& path, int number, const int (&gate)[2]) {
  close(gate[1]);
  char byte = 0;
  bool isGood = read(gate[0], &byte, 1) == 0;
  {
    SqliteDB db(path, 1000, "writer");
    isGood = db.Exec("PRAGMA synchronous=OFF") && isGood;  // the disk's speed is not in question
    const SqliteTableHandler table("shared", "writer INTEGER, n INTEGER, UNIQUE (writer, n)");
    InsertCommand insert = InsertOf(table, "writer", number);
    for (int n = 0; n < 200; ++n) {
      insert.AddFieldValue("n", n);
      isGood = db.InsertRecord(insert) && isGood;
    }
  }
  return isGood ? 0 : 1;
}

TEST_F(SqliteDBProcessTest, EightWritersLoseNoRow) {
  int gate[2];
  ASSERT_EQ(pipe2(gate, O_CLOEXEC), 0);
  std::vector<pid_t> writers;
  for (int number = 0; number < 8; ++number) {
    writers.push_back(StartChild([&] { return WriteRows(path, number, gate); }));
  }
  close(gate[0]);
  close(gate[1]);
  for (const pid_t writer : writers) EXPECT_EQ(JoinChild(writer), 0);
  int count = 0;
  EXPECT_TRUE(db->GetCount(SqliteTableHandler("shared", ""), count));
  EXPECT_EQ(count, 1600);
  EXPECT_THAT(
      Rows(*db, "SELECT writer, count() AS n FROM shared GROUP BY writer HAVING count() <> 200"),
      IsEmpty());
}

// Inserts 20 times 10 rows at once.
int WriteManyRows(const std::string& path, int number) {
  bool isGood = true;
  {
    SqliteDB db(path, 1000, "writer");
    isGood = db.Exec("PRAGMA synchronous=OFF");
    const SqliteTableHandler table("shared", "writer INTEGER, n INTEGER, UNIQUE (writer, n)");
    for (int round = 0; round < 20; ++round) {
      Records rows(10);
      for (int i = 0; i < 10; ++i) {
        rows[static_cast<size_t>(i)].AddValue("writer", number);
        rows[static_cast<size_t>(i)].AddValue("n", 10 * round + i);
      }
      isGood = db.InsertRecords(table, rows) && isGood;
    }
  }
  return isGood ? 0 : 1;
}

TEST_F(SqliteDBProcessTest, WritersOfManyRecordsLoseNoneAndShowNoHalf) {
  ASSERT_TRUE(db->CreateTable(
      SqliteTableHandler("shared", "writer INTEGER, n INTEGER, UNIQUE (writer, n)")));
  db = std::make_unique<SqliteDB>(path, 1000, "reader");
  std::vector<pid_t> writers;
  for (int number = 0; number < 4; ++number) {
    writers.push_back(StartChild([&] { return WriteManyRows(path, number); }));
  }
  int count = 0;
  while (count < 800) {
    ASSERT_TRUE(db->GetCount(SqliteTableHandler("shared", ""), count));
    ASSERT_EQ(count % 10, 0);
  }
  for (const pid_t writer : writers) EXPECT_EQ(JoinChild(writer), 0);
  LogCapture::Clear();
}

TEST_F(SqliteDBProcessTest, AReadOnlyFileIsReadAndNotWritten) {
  ASSERT_EQ(chmod(dir.c_str(), 0755), 0);
  ASSERT_EQ(chmod(path.c_str(), 0444), 0);
  const int status = RunInChild([&] {
    constexpr uid_t kNobody = 65534;
    ASSERT_TRUE(geteuid() != 0 || setresuid(kNobody, kNobody, kNobody) == 0);
    const Json::Value failure = Error(404, 8, "attempt to write a readonly database");
    EXPECT_THAT(Rows(*db, "SELECT n FROM t"), ElementsAre("n:1"));
    EXPECT_FALSE(db->Exec("DELETE FROM t"));
    EXPECT_EQ(db->GetErr(), failure);
    ExpectLog({ExecFailed("Exec", 0, "DELETE FROM t", failure)});
  });
  EXPECT_EQ(status, 0);
}

class SqliteDBFileTest : public DatabaseTest {};

TEST_F(SqliteDBFileTest, PathsThatCannotBeOpenedFailInEveryOperation) {
  ASSERT_EQ(symlink("loop", Path("loop").c_str()), 0);
  for (const std::string& bad : {dir, Path("no/such/dir"), Path("loop"), Path("loop/below")}) {
    SqliteDB nowhere(bad, 3, "");
    const LogLine warning = Warn(kFile, "Open", "Failed to open db[" + bad + "]");
    const std::string message = "Failed to open db [" + bad + "]";
    nowhere.SetDBErr(7, "before");
    const Json::Value before = nowhere.GetErr();
    EXPECT_FALSE(nowhere.Open());
    EXPECT_EQ(nowhere.GetErr(), before);
    EXPECT_FALSE(nowhere.SelectByCommand("SELECT 1", record));
    EXPECT_EQ(nowhere.GetErr(), before);
    EXPECT_FALSE(nowhere.SelectByCommand("SELECT 1", records));
    EXPECT_EQ(nowhere.GetErr(), before);
    EXPECT_FALSE(nowhere.Exec("SELECT 1"));
    EXPECT_EQ(nowhere.GetErr(), Error(404));
    ExpectLog({warning, warning, Err(kFile, "SelectByCommand", message), warning,
               Err(kFile, "SelectByCommand", message), warning, Err(kFile, "Exec", message)});
  }
}

TEST_F(SqliteDBFileTest, AFailedOpenIsTriedAgainByTheNextOperation) {
  const std::string file = Path("dir/file");
  SqliteDB late(file, 0, "");
  EXPECT_FALSE(late.Exec("SELECT 1"));
  ExpectLog({Warn(kFile, "Open", "Failed to open db[" + file + "]"),
             Err(kFile, "Exec", "Failed to open db [" + file + "]")});
  ASSERT_EQ(mkdir(Path("dir").c_str(), 0700), 0);
  EXPECT_TRUE(late.Exec("SELECT 1"));
}

TEST_F(SqliteDBFileTest, AFileThatIsNoDatabaseIsLeftAlone) {
  const std::string text(4096, 'x');
  WriteText(path, text);
  const Json::Value failure = Error(404, 26, "file is not a database");
  EXPECT_TRUE(db->Open());
  EXPECT_FALSE(db->Exec("CREATE TABLE t (n)"));
  EXPECT_EQ(db->GetErr(), failure);
  ExpectLog({ExecFailed("Exec", 0, "CREATE TABLE t (n)", failure)});
  db->Close();
  EXPECT_EQ(ReadText(path), text);
}

TEST_F(SqliteDBFileTest, IsExistedIsTrueForWhateverStandsAtThePath) {
  EXPECT_TRUE(SqliteDB(dir, 0, "").IsExisted());
  EXPECT_FALSE(SqliteDB("", 0, "").IsExisted());
  WriteText(path, "");
  EXPECT_TRUE(db->IsExisted());
}

TEST_F(SqliteDBFileTest, AFileRemovedUnderTheHandleIsReadAndNotWritten) {
  ASSERT_TRUE(db->Exec("CREATE TABLE t (n); INSERT INTO t VALUES (1)"));
  ASSERT_EQ(unlink(path.c_str()), 0);
  const SqliteTableHandler table("t", "n");
  const Json::Value failure = Error(404, 8, "attempt to write a readonly database");
  EXPECT_THAT(Rows(*db, "SELECT n FROM t"), ElementsAre("n:1"));
  EXPECT_FALSE(db->Exec("INSERT INTO t VALUES (2)"));
  EXPECT_EQ(db->GetErr(), failure);
  ExpectLog({ExecFailed("Exec", 0, "INSERT INTO t VALUES (2)", failure)});
  // To the operations that look for the file first there is none.
  EXPECT_TRUE(db->DeleteAllRecords(table));
  EXPECT_FALSE(db->SelectRecords(SelectAll(table), records));
  EXPECT_FALSE(HasFile());
}

TEST_F(SqliteDBFileTest, ThousandsOfOperationsLeaveNothingBehind) {
  EXPECT_TRUE(db->Open());
  db->Close();
  const std::set<int> descriptors = OpenDescriptors();
  const sqlite3_int64 memory = sqlite3_memory_used();
  for (int round = 0; round < 500; ++round) {
    SqliteDB passing(path, 0, "");
    SqliteDB nowhere(dir, 0, "");
    EXPECT_TRUE(passing.Exec("SELECT 1"));
    EXPECT_FALSE(passing.Exec("nonsense"));
    EXPECT_TRUE(passing.SelectByCommand("SELECT 1 AS n UNION SELECT 2", record));
    EXPECT_FALSE(passing.SelectByCommand("nonsense", record));
    EXPECT_FALSE(passing.SelectByCommand("SELECT abs(-9223372036854775808)", records));
    EXPECT_FALSE(passing.SelectByCommand(" ", records));
    EXPECT_FALSE(nowhere.Exec("SELECT 1"));
    EXPECT_FALSE(nowhere.SelectByCommand("SELECT 1", records));
    LogCapture::Clear();
  }
  EXPECT_EQ(OpenDescriptors(), descriptors);
  EXPECT_EQ(sqlite3_memory_used(), memory);
}

}  // namespace
