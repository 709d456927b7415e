// Files: opened, looked at, read, written and told apart. A call that a signal interrupts is made
// again (retry.h), and every descriptor is closed on exec. A failure is a closed descriptor, false
// or an empty answer, with errno set.

#ifndef KELODRCORE_POSIX_FILE_IO_H_
#define KELODRCORE_POSIX_FILE_IO_H_

#include <fcntl.h>
#include <sys/stat.h>

#include <cstddef>
#include <string>
#include <string_view>

#include "posix/descriptor.h"

namespace KeloDRCore::Posix {

// For a file that may be anybody's: opening a FIFO does not wait for its writer, and opening a
// terminal does not make it the controlling one.
constexpr int kHarmless = O_NONBLOCK | O_NOCTTY;

// Sets errno for a failure that no call reports.
bool Fail(int error);

// The directory of the file at `path`: "a/" of "a/b", "." of "b".
std::string DirectoryOf(const std::string& path);

// A relative `path` begins at the open directory.
Descriptor OpenAt(int directory, const std::string& path, int flags, mode_t mode = 0);
Descriptor Open(const std::string& path, int flags, mode_t mode = 0);

bool Stat(int fd, struct stat& found);
bool StatAt(int directory, const std::string& path, int flags, struct stat& found);

bool IsSameFile(const struct stat& one, const struct stat& other);

bool SetOwner(int fd, uid_t user, gid_t group);
bool SetMode(int fd, mode_t mode);
bool Sync(int fd);

// Removes what is at `path`, which is no directory. True also when nothing is there.
bool UnlinkAt(int directory, const std::string& path);

// Gives what strangers may have put at `path` another name beside it, one that nobody can guess and
// take first. True also when nothing is there.
bool MoveAway(int directory, const std::string& path);

// Reads from the current position to the end, or up to `limit` bytes. `text` is unspecified after a
// failure.
bool ReadAll(int fd, std::string& text, size_t limit = std::string::npos);

bool WriteAll(int fd, std::string_view text);

}  // namespace KeloDRCore::Posix

#endif  // KELODRCORE_POSIX_FILE_IO_H_
