// Statements that find the database busy or locked, with the engine failing on request, and the
// recorded error while they run.

#include <gmock/gmock.h>
#include <sqlite3.h>

#include <set>

#include "kelodrcore/sqlite_db.h"
#include "support/database.h"
#include "support/test_clock.h"

namespace {

using KeloDRCore::SqliteCommand;
using testing::ElementsAre;

class SqliteDBRetryTest : public DatabaseTest {
 protected:
  void SetUp() override {
    FailNextCalls(0);
    DatabaseTest::SetUp();
  }

  // A handle that retries `retries` times, on a table with two rows.
  void Start(unsigned int retries) {
    db = std::make_unique<SqliteDB>(path, retries, "label");
    ASSERT_TRUE(db->Exec("CREATE TABLE t (n); INSERT INTO t VALUES (1), (2)"));
  }
};

struct Failure {
  int code;
  const char* message;
};

const Failure kLocks[] = {{5, "database is locked"}, {6, "database table is locked"}};

TEST_F(SqliteDBRetryTest, ExecSucceedsAfterOnePause) {
  Start(1);
  for (const Failure& lock : kLocks) {
    const std::string sql = "INSERT INTO t VALUES (fail(" + std::to_string(lock.code) + "))";
    FailNextCalls(1);
    Pauses::Start([&] { EXPECT_EQ(db->GetErr(), Error(405, lock.code, lock.message)); });
    EXPECT_TRUE(db->Exec(sql));
    EXPECT_EQ(db->GetErr(), Error(0));
    Pauses::ExpectCount(1);
    ExpectLog(
        {Info(kFile, "Exec", "After retry [1] times, success to exec command [" + sql + "]")});
  }
  EXPECT_THAT(Rows(*db, "SELECT n FROM t"), ElementsAre("n:1", "n:2", "n:5", "n:6"));
}

TEST_F(SqliteDBRetryTest, ExecGivesUpOnePastTheLimit) {
  for (const unsigned int limit : {0U, 1U, 3U}) {
    for (const Failure& lock : kLocks) {
      SqliteDB patient(path, limit, "");
      const std::string sql = "SELECT fail(" + std::to_string(lock.code) + ")";
      const Json::Value failure = Error(405, lock.code, lock.message);
      FailNextCalls(static_cast<int>(limit) + 1);
      Pauses::Start();
      EXPECT_FALSE(patient.Exec(sql));
      EXPECT_EQ(patient.GetErr(), failure);
      Pauses::ExpectCount(limit);
      ExpectLog({ExecFailed("Exec", limit + 1, sql, failure)});
      // All failures are used up, so that there were limit + 1 attempts.
      EXPECT_TRUE(patient.Exec(sql));
      Pauses::ExpectCount(limit);
    }
  }
}

TEST_F(SqliteDBRetryTest, ExecSucceedsOnTheLastAttempt) {
  Start(3);
  FailNextCalls(3);
  EXPECT_TRUE(db->Exec("SELECT fail(5)"));
  Pauses::ExpectCount(3);
  ExpectLog(
      {Info(kFile, "Exec", "After retry [3] times, success to exec command [SELECT fail(5)]")});
}

TEST_F(SqliteDBRetryTest, ThePausesAreDrawnFromAllMillisecondsOfOneToTwoSeconds) {
  Start(1100);
  FailNextCalls(1100);
  const CountingGenerator draws;
  EXPECT_TRUE(db->Exec("SELECT fail(5)"));
  std::set<unsigned int> expected;
  for (unsigned int length = 1000; length <= 2000; ++length) expected.insert(length);
  const std::vector<unsigned int> lengths = Pauses::Lengths();
  EXPECT_EQ(std::set<unsigned int>(lengths.begin(), lengths.end()), expected);
  LogCapture::Clear();
}

TEST_F(SqliteDBRetryTest, TheTwoQueriesCrossTheirWordings) {
  Start(2);
  const std::string sql = "SELECT fail(6) AS n";
  const Json::Value failure = Error(405, 6, "database table is locked");
  FailNextCalls(2);
  EXPECT_TRUE(db->SelectByCommand(sql, record));
  EXPECT_EQ(db->GetErr(), Error(0));
  FailNextCalls(2);
  EXPECT_TRUE(db->SelectByCommand(sql, records));
  EXPECT_EQ(db->GetErr(), Error(0));
  FailNextCalls(3);
  EXPECT_FALSE(db->SelectByCommand(sql, record));
  EXPECT_EQ(db->GetErr(), failure);
  FailNextCalls(3);
  EXPECT_FALSE(db->SelectByCommand(sql, records));
  EXPECT_EQ(db->GetErr(), failure);
  Pauses::ExpectCount(8);
  ExpectLog({Info(kFile, "SelectByCommand",
                  "After retry [2] times, success to exec command [" + sql + "]"),
             Info(kFile, "SelectByCommand", "After retry [2] times, success to select command"),
             SelectFailed(3, sql, failure), ExecFailed("SelectByCommand", 3, sql, failure)});
}

TEST_F(SqliteDBRetryTest, QueriesWithLimitZeroMakeOneAttempt) {
  Start(0);
  const std::string sql = "SELECT fail(5) AS n";
  const Json::Value failure = Error(405, 5, "database is locked");
  FailNextCalls(1);
  EXPECT_FALSE(db->SelectByCommand(sql, record));
  FailNextCalls(1);
  EXPECT_FALSE(db->SelectByCommand(sql, records));
  Pauses::ExpectCount(0);
  ExpectLog({SelectFailed(1, sql, failure), ExecFailed("SelectByCommand", 1, sql, failure)});
}

TEST_F(SqliteDBRetryTest, EveryOtherFailureEndsAtOnce) {
  Start(3);
  for (const int code :
       {1, 2, 3, 4, 8, 9, 10, 11, 12, 13, 14, 15, 16, 18, 19, 20, 22, 23, 24, 25, 26}) {
    const std::string sql = "SELECT fail(" + std::to_string(code) + ")";
    const Json::Value failure = Error(404, code, sqlite3_errstr(code));
    FailNextCalls(1);
    EXPECT_FALSE(db->Exec(sql));
    EXPECT_EQ(db->GetErr(), failure);
    FailNextCalls(1);
    EXPECT_FALSE(db->SelectByCommand(sql, record));
    EXPECT_EQ(db->GetErr(), failure);
    FailNextCalls(1);
    EXPECT_FALSE(db->SelectByCommand(sql, records));
    EXPECT_EQ(db->GetErr(), failure);
    ExpectLog({ExecFailed("Exec", 0, sql, failure), SelectFailed(0, sql, failure),
               ExecFailed("SelectByCommand", 0, sql, failure)});
  }
  Pauses::ExpectCount(0);
}

TEST_F(SqliteDBRetryTest, AnotherFailureAfterRetriesShowsThePausesMade) {
  Start(5);
  const std::string sql = "INSERT INTO late SELECT fail(5)";
  const Json::Value failure = Error(404, 1, "no such table: late");
  ASSERT_TRUE(db->Exec("CREATE TABLE late (n)"));
  SqliteDB other(path, 0, "");
  FailNextCalls(100);
  Pauses::Start([&] {
    if (Pauses::Lengths().size() < 2) return;
    EXPECT_TRUE(other.Exec("DROP TABLE late"));
  });
  EXPECT_FALSE(db->Exec(sql));
  EXPECT_EQ(db->GetErr(), failure);
  Pauses::ExpectCount(2);
  ExpectLog({ExecFailed("Exec", 2, sql, failure)});
}

TEST_F(SqliteDBRetryTest, RowsOfAFailedAttemptStayWhenItIsTriedAgain) {
  Start(1);
  FailNextCalls(1);
  EXPECT_TRUE(
      db->SelectByCommand("SELECT n FROM t UNION ALL SELECT fail(5) UNION ALL SELECT 9", records));
  EXPECT_THAT(Texts(records), ElementsAre("n:1", "n:2", "n:1", "n:2", "n:5", "n:9"));
  ExpectLog({Info(kFile, "SelectByCommand", "After retry [1] times, success to select command")});
}

// A text whose second statement fails `times` times, inside a transaction that it begins itself.
const std::string kTransaction = "BEGIN IMMEDIATE; INSERT INTO t VALUES (3), (fail(5)); COMMIT;";

TEST_F(SqliteDBRetryTest, ATextOfATransactionIsTriedAgainFromItsBeginning) {
  Start(2);
  FailNextCalls(2);
  EXPECT_TRUE(db->Exec(kTransaction));
  Pauses::ExpectCount(2);
  LogCapture::Clear();
  SqliteDB other(path, 0, "");
  EXPECT_THAT(Rows(other, "SELECT n FROM t"), ElementsAre("n:1", "n:2", "n:3", "n:5"));
}

TEST_F(SqliteDBRetryTest, ATextThatFailsLeavesNoTransactionThatItBegan) {
  Start(1);
  const std::string texts[] = {kTransaction, "SAVEPOINT a; INSERT INTO t VALUES (3), (fail(5))",
                               "COMMIT; nonsense", "BEGIN; COMMIT; BEGIN; SELECT fail(5)"};
  for (const std::string& sql : texts) {
    FailNextCalls(100);
    EXPECT_FALSE(db->Exec(sql));
    EXPECT_FALSE(db->DoExecSqliteCommand(sql));
    ASSERT_TRUE(db->Exec("INSERT INTO t VALUES (4)"));
    SqliteDB other(path, 0, "");
    EXPECT_THAT(Rows(other, "SELECT n FROM t"), ElementsAre("n:1", "n:2", "n:4"));
    ASSERT_TRUE(db->Exec("DELETE FROM t WHERE n > 2"));
  }
  LogCapture::Clear();
}

TEST_F(SqliteDBRetryTest, TheErrorOfATextIsThatOfTheStatementThatFailed) {
  Start(0);
  FailNextCalls(100);
  EXPECT_FALSE(db->Exec(kTransaction));
  const Json::Value busy = Error(405, 5, "database is locked");
  EXPECT_EQ(db->GetErr(), busy);
  EXPECT_FALSE(db->Exec("BEGIN; nonsense"));
  const Json::Value failure = Error(404, 1, "near \"nonsense\": syntax error");
  EXPECT_EQ(db->GetErr(), failure);
  ExpectLog({ExecFailed("Exec", 1, kTransaction, busy),
             ExecFailed("Exec", 0, "BEGIN; nonsense", failure)});
}

TEST_F(SqliteDBRetryTest, ATextThatFailsInsideATransactionLeavesItOpen) {
  Start(0);
  ASSERT_TRUE(db->Exec("BEGIN; INSERT INTO t VALUES (3)"));
  EXPECT_FALSE(db->Exec("INSERT INTO t VALUES (4); nonsense"));
  LogCapture::Clear();
  EXPECT_TRUE(db->Exec("COMMIT"));
  EXPECT_THAT(Rows(*db, "SELECT n FROM t"), ElementsAre("n:1", "n:2", "n:3", "n:4"));
}

TEST_F(SqliteDBRetryTest, ATextThatSucceedsMayLeaveATransactionOpen) {
  Start(0);
  ASSERT_TRUE(db->Exec("BEGIN; INSERT INTO t VALUES (3)"));
  ASSERT_TRUE(db->Exec("ROLLBACK"));
  EXPECT_THAT(Rows(*db, "SELECT n FROM t"), ElementsAre("n:1", "n:2"));
}

TEST_F(SqliteDBRetryTest, StatementsOutsideATransactionRunAgainWithTheRetry) {
  Start(1);
  FailNextCalls(1);
  EXPECT_TRUE(db->Exec("INSERT INTO t VALUES (3); INSERT INTO t VALUES (fail(5))"));
  LogCapture::Clear();
  EXPECT_THAT(Rows(*db, "SELECT n FROM t"), ElementsAre("n:1", "n:2", "n:3", "n:3", "n:5"));
}

TEST_F(SqliteDBRetryTest, SingleAttemptsNeverRetry) {
  Start(3);
  FailNextCalls(3);
  EXPECT_FALSE(db->DoExecSqliteCommand("SELECT fail(5)"));
  EXPECT_FALSE(db->DoSelectSqliteRecord("SELECT fail(5)", record));
  EXPECT_FALSE(db->DoSelectSqliteRecords("SELECT fail(5)", records));
  Json::Value raw = Error(5);
  raw["err_msg"] = "database is locked";
  EXPECT_EQ(db->GetErr(), raw);
  Pauses::ExpectCount(0);
}

TEST_F(SqliteDBRetryTest, TheConnectionIsKeptBetweenAttempts) {
  Start(2);
  ASSERT_TRUE(db->Exec("CREATE TEMP TABLE mine (n)"));
  FailNextCalls(2);
  const std::string sql = "INSERT INTO mine SELECT fail(5)";
  EXPECT_TRUE(db->Exec(sql));
  LogCapture::Clear();
  EXPECT_THAT(Rows(*db, "SELECT n FROM mine"), ElementsAre("n:5"));
}

TEST_F(SqliteDBRetryTest, TheErrorIsUnknownWhileExecRunsAndAFailureWhileAQueryDoes) {
  Start(0);
  Json::Value during;
  FailNextCalls(0, [&] { during = db->GetErr(); });
  EXPECT_TRUE(db->Exec("SELECT fail(1)"));
  EXPECT_EQ(during, Error(407));
  db->SetDBErr(7, "before");
  EXPECT_TRUE(db->SelectByCommand("SELECT fail(1) AS n", record));
  EXPECT_EQ(during, Error(404));
  db->SetDBErr(7, "before");
  EXPECT_TRUE(db->SelectByCommand("SELECT fail(1) AS n", records));
  EXPECT_EQ(during, Error(404));
}

// Notes the handle's error whenever it is asked something.
class ProbeCommand : public SqliteCommand {
 public:
  explicit ProbeCommand(const SqliteDB& observed) : db(observed) {}

  std::string GetCommand() const override {
    errors.push_back(db.GetErr());
    return "SELECT " + std::to_string(errors.size());
  }
  bool IsValid() const override {
    errors.push_back(db.GetErr());
    return true;
  }
  void DumpParam(std::stringstream& /*stream*/) const override {}

  mutable std::vector<Json::Value> errors;

 private:
  const SqliteDB& db;
};

TEST_F(SqliteDBRetryTest, ACommandIsAskedTwiceWithTheErrorOfItsStep) {
  const ProbeCommand probe(*db);
  EXPECT_TRUE(db->Exec(probe));
  EXPECT_THAT(probe.errors, ElementsAre(Error(407), Error(407), Error(404)));
  ExpectLog({Info(kFile, "Exec", "label Exec cmd: SELECT 1"),
             Info(kFile, "Exec", "label Exec cmd success")});
}

}  // namespace
