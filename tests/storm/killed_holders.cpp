#include <sched.h>
#include <sys/file.h>

#include <atomic>
#include <csignal>

#include "kelodrcore/file_lock.h"
#include "storm/storm.h"

using KeloDRCore::FileLock;

namespace {

constexpr int kMostWorkers = 64;

// The counter is read and written in two steps, so that two holders at once lose a count.
struct Shared {
  std::atomic<int> counter;
  std::atomic<int> own[kMostWorkers];
};

void Count(std::atomic<int>& counter) {
  const int value = counter;
  sched_yield();
  counter = value + 1;
}

void Hold(Shared& shared, int worker, std::mt19937& random) {
  const bool dies = Draw(random, 10) == 0;
  const bool diesFirst = Draw(random, 2) == 0;
  if (dies && diesFirst) raise(SIGKILL);
  Count(shared.counter);
  ++shared.own[worker];
  if (dies) raise(SIGKILL);
}

}  // namespace

std::string KilledHolders(const Settings& settings) {
  Shared& shared = MakeShared<Shared>();
  Expect(settings.processes <= kMostWorkers, "too many processes");
  Workers workers(settings.processes, [&](int worker, int life) {
    std::mt19937 random = Generator(settings, worker, life);
    FileLock lock(settings.dir + "/lock");
    while (shared.own[worker] < settings.count) {
      if (!lock.lock(LOCK_EX, 0)) _exit(1);
      Hold(shared, worker, random);
      lock.unlock();
    }
  });
  workers.Join(false);
  const int expected = settings.processes * settings.count;
  Expect(shared.counter == expected, "the counter is " + std::to_string(shared.counter));
  Expect(FileLock(settings.dir + "/lock").tryLock(LOCK_EX | LOCK_NB), "held by nobody");
  return std::to_string(expected) + " counts, " + std::to_string(workers.Killed()) +
         " holders killed, counter " + std::to_string(shared.counter);
}
