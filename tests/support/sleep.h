// The sleeps of a test program: its own usleep() stands before the C library's, for the shared
// libraries as well. Real until a test says otherwise.

#ifndef KELODRCORE_TESTS_SUPPORT_SLEEP_H_
#define KELODRCORE_TESTS_SUPPORT_SLEEP_H_

#include <sys/types.h>

#include <functional>
#include <optional>

// What usleep() is to answer without sleeping; nothing for a sleep that is to be real.
using SleepStandIn = std::function<std::optional<int>(useconds_t microseconds)>;

// Asks `standIn` about each sleep from here on; all of them are real without one.
void ReplaceSleeps(SleepStandIn standIn);

#endif  // KELODRCORE_TESTS_SUPPORT_SLEEP_H_
