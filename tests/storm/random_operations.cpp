#include <sys/file.h>
#include <sys/prctl.h>
#include <sys/wait.h>

#include <atomic>
#include <csignal>
#include <ctime>
#include <filesystem>
#include <set>

#include "kelodrcore/cache.h"
#include "kelodrcore/file_lock.h"
#include "kelodrcore/json_value.h"
#include "kelodrcore/sqlite_db.h"
#include "storm/storm.h"

using KeloDRCore::Cache;
using KeloDRCore::FileLock;
using KeloDRCore::InsertCommand;
using KeloDRCore::SqliteDB;
using KeloDRCore::SqliteTableHandler;
using KeloDRCore::SqliteValueList;

namespace {

constexpr int kLocks = 4;
constexpr int kMostInserts = 1 << 20;
constexpr unsigned int kRetries = 1000;

struct Shared {
  std::atomic<bool> stop;
  std::atomic<int> nextNumber;
  std::atomic<int> acknowledged;
  int acknowledgedNumbers[kMostInserts];
  std::atomic<int> cacheReads;
  std::atomic<int> documentReads;
  std::atomic<int> fetches;
  std::atomic<int> locks;
  std::atomic<pid_t> fetcher;
  std::atomic<pid_t> holders[kLocks];
};

constexpr int kDyingMs = 5000;

// Marks this process as the only one in a section. One that was killed there lets go of its locks a
// little before it is dead; one that goes on finds that it is not the only one when it leaves.
void Enter(std::atomic<pid_t>& section, const char* what) {
  const pid_t other = section.exchange(getpid());
  int waited = 0;
  for (; other != 0 && waited < kDyingMs && IsAlive(other); ++waited) SleepMs(1);
  Expect(waited < kDyingMs, what);
}

void Leave(std::atomic<pid_t>& section, const char* what) {
  Expect(section.exchange(0) == getpid(), what);
}

class StormCache : public Cache {
 public:
  StormCache(const Settings& settings, bool isRequired, Shared& state, std::mt19937& draws)
      : Cache(settings.dir + "/cache", "c", 1000, isRequired, 0), shared(state), random(draws) {}

  Json::Value GetInfo() const override { return "storm"; }
  bool IsValidData(const Json::Value& data) const override { return !data.isNull(); }
  bool IsNeedUpdate(const Json::Value& /*data*/) const override { return Draw(random, 5) == 0; }

  bool GetUpdatedData(Json::Value& out) const override {
    Enter(shared.fetcher, "two fetches at a time");
    SleepMs(Draw(random, 20));
    ++shared.fetches;
    out = Numbered(Draw(random, 100000));
    Leave(shared.fetcher, "a fetch ended while another one ran");
    return Draw(random, 20) != 0;
  }

 private:
  Shared& shared;
  std::mt19937& random;
};

// One life of one worker.
class Worker {
 public:
  Worker(const Settings& all, Shared& state, std::mt19937 draws)
      : settings(all), shared(state), random(draws), db(all.dir + "/base", kRetries, "") {}

  void Run() {
    while (!shared.stop) {
      switch (Draw(random, 5)) {
        case 0:
          Insert();
          break;
        case 1:
          ReadCache();
          break;
        case 2:
          Write();
          break;
        case 3:
          Read();
          break;
        default:
          Lock();
      }
    }
  }

 private:
  void Insert() {
    const int number = ++shared.nextNumber;
    InsertCommand insert;
    insert.SetTable(SqliteTableHandler("t", "n INTEGER UNIQUE, filler TEXT"));
    insert.AddFieldValue("n", number);
    insert.AddFieldValue("filler", std::string(static_cast<size_t>(Draw(random, 3000)), 'x'));
    Expect(db.InsertRecord(insert), "an insert failed");
    if (Draw(random, 3) == 0) db.Close();
    shared.acknowledgedNumbers[shared.acknowledged++ % kMostInserts] = number;
  }

  void ReadCache() {
    const StormCache cache(settings, Draw(random, 10) == 0, shared, random);
    const Json::Value data = cache.Read();
    Expect(data.isNull() || IsWhole(data), "a cache gave half a document");
    ++shared.cacheReads;
  }

  void Write() {
    const std::string path = settings.dir + "/documents/d";
    Expect(KeloDRCore::JsonValue::toFile(Numbered(Draw(random, 100000)), path), "no write");
  }

  void Read() {
    Json::Value value;
    const std::string path = settings.dir + "/documents/d";
    Expect(KeloDRCore::JsonValue::fromFile(value, path) && IsWhole(value), "half a document");
    ++shared.documentReads;
  }

  void Lock() {
    const int which = Draw(random, kLocks);
    FileLock lock(settings.dir + "/lock" + std::to_string(which));
    const int type = Draw(random, 2) == 0 ? LOCK_EX : LOCK_EX | LOCK_NB;
    if (!lock.lock(type, 0)) return;
    Enter(shared.holders[which], "two holders of a lock");
    SleepMs(Draw(random, 3));
    Leave(shared.holders[which], "a lock had another holder");
    if (Draw(random, 2) == 0) lock.unlock();
    ++shared.locks;
  }

