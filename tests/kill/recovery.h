// What the kill sweeps share: files in memory, pairs of kills, and what is asked of the world
// after.

#ifndef KELODRCORE_TESTS_KILL_RECOVERY_H_
#define KELODRCORE_TESTS_KILL_RECOVERY_H_

#include <functional>
#include <string>

#include "support/tracer.h"

// Of the instants of a first and of a second process, one in so many.
struct Sample {
  int first;
  int second;
};

// Two operations, one after the other, and how many processes each of them consists of.
struct Succession {
  std::function<void()> first;
  std::function<void()> second;
  int processes = 1;
};

// Kills one process of the first operation and then one of the second at pairs of their instants
// and runs `check` after each pair; `prepare` runs before it. The second one's instants start
// elsewhere for each of the first one's, so that neighbours differ. With KELODR_EVERY_PAIR in the
// environment every pair is taken, in builds whose processes fork slowly fewer than the sample.
// Returns how many pairs there were.
int SweepPairs(const Sample& sample, const std::function<void()>& prepare,
               const Succession& operations,
               const std::function<void(const Tracer::Moment&)>& check);

// Runs `action` and expects it to be done at once: well below the shortest time that the library
// waits for anybody, the five seconds of a lock.
void ExpectPrompt(const std::function<void()>& action);

// Expects that the lock can be had, at once.
void ExpectFree(const std::string& lockName);

#endif  // KELODRCORE_TESTS_KILL_RECOVERY_H_
