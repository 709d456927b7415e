// What all benchmarks share: how they are named and registered, where their files lie, and how a
// result is held against another one.

#ifndef KELODRCORE_BENCH_SUPPORT_H_
#define KELODRCORE_BENCH_SUPPORT_H_

#include <benchmark/benchmark.h>
#include <json/json.h>

#include <functional>
#include <string>

namespace bench {

// Who does the work: the library, the baseline (the system and library calls that the work itself
// needs, written by hand), or a peer by its own name. `bound` is the largest ratio of the library's
// time to this contestant's time that is accepted; 0 means none.
struct Contestant {
  const char* name;
  double bound = 0;
};

inline constexpr Contestant kLibrary = {"kelodrcore"};

constexpr Contestant Baseline(double bound = 0) { return {"baseline", bound}; }

// Each file with benchmarks has one object of this type. main() calls its function, which registers
// the benchmarks of that file.
struct Benchmarks {
  explicit Benchmarks(void (*registerAll)());
};

// Calls the functions of all objects of type Benchmarks.
void RegisterAll();

// Registers "OPERATION/WORK/CONTESTANT". The table of ratios and the curves are made from these
// names, so no part contains a slash.
benchmark::internal::Benchmark* Register(const std::string& operation, const std::string& work,
                                         const Contestant& contestant,
                                         const std::function<void(benchmark::State&)>& run);

// Ends the program when contestants do not do the same work.
void Require(bool condition, const std::string& what);

// A file in a directory of this run, which is removed at its end.
std::string ScratchPath(const std::string& name);

void WriteWhole(const std::string& path, const std::string& text);

// "16 B", "4 KiB", "1 MiB"
std::string SizeName(size_t bytes);

// The JSON text of about `size` bytes of a list of nodes: texts, numbers, truths, nested objects.
std::string NodesDocument(size_t size);

// JsonCpp's own reader on a buffer.
bool ParseWithJsonCpp(const std::string& text, Json::Value& value);

// JsonCpp's own writer into a buffer, with UTF-8 as it is, on one line.
std::string WriteWithJsonCpp(const Json::Value& value);

// The writer that JsonCpp calls fast: it builds the text without a stream. It is deprecated, and
// escapes everything that is not ASCII, so that its text is another one.
std::string WriteFastWithJsonCpp(const Json::Value& value);

}  // namespace bench

#endif  // KELODRCORE_BENCH_SUPPORT_H_
