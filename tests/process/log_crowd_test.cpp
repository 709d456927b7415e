// Background refreshes of a program whose threads log all the time. It has the C library's own
// syslog, with its locks, and nothing that stands before it.

#include <dlfcn.h>
#include <json/json.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <csignal>
#include <cstdarg>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <string>
#include <thread>
#include <vector>

#include "kelodrcore/file_lock.h"
#include "kelodrcore/sqlite_db.h"
#include "support/mounts.h"
#include "support/process.h"
#include "support/test_cache.h"

namespace {

using KeloDRCore::InsertCommand;
using KeloDRCore::SqliteDB;
using KeloDRCore::SqliteTableHandler;
using Clock = std::chrono::steady_clock;

constexpr int kRefreshes = 500;
constexpr int kCaches = 20;
constexpr int kThreads = 4;
constexpr std::chrono::seconds kLongest{60};  // ten times what a refresher that cannot log takes

// A call of syslog would take in the one that the other tests have.
void Log(const char* format, ...) {
  va_list none;
  va_start(none, format);
  vsyslog(LOG_DEBUG, format, none);
  va_end(none);
}

class LogCrowdTest : public testing::Test {
 protected:
  void SetUp() override {
    if (!kMayForkBesideThreads) GTEST_SKIP() << "AddressSanitizer does not survive such a fork";
    std::string pattern = std::filesystem::temp_directory_path() / "kelodrcore-test-XXXXXX";
    ASSERT_NE(mkdtemp(pattern.data()), nullptr);
    dir = pattern;
    ASSERT_EQ(dlsym(RTLD_DEFAULT, "syslog"), dlsym(RTLD_NEXT, "syslog")) << "not the real one";
    if (!CanLock()) GTEST_SKIP() << "the lock directory is another user's";
    ASSERT_EQ(prctl(PR_SET_CHILD_SUBREAPER, 1), 0);
    openlog("kelodrcore-test", 0, LOG_LOCAL7);
    SetAlarms(SIG_BLOCK, SIG_IGN);
  }
  void TearDown() override {
    SetAlarms(SIG_UNBLOCK, SIG_DFL);
    closelog();
    prctl(PR_SET_CHILD_SUBREAPER, 0);
    std::error_code error;
    std::filesystem::remove_all("/tmp/.kelodr_lock" + dir, error);
    std::filesystem::remove_all(dir, error);
  }

  // What a caller may do with a signal that its refreshers depend on.
  static void SetAlarms(int how, sighandler_t handler) {
    sigset_t alarms;
    sigemptyset(&alarms);
    sigaddset(&alarms, SIGALRM);
    pthread_sigmask(how, &alarms, nullptr);
    signal(SIGALRM, handler);
  }

  TestCache MakeCache(int number, bool alwaysRequired) const {
    TestCache cache(dir, std::to_string(number), -1, alwaysRequired, 0);  // is always stale
    cache.FetchGives("new");
    return cache;
  }

  void LogAndInsert(int number, const std::atomic<bool>& done) const {
    SqliteDB db(dir + "/db" + std::to_string(number), 100, "crowd");
    InsertCommand insert;
    insert.SetTable(SqliteTableHandler("t", "n INTEGER"));
    insert.AddFieldValue("n", number);
    for (int i = 0; !done; ++i) {
      Log("a line");
      if (i % 1000 != 0) continue;
      EXPECT_TRUE(db.InsertRecord(insert));
    }
  }

  // How many refreshers ended in one of the two ways that there are; those that do not end in time
  // are killed.
  struct Ends {
    int finished = 0;
    int couldNotLog = 0;
  };
  static Ends AwaitRefreshers() {
    Ends ends;
    const Clock::time_point deadline = Clock::now() + kLongest;
    int status = 0;
    for (pid_t child; (child = waitpid(-1, &status, WNOHANG)) >= 0;) {
      if (child > 0) {
        const bool endedByAlarm = WIFSIGNALED(status) && WTERMSIG(status) == SIGALRM;
        EXPECT_TRUE(status == 0 || endedByAlarm) << status;
        ++(endedByAlarm ? ends.couldNotLog : ends.finished);
      } else if (Clock::now() > deadline) {
        ADD_FAILURE() << "a refresher hangs";
        KillChildren();
      } else {
        std::this_thread::sleep_for(std::chrono::milliseconds(10));
      }
    }
    return ends;
  }

  static void KillChildren() {
    const std::string list = "/proc/self/task/" + std::to_string(getpid()) + "/children";
    std::ifstream in(list);
    for (pid_t child = 0; in >> child;) kill(child, SIGKILL);
  }

  std::string dir;
};

TEST_F(LogCrowdTest, NoRefresherHangsOrLeavesAClaimBehind) {
  for (int i = 0; i < kCaches; ++i) ASSERT_TRUE(MakeCache(i, false).UpdateWithData("old"));
  std::atomic<bool> done{false};
  std::vector<std::thread> threads;
  threads.reserve(kThreads + 1);
  for (int i = 0; i < kThreads; ++i) {
    threads.emplace_back([this, i, &done] { LogAndInsert(i, done); });
  }
  threads.emplace_back([&done] {
    while (!done) tzset();  // whose lock a line takes as well
  });
  for (int i = 0; i < kRefreshes; ++i) {
    const TestCache cache = MakeCache(i % kCaches, false);
    EXPECT_TRUE(cache.Update());
  }
  done = true;
  for (std::thread& thread : threads) thread.join();
  const Ends ends = AwaitRefreshers();
  std::cout << "[   ends   ] " << ends.finished << " refreshers finished, " << ends.couldNotLog
            << " could not log\n";
  EXPECT_GT(ends.finished, 0);
  for (int i = 0; i < kCaches; ++i) {
    const std::string pidFile = dir + "/" + std::to_string(i) + ".cached.pid";
    EXPECT_FALSE(std::filesystem::exists(pidFile)) << "a claim was left behind";
    EXPECT_TRUE(MakeCache(i, true).Update());
  }
}

}  // namespace
