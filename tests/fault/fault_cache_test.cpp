#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <memory>

#include "fault/fault.h"
#include "kelocore.h"
#include "kelodrcore/file_lock.h"
#include "kelodrcore/json_value.h"
#include "support/process.h"
#include "support/test_cache.h"

namespace JsonValue = KeloDRCore::JsonValue;
using Fault::Outcome;
using KeloDRCore::FileLock;

namespace {

constexpr long kTimeout = 1000;
constexpr char kOld[] = R"({"cached_data":"old","max_updated_time":7})";

class CacheFaultTest : public FaultTest {
 protected:
  void SetUp() override {
    FaultTest::SetUp();
    if (!CanLock()) GTEST_SKIP() << "the lock directory is another user's";
    cacheDir = Path("caches");
    path = cacheDir + "/c.cached";
    mayThrowJsonError = true;
    interruptedStride = 47;
  }
  void TearDown() override {
    const std::filesystem::path lock = FileLock::getLockFilePath(path + ".lock");
    std::error_code error;
    std::filesystem::remove_all(lock.parent_path(), error);
    FaultTest::TearDown();
  }

  // A cache that is in memory and, unless it is to be fresh, too old in its file.
  void MakeCache(bool alwaysRequired, bool isFresh);
  void WriteOld(bool isFresh) const;

  // What the file holds, "old" or "new"; anything else is a failure.
  std::string Document() const;
  void CheckState(const Outcome& outcome) const;

  std::string cacheDir;
  std::string path;
  std::unique_ptr<TestCache> cache;
};

void CacheFaultTest::WriteOld(bool isFresh) const {
  WriteText(path, kOld);
  const time_t modified = time(nullptr) - (isFresh ? 0 : 2 * kTimeout);
  const timespec times[2] = {{modified, 0}, {modified, 0}};
  EXPECT_EQ(utimensat(AT_FDCWD, path.c_str(), times, 0), 0);
}

void CacheFaultTest::MakeCache(bool alwaysRequired, bool isFresh) {
  std::filesystem::remove_all(cacheDir);
  std::filesystem::create_directory(cacheDir);  // faster than the cache, which runs a program
  cache = std::make_unique<TestCache>(cacheDir, "c", kTimeout, alwaysRequired, 0);
  cache->fetch = [](Json::Value& out) {
    const Fault::Suspension suspension;
    out = "new";
    return true;
  };
  WriteOld(isFresh);
  EXPECT_EQ(cache->GetCachedData(), "old");
}

std::string CacheFaultTest::Document() const {
  Json::Value document;
  EXPECT_TRUE(JsonValue::fromFile(document, path)) << ReadText(path);
  const std::string data = document["cached_data"].asString();
  EXPECT_TRUE(data == "old" || (data == "new" && document["max_updated_time"].isInt())) << data;
  return data;
}

// The document is whole, and nothing of an update stays: no lock, no claim, no temporary, unless
// its removal itself failed, again and again, or the pid file could not be read, which might have
// been another's then. A claim that stays is left for the next update.
void CacheFaultTest::CheckState(const Outcome& outcome) const {
  Document();
  FileLock lock(path + ".lock");
  EXPECT_TRUE(lock.tryLock(LOCK_EX | LOCK_NB));
  const bool pidFileUnread = outcome.Failed("openat") || outcome.Failed("fstat") ||
                             outcome.Failed("read") || outcome.Failed("new");
  const bool pidFileKept =
      pidFileUnread ||
      (outcome.Failed("unlink") && (outcome.failures >= 3 || ReadText(path + ".pid").empty()));
  const bool temporaryKept = outcome.Failed("unlinkat") || outcome.Failed("flock");
  for (const std::string& name : NamesIn(cacheDir)) {
    EXPECT_TRUE(name == "c.cached" || (pidFileKept && name == "c.cached.pid") ||
                (temporaryKept && name == ".c.cached.kelodr-" + std::to_string(geteuid())))
        << name;
  }
}

}  // namespace

TEST_F(CacheFaultTest, ACacheHasItsPathOrTheFallback) {
  const auto prepare = [this] { std::filesystem::remove_all(cacheDir); };
  const auto run = [this] {
    const TestCache made(cacheDir, "c", kTimeout, false, 0);
    return true;
  };
  const auto check = [this](const Outcome& outcome) {
    const LogLine told = Err("cache.cpp", "GetCachedPath", "Failed to create [" + cacheDir + "]");
    const bool isTold = std::count(outcome.log.begin(), outcome.log.end(), told) == 1;
    const bool isThere = std::filesystem::is_directory(cacheDir);
    EXPECT_TRUE(isThere || isTold || outcome.threw);
  };
  SweepCalls({prepare, run, check});
  SweepMemory({prepare, run, check});
}

