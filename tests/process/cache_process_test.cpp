// What processes that share a cache file see of each other.

#include "process/cache_process.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <poll.h>
#include <sys/file.h>
#include <unistd.h>

#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <functional>
#include <memory>
#include <set>
#include <stdexcept>
#include <thread>

#include "kelodrcore/file_lock.h"
#include "kelodrcore/json_value.h"
#include "support/lock_test.h"
#include "support/process.h"
#include "support/test_clock.h"

namespace {

using KeloDRCore::FileLock;
namespace JsonValue = KeloDRCore::JsonValue;

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
  for (const std::string& name : NamesIn(cacheDir)) {
    if (name != "c.cached") std::filesystem::remove_all(cacheDir + "/" + name);
  }
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

TEST_F(CacheProcessTest, AFetchUpdatesAnotherCache) {
  TestCache other(cacheDir, "other", 1000, true, 0);
  other.FetchGives("other");
  TestCache cache = MakeCache();
  cache.fetch = [&](Json::Value& out) {
    out = other.Read();
    return true;
  };
  EXPECT_EQ(cache.Read(), "other");
  EXPECT_EQ(other.Remove(), 0);
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

// --- The refresher

TEST_F(CacheProcessTest, ARefresherUpdatesBehindTheCallersBack) {
  WriteCacheFile("\"old\"", kStale);
  const Event finish;
  TestCache cache = MakeCache(false);
  cache.fetch = [&, caller = getpid()](Json::Value& out) {
    out =
        atoi(ReadText(pidFile).c_str()) == getpid() && getpid() != caller && getsid(0) == getpid();
    return finish.Wait();
  };
  EXPECT_EQ(RunInChild([&] { EXPECT_EQ(cache.Read(), "old"); }), 0);
  finish.Cause();
  EXPECT_EQ(JoinAll(), 1);
  EXPECT_EQ(cache.Read(), true);
  ExpectLog({});
  EXPECT_EQ(LogCapture::ReadMirror(mirror), (std::vector<LogLine>{Starts(), Finishes()}));
}

TEST_F(CacheProcessTest, ARefresherEndsWith0WhateverTheFetchDoes) {
  WriteCacheFile("\"old\"", kStale);
  TestCache cache = MakeCache(false, -1);
  EXPECT_TRUE(cache.Update());
  EXPECT_EQ(JoinAll(), 1);
  cache.fetch = [](Json::Value&) -> bool { throw std::runtime_error("fetch"); };
  EXPECT_TRUE(cache.Update());
  EXPECT_EQ(JoinAll(), 1);
  EXPECT_EQ(cache.Read(), "old");
  EXPECT_EQ(JoinAll(), 1);
  EXPECT_EQ(LogCapture::ReadMirror(mirror),
            (std::vector<LogLine>{Starts(), FetchFailed(-1), Finishes(), Starts(), Finishes(),
                                  Starts(), Finishes()}));
}

TEST_F(CacheProcessTest, ARefresherHoldsUpNobodyWhoReadsTheCallersOutput) {
  WriteCacheFile("\"old\"", kStale);
  const Event finish;
  int output[2];
  ASSERT_EQ(pipe2(output, O_CLOEXEC), 0);
  EXPECT_EQ(RunInChild([&] {
              for (const int fd : {STDOUT_FILENO, STDERR_FILENO}) dup2(output[1], fd);
              close(output[1]);
              TestCache cache = MakeCache(false);
              cache.fetch = [&](Json::Value& out) {
                out = 1;
                return finish.Wait();
              };
              EXPECT_TRUE(cache.Update());
            }),
            0);
  close(output[1]);
  pollfd poller{output[0], POLLIN, 0};
  EXPECT_EQ(poll(&poller, 1, 10000), 1) << "no end of file while the refresher runs";
  char byte = 0;
  EXPECT_EQ(read(output[0], &byte, 1), 0);
  finish.Cause();
  EXPECT_EQ(JoinAll(), 1);
  close(output[0]);
}

std::string exitFile;

TEST_F(CacheProcessTest, ARefresherRunsNoExitHandlerAndFlushesNoStream) {
  WriteCacheFile("\"old\"", kStale);
  exitFile = Path("exit");
  constexpr int kReturned = 7;
  const int status = RunInChild([&] {
    FILE* stream = fopen(Path("stream").c_str(), "w");
    fputs("once", stream);
    atexit([] { std::ofstream(exitFile, std::ios::app) << "once"; });
    EXPECT_TRUE(MakeCache(false, -1).Update());
    exit(testing::Test::HasFailure() ? 1 : kReturned);
  });
  EXPECT_EQ(WEXITSTATUS(status), kReturned);
  EXPECT_EQ(JoinAll(), 1);
  EXPECT_EQ(ReadText(Path("stream")), "once");
  EXPECT_EQ(ReadText(exitFile), "once");
}

// The refresher may end before the process between it and the caller, which ignores its children as
// well: then the kernel takes its status, and nobody is left to be joined. So the test waits for
// the refresher's end itself: it holds the other end of a pipe until then.
TEST_F(CacheProcessTest, ACallerMayIgnoreItsChildren) {
  cacheDir = Path("new");
  int life[2];
  ASSERT_EQ(pipe2(life, O_CLOEXEC), 0);
  EXPECT_EQ(RunInChild([&] {
              signal(SIGCHLD, SIG_IGN);
              TestCache cache = MakeCache(false);
              EXPECT_TRUE(cache.UpdateWithData("old"));
              cache.FetchGives("new");
              EXPECT_TRUE(cache.Update());
            }),
            0);
  close(life[1]);
  char byte = 0;
  EXPECT_EQ(read(life[0], &byte, 1), 0);
  close(life[0]);
  EXPECT_LE(JoinAll(), 1);
  EXPECT_EQ(MakeCache().Read(), "new");
}

TEST_F(CacheProcessTest, ARefresherKeepsNoLockOfItsCaller) {
  WriteCacheFile("\"old\"", kStale);
  const Event fetching;
  const Event finish;
  auto held = std::make_unique<FileLock>(path + ".held");
  auto unused = std::make_unique<FileLock>(path + ".unused");
  ASSERT_TRUE(held->lock(LOCK_EX | LOCK_NB, 0));
  ASSERT_TRUE(unused->openLockedFile());
  TestCache cache = MakeCache(false);
  cache.fetch = [&](Json::Value& out) {
    held->unlock();  // is the caller's to release
    fetching.Cause();
    out = "new";
    return finish.Wait();
  };
  EXPECT_TRUE(cache.Update());
  EXPECT_TRUE(fetching.Wait());
  EXPECT_FALSE(FileLock(path + ".held").tryLock(LOCK_EX | LOCK_NB));
  held.reset();
  EXPECT_TRUE(FileLock(path + ".held").tryLock(LOCK_EX | LOCK_NB)) << "while the fetch runs";
  EXPECT_TRUE(unused->lock(LOCK_EX | LOCK_NB, 0));
  unused.reset();
  EXPECT_TRUE(FileLock(path + ".unused").tryLock(LOCK_EX | LOCK_NB));
  finish.Cause();
  EXPECT_EQ(JoinAll(), 1);
}

// Nothing waits for the refresher here: each round is one chance to be quicker than it.
TEST_F(CacheProcessTest, ALockThatIsClosedAfterTheForkIsFreeAtOnce) {
  constexpr int kRounds = 20;
  for (int round = 0; round < kRounds; ++round) {
    WriteCacheFile("\"old\"", kStale);
    auto held = std::make_unique<FileLock>(path + ".held");
    ASSERT_TRUE(held->lock(LOCK_EX | LOCK_NB, 0));
    TestCache cache = MakeCache(false);
    cache.fetch = [](Json::Value& out) {
      out = "new";
      return true;
    };
    EXPECT_TRUE(cache.Update());
    held.reset();
    EXPECT_TRUE(FileLock(path + ".held").tryLock(LOCK_EX | LOCK_NB));
    EXPECT_EQ(JoinAll(), 1);
  }
}

TEST_F(CacheProcessTest, AFailedForkFailsTheUpdate) {
  WriteCacheFile("\"old\"", kStale);
  LogCapture::MirrorTo("");
  constexpr int kDone = 7;  // a status that only the end of the child's body gives
  const pid_t child = StartChild([&] {
    const TestCache cache = MakeCache(false);
    // A sanitizer needs descriptors when it meets JsonCpp's reader and writer for the first time.
    EXPECT_EQ(JsonValue::toString(cache.GetCachedData()), "\"old\"");
    const std::set<int> open = OpenDescriptors();
    rlim_t limit = 0;
    // Two free descriptors: enough for the lock and the pid file, too few to fork with.
    for (int free = 0; free < 2; ++limit) {
      if (open.count(static_cast<int>(limit)) == 0) ++free;
    }
    LowerLimit(RLIMIT_NOFILE, limit);
    const LogLine failed =
        Warn("cache.cpp", "Update", "Failed to fork(). errno=[24/Too many open files]");
    EXPECT_FALSE(cache.Update());
    ExpectLog({failed});
    EXPECT_EQ(cache.Read(), "old");
    ExpectLog({failed, ReadFailed()});
    return kDone;
  });
  const int status = JoinChild(child);
  EXPECT_TRUE(WIFEXITED(status));
  EXPECT_EQ(WEXITSTATUS(status), kDone);
}

}  // namespace
