#include "posix/access.h"

#include <sys/xattr.h>

#include <cerrno>
#include <optional>
#include <set>
#include <string>

#include "posix/file_io.h"
#include "posix/retry.h"

namespace KeloDRCore::Posix {
namespace {

const char kAcl[] = "system.posix_acl_access";
constexpr size_t kLongest = 65536;  // of a value and of a list of names, to the kernel

using Attribute = std::optional<std::string>;

// Attributes are asked for by this name: the calls that take a descriptor refuse one of O_PATH.
std::string NameOf(int fd) { return "/proc/self/fd/" + std::to_string(fd); }

// A file system without attributes has none.
bool IsNone() { return errno == ENODATA || errno == ENOTSUP; }

bool GetAttribute(const std::string& file, const std::string& name, Attribute& value) {
  std::string buffer(kLongest, '\0');
  const ssize_t size =
      Retry([&] { return getxattr(file.c_str(), name.c_str(), buffer.data(), buffer.size()); });
  if (size < 0) return IsNone();
  value = buffer.substr(0, static_cast<size_t>(size));
  return true;
}

bool AddNames(const std::string& file, std::set<std::string>& names) {
  std::string list(kLongest, '\0');
  const ssize_t size = Retry([&] { return listxattr(file.c_str(), list.data(), list.size()); });
  if (size < 0) return IsNone();
  for (size_t at = 0; at < static_cast<size_t>(size);) {
    const std::string name = list.c_str() + at;
    if (name.rfind("user.", 0) == 0 || name.rfind("security.", 0) == 0) names.insert(name);
    at += name.size() + 1;
  }
  return true;
}

bool SetAttribute(const std::string& file, const std::string& name, const Attribute& value) {
  return Retry([&] {
           return value ? setxattr(file.c_str(), name.c_str(), value->data(), value->size(), 0)
                        : removexattr(file.c_str(), name.c_str());
         }) == 0;
}

bool CopyAttribute(const std::string& from, const std::string& to, const std::string& name) {
  Attribute wanted;
  Attribute found;
  if (!GetAttribute(from, name, wanted) || !GetAttribute(to, name, found)) return false;
  return wanted == found || SetAttribute(to, name, wanted);
}

// An attribute that only the new file has was given to it by its directory.
bool CopyAttributes(int fromFd, int toFd) {
  const std::string from = NameOf(fromFd);
  const std::string to = NameOf(toFd);
  std::set<std::string> names = {kAcl};
  if (!AddNames(from, names) || !AddNames(to, names)) return false;
  for (const std::string& name : names) {
    if (!CopyAttribute(from, to, name)) return false;
  }
  return true;
}

bool CopyOwner(int from, int to) {
  struct stat wanted = {};
  struct stat found = {};
  if (!Stat(from, wanted) || !Stat(to, found)) return false;
  if (wanted.st_uid == found.st_uid && wanted.st_gid == found.st_gid) return true;
  return SetOwner(to, wanted.st_uid, wanted.st_gid);
}

}  // namespace

bool CopyAccess(int from, int to, mode_t added) {
  struct stat wanted = {};
  // A change of owner clears attributes and set-id bits, and an ACL changes the mode.
  return CopyOwner(from, to) && CopyAttributes(from, to) && Stat(from, wanted) &&
         SetMode(to, (wanted.st_mode & kModeBits) | added);
}

}  // namespace KeloDRCore::Posix
