#include <sys/file.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <functional>
#include <memory>

#include "fault/fault.h"
#include "kelodrcore/file_lock.h"
#include "support/process.h"

using Fault::Outcome;
using KeloDRCore::FileLock;

namespace {

constexpr int kExclusive = LOCK_EX | LOCK_NB;

// Takes other effective ids on; what they are in the end is for the test to judge.
class LowerIds {
 public:
  explicit LowerIds(uid_t id) {
    EXPECT_EQ(setegid(id), 0);
    EXPECT_EQ(seteuid(id), 0);
  }
  ~LowerIds() {
    EXPECT_EQ(seteuid(0), 0);
    EXPECT_EQ(setegid(0), 0);
  }
  LowerIds(const LowerIds&) = delete;
  LowerIds& operator=(const LowerIds&) = delete;
};

class FileLockFaultTest : public FaultTest {
 protected:
  void SetUp() override {
    FaultTest::SetUp();
    if (!CanLock()) GTEST_SKIP() << "the lock directory is another user's";
    path = FileLock::getLockFilePath(name);
    lockDir = std::filesystem::path(path).parent_path();
  }
  void TearDown() override {
    std::error_code error;
    std::filesystem::remove_all(lockDir, error);
    FaultTest::TearDown();
  }

  bool IsFree() const {
    const Fault::Suspension suspension;
    FileLock other(name);
    return other.tryLock(kExclusive);
  }

  // A lock is held or not as its answer says.
  bool Take(FileLock& lock) const {
    const bool taken = lock.lock(kExclusive, 1);
    EXPECT_NE(taken, IsFree());
    return taken;
  }

  void SweepTaking(const std::function<void()>& prepare, const std::function<bool()>& run) {
    const auto check = [&](const Outcome& outcome) { CheckTaken(outcome); };
    SweepCalls({prepare, run, check});
    SweepMemory({prepare, run, check});
  }

  void CheckTaken(const Outcome& outcome) const;

  const std::string name = "fault-test-" + std::to_string(getpid()) + "/lock";
  std::string path;
  std::string lockDir;
};

// A lock that could not be had for want of its file is told last of all, one that is taken already
// is not told.
void FileLockFaultTest::CheckTaken(const Outcome& outcome) const {
  const std::vector<LogLine> none;
  if (outcome.succeeded || outcome.Failed("flock")) {
    EXPECT_EQ(outcome.log, none);
  } else if (!outcome.threw) {
    ASSERT_GE(outcome.log.size(), 2U);
    EXPECT_EQ(outcome.log.back().message.find("Bad fd ["), 0U);
  }
  EXPECT_TRUE(IsFree());
}

}  // namespace

TEST_F(FileLockFaultTest, ALockIsHeldOrNotGot) {
  const auto prepare = [&] { std::filesystem::remove_all(lockDir); };
  const auto run = [&] {
    FileLock lock(name);
    return Take(lock);
  };
  SweepTaking(prepare, run);
}

TEST_F(FileLockFaultTest, AReleasedLockIsFreeOrItsFailureTold) {
  std::unique_ptr<FileLock> lock;
  const auto prepare = [&] {
    lock = std::make_unique<FileLock>(name);
    EXPECT_TRUE(lock->lock(kExclusive, 1));
  };
  const auto run = [&] {
    lock->unlock();
    return true;
  };
  const auto check = [&](const Outcome& outcome) {
    const bool failed = outcome.FailedForGood("flock");
    EXPECT_EQ(IsFree(), !failed);
    EXPECT_EQ(outcome.log.size(), failed ? 1U : 0U);
    lock->unlock();
    EXPECT_TRUE(IsFree());
  };
  SweepCalls({prepare, run, check});
  lock.reset();
}

TEST_F(FileLockFaultTest, InterruptionsWithoutEndAreAFailureToRelease) {
  FileLock lock(name);
  ASSERT_TRUE(lock.lock(kExclusive, 1));
  Fault::Arm({EINTR, 1, Fault::kForGood});
  lock.unlock();
  EXPECT_GT(Fault::Disarm(), 1000);
  EXPECT_EQ(LogCapture::Take().size(), 1U);  // "Failed to unlock"
  EXPECT_FALSE(IsFree());
}

TEST_F(FileLockFaultTest, AReusedLockIsHeldOrNotGot) {
  const auto prepare = [] {};
  const auto run = [&] {
    FileLock lock(name);
    {
      const Fault::Suspension suspension;
      EXPECT_TRUE(lock.tryLock(kExclusive));
    }
    return Take(lock);
  };
  SweepTaking(prepare, run);
}

TEST_F(FileLockFaultTest, AProbeLeavesTheLockFree) {
  const auto prepare = [&] { std::filesystem::remove_all(lockDir); };
  const auto run = [&] {
    FileLock lock(name);
    return lock.tryLock(kExclusive);
  };
  const auto check = [&](const Outcome& /*outcome*/) { EXPECT_TRUE(IsFree()); };
  SweepCalls({prepare, run, check});
  SweepMemory({prepare, run, check});
}

// Power that cannot be given back is told; the ids are otherwise as they were.
TEST_F(FileLockFaultTest, PowerIsGivenBackOrItsFailureTold) {
  if (!IsRoot()) GTEST_SKIP() << "needs root";
  const uid_t user = PrivateUid();
  uid_t uidLeft = 0;
  gid_t gidLeft = 0;
  const auto prepare = [&] { std::filesystem::remove_all(lockDir); };
  const auto run = [&] {
    const LowerIds ids(user);
    FileLock lock(name);
    const bool taken = lock.lock(kExclusive, 1);
    uidLeft = geteuid();
    gidLeft = getegid();
    return taken;
  };
  const auto check = [&](const Outcome& outcome) {
    const bool kept = uidLeft != user || gidLeft != user;
    const bool failed = outcome.Failed("setresuid") || outcome.Failed("setresgid");
    const auto told =
        std::count_if(outcome.log.begin(), outcome.log.end(), [](const LogLine& line) {
          return line.message.find("CriticalSection") != std::string::npos;
        });
    EXPECT_TRUE(!kept || failed);
    EXPECT_EQ(told > 0, failed);
    EXPECT_TRUE(IsFree());
  };
  SweepCalls({prepare, run, check});
}
