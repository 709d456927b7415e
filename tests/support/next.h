// Calls of a test program that stand before those of the C library.

#ifndef KELODRCORE_TESTS_SUPPORT_NEXT_H_
#define KELODRCORE_TESTS_SUPPORT_NEXT_H_

#include <dlfcn.h>

// The definition of a call that stands behind this program's own.
template <typename Function>
Function* Next(const char* call) {
  return reinterpret_cast<Function*>(dlsym(RTLD_NEXT, call));
}

#endif  // KELODRCORE_TESTS_SUPPORT_NEXT_H_
