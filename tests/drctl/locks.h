// The fixture of tests whose program takes locks.

#ifndef KELODRCORE_TESTS_DRCTL_LOCKS_H_
#define KELODRCORE_TESTS_DRCTL_LOCKS_H_

#include <unistd.h>

#include <filesystem>

#include "support/clean_test.h"

constexpr char kLockDir[] = "/tmp/.kelodr_lock";
constexpr char kNeedsLocks[] = "needs a /tmp where this user can make locks";

// Where root has made the directory of the lock files, an ordinary user can make none.
inline bool CanMakeLocks() { return access(kLockDir, F_OK) != 0 || access(kLockDir, W_OK) == 0; }

// Removes the locks of files in the test's directory.
class LocksTest : public CleanTest {
 protected:
  void TearDown() override {
    std::error_code error;
    std::filesystem::remove_all(kLockDir + dir, error);
    CleanTest::TearDown();
  }
};

#endif  // KELODRCORE_TESTS_DRCTL_LOCKS_H_
