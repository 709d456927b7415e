#include "kelodrcore/sqlite_transaction.h"

#include <gmock/gmock.h>
#include <unistd.h>

#include <optional>
#include <type_traits>

#include "support/database.h"

namespace {

using KeloDRCore::SqliteTransaction;
using testing::ElementsAre;
using testing::IsEmpty;

static_assert(!std::is_copy_constructible_v<SqliteTransaction>);
static_assert(!std::is_copy_assignable_v<SqliteTransaction>);

const Json::Value kBusy = Error(405, 5, "database is locked");

class SqliteTransactionTest : public DatabaseTest {
 protected:
  void SetUp() override {
    DatabaseTest::SetUp();
    ASSERT_TRUE(db->Exec("CREATE TABLE t (n INTEGER PRIMARY KEY)"));
    other = std::make_unique<SqliteDB>(path, 0, "other");
    Pauses::Start(nullptr, [] {});  // SQLite's own waits end at once
  }

  void TearDown() override {
    other.reset();
    DatabaseTest::TearDown();
  }

  void StartWithRetries(unsigned int retries) {
    db = std::make_unique<SqliteDB>(path, retries, "label");
  }

  void Insert(int n) { EXPECT_TRUE(db->Exec("INSERT INTO t VALUES (" + std::to_string(n) + ")")); }

  // What is on disk, as another connection sees it.
  std::vector<std::string> Kept() { return Rows(*other, "SELECT n FROM t ORDER BY n"); }

  LogLine NotOpen() const {
    return Err("sqlite_transaction.cpp", "Commit", "No transaction is open in db[" + path + "]");
  }

