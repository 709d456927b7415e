// Fails the calls that SQLite makes for its files, those of its own interface to the system: with
// any result code, also where no call of the C library would lead to it.

#ifndef KELODRCORE_TESTS_FAULT_FAILING_VFS_H_
#define KELODRCORE_TESTS_FAULT_FAILING_VFS_H_

namespace FailingVfs {

// Errors of a Fault::Plan.
constexpr int kError = -101;      // the code that SQLite has for a failure of the call
constexpr int kFull = -102;       // a write of a half of the data, SQLITE_FULL
constexpr int kBusy = -103;       // another connection's lock, SQLITE_BUSY
constexpr int kShortRead = -104;  // nothing but zeros, SQLITE_IOERR_SHORT_READ

// Puts the failing interface before SQLite's own one, for all connections opened from now on.
// Returns SQLite's result code.
int Register();

}  // namespace FailingVfs

#endif  // KELODRCORE_TESTS_FAULT_FAILING_VFS_H_
