// What a forked child must find whole, whatever other threads did at the fork.

#ifndef KELODRCORE_POSIX_FORK_MUTEX_H_
#define KELODRCORE_POSIX_FORK_MUTEX_H_

#include <mutex>

namespace KeloDRCore::Posix {

// Guards the few lists of a process. Every fork takes it and frees it again on both sides, so that
// a child never waits for a thread that it does not have. Nobody forks while holding it.
extern std::mutex forkMutex;

}  // namespace KeloDRCore::Posix

#endif  // KELODRCORE_POSIX_FORK_MUTEX_H_
