#include "posix/file_io.h"

#include <sys/random.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>

#include "posix/retry.h"

namespace KeloDRCore::Posix {

bool Fail(int error) {
  errno = error;
  return false;
}

std::string DirectoryOf(const std::string& path) {
  const size_t slash = path.rfind('/');
  if (slash == std::string::npos) return ".";
  return path.substr(0, slash + 1);
}

Descriptor OpenAt(int directory, const std::string& path, int flags, mode_t mode) {
  return Descriptor(
      Retry([&] { return openat(directory, path.c_str(), flags | O_CLOEXEC, mode); }));
}

Descriptor Open(const std::string& path, int flags, mode_t mode) {
  return OpenAt(AT_FDCWD, path, flags, mode);
}

bool Stat(int fd, struct stat& found) {
  return Retry([&] { return fstat(fd, &found); }) == 0;
}

bool StatAt(int directory, const std::string& path, int flags, struct stat& found) {
  return Retry([&] { return fstatat(directory, path.c_str(), &found, flags); }) == 0;
}

bool IsSameFile(const struct stat& one, const struct stat& other) {
  return one.st_dev == other.st_dev && one.st_ino == other.st_ino;
}

bool SetOwner(int fd, uid_t user, gid_t group) {
  return Retry([&] { return fchown(fd, user, group); }) == 0;
}

bool SetMode(int fd, mode_t mode) {
  return Retry([&] { return fchmod(fd, mode); }) == 0;
}

bool Sync(int fd) {
  return Retry([&] { return fsync(fd); }) == 0;
}

bool UnlinkAt(int directory, const std::string& path) {
  return Retry([&] { return unlinkat(directory, path.c_str(), 0); }) == 0 || errno == ENOENT;
}

bool MoveAway(int directory, const std::string& path) {
  unsigned long long random = 0;
  if (Retry([&] { return getrandom(&random, sizeof random, 0); }) < 0) return false;
  const std::string aside =
      path.substr(0, path.rfind('/') + 1) + ".planted-" + std::to_string(random);
  return Retry([&] { return renameat(directory, path.c_str(), directory, aside.c_str()); }) == 0 ||
         errno == ENOENT;
}

bool ReadAll(int fd, std::string& text, size_t limit) {
  // Files of /proc give a size of 0, and some of them their content to the first read only.
  constexpr size_t kSmallestRead = 4096;
  struct stat found = {};
  if (!Stat(fd, found)) return false;
  const auto size = static_cast<unsigned long long>(found.st_size);
  if (size >= text.max_size() / 2) return Fail(EFBIG);
  // The byte more finds the end without growing.
  text.resize(std::min(limit, std::max(static_cast<size_t>(size) + 1, kSmallestRead)));
  size_t done = 0;
  while (done < limit) {
    const ssize_t count = Retry([&] { return read(fd, &text[done], text.size() - done); });
    if (count < 0) return false;
    if (count == 0) break;
    done += static_cast<size_t>(count);
    if (done < text.size()) continue;
    if (text.size() > text.max_size() / 2) return Fail(EFBIG);  // GCOVR_EXCL_BR_LINE: 32 bits
    text.resize(std::min(limit, 2 * text.size()));
  }
  text.resize(done);
  return true;
}

bool WriteAll(int fd, std::string_view text) {
  while (!text.empty()) {
    const ssize_t count = Retry([&] { return write(fd, text.data(), text.size()); });
    if (count < 0) return false;
    if (count == 0) return Fail(EIO);
    text.remove_prefix(static_cast<size_t>(count));
  }
  return true;
}

}  // namespace KeloDRCore::Posix
