// Loaded before the C library by scripts/coverage.sh. A process writes its counts when it exits,
// but not at _exit(), with which the children of tests and of the library end. Here it exits.

#include <errno.h>
#include <stdlib.h>
#include <string.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <unistd.h>

// Only the test programs and drctl: a shell's children must not write its buffers a second time.
static bool IsCounted() {
  const char* const name = program_invocation_short_name;
  const size_t length = strlen(name);
  return strcmp(name, "drctl") == 0 || (length > 5 && strcmp(name + length - 5, "_test") == 0);
}

// The limits of a test are not meant for the counts.
static void LiftLimit(decltype(RLIMIT_NOFILE) resource) {
  rlimit limit{};
  getrlimit(resource, &limit);
  limit.rlim_cur = limit.rlim_max;
  setrlimit(resource, &limit);
}

extern "C" void _exit(int status) {
  if (IsCounted()) {
    LiftLimit(RLIMIT_NOFILE);
    LiftLimit(RLIMIT_FSIZE);
    exit(status);
  }
  for (;;) syscall(SYS_exit_group, status);
}
