// Cache updates and lock cycles killed at every system call of every process that they involve.

#include <sys/file.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <numeric>
#include <string>
#include <vector>

#include "kelodrcore/file_lock.h"
#include "kelodrcore/json_value.h"
#include "kill/recovery.h"
#include "support/test_cache.h"
#include "support/test_clock.h"
#include "support/tracer.h"

namespace {

using KeloDRCore::FileLock;
using KeloDRCore::JsonValue::fromFile;
using Tracer::Moment;

constexpr int kStale = 1100;  // seconds; above the time-out of MakeCache()

int Sum(const std::vector<int>& numbers) {
  return std::accumulate(numbers.begin(), numbers.end(), 0);
}

class KilledUpdateTest : public CacheFixture {
 protected:
  void Prepare() const {
    std::filesystem::remove_all(cacheDir);
    std::filesystem::create_directory(cacheDir);
    WriteCacheFile("\"old\"", kStale);
  }

  // The lock directory is missing as well, so that claiming the update makes it.
  void PrepareFirst() const {
    Prepare();
    RemoveLockDir();
  }

  void RemoveLockDir() const { std::filesystem::remove_all("/tmp/.kelodr_lock" + dir); }

  void Refresh(const std::string& data, bool waits = true) const {
    TestClock::SkipSleeps();
    TestCache cache = MakeCache(waits);
    cache.FetchGives(data);
    cache.Read();
  }

  void ExpectOneOf(const std::vector<std::string>& data, const Moment& moment) const {
    Json::Value document;
    EXPECT_TRUE(fromFile(document, path)) << moment;
    const std::string found = document["cached_data"].asString();
    EXPECT_EQ(std::count(data.begin(), data.end(), found), 1) << found << " at " << moment;
  }

  static std::string Temporary() { return ".c.cached.kelodr-" + std::to_string(geteuid()); }

  // The cache file, a pid file that names nobody alive, one temporary.
  void ExpectFewLeftovers(const Moment& moment) const {
    for (const std::string& name : NamesIn(cacheDir)) {
      EXPECT_TRUE(name == "c.cached" || name == "c.cached.pid" || name == Temporary())
          << name << " at " << moment;
    }
  }

  void ExpectWhole(const std::vector<std::string>& data, const Moment& moment) const {
    ExpectOneOf(data, moment);
    ExpectFewLeftovers(moment);
    ExpectFree(lockName);
    LogCapture::Clear();
  }

  void ExpectNextUpdateSucceeds(const Moment& moment) const {
    TestCache cache = MakeCache();
    cache.FetchGives("next");
    ExpectPrompt([&] { EXPECT_TRUE(cache.Update()) << moment; });
    EXPECT_EQ(MakeCache().Read(), "next") << moment;
    EXPECT_EQ(NamesIn(cacheDir), std::vector<std::string>{"c.cached"}) << moment;
    LogCapture::Clear();
  }

  std::vector<int> SweepRefresh(bool waits) {
    return Tracer::Sweep([this] { Prepare(); }, [&] { Refresh("new", waits); },
                         [this](const Moment& moment) {
                           ExpectWhole({"old", "new"}, moment);
                           ExpectNextUpdateSucceeds(moment);
                         });
  }

