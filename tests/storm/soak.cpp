#include "storm/soak.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/mount.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <csignal>
#include <filesystem>
#include <set>

#include "kelodrcore/file_lock.h"
#include "kelodrcore/json_value.h"
#include "support/mounts.h"

using KeloDRCore::FileLock;
using KeloDRCore::JsonValue::toFile;

namespace {

// What a survivor may have more at the end than at a tenth of the time. AddressSanitizer keeps what
// is freed for a while.
#ifdef __SANITIZE_ADDRESS__
constexpr int kMoreMemoryKiB = 1 << 20;
#else
constexpr int kMoreMemoryKiB = 512;
#endif
constexpr unsigned int kPatienceS = 120;  // for who waits at the end; then this process is killed

// A small one in the place of the directory, where this process may mount it.
class Disk {
 public:
  explicit Disk(const std::string& directory)
      : dir(directory),
        isOwn(EnterOwnMounts() &&
              mount("tmpfs", dir.c_str(), "tmpfs", 0, "mode=0755,size=4m") == 0) {}
  ~Disk() {
    if (isOwn) umount2(dir.c_str(), MNT_DETACH);
  }
  Disk(const Disk&) = delete;
  Disk& operator=(const Disk&) = delete;

  bool IsOwn() const { return isOwn; }

 private:
  const std::string dir;
  const bool isOwn;
};

// Whoever else writes meanwhile gets the last bytes.
void FillOnce(const std::string& path, std::mt19937& random) {
  static const std::string block(4096, 'x');
  const int file = open(path.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600);
  for (int rounds = Draw(random, 20); rounds >= 0; --rounds) {
    while (write(file, block.data(), block.size()) > 0) continue;
    SleepMs(Draw(random, 10));
    const off_t back = Draw(random, 8) * static_cast<off_t>(block.size());
    const off_t size = lseek(file, 0, SEEK_END);
    Expect(ftruncate(file, std::max<off_t>(0, size - back)) == 0, "the disk cannot be freed");
  }
  close(file);
  unlink(path.c_str());
}

void FillAtRandom(const Settings& settings, Shared& shared) {
  std::mt19937 random = Generator(settings, settings.processes, 0);
  while (!shared.stop) {
    SleepMs(Draw(random, 1000));
    ++shared.disk;
    FillOnce(settings.dir + "/filler", random);
    ++shared.disk;
  }
}

// What befalls the processes.
class Troubles {
 public:
  Troubles(const Settings& all, Shared& state, Workers& whose)
      : settings(all), shared(state), workers(whose), random(Generator(all, -1, 0)) {}

  void MakeOne() {
    const int which = Draw(random, 8);
    if (which == 0) {
      const int first = Survivors(settings);
      workers.Kill(first + Draw(random, settings.processes - first));
    } else if (which == 1) {
      KillFetcher();
    } else if (which == 2) {
      Stop();
    } else {
      constexpr int kSignals[] = {SIGALRM, SIGUSR1, SIGCHLD, SIGTERM};
      Send(Draw(random, settings.processes), kSignals[Draw(random, 4)]);
    }
    workers.Reap();
    SleepMs(Draw(random, 20));
  }

  int Signals() const { return signals; }

 private:
  // Of the refreshers that belong to nobody only their fetch is known.
  void KillFetcher() {
    const pid_t fetcher = shared.fetcher;
    siginfo_t info = {};
    const bool isChild = fetcher > 0 && waitid(P_PID, static_cast<id_t>(fetcher), &info,
                                               WEXITED | WNOHANG | WNOWAIT) == 0;
    if (isChild && !workers.Has(fetcher)) kill(fetcher, SIGKILL);
  }

  void Stop() {
    const int worker = Draw(random, settings.processes);
    if (!Send(worker, SIGSTOP)) return;
    SleepMs(Draw(random, 50));
    Send(worker, SIGCONT);
  }

  bool Send(int worker, int number) {
    const pid_t pid = workers.Pid(worker);
    if (shared.ready[worker] != pid || kill(pid, number) != 0) return false;
    ++signals;
    return true;
  }

