#include <malloc.h>
#include <sys/file.h>
#include <sys/time.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <filesystem>
#include <fstream>

#include "kelodrcore/cache.h"
#include "kelodrcore/file_lock.h"
#include "kelodrcore/json_value.h"
#include "storm/soak.h"

using KeloDRCore::Cache;
using KeloDRCore::FileLock;
using KeloDRCore::JsonValue::fromFile;
using KeloDRCore::JsonValue::toFile;

namespace {

constexpr int kDyingMs = 5000;

std::atomic<int>* caught;

void CatchSignals(Shared& shared, std::mt19937& random) {
  caught = &shared.caught;
  struct sigaction action = {};
  action.sa_handler = [](int) { ++*caught; };
  for (const int number : {SIGALRM, SIGUSR1, SIGCHLD, SIGTERM}) {
    action.sa_flags = Draw(random, 2) == 0 ? SA_RESTART : 0;
    sigaction(number, &action, nullptr);
  }
}

// Interrupts whatever waits.
void StartTimer() {
  const timeval interval = {0, 5000};
  const itimerval timer = {interval, interval};
  setitimer(ITIMER_REAL, &timer, nullptr);
}

// Marks this process as the only one in a section. One that was killed there lets go of its locks a
// little before it is dead; one that goes on finds that it is not the only one when it leaves.
void Enter(std::atomic<pid_t>& section, const char* what) {
  const pid_t other = section.exchange(getpid());
  int waited = 0;
  for (; other != 0 && waited < kDyingMs && IsAlive(other); ++waited) SleepMs(1);
  Expect(waited < kDyingMs, what);
}

void Leave(std::atomic<pid_t>& section, const char* what) {
  Expect(section.exchange(0) == getpid(), what);
}

class SoakCache : public Cache {
 public:
  SoakCache(const Settings& settings, bool isRequired, Shared& state, std::mt19937& draws)
      : Cache(settings.dir + "/cache", "c", 1000, isRequired, 0), shared(state), random(draws) {}

  Json::Value GetInfo() const override { return "storm"; }
  bool IsValidData(const Json::Value& data) const override { return !data.isNull(); }
  bool IsNeedUpdate(const Json::Value& /*data*/) const override { return Draw(random, 5) == 0; }

  bool GetUpdatedData(Json::Value& out) const override {
    Enter(shared.fetcher, "two fetches at a time");
    SleepMs(Draw(random, 100));
    out = Numbered(++shared.fetches);
    Leave(shared.fetcher, "a fetch ended while another one ran");
    return Draw(random, 20) != 0;
  }

 private:
  Shared& shared;
  std::mt19937& random;
};

// One life of one worker.
class Worker {
 public:
  Worker(const Settings& all, Shared& state, std::mt19937 draws)
      : settings(all), shared(state), random(draws), rows(all, state, random) {}

  void DoOne() {
    static constexpr void (Worker::*kOperations[])() = {
        &Worker::Insert, &Worker::Insert, &Worker::Select, &Worker::ReadCache,
        &Worker::Write,  &Worker::Read,   &Worker::Count};
    const int which = Draw(random, static_cast<int>(std::size(kOperations)));
    (this->*kOperations[which])();
    SleepMs(Draw(random, settings.pause + 1));
  }

  Measure GetMeasure() {
    rows.Close();
    Expect(waitpid(-1, nullptr, WNOHANG) == -1 && errno == ECHILD, "a child is left");
    return MeasureThis();
  }

 private:
  void Insert() { rows.Insert(); }

  void Select() { rows.Check(kRecentGroups); }

  // Each fetch has the next number, and one at a time is written.
  void ReadCache() {
    const int oldest = shared.cached;
    const SoakCache cache(settings, Draw(random, 10) == 0, shared, random);
    const Json::Value data = cache.Read();
    if (data.isNull()) return Expect(oldest == 0, "the cache is empty again");
    if (!IsWhole(data)) return Expect(false, "a cache gave half a document");
    Expect(data["first"].asInt() >= oldest, "an older document is in the cache again");
    Raise(shared.cached, data["first"].asInt());
    ++shared.acknowledged[kCacheRead];
  }

