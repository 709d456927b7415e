// FileLock: taking and releasing a lock that nobody else wants.

#include <sys/file.h>

#include <boost/interprocess/sync/file_lock.hpp>

#include "contenders.h"
#include "kelodrcore/file_lock.h"
#include "support.h"

namespace bench {
namespace {

const Benchmarks registered([] {
  const char* const operation = "FileLock";
  const char* const work = "lock and unlock";
  Register(operation, work, kLibrary, [](benchmark::State& state) {
    KeloDRCore::FileLock lock("kelodr_bench.lock");
    for (auto _ : state) {
      Require(lock.lock(LOCK_EX | LOCK_NB, 0), "lock");
      lock.unlock();
    }
  });
  Register(operation, work, Baseline(1.3), [](benchmark::State& state) {
    LockByHand lock(ScratchPath("locks"));
    for (auto _ : state) {
      Require(lock.Lock(LOCK_EX | LOCK_NB, 0), "lock");
      lock.Unlock();
    }
  });
  // A record lock on a file that is open: no look at the file, no other user's ids.
  Register(operation, work, {"Boost.Interprocess"}, [](benchmark::State& state) {
    const std::string path = ScratchPath("boost.lock");
    WriteWhole(path, "");
    boost::interprocess::file_lock lock(path.c_str());
    for (auto _ : state) {
      Require(lock.try_lock(), "lock");
      lock.unlock();
    }
  });
});

}  // namespace
}  // namespace bench
