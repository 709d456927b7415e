#include "fault/fault_database.h"

using KeloDRCore::InsertCommand;
using KeloDRCore::SelectCommand;
using KeloDRCore::UpdateCommand;
using SqliteDBFaultTest = DatabaseFaultTest;

namespace {

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

TEST_F(SqliteDBFaultTest, ManyRecordsAreInsertedOrNone) {
  const std::vector<SqliteValueList> records = ManyRecords();
  SweepWriting([this] { MakeFile(); },
               [&](SqliteDB& db) { return db.InsertOrReplaceRecords(table, records); }, kAfterMany);
  SweepWriting([this] { RemoveFile(); },
               [&](SqliteDB& db) { return db.InsertOrReplaceRecords(table, records); },
               Rows(kAfterMany.begin() + 2, kAfterMany.end()));
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
