// The processes of the soak: what they share, and what they do.

#ifndef KELODRCORE_TESTS_STORM_SOAK_H_
#define KELODRCORE_TESTS_STORM_SOAK_H_

#include <atomic>
#include <map>
#include <random>
#include <set>
#include <string>

#include "kelodrcore/sqlite_db.h"
#include "storm/storm.h"

constexpr int kDocuments = 4;  // with a lock each
constexpr int kMostProcesses = 64;
constexpr int kMostGroups = 1 << 22;
constexpr int kRecentGroups = 4096;  // are looked for all the time, the others at the end

// What is acknowledged.
enum Kind {
  kRow,
  kBulk,
  kTransaction,
  kRollback,
  kSelect,
  kDelete,
  kWrite,
  kRead,
  kCount,
  kCacheRead,
  kKinds
};

constexpr const char* kNames[kKinds] = {
    "inserts", "bulk inserts",      "transactions",   "rollbacks",           "selects",
    "deletes", "documents written", "documents read", "counts under a lock", "cache reads"};

// A group of rows is there as a whole or not at all.
enum class Group : char { kUnknown, kThere, kLeaving, kGone };

struct Measure {
  int memoryKiB;  // that no other process shares
  int descriptors;
};

struct Shared {
  std::atomic<bool> stop;
  std::atomic<bool> isWarm;  // a tenth of the time is over
  std::atomic<int> disk;     // odd while it is filled
  std::atomic<int> acknowledged[kKinds];
  std::atomic<int> refused;
  std::atomic<int> caught;
  std::atomic<int> fetches;
  std::atomic<int> nextGroup;
  std::atomic<int> oldestGroup;
  std::atomic<Group> groups[kMostGroups];
  std::atomic<int> tried[kDocuments];
  std::atomic<int> written[kDocuments];
  std::atomic<int> cached;  // the newest document that was seen
  std::atomic<pid_t> fetcher;
  std::atomic<pid_t> holders[kDocuments];
  std::atomic<pid_t> ready[kMostProcesses];  // who can be sent signals
  Measure first[kMostProcesses];
  Measure last[kMostProcesses];
};

inline void Raise(std::atomic<int>& most, int number) {
  int old = most;
  while (old < number && !most.compare_exchange_weak(old, number)) continue;
}

// One operation: it may only be refused when the disk was full meanwhile.
class Operation {
 public:
  Operation(Shared& state, Kind what) : shared(state), kind(what), disk(state.disk) {}

  // Returns `isDone`.
  bool End(bool isDone) const;

 private:
  Shared& shared;
  const Kind kind;
  const int disk;
};

// The database of all, which stays small. Each method is one operation.
class Rows {
 public:
  Rows(const Settings& settings, Shared& state, std::mt19937& draws);

  void Insert();
  void Check(int newest);  // as many groups, whether they are there or gone
  void Trim();
  void Close() { db.Close(); }
  bool IsSound();

 private:
  struct Found {
    int rows = 0;
    int size = 0;
  };

  bool InsertRow(int group, int part, int size);
  bool InsertBulk(int group);
  bool InsertFirstParts(int group);
  bool InsertTransaction(int group);
  bool InsertAndRollBack(int group);
  bool Select(int newest, std::map<int, Found>& found);
  void Compare(int first, const std::vector<Group>& known, const std::map<int, Found>& found) const;

  Shared& shared;
  std::mt19937& random;
  KeloDRCore::SqliteDB db;
};

// One life of one process. The first fourth of the processes are never killed: the survivors.
void Live(const Settings& settings, Shared& shared, int worker, int life);
inline int Survivors(const Settings& settings) { return (settings.processes + 3) / 4; }

// Numbered documents, each with a lock, and one more of all.
std::string DocumentPath(const Settings& settings, int which);

std::set<std::string> NamesIn(const std::string& dir);

void UpdateCache(const Settings& settings, Shared& shared);

Measure MeasureThis();

#endif  // KELODRCORE_TESTS_STORM_SOAK_H_
