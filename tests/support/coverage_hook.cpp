// Coverage builds only; part of the library and of each test program (coverage_exit.cpp tells why).

extern "C" {
void __gcov_dump();
// Absent in programs that are no tests.
void KelodrDumpAtExit(void (*dump)()) __attribute__((weak));
}

namespace {

[[maybe_unused]] const bool isHandedIn = [] {
  if (KelodrDumpAtExit != nullptr) KelodrDumpAtExit(__gcov_dump);
  return true;
}();

}  // namespace
