// Forking a process that goes on without its caller.

#ifndef KELODRCORE_SRC_LOCK_FORK_H_
#define KELODRCORE_SRC_LOCK_FORK_H_

namespace KeloDRCore {

// KLIBCProcForkEx with `flags` that put the standard streams on /dev/null. In the child every open
// FileLock leads there too: on return to the caller, the locks are the caller's alone.
int ForkWithoutLocks(int flags);

}  // namespace KeloDRCore

#endif  // KELODRCORE_SRC_LOCK_FORK_H_
