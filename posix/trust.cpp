#include "posix/trust.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>

#include "posix/file_io.h"

namespace KeloDRCore::Posix {
namespace {

bool IsOwn(const struct stat& file) { return file.st_uid == 0 || file.st_uid == geteuid(); }

bool IsOfDirectory(const struct stat& file, const struct stat& directory) {
  return file.st_uid == directory.st_uid && (directory.st_mode & S_IWOTH) == 0;
}

bool Accept(const struct stat& file, const std::string& path) {
  if (IsBelieved(file, path)) return true;
  return Fail(S_ISREG(file.st_mode) ? EACCES : EINVAL);
}

}  // namespace

bool IsBelieved(const struct stat& file, const std::string& path) {
  if (!S_ISREG(file.st_mode)) return false;
  if (IsOwn(file)) return true;
  const std::string parent = DirectoryOf(path);
  struct stat directory = {};
  return StatAt(AT_FDCWD, parent, 0, directory) && IsOfDirectory(file, directory);
}

bool IsOwnerBelieved(const struct stat& file, int directory) {
  struct stat found = {};
  return IsOwn(file) || (Stat(directory, found) && IsOfDirectory(file, found));
}

bool IsBelieved(const struct stat& file, int directory) {
  return S_ISREG(file.st_mode) && IsOwnerBelieved(file, directory);
}

bool StatBelieved(const std::string& path, struct stat& found) {
  return StatAt(AT_FDCWD, path, AT_SYMLINK_NOFOLLOW, found) && Accept(found, path);
}

Descriptor OpenBelieved(const std::string& path) {
  Descriptor file = Open(path, O_RDONLY | O_NOFOLLOW | kHarmless);
  struct stat found = {};
  if (file.IsOpen() && !(Stat(file.Get(), found) && Accept(found, path))) file.Close();
  return file;
}

}  // namespace KeloDRCore::Posix
