#include "growth/cost.h"

#include <malloc.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <fstream>

namespace {

size_t held = 0;
size_t peak = 0;

void* Hold(void* memory) {
  held += malloc_usable_size(memory);
  peak = std::max(peak, held);
  return memory;
}

// callgrind writes a file, numbered from 1, each time that CountedWork returns.
double CountedInstructions(const std::string& counts) {
  static int number = 0;
  const std::string path = counts + "." + std::to_string(++number);
  std::ifstream file(path);
  double instructions = -1;
  for (std::string line; std::getline(file, line);) {
    if (sscanf(line.c_str(), "summary: %lf", &instructions) == 1) break;
  }
  unlink(path.c_str());
  if (instructions >= 0) return instructions;
  fprintf(stderr, "growth: valgrind has not counted to %s\n", path.c_str());
  exit(1);
}

}  // namespace

extern "C" {

// The C library's own, behind the names that count.
void* __libc_malloc(size_t size);
void* __libc_calloc(size_t count, size_t size);
void* __libc_realloc(void* memory, size_t size);
void __libc_free(void* memory);

void* malloc(size_t size) { return Hold(__libc_malloc(size)); }
void* calloc(size_t count, size_t size) { return Hold(__libc_calloc(count, size)); }
void* realloc(void* memory, size_t size) {
  held -= malloc_usable_size(memory);
  return Hold(__libc_realloc(memory, size));
}
void free(void* memory) {
  held -= malloc_usable_size(memory);
  __libc_free(memory);
}

// Nothing is sent to this machine's log, nor counted.
void syslog(int /*priority*/, const char* /*format*/, ...) {}
void __syslog_chk(int /*priority*/, int /*flag*/, const char* /*format*/, ...) {}

// Its name is told to valgrind.
__attribute__((noinline)) void CountedWork(const std::function<void()>& work) { work(); }

}  // extern "C"

Cost CostOf(const std::function<void()>& work, const std::string& counts) {
  const size_t before = held;
  peak = held;
  CountedWork(work);
  const size_t heap = peak - before;
  return {CountedInstructions(counts), static_cast<double>(heap)};
}
