#include "kelodrcore/file_lock.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <mutex>
#include <utility>
#include <vector>

#include "kelocore.h"
#include "kelodrcore/file.h"
#include "lock_fork.h"
#include "log.h"
#include "posix/directory_walk.h"
#include "posix/file_io.h"
#include "posix/fork_mutex.h"
#include "posix/pipe.h"
#include "posix/retry.h"
#include "privilege.h"

namespace KeloDRCore {
namespace {

using Posix::Descriptor;

constexpr char kLockDir[] = "/tmp/.kelodr_lock";
constexpr char kStart[] = "/tmp";
constexpr int kLockDirMode = 0755;

// Decimal on purpose: lock files have always been made with these bits.
constexpr mode_t kLockFileMode = 644;

constexpr unsigned int kPollMs = 50;

// How often one lock() goes after the successor of a removed lock file at once, before that counts
// as busy. Each time takes a removal between an open and a flock, so once is rare.
constexpr int kReplacedLimit = 10;

// The open lock files of this process. They are opened, closed and forked under the mutex, so that
// a child knows all that it has.
std::vector<int>& openFiles = *new std::vector<int>;  // outlives every user

// Whether `fd` is still the lock file at `path`: a cleaner of /tmp removes or replaces files that
// are open, and then newcomers lock another one.
bool IsLockFile(int fd, const std::string& path) {
  struct stat open = {};
  struct stat named = {};
  return Posix::Stat(fd, open) && S_ISREG(open.st_mode) &&
         Posix::StatAt(AT_FDCWD, path, AT_SYMLINK_NOFOLLOW, named) &&
         Posix::IsSameFile(open, named);
}

Descriptor OpenLockDir(const std::string& parent) {
  Descriptor directory = Posix::OpenStepwise(
      kStart, parent, [](const std::string& step) { return File::CreateDir(step, kLockDirMode); });
  if (!directory.IsOpen()) {
    KELODR_LOG(ERR, "checkLockDir", "Failed to create lock dir [%s] in local host", parent.c_str());
  }
  return directory;
}

// The mode denies the owner of a lock file to read it, and flock takes any descriptor.
Descriptor OpenLockFile(int directory, const std::string& name) {
  const int flags = O_CREAT | O_NOFOLLOW | Posix::kHarmless;
  Descriptor file = Posix::OpenAt(directory, name, O_RDONLY | flags, kLockFileMode);
  if (!file.IsOpen() && errno == EACCES) {
    file = Posix::OpenAt(directory, name, O_WRONLY | flags, kLockFileMode);
  }
  if (file.IsOpen() && !File::IsRegularFile(file.Get())) {
    file.Close();
    errno = EINVAL;
  }
  return file;
}

// Whether an open failed because of what stands at the name.
bool IsWrongKind(int error) {
  return error == ELOOP || error == EISDIR || error == ENXIO || error == EINVAL;
}

// The directory may have been a stranger's before it was made root's.
Descriptor OpenOrReplace(int directory, const std::string& name) {
  Descriptor file = OpenLockFile(directory, name);
  const int error = errno;
  if (!file.IsOpen() && IsWrongKind(error) && Posix::ClearPlanted(directory, name)) {
    return OpenLockFile(directory, name);
  }
  errno = error;
  return file;
}

int OpenRegistered(int directory, const std::string& name) {
  const std::lock_guard<std::mutex> guard(Posix::forkMutex);
  Descriptor file = OpenOrReplace(directory, name);
  if (file.IsOpen()) openFiles.push_back(file.Get());
  return file.Release();
}

void CloseRegistered(int fd) {
  const std::lock_guard<std::mutex> guard(Posix::forkMutex);
  openFiles.erase(std::find(openFiles.begin(), openFiles.end(), fd));
  close(fd);
}

}  // namespace

int ForkWithoutLocks(int flags) {
  Posix::Pipe told;
  if (!told.Open()) return -1;
  const int pid = KLIBCProcForkEx(flags);
  if (pid > 0) {
    // Until the child has let go: a lock that the caller closes next is free at once.
    told.writeEnd.Close();
    Posix::Receive(told.readEnd.Get());
  }
  if (pid != 0) return pid;
  for (const int fd : openFiles) {
    Posix::Retry([&] { return dup3(STDIN_FILENO, fd, O_CLOEXEC); });
  }
  Posix::Send(told.writeEnd.Get(), 0);
  return 0;
}

FileLock::FileLock(const std::string& name) : path(getLockFilePath(name)) {}

FileLock::~FileLock() { closeFile(); }

void FileLock::closeFile() {
  if (fd >= 0) CloseRegistered(std::exchange(fd, -1));
}

bool FileLock::setLockFile(const std::string& name) {
  if (name.empty()) {
    KELODR_LOG(ERR, __func__, "Failed to set lock path [%s]", name.c_str());
    return false;
  }
  const std::string newPath = getLockFilePath(name);
  if (newPath == path) return true;
  if (fd >= 0) {
    KELODR_LOG(ERR, __func__, "File [%s] has been open, can not set file path to [%s]",
               path.c_str(), newPath.c_str());
    return false;
  }
  path = newPath;
  return true;
}

std::string FileLock::getLockFilePath(const std::string& name) {
  if (name.empty()) {
    KELODR_LOG(ERR, __func__, "Bad lock file[%s]", name.c_str());
    return "";
  }
  return std::string(kLockDir) + "/" + name;
}

bool FileLock::checkLockDir() const {
  const std::string parent = File::GetParentDir(path);
  if (parent.empty()) return false;
  return OpenLockDir(parent).IsOpen();
}

bool FileLock::openLockedFile() {
  if (path.empty()) {
    KELODR_LOG(ERR, __func__, "%s", "Bad Lock File");
    return false;
  }
  if (IsLockFile(fd, path)) return true;
  const std::string parent = File::GetParentDir(path);
  const Descriptor directory = OpenLockDir(parent);
  if (!directory.IsOpen()) {
    KELODR_LOG(ERR, __func__, "Failed to check lock dir of lock file [%s].", path.c_str());
    return false;
  }
  closeFile();
  std::string name = path.substr(parent.size() + 1);
  if (name.empty()) name = ".";  // the path of a directory, which is refused
  fd = OpenRegistered(directory.Get(), name);
  if (fd < 0) KELODR_LOG(ERR, __func__, "Failed to open lock file[%s], errno=%m", path.c_str());
  return fd >= 0;
}

bool FileLock::lock(int type, unsigned int timeout) {
  return attempt(type, timeout) == Outcome::kTaken;
}

FileLock::Outcome FileLock::attempt(int type, unsigned int timeout) {
  KELODR_PRIVILEGED();
  int replaced = 0;
  bool usable = openLockedFile();
  for (uint64_t elapsedMs = 0; usable;) {
    const bool isTaken = flock(fd, type) == 0;
    const bool isBusy = isTaken || errno == EWOULDBLOCK;
    if (isTaken) {
      if (IsLockFile(fd, path)) return Outcome::kTaken;
      // Newcomers stand on another file: this lock excludes nobody. It is given up whatever comes
      // of the next file.
      closeFile();
      usable = openLockedFile();
      if (!usable || ++replaced <= kReplacedLimit) continue;
    }
    if (elapsedMs / 1000 >= timeout) return isBusy ? Outcome::kBusy : Outcome::kFailed;
    elapsedMs += kPollMs;
    usleep(kPollMs * 1000);
  }
  KELODR_LOG(ERR, "lock", "Bad fd [%d] to lock [%s]", fd, path.c_str());
  return Outcome::kFailed;
}

bool FileLock::tryLock(int type) {
  if (!lock(type, 0)) return false;
  unlock();
  return true;
}

void FileLock::unlock() const {
  KELODR_PRIVILEGED();
  if (fd > 0 && Posix::Retry([this] { return flock(fd, LOCK_UN); }) < 0) {
    KELODR_LOG(ERR, __func__, "Failed to unlock [%s] with fd [%d], errno=[%m]", path.c_str(), fd);
  }
}

}  // namespace KeloDRCore
