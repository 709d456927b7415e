#include "kill/recovery.h"

#include <gtest/gtest.h>
#include <sys/file.h>
#include <unistd.h>

#include <chrono>
#include <cstdlib>

#include "kelodrcore/file_lock.h"

using Tracer::Moment;

namespace {

// A kill loses nothing that was written, on a disk or not. In memory a sync costs nothing, and a
// sweep makes thousands. Set before any fixture asks for it.
[[maybe_unused]] const bool inMemory =
    access("/dev/shm", W_OK | X_OK) == 0 && setenv("TMPDIR", "/dev/shm", 0) == 0;

Sample StepsOf(const Sample& sample) {
  if (getenv("KELODR_EVERY_PAIR") != nullptr) return {1, 1};
  return {sample.first * KELODR_THINNING, sample.second};
}

}  // namespace

int SweepPairs(const Sample& sample, const std::function<void()>& prepare,
               const Succession& operations, const std::function<void(const Moment&)>& check) {
  const Sample step = StepsOf(sample);
  int pairs = 0;
  bool killedFirst = false;
  // Whether the second operation was killed.
  const auto killBoth = [&](const Moment& one, const Moment& two) {
    prepare();
    killedFirst = Tracer::KilledAt(one, operations.first);
    const bool killedSecond = Tracer::KilledAt(two, operations.second);
    check(two);
    pairs += killedFirst && killedSecond;
    return killedSecond;
  };
  for (Moment one; one.process < operations.processes; one = {one.process + 1, 0}) {
    killedFirst = true;
    for (; killedFirst && !testing::Test::HasFailure(); one.call += step.first) {
      for (int process = 0; process < operations.processes; ++process) {
        Moment two{process, one.call % step.second};
        while (killBoth(one, two)) two.call += step.second;
      }
    }
  }
  return pairs;
}

void ExpectPrompt(const std::function<void()>& action) {
  const auto start = std::chrono::steady_clock::now();
  action();
  EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(4));
}

void ExpectFree(const std::string& lockName) {
  ExpectPrompt([&] {
    EXPECT_TRUE(KeloDRCore::FileLock(lockName).tryLock(LOCK_EX | LOCK_NB)) << "held by nobody";
  });
}
