#include "kelodrcore/file_lock.h"

#include <fcntl.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <string>
#include <type_traits>
#include <utility>
#include <vector>

#include "support/lock_test.h"

namespace {

using KeloDRCore::FileLock;
using LockCalls::flocks;
using LockCalls::sleeps;

static_assert(!std::is_copy_constructible_v<FileLock> && !std::is_copy_assignable_v<FileLock>);
static_assert(!std::is_polymorphic_v<FileLock>);
static_assert(!std::is_convertible_v<std::string, FileLock>);

using FileLockTest = LockTest;
using FileLockNameTest = CleanTest;

// --- names and paths -----------------------------------------------------------------------------

TEST_F(FileLockNameTest, ThePathIsTheNameBelowTheLockDirectory) {
  EXPECT_EQ(FileLock::getLockFilePath("a"), "/tmp/.kelodr_lock/a");
  EXPECT_EQ(FileLock::getLockFilePath("/a/b"), "/tmp/.kelodr_lock//a/b");
  EXPECT_EQ(FileLock::getLockFilePath("../a"), "/tmp/.kelodr_lock/../a");
  EXPECT_EQ(FileLock::getLockFilePath(" "), "/tmp/.kelodr_lock/ ");
}

TEST_F(FileLockNameTest, AnEmptyNameHasNoPath) {
  EXPECT_EQ(FileLock::getLockFilePath(""), "");
  ExpectLog({Err("file_lock.cpp", "getLockFilePath", "Bad lock file[]")});
}

TEST_F(FileLockTest, ALockOfAnEmptyNameCannotBeTaken) {
  FileLock lock("");
  ExpectLog({Err("file_lock.cpp", "getLockFilePath", "Bad lock file[]")});
  EXPECT_FALSE(lock.lock(LOCK_EX | LOCK_NB, 1));
  ExpectLog({Err("file_lock.cpp", "openLockedFile", "Bad Lock File"),
             Err("file_lock.cpp", "lock", "Bad fd [-1] to lock []")});
  EXPECT_EQ(flocks, 0);
  EXPECT_TRUE(sleeps.empty());
}

TEST_F(FileLockTest, ALockWithoutNameOpensNothingAndUnlocksSilently) {
  FileLock lock;
  EXPECT_FALSE(lock.openLockedFile());
  ExpectLog({Err("file_lock.cpp", "openLockedFile", "Bad Lock File")});
  EXPECT_FALSE(lock.checkLockDir());
  EXPECT_FALSE(lock.tryLock(LOCK_EX | LOCK_NB));
  ExpectLog({Err("file_lock.cpp", "openLockedFile", "Bad Lock File"),
             Err("file_lock.cpp", "lock", "Bad fd [-1] to lock []")});
  lock.unlock();
  EXPECT_EQ(flocks, 0);
}

TEST_F(FileLockTest, SetLockFileNamesTheLock) {
  FileLock lock;
  EXPECT_TRUE(lock.setLockFile("other"));
  EXPECT_TRUE(lock.setLockFile(name));
  EXPECT_TRUE(lock.lock(LOCK_EX | LOCK_NB, 0));
  EXPECT_FALSE(IsFree());
}

TEST_F(FileLockTest, SetLockFileRefusesAnEmptyNameAndKeepsTheOld) {
  FileLock lock(name);
  EXPECT_FALSE(lock.setLockFile(""));
  ExpectLog({Err("file_lock.cpp", "setLockFile", "Failed to set lock path []")});
  EXPECT_TRUE(lock.lock(LOCK_EX | LOCK_NB, 0));
  EXPECT_FALSE(IsFree());
}

TEST_F(FileLockTest, SetLockFileWhileOpenTakesOnlyTheSameName) {
  FileLock lock(name);
  ASSERT_TRUE(lock.openLockedFile());
  EXPECT_TRUE(lock.setLockFile(name));
  EXPECT_FALSE(lock.setLockFile("other"));
  ExpectLog({Err("file_lock.cpp", "setLockFile",
                 "File [" + path +
                     "] has been open, can not set file path to "
                     "[/tmp/.kelodr_lock/other]")});
  EXPECT_TRUE(lock.lock(LOCK_EX | LOCK_NB, 0));
  EXPECT_FALSE(IsFree());
}

// --- directory and file --------------------------------------------------------------------------

TEST_F(FileLockTest, CheckLockDirMakesTheDirectoriesOfAName) {
  const mode_t before = umask(077);
  FileLock lock(name + "/a/b");
  EXPECT_TRUE(lock.checkLockDir());
  umask(before);
  struct stat status = {};
  ASSERT_EQ(stat((path + "/a").c_str(), &status), 0);
  EXPECT_EQ(status.st_mode, mode_t(S_IFDIR | 0755));
  EXPECT_EQ(NamesIn(path + "/a"), std::vector<std::string>{});
}

TEST_F(FileLockTest, ADirectoryThatCannotBeMadeIsNamedByEachStep) {
  WriteText(path, "");
  const std::string parent = path + "/sub";
  FileLock lock(name + "/sub/lock");
  EXPECT_FALSE(lock.lock(LOCK_EX | LOCK_NB, 1));
  ExpectLog({Err("file.cpp", "CreateDir", "Failed to create dir [" + parent + "] with mode [755]"),
             Err("file_lock.cpp", "checkLockDir",
                 "Failed to create lock dir [" + parent + "] in local host"),
             Err("file_lock.cpp", "openLockedFile",
                 "Failed to check lock dir of lock file [" + parent + "/lock]."),
             Err("file_lock.cpp", "lock", "Bad fd [-1] to lock [" + parent + "/lock]")});
}

TEST_F(FileLockTest, ANameThatEndsWithASlashIsThatOfADirectory) {
  FileLock lock(name + "/");
  EXPECT_FALSE(lock.lock(LOCK_EX | LOCK_NB, 1));
  ExpectLog(CannotOpen(path + "/", "Is a directory"));
}

TEST_F(FileLockTest, ANameMayLeadUpwards) {
  FileLock lock("../.kelodr_lock/" + name);
  EXPECT_TRUE(lock.lock(LOCK_EX | LOCK_NB, 1));
  EXPECT_FALSE(IsFree());
  // A step that is no directory is taken away nowhere but below the lock directory.
  FileLock below("../.kelodr_lock/" + name + "/lock");
  EXPECT_FALSE(below.lock(LOCK_EX | LOCK_NB, 1));
  LogCapture::Clear();
  EXPECT_FALSE(IsFree());
}

TEST_F(FileLockTest, AFileThatCannotBeOpenedIsNamedWithTheReason) {
  std::filesystem::create_directory(path);
  FileLock lock(name);
  EXPECT_FALSE(lock.lock(LOCK_EX | LOCK_NB, 1));
  ExpectLog(CannotOpen(path, "Is a directory"));
  EXPECT_EQ(flocks, 0);
}

TEST_F(FileLockTest, ASymbolicLinkIsRefused) {
  std::filesystem::create_symlink(Path("target"), path);
  FileLock lock(name);
  EXPECT_FALSE(lock.lock(LOCK_EX | LOCK_NB, 0));
  ExpectLog(CannotOpen(path, "Too many levels of symbolic links"));
  EXPECT_EQ(NamesIn(dir), std::vector<std::string>{});
}

TEST_F(FileLockTest, ANewLockFileIsEmptyAndHasTheDecimalMode644LessTheUmask) {
  for (const auto& [mask, mode] :
       {std::pair<mode_t, mode_t>{0, 01204}, {022, 01204}, {077, 01200}}) {
    const mode_t before = umask(mask);
    FileLock lock(name);
    EXPECT_TRUE(lock.openLockedFile());
    umask(before);
    struct stat status = {};
    ASSERT_EQ(lstat(path.c_str(), &status), 0);
    EXPECT_EQ(status.st_mode, mode_t(S_IFREG | mode));
    EXPECT_EQ(status.st_size, 0);
    unlink(path.c_str());
  }
}

TEST_F(FileLockTest, TheFileIsOpenedReadOnlyAndCloseOnExec) {
  FileLock lock(name);
  ASSERT_TRUE(lock.openLockedFile());
  const int fd = DescriptorOf(path);
  ASSERT_GE(fd, 0);
  EXPECT_EQ(fcntl(fd, F_GETFL) & O_ACCMODE, O_RDONLY);
  EXPECT_EQ(fcntl(fd, F_GETFD), FD_CLOEXEC);
}

TEST_F(FileLockTest, TheFileStaysOpenUntilTheDestructor) {
  {
    FileLock lock(name);
    ASSERT_TRUE(lock.openLockedFile());
    const int fd = DescriptorOf(path);
    EXPECT_TRUE(lock.openLockedFile());
    EXPECT_TRUE(lock.lock(LOCK_EX | LOCK_NB, 0));
    lock.unlock();
    EXPECT_TRUE(lock.lock(LOCK_SH | LOCK_NB, 0));
    EXPECT_EQ(DescriptorOf(path), fd);
    EXPECT_EQ(fcntl(fd, F_GETFD), FD_CLOEXEC);
  }
  EXPECT_EQ(DescriptorOf(path), -1);
  EXPECT_TRUE(IsFree());
}

TEST_F(FileLockTest, ARemovedFileIsMadeAnewWhenItIsOpenedAgain) {
  FileLock lock(name);
  ASSERT_TRUE(lock.openLockedFile());
  ASSERT_EQ(unlink(path.c_str()), 0);
  EXPECT_TRUE(lock.openLockedFile());
  EXPECT_GE(DescriptorOf(path), 0);
}

// One inode number can stand for two files, each on a file system of its own.
TEST_F(FileLockTest, AFileOnAnotherFileSystemIsAnotherFile) {
  const auto mountTmp = [] { EXPECT_EQ(mount("tmpfs", "/tmp", "tmpfs", 0, "size=64k"), 0); };
  const auto inode = [this] {
    struct stat status = {};
    EXPECT_EQ(stat(path.c_str(), &status), 0);
    return status.st_ino;
  };
  if (!RunWithOwnMounts([&] {
        mountTmp();
        FileLock lock(name);
        ASSERT_TRUE(lock.openLockedFile());
        const ino_t first = inode();
        mountTmp();
        { ASSERT_TRUE(FileLock(name).openLockedFile()); }
        ASSERT_EQ(inode(), first);
        EXPECT_TRUE(lock.lock(LOCK_EX | LOCK_NB, 0));
        EXPECT_FALSE(IsFree());
      })) {
    GTEST_SKIP() << "needs the right to mount a file system";
  }
}

TEST_F(FileLockTest, ARemovedFileIsClosedWhateverItsDescriptor) {
  EXPECT_EQ(RunInChild([this] {
              close(0);
              FileLock lock(name);
              ASSERT_TRUE(lock.openLockedFile());
              ASSERT_EQ(DescriptorOf(path), 0);
              ASSERT_EQ(unlink(path.c_str()), 0);
              ASSERT_TRUE(lock.openLockedFile());
              EXPECT_EQ(DescriptorOf(path), 0);
            }),
            0);
}

// --- taking and releasing ------------------------------------------------------------------------

TEST_F(FileLockTest, AnExclusiveLockExcludesOtherProcesses) {
  Holder holder([this] { return Hold(LOCK_EX | LOCK_NB); });
  FileLock lock(name);
  EXPECT_FALSE(lock.lock(LOCK_EX | LOCK_NB, 0));
  EXPECT_FALSE(lock.lock(LOCK_SH | LOCK_NB, 0));
}

TEST_F(FileLockTest, AnExclusiveLockExcludesOtherObjectsOfTheProcess) {
  FileLock first(name);
  FileLock second(name);
  EXPECT_TRUE(first.lock(LOCK_EX | LOCK_NB, 0));
  EXPECT_FALSE(second.lock(LOCK_EX | LOCK_NB, 0));
  first.unlock();
  EXPECT_TRUE(second.lock(LOCK_EX | LOCK_NB, 0));
  EXPECT_FALSE(first.tryLock(LOCK_SH | LOCK_NB));
}

TEST_F(FileLockTest, LocksOfOtherNamesAreIndependent) {
  FileLock first(name + "/a");
  FileLock second(name + "/b");
  EXPECT_TRUE(first.lock(LOCK_EX | LOCK_NB, 0));
  EXPECT_TRUE(second.lock(LOCK_EX | LOCK_NB, 0));
}

TEST_F(FileLockTest, SharedLocksShareAndExcludeAnExclusiveOne) {
  Holder holder([this] { return Hold(LOCK_SH | LOCK_NB); });
  FileLock lock(name);
  EXPECT_TRUE(lock.lock(LOCK_SH | LOCK_NB, 0));
  EXPECT_FALSE(lock.lock(LOCK_EX | LOCK_NB, 0));
  holder.Kill();
  EXPECT_TRUE(lock.lock(LOCK_EX | LOCK_NB, 0));
}

TEST_F(FileLockTest, AKilledHolderReleasesItsLock) {
  Holder holder([this] { return Hold(LOCK_EX | LOCK_NB); });
  FileLock lock(name);
  EXPECT_FALSE(lock.lock(LOCK_EX | LOCK_NB, 0));
  holder.Kill();
  EXPECT_TRUE(lock.lock(LOCK_EX | LOCK_NB, 0));
}

TEST_F(FileLockTest, UnlockReleasesAndKeepsTheFileOpen) {
  FileLock lock(name);
  ASSERT_TRUE(lock.lock(LOCK_EX | LOCK_NB, 0));
  EXPECT_FALSE(IsFree());
  lock.unlock();
  EXPECT_TRUE(IsFree());
  EXPECT_GE(DescriptorOf(path), 0);
}

TEST_F(FileLockTest, UnlockNamesAFailure) {
  FileLock lock(name);
  ASSERT_TRUE(lock.lock(LOCK_EX | LOCK_NB, 0));
  const int fd = DescriptorOf(path);
  ASSERT_EQ(close(fd), 0);
  lock.unlock();
  ExpectLog({Err("file_lock.cpp", "unlock",
                 "Failed to unlock [" + path + "] with fd [" + std::to_string(fd) +
                     "], errno=[Bad file descriptor]")});
}

TEST_F(FileLockTest, UnlockLeavesDescriptorZeroAlone) {
  EXPECT_EQ(RunInChild([this] {
              close(0);
              FileLock lock(name);
              ASSERT_TRUE(lock.lock(LOCK_EX | LOCK_NB, 0));
              ASSERT_EQ(DescriptorOf(path), 0);
              ExpectLog({});
              LockCalls::Forget();
              lock.unlock();
              EXPECT_EQ(flocks, 0);
              EXPECT_FALSE(IsFree());
              EXPECT_FALSE(lock.setLockFile("other"));
              LogCapture::Clear();
              lock.~FileLock();
              EXPECT_EQ(fcntl(0, F_GETFD), -1);
              EXPECT_TRUE(IsFree());
              new (&lock) FileLock;
            }),
            0);
}

TEST_F(FileLockTest, UnlockReleasesAnyDescriptorAboveZero) {
  EXPECT_EQ(RunInChild([this] {
              const int output = dup(STDOUT_FILENO);
              close(STDOUT_FILENO);
              FileLock lock(name);
              ASSERT_TRUE(lock.lock(LOCK_EX | LOCK_NB, 0));
              ASSERT_EQ(DescriptorOf(path), STDOUT_FILENO);
              lock.unlock();
              EXPECT_TRUE(IsFree());
              ASSERT_TRUE(lock.setLockFile(name));
              lock.~FileLock();
              dup2(output, STDOUT_FILENO);
              new (&lock) FileLock;
            }),
            0);
}

TEST_F(FileLockTest, TryLockAnswersAndNeverHolds) {
  FileLock lock(name);
  EXPECT_TRUE(lock.tryLock(LOCK_EX | LOCK_NB));
  EXPECT_TRUE(IsFree());
  EXPECT_EQ(flocks, 2);
  Holder holder([this] { return Hold(LOCK_SH | LOCK_NB); });
  LockCalls::Forget();
  EXPECT_FALSE(lock.tryLock(LOCK_EX | LOCK_NB));
  EXPECT_EQ(flocks, 1);
  EXPECT_TRUE(sleeps.empty());
  EXPECT_TRUE(lock.tryLock(LOCK_SH | LOCK_NB));
}

// --- time-outs -----------------------------------------------------------------------------------

TEST_F(FileLockTest, ABusyLockIsTriedTwentyTimesASecondAndOnceMore) {
  FileLock holder(name);
  ASSERT_TRUE(holder.lock(LOCK_EX | LOCK_NB, 0));
  LockCalls::sleepAtOnce = true;
  FileLock lock(name);
  for (const unsigned int timeout : {0U, 1U, 2U, 5U, 60U}) {
    LockCalls::Forget();
    EXPECT_FALSE(lock.lock(LOCK_EX | LOCK_NB, timeout));
    EXPECT_EQ(flocks, static_cast<int>(20 * timeout + 1));
    EXPECT_EQ(sleeps, std::vector<useconds_t>(20 * timeout, 50000));
  }
}

TEST_F(FileLockTest, ATimeoutOfASecondTakesASecond) {
  FileLock holder(name);
  ASSERT_TRUE(holder.lock(LOCK_EX | LOCK_NB, 0));
  FileLock lock(name);
  timespec begin = {};
  timespec end = {};
  clock_gettime(CLOCK_MONOTONIC, &begin);
  EXPECT_FALSE(lock.lock(LOCK_EX | LOCK_NB, 1));
  clock_gettime(CLOCK_MONOTONIC, &end);
  EXPECT_GE(end.tv_sec - begin.tv_sec + (end.tv_nsec < begin.tv_nsec ? -1 : 0), 1);
}

TEST_F(FileLockTest, ALockReleasedWhileItIsPolledIsTaken) {
  FileLock holder(name);
  ASSERT_TRUE(holder.lock(LOCK_EX | LOCK_NB, 0));
  LockCalls::sleepAtOnce = true;
  LockCalls::Forget();
  LockCalls::beforeFlock = [&holder](int number) {
    if (number == 8) holder.unlock();
  };
  FileLock lock(name);
  EXPECT_TRUE(lock.lock(LOCK_EX | LOCK_NB, 4294967295U));
  EXPECT_EQ(sleeps.size(), 7U);
  EXPECT_FALSE(IsFree());
}

TEST_F(FileLockTest, AnyFailureOfFlockCountsAsBusy) {
  LockCalls::sleepAtOnce = true;
  FileLock lock(name);
  EXPECT_FALSE(lock.lock(0x7000, 1));
  EXPECT_EQ(flocks, 21);
}

}  // namespace
