// A claim whose pid file cannot be removed at once, and a document that is replaced while it is
// read.

#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <csignal>
#include <filesystem>
#include <memory>
#include <vector>

#include "fault/interception.h"
#include "kelodrcore/file_lock.h"
#include "support/process.h"
#include "support/test_cache.h"

namespace {

using Fault::Interception;

class InterceptedCacheTest : public CleanTest {
 protected:
  void SetUp() override {
    CleanTest::SetUp();
    if (!CanLock()) GTEST_SKIP() << "the lock directory is another user's";
    cache = std::make_unique<TestCache>(dir, "c", 1000, true, 0);
    cache->FetchGives(1);
  }
  void TearDown() override {
    const std::string lock = KeloDRCore::FileLock::getLockFilePath(Path("c.cached.lock"));
    unlink(lock.c_str());
    rmdir(lock.substr(0, lock.rfind('/')).c_str());
    CleanTest::TearDown();
  }

  // Updates the cache; the first calls that are to remove the pid file fail with these errors.
  void UpdateWhileRemovalFails(const std::vector<int>& errors) {
    std::vector<std::unique_ptr<Interception>> failures;
    cache->fetch = [&](Json::Value& out) {
      for (const int error : errors) {
        const int number = static_cast<int>(failures.size()) + 1;
        failures.push_back(std::make_unique<Interception>("unlink", number, error));
      }
      out = 1;
      return true;
    };
    EXPECT_TRUE(cache->Update());
    for (const auto& failure : failures) EXPECT_TRUE(failure->HasRun());
  }

  LogLine Starts() const {
    return Debug("cache.cpp", "SetUpdating",
                 "---> Start to update cache [" + Path("c.cached") + "]");
  }
  LogLine CannotUnlink(const std::string& reason) const {
    return Notice("cache.cpp", "UnsetUpdating",
                  "Failed to unlink [" + Path("c.cached.pid") + "] with ret[-1](" + reason + ")");
  }
  LogLine Finishes() const {
    return Debug("cache.cpp", "UnsetUpdating",
                 "<--- Finish to update cache [" + Path("c.cached") + "]");
  }

  using Names = std::vector<std::string>;
  std::unique_ptr<TestCache> cache;
};

TEST_F(InterceptedCacheTest, IsReleasedAtTheThirdAttempt) {
  UpdateWhileRemovalFails({EIO, EACCES});
  ExpectLog({Starts(), Finishes()});
  EXPECT_EQ(NamesIn(dir), Names{"c.cached"});
}

TEST_F(InterceptedCacheTest, IsGivenUpAfterTheThirdAttempt) {
  UpdateWhileRemovalFails({EIO, EIO, EACCES});
  ExpectLog({Starts(), CannotUnlink("Permission denied"), Finishes()});
  EXPECT_EQ(NamesIn(dir), (Names{"c.cached", "c.cached.pid"}));
}

TEST_F(InterceptedCacheTest, IsNotTriedAgainWhereThePidFileIsGone) {
  UpdateWhileRemovalFails({ENOENT});
  ExpectLog({Starts(), CannotUnlink("No such file or directory"), Finishes()});
  EXPECT_EQ(NamesIn(dir), (Names{"c.cached", "c.cached.pid"}));
}

// Whichever call fails while the claim is released.
TEST_F(InterceptedCacheTest, TheClaimOfAnotherLiveProcessStays) {
  const std::string pidFile = Path("c.cached.pid");
  const std::string other = std::to_string(getppid());
  for (const char* call : {"openat", "fstat", "read", "fstatat"}) {
    bool hasRun = true;
    for (int number = 1; hasRun; ++number) {
      std::unique_ptr<Interception> failure;
      cache->isValid = [&](const Json::Value& /*data*/) {
        if (ReadText(pidFile).empty()) return false;  // before the claim
        WriteText(pidFile, other);
        failure = std::make_unique<Interception>(call, number, EIO);
        return false;  // nothing is written: the release comes next
      };
      EXPECT_FALSE(cache->Update());
      hasRun = failure->HasRun();
      failure.reset();
      EXPECT_EQ(ReadText(pidFile), other) << call << " " << number;
      unlink(pidFile.c_str());
      LogCapture::Clear();
    }
  }
}

// The caller waits until its refresher has let go of its locks, but not for a dead one.
TEST_F(InterceptedCacheTest, ARefresherThatDiesAtOnceHoldsNobodyUp) {
  WriteText(Path("c.cached"), R"({"cached_data": "old"})");
  KeloDRCore::FileLock open(Path("c.cached.lock"));
  ASSERT_TRUE(open.openLockedFile());
  const Interception death("dup3", 1, []() -> int { _exit(0); });
  const TestCache lazy(dir, "c", 1000, false, 0);
  EXPECT_TRUE(lazy.Update());
  EXPECT_FALSE(death.HasRun()) << "in the caller";
}

// Such a process has the pipe open, too, through which the refresher tells that it has let go.
TEST_F(InterceptedCacheTest, AProcessForkedAtTheSameTimeHoldsNobodyUp) {
  WriteText(Path("c.cached"), R"({"cached_data": "old"})");
  pid_t other = -1;
  const Interception meanwhile("fork", 1, [&] {
    other = fork();
    if (other == 0) {
      prctl(PR_SET_PDEATHSIG, SIGKILL);
      pause();
    }
    return Fault::kGoOn;
  });
  EXPECT_TRUE(TestCache(dir, "c", 1000, false, 0).Update());
  ASSERT_GT(other, 0);
  EXPECT_EQ(waitpid(other, nullptr, WNOHANG), 0) << "was waited for";
  kill(other, SIGKILL);
  EXPECT_EQ(waitpid(other, nullptr, 0), other);
}

TEST_F(InterceptedCacheTest, ADocumentThatIsReplacedWhileItIsReadIsReadAgain) {
  const std::string path = Path("c.cached");
  WriteText(path, R"({"cached_data": "old"})");
  std::filesystem::last_write_time(
      path, std::filesystem::last_write_time(path) - std::chrono::seconds(10));
  const Interception other("read", 1, [&] {
    EXPECT_EQ(unlink(path.c_str()), 0);
    WriteText(path, R"({"cached_data": "new"})");
    return Fault::kGoOn;
  });
  EXPECT_EQ(cache->Read(), "old");
  EXPECT_TRUE(other.HasRun());
  EXPECT_EQ(cache->Read(), "new");
}

}  // namespace
