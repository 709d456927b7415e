// Signals that come all the time, from a timer that interrupts every call that can be interrupted.

#include <sys/file.h>
#include <sys/time.h>
#include <unistd.h>

#include <csignal>
#include <filesystem>
#include <functional>

#include "kelodrcore/file.h"
#include "kelodrcore/file_lock.h"
#include "kelodrcore/json_value.h"
#include "process/cache_process.h"
#include "support/process.h"

namespace {

namespace File = KeloDRCore::File;
namespace JsonValue = KeloDRCore::JsonValue;
using KeloDRCore::FileLock;

volatile sig_atomic_t signals = 0;

class SignalStormTest : public CacheProcessTest {
 protected:
  // Runs `body` every time anew, until so many signals have come.
  static void RunInStorm(const std::function<void()>& body) {
    constexpr int kSignals = 100;
    EXPECT_EQ(RunInChild([&] {
                Handle(
                    SIGALRM, [](int /*number*/) { signals = signals + 1; }, 0);
                const itimerval every{{0, 5000}, {0, 5000}};
                ASSERT_EQ(setitimer(ITIMER_REAL, &every, nullptr), 0);
                while (signals < kSignals && !testing::Test::HasFailure()) body();
                const itimerval never{};
                setitimer(ITIMER_REAL, &never, nullptr);
              }),
              0);
  }

  static Json::Value LargeDocument() {
    Json::Value document(Json::arrayValue);
    for (int i = 0; i < 20000; ++i) document.append(i);
    return document;
  }
};

TEST_F(SignalStormTest, LocksAreTakenAndReleased) {
  RunInStorm([this] {
    FileLock lock(lockName + "/below");
    EXPECT_TRUE(lock.lock(LOCK_EX | LOCK_NB, 0));
    EXPECT_FALSE(FileLock(lockName + "/below").lock(LOCK_EX | LOCK_NB, 0));
    lock.unlock();
    EXPECT_TRUE(FileLock(lockName + "/below").tryLock(LOCK_EX | LOCK_NB));
    std::filesystem::remove_all(FileLock::getLockFilePath(lockName));
  });
}

TEST_F(SignalStormTest, DocumentsAreReplacedAndRead) {
  const Json::Value document = LargeDocument();
  RunInStorm([&] {
    Json::Value read;
    EXPECT_TRUE(JsonValue::toFile(document, Path("document")));
    EXPECT_TRUE(JsonValue::fromFile(read, Path("document")));
    EXPECT_EQ(read, document);
    EXPECT_TRUE(File::Write(Path("file"), document));
    EXPECT_TRUE(File::Read(Path("file"), read));
    EXPECT_EQ(read, document);
  });
}

TEST_F(SignalStormTest, DirectoriesAreMadeAndRemoved) {
  RunInStorm([this] {
    EXPECT_TRUE(File::CreateDir(Path("a/b"), 0700));
    EXPECT_TRUE(File::RemoveDir(Path("a")));
  });
}

TEST_F(SignalStormTest, CachesAreUpdatedAndRead) {
  RunInStorm([this] {
    TestCache cache = MakeCache();
    cache.FetchGives("new");
    EXPECT_TRUE(cache.Update());
    EXPECT_EQ(MakeCache().Read(), "new");
    LogCapture::Clear();
  });
}

TEST_F(SignalStormTest, CachesAreRefreshedInTheBackground) {
  ASSERT_TRUE(MakeCache().UpdateWithData("old"));
  RunInStorm([this] {
    TestCache cache = MakeCache(false, 0, -1);  // is always stale
    cache.FetchGives("new");
    EXPECT_TRUE(cache.Update());
  });
  EXPECT_GT(JoinAll(), 0);
  TestCache cache = MakeCache();
  cache.FetchGives("last");
  EXPECT_TRUE(cache.Update());
  EXPECT_EQ(MakeCache().Read(), "last");
  LogCapture::Clear();
}

}  // namespace
