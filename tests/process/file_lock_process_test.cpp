#include <fcntl.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <filesystem>
#include <memory>
#include <string>
#include <vector>

#include "kelodrcore/file_lock.h"
#include "support/lock_test.h"
#include "support/process.h"

namespace {

using KeloDRCore::FileLock;
using LockCalls::flocks;
using LockCalls::sleeps;

constexpr uid_t kUser = 65534;

using FileLockProcessTest = LockTest;

ino_t InodeOf(const std::string& path) {
  struct stat status = {};
  return lstat(path.c_str(), &status) == 0 ? status.st_ino : 0;
}

// Puts another file in the place of the one at `path`.
void Replace(const std::string& path) {
  WriteText(path + ".new", "");
  ASSERT_EQ(rename((path + ".new").c_str(), path.c_str()), 0);
}

// Whether this process has the file that is now at `path` open.
bool HasOpen(const std::string& path) {
  for (const int fd : OpenDescriptors()) {
    struct stat status = {};
    if (fstat(fd, &status) == 0 && status.st_ino == InodeOf(path)) return true;
  }
  return false;
}

// --- a lock file that goes away ------------------------------------------------------------------

TEST_F(FileLockProcessTest, ARemovedLockFileIsMadeAnewByTheNextLock) {
  FileLock lock(name);
  ASSERT_TRUE(lock.lock(LOCK_EX | LOCK_NB, 0));
  lock.unlock();
  ASSERT_EQ(unlink(path.c_str()), 0);
  EXPECT_TRUE(lock.lock(LOCK_EX | LOCK_NB, 0));
  EXPECT_TRUE(HasOpen(path));
  EXPECT_FALSE(IsFree());
}

TEST_F(FileLockProcessTest, AReplacedLockFileIsOpenedAnewByTheNextLock) {
  FileLock lock(name);
  ASSERT_TRUE(lock.lock(LOCK_EX | LOCK_NB, 0));
  Replace(path);
  EXPECT_TRUE(IsFree());
  EXPECT_TRUE(lock.lock(LOCK_EX | LOCK_NB, 0));
  EXPECT_FALSE(IsFree());
  EXPECT_EQ(DescriptorOf(path + " (deleted)"), -1) << "the old file was left open";
}

TEST_F(FileLockProcessTest, TheNextLockExcludesAHolderOfTheReplacement) {
  FileLock lock(name);
  ASSERT_TRUE(lock.lock(LOCK_EX | LOCK_NB, 0));
  Replace(path);
  const Holder holder([this] { return Hold(LOCK_EX | LOCK_NB); });
  EXPECT_FALSE(lock.lock(LOCK_EX | LOCK_NB, 0));
}

TEST_F(FileLockProcessTest, ADescriptorThatBecameAnotherKindOfFileIsOpenedAnew) {
  FileLock lock(name);
  ASSERT_TRUE(lock.openLockedFile());
  const int fd = DescriptorOf(path);
  const int device = open("/dev/null", O_RDONLY | O_CLOEXEC);
  ASSERT_EQ(dup3(device, fd, O_CLOEXEC), fd);
  close(device);
  EXPECT_TRUE(lock.lock(LOCK_EX | LOCK_NB, 0));
  EXPECT_TRUE(HasOpen(path));
  EXPECT_FALSE(IsFree());
}

TEST_F(FileLockProcessTest, AFileReplacedBetweenOpeningAndLockingIsNotHeld) {
  FileLock lock(name);
  LockCalls::beforeFlock = [this](int number) {
    if (number == 1) Replace(path);
  };
  EXPECT_TRUE(lock.lock(LOCK_EX | LOCK_NB, 0));
  EXPECT_EQ(flocks, 2);
  EXPECT_TRUE(sleeps.empty());
  EXPECT_FALSE(IsFree());
}

TEST_F(FileLockProcessTest, AFileRemovedBetweenOpeningAndLockingIsNotHeld) {
  FileLock lock(name);
  LockCalls::beforeFlock = [this](int number) {
    if (number == 1) unlink(path.c_str());
  };
  EXPECT_TRUE(lock.lock(LOCK_EX | LOCK_NB, 0));
  EXPECT_TRUE(HasOpen(path));
  EXPECT_FALSE(IsFree());
}

TEST_F(FileLockProcessTest, AHolderOfTheReplacementKeepsTheLockFromTheOldFile) {
  FileLock lock(name);
  FileLock newcomer(name);
  LockCalls::sleepAtOnce = true;
  LockCalls::beforeFlock = [&, this](int number) {
    if (number != 1) return;
    Replace(path);
    EXPECT_TRUE(newcomer.lock(LOCK_EX | LOCK_NB, 0));
  };
  EXPECT_FALSE(lock.lock(LOCK_EX | LOCK_NB, 1));
  EXPECT_EQ(sleeps, std::vector<useconds_t>(20, 50000));
}

TEST_F(FileLockProcessTest, AFileReplacedAgainAndAgainIsGivenUpAfterTheTimeout) {
  LockCalls::sleepAtOnce = true;
  LockCalls::beforeFlock = [this](int) { Replace(path); };
  FileLock lock(name);
  EXPECT_FALSE(lock.lock(LOCK_EX | LOCK_NB, 0));
  EXPECT_EQ(flocks, 11) << "ten successors are tried at once";
  EXPECT_TRUE(sleeps.empty());
  EXPECT_FALSE(lock.lock(LOCK_EX | LOCK_NB, 2));
  EXPECT_EQ(sleeps, std::vector<useconds_t>(40, 50000));
  EXPECT_TRUE(IsFree());
}

TEST_F(FileLockProcessTest, ALockFileThatCannotBeOpenedAnewFailsAtOnce) {
  LockCalls::beforeFlock = [this](int) {
    unlink(path.c_str());
    std::filesystem::create_directory(path);
  };
  FileLock lock(name);
  EXPECT_FALSE(lock.lock(LOCK_EX | LOCK_NB, 5));
  ExpectLog(CannotOpen(path, "Is a directory"));
  EXPECT_EQ(flocks, 1);
  EXPECT_TRUE(sleeps.empty());
}

TEST_F(FileLockProcessTest, ALockWhoseDirectoryCannotBeMadeAnewFailsAtOnce) {
  LockCalls::beforeFlock = [this](int) {
    std::filesystem::remove_all(path);
    WriteText(path, "");
  };
  FileLock lock(name + "/lock");
  EXPECT_FALSE(lock.lock(LOCK_EX | LOCK_NB, 5));
  const std::vector<LogLine> lines = LogCapture::Take();
  ASSERT_FALSE(lines.empty());
  EXPECT_EQ(lines.back(), Err("file_lock.cpp", "lock", "Bad fd [-1] to lock [" + path + "/lock]"));
  EXPECT_EQ(flocks, 1);
}

// --- processes -----------------------------------------------------------------------------------

TEST_F(FileLockProcessTest, WithoutNonBlockTheKernelWaits) {
  int go[2];
  ASSERT_EQ(pipe2(go, O_CLOEXEC), 0);
  const pid_t waiter = getpid();
  std::unique_ptr<FileLock> held(new FileLock(name));
  ASSERT_TRUE(held->lock(LOCK_EX | LOCK_NB, 0));
  const pid_t child = StartChild([&] {
    // Ends, as the last that has the lock, when the waiter sleeps in the kernel.
    char byte = 0;
    bool done = read(go[0], &byte, 1) == 1;
    const std::string stat = "/proc/" + std::to_string(waiter) + "/stat";
    while (ReadText(stat).find(") S ") == std::string::npos) sched_yield();
    return done ? 0 : 1;
  });
  held.reset();
  FileLock lock(name);
  LockCalls::Forget();
  LockCalls::beforeFlock = [&go](int) { EXPECT_EQ(write(go[1], "x", 1), 1); };
  EXPECT_TRUE(lock.lock(LOCK_EX, 0));
  LockCalls::beforeFlock = nullptr;
  EXPECT_EQ(flocks, 1);
  EXPECT_FALSE(IsFree());
  EXPECT_EQ(JoinChild(child), 0);
  close(go[0]);
  close(go[1]);
}

TEST_F(FileLockProcessTest, AForkedChildSharesTheLockOfItsParent) {
  FileLock lock(name);
  ASSERT_TRUE(lock.lock(LOCK_EX | LOCK_NB, 0));
  EXPECT_EQ(RunInChild([&] {
              FileLock other(name);
              EXPECT_FALSE(other.lock(LOCK_EX | LOCK_NB, 0));
              EXPECT_TRUE(lock.lock(LOCK_EX | LOCK_NB, 0));
            }),
            0);
  EXPECT_FALSE(IsFree()) << "the child's end released it";
  EXPECT_EQ(RunInChild([&] { lock.unlock(); }), 0);
  EXPECT_TRUE(IsFree());
}

TEST_F(FileLockProcessTest, ALockOutlivesItsParentInAForkedChild) {
  auto* lock = new FileLock(name);
  ASSERT_TRUE(lock->lock(LOCK_EX | LOCK_NB, 0));
  Holder holder([] { return true; });
  delete lock;
  EXPECT_FALSE(IsFree());
  holder.Kill();
  EXPECT_TRUE(IsFree());
}

TEST_F(FileLockProcessTest, AProgramThatIsExecutedDoesNotHoldTheLock) {
  auto* lock = new FileLock(name);
  ASSERT_TRUE(lock->lock(LOCK_EX | LOCK_NB, 0));
  int done[2];
  ASSERT_EQ(pipe(done), 0);
  const pid_t child = StartChild([&] {
    close(done[0]);
    // Answers when it runs, and then only waits.
    const std::string script = "echo >&" + std::to_string(done[1]) + "; exec sleep 1000";
    execl("/bin/sh", "sh", "-c", script.c_str(), nullptr);
    return 1;
  });
  close(done[1]);
  char byte = 0;
  EXPECT_EQ(read(done[0], &byte, 1), 1);
  close(done[0]);
  delete lock;
  EXPECT_TRUE(IsFree());
  kill(child, SIGKILL);
  JoinChild(child);
}

TEST_F(FileLockProcessTest, OneOfManyIsInsideAtATime) {
  // Each adds to the number in the file, which loses additions when two are inside.
  WriteText(Path("number"), "0");
  constexpr int kProcesses = 6;
  constexpr int kRounds = 40;
  std::vector<pid_t> children;
  for (int i = 0; i < kProcesses; ++i) {
    children.push_back(StartChild([&] {
      FileLock lock(name);
      bool ok = true;
      for (int round = 0; round < kRounds; ++round) {
        ok = lock.lock(LOCK_EX, 0) && ok;
        WriteText(Path("number"), std::to_string(std::stoi(ReadText(Path("number"))) + 1));
        lock.unlock();
      }
      return ok ? 0 : 1;
    }));
  }
  for (const pid_t child : children) EXPECT_EQ(JoinChild(child), 0);
  EXPECT_EQ(ReadText(Path("number")), std::to_string(kProcesses * kRounds));
}

// --- privileges ----------------------------------------------------------------------------------

LogLine Raised(const char* word) {
  return Auth(LOG_AUTH | LOG_DEBUG,
              std::string("file_lock.cpp WARNING: set") + word + "(-1, 0, -1)");
}

void DropEffectiveIds() {
  ASSERT_EQ(setresgid(gid_t(-1), kUser, gid_t(-1)), 0);
  ASSERT_EQ(setresuid(uid_t(-1), kUser, uid_t(-1)), 0);
}

TEST_F(FileLockProcessTest, LockAndUnlockWorkAsRootUnderOtherEffectiveIdsAndRestoreThem) {
  if (!IsRoot()) GTEST_SKIP() << "needs root";
  EXPECT_EQ(
      RunInChild([this] {
        DropEffectiveIds();
        FileLock lock(name + "/lock");
        LockCalls::beforeFlock = [](int) {
          EXPECT_EQ(geteuid(), 0U);
          EXPECT_EQ(getegid(), 0U);
        };
        const std::vector<LogLine> lines = {Raised("resgid"), Raised("resuid"), Raised("resuid")};
        EXPECT_TRUE(lock.lock(LOCK_EX | LOCK_NB, 0));
        ExpectLog(lines);
        EXPECT_EQ(geteuid(), kUser);
        EXPECT_EQ(getegid(), kUser);
        lock.unlock();
        ExpectLog(lines);
        EXPECT_EQ(geteuid(), kUser);
        EXPECT_EQ(getegid(), kUser);
      }),
      0);
  for (const std::string& made : {path, path + "/lock"}) {
    struct stat status = {};
    ASSERT_EQ(lstat(made.c_str(), &status), 0);
    EXPECT_EQ(status.st_uid, 0U);
    EXPECT_EQ(status.st_gid, 0U);
  }
}

TEST_F(FileLockProcessTest, TheIdsAreRestoredWhenTheLockIsBusyAndWhenItCannotBeOpened) {
  if (!IsRoot()) GTEST_SKIP() << "needs root";
  const Holder holder([this] { return Hold(LOCK_EX | LOCK_NB); });
  EXPECT_EQ(RunInChild([this] {
              DropEffectiveIds();
              FileLock lock(name);
              EXPECT_FALSE(lock.lock(LOCK_EX | LOCK_NB, 0));
              EXPECT_EQ(geteuid(), kUser);
              EXPECT_EQ(getegid(), kUser);
              ExpectLog({Raised("resgid"), Raised("resuid"), Raised("resuid")});
              FileLock unnamed;
              EXPECT_FALSE(unnamed.lock(LOCK_EX | LOCK_NB, 0));
              EXPECT_EQ(geteuid(), kUser);
              EXPECT_EQ(getegid(), kUser);
              ExpectLog({Raised("resgid"), Raised("resuid"),
                         Err("file_lock.cpp", "openLockedFile", "Bad Lock File"),
                         Err("file_lock.cpp", "lock", "Bad fd [-1] to lock []"), Raised("resuid")});
            }),
            0);
}

TEST_F(FileLockProcessTest, ALockThatOthersMayReadWorksWithoutAnyPrivileges) {
  if (!IsRoot()) GTEST_SKIP() << "needs root";
  {
    const mode_t before = umask(0);
    FileLock lock(name);
    ASSERT_TRUE(lock.openLockedFile());
    umask(before);
  }
  EXPECT_EQ(RunInChild([this] {
              ASSERT_EQ(setresgid(kUser, kUser, kUser), 0);
              ASSERT_EQ(setresuid(kUser, kUser, kUser), 0);
              const std::vector<LogLine> refused = {
                  Auth(LOG_AUTH | LOG_ERR,
                       "file_lock.cpp ERROR: setresgid(-1, 0, -1) [Operation not permitted]"),
                  Auth(LOG_AUTH | LOG_ERR, "file_lock.cpp ERROR: ENTERCriticalSection")};
              FileLock lock(name);
              EXPECT_TRUE(lock.lock(LOCK_EX | LOCK_NB, 0));
              ExpectLog(refused);
              EXPECT_FALSE(IsFree());
              lock.unlock();
              ExpectLog(refused);
              FileLock missing(name + "-missing");
              EXPECT_FALSE(missing.lock(LOCK_EX | LOCK_NB, 0));
              std::vector<LogLine> lines = refused;
              for (const LogLine& line : CannotOpen(path + "-missing", "Permission denied")) {
                lines.push_back(line);
              }
              ExpectLog(lines);
            }),
            0);
}

}  // namespace
