// The calls that can fail. The linker lets these definitions stand before the C library's.
//
// A call is listed with the errors that its manual page gives, as far as sweeps ask for them, and
// EINTR wherever a file system of user space or of the network may answer so. What a call has done
// when it fails is what it really has done: close has closed, a failed stream remembers its error.
// Those that move data are in fault_transfers.cpp.

// Both the old and the 64-bit names are defined here.
#undef _FILE_OFFSET_BITS
#undef _TIME_BITS

#include <fcntl.h>
#include <sqlite3.h>
#include <sys/types.h>
#include <unistd.h>

#include <cerrno>
#include <cstdarg>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <new>

#include "fault/fault.h"
#include "fault/interception.h"
#include "support/next.h"

using Fault::Hits;
using Fault::Intercepts;
using Fault::kNoMemory;

namespace {

int FailStream(FILE* stream) {
  stream->_flags |= _IO_ERR_SEEN;
  return EOF;
}

int CloseAndFail(int fd) {
  const int error = errno;
  Next<int(int)>("close")(fd);
  errno = error;
  return -1;
}

// What is given back is not held by anybody else.
bool Unlocks(int command, long argument) {
  if (command != F_SETLK && command != F_SETLK64) return false;
  return reinterpret_cast<const struct flock*>(argument)->l_type == F_UNLCK;
}

}  // namespace

