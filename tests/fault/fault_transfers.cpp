// The calls that move data, which can fail and can move less than they are asked to.
//
// Those that the C library makes for its own streams do not come by here.

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "fault/fault.h"
#include "fault/interception.h"
#include "support/next.h"

using Fault::Hits;
using Fault::Intercepts;

namespace {

enum class Kind { kRead, kWrite };

// What goes through pipes here is a few bytes long, and those go as a whole.
bool IsFile(int fd) {
  const Fault::Suspension suspension;
  const int saved = errno;
  struct stat status = {};
  const bool isFile = fstat(fd, &status) == 0 && S_ISREG(status.st_mode);
  errno = saved;
  return isFile;
}

// How many of `size` bytes the call moves; false when it fails.
bool Permits(const char* call, Kind kind, int fd, size_t& size) {
  if (Intercepts(call)) {
    if (errno != Fault::kMoveNothing) return false;
    size = 0;
  }
  if (kind == Kind::kWrite ? Hits(call, {EINTR, EIO, ENOSPC}) : Hits(call, {EINTR, EIO})) {
    return false;
  }
  if (size == 0 || !IsFile(fd)) return true;
  if (kind == Kind::kWrite && Hits(call, {Fault::kDiskFull})) {
    size /= 2;
    return Fault::Failures() == 1 && size > 0;
  }
  if (size == 1) return true;
  if (Hits(call, {Fault::kOneByte})) size = 1;
  if (Hits(call, {Fault::kHalf})) size /= 2;
  return true;
}

}  // namespace

extern "C" ssize_t read(int fd, void* data, size_t size) {
  if (!Permits("read", Kind::kRead, fd, size)) return -1;
  return Next<ssize_t(int, void*, size_t)>("read")(fd, data, size);
}

extern "C" ssize_t write(int fd, const void* data, size_t size) {
  if (!Permits("write", Kind::kWrite, fd, size)) return -1;
  return Next<ssize_t(int, const void*, size_t)>("write")(fd, data, size);
}

extern "C" ssize_t pread64(int fd, void* data, size_t size, off64_t offset) {
  if (!Permits("pread64", Kind::kRead, fd, size)) return -1;
  return Next<ssize_t(int, void*, size_t, off64_t)>("pread64")(fd, data, size, offset);
}

extern "C" ssize_t pwrite64(int fd, const void* data, size_t size, off64_t offset) {
  if (!Permits("pwrite64", Kind::kWrite, fd, size)) return -1;
  return Next<ssize_t(int, const void*, size_t, off64_t)>("pwrite64")(fd, data, size, offset);
}
