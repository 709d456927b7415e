#include <fcntl.h>
#include <pthread.h>
#include <sys/stat.h>

#include <atomic>
#include <cstring>
#include <ctime>

#include "kelodrcore/cache.h"
#include "storm/storm.h"

using KeloDRCore::Cache;

namespace {

constexpr long kTimeout = 1000;
constexpr int kPatienceMs = 30000;

struct Shared {
  pthread_barrier_t barrier;  // of all processes and the parent, before and after each expiry
  std::atomic<int> round;
  std::atomic<int> fetches;  // of this round
  std::atomic<int> arrived;  // who wait for the fetch of this round, or lost the claim to it
  std::atomic<int> fresh;
  std::atomic<int> old;
};

// A process that found the file stale before a refresh ended may claim the next one after it: the
// protocol does not look again. So the fetch lasts until everybody else has looked.
class RoundCache : public Cache {
 public:
  RoundCache(const Settings& all, Shared& state)
      : Cache(all.dir, "c", kTimeout, true, 0), settings(all), shared(state) {}

  Json::Value GetInfo() const override { return "storm"; }
  bool IsValidData(const Json::Value& data) const override { return !data.isNull(); }
  bool GetUpdatedData(Json::Value& out) const override {
    ++shared.fetches;
    int waited = 0;
    for (; shared.arrived < settings.processes - 1 && waited < kPatienceMs; ++waited) SleepMs(1);
    Expect(waited < kPatienceMs, "somebody neither waited for the fetch nor lost the claim");
    out = Numbered(shared.round);
    return true;
  }

 private:
  const Settings& settings;
  Shared& shared;
};

void ReadEachRound(const Settings& settings, Shared& shared) {
  WatchLog([&](const char* format) {
    const bool waits = strstr(format, "start to block wait") != nullptr;
    const bool lost = strstr(format, "Failed to update cache") != nullptr;
    if (waits || lost) ++shared.arrived;
  });
  const RoundCache cache(settings, shared);
  for (int round = 1; round <= settings.count; ++round) {
    pthread_barrier_wait(&shared.barrier);
    const Json::Value data = cache.Read();
    if (data == Numbered(round)) ++shared.fresh;
    if (data == Numbered(round - 1)) ++shared.old;
    pthread_barrier_wait(&shared.barrier);
  }
}

void Expire(const std::string& path) {
  const time_t past = time(nullptr) - 2 * kTimeout;
  const timespec times[2] = {{past, 0}, {past, 0}};
  Expect(utimensat(AT_FDCWD, path.c_str(), times, 0) == 0, "no cache file");
}

void MakeBarrier(pthread_barrier_t& barrier, int processes) {
  pthread_barrierattr_t attributes;
  pthread_barrierattr_init(&attributes);
  pthread_barrierattr_setpshared(&attributes, PTHREAD_PROCESS_SHARED);
  pthread_barrier_init(&barrier, &attributes, static_cast<unsigned int>(processes) + 1);
}

}  // namespace

std::string Expiries(const Settings& settings) {
  Shared& shared = MakeShared<Shared>();
  MakeBarrier(shared.barrier, settings.processes);
  Expect(RoundCache(settings, shared).UpdateWithData(Numbered(0)), "no first document");
  Workers workers(settings.processes, [&](int, int) { ReadEachRound(settings, shared); });
  int fetches = 0;
  for (int round = 1; round <= settings.count; ++round) {
    shared.round = round;
    shared.fetches = 0;
    shared.arrived = 0;
    Expire(settings.dir + "/c.cached");
    pthread_barrier_wait(&shared.barrier);
    pthread_barrier_wait(&shared.barrier);
    Expect(shared.fetches == 1, std::to_string(shared.fetches) + " fetches at an expiry");
    fetches += shared.fetches;
  }
  workers.Join(true);
  const int reads = settings.processes * settings.count;
  Expect(shared.fresh + shared.old == reads, "a read gave neither the new nor the old document");
  return std::to_string(settings.count) + " expiries, " + std::to_string(fetches) + " fetches, " +
         std::to_string(shared.fresh) + " reads of the new document, " +
         std::to_string(shared.old) + " of the old one by who lost the claim";
}