  std::unique_ptr<SqliteDB> other;
};

TEST_F(SqliteTransactionTest, CommitKeepsTheChanges) {
  SqliteTransaction transaction(*db);
  EXPECT_TRUE(transaction.IsOpen());
  Insert(1);
  EXPECT_THAT(Kept(), IsEmpty());
  EXPECT_TRUE(transaction.Commit());
  EXPECT_FALSE(transaction.IsOpen());
  EXPECT_EQ(db->GetErr(), Error(0));
  EXPECT_THAT(Kept(), ElementsAre("n:1"));
}

TEST_F(SqliteTransactionTest, RollbackUndoesTheChanges) {
  SqliteTransaction transaction(*db);
  Insert(1);
  transaction.Rollback();
  EXPECT_FALSE(transaction.IsOpen());
  Insert(2);
  EXPECT_THAT(Kept(), ElementsAre("n:2"));
}

TEST_F(SqliteTransactionTest, TheDestructorUndoesWhatWasNotCommitted) {
  {
    const SqliteTransaction transaction(*db);
    Insert(1);
  }
  Insert(2);
  EXPECT_THAT(Kept(), ElementsAre("n:2"));
}

TEST_F(SqliteTransactionTest, RollbackAndDestructorLeaveTheRecordedError) {
  {
    SqliteTransaction transaction(*db);
    EXPECT_FALSE(db->Exec("nonsense"));
    transaction.Rollback();
  }
  const Json::Value failure = Error(404, 1, "near \"nonsense\": syntax error");
  EXPECT_EQ(db->GetErr(), failure);
  {
    const SqliteTransaction transaction(*db);
    EXPECT_EQ(db->GetErr(), Error(0));
    EXPECT_FALSE(db->Exec("nonsense"));
  }
  EXPECT_EQ(db->GetErr(), failure);
  LogCapture::Clear();
}

TEST_F(SqliteTransactionTest, NothingHappensAfterTheEnd) {
  SqliteTransaction transaction(*db);
  EXPECT_TRUE(transaction.Commit());
  ASSERT_TRUE(db->Exec("BEGIN"));
  Insert(1);
  EXPECT_FALSE(transaction.IsOpen());
  transaction.Rollback();
  ASSERT_TRUE(db->Exec("COMMIT"));
  EXPECT_FALSE(transaction.Commit());
  EXPECT_EQ(db->GetErr(), Error(404));
  ExpectLog({NotOpen()});
  EXPECT_THAT(Kept(), ElementsAre("n:1"));
}

TEST_F(SqliteTransactionTest, ARolledBackOneLeavesTheNextOneAlone) {
  {
    SqliteTransaction transaction(*db);
    transaction.Rollback();
    ASSERT_TRUE(db->Exec("BEGIN"));
    Insert(1);
    EXPECT_FALSE(transaction.IsOpen());
  }
  ASSERT_TRUE(db->Exec("COMMIT"));
  EXPECT_THAT(Kept(), ElementsAre("n:1"));
}

TEST_F(SqliteTransactionTest, OthersReadButDoNotWriteMeanwhile) {
  SqliteTransaction transaction(*db);
  EXPECT_THAT(Kept(), IsEmpty());
  EXPECT_FALSE(other->Exec("INSERT INTO t VALUES (1)"));
  EXPECT_EQ(other->GetErr(), kBusy);
  LogCapture::Clear();
}

TEST_F(SqliteTransactionTest, TheFileIsCreatedAndTheHandleOpened) {
  const std::string fresh = Path("fresh");
  SqliteDB handle(fresh, 0, "label");
  SqliteTransaction transaction(handle);
  EXPECT_TRUE(transaction.IsOpen());
  EXPECT_EQ(access(fresh.c_str(), F_OK), 0);
}

TEST_F(SqliteTransactionTest, IsNotOpenWhereTheDatabaseCannotBeOpened) {
  SqliteDB handle(dir, 0, "label");
  SqliteTransaction transaction(handle);
  EXPECT_FALSE(transaction.IsOpen());
  EXPECT_EQ(handle.GetErr(), Error(404));
  ExpectLog({Warn(kFile, "Open", "Failed to open db[" + dir + "]"),
             Err(kFile, "Exec", "Failed to open db [" + dir + "]")});
}

TEST_F(SqliteTransactionTest, TheBeginningIsTriedAgain) {
  StartWithRetries(1);
  ASSERT_TRUE(other->Exec("BEGIN IMMEDIATE"));
  Pauses::Start([&] { EXPECT_TRUE(other->Exec("COMMIT")); }, [] {});
  const SqliteTransaction transaction(*db);
  EXPECT_TRUE(transaction.IsOpen());
  Pauses::ExpectCount(1);
  ExpectLog(
      {Info(kFile, "Exec", "After retry [1] times, success to exec command [BEGIN IMMEDIATE]")});
}

TEST_F(SqliteTransactionTest, IsNotOpenWhenAnotherOneStays) {
  StartWithRetries(2);
  ASSERT_TRUE(other->Exec("BEGIN IMMEDIATE"));
  SqliteTransaction transaction(*db);
  EXPECT_FALSE(transaction.IsOpen());
  EXPECT_EQ(db->GetErr(), kBusy);
  Pauses::ExpectCount(2);
  ExpectLog({ExecFailed("Exec", 3, "BEGIN IMMEDIATE", kBusy)});
  transaction.Rollback();
  EXPECT_EQ(db->GetErr(), kBusy);
  EXPECT_FALSE(transaction.Commit());
  EXPECT_EQ(db->GetErr(), Error(404));
  ExpectLog({NotOpen()});
}

TEST_F(SqliteTransactionTest, ASecondOneOnTheHandleIsNotOpenAndDisturbsNothing) {
  SqliteTransaction first(*db);
  Insert(1);
  const Json::Value failure = Error(404, 1, "cannot start a transaction within a transaction");
  {
    SqliteTransaction second(*db);
    EXPECT_FALSE(second.IsOpen());
    EXPECT_EQ(db->GetErr(), failure);
    second.Rollback();
    EXPECT_TRUE(first.IsOpen());
    EXPECT_FALSE(second.Commit());
  }
  ExpectLog({ExecFailed("Exec", 0, "BEGIN IMMEDIATE", failure), NotOpen()});
  EXPECT_TRUE(first.IsOpen());
  EXPECT_THAT(Kept(), IsEmpty());
  EXPECT_TRUE(first.Commit());
  EXPECT_THAT(Kept(), ElementsAre("n:1"));
}

TEST_F(SqliteTransactionTest, CommitIsTriedAgainWhileOthersRead) {
  StartWithRetries(1);
  SqliteTransaction transaction(*db);
  Insert(1);
  ASSERT_TRUE(other->Exec("BEGIN; SELECT n FROM t"));
  Pauses::Start([&] { EXPECT_TRUE(other->Exec("COMMIT")); }, [] {});
  EXPECT_TRUE(transaction.Commit());
  Pauses::ExpectCount(1);
  ExpectLog({Info(kFile, "Exec", "After retry [1] times, success to exec command [COMMIT]")});
  EXPECT_THAT(Kept(), ElementsAre("n:1"));
}

TEST_F(SqliteTransactionTest, ACommitThatFailedCanBeTriedAgain) {
  SqliteTransaction transaction(*db);
  Insert(1);
  ASSERT_TRUE(other->Exec("BEGIN; SELECT n FROM t"));
  EXPECT_FALSE(transaction.Commit());
  EXPECT_EQ(db->GetErr(), kBusy);
  ExpectLog({ExecFailed("Exec", 1, "COMMIT", kBusy)});
  EXPECT_TRUE(transaction.IsOpen());
  ASSERT_TRUE(other->Exec("COMMIT"));
  EXPECT_TRUE(transaction.Commit());
  EXPECT_EQ(db->GetErr(), Error(0));
  EXPECT_THAT(Kept(), ElementsAre("n:1"));
}

TEST_F(SqliteTransactionTest, ACommitThatBreaksAConstraintLeavesItOpen) {
  ASSERT_TRUE(
      db->Exec("PRAGMA foreign_keys=ON; CREATE TABLE child"
               " (n REFERENCES t (n) DEFERRABLE INITIALLY DEFERRED)"));
  SqliteTransaction transaction(*db);
  ASSERT_TRUE(db->Exec("INSERT INTO child VALUES (1)"));
  EXPECT_FALSE(transaction.Commit());
  EXPECT_EQ(db->GetErr(), Error(404, 19, "FOREIGN KEY constraint failed"));
  EXPECT_TRUE(transaction.IsOpen());
  Insert(1);
  EXPECT_TRUE(transaction.Commit());
  EXPECT_THAT(Kept(), ElementsAre("n:1"));
  LogCapture::Clear();
}

TEST_F(SqliteTransactionTest, AFailedStatementLeavesItOpen) {
  SqliteTransaction transaction(*db);
  Insert(1);
  EXPECT_FALSE(db->Exec("INSERT INTO t VALUES (2); nonsense"));
  EXPECT_FALSE(db->Exec("INSERT INTO t VALUES (1)"));
  EXPECT_TRUE(transaction.IsOpen());
  EXPECT_TRUE(transaction.Commit());
  EXPECT_THAT(Kept(), ElementsAre("n:1", "n:2"));
  LogCapture::Clear();
}

TEST_F(SqliteTransactionTest, ClosingTheHandleEndsIt) {
  SqliteTransaction transaction(*db);
  Insert(1);
  db->Close();
  EXPECT_FALSE(transaction.IsOpen());
  EXPECT_FALSE(transaction.Commit());
  ExpectLog({NotOpen()});
  EXPECT_THAT(Kept(), IsEmpty());
}

// A new connection is often at the address of the closed one.
TEST_F(SqliteTransactionTest, OneOfAClosedConnectionLeavesTheNextConnectionAlone) {
  std::optional<SqliteTransaction> first(*db);
  db->Close();
  SqliteTransaction second(*db);
  ASSERT_TRUE(second.IsOpen());
  Insert(1);
  EXPECT_FALSE(first->IsOpen());
  EXPECT_FALSE(first->Commit());
  first->Rollback();
  first.reset();
  EXPECT_TRUE(second.IsOpen());
  EXPECT_TRUE(second.Commit());
  EXPECT_THAT(Kept(), ElementsAre("n:1"));
  ExpectLog({NotOpen()});
}

TEST_F(SqliteTransactionTest, OneThatSqliteEndedLeavesTheNextOneAlone) {
  std::optional<SqliteTransaction> first(*db);
  Insert(1);
  EXPECT_FALSE(db->Exec("INSERT OR ROLLBACK INTO t VALUES (1)"));
  LogCapture::Clear();
  EXPECT_FALSE(first->IsOpen());
  SqliteTransaction second(*db);
  EXPECT_TRUE(second.IsOpen());
  Insert(2);
  EXPECT_FALSE(first->IsOpen());
  first.reset();
  EXPECT_TRUE(second.Commit());
  EXPECT_THAT(Kept(), ElementsAre("n:2"));
}

TEST_F(SqliteTransactionTest, HoldsTheOperationsOnRecords) {
  const SqliteTableHandler table("t", "n INTEGER PRIMARY KEY");
  const SqliteTableHandler fresh("fresh", "n");
  {
    const SqliteTransaction transaction(*db);
    EXPECT_TRUE(db->InsertRecord(InsertOf(table, "n", 1)));
    EXPECT_TRUE(db->InsertRecord(InsertOf(fresh, "n", 2)));
    EXPECT_TRUE(db->DeleteRecord("n=1", table));
    EXPECT_TRUE(db->SelectRecords(SelectAll(fresh), records));
    EXPECT_THAT(Texts(records), ElementsAre("n:2"));
  }
  EXPECT_FALSE(db->IsTableExisted("fresh"));
  EXPECT_THAT(Kept(), IsEmpty());
  LogCapture::Clear();
}

}  // namespace
