// Another process that comes between two calls on the way to a lock file.

#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>
#include <cstdio>
#include <string>
#include <vector>

#include "fault/interception.h"
#include "posix/directory_walk.h"
#include "posix/file_io.h"
#include "support/clean_test.h"

namespace {

using KeloDRCore::Posix::Descriptor;

using InterceptedLockTest = CleanTest;

// What is locked in it would exclude nobody who comes later.
TEST_F(InterceptedLockTest, ADirectoryThatItsOwnerMovesAwayIsNotTaken) {
  const std::string step = Path("step");
  ASSERT_EQ(mkdir(step.c_str(), 0755), 0);
  const Fault::Interception owner("fstat", 1, [&] {
    EXPECT_EQ(rename(step.c_str(), Path("moved").c_str()), 0);
    EXPECT_EQ(mkdir(step.c_str(), 0755), 0);
    return Fault::kGoOn;
  });
  const Descriptor opened =
      KeloDRCore::Posix::OpenStepwise(dir, step, [](const std::string&) { return false; });
  EXPECT_TRUE(owner.HasRun());
  struct stat found = {};
  struct stat named = {};
  ASSERT_TRUE(KeloDRCore::Posix::Stat(opened.Get(), found));
  ASSERT_EQ(stat(step.c_str(), &named), 0);
  EXPECT_TRUE(KeloDRCore::Posix::IsSameFile(found, named));
}

TEST_F(InterceptedLockTest, AStepThatCannotBeMadeIsLeftToTheCaller) {
  const Fault::Interception refusal("mkdirat", 1, EACCES);
  std::vector<std::string> made;
  const Descriptor opened =
      KeloDRCore::Posix::OpenStepwise(dir, Path("step/lower"), [&](const std::string& path) {
        made.push_back(path);
        return mkdir(path.c_str(), 0755) == 0;
      });
  EXPECT_TRUE(opened.IsOpen());
  EXPECT_EQ(made, std::vector<std::string>{Path("step")});
}

}  // namespace