TEST_F(CacheFaultTest, AReadGivesTheDocumentOrTheDefault) {
  Json::Value read;
  const auto prepare = [this] {
    MakeCache(false, true);
    cache = std::make_unique<TestCache>(cacheDir, "c", kTimeout, false, 0);
    cache->defaultValue = "default";
  };
  const auto run = [&] {
    read = cache->GetCachedData();
    return true;
  };
  const auto check = [&](const Outcome& outcome) {
    EXPECT_TRUE(outcome.threw || read == "old" || (read == "default" && !outcome.log.empty()));
    EXPECT_TRUE(!outcome.failed.empty() || read == "old");
    CheckState(outcome);
  };
  SweepCalls({prepare, run, check});
  SweepMemory({prepare, run, check});
  SweepTransfers({prepare, run, check});
}

TEST_F(CacheFaultTest, AnUpdateIsMadeOrFails) {
  const LogLine withoutLock =
      Notice("cache.cpp", "UnsetUpdating", "Failed to lock to unset cache[" + path + "]");
  size_t releasesWithoutLock = 0;
  const auto prepare = [this] { MakeCache(true, false); };
  const auto run = [this] {
    {
      const Fault::Suspension suspension;
      WriteOld(false);
    }
    return cache->Update();
  };
  const auto check = [&](const Outcome& outcome) {
    // An updater that could not be told apart from none is waited for, and then there is no news.
    const bool waited = std::any_of(
        outcome.log.begin(), outcome.log.end(),
        [](const LogLine& line) { return line.message.find("start to block wait cache") == 0; });
    EXPECT_TRUE(!outcome.succeeded || waited || Document() == "new");
    CheckState(outcome);
    releasesWithoutLock +=
        static_cast<size_t>(std::count(outcome.log.begin(), outcome.log.end(), withoutLock));
  };
  // Whoever holds the lock is waited for: longer than the longest wait for it (a minute).
  heldForGood = 1500;
  SweepCalls({prepare, run, check});
  releasesWithoutLock = 0;
  SweepMemory({prepare, run, check});
  EXPECT_GT(releasesWithoutLock, 0U) << "a lock that there is no memory for is told";
  SweepTransfers({prepare, run, check});
}

TEST_F(CacheFaultTest, AWriteIsMadeOrTold) {
  const auto prepare = [this] { MakeCache(true, false); };
  const auto run = [this] { return cache->UpdateWithData("new"); };
  const auto check = [this](const Outcome& outcome) {
    EXPECT_TRUE(!outcome.succeeded || Document() == "new");
    EXPECT_EQ(outcome.log.empty(), outcome.succeeded || outcome.threw);
    CheckState(outcome);
  };
  SweepCalls({prepare, run, check});
  SweepMemory({prepare, run, check});
  SweepTransfers({prepare, run, check});
}

// The refresher holds the write end until it has ended.
TEST_F(CacheFaultTest, ARefreshInTheBackgroundLeavesTheOldOrTheNewDocument) {
  const auto prepare = [this] { MakeCache(false, false); };
  const auto run = [this] {
    int life[2];
    {
      const Fault::Suspension suspension;
      WriteOld(false);
      EXPECT_EQ(pipe2(life, O_CLOEXEC), 0);
    }
    const auto wait = [this](const int* ends) {
      const Fault::Suspension suspension;
      close(ends[1]);
      char byte = 0;
      EXPECT_EQ(read(ends[0], &byte, 1), 0);
      close(ends[0]);
      // It lets go of the pipe shortly before it is dead to whoever reads a claim that it left.
      while (KLIBCProcAlive(KLIBCReadPidFile((path + ".pid").c_str())) == 1) sched_yield();
    };
    const std::unique_ptr<int, decltype(wait)> waitAtEnd(life, wait);
    return cache->Update();
  };
  const auto check = [this](const Outcome& outcome) {
    EXPECT_TRUE(!outcome.failed.empty() || Document() == "new");
    CheckState(outcome);
  };
  interruptedStride = 151;  // most of the calls are those of an update that is waited for
  SweepCalls({prepare, run, check});
  SweepMemory({prepare, run, check});
  SweepTransfers({prepare, run, check});
}

TEST_F(CacheFaultTest, ARemovalAnswersWhatUnlinkDid) {
  const auto prepare = [this] { MakeCache(false, true); };
  const auto run = [this] {
    {
      const Fault::Suspension suspension;
      WriteOld(true);
    }
    return cache->Remove() == 0;
  };
  const auto check = [this](const Outcome& outcome) {
    EXPECT_EQ(access(path.c_str(), F_OK) == 0, !outcome.succeeded);
  };
  SweepCalls({prepare, run, check});
}
