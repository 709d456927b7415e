#include "kelodrcore/sqlite_db.h"

#include <dlfcn.h>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <sqlite3.h>
#include <unistd.h>

#include "kelodrcore/err.h"
#include "support/database.h"

namespace {

using testing::ElementsAre;
using testing::IsEmpty;

// What the tests force the engine to answer.
bool opensWithoutHandle = false;
bool refusesBusyTimeout = false;
bool givesNoText = false;
bool givesNoName = false;

template <typename Function>
Function Next(const char* name, Function /*type*/) {
  return reinterpret_cast<Function>(dlsym(RTLD_NEXT, name));
}

}  // namespace

// The linker lets these stand before the engine's own.
extern "C" int sqlite3_open(const char* path, sqlite3** db) {
  if (opensWithoutHandle) {
    *db = nullptr;
    return SQLITE_OK;
  }
  return Next("sqlite3_open", &sqlite3_open)(path, db);
}

extern "C" int sqlite3_busy_timeout(sqlite3* db, int milliseconds) {
  if (refusesBusyTimeout) return SQLITE_MISUSE;
  if (db == nullptr) return SQLITE_OK;
  return Next("sqlite3_busy_timeout", &sqlite3_busy_timeout)(db, milliseconds);
}

extern "C" const unsigned char* sqlite3_column_text(sqlite3_stmt* stmt, int column) {
  if (givesNoText) return nullptr;
  return Next("sqlite3_column_text", &sqlite3_column_text)(stmt, column);
}

extern "C" const char* sqlite3_column_name(sqlite3_stmt* stmt, int column) {
  if (givesNoName) return nullptr;
  return Next("sqlite3_column_name", &sqlite3_column_name)(stmt, column);
}

