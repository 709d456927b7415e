#include "posix/directory_walk.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>

#include "posix/file_io.h"
#include "posix/retry.h"

namespace KeloDRCore::Posix {
namespace {

constexpr mode_t kMode = 0755;

// How often a step is tried: whoever may write beside it can put something else there each time.
constexpr int kMaxAttempts = 10;

struct Step {
  std::string name;
  std::string path;  // from the root directory to `name`
  bool isFirst;
  bool isBelow;  // no ".." on the way
};

// By the descriptor: what the name means may change at any moment.
bool Secure(int directory) {
  struct stat found = {};
  if (!Stat(directory, found)) return false;
  const uid_t user = geteuid();
  if (user != 0 && found.st_uid != 0 && found.st_uid != user) return Fail(EACCES);
  if (user != 0 || (found.st_uid == 0 && (found.st_mode & (S_IWGRP | S_IWOTH)) == 0)) return true;
  return SetOwner(directory, 0, 0) && SetMode(directory, kMode);
}

// After a failure to open it: whether what is no directory could be taken away. In the place of the
// first step, even a file of root's may be a stranger's work: a hard link.
bool ClearStep(int parent, const Step& step) {
  if ((errno != ENOTDIR && errno != ELOOP) || geteuid() != 0 || !step.isBelow) return false;
  if (!step.isFirst) return ClearPlanted(parent, step.name);
  return UnlinkAt(parent, step.name);
}

// Its owner may have moved the directory away before it was secured.
bool IsAt(int parent, const std::string& name, int directory) {
  struct stat named = {};
  struct stat open = {};
  return StatAt(parent, name, AT_SYMLINK_NOFOLLOW, named) && Stat(directory, open) &&
         IsSameFile(named, open);
}

// Whatever the umask: it is everybody's way to the files below.
bool Make(int parent, const std::string& name) {
  return Retry([&] { return mkdirat(parent, name.c_str(), kMode); }) == 0 &&
         Retry([&] { return fchmodat(parent, name.c_str(), kMode, 0); }) == 0;
}

bool IsLink(int parent, const std::string& name) {
  struct stat found = {};
  return StatAt(parent, name, AT_SYMLINK_NOFOLLOW, found) && S_ISLNK(found.st_mode);
}

Descriptor OpenStep(int parent, const Step& step, const std::string& path,
                    const MakeDirectory& make) {
  for (int attempt = 0; attempt < kMaxAttempts; ++attempt) {
    Descriptor opened = OpenAt(parent, step.name, O_RDONLY | O_DIRECTORY | O_NOFOLLOW);
    if (opened.IsOpen()) {
      if (!step.isBelow) return opened;
      if (!Secure(opened.Get())) return {};
      if (IsAt(parent, step.name, opened.Get())) return opened;
    } else if (errno == ENOENT) {
      if (!Make(parent, step.name) && !make(step.path)) return {};
    } else if (!ClearStep(parent, step)) {
      // Below the first step the way is safe, and the whole directory is what cannot be made. A
      // link would be followed on the way to it.
      make(step.isFirst || IsLink(parent, step.name) ? step.path : path);
      return {};
    }
  }
  return {};
}

}  // namespace

bool ClearPlanted(int directory, const std::string& name) {
  struct stat found = {};
  if (geteuid() != 0 || !StatAt(directory, name, AT_SYMLINK_NOFOLLOW, found)) return false;
  if (found.st_uid == 0) return false;
  return S_ISDIR(found.st_mode) ? MoveAway(directory, name) : UnlinkAt(directory, name);
}

Descriptor OpenStepwise(const std::string& start, const std::string& path,
                        const MakeDirectory& make) {
  Descriptor directory = Open(start, O_RDONLY | O_DIRECTORY);
  Step step{{}, {}, true, true};
  size_t begin = path.find_first_not_of('/', start.size());
  while (directory.IsOpen() && begin != std::string::npos) {
    const size_t end = std::min(path.find('/', begin), path.size());
    step.name = path.substr(begin, end - begin);
    step.path = path.substr(0, end);
    step.isBelow = step.isBelow && step.name != "..";
    directory = OpenStep(directory.Get(), step, path, make);
    step.isFirst = false;
    begin = path.find_first_not_of('/', end);
  }
  return directory;
}

}  // namespace KeloDRCore::Posix
