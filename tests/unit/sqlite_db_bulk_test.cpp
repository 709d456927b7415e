// InsertRecords and InsertOrReplaceRecords: many records, all or none.

#include <dlfcn.h>
#include <gmock/gmock.h>
#include <sqlite3.h>

#include <cstring>
#include <limits>

#include "kelodrcore/sqlite_transaction.h"
#include "support/database.h"

namespace {

using KeloDRCore::SqliteTransaction;
using KeloDRCore::SqliteValue;
using testing::ElementsAre;
using testing::IsEmpty;

int preparedInserts = 0;
bool refusesUndoing = false;

template <typename Function>
Function Next(const char* name, Function /*type*/) {
  return reinterpret_cast<Function>(dlsym(RTLD_NEXT, name));
}

}  // namespace

// The linker lets these stand before the engine's own.
extern "C" int sqlite3_prepare_v2(sqlite3* db, const char* sql, int size, sqlite3_stmt** stmt,
                                  const char** tail) {
  if (std::strncmp(sql, "INSERT", 6) == 0) ++preparedInserts;
  return Next("sqlite3_prepare_v2", &sqlite3_prepare_v2)(db, sql, size, stmt, tail);
}

extern "C" int sqlite3_exec(sqlite3* db, const char* sql, int (*row)(void*, int, char**, char**),
                            void* argument, char** message) {
  if (refusesUndoing && std::strncmp(sql, "ROLLBACK", 8) == 0) return SQLITE_NOMEM;
  return Next("sqlite3_exec", &sqlite3_exec)(db, sql, row, argument, message);
}

namespace {

const SqliteTableHandler kTable("t", "n INTEGER PRIMARY KEY, s TEXT");
const Json::Value kBusy = Error(405, 5, "database is locked");
constexpr char kStatement[] = "INSERT INTO t (n) VALUES (?);";

SqliteValueList Record(int n) {
  SqliteValueList record;
  EXPECT_TRUE(record.AddValue("n", n));
  return record;
}

SqliteValueList Record(int n, const SqliteValue& s) {
  SqliteValueList record = Record(n);
  EXPECT_TRUE(record.AddValue("s", s));
  return record;
}

class SqliteDBBulkTest : public DatabaseTest {
 protected:
  void SetUp() override {
    FailNextCalls(0);
    DatabaseTest::SetUp();
    other = std::make_unique<SqliteDB>(path, 0, "other");
    Pauses::Start(nullptr, [] {});
    refusesUndoing = false;
  }

  void TearDown() override {
    other.reset();
    DatabaseTest::TearDown();
  }

  void Start(unsigned int retries) {
    db = std::make_unique<SqliteDB>(path, retries, "label");
    ASSERT_TRUE(db->CreateTable(kTable));
  }

  // What is on disk, as another connection sees it.
  std::vector<std::string> Kept() { return Rows(*other, "SELECT * FROM t ORDER BY n"); }

  static LogLine Announced(const std::string& statement,
                           const std::string& function = "InsertRecords") {
    return Info(kFile, function, "label Exec cmd: " + statement);
  }
  static LogLine Succeeded(const std::string& function = "InsertRecords") {
    return Info(kFile, function, "label Exec cmd success");
  }

  void ExpectInvalid(const SqliteTableHandler& table, const Records& rows) {
    EXPECT_FALSE(db->InsertRecords(table, rows));
    EXPECT_EQ(db->GetErr(), Error(401));
    EXPECT_FALSE(HasFile());
    ExpectLog({Err(kFile, "InsertRecords",
                   std::string("invalid records for table [") + table.tableName.c_str() + "]")});
  }

  // The insert of 1 and 2 on a database where `block` has happened, which `unblock` ends in the
  // first pause.
  void ExpectRetried(const std::string& block, const std::string& unblock) {
    ASSERT_TRUE(other->Exec(block));
    LogCapture::Clear();
    Pauses::Start([&] { EXPECT_TRUE(other->Exec(unblock)); }, [] {});
    EXPECT_TRUE(db->InsertRecords(SqliteTableHandler("t", ""), {Record(1), Record(2)}));
    EXPECT_EQ(db->GetErr(), Error(0));
    Pauses::ExpectCount(1);
    ExpectLog({Announced(kStatement), Succeeded()});
    EXPECT_THAT(Rows(*db, "SELECT n FROM t ORDER BY n"), ElementsAre("n:1", "n:2"));
  }

