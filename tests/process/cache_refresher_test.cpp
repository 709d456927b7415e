// The process that refreshes a cache behind its caller's back.

#include <fcntl.h>
#include <gmock/gmock.h>
#include <poll.h>
#include <sys/file.h>
#include <unistd.h>

#include <csignal>
#include <cstdlib>
#include <fstream>
#include <memory>
#include <set>
#include <stdexcept>

#include "kelodrcore/file_lock.h"
#include "kelodrcore/json_value.h"
#include "process/cache_process.h"
#include "support/process.h"

namespace {

using KeloDRCore::FileLock;
namespace JsonValue = KeloDRCore::JsonValue;

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

// Only its first line is under a time limit: no alarm comes later, and what the caller made of that
// signal stays.
TEST_F(CacheProcessTest, AFetchIsUnderNoTimeLimit) {
  WriteCacheFile("\"old\"", kStale);
  TestCache cache = MakeCache(false);
  cache.fetch = [](Json::Value& out) {
    sigset_t mask;
    sigemptyset(&mask);
    sigprocmask(SIG_BLOCK, nullptr, &mask);
    out = alarm(0) == 0 && sigismember(&mask, SIGALRM) == 1 && signal(SIGALRM, SIG_DFL) == SIG_IGN;
    return true;
  };
  EXPECT_EQ(RunInChild([&] {
              sigset_t alarms;
              sigemptyset(&alarms);
              sigaddset(&alarms, SIGALRM);
              sigprocmask(SIG_BLOCK, &alarms, nullptr);
              signal(SIGALRM, SIG_IGN);
              EXPECT_TRUE(cache.Update());
            }),
            0);
  EXPECT_EQ(JoinAll(), 1);
  EXPECT_EQ(cache.Read(), true);
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
