// The kernel's random numbers of a test program: its own getrandom stands before the C library's,
// for the library under test as well. Real until a test says otherwise.

#ifndef KELODRCORE_TESTS_SUPPORT_COUNTING_GENERATOR_H_
#define KELODRCORE_TESTS_SUPPORT_COUNTING_GENERATOR_H_

// While it lives, the draws of this process are 0, 1, 2 and so on: as many draws as a range has
// numbers, or more, give every one of them.
class CountingGenerator {
 public:
  CountingGenerator();
  ~CountingGenerator();
  CountingGenerator(const CountingGenerator&) = delete;
  CountingGenerator& operator=(const CountingGenerator&) = delete;
};

#endif  // KELODRCORE_TESTS_SUPPORT_COUNTING_GENERATOR_H_
