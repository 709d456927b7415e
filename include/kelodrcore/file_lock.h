/// @file
/// A lock between processes on a named lock file.

#ifndef KELODRCORE_FILE_LOCK_H_
#define KELODRCORE_FILE_LOCK_H_

#include <string>

#include "kelodrcore/export.h"

namespace KeloDRCore {

/// An advisory lock between processes, and between objects of one process, built on flock(2).
///
/// The lock named NAME is the file "/tmp/.kelodr_lock/NAME". It is created on first use, with its
/// directory, as root. The name is taken verbatim: slashes in it make subdirectories. The file is
/// opened by the first lock() and stays open, across lock() and unlock(), until the destructor; its
/// name can be changed only before that. It is never removed.
///
/// Each missing directory on the way is made with mode 0755, whatever the umask. No directory below
/// "/tmp" may be a link. A process that is root makes them root's and writable by nobody else, and
/// removes what another user has put in their place. Any other process accepts directories of root
/// or of its own user. A lock file of one ordinary user can be taken by root and by that user.
///
/// After `fork`, a lock belongs to the open file: a child forked while it is held shares it. It
/// ends with an unlock() of either, or when both have closed the file (or ended). The background
/// refresh of a `Cache` shares no lock of its caller. Programs that are executed do not inherit a
/// lock. When the lock file is removed or replaced while it is open, a lock already held on it goes
/// on, unknown to newcomers; the next lock() takes the file that is there then.
///
/// One object is for one thread at a time, and lock() and unlock() change the effective ids of the
/// whole process while they run. What is called deliberate here is frozen.
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

  /// Names the lock. The name that it has already is a success at any time. False for an empty
  /// name, and for another name once the lock file is open.
  bool setLockFile(const std::string& name);

  /// The path of the lock file of `name`; empty, with a log line, for an empty name.
  [[nodiscard]] static std::string getLockFilePath(const std::string& name);

  /// Makes sure that the directory of the lock file exists and is safe, as described above. False
  /// without a name (not logged), or when that cannot be done.
  bool checkLockDir() const;

  /// Opens the lock file, creating it if needed. One that is open already is kept, unless it is no
  /// longer the regular file at its path: then it is closed, which ends a lock held on it, and
  /// opened anew. A link or anything else that is not a regular file is refused.
  ///
  /// The permission bits of a new lock file are deliberately the decimal number 644 (octal 01204)
  /// less the umask. They deny its owner to read it, so that an owner who is not root has it open
  /// for writing; flock needs no more.
  bool openLockedFile();

  /// Takes the lock, or changes the one that is held to `type`, the operation of flock: LOCK_SH or
  /// LOCK_EX, with LOCK_NB. `timeout` is in seconds. False when the lock file cannot be opened (at
  /// once), or when the lock cannot be taken in time.
  ///
  /// The lock is tried at once and then every 50 ms, 20 * `timeout` + 1 times in all. Any failure
  /// of flock counts as one more try. A signal ends a pause early, so that a timer signal every 5
  /// ms ends the call with a tenth of the time-out. Without LOCK_NB the time-out is ignored, and
  /// each try waits in the kernel for as long as it takes.
  ///
  /// Should the file turn out, once locked, to have been removed or replaced in the meantime, its
  /// successor is tried instead, at once for the first few times.
  [[nodiscard]] bool lock(int type, unsigned int timeout);

  /// Whether the lock could be taken at this moment: takes it, with a time-out of 0, and releases
  /// it at once. Never leaves it held, but on descriptor 0, which unlock() leaves alone.
  bool tryLock(int type);

  /// Releases the lock and keeps the file open. Descriptor 0 is deliberately left alone.
  void unlock() const;

 private:
  friend class CacheLock;  // a cache does not take a lock that cannot be opened for a held one

  enum class Outcome { kTaken, kBusy, kFailed };

  // lock() with its outcome; kBusy when somebody holds the lock.
  KELODR_LOCAL Outcome attempt(int type, unsigned int timeout);
  KELODR_LOCAL void closeFile();

  int fd = -1;       // -1: not open
  std::string path;  // empty: no name
};

}  // namespace KeloDRCore

#endif  // KELODRCORE_FILE_LOCK_H_
