// usage: storm NAME [processes=N] [seconds=N] [count=N] [seed=N] [pause=N]
//
//   soak       processes do random things to one database, one cache, five documents and four locks
//              for some seconds, with at most `pause` milliseconds between two; they are killed,
//              stopped and sent signals at random, and the disk fills up
//   holders    each process takes one lock `count` times, and one holder in ten is killed
//   expiries   processes read a cache each time that it expires, `count` times: one fetch each
//   readers    one process writes a document, the others read it, `count` times in all
//
// Prints one line of figures; the exit status is 0 when everything held. The seed decides what each
// process does, though not when the kernel lets it.

#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <map>

#include "storm/storm.h"

namespace {

using Storm = std::string (*)(const Settings&);
struct Kind {
  Storm run;
  Settings settings;  // by default: what takes a few seconds
};

const std::map<std::string, Kind> kKinds = {
    {"holders", {KilledHolders, {"", 8, 0, 100, 1}}},
    {"expiries", {Expiries, {"", 50, 0, 4, 1}}},
    {"readers", {Readers, {"", 5, 0, 50000, 1}}},
    {"soak", {Soak, {"", 8, 3, 0, 1}}},
};

const std::map<std::string, int Settings::*> kNumbers = {{"processes", &Settings::processes},
                                                         {"seconds", &Settings::seconds},
                                                         {"count", &Settings::count},
                                                         {"seed", &Settings::seed},
                                                         {"pause", &Settings::pause}};

// Takes "NAME=NUMBER"; false for any other text.
bool Set(Settings& settings, const std::string& argument) {
  const size_t end = argument.find('=');
  const auto found = kNumbers.find(argument.substr(0, end));
  if (end == std::string::npos || found == kNumbers.end()) return false;
  int& number = settings.*found->second;
  number = atoi(argument.c_str() + end + 1);
  return number > 0;
}

std::string MakeDirectory() {
  std::string pattern =
      (std::filesystem::temp_directory_path() / "kelodrcore-storm-XXXXXX").string();
  return mkdtemp(pattern.data()) != nullptr ? pattern : "";
}

int Run(const std::string& name, const Kind& kind) {
  Settings settings = kind.settings;
  settings.dir = MakeDirectory();
  if (settings.dir.empty()) return 2;
  const auto start = std::chrono::steady_clock::now();
  const std::string figures = kind.run(settings);
  const std::chrono::duration<double> length = std::chrono::steady_clock::now() - start;
  std::filesystem::remove_all(settings.dir);
  std::filesystem::remove_all("/tmp/.kelodr_lock" + settings.dir);
  printf("%s: %d processes, seed %d, %.1f s: %s%s\n", name.c_str(), settings.processes,
         settings.seed, length.count(), figures.c_str(), IsAllWell() ? "" : ": WRONG");
  return IsAllWell() ? 0 : 1;
}

}  // namespace

int main(int argc, char** argv) {
  const auto found = argc > 1 ? kKinds.find(argv[1]) : kKinds.end();
  bool valid = found != kKinds.end();
  Kind kind = valid ? found->second : Kind{};
  for (int i = 2; i < argc; ++i) valid = valid && Set(kind.settings, argv[i]);
  if (!valid) {
    fprintf(stderr, "usage: storm holders|expiries|readers|soak [NAME=NUMBER...]\n");
    return 2;
  }
  if (access("/tmp/.kelodr_lock", W_OK) != 0 && errno != ENOENT) {
    printf("skipped: the lock directory is another user's\n");
    return 0;
  }
  return Run(found->first, kind);
}
