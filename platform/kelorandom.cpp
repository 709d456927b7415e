#include "kelorandom.h"

#include <sys/random.h>

#include <cerrno>
#include <cstdlib>
#include <limits>
#include <utility>

namespace {

constexpr unsigned int kMax = std::numeric_limits<unsigned int>::max();

// A request this small never comes back in part; what remains is a signal before the generator is
// seeded, and a kernel without the call, where no number would be honest.
unsigned int Draw() {
  unsigned int value = 0;
  while (getrandom(&value, sizeof value, 0) != static_cast<ssize_t>(sizeof value)) {
    if (errno != EINTR) abort();
  }
  return value;
}

// A draw below `count`. The incomplete last run of `count` numbers is drawn again: kept, it would
// favour the small results.
unsigned int DrawBelow(unsigned int count) {
  const unsigned int incomplete = (kMax % count + 1) % count;
  unsigned int value = Draw();
  while (value > kMax - incomplete) value = Draw();
  return value % count;
}

}  // namespace

namespace KELO::RANDOM {

unsigned int KELORandomBase::urandom(unsigned int min, unsigned int max) {
  if (min > max) std::swap(min, max);
  const unsigned int span = max - min;
  return span == kMax ? Draw() : min + DrawBelow(span + 1);
}

}  // namespace KELO::RANDOM
