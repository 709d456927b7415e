// InsertRecord and InsertRecords: rows of five fields inside one transaction, into an empty table.

#include <SQLiteCpp/SQLiteCpp.h>
#include <sqlite3.h>

#include <functional>

#include "kelodrcore/sqlite_db.h"
#include "nodes.h"
#include "raw_calls.h"
#include "soci_peer.h"
#include "support.h"

namespace bench {
namespace {

constexpr char kInsert[] = "INSERT INTO nodes (address,id,name,online,port) VALUES (?,?,?,?,?)";

using InsertAll = std::function<void(const std::string& path, const std::vector<Node>& nodes)>;

// The peers do less: they look for no table, log nothing, and prepare one statement for all rows.

void InsertWithSqliteCpp(const std::string& path, const std::vector<Node>& nodes) {
  SQLite::Database db(path, SQLite::OPEN_READWRITE);
  SQLite::Transaction transaction(db);
  SQLite::Statement statement(db, kInsert);
  for (const Node& node : nodes) {
    statement.bind(1, node.address);
    statement.bind(2, node.id);
    statement.bind(3, node.name);
    statement.bind(4, node.online ? 1 : 0);
    statement.bind(5, node.port);
    statement.exec();
    statement.reset();
  }
  transaction.commit();
}

void Measure(const char* operation, const char* work, const Contestant& contestant,
             const InsertAll& insertAll) {
  Register(operation, work, contestant, [=](benchmark::State& state) {
    static const std::vector<Node> nodes = MakeNodes(kRows);
    static const std::string expected = Contents(DatabaseOf(kRows));
    const std::string path = ScratchPath("insert.db");
    for (auto _ : state) {
      state.PauseTiming();
      MakeDatabase(path);
      state.ResumeTiming();
      insertAll(path, nodes);
    }
    Require(Contents(path) == expected, std::string(contestant.name) + " inserts other rows");
  })->Unit(benchmark::kMillisecond);
}

const Benchmarks registered([] {
  Measure("InsertRecord", "20,000 rows", kLibrary, InsertWithLibrary);
  Measure("InsertRecord", "20,000 rows", Baseline(1.15), InsertByHand);
  Measure("InsertRecord", "20,000 rows", {"SQLiteCpp"}, InsertWithSqliteCpp);
  Measure("InsertRecord", "20,000 rows", {"SOCI"}, InsertWithSoci);
  Measure("InsertRecord", "20,000 rows, one command for all", kLibrary, InsertWithOneCommand);
  Measure("InsertRecord", "20,000 rows, one command for all", Baseline(1.15), InsertByHand);
  Measure("InsertRecords", "20,000 rows", kLibrary,
          [](const std::string& path, const std::vector<Node>& nodes) {
            static const std::vector<KeloDRCore::SqliteValueList> records = RecordsOf(nodes);
            InsertAllWithLibrary(path, records);
          });
  Measure("InsertRecords", "20,000 rows", Baseline(1.15), InsertPrepared);
  Measure("InsertRecords", "20,000 rows", {"SQLiteCpp", 1.1}, InsertWithSqliteCpp);
});

}  // namespace
}  // namespace bench
