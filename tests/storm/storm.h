// Storms: many processes do the same things at once, by a seed, and some of them are killed.

#ifndef KELODRCORE_TESTS_STORM_STORM_H_
#define KELODRCORE_TESTS_STORM_STORM_H_

#include <json/json.h>
#include <sys/mman.h>
#include <sys/types.h>

#include <algorithm>
#include <cstdlib>
#include <functional>
#include <new>
#include <random>
#include <string>
#include <vector>

struct Settings {
  std::string dir;  // the storm's own, empty at its start
  int processes;
  int seconds;
  int count;
  int seed;
  int pause = 0;
};

// Each returns the figures for its report; what they run is told in main.cpp.
std::string Soak(const Settings& settings);
std::string KilledHolders(const Settings& settings);
std::string Expiries(const Settings& settings);
std::string Readers(const Settings& settings);

// Says what is wrong, in whatever process, and makes the storm fail.
void Expect(bool holds, const std::string& what);

// Whether everything held so far, in all processes.
bool IsAllWell();

// What every log line of the library is shown to, by its format.
void WatchLog(std::function<void(const char* format)> watcher);

// A T, made of zero bytes, that all processes forked from here on share. It stays until the end.
template <typename T>
T& MakeShared() {
  void* const memory =
      mmap(nullptr, sizeof(T), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
  if (memory == MAP_FAILED) abort();
  return *new (memory) T();
}

// A document that shows whether it is whole.
Json::Value Numbered(int number);
bool IsWhole(const Json::Value& document);

// The random numbers of one life of one worker.
std::mt19937 Generator(const Settings& settings, int worker, int life);
int Draw(std::mt19937& generator, int below);
void SleepMs(int milliseconds);

// False also for a process that has ended and was not waited for.
bool IsAlive(pid_t pid);

// Child processes, numbered from 0. A killed one is replaced by another life of the same number.
class Workers {
 public:
  using Body = std::function<void(int worker, int life)>;

  Workers(int count, const Body& work);

  void Kill(int worker);

  pid_t Pid(int worker) const { return pids[static_cast<size_t>(worker)]; }

  bool Has(pid_t pid) const { return std::count(pids.begin(), pids.end(), pid) > 0; }

  // Waits for those that have ended, those that others left to this process, too.
  void Reap();

  // Waits until each has ended by itself, and whatever they left to nobody, too.
  void Join(bool isKillingOver);

  int Killed() const { return killed; }

 private:
  void Start(size_t worker);
  void TakeAll(int options, bool restart);
  void Take(pid_t pid, int status, bool restart);

  Body body;
  std::vector<pid_t> pids;
  std::vector<int> lives;
  int killed = 0;
};

#endif  // KELODRCORE_TESTS_STORM_STORM_H_
