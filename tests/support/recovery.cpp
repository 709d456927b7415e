#include "support/recovery.h"

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
               const std::function<void()>& first, const std::function<void()>& second,
               const std::function<void(const Moment&)>& check) {
  const Sample step = StepsOf(sample);
  int pairs = 0;
  bool killedFirst = true;
  for (Moment one; killedFirst && !testing::Test::HasFailure(); one.call += step.first) {
    bool killedSecond = true;
    for (Moment two{0, one.call % step.second}; killedSecond; two.call += step.second) {
      prepare();
      killedFirst = Tracer::KilledAt(one, first);
      killedSecond = Tracer::KilledAt(two, second);
      check(two);
      pairs += killedFirst && killedSecond;
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
