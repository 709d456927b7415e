// SelectEach: rows handed over one by one.

#include <gmock/gmock.h>
#include <malloc.h>

#include <algorithm>
#include <stdexcept>

#include "support/database.h"

namespace {

using testing::ElementsAre;
using testing::IsEmpty;

const SqliteTableHandler kTable("t", "n INTEGER");

class SqliteDBEachTest : public DatabaseTest {
 protected:
  void SetUp() override {
    FailNextCalls(0);
    DatabaseTest::SetUp();
    db = std::make_unique<SqliteDB>(path, 2, "label");
    ASSERT_TRUE(db->Exec("CREATE TABLE t (n INTEGER); INSERT INTO t VALUES (1), (2), (3)"));
  }

  // Takes `most` rows.
  bool Each(const SelectCommand& command, size_t most = 1000) {
    return db->SelectEach(command, [&](const SqliteValueList& row) {
      records.push_back(row);
      return records.size() < most;
    });
  }

  // A select of one expression, named n, from each row.
  static SelectCommand SelectOf(const std::string& expression) {
    SelectCommand command;
    EXPECT_TRUE(command.SetTable(kTable));
    EXPECT_TRUE(command.AddField(expression + " AS n"));
    return command;
  }

  // No statement of the handle reads any more: another one may write.
  void ExpectReleased() {
    SqliteDB other(path, 0, "other");
    Pauses::Start(nullptr, [] {});
    EXPECT_TRUE(other.Exec("BEGIN EXCLUSIVE; COMMIT"));
  }
};

TEST_F(SqliteDBEachTest, HandsTheRowsOverInOrder) {
  SelectCommand command = SelectAll(kTable);
  command.AddOrderField("n");
  EXPECT_TRUE(Each(command));
  EXPECT_THAT(Texts(records), ElementsAre("n:3", "n:2", "n:1"));
  EXPECT_EQ(db->GetErr(), Error(0));
}

TEST_F(SqliteDBEachTest, StopsWithSuccessWhenItIsTold) {
  EXPECT_TRUE(Each(SelectAll(kTable), 2));
  EXPECT_THAT(Texts(records), ElementsAre("n:1", "n:2"));
  EXPECT_EQ(db->GetErr(), Error(0));
  ExpectReleased();
}

TEST_F(SqliteDBEachTest, NoRowIsASuccessWithoutACall) {
  SelectCommand command = SelectAll(kTable);
  command.SetCondition("n > 3");
  EXPECT_FALSE(db->Exec("nonsense"));
  LogCapture::Clear();
  EXPECT_TRUE(Each(command));
  EXPECT_THAT(records, IsEmpty());
  EXPECT_EQ(db->GetErr(), Error(0));
}

TEST_F(SqliteDBEachTest, CreatesTheTable) {
  EXPECT_TRUE(Each(SelectAll(SqliteTableHandler("fresh", "n"))));
  EXPECT_TRUE(db->IsTableExisted("fresh"));
}

TEST_F(SqliteDBEachTest, AnInvalidCommandFailsAsForSelectRecords) {
  EXPECT_FALSE(Each(SelectCommand()));
  EXPECT_EQ(db->GetErr(), Error(401));
  ExpectLog({Err(kFile, "SelectEach", "invalid select command []condition:[]/fields:[]]")});
}

TEST_F(SqliteDBEachTest, AMissingFileFailsWithoutALine) {
  EXPECT_FALSE(db->Exec("nonsense"));
  const Json::Value before = db->GetErr();
  db = std::make_unique<SqliteDB>(Path("missing"), 0, "label");
  EXPECT_FALSE(Each(SelectAll(kTable)));
  EXPECT_EQ(db->GetErr(), Error(0));
  LogCapture::Clear();
}

TEST_F(SqliteDBEachTest, ATableThatCannotBeCreatedFails) {
  EXPECT_FALSE(Each(SelectAll(SqliteTableHandler("fresh", ""))));
  const Json::Value missing = Error(404, 1, "no such table: fresh");
  EXPECT_EQ(db->GetErr(), missing);
  ExpectLog({ExecFailed("SelectByCommand", 0, "SELECT  * FROM fresh", missing)});
  EXPECT_FALSE(Each(SelectAll(SqliteTableHandler("fresh", ","))));
  std::vector<LogLine> lines = LogCapture::Take();
  ASSERT_FALSE(lines.empty());
  EXPECT_EQ(lines.back(), Err(kFile, "SelectEach", "Failed to create table"));
}

TEST_F(SqliteDBEachTest, AFileThatCannotBeOpenedFails) {
  db = std::make_unique<SqliteDB>(dir, 0, "label");
  EXPECT_FALSE(Each(SelectAll(SqliteTableHandler("t", ""))));
  EXPECT_EQ(db->GetErr(), Error(404));
  ExpectLog({Warn(kFile, "Open", "Failed to open db[" + dir + "]"),
             Err(kFile, "SelectByCommand", "Failed to open db [" + dir + "]")});
}

TEST_F(SqliteDBEachTest, ANulByteInTheConditionIsRefused) {
  SelectCommand command = SelectAll(kTable);
  command.SetCondition(std::string("n = 1\0 OR 1", 11));
  EXPECT_FALSE(Each(command));
  EXPECT_EQ(db->GetErr(), Error(401));
  EXPECT_THAT(records, IsEmpty());
  ExpectLog({Err(kFile, "SelectByCommand", "NUL byte in command [SELECT  * FROM t WHERE n = 1]")});
}

TEST_F(SqliteDBEachTest, ANulByteInTheConditionLeavesTheTableUnmade) {
  SelectCommand command = SelectAll(SqliteTableHandler("missing", "n"));
  command.SetCondition(std::string("n = 1\0 OR 1", 11));
  SqliteValueList row;
  EXPECT_FALSE(Each(command));
  EXPECT_FALSE(db->SelectRecord(command, row));
  EXPECT_FALSE(db->SelectRecords(command, records));
  EXPECT_EQ(db->GetErr(), Error(401));
  const LogLine refused =
      Err(kFile, "SelectByCommand", "NUL byte in command [SELECT  * FROM missing WHERE n = 1]");
  ExpectLog({refused, refused, refused});
  EXPECT_FALSE(db->IsTableExisted("missing"));
}

TEST_F(SqliteDBEachTest, IsTriedAgainWhileNoRowWasHandedOver) {
  for (const int code : {5, 6}) {
    records.clear();
    FailNextCalls(2);
    Pauses::Start();
    EXPECT_TRUE(Each(SelectOf("fail(" + std::to_string(code) + ")")));
    EXPECT_EQ(records.size(), 3U);
    EXPECT_EQ(db->GetErr(), Error(0));
    Pauses::ExpectCount(2);
    ExpectLog({Info(kFile, "SelectByCommand", "After retry [2] times, success to select command")});
  }
}

TEST_F(SqliteDBEachTest, GivesUpOnePastTheLimit) {
  FailNextCalls(100);
  EXPECT_FALSE(Each(SelectOf("fail(5)")));
  const Json::Value failure = Error(405, 5, "database is locked");
  EXPECT_EQ(db->GetErr(), failure);
  EXPECT_THAT(records, IsEmpty());
  Pauses::ExpectCount(2);
  ExpectLog({ExecFailed("SelectByCommand", 3, "SELECT fail(5) AS n FROM t", failure)});
}

TEST_F(SqliteDBEachTest, IsNotTriedAgainAfterARow) {
  for (const int code : {5, 6}) {
    records.clear();
    FailNextCalls(1);
    EXPECT_FALSE(Each(SelectOf("iif(n = 1, n, fail(" + std::to_string(code) + "))")));
    EXPECT_THAT(Texts(records), ElementsAre("n:1"));
    EXPECT_EQ(db->GetErr()["err_code"], 405);
    EXPECT_EQ(db->GetErr()["err_msg"]["sqlite_errcode"], code);
    Pauses::ExpectCount(0);
    const std::vector<LogLine> lines = LogCapture::Take();
    ASSERT_EQ(lines.size(), 1U);
    EXPECT_EQ(lines[0].message.find("Reach retry limit [0], failed to exec command ["), 0U);
    ExpectReleased();
  }
}

TEST_F(SqliteDBEachTest, AnotherFailureEndsAtOnce) {
  FailNextCalls(1);
  EXPECT_FALSE(Each(SelectOf("fail(10)")));
  EXPECT_EQ(db->GetErr(), Error(404, 10, "disk I/O error"));
  Pauses::ExpectCount(0);
  LogCapture::Clear();
}

TEST_F(SqliteDBEachTest, WhatTheFunctionThrowsPassesAfterTheStatementIsReleased) {
  const auto throwing = [&](const auto& exception) {
    return [&, exception](const SqliteValueList& row) -> bool {
      records.push_back(row);
      throw exception;
    };
  };
  EXPECT_THROW(db->SelectEach(SelectAll(kTable), throwing(std::runtime_error("own"))),
               std::runtime_error);
  ExpectReleased();
  EXPECT_THROW(db->SelectEach(SelectAll(kTable), throwing(Json::LogicError("own"))),
               Json::LogicError);
  EXPECT_THROW(db->SelectEach(SelectAll(kTable), throwing(42)), int);
  ExpectReleased();
  EXPECT_EQ(records.size(), 3U);
}

TEST_F(SqliteDBEachTest, TheErrorIsADatabaseErrorUntilTheLastRow) {
  std::vector<Json::Value> errors;
  EXPECT_TRUE(db->SelectEach(SelectAll(kTable), [&](const SqliteValueList& /*row*/) {
    errors.push_back(db->GetErr());
    return true;
  }));
  EXPECT_THAT(errors, testing::Each(Error(404)));
  EXPECT_EQ(db->GetErr(), Error(0));
}

TEST_F(SqliteDBEachTest, TheFunctionMayUseTheHandle) {
  const auto take = [&](const SqliteValueList& row) {
    int n = 0;
    EXPECT_TRUE(row.GetValue("n", n));
    EXPECT_FALSE(db->Exec("nonsense"));
    return db->Exec("UPDATE t SET n = n + 10 WHERE n = " + std::to_string(n));
  };
  SelectCommand command = SelectAll(kTable);
  command.AddOrderField("n");  // sorted before the first row, so that the updates do not show
  EXPECT_TRUE(db->SelectEach(command, take));
  EXPECT_EQ(db->GetErr(), Error(0));
  EXPECT_THAT(Rows(*db, "SELECT n FROM t ORDER BY n"), ElementsAre("n:11", "n:12", "n:13"));
  LogCapture::Clear();
}

TEST_F(SqliteDBEachTest, ARowsLinesNameTheParser) {
  ASSERT_TRUE(db->Exec("UPDATE t SET n = NULL WHERE n = 2"));
  EXPECT_TRUE(Each(SelectAll(kTable)));
  EXPECT_THAT(Texts(records), ElementsAre("n:1", "", "n:3"));
  ExpectLog({Warn(kFile, "ParseRecord", "field [n] has null value")});
}

TEST_F(SqliteDBEachTest, TheMemoryDoesNotGrowWithTheRows) {
  ASSERT_TRUE(
      db->Exec("WITH RECURSIVE i (n) AS (SELECT 1 UNION ALL SELECT n + 1 FROM i LIMIT 3000)"
               "INSERT INTO t SELECT n FROM i"));
  SelectCommand command;
  ASSERT_TRUE(command.SetTable(kTable));
  ASSERT_TRUE(command.AddField("hex(zeroblob(5000)) AS text"));  // 30 MB in all
  size_t most = 0;
  const size_t before = mallinfo2().uordblks;
  EXPECT_TRUE(db->SelectEach(command, [&](const SqliteValueList& /*row*/) {
    most = std::max(most, static_cast<size_t>(mallinfo2().uordblks));
    return true;
  }));
  EXPECT_LT(most, before + 5000000);
}

}  // namespace
