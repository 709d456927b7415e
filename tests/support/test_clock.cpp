#include "support/test_clock.h"

#include <optional>
#include <utility>

#include "support/sleep.h"

namespace {

std::optional<time_t> fixedTime;
std::vector<unsigned int> sleeps;

}  // namespace

// The linker lets this stand before the C library's.
extern "C" time_t time(time_t* out) noexcept {
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

namespace TestClock {

void SetTime(time_t now) { fixedTime = now; }

void SkipSleeps(std::function<void()> duringSleep) {
  ReplaceSleeps([duringSleep = std::move(duringSleep)](useconds_t microseconds) {
    sleeps.push_back(microseconds);
    if (duringSleep) duringSleep();
    return 0;
  });
}

std::vector<unsigned int> TakeSleeps() { return std::exchange(sleeps, {}); }

void Reset() {
  fixedTime.reset();
  ReplaceSleeps(nullptr);
  sleeps.clear();
}

}  // namespace TestClock
