// How the cost of each operation grows with its size, in instructions and in heap. valgrind runs it
// with --tool=callgrind --callgrind-out-file=COUNTS, --zero-before=CountedWork and
// --dump-after=CountedWork. The arguments are COUNTS and, if not all, a part of the names.

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <filesystem>

#include "growth/cost.h"
#include "growth/operations.h"

namespace {

constexpr size_t kFactor = 8;

// Places in a map are found in log n steps, and buffers grow by doubling: what is linear but for
// these stays below ten times. What copies the whole for each part costs up to 64 times as much.
constexpr double kSlack = 1.25;

std::string scratch;

double Allowed(Growth growth) {
  return kSlack * (growth == Growth::kLinear ? static_cast<double>(kFactor) : 1.0);
}

// Whether the larger size costs no more than its growth allows. What grows is counted above the
// cost of size 1.
bool IsAllowed(const char* unit, Growth growth, double one, double small, double large) {
  const double fixed = growth == Growth::kLinear ? one : 0;
  const bool isAllowed = large - fixed <= Allowed(growth) * (small - fixed);
  printf("  %s %.0f -> %.0f (%.2f, at most %.2f)%s", unit, small - fixed, large - fixed,
         (large - fixed) / std::max(small - fixed, 1.0), Allowed(growth),
         isAllowed ? "" : " TOO MUCH");
  return isAllowed;
}

bool Grows(const Operation& operation, const std::string& counts) {
  operation.prepared(1)();  // what is made once in a process is there now
  const Cost one = CostOf(operation.prepared(1), counts);
  const Cost small = CostOf(operation.prepared(operation.size), counts);
  const Cost large = CostOf(operation.prepared(kFactor * operation.size), counts);
  printf("%s, %zu -> %zu:", operation.name.c_str(), operation.size, kFactor * operation.size);
  const bool isFast = IsAllowed("instructions", operation.instructions, one.instructions,
                                small.instructions, large.instructions);
  const bool isSmall = IsAllowed("heap", operation.heap, one.heap, small.heap, large.heap);
  printf("\n");
  return isFast && isSmall;
}

std::vector<Operation> AllOperations() {
  std::vector<Operation> operations;
  for (const auto add :
       {AddDocuments, AddFiles, AddStatements, AddRows, AddMessages, AddLocksAndCaches}) {
    add(operations);
  }
  return operations;
}

}  // namespace

void Require(bool isDone, const char* what) {
  if (isDone) return;
  fprintf(stderr, "growth: %s failed\n", what);
  exit(1);
}

std::string Path(const std::string& name) { return scratch + "/" + name; }

int main(int argc, char** argv) {
  Require(argc > 1, "the name of valgrind's file: it");
  const std::string part = argc > 2 ? argv[2] : "";
  scratch = std::filesystem::temp_directory_path() / "kelodr_growth_XXXXXX";
  Require(mkdtemp(scratch.data()) != nullptr, "mkdtemp");
  bool areGood = true;
  for (const Operation& operation : AllOperations()) {
    if (operation.name.find(part) == std::string::npos) continue;
    areGood = Grows(operation, argv[1]) && areGood;
    std::filesystem::remove_all(scratch);
    std::filesystem::create_directory(scratch);
  }
  std::filesystem::remove_all(scratch);
  std::filesystem::remove_all("/tmp/.kelodr_lock" + scratch);
  return areGood ? 0 : 1;
}
