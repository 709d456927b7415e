// The fixture of the tests in which processes share a cache file.

#ifndef KELODRCORE_TESTS_PROCESS_CACHE_PROCESS_H_
#define KELODRCORE_TESTS_PROCESS_CACHE_PROCESS_H_

#include <fcntl.h>
#include <poll.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <ctime>
#include <functional>
#include <string>
#include <vector>

#include "kelodrcore/file_lock.h"
#include "support/test_cache.h"

constexpr int kStale = 1100;  // seconds; above the time-out of MakeCache()

// An event that one process waits for and another one causes.
class Event {
 public:
  Event() { EXPECT_EQ(pipe2(ends, O_CLOEXEC), 0); }
  ~Event() {
    close(ends[0]);
    close(ends[1]);
  }
  Event(const Event&) = delete;
  Event& operator=(const Event&) = delete;

  void Cause() const { EXPECT_EQ(write(ends[1], "x", 1), 1); }

  // False when it did not come within a minute.
  bool Wait() const {
    pollfd poller{ends[0], POLLIN, 0};
    char byte = 0;
    return poll(&poller, 1, 60000) == 1 && read(ends[0], &byte, 1) == 1;
  }

 private:
  int ends[2] = {-1, -1};
};

// The test process becomes the parent of the refreshers that its children and it leave to nobody.
class CacheProcessTest : public CacheFixture {
 protected:
  void SetUp() override {
    CacheFixture::SetUp();
    ASSERT_EQ(prctl(PR_SET_CHILD_SUBREAPER, 1), 0);
    mirror = Path("log");
    LogCapture::MirrorTo(mirror);
  }
  void TearDown() override {
    CacheFixture::TearDown();
    EXPECT_EQ(prctl(PR_SET_CHILD_SUBREAPER, 0), 0);
  }

  // Waits for every child, refreshers too; how many there were. Each must have exited with 0.
  static int JoinAll() {
    int count = 0;
    for (int status = 0; waitpid(-1, &status, 0) > 0; ++count) EXPECT_EQ(status, 0);
    return count;
  }

  // How many processes have logged this line so far.
  size_t CountInMirror(const LogLine& line) const {
    const std::vector<LogLine> lines = LogCapture::ReadMirror(mirror);
    return static_cast<size_t>(std::count(lines.begin(), lines.end(), line));
  }

  // Waits until the line has been logged so often; false when that took more than a minute.
  bool WaitForLines(const LogLine& line, size_t count = 1) const {
    const time_t deadline = time(nullptr) + 60;
    while (CountInMirror(line) < count) {
      if (time(nullptr) > deadline) return false;
      const timespec rest{0, 10000000};
      nanosleep(&rest, nullptr);
    }
    return true;
  }

  LogLine StartsWaiting() const {
    return Debug("cache.cpp", "Update", "start to block wait cache [" + path + "] ");
  }
  LogLine FinishesWaiting() const {
    return Debug("cache.cpp", "Update", "finish to block wait cache [" + path + "] ");
  }
  LogLine CannotUnlink(const std::string& reason) const {
    return Notice("cache.cpp", "UnsetUpdating",
                  "Failed to unlink [" + pidFile + "] with ret[-1](" + reason + ")");
  }

  // The lines of a cache that finds its lock file not to be opened.
  std::vector<LogLine> CannotOpenLock(const std::string& reason) const {
    const std::string file = KeloDRCore::FileLock::getLockFilePath(lockName);
    return {Err("file_lock.cpp", "openLockedFile",
                "Failed to open lock file[" + file + "], errno=" + reason),
            Err("file_lock.cpp", "lock", "Bad fd [-1] to lock [" + file + "]")};
  }

  // A child that has claimed the update and is fetching; it waits for `finish`, then gives "new".
  pid_t StartUpdater(const Event& finish) const {
    const Event fetching;
    const pid_t updater = StartChild([&] {
      TestCache cache = MakeCache();
      cache.fetch = [&](Json::Value& out) {
        fetching.Cause();
        out = "new";
        return finish.Wait();
      };
      EXPECT_TRUE(cache.Update());
      return 0;
    });
    EXPECT_TRUE(fetching.Wait());
    return updater;
  }

  // A child that updates with required data, fetches nothing and ends with this data in memory.
  pid_t StartWaiter(const Json::Value& expected) const {
    return StartChild([&] {
      TestCache cache = MakeCache();
      cache.fetch = [](Json::Value&) {
        ADD_FAILURE() << "fetched";
        return false;
      };
      EXPECT_TRUE(cache.Update());
      EXPECT_EQ(cache.GetCachedData(), expected);
      return 0;
    });
  }

  std::string mirror;
};

#endif  // KELODRCORE_TESTS_PROCESS_CACHE_PROCESS_H_
