// What the fuzz targets share.

#ifndef KELODRCORE_FUZZ_FUZZ_H_
#define KELODRCORE_FUZZ_FUZZ_H_

#include <fuzzer/FuzzedDataProvider.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>

// Ends the program when a promise is broken; libFuzzer then reports the input.
inline void Require(bool holds, const char* promise) {
  if (holds) return;
  fprintf(stderr, "broken promise: %s\n", promise);
  if (seteuid(getuid()) != 0) fprintf(stderr, "the input cannot be kept\n");
  abort();
}

#endif  // KELODRCORE_FUZZ_FUZZ_H_