  std::unique_ptr<SqliteDB> other;
};

TEST_F(SqliteDBBulkTest, CreatesFileAndTableAndInsertsAll) {
  EXPECT_TRUE(db->InsertRecords(kTable, {Record(2, "b"), Record(1, "it's")}));
  EXPECT_EQ(db->GetErr(), Error(0));
  ExpectLog({Announced("INSERT INTO t (n,s) VALUES (?,?);"), Succeeded()});
  EXPECT_THAT(Kept(), ElementsAre("n:1, s:'it''s'", "n:2, s:'b'"));
}

TEST_F(SqliteDBBulkTest, ARowThatIsThereFailsTheInsertAndIsReplacedByTheOther) {
  ASSERT_TRUE(db->InsertRecords(kTable, {Record(2, "old")}));
  LogCapture::Clear();
  const Records rows = {Record(1, "new"), Record(2, "new"), Record(3, "new")};
  const Json::Value failure = Error(404, 19, "UNIQUE constraint failed: t.n");
  EXPECT_FALSE(db->InsertRecords(kTable, rows));
  EXPECT_EQ(db->GetErr(), failure);
  ExpectLog({Announced("INSERT INTO t (n,s) VALUES (?,?);"),
             ExecFailed("InsertRecords", 0, "INSERT INTO t (n,s) VALUES (?,?);", failure)});
  EXPECT_THAT(Kept(), ElementsAre("n:2, s:'old'"));
  EXPECT_TRUE(db->InsertOrReplaceRecords(kTable, rows));
  EXPECT_EQ(db->GetErr(), Error(0));
  const std::string function = "InsertOrReplaceRecords";
  ExpectLog(
      {Announced("INSERT OR REPLACE INTO t (n,s) VALUES (?,?);", function), Succeeded(function)});
  EXPECT_THAT(Kept(), ElementsAre("n:1, s:'new'", "n:2, s:'new'", "n:3, s:'new'"));
}

TEST_F(SqliteDBBulkTest, NothingStaysBegunAfterAFailure) {
  Start(0);
  EXPECT_FALSE(db->InsertRecords(kTable, {Record(1), Record(1)}));
  LogCapture::Clear();
  EXPECT_TRUE(db->Exec("INSERT INTO t (n) VALUES (5)"));
  EXPECT_THAT(Kept(), ElementsAre("n:5"));
  LogCapture::Clear();
}

TEST_F(SqliteDBBulkTest, NoRecordsTouchNothing) {
  EXPECT_FALSE(db->Exec(""));
  LogCapture::Clear();
  EXPECT_TRUE(db->InsertRecords(kTable, {}));
  EXPECT_TRUE(db->InsertOrReplaceRecords(kTable, {}));
  EXPECT_EQ(db->GetErr(), Error(401));
  EXPECT_FALSE(HasFile());
}

TEST_F(SqliteDBBulkTest, ATableWithoutANameIsRefused) {
  ExpectInvalid(SqliteTableHandler("", "n"), {Record(1)});
}

TEST_F(SqliteDBBulkTest, AnEmptyRecordAnywhereIsRefused) {
  ExpectInvalid(kTable, {SqliteValueList()});
  ExpectInvalid(kTable, {SqliteValueList(), Record(1)});
  ExpectInvalid(kTable, {Record(1), SqliteValueList()});
}

TEST_F(SqliteDBBulkTest, ANulByteInTheFirstStatementIsRefused) {
  record.AddValue(std::string("n\0x", 3), 1);
  EXPECT_FALSE(db->InsertRecords(kTable, {record, Record(1)}));
  EXPECT_EQ(db->GetErr(), Error(401));
  EXPECT_FALSE(db->InsertRecords(SqliteTableHandler(std::string("t\0x", 3), "n"), {Record(1)}));
  EXPECT_EQ(db->GetErr(), Error(401));
  EXPECT_FALSE(HasFile());
  ExpectLog({Err(kFile, "InsertRecords", "NUL byte in command [INSERT INTO t (n]"),
             Err(kFile, "InsertRecords", "NUL byte in command [INSERT INTO t]")});
}

TEST_F(SqliteDBBulkTest, WhatCannotBeBoundIsRefusedAndNothingIsStored) {
  Start(3);
  record.AddValue(std::string("n\0x", 3), 1);
  const Records refused[] = {
      {Record(1), record},
      {Record(1, 1), Record(2, std::numeric_limits<unsigned long long>::max())},
      {Record(1, 1ULL << 63)}};
  for (const Records& rows : refused) {
    EXPECT_FALSE(db->InsertRecords(kTable, rows));
    EXPECT_EQ(db->GetErr(), Error(401));
    const std::vector<LogLine> lines = LogCapture::Take();
    ASSERT_EQ(lines.size(), 2U);
    EXPECT_EQ(lines[1], ExecFailed("InsertRecords", 0,
                                   lines[0].message.substr(std::string("label Exec cmd: ").size()),
                                   Error(401)));
    EXPECT_THAT(Kept(), IsEmpty());
    EXPECT_TRUE(db->Exec("BEGIN; ROLLBACK"));
  }
  Pauses::ExpectCount(0);
}

TEST_F(SqliteDBBulkTest, IntegersAreStoredWhole) {
  constexpr long long kMin = std::numeric_limits<long long>::min();
  constexpr long long kMax = std::numeric_limits<long long>::max();
  const SqliteTableHandler table("t", "n INTEGER PRIMARY KEY, s INTEGER");
  EXPECT_TRUE(db->InsertRecords(
      table, {Record(1, kMin), Record(2, kMax), Record(3, static_cast<unsigned long long>(kMax)),
              Record(4, 4294967296LL), Record(5, 4294967295U), Record(6, -1), Record(7, true),
              Record(8, false)}));
  LogCapture::Clear();
  EXPECT_THAT(
      Rows(*db, "SELECT CAST(s AS TEXT) AS s FROM t WHERE typeof(s) = 'integer'"),
      ElementsAre("s:'-9223372036854775808'", "s:'9223372036854775807'", "s:'9223372036854775807'",
                  "s:'4294967296'", "s:'4294967295'", "s:'-1'", "s:'1'", "s:'0'"));
}

TEST_F(SqliteDBBulkTest, TextsAreBoundAndNotRead) {
  const std::string long1(100000, 'x');
  EXPECT_TRUE(db->InsertRecords(
      kTable, {Record(1, "'); DROP TABLE t; --"), Record(2, ""), Record(3, "\xc3\xa4?"),
               Record(4, long1), Record(5, std::string("a\0b", 3))}));
  LogCapture::Clear();
  EXPECT_THAT(Rows(*db, "SELECT s FROM t WHERE n < 4"),
              ElementsAre("s:'''); DROP TABLE t; --'", "s:''", "s:'\xc3\xa4?'"));
  EXPECT_THAT(Rows(*db, "SELECT hex(s) AS s FROM t WHERE n = 5"), ElementsAre("s:'610062'"));
  EXPECT_THAT(Rows(*db, "SELECT length(s) AS s FROM t WHERE n = 4"), ElementsAre("s:100000"));
}

TEST_F(SqliteDBBulkTest, EachRunOfTheSameFieldsIsPreparedOnce) {
  Start(0);
  SqliteValueList named;
  named.AddValue("s", "alone");
  preparedInserts = 0;
  EXPECT_TRUE(db->InsertRecords(
      kTable, {Record(1), Record(2), Record(3, "c"), Record(4, "d"), named, Record(7), Record(8)}));
  EXPECT_EQ(preparedInserts, 4);
  ExpectLog({Announced(kStatement), Succeeded()});
  EXPECT_THAT(Rows(*db, "SELECT n, ifnull(s, '-') AS s FROM t"),
              ElementsAre("n:1, s:'-'", "n:2, s:'-'", "n:3, s:'c'", "n:4, s:'d'", "n:5, s:'alone'",
                          "n:7, s:'-'", "n:8, s:'-'"));
}

TEST_F(SqliteDBBulkTest, AFailureInALaterRunUndoesTheEarlierOnes) {
  Start(0);
  SqliteValueList unknown;
  unknown.AddValue("unknown", 1);
  const Json::Value failure = Error(404, 1, "table t has no column named unknown");
  EXPECT_FALSE(db->InsertRecords(kTable, {Record(1), unknown, Record(2)}));
  EXPECT_EQ(db->GetErr(), failure);
  ExpectLog({Announced(kStatement), ExecFailed("InsertRecords", 0, kStatement, failure)});
  EXPECT_THAT(Kept(), IsEmpty());
}

TEST_F(SqliteDBBulkTest, ATableThatIsNotToBeCreatedHasToBeThere) {
  const Json::Value failure = Error(404, 1, "no such table: t");
  EXPECT_FALSE(db->InsertRecords(SqliteTableHandler("t", ""), {Record(1)}));
  EXPECT_EQ(db->GetErr(), failure);
  ExpectLog({Announced(kStatement), ExecFailed("InsertRecords", 0, kStatement, failure)});
}

TEST_F(SqliteDBBulkTest, ATableThatCannotBeCreatedFails) {
  EXPECT_FALSE(db->InsertRecords(SqliteTableHandler("t", ","), {Record(1)}));
  EXPECT_EQ(db->GetErr()["err_code"], 404);
  const std::vector<LogLine> lines = LogCapture::Take();
  ASSERT_EQ(lines.size(), 4U);
  EXPECT_EQ(lines.front(), Announced(kStatement));
  EXPECT_EQ(lines.back(), Err(kFile, "InsertRecords", "Failed to create table [t]"));
}

TEST_F(SqliteDBBulkTest, AFileThatCannotBeOpenedFails) {
  db = std::make_unique<SqliteDB>(dir, 0, "label");
  EXPECT_FALSE(db->InsertRecords(SqliteTableHandler("t", ""), {Record(1)}));
  EXPECT_EQ(db->GetErr(), Error(404));
  ExpectLog({Announced(kStatement), Warn(kFile, "Open", "Failed to open db[" + dir + "]"),
             Err(kFile, "InsertRecords", "Failed to open db [" + dir + "]")});
}

TEST_F(SqliteDBBulkTest, IsTriedAgainWhenNothingCanBeRead) {
  Start(1);
  ExpectRetried("BEGIN EXCLUSIVE", "COMMIT");
}

TEST_F(SqliteDBBulkTest, IsTriedAgainWhenNothingCanBeWritten) {
  Start(1);
  ExpectRetried("BEGIN IMMEDIATE", "COMMIT");
}

TEST_F(SqliteDBBulkTest, IsTriedAgainWhenItCannotCommit) {
  Start(1);
  ExpectRetried("BEGIN; SELECT * FROM t", "COMMIT");
}

TEST_F(SqliteDBBulkTest, IsTriedAgainAsAWholeWhenAnyRowMeetsALock) {
  Start(1);
  ASSERT_TRUE(
      db->Exec("CREATE TRIGGER failing BEFORE INSERT ON t WHEN new.n = 2 BEGIN"
               " SELECT fail(new.s); END"));
  for (const int code : {5, 6}) {
    FailNextCalls(1);
    Pauses::Start([&] { EXPECT_THAT(Kept(), IsEmpty()); });
    EXPECT_TRUE(db->InsertRecords(kTable, {Record(1, code), Record(2, code), Record(3, code)}));
    Pauses::ExpectCount(1);
    EXPECT_THAT(Rows(*other, "SELECT n FROM t ORDER BY n"), ElementsAre("n:1", "n:2", "n:3"));
    ASSERT_TRUE(db->Exec("DELETE FROM t"));
  }
  LogCapture::Clear();
}

TEST_F(SqliteDBBulkTest, GivesUpOnePastTheLimitAndLeavesNothing) {
  Start(2);
  ASSERT_TRUE(other->Exec("BEGIN; SELECT * FROM t"));
  EXPECT_FALSE(db->InsertRecords(kTable, {Record(1), Record(2)}));
  EXPECT_EQ(db->GetErr(), kBusy);
  Pauses::ExpectCount(2);
  ExpectLog({Announced(kStatement), ExecFailed("InsertRecords", 3, kStatement, kBusy)});
  ASSERT_TRUE(other->Exec("COMMIT"));
  EXPECT_TRUE(db->Exec("INSERT INTO t (n) VALUES (5)"));
  EXPECT_THAT(Rows(*other, "SELECT n FROM t"), ElementsAre("n:5"));
}

TEST_F(SqliteDBBulkTest, InsideATransactionItsFailureUndoesOnlyItself) {
  Start(0);
  SqliteTransaction transaction(*db);
  EXPECT_TRUE(db->InsertRecords(kTable, {Record(1), Record(2)}));
  EXPECT_FALSE(db->InsertRecords(kTable, {Record(3), Record(1)}));
  EXPECT_EQ(db->GetErr(), Error(404, 19, "UNIQUE constraint failed: t.n"));
  EXPECT_FALSE(db->Exec("RELEASE records")) << "the savepoint is left";
  EXPECT_TRUE(transaction.IsOpen());
  EXPECT_TRUE(db->InsertRecords(kTable, {Record(4)}));
  EXPECT_THAT(Rows(*other, "SELECT n FROM t"), IsEmpty());
  EXPECT_TRUE(transaction.Commit());
  EXPECT_THAT(Rows(*other, "SELECT n FROM t"), ElementsAre("n:1", "n:2", "n:4"));
  LogCapture::Clear();
}

TEST_F(SqliteDBBulkTest, InsideATransactionItIsUndoneWithIt) {
  Start(0);
  {
    const SqliteTransaction transaction(*db);
    EXPECT_TRUE(db->InsertRecords(kTable, {Record(1), Record(2)}));
  }
  EXPECT_THAT(Kept(), IsEmpty());
  LogCapture::Clear();
}

TEST_F(SqliteDBBulkTest, InsideATransactionItIsTriedAgainFromItsSavepoint) {
  Start(1);
  ASSERT_TRUE(
      db->Exec("CREATE TRIGGER failing BEFORE INSERT ON t WHEN new.n = 2 BEGIN"
               " SELECT fail(5); END"));
  SqliteTransaction transaction(*db);
  ASSERT_TRUE(db->Exec("INSERT INTO t (n) VALUES (9)"));
  FailNextCalls(1);
  EXPECT_TRUE(db->InsertRecords(kTable, {Record(1), Record(2)}));
  Pauses::ExpectCount(1);
  EXPECT_TRUE(transaction.Commit());
  EXPECT_THAT(Rows(*other, "SELECT n FROM t ORDER BY n"), ElementsAre("n:1", "n:2", "n:9"));
  LogCapture::Clear();
}

// Half of the records must not become a part of what the caller commits.
TEST_F(SqliteDBBulkTest, ASavepointThatCannotBeUndoneTakesTheTransactionWithIt) {
  Start(0);
  SqliteTransaction transaction(*db);
  refusesUndoing = true;
  EXPECT_FALSE(db->InsertRecords(kTable, {Record(1), Record(1)}));
  refusesUndoing = false;
  EXPECT_FALSE(transaction.IsOpen());
  EXPECT_FALSE(transaction.Commit());
  EXPECT_THAT(Kept(), IsEmpty());
  LogCapture::Clear();
}

TEST_F(SqliteDBBulkTest, ATransactionThatCannotBeRolledBackEndsWithTheConnection) {
  Start(0);
  refusesUndoing = true;
  EXPECT_FALSE(db->Exec("BEGIN; INSERT INTO t (n) VALUES (1); nonsense"));
  EXPECT_EQ(db->GetErr(), Error(404, 1, "near \"nonsense\": syntax error"));
  {
    SqliteTransaction transaction(*db);
    ASSERT_TRUE(db->Exec("INSERT INTO t (n) VALUES (2)"));
  }
  refusesUndoing = false;
  EXPECT_TRUE(db->Exec("INSERT INTO t (n) VALUES (3)"));
  EXPECT_THAT(Rows(*other, "SELECT n FROM t"), ElementsAre("n:3"));
  LogCapture::Clear();
}

}  // namespace
