// Coverage builds only; part of the library and of each test program (coverage_exit.cpp tells why).

#include <pthread.h>

extern "C" {
void __gcov_dump();
void __gcov_reset();
// Absent in programs that are no tests.
void KelodrDumpAtExit(void (*dump)()) __attribute__((weak));
}

namespace {

[[maybe_unused]] const bool isHandedIn = [] {
  // What the parent executed is not counted once more for each child.
  pthread_atfork(nullptr, nullptr, __gcov_reset);
  if (KelodrDumpAtExit != nullptr) KelodrDumpAtExit(__gcov_dump);
  return true;
}();

}  // namespace
