// Users, signals and limits for tests of processes; what changes them belongs into a child.

#ifndef KELODRCORE_TESTS_SUPPORT_PROCESS_H_
#define KELODRCORE_TESTS_SUPPORT_PROCESS_H_

#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>

inline bool IsRoot() { return geteuid() == 0; }

// A child that is forked beside threads may find the allocator of AddressSanitizer locked for ever.
#ifdef __SANITIZE_ADDRESS__
inline constexpr bool kMayForkBesideThreads = false;
#else
inline constexpr bool kMayForkBesideThreads = true;
#endif

// An id that no other process of this machine runs under.
inline uid_t PrivateUid() { return 1000000 + static_cast<uid_t>(getpid()); }

inline struct sigaction Disposition(int signalNumber) {
  struct sigaction action {};
  sigaction(signalNumber, nullptr, &action);
  return action;
}

inline void Handle(int signalNumber, void (*handler)(int), int flags) {
  struct sigaction action {};
  action.sa_handler = handler;
  action.sa_flags = flags;
  sigaction(signalNumber, &action, nullptr);
}

inline void ReapEverything(int /*signalNumber*/) {
  const int savedErrno = errno;
  while (waitpid(-1, nullptr, WNOHANG) > 0) {
  }
  errno = savedErrno;
}

// Lowers what is allowed, not what could be allowed again.
inline void LowerLimit(decltype(RLIMIT_NOFILE) resource, rlim_t value) {
  rlimit limit{};
  ASSERT_EQ(getrlimit(resource, &limit), 0);
  limit.rlim_cur = value;
  ASSERT_EQ(setrlimit(resource, &limit), 0);
}

// Takes every descriptor number but those of the standard streams.
inline void LeaveNoDescriptors() { LowerLimit(RLIMIT_NOFILE, 3); }

#endif  // KELODRCORE_TESTS_SUPPORT_PROCESS_H_
