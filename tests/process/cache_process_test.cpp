// What processes that share a cache file see of each other.

#include "process/cache_process.h"

#include <gmock/gmock.h>
#include <sys/file.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <stdexcept>
#include <thread>

#include "kelodrcore/file_lock.h"
#include "support/lock_test.h"
#include "support/process.h"
#include "support/test_clock.h"

namespace {

using KeloDRCore::FileLock;

// --- The claim

TEST_F(CacheProcessTest, AClaimIsThePidFileOfTheFetchingProcess) {
  TestCache cache = MakeCache();
  cache.fetch = [this](Json::Value& out) {
    EXPECT_EQ(atoi(ReadText(pidFile).c_str()), getpid());
    EXPECT_EQ(NamesIn(cacheDir), std::vector<std::string>{"c.cached.pid"});
    out = 1;
    return true;
  };
  EXPECT_TRUE(cache.Update());
  EXPECT_EQ(NamesIn(cacheDir), std::vector<std::string>{"c.cached"});
  ExpectLog({Starts(), Finishes()});
}

TEST_F(CacheProcessTest, TheLockIsNamedAfterTheFileAndFreeDuringTheFetch) {
  TestCache cache = MakeCache();
  cache.fetch = [this](Json::Value& out) {
    EXPECT_TRUE(std::filesystem::exists("/tmp/.kelodr_lock/" + path + ".lock"));
    EXPECT_TRUE(FileLock(lockName).tryLock(LOCK_EX | LOCK_NB));
    out = 1;
    return true;
  };
  EXPECT_TRUE(cache.Update());
  EXPECT_TRUE(FileLock(lockName).tryLock(LOCK_EX | LOCK_NB));
  ExpectLog({Starts(), Finishes()});
}

TEST_F(CacheProcessTest, AFailedFetchReleasesTheClaim) {
  EXPECT_FALSE(MakeCache(true, -1).Update());
  EXPECT_EQ(NamesIn(cacheDir), std::vector<std::string>{});
  ExpectLog({Starts(), FetchFailed(-1), Finishes()});
}

TEST_F(CacheProcessTest, AnExceptionReleasesTheClaimAndReachesTheCaller) {
  TestCache cache = MakeCache();
  cache.fetch = [](Json::Value&) -> bool { throw std::runtime_error("fetch"); };
  EXPECT_THROW(cache.Update(), std::runtime_error);
  EXPECT_EQ(NamesIn(cacheDir), std::vector<std::string>{});
  EXPECT_TRUE(FileLock(lockName).tryLock(LOCK_EX | LOCK_NB));
  ExpectLog({Starts(), Finishes()});
}

TEST_F(CacheProcessTest, AnExceptionOfTheTestOfTheDataReachesTheCaller) {
  WriteCacheFile("1");
  TestCache cache = MakeCache(false);
  cache.isValid = [](const Json::Value&) -> bool { throw std::runtime_error("test"); };
  EXPECT_THROW(cache.Update(), std::runtime_error);
  EXPECT_EQ(NamesIn(cacheDir), std::vector<std::string>{"c.cached"});
  ExpectLog({});
}

TEST_F(CacheProcessTest, NoClaimWhileAnotherReaderKeepsTheLock) {
  TestClock::SkipSleeps();
  FileLock reader(lockName);
  ASSERT_TRUE(reader.lock(LOCK_SH | LOCK_NB, 0));
  EXPECT_FALSE(MakeCache().Update());
  EXPECT_EQ(TestClock::TakeSleeps(), std::vector<unsigned int>(100, 50000));
  ExpectLog(
      {Debug("cache.cpp", "SetUpdating", "Failed to lock [/tmp/.kelodr_lock/" + path + ".lock]")});
}

TEST_F(CacheProcessTest, NoClaimWhenAnotherProcessWasQuicker) {
  FileLock reader(lockName);
  ASSERT_TRUE(reader.lock(LOCK_SH | LOCK_NB, 0));
  TestClock::SkipSleeps([&] {
    WriteText(pidFile, std::to_string(getppid()));
    reader.unlock();
  });
  EXPECT_FALSE(MakeCache().Update());
  EXPECT_EQ(TestClock::TakeSleeps(), std::vector<unsigned int>{50000});
  ExpectLog(
      {Debug("cache.cpp", "SetUpdating", "there is other process to update cache [" + path + "]")});
  std::filesystem::remove(pidFile);
}

TEST_F(CacheProcessTest, NoClaimAndNoLineWhenAnotherProcessClaimedSinceTheFirstLook) {
  int locks = 0;
  LockCalls::beforeFlock = [&](int) {
    if (++locks == 2) WriteText(pidFile, std::to_string(getppid()));
  };
  EXPECT_FALSE(MakeCache().Update());
  LockCalls::beforeFlock = nullptr;
  EXPECT_EQ(locks, 2);
  ExpectLog({});
  std::filesystem::remove(pidFile);
}

TEST_F(CacheProcessTest, NoClaimWithoutAPidFile) {
  std::filesystem::create_directories(pidFile + "/in the way");
  EXPECT_FALSE(MakeCache().Update());
  ExpectLog({Debug("cache.cpp", "SetUpdating", "Failed to set cache [" + path + "] updating")});
  std::filesystem::remove_all(pidFile);
}

TEST_F(CacheProcessTest, AStrangersDirectoryInThePlaceOfThePidFileStopsNobody) {
  if (geteuid() != 0) GTEST_SKIP() << "needs root to make a stranger's directory";
  std::filesystem::create_directories(pidFile + "/in the way");
  ASSERT_EQ(chown(pidFile.c_str(), 4711, 4711), 0);
  TestCache cache = MakeCache();
  cache.FetchGives(1);
  EXPECT_TRUE(cache.Update());
  ExpectLog({Starts(), Finishes()});
  const std::vector<std::string> names = NamesIn(cacheDir);
  ASSERT_THAT(names, testing::ElementsAre(testing::StartsWith(".planted-"), "c.cached"));
  std::filesystem::remove_all(cacheDir + "/" + names.front());
}

TEST_F(CacheProcessTest, TheClaimIsReleasedEvenWithoutTheLock) {
  TestClock::SkipSleeps();
  FileLock reader(lockName);
  TestCache cache = MakeCache();
  cache.fetch = [&](Json::Value& out) {
    out = 1;
    return reader.lock(LOCK_SH | LOCK_NB, 0);
  };
  EXPECT_TRUE(cache.Update());
  EXPECT_EQ(TestClock::TakeSleeps(), std::vector<unsigned int>(1200, 50000));
  ExpectLog({Starts(),
             Notice("cache.cpp", "UnsetUpdating", "Failed to lock to unset cache[" + path + "]"),
             Finishes()});
}

TEST_F(CacheProcessTest, TheClaimOfAnotherProcessIsNotReleased) {
  TestCache cache = MakeCache();
  cache.fetch = [this](Json::Value& out) {
    WriteText(pidFile, std::to_string(getppid()));
    out = 1;
    return true;
  };
  EXPECT_TRUE(cache.Update());
  ExpectLog({Starts(), Debug("cache.cpp", "UnsetUpdating",
                             "Failed to unset updating cache [" + pidFile +
                                 "] since different pid[" + std::to_string(getppid()) + "]")});
  EXPECT_EQ(ReadText(pidFile), std::to_string(getppid()));
  std::filesystem::remove(pidFile);
  EXPECT_TRUE(FileLock(lockName).tryLock(LOCK_EX | LOCK_NB));
}

TEST_F(CacheProcessTest, TheClaimOfADeadProcessIsRemoved) {
  const pid_t dead = StartChild([] { return 0; });
  EXPECT_EQ(JoinChild(dead), 0);
  TestCache cache = MakeCache();
  cache.fetch = [&](Json::Value& out) {
    WriteText(pidFile, std::to_string(dead));
    out = 1;
    return true;
  };
  EXPECT_TRUE(cache.Update());
  ExpectLog({Starts(), Finishes()});
}

TEST_F(CacheProcessTest, APidFileThatCannotBeRemovedIsReported) {
  TestCache cache = MakeCache();
  cache.fetch = [this](Json::Value& out) {
    out = 1;
    return std::filesystem::remove(pidFile);
  };
  EXPECT_TRUE(cache.Update());
  ExpectLog({Starts(), CannotUnlink("No such file or directory"), Finishes()});
}

// --- Who fetches

// A cache whose subclass itself says whether its readers wait.
class DecidingCache : public TestCache {
 public:
  DecidingCache(const TestCache& cache, bool required) : TestCache(cache), isRequired(required) {}
  bool IsUpdatedDataRequired() const override { return isRequired; }

