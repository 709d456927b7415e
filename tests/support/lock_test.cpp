#include "support/lock_test.h"

#include <fcntl.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <filesystem>

#include "kelodrcore/file_lock.h"
#include "support/test_clock.h"

namespace LockCalls {

int flocks = 0;
std::vector<useconds_t> sleeps;
bool sleepAtOnce = false;
std::function<void(int)> beforeFlock;

void Forget() {
  flocks = 0;
  sleeps.clear();
}

}  // namespace LockCalls

extern "C" int flock(int fd, int operation) noexcept {
  ++LockCalls::flocks;
  if (LockCalls::beforeFlock) LockCalls::beforeFlock(LockCalls::flocks);
  return static_cast<int>(syscall(SYS_flock, fd, operation));
}

void LockTest::SetUp() {
  CleanTest::SetUp();
  if (!CanLock()) GTEST_SKIP() << "the lock directory is another user's";
  const std::string lockDir = "/tmp/.kelodr_lock";
  std::filesystem::create_directory(lockDir);
  name = "test-" + dir.substr(dir.rfind('-') + 1);
  path = lockDir + "/" + name;
  LockCalls::Forget();
  ReplaceSleeps([](useconds_t microseconds) -> std::optional<int> {
    LockCalls::sleeps.push_back(microseconds);
    if (LockCalls::sleepAtOnce) return 0;
    return std::nullopt;
  });
}

void LockTest::TearDown() {
  LockCalls::beforeFlock = nullptr;
  LockCalls::sleepAtOnce = false;
  std::error_code error;
  std::filesystem::remove_all(path, error);
  CleanTest::TearDown();
}

bool LockTest::IsFree() const {
  int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC);
  if (fd < 0) fd = open(path.c_str(), O_WRONLY | O_CLOEXEC);  // its owner may not read it
  EXPECT_GE(fd, 0) << path;
  const bool isFree = syscall(SYS_flock, fd, LOCK_EX | LOCK_NB) == 0;
  close(fd);
  return isFree;
}

int LockTest::DescriptorOf(const std::string& file) {
  for (const int fd : OpenDescriptors()) {
    std::error_code error;
    const std::string link = "/proc/self/fd/" + std::to_string(fd);
    if (std::filesystem::read_symlink(link, error) == file) return fd;
  }
  return -1;
}

std::vector<LogLine> LockTest::CannotOpen(const std::string& file, const std::string& reason) {
  return {Err("file_lock.cpp", "openLockedFile",
              "Failed to open lock file[" + file + "], errno=" + reason),
          Err("file_lock.cpp", "lock", "Bad fd [-1] to lock [" + file + "]")};
}

bool LockTest::Hold(int type) const {
  static KeloDRCore::FileLock lock;
  return lock.setLockFile(name) && lock.lock(type, 0);
}