  int SweepRefreshes(const Sample& sample, const Succession& refreshes) {
    return SweepPairs(
        sample, [this] { Prepare(); }, refreshes,
        [this](const Moment& second) {
          ExpectWhole({"old", "new", "newer"}, second);
          ExpectNextUpdateSucceeds(second);
        });
  }
};

TEST_F(KilledUpdateTest, LeavesTheOldDocumentOrTheNewOneAndNoLockHeld) {
  PrepareFirst();
  ExpectNextUpdateSucceeds({});  // makes the lock directory
  const std::vector<int> kills = SweepRefresh(true);
  ASSERT_EQ(kills.size(), 1U);
  EXPECT_GT(kills[0], 60);
  RecordProperty("kills", kills[0]);
}

TEST_F(KilledUpdateTest, MayBeTheFirstOneSinceTheStart) {
  const std::vector<int> kills =
      Tracer::Sweep([this] { PrepareFirst(); }, [this] { Refresh("new"); },
                    [this](const Moment& moment) {
                      ExpectWhole({"old", "new"}, moment);
                      ExpectNextUpdateSucceeds(moment);
                    });
  ASSERT_EQ(kills.size(), 1U);
  RecordProperty("kills", Sum(kills));
}

TEST_F(KilledUpdateTest, MayBeADetachedOneOrItsCaller) {
  const std::vector<int> kills = SweepRefresh(false);
  ASSERT_GE(kills.size(), 3U) << "not the caller, the process in between, and the refresher";
  EXPECT_GT(kills[2], 60);
  RecordProperty("kills", Sum(kills));
}

TEST_F(KilledUpdateTest, MayBeFollowedByAnotherKilledUpdate) {
  const int pairs =
      SweepRefreshes({15, 5}, {[this] { Refresh("new"); }, [this] { Refresh("newer"); }});
  EXPECT_GT(pairs, 50);
  RecordProperty("kills", pairs);
}

TEST_F(KilledUpdateTest, MayBeADetachedOneAfterAnother) {
  const int pairs = SweepRefreshes(
      {23, 9}, {[this] { Refresh("new", false); }, [this] { Refresh("newer", false); }, 3});
  EXPECT_GT(pairs, 50);
  RecordProperty("kills", pairs);
}

TEST_F(KilledUpdateTest, ReachesTheDiskBeforeItsName) {
  Prepare();
  const std::string temporary = Temporary();
  EXPECT_EQ(Tracer::FileCalls(cacheDir, [this] { Refresh("new"); }),
            (std::vector<std::string>{
                "remove c.cached.pid", "create c.cached.pid", "mode c.cached.pid",
                "write c.cached.pid", "write c.cached.pid", "create " + temporary,
                "write " + temporary, "mode " + temporary, "sync " + temporary,
                "rename " + temporary + " c.cached", "sync .", "remove c.cached.pid"}));
}

class KilledLockCycleTest : public KilledUpdateTest {
 protected:
  void Cycle() const {
    FileLock lock(lockName);
    if (lock.lock(LOCK_EX | LOCK_NB, 0)) lock.unlock();
  }

  int Sweep(const std::function<void()>& prepare) {
    return Sum(Tracer::Sweep(
        prepare, [this] { Cycle(); }, [this](const Moment&) { ExpectFree(lockName); }));
  }

  int SweepCycles(const Sample& sample, const std::function<void()>& prepare, int processes) {
    const auto cycle = [this] { Cycle(); };
    return SweepPairs(sample, prepare, {cycle, cycle, processes},
                      [this](const Moment&) { ExpectFree(lockName); });
  }
};

TEST_F(KilledLockCycleTest, LeavesTheLockFree) {
  Cycle();
  const int kills = Sweep([] {});
  EXPECT_GE(kills, 8);
  RecordProperty("kills", kills);
}

TEST_F(KilledLockCycleTest, LeavesTheLockFreeWhenItMakesTheDirectory) {
  const int kills = Sweep([this] { RemoveLockDir(); });
  EXPECT_GT(kills, 20);
  RecordProperty("kills", kills);
}

TEST_F(KilledLockCycleTest, MayBeFollowedByAnotherKilledCycle) {
  Cycle();
  const int pairs = SweepCycles(
      {1, 1}, [] {}, 1);
  EXPECT_GT(pairs, 10);
  RecordProperty("kills", pairs);
}

TEST_F(KilledLockCycleTest, MayBeFollowedByAnotherKilledCycleThatMakesTheDirectory) {
  const int pairs = SweepCycles(
      {3, 2}, [this] { RemoveLockDir(); }, 1);
  EXPECT_GT(pairs, 50);
  RecordProperty("kills", pairs);
}

}  // namespace
