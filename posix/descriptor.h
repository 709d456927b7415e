// A file descriptor that closes itself.

#ifndef KELODRCORE_POSIX_DESCRIPTOR_H_
#define KELODRCORE_POSIX_DESCRIPTOR_H_

#include <unistd.h>

#include <cerrno>
#include <utility>

namespace KeloDRCore::Posix {

// Owns a descriptor, or none (-1). Closing it leaves errno alone, so that failure paths need not
// save it.
class Descriptor {
 public:
  Descriptor() = default;
  explicit Descriptor(int owned) : fd(owned) {}
  Descriptor(Descriptor&& other) noexcept : fd(other.Release()) {}
  Descriptor& operator=(Descriptor&& other) noexcept {
    std::swap(fd, other.fd);
    return *this;
  }
  ~Descriptor() { Close(); }

  bool IsOpen() const { return fd >= 0; }
  int Get() const { return fd; }
  int Release() { return std::exchange(fd, -1); }
  void Close() {
    const int savedErrno = errno;
    if (fd >= 0) close(Release());  // not made again: Linux frees the number even when interrupted
    errno = savedErrno;
  }

 private:
  int fd = -1;
};

}  // namespace KeloDRCore::Posix

#endif  // KELODRCORE_POSIX_DESCRIPTOR_H_