  const Settings& settings;
  Shared& shared;
  std::mt19937 random;
  SqliteDB db;
};

void KillAtRandom(const Settings& settings, const Shared& shared, Workers& workers) {
  std::mt19937 random = Generator(settings, -1, 0);
  const time_t end = time(nullptr) + settings.seconds;
  while (time(nullptr) < end) {
    SleepMs(Draw(random, 50));
    const pid_t fetcher = shared.fetcher;
    // Of the refreshers that belong to nobody only their fetch is known.
    if (Draw(random, 4) == 0 && fetcher > 0) kill(fetcher, SIGKILL);
    workers.Kill(Draw(random, settings.processes));
  }
}

void ExpectEveryAcknowledgedInsert(const Settings& settings, const Shared& shared) {
  SqliteDB db(settings.dir + "/base", kRetries, "");
  std::vector<SqliteValueList> rows;
  Expect(db.SelectByCommand("PRAGMA integrity_check", rows) && rows.size() == 1 &&
             rows[0].ToStr() == "integrity_check:'ok'",
         "the database is not sound");
  rows.clear();
  Expect(db.SelectByCommand("SELECT n FROM t", rows), "the rows cannot be read");
  std::set<int> numbers;
  for (const SqliteValueList& row : rows) {
    int number = 0;
    if (row.GetValue("n", number)) numbers.insert(number);
  }
  numbers.insert(0);  // of who was killed before it wrote its number down
  for (int i = 0; i < shared.acknowledged; ++i) {
    Expect(numbers.count(shared.acknowledgedNumbers[i]) == 1, "an acknowledged insert is lost");
  }
}

std::set<std::string> NamesIn(const std::string& dir) {
  std::set<std::string> names;
  for (const auto& entry : std::filesystem::directory_iterator(dir)) {
    names.insert(entry.path().filename().string());
  }
  return names;
}

// Each next process finds everything free, and takes away what the killed ones left.
void ExpectNothingLeft(const Settings& settings, Shared& shared) {
  std::mt19937 random = Generator(settings, -2, 0);
  Expect(NamesIn(settings.dir + "/cache").size() <= 3, "leftovers beside the cache pile up");
  Expect(NamesIn(settings.dir + "/documents").size() <= 2, "leftovers beside a document pile up");
  const StormCache cache(settings, true, shared, random);
  bool updated = false;
  for (int i = 0; i < 10 && !updated; ++i) updated = cache.Update();
  Expect(updated && IsWhole(cache.GetCachedData()), "no update any more");
  Expect(KeloDRCore::JsonValue::toFile(Numbered(1), settings.dir + "/documents/d"), "no write");
  Expect(NamesIn(settings.dir + "/cache") == std::set<std::string>{"c.cached"},
         "left in the cache");
  Expect(NamesIn(settings.dir + "/documents") == std::set<std::string>{"d"}, "left by a writer");
  Expect(NamesIn(settings.dir) == std::set<std::string>{"base", "cache", "documents"}, "left over");
  for (int i = 0; i < kLocks; ++i) {
    FileLock lock(settings.dir + "/lock" + std::to_string(i));
    Expect(lock.tryLock(LOCK_EX | LOCK_NB), "a lock is held by nobody");
  }
}

std::string Figures(const Shared& shared, int killed) {
  return std::to_string(shared.acknowledged) + " inserts, " + std::to_string(shared.documentReads) +
         " documents read, " + std::to_string(shared.cacheReads) + " cache reads, " +
         std::to_string(shared.fetches) + " fetches, " + std::to_string(shared.locks) + " locks, " +
         std::to_string(killed) + " processes killed";
}

}  // namespace

std::string RandomOperations(const Settings& settings) {
  Shared& shared = MakeShared<Shared>();
  std::filesystem::create_directory(settings.dir + "/cache");
  std::filesystem::create_directory(settings.dir + "/documents");
  Expect(KeloDRCore::JsonValue::toFile(Numbered(0), settings.dir + "/documents/d"), "no write");
  prctl(PR_SET_CHILD_SUBREAPER, 1);  // of the cache's refreshers
  Workers workers(settings.processes, [&](int worker, int life) {
    Worker(settings, shared, Generator(settings, worker, life)).Run();
  });
  KillAtRandom(settings, shared, workers);
  shared.stop = true;
  workers.Join(true);
  Expect(shared.acknowledged > 0 && shared.acknowledged < kMostInserts, "no inserts, or too many");
  Expect(shared.fetches > 0 && shared.locks > 0, "no fetches or locks");
  ExpectEveryAcknowledgedInsert(settings, shared);
  ExpectNothingLeft(settings, shared);
  return Figures(shared, workers.Killed());
}
