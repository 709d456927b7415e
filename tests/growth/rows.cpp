// Rows inserted and selected.

#include <unistd.h>

#include <memory>

#include "growth/operations.h"
#include "growth/texts.h"
#include "kelodrcore/sqlite_db.h"
#include "kelodrcore/sqlite_transaction.h"

namespace {

using namespace KeloDRCore;

const SqliteTableHandler kTable("t", "a TEXT, n INTEGER");

// A new database. Its page cache is the size of a few rows: it takes a share of its own from small
// tables only.
std::shared_ptr<SqliteDB> NewDatabase() {
  const std::string path = Path("rows.db");
  unlink(path.c_str());
  const auto db = std::make_shared<SqliteDB>(path, 0, "growth");
  Require(db->Exec("PRAGMA cache_size=4; PRAGMA synchronous=OFF"), "PRAGMA");
  Require(db->CreateTable(kTable), "CreateTable");
  return db;
}

std::vector<SqliteValueList> Records(size_t count) {
  SqliteValueList record;
  record.AddValue("a", "the text of a row");
  record.AddValue("n", 1234);
  return std::vector<SqliteValueList>(count, record);
}

std::shared_ptr<SqliteDB> DatabaseOf(const std::vector<SqliteValueList>& records) {
  const auto db = NewDatabase();
  Require(db->InsertRecords(kTable, records), "InsertRecords");
  return db;
}

SelectCommand SelectAll() {
  SelectCommand command;
  command.SetTable(kTable);
  command.SelectAll();
  return command;
}

Work SelectRecordsOf(const std::vector<SqliteValueList>& stored) {
  return [db = DatabaseOf(stored), count = stored.size()] {
    std::vector<SqliteValueList> records;
    Require(db->SelectRecords(SelectAll(), records) && records.size() == count, "SelectRecords");
  };
}

Work SelectEachOf(size_t count) {
  return [db = DatabaseOf(Records(count)), count] {
    size_t taken = 0;
    Require(db->SelectEach(SelectAll(), [&](const SqliteValueList&) { return ++taken != 0; }),
            "SelectEach");
    Require(taken == count, "taking");
  };
}

Work InsertRecordsOf(size_t count) {
  return [db = NewDatabase(), records = Records(count)] {
    Require(db->InsertRecords(kTable, records), "InsertRecords");
  };
}

// Every other record has other fields, so that each begins a new statement.
Work InsertMixedOf(size_t count) {
  std::vector<SqliteValueList> records = Records(count);
  for (size_t i = 0; i < count; i += 2) {
    records[i] = SqliteValueList();
    records[i].AddValue("n", 1);
  }
  return [db = NewDatabase(), records] {
    Require(db->InsertOrReplaceRecords(kTable, records), "InsertOrReplaceRecords");
  };
}

Work InsertOneByOneOf(size_t count) {
  return [db = NewDatabase(), count] {
    InsertCommand command;
    command.SetTable(kTable);
    command.AddFieldValue("n", 1);
    SqliteTransaction transaction(*db);
    for (size_t i = 0; i < count; ++i) Require(db->InsertRecord(command), "InsertRecord");
    Require(transaction.Commit(), "Commit");
  };
}

SqliteValueList LargeRecord(size_t size) {
  SqliteValueList record;
  record.AddValue("a", Repeated(size, "it's"));
  return record;
}

Work InsertLarge(size_t size) {
  InsertCommand command;
  command.SetTable(kTable);
  command.SetFieldValues(LargeRecord(size));
  return [db = NewDatabase(), command] { Require(db->InsertRecord(command), "InsertRecord"); };
}

}  // namespace

void AddRows(std::vector<Operation>& operations) {
  operations.push_back(
      {"SelectRecords of rows", 128, [](size_t n) { return SelectRecordsOf(Records(n)); }});
  operations.push_back({"SelectRecords of a large row", 4096,
                        [](size_t n) { return SelectRecordsOf({LargeRecord(n)}); }});
  operations.push_back({"SelectEach of rows", 128, SelectEachOf, Growth::kConstant});
  operations.push_back({"InsertRecords of rows", 512, InsertRecordsOf, Growth::kConstant});
  operations.push_back(
      {"InsertOrReplaceRecords of rows of two kinds", 64, InsertMixedOf, Growth::kConstant});
  operations.push_back({"InsertRecord of rows", 32, InsertOneByOneOf, Growth::kConstant});
  operations.push_back({"InsertRecord of a large row", 4096, InsertLarge});
}
