// Coverage builds only. What a process has executed is written when it ends, but not by _exit; so
// the _exit here writes it first. The library and the test program are counted apart, and each
// hands in how its own counts are written (coverage_hook.cpp).

#include <sys/resource.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <initializer_list>

namespace {

constexpr int kMaxDumps = 8;
void (*dumps[kMaxDumps])();
int count = 0;

// The limits of a test are not meant for the counts.
void LiftLimits() {
  for (const auto resource : {RLIMIT_NOFILE, RLIMIT_FSIZE}) {
    rlimit limit{};
    getrlimit(resource, &limit);
    limit.rlim_cur = limit.rlim_max;
    setrlimit(resource, &limit);
  }
}

}  // namespace

extern "C" {

// Absent in programs that make no call fail.
void KelodrSuspendFaults() __attribute__((weak));

void KelodrDumpAtExit(void (*dump)()) {
  if (count < kMaxDumps) dumps[count++] = dump;
}

void _exit(int status) {
  LiftLimits();
  if (KelodrSuspendFaults != nullptr) KelodrSuspendFaults();
  while (count > 0) dumps[--count]();
  for (;;) syscall(SYS_exit_group, status);
}

}  // extern "C"
