// kelodrcore_bench: each operation of the library beside the same work written by hand and beside
// peers. scripts/bench.sh runs it and makes the table and the curves.

#include <SQLiteCpp/SQLiteCpp.h>
#include <soci/version.h>
#include <sqlite3.h>
#include <sys/utsname.h>

#include <boost/version.hpp>
#include <cstdio>
#include <fstream>
#include <string>

#include "support.h"

namespace {

#ifdef NDEBUG
constexpr bool kAssertionsAreOff = true;
#else
constexpr bool kAssertionsAreOff = false;
#endif
#ifdef __OPTIMIZE__
constexpr bool kIsOptimized = true;
#else
constexpr bool kIsOptimized = false;
#endif

std::string ProcessorName() {
  std::ifstream info("/proc/cpuinfo");
  for (std::string line; std::getline(info, line);) {
    if (line.rfind("model name", 0) == 0) return line.substr(line.find(':') + 2);
  }
  return "unknown";
}

void DescribeMachineAndVersions() {
  utsname system = {};
  uname(&system);
  const auto add = [](const char* key, const std::string& value) {
    benchmark::AddCustomContext(key, value);
  };
  add("processor", ProcessorName());
  add("system", std::string(system.sysname) + " " + system.release + " " + system.machine);
  add("compiler", "g++ " __VERSION__);
  add("build", KELODR_BUILD_TYPE);
  add("kelodrcore", KELODR_VERSION);
  add("sqlite", sqlite3_libversion());
  add("jsoncpp", JSONCPP_VERSION_STRING);
  add("sqlitecpp", SQLITECPP_VERSION);
  add("soci", std::to_string(SOCI_VERSION / 100000) + "." +
                  std::to_string(SOCI_VERSION / 100 % 1000) + "." +
                  std::to_string(SOCI_VERSION % 100));
  add("boost", BOOST_LIB_VERSION);
}

}  // namespace

int main(int argc, char** argv) {
  if (!kAssertionsAreOff || !kIsOptimized || sizeof(KELODR_SANITIZE) > 1) {
    fprintf(stderr, "kelodrcore_bench: this is a debug build; its figures would mean nothing\n");
    return 1;
  }
  benchmark::Initialize(&argc, argv);
  if (benchmark::ReportUnrecognizedArguments(argc, argv)) return 1;
  DescribeMachineAndVersions();
  bench::RegisterAll();
  benchmark::RunSpecifiedBenchmarks();
  return 0;
}
