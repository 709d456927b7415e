// SelectRecords and SelectEach: rows of five columns, each into a record of its own.

#include <SQLiteCpp/SQLiteCpp.h>
#include <sqlite3.h>

#include "kelodrcore/sqlite_db.h"
#include "nodes.h"
#include "raw_calls.h"
#include "soci_peer.h"
#include "support.h"

namespace bench {
namespace {

constexpr char kSelect[] = "SELECT address,id,name,online,port FROM nodes";

KeloDRCore::SelectCommand SelectAllNodes() {
  KeloDRCore::SelectCommand command;
  command.SetTable(NodeTable());
  for (const char* field : {"address", "id", "name", "online", "port"}) command.AddField(field);
  return command;
}

// The records as log lines show them.
std::string ExpectedText() {
  std::string text;
  for (const Node& node : MakeNodes(kRows)) {
    text += "address:";
    AppendLiteral(text, node.address.data(), node.address.data() + node.address.size());
    text += ", id:" + std::to_string(node.id) + ", name:";
    AppendLiteral(text, node.name.data(), node.name.data() + node.name.size());
    text += ", online:" + std::to_string(node.online) + ", port:" + std::to_string(node.port);
  }
  return text;
}

// Nothing of it stays in memory, where it would be in the way of what is measured.
template <typename Selected>
void RequireExpected(const Selected& selected) {
  Require(selected() == ExpectedText(), "the records differ");
}

void AppendText(std::string& text, const Record& record) {
  const char* separator = "";
  for (const auto& [name, value] : record) {
    text.append(separator).append(name) += ':';
    separator = ", ";
    AppendValue(text, value);
  }
}

void SelectWithLibrary(benchmark::State& state) {
  KeloDRCore::SqliteDB db(DatabaseOf(kRows), 3, "bench");
  const KeloDRCore::SelectCommand command = SelectAllNodes();
  RequireExpected([&] {
    std::vector<KeloDRCore::SqliteValueList> records;
    db.SelectRecords(command, records);
    std::string text;
    for (const KeloDRCore::SqliteValueList& record : records) text += record.ToStr();
    return text;
  });
  for (auto _ : state) {
    std::vector<KeloDRCore::SqliteValueList> records;
    Require(db.SelectRecords(command, records) && records.size() == kRows, "SelectRecords");
  }
}

// The contestants that fill `std::map<std::string, Json::Value>`.
template <typename Fill>
void FillRecords(benchmark::State& state, const Fill& fill) {
  RequireExpected([&] {
    std::vector<Record> records;
    fill(records);
    std::string text;
    for (const Record& record : records) AppendText(text, record);
    return text;
  });
  for (auto _ : state) {
    std::vector<Record> records;
    fill(records);
  }
}

void SelectByHand(benchmark::State& state) {
  sqlite3* const db = OpenRaw(DatabaseOf(kRows));
  FillRecords(state, [db](std::vector<Record>& records) { SelectRaw(db, kSelect, records); });
  sqlite3_close(db);
}

void EachWithLibrary(benchmark::State& state) {
  KeloDRCore::SqliteDB db(DatabaseOf(kRows), 3, "bench");
  const KeloDRCore::SelectCommand command = SelectAllNodes();
  for (auto _ : state) {
    size_t fields = 0;
    Require(db.SelectEach(command,
                          [&](const KeloDRCore::SqliteValueList& record) {
                            fields += record.GetValues().size();
                            return true;
                          }),
            "SelectEach");
    Require(fields == 5 * kRows, "SelectEach leaves fields out");
  }
}

void EachByHand(benchmark::State& state) {
  sqlite3* const db = OpenRaw(DatabaseOf(kRows));
  for (auto _ : state) {
    size_t fields = 0;
    sqlite3_stmt* statement = nullptr;
    sqlite3_prepare_v2(db, kSelect, -1, &statement, nullptr);
    while (sqlite3_step(statement) == SQLITE_ROW) fields += ReadRaw(statement).size();
    sqlite3_finalize(statement);
    Require(fields == 5 * kRows, "the loop by hand leaves fields out");
  }
  sqlite3_close(db);
}

void SelectWithSqliteCpp(benchmark::State& state) {
  const SQLite::Database db(DatabaseOf(kRows));
  FillRecords(state, [&db](std::vector<Record>& records) {
    SQLite::Statement statement(db, kSelect);
    while (statement.executeStep()) {
      Record record;
      for (int i = 0; i < statement.getColumnCount(); ++i) {
        const SQLite::Column column = statement.getColumn(i);
        if (column.isInteger()) {
          record.emplace(column.getName(), static_cast<Json::Int64>(column.getInt64()));
        } else {
          record.emplace(column.getName(), column.getText());
        }
      }
      records.push_back(std::move(record));
    }
  });
}

void SelectWithSoci(benchmark::State& state) {
  SociSession session(DatabaseOf(kRows));
  FillRecords(state,
              [&session](std::vector<Record>& records) { session.Select(kSelect, records); });
}

const Benchmarks registered([] {
  const auto measure = [](const Contestant& contestant, void (*run)(benchmark::State&)) {
    Register("SelectRecords", "20,000 rows", contestant, run)->Unit(benchmark::kMillisecond);
  };
  measure(kLibrary, SelectWithLibrary);
  measure(Baseline(1.05), SelectByHand);
  measure({"SQLiteCpp", 1}, SelectWithSqliteCpp);
  measure({"SOCI", 1}, SelectWithSoci);
  Register("SelectEach", "20,000 rows", kLibrary, EachWithLibrary)->Unit(benchmark::kMillisecond);
  Register("SelectEach", "20,000 rows", Baseline(1.05), EachByHand)->Unit(benchmark::kMillisecond);
});

}  // namespace
}  // namespace bench
