#include "own_claim.h"

#include <fcntl.h>

#include <mutex>
#include <utility>

#include "posix/file_io.h"
#include "posix/fork_mutex.h"

namespace KeloDRCore {

OwnClaim* OwnClaim::first = nullptr;

OwnClaim::OwnClaim(const std::string& path) : name(path.substr(path.rfind('/') + 1)) {
  Posix::StatAt(AT_FDCWD, Posix::DirectoryOf(path), 0, directory);
}

OwnClaim::~OwnClaim() {
  if (!isListed) return;
  const std::lock_guard<std::mutex> guard(Posix::forkMutex);
  OwnClaim** link = &first;
  while (*link != this) link = &(*link)->next;
  *link = next;
}

void OwnClaim::Enlist() {
  const std::lock_guard<std::mutex> guard(Posix::forkMutex);
  next = std::exchange(first, this);
  isListed = true;
}

// Claims of a process that forked this one are not its own.
bool OwnClaim::IsOfSameCache(const OwnClaim& other) const {
  return pid == other.pid && name == other.name && Posix::IsSameFile(directory, other.directory);
}

bool OwnClaim::IsMade(By who, const std::string& path) {
  const OwnClaim asked(path);
  const std::lock_guard<std::mutex> guard(Posix::forkMutex);
  for (const OwnClaim* claim = first; claim != nullptr; claim = claim->next) {
    if (!claim->IsOfSameCache(asked)) continue;
    if (who == By::kAnyThread || claim->thread == asked.thread) return true;
  }
  return false;
}

}  // namespace KeloDRCore
