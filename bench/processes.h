// Child processes: a number from one, and the time that many take together.

#ifndef KELODRCORE_BENCH_PROCESSES_H_
#define KELODRCORE_BENCH_PROCESSES_H_

#include <functional>

namespace bench {

// What `work` returns in a child process.
double NumberFromChild(const std::function<double()>& work);

// The seconds from the moment that `count` prepared processes are let go until the last one has
// done its work. `prepare` runs in each child before that moment and returns the work.
double SecondsOfCrowd(int count, const std::function<std::function<void()>()>& prepare);

}  // namespace bench

#endif  // KELODRCORE_BENCH_PROCESSES_H_
