// Tables and command objects on the database handle.

#include <gmock/gmock.h>

#include "kelodrcore/sqlite_db.h"
#include "support/database.h"

namespace {

using testing::ElementsAre;
using testing::IsEmpty;

const std::string kCommands = "sqlite_command.cpp";
const std::string kDefs = "id INTEGER PRIMARY KEY, name TEXT";
const SqliteTableHandler kTable("node", kDefs);
const SqliteTableHandler kForeignTable("node", "");
// Its definitions are refused by the engine.
const SqliteTableHandler kBadTable("node", "id,");
const std::string kBadCreate = "CREATE TABLE IF NOT EXISTS node (id,)";

InsertCommand Insert(const SqliteTableHandler& table, int id, const char* name) {
  InsertCommand cmd;
  cmd.SetTable(table);
  cmd.AddFieldValue("id", id);
  cmd.AddFieldValue("name", name);
  return cmd;
}

DeleteCommand Delete(const SqliteTableHandler& table, const std::string& condition) {
  DeleteCommand cmd;
  cmd.SetTable(table);
  cmd.SetCondition(condition);
  return cmd;
}

class SqliteDBTableTest : public DatabaseTest {
 protected:
  // The table with two rows.
  void Fill() {
    ASSERT_TRUE(db->Exec("CREATE TABLE node (" + kDefs + ");" +
                         "INSERT INTO node VALUES (1, 'a'), (2, 'b')"));
  }

  std::vector<std::string> Content() { return Rows(*db, "SELECT * FROM node ORDER BY id"); }

  static LogLine Announced(const std::string& sql) {
    return Info(kFile, "Exec", "label Exec cmd: " + sql);
  }
  // The two lines of a command that succeeds.
  static void ExpectDone(const std::string& sql) {
    ExpectLog({Announced(sql), Info(kFile, "Exec", "label Exec cmd success")});
  }

  // An error that an operation must leave alone.
  void MarkError() {
    db->SetDBErr(77, "mark");
    marked = db->GetErr();
  }