namespace {

using SqliteDBTest = DatabaseTest;

// What a single attempt records: SQLite's own code and message.
Json::Value RawError(int code, const std::string& message) {
  Json::Value err = Error(code);
  err["err_msg"] = message;
  return err;
}

TEST_F(SqliteDBTest, ConstructionOpensNothing) {
  EXPECT_FALSE(HasFile());
  EXPECT_EQ(db->GetErr(), Error(0));
  EXPECT_FALSE(db->IsExisted());
}

TEST_F(SqliteDBTest, OpenCreatesTheFileAndLeavesTheErrorAlone) {
  db->SetDBErr(7, "before");
  const Json::Value before = db->GetErr();
  EXPECT_TRUE(db->Open());
  EXPECT_TRUE(HasFile());
  EXPECT_TRUE(db->IsExisted());
  EXPECT_EQ(db->GetErr(), before);
}

TEST_F(SqliteDBTest, OpenOfAnOpenHandleExaminesNothing) {
  ASSERT_TRUE(db->Exec("CREATE TEMP TABLE mine (n)"));
  ASSERT_EQ(unlink(path.c_str()), 0);
  refusesBusyTimeout = true;
  EXPECT_TRUE(db->Open());
  refusesBusyTimeout = false;
  EXPECT_FALSE(HasFile());
  EXPECT_THAT(Rows(*db, "SELECT count() AS n FROM mine"), ElementsAre("n:0"));
}

TEST_F(SqliteDBTest, OpenSetsTheBusyTimeoutToOneSecond) {
  EXPECT_THAT(Rows(*db, "PRAGMA busy_timeout"), ElementsAre("timeout:1000"));
}

TEST_F(SqliteDBTest, OpenDescriptorsAreClosedOnExec) {
  const std::set<int> before = OpenDescriptors();
  ASSERT_TRUE(db->Exec("CREATE TABLE t (n)"));
  int added = 0;
  for (const int fd : OpenDescriptors()) {
    if (before.count(fd) != 0) continue;
    ++added;
    EXPECT_NE(fcntl(fd, F_GETFD) & FD_CLOEXEC, 0);
  }
  EXPECT_EQ(added, 1);
}

TEST_F(SqliteDBTest, RefusedBusyTimeoutFailsOnceAndLeavesTheConnectionOpen) {
  refusesBusyTimeout = true;
  EXPECT_FALSE(db->Open());
  ExpectLog({Warn(kFile, "Open", "Failed to set busy timeout with error")});
  EXPECT_EQ(db->GetErr(), Error(0));
  EXPECT_TRUE(db->Open());
  refusesBusyTimeout = false;
  EXPECT_THAT(Rows(*db, "PRAGMA busy_timeout"), ElementsAre("timeout:0"));
}

TEST_F(SqliteDBTest, ExecWithARefusedBusyTimeoutReadsAsAFailedOpen) {
  refusesBusyTimeout = true;
  EXPECT_FALSE(db->Exec("CREATE TABLE t (n)"));
  refusesBusyTimeout = false;
  EXPECT_EQ(db->GetErr(), Error(404));
  ExpectLog({Warn(kFile, "Open", "Failed to set busy timeout with error"),
             Err(kFile, "Exec", "Failed to open db [" + path + "]")});
}

TEST_F(SqliteDBTest, ExecReportsAnOpenThatGaveNoHandle) {
  opensWithoutHandle = true;
  EXPECT_FALSE(db->Exec("CREATE TABLE t (n)"));
  opensWithoutHandle = false;
  EXPECT_EQ(db->GetErr(), Error(403));
  ExpectLog({Err(kFile, "Exec", "DB[" + path + "] is not opened")});
}

TEST_F(SqliteDBTest, SelectByCommandDoesNotCheckForAMissingHandle) {
  const Json::Value misuse = Error(404, 21, "out of memory");
  opensWithoutHandle = true;
  EXPECT_FALSE(db->SelectByCommand("SELECT 1", record));
  EXPECT_EQ(db->GetErr(), misuse);
  EXPECT_FALSE(db->SelectByCommand("SELECT 1", records));
  EXPECT_EQ(db->GetErr(), misuse);
  opensWithoutHandle = false;
  ExpectLog(
      {SelectFailed(0, "SELECT 1", misuse), ExecFailed("SelectByCommand", 0, "SELECT 1", misuse)});
}

TEST_F(SqliteDBTest, CloseOfAClosedHandleDoesNothing) {
  db->Close();
  ASSERT_TRUE(db->Open());
  db->Close();
  db->Close();
  EXPECT_TRUE(db->Open());
}

TEST_F(SqliteDBTest, CloseEndsTheConnectionAndItsTransaction) {
  ASSERT_TRUE(db->Exec("CREATE TABLE t (n); BEGIN; INSERT INTO t VALUES (1)"));
  db->Close();
  EXPECT_THAT(Rows(*db, "SELECT * FROM t"), IsEmpty());
}

TEST_F(SqliteDBTest, DestructionThroughTheHandleClosesTheConnection) {
  const std::set<int> before = OpenDescriptors();
  SqliteDB* const other = new SqliteDB(path, 0, "");
  EXPECT_TRUE(other->Open());
  EXPECT_EQ(OpenDescriptors().size(), before.size() + 1);
  delete other;
  EXPECT_EQ(OpenDescriptors(), before);
}

TEST_F(SqliteDBTest, StaysOpenAcrossOperationsAndFailures) {
  ASSERT_TRUE(db->Exec("CREATE TEMP TABLE mine (n); INSERT INTO mine VALUES (1)"));
  EXPECT_FALSE(db->Exec("no statement"));
  EXPECT_FALSE(db->SelectByCommand("no statement", record));
  LogCapture::Clear();
  EXPECT_THAT(Rows(*db, "SELECT n FROM mine"), ElementsAre("n:1"));
}

TEST_F(SqliteDBTest, SingleAttemptsFailOnAClosedHandle) {
  const Json::Value failure = RawError(21, "out of memory");
  EXPECT_FALSE(db->DoExecSqliteCommand("CREATE TABLE t (n)"));
  EXPECT_EQ(db->GetErr(), failure);
  EXPECT_FALSE(db->DoSelectSqliteRecord("SELECT 1 AS n", record));
  EXPECT_EQ(db->GetErr(), failure);
  EXPECT_FALSE(db->DoSelectSqliteRecords("SELECT 1 AS n", records));
  EXPECT_EQ(db->GetErr(), failure);
  EXPECT_FALSE(HasFile());
  EXPECT_EQ(record.ToStr(), "");
  EXPECT_THAT(records, IsEmpty());
}

TEST_F(SqliteDBTest, SingleExecRecordsTheRawFailureAndNoSuccess) {
  ASSERT_TRUE(db->Open());
  EXPECT_FALSE(db->DoExecSqliteCommand("DROP TABLE missing"));
  const Json::Value failure = RawError(1, "no such table: missing");
  EXPECT_EQ(db->GetErr(), failure);
  EXPECT_TRUE(db->DoExecSqliteCommand("CREATE TABLE t (n)"));
  EXPECT_EQ(db->GetErr(), failure);
  EXPECT_TRUE(db->DoExecSqliteCommand(""));
  EXPECT_EQ(db->GetErr(), failure);
}

TEST_F(SqliteDBTest, SingleSelectsRecordTheRawFailureAndClearItOnSuccess) {
  ASSERT_TRUE(db->Open());
  const Json::Value failure = RawError(1, "no such table: missing");
  EXPECT_FALSE(db->DoSelectSqliteRecord("SELECT * FROM missing", record));
  EXPECT_EQ(db->GetErr(), failure);
  EXPECT_TRUE(db->DoSelectSqliteRecord("SELECT 1 AS n", record));
  EXPECT_EQ(db->GetErr(), Error(0));
  EXPECT_FALSE(db->DoSelectSqliteRecords("SELECT * FROM missing", records));
  EXPECT_EQ(db->GetErr(), failure);
  EXPECT_TRUE(db->DoSelectSqliteRecords("SELECT 1 AS n WHERE 0", records));
  EXPECT_EQ(db->GetErr(), Error(0));
}

// A text without a statement compiles to nothing, and stepping nothing is a misuse.
TEST_F(SqliteDBTest, SingleSelectsFailOnATextWithoutAStatement) {
  ASSERT_TRUE(db->Open());
  const Json::Value misuse = RawError(21, "not an error");
  for (const char* const blank : {"", " \n", "-- nothing", "/* nothing */", ";"}) {
    EXPECT_FALSE(db->DoSelectSqliteRecord(blank, record));
    EXPECT_EQ(db->GetErr(), misuse);
    EXPECT_FALSE(db->DoSelectSqliteRecords(blank, records));
    EXPECT_EQ(db->GetErr(), misuse);
  }
}

TEST_F(SqliteDBTest, ExecRunsAStatementWithoutALine) {
  EXPECT_TRUE(db->Exec("CREATE TABLE t (n)"));
  EXPECT_TRUE(HasFile());
  EXPECT_EQ(db->GetErr(), Error(0));
}

TEST_F(SqliteDBTest, ExecClearsTheErrorBeforeIt) {
  db->SetDBErr(7, "before");
  EXPECT_TRUE(db->Exec("CREATE TABLE t (n)"));
  EXPECT_EQ(db->GetErr(), Error(0));
}

TEST_F(SqliteDBTest, EmptyStatementsFailWithoutOpening) {
  EXPECT_FALSE(db->Exec(""));
  EXPECT_EQ(db->GetErr(), Error(401));
  db->SetDBErr(7, "before");
  EXPECT_FALSE(db->SelectByCommand("", record));
  EXPECT_EQ(db->GetErr(), Error(401));
  db->SetDBErr(7, "before");
  EXPECT_FALSE(db->SelectByCommand("", records));
  EXPECT_EQ(db->GetErr(), Error(401));
  EXPECT_FALSE(HasFile());
  ExpectLog({Err(kFile, "Exec", "empty command to exec db[" + path + "]"),
             Err(kFile, "SelectByCommand", "Empty command to select record"),
             Err(kFile, "SelectByCommand", "Empty command to select records")});
}

TEST_F(SqliteDBTest, SyntaxErrorsAreNotRetried) {
  const Json::Value failure = Error(404, 1, "near \"nonsense\": syntax error");
  Pauses::Start();
  SqliteDB patient(path, 5, "");
  EXPECT_FALSE(patient.Exec("nonsense"));
  EXPECT_EQ(patient.GetErr(), failure);
  EXPECT_FALSE(patient.SelectByCommand("nonsense", record));
  EXPECT_EQ(patient.GetErr(), failure);
  EXPECT_FALSE(patient.SelectByCommand("nonsense", records));
  EXPECT_EQ(patient.GetErr(), failure);
  EXPECT_THAT(Pauses::Lengths(), IsEmpty());
  ExpectLog({ExecFailed("Exec", 0, "nonsense", failure), SelectFailed(0, "nonsense", failure),
             ExecFailed("SelectByCommand", 0, "nonsense", failure)});
}

TEST_F(SqliteDBTest, BlankStatementsRunInExecAndFailInAQuery) {
  const Json::Value misuse = Error(404, 21, "not an error");
  for (const char* const blank : {" ", "-- comment", "/* */;"}) {
    EXPECT_TRUE(db->Exec(blank));
    EXPECT_EQ(db->GetErr(), Error(0));
    EXPECT_FALSE(db->SelectByCommand(blank, records));
    EXPECT_EQ(db->GetErr(), misuse);
    ExpectLog({ExecFailed("SelectByCommand", 0, blank, misuse)});
  }
}

TEST_F(SqliteDBTest, ExecRunsEveryStatementAndAQueryTheFirst) {
  EXPECT_TRUE(db->Exec("CREATE TABLE t (n); INSERT INTO t VALUES (1); INSERT INTO t VALUES (2)"));
  EXPECT_THAT(Rows(*db, "SELECT n FROM t; DELETE FROM t"), ElementsAre("n:1", "n:2"));
  EXPECT_THAT(Rows(*db, "SELECT n FROM t; nonsense"), ElementsAre("n:1", "n:2"));
}

TEST_F(SqliteDBTest, ExecKeepsWhatRanBeforeTheFailingStatement) {
  const std::string sql = "CREATE TABLE t (n); nonsense; DROP TABLE t";
  EXPECT_FALSE(db->Exec(sql));
  ExpectLog({ExecFailed("Exec", 0, sql, Error(404, 1, "near \"nonsense\": syntax error"))});
  EXPECT_THAT(Rows(*db, "SELECT name FROM sqlite_master"), ElementsAre("name:'t'"));
}

TEST_F(SqliteDBTest, ExecDiscardsRows) {
  EXPECT_TRUE(db->Exec("SELECT 1 UNION SELECT NULL"));
  EXPECT_EQ(db->GetErr(), Error(0));
}

TEST_F(SqliteDBTest, QueryRunsAStatementWithoutRows) {
  EXPECT_TRUE(db->SelectByCommand("CREATE TABLE t (n)", records));
  EXPECT_TRUE(db->SelectByCommand("INSERT INTO t VALUES (1)", record));
  EXPECT_THAT(records, IsEmpty());
  EXPECT_EQ(record.ToStr(), "");
  EXPECT_THAT(Rows(*db, "SELECT n FROM t"), ElementsAre("n:1"));
}

TEST_F(SqliteDBTest, ANullTextIsAnEmptyOne) {
  givesNoText = true;
  const std::vector<std::string> rows = Rows(*db, "SELECT 'x' AS t, 1 AS n");
  givesNoText = false;
  EXPECT_THAT(rows, ElementsAre("n:1, t:''"));
}

TEST_F(SqliteDBTest, ANullNameIsOneThatThereIsNoMemoryFor) {
  record.AddValue("old", 1);
  givesNoName = true;
  EXPECT_THROW(db->SelectByCommand("SELECT 1 AS n", record), std::bad_alloc);
  givesNoName = false;
  EXPECT_EQ(record.ToStr(), "old:1");
}

TEST_F(SqliteDBTest, ATextWithANulByteDoesNotRun) {
  using std::string_literals::operator""s;
  const auto refused = [](const std::string& function) {
    return Err(kFile, function, "NUL byte in command [SELECT 1 AS n]");
  };
  const std::string sql = "SELECT 1 AS n\0;"s;
  EXPECT_FALSE(db->Exec(sql));
  EXPECT_EQ(db->GetErr(), Error(401));
  EXPECT_FALSE(db->SelectByCommand(sql, record));
  EXPECT_EQ(db->GetErr(), Error(401));
  EXPECT_FALSE(db->SelectByCommand(sql, records));
  EXPECT_EQ(db->GetErr(), Error(401));
  EXPECT_FALSE(HasFile());
  ExpectLog({refused("Exec"), refused("SelectByCommand"), refused("SelectByCommand")});
  ASSERT_TRUE(db->Open());
  EXPECT_FALSE(db->DoExecSqliteCommand(sql));
  EXPECT_EQ(db->GetErr(), Error(401));
  EXPECT_FALSE(db->DoSelectSqliteRecord(sql, record));
  EXPECT_EQ(db->GetErr(), Error(401));
  EXPECT_FALSE(db->DoSelectSqliteRecords(sql, records));
  EXPECT_EQ(db->GetErr(), Error(401));
  ExpectLog({refused("DoExecSqliteCommand"), refused("DoSelectSqliteRecord"),
             refused("DoSelectSqliteRecords")});
  EXPECT_EQ(record.ToStr(), "");
  EXPECT_THAT(records, IsEmpty());
}

TEST_F(SqliteDBTest, AConditionWithANulByteDeletesNothing) {
  const SqliteTableHandler table("t", "name TEXT");
  ASSERT_TRUE(db->InsertRecord(InsertOf(table, "name", "a")));
  LogCapture::Clear();
  DeleteCommand command;
  command.SetTable(table);
  command.SetCondition(KeloDRCore::SqliteEqual("name", std::string("a\0", 2)));
  const std::string shown = "DELETE FROM t WHERE name='a";
  EXPECT_FALSE(db->DeleteRecord(command));
  EXPECT_EQ(db->GetErr(), Error(401));
  ExpectLog({Info(kFile, "Exec", "label Exec cmd: " + shown),
             Err(kFile, "Exec", "NUL byte in command [" + shown + "]")});
  EXPECT_FALSE(db->DeleteRecord(std::string("1\0", 2), table));
  EXPECT_FALSE(db->DeleteRecord(std::string("1\0", 2), SqliteTableHandler("new", "n")));
  EXPECT_EQ(db->GetErr(), Error(401));
  LogCapture::Clear();
  EXPECT_THAT(Rows(*db, "SELECT name FROM t"), ElementsAre("name:'a'"));
  EXPECT_FALSE(db->IsTableExisted("new"));
}

TEST_F(SqliteDBTest, ATableNameWithANulByteNamesNoTable) {
  ASSERT_TRUE(db->Exec("CREATE TABLE t (n)"));
  const SqliteTableHandler table(std::string("t'; --\0", 7), "n");
  int count = -1;
  EXPECT_FALSE(db->IsTableExisted(table.tableName));
  EXPECT_EQ(db->GetErr(), Error(401));
  EXPECT_FALSE(db->GetCount(table, count));
  EXPECT_EQ(db->GetErr(), Error(401));
  EXPECT_EQ(count, -1);
  EXPECT_FALSE(db->CreateTable(table));
  EXPECT_EQ(db->GetErr(), Error(401));
  LogCapture::Clear();
}

TEST_F(SqliteDBTest, BulkInsertsNameAConnectionThatIsNotThere) {
  opensWithoutHandle = true;
  EXPECT_FALSE(db->InsertRecords(SqliteTableHandler("t", ""), {record}));
  EXPECT_EQ(db->GetErr(), Error(401));
  LogCapture::Clear();
  record.AddValue("n", 1);
  EXPECT_FALSE(db->InsertRecords(SqliteTableHandler("t", ""), {record}));
  opensWithoutHandle = false;
  EXPECT_EQ(db->GetErr(), Error(403));
  ExpectLog({Info(kFile, "InsertRecords", "label Exec cmd: INSERT INTO t (n) VALUES (?);"),
             Err(kFile, "InsertRecords", "DB[" + path + "] is not opened")});
}

TEST_F(SqliteDBTest, FailureNamesBytesThatAreNotUtf8) {
  const std::string sql = "DROP TABLE \"\xff\xfe'\x01\"";
  const Json::Value failure = Error(404, 1, "no such table: \xff\xfe'\x01");
  EXPECT_FALSE(db->Exec(sql));
  EXPECT_EQ(db->GetErr(), failure);
  ExpectLog({ExecFailed("Exec", 0, sql, failure)});
}

}  // namespace
