// How the cost of a cache read and of a lock grows with the processes that want it at once. The
// time is that of the whole machine, divided by all that was read or locked.

#include <sys/file.h>

#include <memory>

#include "contenders.h"
#include "kelodrcore/file_lock.h"
#include "processes.h"
#include "support.h"

namespace bench {
namespace {

constexpr int kReads = 2000;
constexpr int kLocks = 200;

// More than any turn of 64 waiting processes takes.
constexpr unsigned int kTimeout = 600;

void Measure(const char* operation, int processes, const Contestant& contestant, int times,
             const std::function<std::function<void()>()>& prepare) {
  Register(operation, std::to_string(processes), contestant,
           [=](benchmark::State& state) {
             for (auto _ : state) {
               state.SetIterationTime(SecondsOfCrowd(processes, prepare) / (processes * times));
             }
           })
      ->UseManualTime()
      ->Iterations(1)
      ->Unit(benchmark::kMicrosecond);
}

const Json::Value& SmallDocument() {
  static const Json::Value document = [] {
    Json::Value data;
    ParseWithJsonCpp(NodesDocument(1024), data);
    return data;
  }();
  return document;
}

// Before the processes start: a file that is written again would have to be loaded again.
void WriteFiles() {
  DocumentCache(ScratchPath("cache"), "crowd").UpdateWithData(SmallDocument());
  WriteWhole(ScratchPath("crowd"), WriteWithJsonCpp(SmallDocument()));
}

std::function<void()> ReadWithLibrary() {
  const auto cache = std::make_shared<DocumentCache>(ScratchPath("cache"), "crowd");
  cache->Read();
  return [cache] {
    for (int i = 0; i < kReads; ++i) Require(cache->Read().isArray(), "Cache::Read");
  };
}

std::function<void()> ReadByHand() {
  const auto cache = std::make_shared<CacheByHand>(ScratchPath("crowd"), SmallDocument());
  return [cache] {
    for (int i = 0; i < kReads; ++i) Require(cache->Read().isArray(), "Read");
  };
}

std::function<void()> LockWithLibrary(int type) {
  const auto lock = std::make_shared<KeloDRCore::FileLock>("kelodr_bench.crowd");
  return [lock, type] {
    for (int i = 0; i < kLocks; ++i) {
      Require(lock->lock(type, kTimeout), "lock");
      lock->unlock();
    }
  };
}

std::function<void()> LockByHandInTurn(int type) {
  const auto lock = std::make_shared<LockByHand>(ScratchPath("locks"));
  return [lock, type] {
    for (int i = 0; i < kLocks; ++i) {
      Require(lock->Lock(type, kTimeout), "lock");
      lock->Unlock();
    }
  };
}

const Benchmarks registered([] {
  WriteFiles();
  for (const int processes : {1, 2, 4, 8, 16, 32, 64}) {
    Measure("growth cache", processes, kLibrary, kReads, ReadWithLibrary);
    Measure("growth cache", processes, Baseline(), kReads, ReadByHand);
    Measure("growth lock waiting", processes, kLibrary, kLocks,
            [] { return LockWithLibrary(LOCK_EX); });
    Measure("growth lock waiting", processes, Baseline(), kLocks,
            [] { return LockByHandInTurn(LOCK_EX); });
    Measure("growth lock polling", processes, kLibrary, kLocks,
            [] { return LockWithLibrary(LOCK_EX | LOCK_NB); });
    Measure("growth lock polling", processes, Baseline(), kLocks,
            [] { return LockByHandInTurn(LOCK_EX | LOCK_NB); });
  }
});

}  // namespace
}  // namespace bench