 private:
  bool isRequired;
};

TEST_F(CacheProcessTest, ASubclassThatRequiresFreshDataFetchesItself) {
  WriteCacheFile("\"old\"", kStale);
  DecidingCache cache(MakeCache(false), true);
  cache.FetchGives("new");
  EXPECT_EQ(cache.Read(), "new");
  EXPECT_EQ(JoinAll(), 0);
  ExpectLog({Starts(), Finishes()});
}

TEST_F(CacheProcessTest, ASubclassThatRequiresNoFreshDataLetsARefresherFetch) {
  WriteCacheFile("null", kStale);
  const Event finish;
  DecidingCache cache(MakeCache(true), false);
  cache.fetch = [&](Json::Value& out) {
    out = "new";
    return finish.Wait();
  };
  EXPECT_EQ(cache.Read(), Json::Value());
  finish.Cause();
  EXPECT_EQ(JoinAll(), 1);
  EXPECT_EQ(cache.Read(), "new");
  ExpectLog({});
}

// --- Who counts as an updater

TEST_F(CacheProcessTest, APidFileOfADeadOrReusedPidOrOfNobodyStopsNoUpdate) {
  const pid_t dead = StartChild([] { return 0; });
  EXPECT_EQ(JoinChild(dead), 0);
  for (const std::string& text :
       {std::to_string(dead), std::to_string(getppid()) + "\n1\n", std::string("0"),
        std::string("-1"), std::string("x"), std::string()}) {
    WriteText(pidFile, text);
    TestCache cache = MakeCache();
    cache.FetchGives(text);
    EXPECT_TRUE(cache.Update());
    EXPECT_EQ(cache.GetCachedData(), text);
    ExpectLog({Starts(), Finishes()});
  }
}

TEST_F(CacheProcessTest, ALiveProcessInThePidFileIsAnUpdater) {
  WriteCacheFile("\"old\"", kStale);
  const TestCache cache = MakeCache(false);
  for (const pid_t pid : {getppid(), pid_t{1}}) {
    WriteText(pidFile, std::to_string(pid));
    EXPECT_TRUE(cache.Update());
    EXPECT_EQ(cache.Read(), "old");
  }
  ExpectLog({});
  EXPECT_EQ(JoinAll(), 0);
  std::filesystem::remove(pidFile);
}

TEST_F(CacheProcessTest, APidFileThatIsNotBelievedIsNoClaim) {
  const std::string live = std::to_string(getppid());
  WriteText(Path("target"), live);
  const auto expectUpdate = [this] {
    WriteCacheFile("\"old\"", kStale);
    TestCache cache = MakeCache();
    cache.FetchGives("new");
    EXPECT_EQ(cache.Read(), "new");
    ExpectLog({Starts(), Finishes()});
  };
  std::filesystem::create_symlink(Path("target"), pidFile);
  expectUpdate();
  EXPECT_EQ(ReadText(Path("target")), live);
  if (geteuid() != 0) return;  // only root can make a stranger's file
  WriteText(pidFile, live);
  ASSERT_EQ(chown(pidFile.c_str(), 4711, 4711), 0);
  expectUpdate();
}

// Its release could not remove it.
TEST_F(CacheProcessTest, AClaimOfTheCallerThatIsLeftOverIsGivenUp) {
  WriteText(pidFile, std::to_string(getpid()));
  TestCache cache = MakeCache();
  cache.FetchGives("new");
  EXPECT_EQ(cache.Read(), "new");
  ExpectLog({NoData(), UsesDefault(), Starts(), Finishes()});
}

TEST_F(CacheProcessTest, AClaimOfTheCallerThatIsLeftOverStopsNoRefresher) {
  WriteCacheFile("\"old\"", kStale);
  WriteText(pidFile, std::to_string(getpid()));
  TestCache cache = MakeCache(false);
  cache.FetchGives("new");
  EXPECT_TRUE(cache.Update());
  EXPECT_EQ(JoinAll(), 1);
  EXPECT_EQ(cache.Read(), "new");
}

// --- A fetch that uses its own cache

TEST_F(CacheProcessTest, AFetchReadsTheOldDataOfItsOwnCache) {
  ASSERT_EQ(symlink(cacheDir.c_str(), Path("link").c_str()), 0);
  WriteCacheFile("\"old\"", kStale);
  for (const std::string& sameDir : {cacheDir, cacheDir + "/../cache/.", Path("link")}) {
    TestCache cache = MakeCache();
    cache.fetch = [&](Json::Value& out) {
      const TestCache other(sameDir, "c", 1000, true, 0);
      EXPECT_TRUE(other.Update());
      EXPECT_EQ(other.Read(), "old");
      out = "new";
      return true;
    };
    EXPECT_TRUE(cache.Update());
    EXPECT_EQ(cache.Read(), "new");
    ExpectLog({Starts(), Finishes()});
    WriteCacheFile("\"old\"", kStale);
  }
}

// One has another name, the other stands in another directory.
TEST_F(CacheProcessTest, AFetchUpdatesAnotherCache) {
  for (TestCache other :
       {TestCache(cacheDir, "d", 1000, true, 0), TestCache(Path("other"), "c", 1000, true, 0)}) {
    other.FetchGives("other");
    TestCache cache = MakeCache();
    cache.fetch = [&](Json::Value& out) {
      out = other.Read();
      return true;
    };
    EXPECT_TRUE(cache.Update());
    EXPECT_EQ(cache.GetCachedData(), "other");
    EXPECT_EQ(other.Remove(), 0);
  }
  LogCapture::Clear();
}

// It waits as another process does.
TEST_F(CacheProcessTest, AnotherThreadGetsTheDataOfTheFetch) {
  WriteCacheFile("\"old\"", kStale);
  TestCache cache = MakeCache();
  std::thread reader;
  cache.fetch = [&](Json::Value& out) {
    reader = std::thread([this] { EXPECT_EQ(MakeCache().Read(), "new"); });
    EXPECT_TRUE(WaitForLines(StartsWaiting()));
    out = "new";
    return true;
  };
  EXPECT_TRUE(cache.Update());
  reader.join();
  EXPECT_THAT(LogCapture::Take(), testing::UnorderedElementsAre(Starts(), StartsWaiting(),
                                                                Finishes(), FinishesWaiting()));
}

TEST_F(CacheProcessTest, AChildOfAFetchFindsItsParentUpdating) {
  WriteCacheFile("\"old\"", kStale);
  TestCache cache = MakeCache();
  cache.fetch = [&](Json::Value& out) {
    EXPECT_EQ(RunInChild([this] { EXPECT_EQ(MakeCache(false).Read(), "old"); }), 0);
    out = "new";
    return true;
  };
  EXPECT_TRUE(cache.Update());
  EXPECT_EQ(JoinAll(), 0);
  LogCapture::Clear();
}

TEST_F(CacheProcessTest, AChildOfAFetchWaitsForItsParent) {
  WriteCacheFile("\"old\"", kStale);
  TestCache cache = MakeCache();
  pid_t child = -1;
  cache.fetch = [&](Json::Value& out) {
    child = StartWaiter("new");
    EXPECT_TRUE(WaitForLines(StartsWaiting()));
    out = "new";
    return true;
  };
  EXPECT_TRUE(cache.Update());
  EXPECT_EQ(JoinChild(child), 0);
  LogCapture::Clear();
}

// --- A lock that cannot be opened

TEST_F(CacheProcessTest, ALockThatCannotBeOpenedFailsTheUpdateAtOnce) {
  const std::string lockFile = FileLock::getLockFilePath(lockName);
  std::filesystem::create_directories(lockFile);
  TestClock::SkipSleeps();
  for (const bool required : {true, false}) {
    WriteCacheFile("\"old\"", kStale);
    EXPECT_FALSE(MakeCache(required).Update());
    std::vector<LogLine> lines = CannotOpenLock("Is a directory");
    ExpectLog(lines);
    EXPECT_EQ(MakeCache(required).Read(), "old");
    lines.push_back(ReadFailed());
    ExpectLog(lines);
    EXPECT_EQ(TestClock::TakeSleeps(), std::vector<unsigned int>{});
  }
  std::filesystem::remove(path);
  TestCache cache = MakeCache();
  cache.defaultValue = "default";
  EXPECT_EQ(cache.Read(), "default");
  LogCapture::Clear();
  EXPECT_EQ(JoinAll(), 0);
}

TEST_F(CacheProcessTest, ALockThatCanNoLongerBeOpenedEndsTheWait) {
  WriteCacheFile("\"old\"", kStale);
  WriteText(pidFile, std::to_string(getppid()));
  const std::string lockFile = FileLock::getLockFilePath(lockName);
  TestClock::SkipSleeps([&] {
    std::filesystem::remove(lockFile);
    std::filesystem::create_directories(lockFile);
  });
  EXPECT_FALSE(MakeCache().Update());
  std::vector<LogLine> lines = CannotOpenLock("Is a directory");
  lines.insert(lines.begin(), StartsWaiting());
  lines.push_back(FinishesWaiting());
  ExpectLog(lines);
  EXPECT_EQ(TestClock::TakeSleeps().size(), 1U);
  std::filesystem::remove(pidFile);
}

TEST_F(CacheProcessTest, AnExclusiveLockStandsForAnUpdater) {
  WriteCacheFile("\"old\"", kStale);
  TestClock::SkipSleeps();
  FileLock updater(lockName);
  ASSERT_TRUE(updater.lock(LOCK_EX | LOCK_NB, 0));
  EXPECT_EQ(MakeCache(false).Read(), "old");
  EXPECT_EQ(TestClock::TakeSleeps(), std::vector<unsigned int>(100, 50000));
  ExpectLog({});
  EXPECT_EQ(JoinAll(), 0);
}

// --- Waiting

TEST_F(CacheProcessTest, AWaiterGetsTheFreshData) {
  WriteCacheFile("\"old\"", kStale);
  const Event finish;
  const pid_t updater = StartUpdater(finish);
  const pid_t waiter = StartWaiter("new");
  EXPECT_TRUE(WaitForLines(StartsWaiting()));
  finish.Cause();
  EXPECT_EQ(JoinChild(waiter), 0);
  EXPECT_EQ(JoinChild(updater), 0);
  EXPECT_EQ(LogCapture::ReadMirror(mirror).back(), FinishesWaiting());
}

TEST_F(CacheProcessTest, AWaiterGoesOnOnceTheFileIsFreshWhoeverUpdates) {
  WriteCacheFile("\"old\"", kStale);
  const Event finish;
  const pid_t updater = StartUpdater(finish);
  const pid_t waiter = StartWaiter("other");
  EXPECT_TRUE(WaitForLines(StartsWaiting()));
  WriteCacheFile("\"other\"");
  EXPECT_EQ(JoinChild(waiter), 0);
  finish.Cause();
  EXPECT_EQ(JoinChild(updater), 0);
}

TEST_F(CacheProcessTest, AReaderThatNeedsNoFreshDataDoesNotWait) {
  WriteCacheFile("\"old\"", kStale);
  const Event finish;
  StartUpdater(finish);
  EXPECT_EQ(MakeCache(false).Read(), "old");
  EXPECT_EQ(CountInMirror(StartsWaiting()), 0U);
  finish.Cause();
  EXPECT_EQ(JoinAll(), 1);
}

TEST_F(CacheProcessTest, AWaiterLooksAgainEvery300To1000MsWhileTheLockIsTakenAndTheFileStale) {
  WriteCacheFile("\"old\"", kStale);
  FileLock updater(lockName);
  ASSERT_TRUE(updater.lock(LOCK_EX | LOCK_NB, 0));
  size_t sleeps = 0;
  TestClock::SkipSleeps([&] {
    if (++sleeps == 302) WriteCacheFile("\"fresh\"");
  });
  EXPECT_EQ(MakeCache().Read(), "fresh");
  ExpectLog({StartsWaiting(), FinishesWaiting()});
  const std::vector<unsigned int> lengths = TestClock::TakeSleeps();
  // The first look, then two rounds of a sleep and a look.
  ASSERT_EQ(lengths.size(), 302U);
  for (size_t i = 0; i < lengths.size(); ++i) {
    if (i == 100 || i == 201) {
      EXPECT_GE(lengths[i], 300000U);
      EXPECT_LE(lengths[i], 1000000U);
    } else {
      EXPECT_EQ(lengths[i], 50000U) << i;
    }
  }
}

TEST_F(CacheProcessTest, AWaiterSleepsFrom300To1000MsBetweenTwoLooks) {
  const CountingGenerator draws;
  WriteCacheFile("\"old\"", kStale);
  WriteText(pidFile, std::to_string(getppid()));
  int sleeps = 0;
  TestClock::SkipSleeps([&] {
    if (++sleeps == kManySleeps) WriteCacheFile("\"fresh\"");
  });
  EXPECT_EQ(MakeCache().Read(), "fresh");
  ExpectManySleepsFrom(300, 1000);
  ExpectLog({StartsWaiting(), FinishesWaiting()});
  std::filesystem::remove(pidFile);
}

}  // namespace
