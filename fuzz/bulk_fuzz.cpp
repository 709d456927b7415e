// Records inserted at once, and the same ones row by row: the same tables, and the same answer.

#include <fuzzer/FuzzedDataProvider.h>
#include <kelodrcore/sqlite_db.h>

#include <algorithm>

#include "fuzz.h"

namespace {

using namespace KeloDRCore;

constexpr char kColumns[] =
    "a INTEGER UNIQUE, b TEXT CHECK (b <> 'refused'), c NOT NULL DEFAULT 1, d UNIQUE";
const SqliteTableHandler kBulk("bulk", kColumns);

// A record, and its statement for the other table as a programmer would write it.
struct Row {
  SqliteValueList record;
  std::string names;
  std::string literals;

  void Add(const std::string& name, const SqliteValue& value, const std::string& literal) {
    Require(record.AddValue(name, value), "a value is taken");
    names += (names.empty() ? "" : ",") + name;
    literals += (literals.empty() ? "" : ",") + literal;
  }
};

void AddField(FuzzedDataProvider& input, Row& row, const std::string& name) {
  switch (input.ConsumeIntegralInRange(0, 4)) {
    case 0: {
      const auto number = input.ConsumeIntegral<long long>();
      return row.Add(name, number, std::to_string(number));
    }
    case 1: {
      const auto number = input.ConsumeIntegral<unsigned int>();
      return row.Add(name, number, std::to_string(number));
    }
    case 2: {
      const int number = input.ConsumeIntegralInRange(0, 7);
      return row.Add(name, number, std::to_string(number));
    }
    case 3: {
      const bool truth = input.ConsumeBool();
      return row.Add(name, truth, truth ? "1" : "0");
    }
    default: {
      std::string text = input.ConsumeRandomLengthString(40);
      text.erase(std::remove(text.begin(), text.end(), '\0'), text.end());
      return row.Add(name, text, SqliteValue(text).ToFormatedValue());
    }
  }
}

Row MakeRow(FuzzedDataProvider& input) {
  Row row;
  const int fields = input.ConsumeIntegralInRange(1, 15);
  const char* const names[] = {"a", "b", "c", "d"};
  for (int i = 0; i < 4; ++i) {
    if ((fields & (1 << i)) != 0) AddField(input, row, names[i]);
  }
  return row;
}

// All rows or none.
bool InsertRowByRow(SqliteDB& db, const std::string& verb, const std::vector<Row>& rows) {
  Require(db.Exec("SAVEPOINT rows"), "a savepoint is set");
  for (const Row& row : rows) {
    if (db.Exec(verb + " INTO single (" + row.names + ") VALUES (" + row.literals + ")")) continue;
    Require(db.Exec("ROLLBACK TO rows; RELEASE rows"), "a savepoint is undone");
    return false;
  }
  Require(db.Exec("RELEASE rows"), "a savepoint is released");
  return true;
}

void RequireSameTables(SqliteDB& db) {
  std::vector<SqliteValueList> rows;
  Require(db.SelectByCommand("SELECT * FROM (SELECT * FROM bulk EXCEPT SELECT * FROM single)"
                             " UNION ALL SELECT * FROM (SELECT * FROM single EXCEPT SELECT * FROM"
                             " bulk)",
                             rows),
          "the tables can be compared");
  Require(rows.empty(), "both ways store the same rows");
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  FuzzedDataProvider input(data, size);
  static SqliteDB db(":memory:", 0, "fuzz");
  static const bool isMade = db.CreateTable(kBulk) && db.CreateTable({"single", kColumns});
  Require(isMade && db.Exec("DELETE FROM bulk; DELETE FROM single"), "the tables are there");
  const bool isInTransaction = input.ConsumeBool();
  if (isInTransaction) Require(db.Exec("BEGIN"), "a transaction begins");
  while (input.remaining_bytes() > 0) {
    const bool replaces = input.ConsumeBool();
    std::vector<Row> rows(input.ConsumeIntegralInRange<size_t>(1, 5));
    std::vector<SqliteValueList> records;
    for (Row& row : rows) {
      row = MakeRow(input);
      records.push_back(row.record);
    }
    const bool isDone =
        replaces ? db.InsertOrReplaceRecords(kBulk, records) : db.InsertRecords(kBulk, records);
    Require(isDone == InsertRowByRow(db, replaces ? "INSERT OR REPLACE" : "INSERT", rows),
            "both ways give the same answer");
    RequireSameTables(db);
  }
  if (isInTransaction) Require(db.Exec("COMMIT"), "the transaction is still open");
  return 0;
}
