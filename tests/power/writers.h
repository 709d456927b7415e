// What is written on the disk that loses power, and what of it has to be there afterwards.

#ifndef KELODRCORE_TESTS_POWER_WRITERS_H_
#define KELODRCORE_TESTS_POWER_WRITERS_H_

#include <functional>

// Writes the thing of this number; true acknowledges it.
using Step = std::function<bool(int number)>;

struct Writer {
  const char* name;  // of what it writes, for the report
  int most;          // steps before a cut
  int mayLose;       // acknowledged steps
  Step (*Start)();
  int (*Find)();  // the number of the last step that is there; -1 for anything broken
};

inline constexpr int kWriterCount = 4;
extern const Writer kWriters[kWriterCount];

#endif  // KELODRCORE_TESTS_POWER_WRITERS_H_
