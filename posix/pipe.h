// What a process and its fork tell each other.

#ifndef KELODRCORE_POSIX_PIPE_H_
#define KELODRCORE_POSIX_PIPE_H_

#include <fcntl.h>
#include <unistd.h>

#include <optional>
#include <utility>

#include "posix/descriptor.h"
#include "posix/retry.h"

namespace KeloDRCore::Posix {

constexpr int kFirstFreeDescriptor = STDERR_FILENO + 1;

// The same file above the standard streams, which a caller may have closed: what is put on one of
// their numbers later must not hit it.
inline Descriptor AboveStandardStreams(Descriptor descriptor) {
  if (!descriptor.IsOpen() || descriptor.Get() >= kFirstFreeDescriptor) return descriptor;
  return Descriptor(fcntl(descriptor.Get(), F_DUPFD_CLOEXEC, kFirstFreeDescriptor));
}

struct Pipe {
  Descriptor readEnd;
  Descriptor writeEnd;

  bool Open() {
    int ends[2];
    if (pipe2(ends, O_CLOEXEC) != 0) return false;
    Descriptor first(ends[0]);
    Descriptor second(ends[1]);
    readEnd = AboveStandardStreams(std::move(first));
    writeEnd = AboveStandardStreams(std::move(second));
    return readEnd.IsOpen() && writeEnd.IsOpen();
  }
};

// A number that one process reports to another; far below PIPE_BUF, so it goes as a whole.
inline void Send(int fd, int number) {
  Retry([&] { return write(fd, &number, sizeof number); });
}

// Nothing when all who could send it are gone.
inline std::optional<int> Receive(int fd) {
  int number = 0;
  const ssize_t size = Retry([&] { return read(fd, &number, sizeof number); });
  return size == sizeof number ? std::optional(number) : std::nullopt;
}

}  // namespace KeloDRCore::Posix

#endif  // KELODRCORE_POSIX_PIPE_H_
