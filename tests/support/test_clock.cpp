#include "support/test_clock.h"

#include <unistd.h>

#include <cerrno>
#include <optional>
#include <utility>

namespace {

std::optional<time_t> fixedTime;
bool skipping = false;
std::function<void()> sleepHook;
std::vector<unsigned int> sleeps;

}  // namespace

// The linker lets these stand before the C library's.
extern "C" {

int usleep(useconds_t microseconds) {
  if (skipping) {
    sleeps.push_back(microseconds);
    if (sleepHook) sleepHook();
    return 0;
  }
  timespec rest{static_cast<time_t>(microseconds / 1000000),
                static_cast<long>(microseconds % 1000000) * 1000};
  return nanosleep(&rest, nullptr);
}

time_t time(time_t* out) noexcept {
  time_t now = 0;
  if (fixedTime) {
    now = *fixedTime;
  } else {
    timespec real{};
    clock_gettime(CLOCK_REALTIME_COARSE, &real);  // the clock of time() and of file systems
    now = real.tv_sec;
  }
  if (out != nullptr) *out = now;
  return now;
}

}  // extern "C"

namespace TestClock {

void SetTime(time_t now) { fixedTime = now; }

void SkipSleeps(std::function<void()> duringSleep) {
  skipping = true;
  sleepHook = std::move(duringSleep);
}

std::vector<unsigned int> TakeSleeps() { return std::exchange(sleeps, {}); }

void Reset() {
  fixedTime.reset();
  skipping = false;
  sleepHook = nullptr;
  sleeps.clear();
}

}  // namespace TestClock
