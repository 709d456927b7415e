// usage: power [CUTS [SEED]]      5 cuts and the seed 1 without them
//
// Writers replace documents and insert rows on a disk that loses power again and again; after each
// cut the disk is mounted anew and has to hold what was acknowledged. Every fifth cut comes at a
// random moment while all write. The others come right after an acknowledgement, one writer at a
// time, so that no other writer has synced in between.
//
// Prints one line of figures; the exit status is 0 when everything held.

#include <unistd.h>

#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <string>

#include "power/disk.h"
#include "power/writers.h"
#include "storm/storm.h"

namespace {

struct Progress {
  std::atomic<int> tried;
  std::atomic<int> acknowledged;
};

struct Shared {
  std::atomic<bool> isCut;
  Progress progress[kWriterCount];
};

struct Figures {
  int cuts = 0;
  int lost = 0;        // files that nobody had synced and that were gone
  int rolledBack = 0;  // acknowledged commits, of a writer that may lose them
};

Shared& shared = MakeShared<Shared>();

const std::string kUnsynced = std::string(kDiskDir) + "/unsynced";
constexpr char kText[] = "nobody syncs this";

std::string ReadUnsynced() {
  std::string text;
  std::ifstream file(kUnsynced);
  std::getline(file, text);
  return text;
}

// What is written just before a cut without being synced has to be lost: a cut that loses nothing
// shows nothing.
void Cut() {
  if (FILE* const file = fopen(kUnsynced.c_str(), "w"); file != nullptr) {
    fputs(kText, file);
    fclose(file);
  }
  shared.isCut = true;
  Expect(Disk::CutPower(), "the disk cannot be shut down");
}

// Writes on until the power is gone; with `limit`, it goes right after so many acknowledgements.
void Write(int writer, int limit) {
  const Step step = kWriters[writer].Start();
  Progress& progress = shared.progress[writer];
  for (int done = 1;; ++done) {
    const int number = ++progress.tried;
    if (!step(number)) break;
    progress.acknowledged = number;
    if (done == limit) Cut();
  }
  Expect(shared.isCut, std::string(kWriters[writer].name) + " fails with the power on");
}

void WriteAll(std::mt19937& random) {
  Workers workers(kWriterCount, [](int worker, int /*life*/) { Write(worker, 0); });
  SleepMs(Draw(random, 300));
  Cut();
  workers.Join(true);
}

void WriteAlone(int writer, std::mt19937& random) {
  const int limit = 1 + Draw(random, kWriters[writer].most);
  Workers workers(1, [=](int /*worker*/, int /*life*/) { Write(writer, limit); });
  workers.Join(true);
}

void Check(int writer, Figures& figures) {
  const Writer& kind = kWriters[writer];
  Progress& progress = shared.progress[writer];
  const int found = kind.Find();
  const std::string what = std::string(kind.name) + ": " + std::to_string(found) + " found, " +
                           std::to_string(progress.acknowledged) + " acknowledged, " +
                           std::to_string(progress.tried) + " tried";
  const int missing = progress.acknowledged - found;
  Expect(missing <= kind.mayLose && found <= progress.tried, what);
  if (missing > 0) figures.rolledBack += missing;
  progress.acknowledged = progress.tried = found;
}

bool CutOnce(Disk& disk, std::mt19937& random, Figures& figures) {
  if (!disk.Mount()) return false;
  shared.isCut = false;
  const int turn = figures.cuts++ % (kWriterCount + 1);
  if (turn < kWriterCount) WriteAlone(turn, random);
  if (turn == kWriterCount) WriteAll(random);
  if (!disk.Unmount() || !disk.Mount()) return false;
  for (int writer = 0; writer < kWriterCount; ++writer) Check(writer, figures);
  figures.lost += ReadUnsynced() != kText;
  unlink(kUnsynced.c_str());
  return disk.Unmount();
}

}  // namespace

int main(int argc, char** argv) {
  const int cuts = argc > 1 ? atoi(argv[1]) : kWriterCount + 1;
  const int seed = argc > 2 ? atoi(argv[2]) : 1;
  Disk disk;
  if (!disk.Make()) {
    printf("skipped: %s\n", disk.Reason().c_str());
    return 0;
  }
  std::mt19937 random(static_cast<unsigned int>(seed));
  Figures figures;
  const auto start = std::chrono::steady_clock::now();
  while (IsAllWell() && figures.cuts < cuts) {
    Expect(CutOnce(disk, random, figures), disk.Reason());
  }
  Expect(figures.lost > 0, "no cut lost what was not synced");
  const std::chrono::duration<double> length = std::chrono::steady_clock::now() - start;
  printf("power: %d cuts, seed %d, %.1f s: %d lost what was not synced", figures.cuts, seed,
         length.count(), figures.lost);
  for (int i = 0; i < kWriterCount; ++i) {
    printf(", %d %s", shared.progress[i].acknowledged.load(), kWriters[i].name);
  }
  printf(", %d commits rolled back%s\n", figures.rolledBack, IsAllWell() ? "" : ": WRONG");
  return IsAllWell() ? 0 : 1;
}