// The definition of call `name`: result type, what it answers when it fails, parameters, arguments,
// errors. The name of the definition itself differs, so that the headers' declarations, which vary
// with the size of files and times, do not matter.
#define FAULT_CALL(Result, name, failure, parameters, arguments, ...) \
  extern "C" Result Fault_##name parameters __asm__(#name);           \
  extern "C" Result Fault_##name parameters {                         \
    if (Intercepts(#name)) return failure;                            \
    if (Hits(#name, {__VA_ARGS__})) return failure;                   \
    return Next<Result parameters>(#name) arguments;                  \
  }

#define FAULT_OPEN(name)                                                                     \
  FAULT_CALL(int, name, -1, (const char* path, int flags, mode_t mode), (path, flags, mode), \
             EINTR, EIO, ENOSPC, EMFILE, EACCES, ENOMEM)
#define FAULT_OPENAT(name)                                                       \
  FAULT_CALL(int, name, -1, (int dir, const char* path, int flags, mode_t mode), \
             (dir, path, flags, mode), EINTR, EIO, ENOSPC, EMFILE, EACCES, ENOMEM)
#define FAULT_FOPEN(name)                                                                          \
  FAULT_CALL(FILE*, name, nullptr, (const char* path, const char* mode), (path, mode), EINTR, EIO, \
             ENOSPC, EMFILE, EACCES, ENOMEM)
#define FAULT_STAT(name)                                                                          \
  FAULT_CALL(int, name, -1, (const char* path, void* status), (path, status), EINTR, EIO, EACCES, \
             ENOMEM)
#define FAULT_FSTAT(name) \
  FAULT_CALL(int, name, -1, (int fd, void* status), (fd, status), EINTR, EIO, ENOMEM)
#define FAULT_FSTATAT(name)                                                       \
  FAULT_CALL(int, name, -1, (int dir, const char* path, void* status, int flags), \
             (dir, path, status, flags), EINTR, EIO, EACCES, ENOMEM)
#define FAULT_FCNTL(name)                                                         \
  extern "C" int Fault_##name(int fd, int command, long argument) __asm__(#name); \
  extern "C" int Fault_##name(int fd, int command, long argument) {               \
    if (Intercepts(#name) || Hits(#name, {EINTR, EIO, EMFILE})) return -1;        \
    if (!Unlocks(command, argument) && Hits(#name, {EACCES, EAGAIN})) return -1;  \
    return Next<int(int, int, long)>(#name)(fd, command, argument);               \
  }

FAULT_OPEN(open)
FAULT_OPEN(open64)
FAULT_OPENAT(openat)
FAULT_OPENAT(openat64)
FAULT_FOPEN(fopen)
FAULT_FOPEN(fopen64)
FAULT_STAT(stat)
FAULT_STAT(stat64)
FAULT_STAT(lstat)
FAULT_STAT(lstat64)
FAULT_FSTAT(fstat)
FAULT_FSTAT(fstat64)
FAULT_FSTATAT(fstatat)
FAULT_FSTATAT(fstatat64)
FAULT_FCNTL(fcntl)
FAULT_FCNTL(fcntl64)
FAULT_CALL(time_t, time, -1, (time_t * out), (out), EIO)
#if __SIZEOF_LONG__ == 4
FAULT_STAT(__stat64_time64)
FAULT_STAT(__lstat64_time64)
FAULT_FSTAT(__fstat64_time64)
FAULT_FSTATAT(__fstatat64_time64)
FAULT_FCNTL(__fcntl_time64)
FAULT_CALL(long long, __time64, -1, (long long* out), (out), EIO)
#endif

FAULT_CALL(int, ftruncate64, -1, (int fd, off64_t size), (fd, size), EINTR, EIO)
FAULT_CALL(void*, mmap64, reinterpret_cast<void*>(-1),
           (void* at, size_t size, int access, int flags, int fd, off64_t offset),
           (at, size, access, flags, fd, offset), EACCES, EAGAIN, ENOMEM)
FAULT_CALL(int, close, CloseAndFail(fd), (int fd), (fd), EIO)

FAULT_CALL(int, access, -1, (const char* path, int mode), (path, mode), EIO, EACCES, ENOMEM)
FAULT_CALL(ssize_t, readlink, -1, (const char* path, char* target, size_t size),
           (path, target, size), EIO, EACCES, ENOMEM)
FAULT_CALL(ssize_t, readlinkat, -1, (int dir, const char* path, char* target, size_t size),
           (dir, path, target, size), EINTR, EIO, EACCES, ENOMEM)
FAULT_CALL(int, rename, -1, (const char* from, const char* to), (from, to), EIO, ENOSPC, EACCES,
           ENOMEM)
FAULT_CALL(int, renameat, -1, (int fromDir, const char* from, int toDir, const char* to),
           (fromDir, from, toDir, to), EINTR, EIO, ENOSPC, EACCES, ENOMEM)
FAULT_CALL(int, unlink, -1, (const char* path), (path), EIO, EACCES, ENOMEM)
FAULT_CALL(int, unlinkat, -1, (int dir, const char* path, int flags), (dir, path, flags), EINTR,
           EIO, EACCES, ENOMEM)
FAULT_CALL(int, mkdir, -1, (const char* path, mode_t mode), (path, mode), EIO, ENOSPC, EACCES,
           ENOMEM)
FAULT_CALL(int, mkdirat, -1, (int dir, const char* path, mode_t mode), (dir, path, mode), EINTR,
           EIO, ENOSPC, EACCES, ENOMEM)
FAULT_CALL(int, rmdir, -1, (const char* path), (path), EIO, EACCES, ENOMEM)
FAULT_CALL(int, flock, -1, (int fd, int operation), (fd, operation), EINTR, EAGAIN, ENOMEM)
FAULT_CALL(int, fchmod, -1, (int fd, mode_t mode), (fd, mode), EINTR, EIO, EACCES)
FAULT_CALL(int, fchmodat, -1, (int dir, const char* path, mode_t mode, int flags),
           (dir, path, mode, flags), EINTR, EIO, EACCES)
FAULT_CALL(int, fchown, -1, (int fd, uid_t uid, gid_t gid), (fd, uid, gid), EINTR, EIO, EACCES)

FAULT_CALL(ssize_t, listxattr, -1, (const char* path, char* list, size_t size), (path, list, size),
           EINTR, EIO, EACCES, ENOMEM)
FAULT_CALL(ssize_t, getxattr, -1, (const char* path, const char* name, void* value, size_t size),
           (path, name, value, size), EINTR, EIO, EACCES, ENOMEM)
FAULT_CALL(int, setxattr, -1,
           (const char* path, const char* name, const void* value, size_t size, int flags),
           (path, name, value, size, flags), EINTR, EIO, ENOSPC, EACCES, ENOMEM)
FAULT_CALL(int, removexattr, -1, (const char* path, const char* name), (path, name), EINTR, EIO,
           EACCES, ENOMEM)

FAULT_CALL(int, dup2, -1, (int from, int to), (from, to), EINTR, EMFILE)
FAULT_CALL(int, dup3, -1, (int from, int to, int flags), (from, to, flags), EINTR, EMFILE)
FAULT_CALL(int, pipe2, -1, (int* ends, int flags), (ends, flags), EMFILE, ENOMEM)
FAULT_CALL(pid_t, fork, -1, (), (), EAGAIN, ENOMEM)
FAULT_CALL(pid_t, waitpid, -1, (pid_t pid, int* status, int options), (pid, status, options), EINTR)
FAULT_CALL(int, posix_spawn, errno,
           (pid_t * pid, const char* path, const void* actions, const void* attributes,
            char* const* argv, char* const* environment),
           (pid, path, actions, attributes, argv, environment), EACCES, EAGAIN, ENOMEM)
FAULT_CALL(int, posix_spawnattr_init, ENOMEM, (void* attributes), (attributes), ENOMEM)
FAULT_CALL(int, setresuid, -1, (uid_t real, uid_t effective, uid_t saved), (real, effective, saved),
           EAGAIN, ENOMEM)
FAULT_CALL(int, setresgid, -1, (gid_t real, gid_t effective, gid_t saved), (real, effective, saved),
           EAGAIN, ENOMEM)
FAULT_CALL(ssize_t, getrandom, -1, (void* data, size_t size, unsigned int flags),
           (data, size, flags), EINTR)
FAULT_CALL(void*, newlocale, nullptr, (int mask, const char* name, void* base), (mask, name, base),
           ENOMEM, kNoMemory)

// Streams.
FAULT_CALL(FILE*, fdopen, nullptr, (int fd, const char* mode), (fd, mode), EMFILE, ENOMEM)
FAULT_CALL(int, getc, FailStream(stream), (FILE * stream), (stream), EINTR, EIO)
FAULT_CALL(int, fflush, FailStream(stream), (FILE * stream), (stream), EINTR, EIO, ENOSPC)
FAULT_CALL(int, fclose, (Next<int(FILE*)>("fclose")(stream), errno = EIO, EOF), (FILE * stream),
           (stream), EIO)
FAULT_CALL(int, vfprintf, FailStream(stream), (FILE * stream, const char* format, va_list values),
           (stream, format, values), EINTR, EIO, ENOSPC, ENOMEM)

extern "C" int fprintf(FILE* stream, const char* format, ...) {
  va_list values;
  va_start(values, format);
  const int length = vfprintf(stream, format, values);
  va_end(values);
  return length;
}

// What it is called in an optimised build.
extern "C" int __fprintf_chk(FILE* stream, int /*flag*/, const char* format, ...) {
  va_list values;
  va_start(values, format);
  const int length = vfprintf(stream, format, values);
  va_end(values);
  return length;
}

// No sweep waits, not for the disk either: only a loss of power would show the difference.
namespace {

// `Time` is a timespec, of 32 or of 64 bits.
template <typename Time>
int Sleep(const Time* time) {
  Fault::Wait(time->tv_sec * 1000000LL + time->tv_nsec / 1000);
  return 0;
}

struct Time64 {
  int64_t tv_sec;
  int32_t tv_nsec;
};

}  // namespace

extern "C" unsigned int sleep(unsigned int seconds) {
  Fault::Wait(seconds * 1000000LL);
  return 0;
}
extern "C" int usleep(useconds_t time) {
  Fault::Wait(time);
  return 0;
}
extern "C" int nanosleep(const timespec* time, timespec* /*rest*/) { return Sleep(time); }
extern "C" int clock_nanosleep(clockid_t, int, const timespec* time, timespec*) {
  return Sleep(time);
}
#if __SIZEOF_LONG__ == 4
extern "C" int __nanosleep64(const Time64* time, void*) { return Sleep(time); }
extern "C" int __clock_nanosleep_time64(int, int, const Time64* time, void*) { return Sleep(time); }
#endif

// In a build that counts what is executed, a child writes its counts then.
extern "C" void _exit(int status) {
  const Fault::Suspension suspension;
  Next<void(int)>("_exit")(status);
  abort();
}

extern "C" int fsync(int /*fd*/) {
  return Intercepts("fsync") || Hits("fsync", {EINTR, EIO, ENOSPC}) ? -1 : 0;
}
extern "C" int fdatasync(int /*fd*/) { return Hits("fdatasync", {EINTR, EIO, ENOSPC}) ? -1 : 0; }

// Memory. Each form of operator new is defined, and its delete, so that none meets another's.
namespace {

void* New(size_t size, const char* name) {
  if (Hits(name, {kNoMemory})) return nullptr;
  const Fault::Suspension suspension;
  return malloc(size > 0 ? size : 1);
}

void* NewOrThrow(size_t size, const char* name) {
  void* const memory = New(size, name);
  if (memory == nullptr) throw std::bad_alloc();
  return memory;
}

}  // namespace

void* operator new(size_t size) { return NewOrThrow(size, "new"); }
void* operator new[](size_t size) { return NewOrThrow(size, "new[]"); }
void* operator new(size_t size, const std::nothrow_t& /*tag*/) noexcept { return New(size, "new"); }
void* operator new[](size_t size, const std::nothrow_t& /*tag*/) noexcept {
  return New(size, "new[]");
}
void operator delete(void* memory) noexcept { free(memory); }
void operator delete[](void* memory) noexcept { free(memory); }
void operator delete(void* memory, size_t /*size*/) noexcept { free(memory); }
void operator delete[](void* memory, size_t /*size*/) noexcept { free(memory); }
void operator delete(void* memory, const std::nothrow_t& /*tag*/) noexcept { free(memory); }
void operator delete[](void* memory, const std::nothrow_t& /*tag*/) noexcept { free(memory); }

// JsonCpp and the C library's streams take theirs from here. A sanitizer has its own.
#ifndef __SANITIZE_ADDRESS__
extern "C" void* __libc_malloc(size_t size);
extern "C" void* __libc_calloc(size_t count, size_t size);
extern "C" void* __libc_realloc(void* memory, size_t size);

extern "C" void* malloc(size_t size) {
  return Hits("malloc", {kNoMemory}) ? nullptr : __libc_malloc(size);
}
extern "C" void* calloc(size_t count, size_t size) {
  return Hits("calloc", {kNoMemory}) ? nullptr : __libc_calloc(count, size);
}
extern "C" void* realloc(void* memory, size_t size) {
  return Hits("realloc", {kNoMemory}) ? nullptr : __libc_realloc(memory, size);
}
#endif
