// usage: model [count=N] [seed=N]
//
// Does so many random operations to the library and to a plain model of what it is described to do,
// and stops at the first difference. 20,000 operations take some seconds; the long form is
// count=1000000. The seed decides everything, so that a difference can be looked at again.

#include <sys/stat.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <map>

#include "model/basics.h"
#include "model/commands.h"
#include "model/conditions.h"
#include "model/database.h"
#include "model/files.h"
#include "model/values.h"
#include "model/web.h"
#include "support/test_clock.h"

namespace {

std::string MakeDirectory() {
  std::string pattern =
      (std::filesystem::temp_directory_path() / "kelodrcore-model-XXXXXX").string();
  return mkdtemp(pattern.data()) != nullptr ? pattern : "";
}

void Run(unsigned long count, const std::string& dir) {
  Values values;
  Conditions conditions;
  Commands commands(values, conditions);
  Database database(dir, commands);
  Files files(dir);
  Web web;
  while (Trace::Count() < count) {
    switch (Draw::Below(20)) {
      case 0:
        Basics::Step();
        break;
      case 1:
      case 2:
      case 3:
        values.Step();
        break;
      case 4:
      case 5:
        conditions.Step();
        break;
      case 6:
      case 7:
      case 8:
      case 9:
      case 10:
        commands.Step();
        break;
      case 11:
      case 12:
        web.Step();
        break;
      case 13:
        files.Step();
        break;
      default:
        database.Step();
    }
  }
}

}  // namespace

int main(int argc, char** argv) {
  std::map<std::string, unsigned long> settings = {{"count", 20000}, {"seed", 1}};
  for (int i = 1; i < argc; ++i) {
    const std::string argument = argv[i];
    const size_t end = argument.find('=');
    const auto found = settings.find(argument.substr(0, end));
    if (end == std::string::npos || found == settings.end()) {
      fprintf(stderr, "usage: model [count=N] [seed=N]\n");
      return 2;
    }
    found->second = strtoul(argument.c_str() + end + 1, nullptr, 10);
  }
  static const std::string dir = MakeDirectory();
  if (dir.empty()) return 2;
  atexit([] { std::filesystem::remove_all(dir); });
  umask(022);
  ReplaceSleeps([](useconds_t length) {
    Calls::Sleep(length);
    return 0;
  });
  Draw::Seed(settings["seed"]);
  printf("seed %lu\n", settings["seed"]);
  const auto start = std::chrono::steady_clock::now();
  Run(settings["count"], dir);
  const std::chrono::duration<double> length = std::chrono::steady_clock::now() - start;
  printf("%lu operations, %.1f s: no difference\n", Trace::Count(), length.count());
}
