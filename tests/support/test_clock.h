// The time of day, the sleeps and the random numbers of a test program. Its own calls stand before
// those of the C library, for the shared libraries as well: time(), usleep(), getrandom(), and
// nanosleep() and clock_nanosleep() where a shared library makes them (a test's own ones are real).
// All of them are real until a test says otherwise.

#ifndef KELODRCORE_TESTS_SUPPORT_TEST_CLOCK_H_
#define KELODRCORE_TESTS_SUPPORT_TEST_CLOCK_H_

#include <sys/types.h>

#include <ctime>
#include <functional>
#include <optional>
#include <vector>

// What a sleep is to answer without sleeping; nothing for a sleep that is to be real.
using SleepStandIn = std::function<std::optional<int>(useconds_t microseconds)>;

// Asks `standIn` about each sleep from here on; all of them are real without one.
void ReplaceSleeps(SleepStandIn standIn);

namespace TestClock {

// time() answers `now` from here on; -1 makes it fail.
void SetTime(time_t now);

// Sleeps take no time from here on: their lengths are recorded, and `duringSleep` runs.
void SkipSleeps(std::function<void()> duringSleep = {});

// The lengths in microseconds of the sleeps skipped since the last call, oldest first.
std::vector<unsigned int> TakeSleeps();

// The real time and real sleeps again.
void Reset();

}  // namespace TestClock

// While it lives, the draws of this process are 0, 1, 2 and so on: as many draws as a range has
// numbers, or more, give every one of them.
class CountingGenerator {
 public:
  CountingGenerator();
  ~CountingGenerator();
  CountingGenerator(const CountingGenerator&) = delete;
  CountingGenerator& operator=(const CountingGenerator&) = delete;
};

#endif  // KELODRCORE_TESTS_SUPPORT_TEST_CLOCK_H_
