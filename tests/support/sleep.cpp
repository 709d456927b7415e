#include "support/sleep.h"

#include <ctime>
#include <utility>

namespace {

constexpr useconds_t kSecond = 1000000;

SleepStandIn current;

}  // namespace

// The linker lets this stand before the C library's.
extern "C" int usleep(useconds_t microseconds) {
  const std::optional<int> result = current ? current(microseconds) : std::nullopt;
  if (result) return *result;
  const timespec length{static_cast<time_t>(microseconds / kSecond),
                        static_cast<long>(microseconds % kSecond) * 1000};
  return nanosleep(&length, nullptr);
}

void ReplaceSleeps(SleepStandIn standIn) { current = std::move(standIn); }