  Json::Value marked;
};

const Json::Value kSyntaxError = Error(404, 1, "near \")\": syntax error");

TEST_F(SqliteDBTableTest, IsTableExistedTellsPresentFromAbsent) {
  Fill();
  EXPECT_TRUE(db->IsTableExisted("node"));
  EXPECT_EQ(db->GetErr(), Error(0));
  EXPECT_FALSE(db->IsTableExisted("missing"));
  EXPECT_FALSE(db->IsTableExisted(""));
  EXPECT_FALSE(db->IsTableExisted("NODE"));
  EXPECT_EQ(db->GetErr(), Error(0));
}

TEST_F(SqliteDBTableTest, IsTableExistedReadsItsRowsAsAnyQueryDoes) {
  EXPECT_TRUE(db->IsTableExisted("' UNION SELECT NULL AS n; --"));
  EXPECT_TRUE(db->IsTableExisted("' UNION SELECT 2.5; --"));
  ExpectLog({Warn(kFile, "ParseRecord", "field [1] has null value"),
             Warn(kFile, "ParseRecord", "Not supported type [2] with field [1]")});
}

TEST_F(SqliteDBTableTest, IsTableExistedTakesANameOfAnyLength) {
  const std::string name(1000, 'n');
  EXPECT_FALSE(db->IsTableExisted(name));
  ASSERT_TRUE(db->Exec("CREATE TABLE " + name + " (x)"));
  EXPECT_TRUE(db->IsTableExisted(name));
}

TEST_F(SqliteDBTableTest, IsTableExistedAsksForTablesOnly) {
  Fill();
  ASSERT_TRUE(db->Exec("CREATE VIEW seen AS SELECT 1; CREATE INDEX byname ON node (name)"));
  EXPECT_FALSE(db->IsTableExisted("seen"));
  EXPECT_FALSE(db->IsTableExisted("byname"));
}

TEST_F(SqliteDBTableTest, IsTableExistedDoesNotEscapeTheName) {
  Fill();
  const std::string sql = "SELECT 1 FROM sqlite_master WHERE type='table' AND name='o'node';";
  const Json::Value failure = Error(404, 1, "near \"node\": syntax error");
  EXPECT_FALSE(db->IsTableExisted("o'node"));
  EXPECT_EQ(db->GetErr(), failure);
  ExpectLog({ExecFailed("SelectByCommand", 0, sql, failure)});
  EXPECT_TRUE(db->IsTableExisted("x' OR 'a'='a"));
}

TEST_F(SqliteDBTableTest, IsTableExistedReadsAFailedOpenAsAbsent) {
  SqliteDB nowhere(dir, 0, "");
  EXPECT_FALSE(nowhere.IsTableExisted("node"));
  EXPECT_EQ(nowhere.GetErr(), Error(0));
  ExpectLog({Warn(kFile, "Open", "Failed to open db[" + dir + "]"),
             Err(kFile, "SelectByCommand", "Failed to open db [" + dir + "]")});
}

TEST_F(SqliteDBTableTest, GetCountCountsTheRows) {
  Fill();
  int count = -1;
  EXPECT_TRUE(db->GetCount(kTable, count));
  EXPECT_EQ(count, 2);
  EXPECT_EQ(db->GetErr(), Error(0));
  ASSERT_TRUE(db->Exec("DELETE FROM node"));
  EXPECT_TRUE(db->GetCount(kForeignTable, count));
  EXPECT_EQ(count, 0);
}

TEST_F(SqliteDBTableTest, GetCountOfAMissingTableFailsAndCreatesNone) {
  const std::string sql = "SELECT count() as count FROM 'node';";
  const Json::Value failure = Error(404, 1, "no such table: node");
  int count = -1;
  EXPECT_FALSE(db->GetCount(kTable, count));
  EXPECT_EQ(count, -1);
  EXPECT_EQ(db->GetErr(), failure);
  ExpectLog({ExecFailed("SelectByCommand", 0, sql, failure),
             Err(kFile, "GetCount", "Record is empty on command [" + sql + "]")});
  EXPECT_FALSE(db->IsTableExisted("node"));
}

TEST_F(SqliteDBTableTest, GetCountDoesNotEscapeTheName) {
  const std::string sql = "SELECT count() as count FROM 'o'node';";
  int count = -1;
  EXPECT_FALSE(db->GetCount(SqliteTableHandler("o'node", kDefs), count));
  const Json::Value failure = Error(404, 1, "unrecognized token: \"';\"");
  EXPECT_EQ(db->GetErr(), failure);
  ExpectLog({ExecFailed("SelectByCommand", 0, sql, failure),
             Err(kFile, "GetCount", "Record is empty on command [" + sql + "]")});
}

// The name is spliced in, so that it can give the query any shape.
TEST_F(SqliteDBTableTest, GetCountRefusesARowWithoutAnIntegerCount) {
  int count = -1;
  const auto get = [&](const std::string& name) {
    return db->GetCount(SqliteTableHandler(name, ""), count);
  };
  EXPECT_FALSE(get("sqlite_master' GROUP BY name UNION ALL SELECT 'text' --"));
  EXPECT_EQ(db->GetErr(), Error(0));
  ExpectLog({Warn("sqlite_value.cpp", "GetValue", "[\"text\"] is not int"),
             Err(kFile, "GetCount", "Record error [count:'text']")});
  EXPECT_FALSE(get("sqlite_master' GROUP BY name UNION ALL SELECT NULL --"));
  EXPECT_EQ(db->GetErr(), Error(0));
  ExpectLog({Warn(kFile, "ParseRecord", "field [count] has null value"),
             Debug("sqlite_value.cpp", "GetValue", "field [count] is not existed"),
             Err(kFile, "GetCount", "Record error []")});
  EXPECT_EQ(count, -1);
}

TEST_F(SqliteDBTableTest, CreateTableMakesTheTableOnce) {
  EXPECT_TRUE(db->CreateTable(kTable));
  EXPECT_EQ(db->GetErr(), Error(0));
  EXPECT_THAT(Rows(*db, "SELECT sql FROM sqlite_master"),
              ElementsAre("sql:'CREATE TABLE node (" + kDefs + ")'"));
  // An existing table is left alone: the statement would fail for its definitions.
  EXPECT_TRUE(db->CreateTable(kBadTable));
  EXPECT_EQ(db->GetErr(), Error(0));
}

TEST_F(SqliteDBTableTest, CreateTableWithoutDefinitionsDoesNothing) {
  MarkError();
  EXPECT_TRUE(db->CreateTable(kForeignTable));
  EXPECT_TRUE(db->CreateTable(SqliteTableHandler()));
  EXPECT_EQ(db->GetErr(), marked);
  EXPECT_FALSE(HasFile());
}

TEST_F(SqliteDBTableTest, CreateTableRefusesAnEmptyName) {
  MarkError();
  EXPECT_FALSE(db->CreateTable(SqliteTableHandler("", kDefs)));
  EXPECT_EQ(db->GetErr(), marked);
  EXPECT_FALSE(HasFile());
  ExpectLog({Err(kFile, "CreateTable", "Invalid table []")});
}

TEST_F(SqliteDBTableTest, CreateTableReportsARefusedStatement) {
  EXPECT_FALSE(db->CreateTable(kBadTable));
  EXPECT_EQ(db->GetErr(), kSyntaxError);
  ExpectLog({ExecFailed("Exec", 0, kBadCreate, kSyntaxError),
             Err(kFile, "CreateTable", "Failed to create table [node] with cmd[id,]")});
}

TEST_F(SqliteDBTableTest, CreateTableDoesNotQuoteTheName) {
  const std::string sql = "CREATE TABLE IF NOT EXISTS two words (" + kDefs + ")";
  EXPECT_FALSE(db->CreateTable(SqliteTableHandler("two words", kDefs)));
  ExpectLog(
      {ExecFailed("Exec", 0, sql, Error(404, 1, "near \"words\": syntax error")),
       Err(kFile, "CreateTable", "Failed to create table [two words] with cmd[" + kDefs + "]")});
  EXPECT_TRUE(db->CreateTable(SqliteTableHandler("[two words]", kDefs)));
  EXPECT_TRUE(db->IsTableExisted("two words"));
  EXPECT_FALSE(db->IsTableExisted("[two words]"));
}

TEST_F(SqliteDBTableTest, InsertCreatesFileAndTableAndLogsTwoLines) {
  MarkError();
  EXPECT_TRUE(db->InsertRecord(Insert(kTable, 1, "it's")));
  EXPECT_EQ(db->GetErr(), Error(0));
  ExpectDone("INSERT INTO node (id,name) VALUES (1,'it''s');");
  EXPECT_THAT(Content(), ElementsAre("id:1, name:'it''s'"));
}

TEST_F(SqliteDBTableTest, AnEmptyLabelLeavesItsBlank) {
  SqliteDB plain(path, 0, "");
  EXPECT_TRUE(plain.InsertRecord(Insert(kTable, 1, "%s")));
  ExpectLog({Info(kFile, "Exec", " Exec cmd: INSERT INTO node (id,name) VALUES (1,'%s');"),
             Info(kFile, "Exec", " Exec cmd success")});
}

TEST_F(SqliteDBTableTest, UpdateCreatesFileAndTableToo) {
  UpdateCommand cmd;
  cmd.SetTable(kTable);
  cmd.AddFieldValue("name", "x");
  EXPECT_TRUE(db->UpdateRecord(cmd));
  EXPECT_EQ(db->GetErr(), Error(0));
  ExpectDone("UPDATE node SET name='x'");
  EXPECT_TRUE(db->IsTableExisted("node"));
}

TEST_F(SqliteDBTableTest, UpdateChangesTheRowsThatMeetTheCondition) {
  Fill();
  UpdateCommand cmd;
  cmd.SetTable(kTable);
  cmd.AddFieldValue("name", "x");
  cmd.SetCondition(std::string("id=2"));
  EXPECT_TRUE(db->UpdateRecord(cmd));
  EXPECT_THAT(Content(), ElementsAre("id:1, name:'a'", "id:2, name:'x'"));
  LogCapture::Clear();
}

TEST_F(SqliteDBTableTest, InvalidCommandsFailWith401AndTouchNoFile) {
  const auto expect = [&](const std::string& kind) {
    EXPECT_EQ(db->GetErr(), Error(401));
    ExpectLog({Err(kCommands, "GetCommand", "Bad " + kind), Announced("")});
  };
  MarkError();
  EXPECT_FALSE(db->InsertRecord(InsertCommand()));
  expect("insert parameter");
  MarkError();
  EXPECT_FALSE(db->UpdateRecord(UpdateCommand()));
  expect("update command");
  MarkError();
  EXPECT_FALSE(db->Exec(DeleteCommand()));
  expect("delete command");
  MarkError();
  EXPECT_FALSE(db->Exec(SelectCommand()));
  expect("select command");
  EXPECT_FALSE(HasFile());
}

TEST_F(SqliteDBTableTest, ExecReportsATableThatCannotBeCreated) {
  EXPECT_FALSE(db->InsertRecord(Insert(kBadTable, 1, "a")));
  EXPECT_EQ(db->GetErr(), kSyntaxError);
  ExpectLog({Announced("INSERT INTO node (id,name) VALUES (1,'a');"),
             ExecFailed("Exec", 0, kBadCreate, kSyntaxError),
             Err(kFile, "CreateTable", "Failed to create table [node] with cmd[id,]"),
             Err(kFile, "Exec", "Failed to create table [node]")});
}

TEST_F(SqliteDBTableTest, ExecReportsAStatementThatFails) {
  Fill();
  const std::string sql = "INSERT INTO node (id,name) VALUES (1,'c');";
  const Json::Value failure = Error(404, 19, "UNIQUE constraint failed: node.id");
  EXPECT_FALSE(db->InsertRecord(Insert(kTable, 1, "c")));
  EXPECT_EQ(db->GetErr(), failure);
  ExpectLog({Announced(sql), ExecFailed("Exec", 0, sql, failure),
             Err(kFile, "Exec", "Failed to exec [" + sql + "] in db[" + path + "]")});
  EXPECT_THAT(Content(), ElementsAre("id:1, name:'a'", "id:2, name:'b'"));
}

TEST_F(SqliteDBTableTest, InsertIntoATableThatNobodyCreatedFailsInTheStatement) {
  const std::string sql = "INSERT INTO node (id,name) VALUES (1,'a');";
  const Json::Value failure = Error(404, 1, "no such table: node");
  EXPECT_FALSE(db->InsertRecord(Insert(kForeignTable, 1, "a")));
  EXPECT_EQ(db->GetErr(), failure);
  ExpectLog({Announced(sql), ExecFailed("Exec", 0, sql, failure),
             Err(kFile, "Exec", "Failed to exec [" + sql + "] in db[" + path + "]")});
}

TEST_F(SqliteDBTableTest, ExecOnAFileThatCannotBeOpenedKeepsItsCode) {
  SqliteDB nowhere(dir, 0, "label");
  const std::string sql = "INSERT INTO node (id,name) VALUES (1,'a');";
  EXPECT_FALSE(nowhere.InsertRecord(Insert(kForeignTable, 1, "a")));
  EXPECT_EQ(nowhere.GetErr(), Error(404));
  ExpectLog({Announced(sql), Warn(kFile, "Open", "Failed to open db[" + dir + "]"),
             Err(kFile, "Exec", "Failed to open db [" + dir + "]"),
             Err(kFile, "Exec", "Failed to exec [" + sql + "] in db[" + dir + "]")});
}

TEST_F(SqliteDBTableTest, ExecRunsASelectAndDiscardsItsRows) {
  Fill();
  EXPECT_TRUE(db->Exec(SelectAll(kTable)));
  EXPECT_EQ(db->GetErr(), Error(0));
  ExpectDone("SELECT  * FROM node");
}

TEST_F(SqliteDBTableTest, ACommandsTableIsNotCreatedOverAnother) {
  Fill();
  EXPECT_TRUE(db->InsertRecord(Insert(kBadTable, 3, "c")));
  EXPECT_THAT(Rows(*db, "SELECT id FROM node"), ElementsAre("id:1", "id:2", "id:3"));
  LogCapture::Clear();
}

TEST_F(SqliteDBTableTest, DeletesOnAMissingFileSucceedAndTouchNothing) {
  MarkError();
  EXPECT_TRUE(db->DeleteRecord(Delete(kTable, "id=1")));
  EXPECT_TRUE(db->DeleteRecord(DeleteCommand()));
  EXPECT_TRUE(db->DeleteRecord("id=1", kTable));
  EXPECT_TRUE(db->DeleteAllRecords(kTable));
  EXPECT_EQ(db->GetErr(), marked);
  EXPECT_FALSE(HasFile());
}

TEST_F(SqliteDBTableTest, DeleteRemovesTheRowsThatMeetTheCondition) {
  Fill();
  EXPECT_TRUE(db->DeleteRecord(Delete(kTable, "id=1")));
  EXPECT_EQ(db->GetErr(), Error(0));
  ExpectDone("DELETE FROM node WHERE id=1;");
  EXPECT_THAT(Content(), ElementsAre("id:2, name:'b'"));
  EXPECT_TRUE(db->DeleteRecord("name='b'", kTable));
  ExpectDone("DELETE FROM node WHERE name='b';");
  EXPECT_THAT(Content(), IsEmpty());
}

TEST_F(SqliteDBTableTest, DeleteCreatesAMissingTableInAFileThatIsThere) {
  ASSERT_TRUE(db->Open());
  EXPECT_TRUE(db->DeleteRecord("id=1", kTable));
  EXPECT_TRUE(db->IsTableExisted("node"));
  LogCapture::Clear();
}

TEST_F(SqliteDBTableTest, AnEmptyConditionNeverDeletes) {
  MarkError();
  EXPECT_FALSE(db->DeleteRecord("", kTable));
  EXPECT_EQ(db->GetErr(), Error(401));
  EXPECT_FALSE(HasFile());
  ExpectLog({Err(kFile, "DeleteRecord", "invalid delete command: condition[]")});
  Fill();
  EXPECT_FALSE(db->DeleteRecord("", kTable));
  ExpectLog({Err(kFile, "DeleteRecord", "invalid delete command: condition[]")});
  EXPECT_THAT(Content(), ElementsAre("id:1, name:'a'", "id:2, name:'b'"));
}

TEST_F(SqliteDBTableTest, DeleteAllRecordsEmptiesTheTable) {
  Fill();
  EXPECT_TRUE(db->DeleteAllRecords(kTable));
  EXPECT_EQ(db->GetErr(), Error(0));
  ExpectDone("DELETE FROM node;");
  EXPECT_THAT(Content(), IsEmpty());
}

TEST_F(SqliteDBTableTest, DeletesOfABadTableSurfaceAsInvalidCommands) {
  ASSERT_TRUE(db->Open());
  const std::vector<LogLine> lines = {Err(kCommands, "SetTable", "Invalid table []"),
                                      Err(kCommands, "GetCommand", "Bad delete command"),
                                      Announced("")};
  EXPECT_FALSE(db->DeleteAllRecords(SqliteTableHandler("", kDefs)));
  EXPECT_EQ(db->GetErr(), Error(401));
  ExpectLog(lines);
  MarkError();
  EXPECT_FALSE(db->DeleteRecord("id=1", SqliteTableHandler()));
  EXPECT_EQ(db->GetErr(), Error(401));
  ExpectLog(lines);
}

TEST_F(SqliteDBTableTest, SelectsReadTheRowsAndClearTheError) {
  Fill();
  records.resize(1);
  MarkError();
  EXPECT_TRUE(db->SelectRecord(SelectAll(kTable), record));
  EXPECT_EQ(db->GetErr(), Error(0));
  EXPECT_EQ(record.ToStr(), "id:1, name:'a'");
  MarkError();
  EXPECT_TRUE(db->SelectRecords(SelectAll(kTable), records));
  EXPECT_EQ(db->GetErr(), Error(0));
  EXPECT_THAT(Texts(records), ElementsAre("", "id:1, name:'a'", "id:2, name:'b'"));
}

TEST_F(SqliteDBTableTest, SelectsWithoutAMatchLeaveTheirResultAlone) {
  record.AddValue("old", 1);
  records = {record};
  ASSERT_TRUE(db->Open());
  EXPECT_TRUE(db->SelectRecord(SelectAll(kTable), record));
  EXPECT_TRUE(db->SelectRecords(SelectAll(kTable), records));
  EXPECT_EQ(record.ToStr(), "old:1");
  EXPECT_THAT(Texts(records), ElementsAre("old:1"));
  EXPECT_TRUE(db->IsTableExisted("node"));
}

TEST_F(SqliteDBTableTest, SelectsOnAMissingFileFailSilently) {
  MarkError();
  EXPECT_FALSE(db->SelectRecord(SelectAll(kTable), record));
  EXPECT_FALSE(db->SelectRecords(SelectAll(kTable), records));
  EXPECT_EQ(db->GetErr(), marked);
  EXPECT_FALSE(HasFile());
}

TEST_F(SqliteDBTableTest, InvalidSelectsFailWith401BeforeTheFileIsLookedFor) {
  SelectCommand cmd;
  cmd.SetTable(kTable);
  cmd.SetCondition(std::string("id=1"));
  MarkError();
  EXPECT_FALSE(db->SelectRecord(cmd, record));
  EXPECT_EQ(db->GetErr(), Error(401));
  MarkError();
  EXPECT_FALSE(db->SelectRecords(cmd, records));
  EXPECT_EQ(db->GetErr(), Error(401));
  const std::string message = "invalid select command [node]condition:[id=1]/fields:[]]";
  ExpectLog({Err(kFile, "SelectRecord", message), Err(kFile, "SelectRecords", message)});
}

TEST_F(SqliteDBTableTest, SelectsReportATableThatCannotBeCreated) {
  ASSERT_TRUE(db->Open());
  const auto lines = [](const std::string& function) {
    return std::vector<LogLine>{
        ExecFailed("Exec", 0, kBadCreate, kSyntaxError),
        Err(kFile, "CreateTable", "Failed to create table [node] with cmd[id,]"),
        Err(kFile, function, "Failed to create table")};
  };
  EXPECT_FALSE(db->SelectRecord(SelectAll(kBadTable), record));
  EXPECT_EQ(db->GetErr(), kSyntaxError);
  ExpectLog(lines("SelectRecord"));
  EXPECT_FALSE(db->SelectRecords(SelectAll(kBadTable), records));
  EXPECT_EQ(db->GetErr(), kSyntaxError);
  ExpectLog(lines("SelectRecords"));
}

TEST_F(SqliteDBTableTest, SelectsPassTheFailureOfTheirStatementOn) {
  Fill();
  SelectCommand cmd;
  cmd.SetTable(kTable);
  cmd.AddField("wrong");
  const Json::Value failure = Error(404, 1, "no such column: wrong");
  EXPECT_FALSE(db->SelectRecord(cmd, record));
  EXPECT_EQ(db->GetErr(), failure);
  EXPECT_FALSE(db->SelectRecords(cmd, records));
  EXPECT_EQ(db->GetErr(), failure);
  ExpectLog({SelectFailed(0, cmd.GetCommand(), failure),
             ExecFailed("SelectByCommand", 0, cmd.GetCommand(), failure)});
}

TEST_F(SqliteDBTableTest, SelectsSet404BeforeTheTableStep) {
  SqliteDB nowhere(dir, 0, "label");
  EXPECT_FALSE(nowhere.SelectRecord(SelectAll(kForeignTable), record));
  EXPECT_EQ(nowhere.GetErr(), Error(404));
  ExpectLog({Warn(kFile, "Open", "Failed to open db[" + dir + "]"),
             Err(kFile, "SelectByCommand", "Failed to open db [" + dir + "]")});
}

TEST_F(SqliteDBTableTest, RowLinesOfASelectNameTheParser) {
  Fill();
  ASSERT_TRUE(db->Exec("DELETE FROM node WHERE id=2; UPDATE node SET name=NULL"));
  EXPECT_TRUE(db->SelectRecord(SelectAll(kTable), record));
  EXPECT_TRUE(db->SelectRecords(SelectAll(kTable), records));
  ExpectLog({Warn(kFile, "ParseRecord", "field [name] has null value"),
             Warn(kFile, "ParseRecord", "field [name] has null value")});
  EXPECT_EQ(record.ToStr(), "id:1");
  EXPECT_THAT(Texts(records), ElementsAre("id:1"));
}

}  // namespace
