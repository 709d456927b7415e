// Random numbers made from draws that the test gives.

#include "kelorandom.h"

#include <sys/random.h>

#include <climits>
#include <cstdlib>
#include <cstring>
#include <vector>

#include "support/clean_test.h"

namespace {

std::vector<unsigned int> draws;  // the next one comes last

}  // namespace

extern "C" ssize_t getrandom(void* buffer, size_t size, unsigned int /*flags*/) {
  if (draws.empty() || size != sizeof draws.back()) abort();
  memcpy(buffer, &draws.back(), sizeof draws.back());
  draws.pop_back();
  return sizeof(unsigned int);
}

namespace {

using RandomDrawTest = CleanTest;

// With UINT_MAX, 0 would come once more often than 1 and 2.
TEST_F(RandomDrawTest, ADrawBeyondTheLastWholeRunIsMadeAgain) {
  KELO::RANDOM::KELORandom random;
  draws = {8, UINT_MAX};
  EXPECT_EQ(random.urandom(0, 2), 2U);
  EXPECT_TRUE(draws.empty());
  draws = {UINT_MAX - 1};
  EXPECT_EQ(random.urandom(0, 2), 2U);
}

TEST_F(RandomDrawTest, EveryDrawCountsWhereTheRunsAreWhole) {
  KELO::RANDOM::KELORandom random;
  draws = {UINT_MAX};
  EXPECT_EQ(random.urandom(0, 3), 3U);
  draws = {UINT_MAX};
  EXPECT_EQ(random.urandom(0, UINT_MAX), UINT_MAX);
}

}  // namespace
