/// @file
/// A lock between processes on a named lock file.

#ifndef KELODRCORE_FILE_LOCK_H_
#define KELODRCORE_FILE_LOCK_H_

#include <string>

#include "kelodrcore/export.h"

namespace KeloDRCore {

/// An advisory lock between processes, and between objects of one process, built on flock(2).
///
/// The lock named NAME is the file "/tmp/.kelodr_lock/NAME", created on first use, with its
/// directory, as root. The name is taken verbatim: slashes in it make subdirectories. The file is
/// opened by the first lock() and stays open, across lock() and unlock(), until the destructor; its
/// name can be changed only before that. It is never removed.
///
/// A lock belongs to the open file: a child forked while it is held shares it, so that it ends with
/// an unlock() of either, or when both have closed the file (or ended). Programs that are executed
/// do not inherit it. When the lock file is removed or replaced while it is open, a lock already
/// held on it goes on, unknown to newcomers; the next lock() takes the file that is there then.
///
/// One object is for one thread at a time, and lock() and unlock() change the effective ids of the
/// whole process while they run.
class KELODR_EXPORT FileLock {
 public:
  /// A lock without a name; see setLockFile().
  FileLock() = default;

  /// The lock named `name`. An empty name is logged and leaves the lock without one.
  explicit FileLock(const std::string& name);

  /// Closes the lock file, which releases the lock unless a forked child still shares it.
  ~FileLock();

  FileLock(const FileLock&) = delete;
  FileLock& operator=(const FileLock&) = delete;

  /// Names the lock. The name that it has already is a success at any time.
  /// @return false for an empty name, and for another name once the lock file is open.
  bool setLockFile(const std::string& name);

  /// The path of the lock file of `name`; empty, with a log line, for an empty name.
  [[nodiscard]] static std::string getLockFilePath(const std::string& name);

  /// Makes sure that the directory of the lock file exists (mode 0755).
  /// @return false without a name (not logged), or when it cannot be created.
  bool checkLockDir() const;

  /// Opens the lock file, creating it if needed. One that is open already is kept, unless it is no
  /// longer the regular file at its path: then it is closed, which ends a lock held on it, and
  /// opened anew. A symbolic link in its place is refused.
  ///
  /// The permission bits of a new lock file are deliberately the decimal number 644 (octal 01204)
  /// less the umask; flock needs no more than a descriptor open for reading.
  bool openLockedFile();

  /// Takes the lock, or changes the one that is held to `type`.
  ///
  /// The lock is tried at once and then every 50 ms, 20 * `timeout` + 1 times in all. Any failure
  /// of flock counts as busy. Should the file turn out, once locked, to have been removed or
  /// replaced in the meantime, its successor is tried instead, at once for the first few times.
  /// @param type the operation of flock: LOCK_SH or LOCK_EX, with LOCK_NB; without LOCK_NB each try
  ///     waits in the kernel, for as long as it takes.
  /// @param timeout in seconds; 0 tries once.
  /// @return false when the lock file cannot be opened, or the lock not be taken in time.
  [[nodiscard]] bool lock(int type, unsigned int timeout);

  /// Whether the lock could be taken at this moment: takes it, with a timeout of 0, and releases it
  /// at once. Never leaves it held (but on descriptor 0, which `unlock` leaves alone).
  bool tryLock(int type);

  /// Releases the lock and keeps the file open. Descriptor 0 is deliberately left alone.
  void unlock() const;

 private:
  int fd = -1;       // -1: not open
  std::string path;  // empty: no name
};

}  // namespace KeloDRCore

#endif  // KELODRCORE_FILE_LOCK_H_
