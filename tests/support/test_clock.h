// The time of day and the sleeps of a test program: its own time() stands before the C library's,
// as its usleep() does (sleep.h), for the shared library as well. Real until a test says otherwise.

#ifndef KELODRCORE_TESTS_SUPPORT_TEST_CLOCK_H_
#define KELODRCORE_TESTS_SUPPORT_TEST_CLOCK_H_

#include <ctime>
#include <functional>
#include <vector>

namespace TestClock {

// time() answers `now` from here on; -1 makes it fail.
void SetTime(time_t now);

// usleep() takes no time from here on: it only records its length and calls `duringSleep`.
void SkipSleeps(std::function<void()> duringSleep = {});

// The lengths in microseconds of the sleeps skipped since the last call, oldest first.
std::vector<unsigned int> TakeSleeps();

// The real time and real sleeps again.
void Reset();

}  // namespace TestClock

#endif  // KELODRCORE_TESTS_SUPPORT_TEST_CLOCK_H_