  // Of all at once, each with any number.
  void Write() {
    const Operation operation(shared, kWrite);
    operation.End(toFile(Numbered(Draw(random, 100000)), Document(kDocuments)));
    Json::Value value;
    Expect(fromFile(value, Document(kDocuments)) && IsWhole(value), "half a document");
  }

  std::string Document(int which) const { return DocumentPath(settings, which); }

  void Read() {
    const int which = Draw(random, kDocuments);
    const int oldest = shared.written[which];
    Json::Value value;
    const bool isWhole = fromFile(value, Document(which)) && IsWhole(value);
    Expect(isWhole, "half a document");
    if (!isWhole) return;
    const int number = value["first"].asInt();
    Expect(number >= oldest && number <= shared.tried[which], "an acknowledged document is lost");
    ++shared.acknowledged[kRead];
  }

  // Writes the next number into a document under its lock.
  void Count() {
    const int which = Draw(random, kDocuments);
    FileLock lock(settings.dir + "/lock" + std::to_string(which));
    const int type = Draw(random, 2) == 0 ? LOCK_EX : LOCK_EX | LOCK_NB;
    if (!lock.lock(type, 0)) return;
    Enter(shared.holders[which], "two holders of a lock");
    CountUnderLock(which);
    Leave(shared.holders[which], "a lock had another holder");
    if (Draw(random, 2) == 0) lock.unlock();
  }

  void CountUnderLock(int which) {
    const Operation operation(shared, kCount);
    Json::Value value;
    fromFile(value, Document(which));
    const int number = value["first"].asInt();
    Expect(number == shared.written[which] || number == shared.tried[which], "a count is lost");
    shared.written[which] = number;
    shared.tried[which] = number + 1;
    const bool isDone = toFile(Numbered(number + 1), Document(which));
    if (operation.End(isDone)) shared.written[which] = number + 1;
    const std::string name = std::to_string(which) + ".";
    for (const std::string& other : NamesIn(settings.dir + "/documents")) {
      Expect(other.find(name) == std::string::npos, "a temporary is left");
    }
  }

  const Settings& settings;
  Shared& shared;
  std::mt19937 random;
  Rows rows;
};

}  // namespace

bool Operation::End(bool isDone) const {
  const bool wasFull = disk % 2 == 1 || shared.disk != disk;
  ++(isDone ? shared.acknowledged[kind] : shared.refused);
  Expect(isDone || wasFull, std::string("refused: ") + kNames[kind]);
  return isDone;
}

std::set<std::string> NamesIn(const std::string& dir) {
  std::set<std::string> names;
  for (const auto& entry : std::filesystem::directory_iterator(dir)) {
    names.insert(entry.path().filename().string());
  }
  return names;
}

std::string DocumentPath(const Settings& settings, int which) {
  return settings.dir + "/documents/" + std::to_string(which);
}

void Live(const Settings& settings, Shared& shared, int number, int life) {
  std::mt19937 random = Generator(settings, number, life);
  CatchSignals(shared, random);
  if ((number + life) % 4 == 0) StartTimer();
  shared.ready[number] = getpid();
  Worker worker(settings, shared, random);
  bool isMeasured = number >= Survivors(settings);
  while (!shared.stop) {
    worker.DoOne();
    if (!shared.isWarm || isMeasured) continue;
    shared.first[number] = worker.GetMeasure();
    isMeasured = true;
  }
  shared.last[number] = worker.GetMeasure();
}

void UpdateCache(const Settings& settings, Shared& shared) {
  std::mt19937 random = Generator(settings, -2, 0);
  const SoakCache cache(settings, true, shared, random);
  bool updated = false;
  for (int i = 0; i < 10 && !updated; ++i) updated = cache.Update();
  Expect(updated && IsWhole(cache.GetCachedData()), "no update any more");
}

Measure MeasureThis() {
  malloc_trim(0);
  Measure measure = {};
  for ([[maybe_unused]] const auto& entry : std::filesystem::directory_iterator("/proc/self/fd")) {
    ++measure.descriptors;
  }
  std::ifstream status("/proc/self/status");
  for (std::string word; status >> word && word != "RssAnon:";) continue;
  status >> measure.memoryKiB;
  return measure;
}
