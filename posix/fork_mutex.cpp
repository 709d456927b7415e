#include "posix/fork_mutex.h"

#include <pthread.h>

namespace KeloDRCore::Posix {

std::mutex forkMutex;

namespace {

void Lock() { forkMutex.lock(); }
void Unlock() { forkMutex.unlock(); }

[[maybe_unused]] const int registered = pthread_atfork(Lock, Unlock, Unlock);

}  // namespace
}  // namespace KeloDRCore::Posix
