// What a piece of work costs, counted instead of timed: the same on a busy machine.

#ifndef KELODRCORE_TESTS_GROWTH_COST_H_
#define KELODRCORE_TESTS_GROWTH_COST_H_

#include <functional>
#include <string>

struct Cost {
  double instructions;
  double heap;  // bytes: the peak during the work above what was held before it
};

// Runs the work, which valgrind must be counting: `counts` is its --callgrind-out-file.
Cost CostOf(const std::function<void()>& work, const std::string& counts);

#endif  // KELODRCORE_TESTS_GROWTH_COST_H_
