// How the cost of SQL work grows: with the rows, and with the size of one value; and what a
// selected row takes of memory.

#include <malloc.h>

#include <cstdio>
#include <fstream>

#include "kelodrcore/sqlite_db.h"
#include "nodes.h"
#include "processes.h"
#include "raw_calls.h"
#include "support.h"

namespace bench {
namespace {

constexpr char kSelect[] = "SELECT  * FROM nodes";

KeloDRCore::SelectCommand SelectAllNodes() {
  KeloDRCore::SelectCommand command;
  command.SetTable(NodeTable());
  command.SelectAll();
  return command;
}

size_t SelectWithLibrary(const std::string& path) {
  KeloDRCore::SqliteDB db(path, 3, "bench");
  std::vector<KeloDRCore::SqliteValueList> records;
  Require(db.SelectRecords(SelectAllNodes(), records), "SelectRecords");
  return records.size();
}

size_t SelectByHand(const std::string& path) {
  sqlite3* const db = OpenRaw(path);
  std::vector<Record> records;
  SelectRaw(db, kSelect, records);
  sqlite3_close(db);
  return records.size();
}

size_t EachWithLibrary(const std::string& path) {
  KeloDRCore::SqliteDB db(path, 3, "bench");
  size_t rows = 0;
  const auto count = [&rows](const KeloDRCore::SqliteValueList& /*record*/) { return ++rows > 0; };
  Require(db.SelectEach(SelectAllNodes(), count), "SelectEach");
  return rows;
}

size_t EachByHand(const std::string& path) {
  sqlite3* const db = OpenRaw(path);
  sqlite3_stmt* statement = nullptr;
  sqlite3_prepare_v2(db, kSelect, -1, &statement, nullptr);
  size_t rows = 0;
  for (; sqlite3_step(statement) == SQLITE_ROW; ++rows) ReadRaw(statement);
  sqlite3_finalize(statement);
  sqlite3_close(db);
  return rows;
}

// An empty database, whose making is not measured.
void MakeUntimed(benchmark::State& state, const std::string& path) {
  state.PauseTiming();
  MakeDatabase(path);
  state.ResumeTiming();
}

void MeasureInsert(int rows, const Contestant& contestant,
                   void (*insertAll)(const std::string&, const std::vector<Node>&)) {
  Register("growth insert", std::to_string(rows), contestant, [=](benchmark::State& state) {
    const std::vector<Node> nodes = MakeNodes(rows);
    const std::string path = ScratchPath("growth.db");
    for (auto _ : state) {
      MakeUntimed(state, path);
      insertAll(path, nodes);
    }
  });
}

void MeasureBulk(int rows) {
  Register("growth bulk", std::to_string(rows), kLibrary, [=](benchmark::State& state) {
    const auto records = RecordsOf(MakeNodes(rows));
    const std::string path = ScratchPath("growth.db");
    for (auto _ : state) {
      MakeUntimed(state, path);
      InsertAllWithLibrary(path, records);
    }
  });
  Register("growth bulk", std::to_string(rows), Baseline(), [=](benchmark::State& state) {
    const std::vector<Node> nodes = MakeNodes(rows);
    const std::string path = ScratchPath("growth.db");
    for (auto _ : state) {
      MakeUntimed(state, path);
      InsertPrepared(path, nodes);
    }
  });
}

void MeasureSelect(const char* operation, int rows, const Contestant& contestant,
                   size_t (*selectAll)(const std::string&)) {
  Register(operation, std::to_string(rows), contestant, [=](benchmark::State& state) {
    const std::string path = DatabaseOf(rows);
    for (auto _ : state) Require(selectAll(path) == static_cast<size_t>(rows), "select");
  });
}

// The highest resident memory of this process in bytes, counted from this moment on when `reset`.
size_t PeakMemory(bool reset) {
  if (reset) {
    malloc_trim(0);
    std::ofstream("/proc/self/clear_refs") << "5";
  }
  std::ifstream status("/proc/self/status");
  for (std::string line; std::getline(status, line);) {
    size_t kilobytes = 0;
    if (sscanf(line.c_str(), "VmHWM: %zu", &kilobytes) == 1) return kilobytes * 1024;
  }
  return 0;
}

// In a child, so that no earlier work has left memory to use again.
void MeasureMemory(const char* operation, int rows, const Contestant& contestant,
                   size_t (*selectAll)(const std::string&)) {
  Register(operation, std::to_string(rows), contestant, [=](benchmark::State& state) {
    const std::string path = DatabaseOf(rows);
    double bytes = 0;
    for (auto _ : state) {
      bytes = NumberFromChild([&] {
        const size_t before = PeakMemory(true);
        selectAll(path);
        return static_cast<double>(PeakMemory(false) - before);
      });
    }
    state.counters["bytes_per_row"] = bytes / rows;
  });
}

void MeasureValueInsert(size_t size, const Contestant& contestant,
                        void (*insertAll)(const std::string&, const std::vector<Node>&),
                        size_t (*selectAll)(const std::string&)) {
  Register("growth value", std::to_string(size), contestant, [=](benchmark::State& state) {
    const std::vector<Node> nodes = {{"10.0.0.1", 1, std::string(size, 'x'), true, 5566}};
    const std::string path = ScratchPath("value.db");
    for (auto _ : state) {
      MakeUntimed(state, path);
      insertAll(path, nodes);
      Require(selectAll(path) == 1, "select");
    }
  })->UseRealTime();
}

const Benchmarks registered([] {
  for (const int rows : {1000, 10000, 100000, 1000000}) {
    MeasureInsert(rows, kLibrary, InsertWithLibrary);
    MeasureInsert(rows, Baseline(), InsertByHand);
    MeasureBulk(rows);
    MeasureSelect("growth select", rows, kLibrary, SelectWithLibrary);
    MeasureSelect("growth select", rows, Baseline(), SelectByHand);
    MeasureSelect("growth each", rows, kLibrary, EachWithLibrary);
    MeasureSelect("growth each", rows, Baseline(), EachByHand);
    MeasureMemory("growth memory", rows, kLibrary, SelectWithLibrary);
    MeasureMemory("growth memory", rows, Baseline(), SelectByHand);
    MeasureMemory("growth each memory", rows, kLibrary, EachWithLibrary);
    MeasureMemory("growth each memory", rows, Baseline(), EachByHand);
  }
  for (size_t size = 16; size <= size_t{64} << 20; size *= 16) {
    MeasureValueInsert(size, kLibrary, InsertWithLibrary, SelectWithLibrary);
    MeasureValueInsert(size, Baseline(), InsertByHand, SelectByHand);
  }
  MeasureValueInsert(size_t{64} << 20, kLibrary, InsertWithLibrary, SelectWithLibrary);
  MeasureValueInsert(size_t{64} << 20, Baseline(), InsertByHand, SelectByHand);
});

}  // namespace
}  // namespace bench
