// What the tests of the file lock share: counted calls, a fixture with a lock of its own, and
// processes that hold a lock.

#ifndef KELODRCORE_TESTS_SUPPORT_LOCK_TEST_H_
#define KELODRCORE_TESTS_SUPPORT_LOCK_TEST_H_

#include <sys/file.h>
#include <sys/types.h>

#include <functional>
#include <string>
#include <vector>

#include "support/clean_test.h"

// This program's own flock stands before the C library's, for the shared library as well: it
// counts, lets a test act at the worst moment, and goes on to the kernel. The sleeps are counted,
// too.
namespace LockCalls {

extern int flocks;                      // calls so far
extern std::vector<useconds_t> sleeps;  // their microseconds
extern bool sleepAtOnce;                // no sleep takes time
// Runs before each flock, with its number (from 1).
extern std::function<void(int)> beforeFlock;

// Forgets the calls so far.
void Forget();

}  // namespace LockCalls

// Each test has a lock name of its own. Skipped where no lock can be made.
class LockTest : public CleanTest {
 protected:
  void SetUp() override;
  void TearDown() override;

  // Whether the lock at the path is free for a newcomer.
  bool IsFree() const;

  // The descriptor that this process has open on the file named `file`, or -1.
  static int DescriptorOf(const std::string& file);

  // The lines of a lock() that cannot open the lock file at `file`.
  static std::vector<LogLine> CannotOpen(const std::string& file, const std::string& reason);

  // For a Holder: takes a lock that ends with the process.
  bool Hold(int type) const;

  std::string name;
  std::string path;
};

#endif  // KELODRCORE_TESTS_SUPPORT_LOCK_TEST_H_