  const Settings& settings;
  Shared& shared;
  Workers& workers;
  std::mt19937 random;
  int signals = 0;
};

void MakeTroubles(const Settings& settings, Shared& shared, Troubles& troubles) {
  using Clock = std::chrono::steady_clock;
  const Clock::time_point begin = Clock::now();
  const std::chrono::duration<double> length(settings.seconds);
  while (Clock::now() - begin < length) {
    troubles.MakeOne();
    if (Clock::now() - begin > length / 10) shared.isWarm = true;
  }
  shared.stop = true;
  alarm(kPatienceS);
}

void Prepare(const Settings& settings, Shared& shared) {
  std::filesystem::create_directory(settings.dir + "/cache");
  std::filesystem::create_directory(settings.dir + "/documents");
  for (int which = 0; which <= kDocuments; ++which) {
    Expect(toFile(Numbered(0), DocumentPath(settings, which)), "no first document");
  }
  std::mt19937 random = Generator(settings, -2, 0);
  Rows(settings, shared, random).Insert();
}

void ExpectEveryRow(const Settings& settings, Shared& shared) {
  std::mt19937 random = Generator(settings, -2, 0);
  Rows rows(settings, shared, random);
  Expect(rows.IsSound(), "the database is not sound");
  rows.Check(kMostGroups);
  rows.Trim();
  rows.Check(kMostGroups);
}

// Each next process finds everything free, and takes away what the killed ones left.
void ExpectNothingLeft(const Settings& settings, Shared& shared) {
  const std::string documents = settings.dir + "/documents";
  Expect(NamesIn(settings.dir + "/cache").size() <= 3, "leftovers beside the cache pile up");
  Expect(NamesIn(documents).size() <= 2 * (kDocuments + 1), "leftovers of writers pile up");
  UpdateCache(settings, shared);
  std::set<std::string> names;
  for (int which = 0; which <= kDocuments; ++which) {
    Expect(toFile(Numbered(1), DocumentPath(settings, which)), "no write");
    names.insert(std::to_string(which));
  }
  Expect(NamesIn(documents) == names, "left by a writer");
  Expect(NamesIn(settings.dir + "/cache") == std::set<std::string>{"c.cached"}, "left in a cache");
  Expect(NamesIn(settings.dir) == std::set<std::string>{"base", "cache", "documents"}, "left over");
  for (int i = 0; i < kDocuments; ++i) {
    FileLock lock(settings.dir + "/lock" + std::to_string(i));
    Expect(lock.tryLock(LOCK_EX | LOCK_NB), "a lock is held by nobody");
  }
}

// Returns the figures.
std::string ExpectFlat(const Settings& settings, const Shared& shared) {
  Measure first = {};
  Measure last = {};
  for (int i = 0; i < Survivors(settings); ++i) {
    const int more = shared.last[i].memoryKiB - shared.first[i].memoryKiB;
    Expect(shared.first[i].memoryKiB > 0 && more <= kMoreMemoryKiB,
           "a survivor has " + std::to_string(more) + " KiB more");
    Expect(shared.last[i].descriptors == shared.first[i].descriptors, "a descriptor is left open");
    first.memoryKiB = std::max(first.memoryKiB, shared.first[i].memoryKiB);
    last.memoryKiB = std::max(last.memoryKiB, shared.last[i].memoryKiB);
    first.descriptors = std::max(first.descriptors, shared.first[i].descriptors);
    last.descriptors = std::max(last.descriptors, shared.last[i].descriptors);
  }
  return std::to_string(first.memoryKiB) + " KiB and " + std::to_string(first.descriptors) +
         " descriptors of a survivor at a tenth of the time, " + std::to_string(last.memoryKiB) +
         " KiB and " + std::to_string(last.descriptors) + " at the end";
}

std::string Figures(const Shared& shared, const Disk& disk) {
  std::string figures;
  for (int kind = 0; kind < kKinds; ++kind) {
    Expect(shared.acknowledged[kind] > 0, std::string("none acknowledged: ") + kNames[kind]);
    figures += std::to_string(shared.acknowledged[kind]) + " " + kNames[kind] + ", ";
  }
  const std::string filled = "disk full " + std::to_string(shared.disk / 2) + " times, " +
                             std::to_string(shared.refused) + " operations refused";
  return figures + std::to_string(shared.fetches) + " fetches, " + std::to_string(shared.caught) +
         " signals caught, " + (disk.IsOwn() ? filled : "disk never full: it cannot be mounted");
}

}  // namespace

std::string Soak(const Settings& settings) {
  Shared& shared = MakeShared<Shared>();
  const bool isPossible = settings.processes > 1 && settings.processes <= kMostProcesses;
  if (!isPossible) return Expect(false, "too many processes, or too few"), "";
  const Disk disk(settings.dir);
  Prepare(settings, shared);
  const int descriptors = MeasureThis().descriptors;
  prctl(PR_SET_CHILD_SUBREAPER, 1);  // of the cache's refreshers
  Workers workers(settings.processes + disk.IsOwn(), [&](int worker, int life) {
    worker < settings.processes ? Live(settings, shared, worker, life)
                                : FillAtRandom(settings, shared);
  });
  Troubles troubles(settings, shared, workers);
  MakeTroubles(settings, shared, troubles);
  workers.Join(true);
  ExpectEveryRow(settings, shared);
  ExpectNothingLeft(settings, shared);
  Expect(MeasureThis().descriptors == descriptors, "a descriptor is left");
  return Figures(shared, disk) + ", " + std::to_string(workers.Killed()) + " processes killed, " +
         std::to_string(troubles.Signals()) + " signals sent; " + ExpectFlat(settings, shared);
}
