#include "fault/failing_vfs.h"

#include <sqlite3.h>

#include <cstring>

#include "fault/fault.h"

using Fault::Hits;

namespace {

using Methods = sqlite3_io_methods;

// An open file; SQLite's own stands behind it in the same memory.
struct File {
  sqlite3_file base;
};

sqlite3_vfs* systemVfs = nullptr;

sqlite3_file* Own(sqlite3_file* file) {
  return reinterpret_cast<sqlite3_file*>(reinterpret_cast<File*>(file) + 1);
}

// Makes a call of the file's own, unless it is to fail with `code`.
template <typename... Parameters, typename... Arguments>
int Make(const char* call, int code, int (*Methods::*method)(sqlite3_file*, Parameters...),
         sqlite3_file* file, Arguments... arguments) {
  if (Hits(call, {FailingVfs::kError})) return code;
  sqlite3_file* const own = Own(file);
  return (own->pMethods->*method)(own, arguments...);
}

int Close(sqlite3_file* file) { return Own(file)->pMethods->xClose(Own(file)); }

int Read(sqlite3_file* file, void* data, int size, sqlite3_int64 at) {
  if (Hits("xRead", {FailingVfs::kShortRead})) {
    memset(data, 0, static_cast<size_t>(size));
    return SQLITE_IOERR_SHORT_READ;
  }
  return Make("xRead", SQLITE_IOERR_READ, &Methods::xRead, file, data, size, at);
}

int Write(sqlite3_file* file, const void* data, int size, sqlite3_int64 at) {
  if (Hits("xWrite", {FailingVfs::kFull})) {
    Own(file)->pMethods->xWrite(Own(file), data, size / 2, at);
    return SQLITE_FULL;
  }
  return Make("xWrite", SQLITE_IOERR_WRITE, &Methods::xWrite, file, data, size, at);
}

int Truncate(sqlite3_file* file, sqlite3_int64 size) {
  return Make("xTruncate", SQLITE_IOERR_TRUNCATE, &Methods::xTruncate, file, size);
}

int Sync(sqlite3_file* file, int flags) {
  return Make("xSync", SQLITE_IOERR_FSYNC, &Methods::xSync, file, flags);
}

int FileSize(sqlite3_file* file, sqlite3_int64* size) {
  return Make("xFileSize", SQLITE_IOERR_FSTAT, &Methods::xFileSize, file, size);
}

int Lock(sqlite3_file* file, int level) {
  if (Hits("xLock", {FailingVfs::kBusy})) return SQLITE_BUSY;
  return Make("xLock", SQLITE_IOERR_LOCK, &Methods::xLock, file, level);
}

int Unlock(sqlite3_file* file, int level) {
  return Make("xUnlock", SQLITE_IOERR_UNLOCK, &Methods::xUnlock, file, level);
}

int CheckReservedLock(sqlite3_file* file, int* isReserved) {
  return Make("xCheckReservedLock", SQLITE_IOERR_CHECKRESERVEDLOCK, &Methods::xCheckReservedLock,
              file, isReserved);
}

// Only what tells of the steps of a write can fail; the others ask and set.
int FileControl(sqlite3_file* file, int operation, void* argument) {
  switch (operation) {
    case SQLITE_FCNTL_SIZE_HINT:
    case SQLITE_FCNTL_SYNC:
    case SQLITE_FCNTL_COMMIT_PHASETWO:
      return Make("xFileControl", SQLITE_IOERR, &Methods::xFileControl, file, operation, argument);
    default:
      return Own(file)->pMethods->xFileControl(Own(file), operation, argument);
  }
}

int SectorSize(sqlite3_file* file) { return Own(file)->pMethods->xSectorSize(Own(file)); }

int DeviceCharacteristics(sqlite3_file* file) {
  return Own(file)->pMethods->xDeviceCharacteristics(Own(file));
}

// Without shared memory and mapped files, which the library does not ask for.
Methods MakeMethods() {
  Methods made = {};
  made.iVersion = 1;
  made.xClose = Close;
  made.xRead = Read;
  made.xWrite = Write;
  made.xTruncate = Truncate;
  made.xSync = Sync;
  made.xFileSize = FileSize;
  made.xLock = Lock;
  made.xUnlock = Unlock;
  made.xCheckReservedLock = CheckReservedLock;
  made.xFileControl = FileControl;
  made.xSectorSize = SectorSize;
  made.xDeviceCharacteristics = DeviceCharacteristics;
  return made;
}

const Methods methods = MakeMethods();

int Open(sqlite3_vfs* /*vfs*/, const char* path, sqlite3_file* file, int flags, int* flagsOut) {
  file->pMethods = nullptr;
  if (Hits("xOpen", {FailingVfs::kError})) return SQLITE_CANTOPEN;
  const int code = systemVfs->xOpen(systemVfs, path, Own(file), flags, flagsOut);
  if (Own(file)->pMethods != nullptr) file->pMethods = &methods;
  return code;
}

int Delete(sqlite3_vfs* /*vfs*/, const char* path, int syncsDirectory) {
  if (Hits("xDelete", {FailingVfs::kError})) return SQLITE_IOERR_DELETE;
  return systemVfs->xDelete(systemVfs, path, syncsDirectory);
}

int Access(sqlite3_vfs* /*vfs*/, const char* path, int flags, int* answer) {
  if (Hits("xAccess", {FailingVfs::kError})) return SQLITE_IOERR_ACCESS;
  return systemVfs->xAccess(systemVfs, path, flags, answer);
}

}  // namespace

int FailingVfs::Register() {
  static sqlite3_vfs vfs;
  systemVfs = sqlite3_vfs_find(nullptr);
  vfs = *systemVfs;
  vfs.zName = "failing";
  vfs.szOsFile += static_cast<int>(sizeof(File));
  vfs.xOpen = Open;
  vfs.xDelete = Delete;
  vfs.xAccess = Access;
  return sqlite3_vfs_register(&vfs, 1);
}
