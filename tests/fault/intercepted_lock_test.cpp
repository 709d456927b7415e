// Another process that comes between two calls on the way to a lock file.

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <filesystem>
#include <string>
#include <vector>

#include "fault/interception.h"
#include "posix/directory_walk.h"
#include "posix/file_io.h"
#include "support/child.h"
#include "support/clean_test.h"

namespace {

using KeloDRCore::Posix::Descriptor;
using KeloDRCore::Posix::OpenStepwise;

using InterceptedLockTest = CleanTest;

constexpr uid_t kStranger = 4321;

bool MakeNothing(const std::string& /*path*/) { return false; }

// What is locked in it would exclude nobody who comes later.
TEST_F(InterceptedLockTest, ADirectoryThatItsOwnerMovesAwayIsNotTaken) {
  const std::string step = Path("step");
  ASSERT_EQ(mkdir(step.c_str(), 0755), 0);
  const Fault::Interception owner("fstat", 1, [&] {
    EXPECT_EQ(rename(step.c_str(), Path("moved").c_str()), 0);
    EXPECT_EQ(mkdir(step.c_str(), 0755), 0);
    return Fault::kGoOn;
  });
  const Descriptor opened = OpenStepwise(dir, step, MakeNothing);
  EXPECT_TRUE(owner.HasRun());
  struct stat found = {};
  struct stat named = {};
  ASSERT_TRUE(KeloDRCore::Posix::Stat(opened.Get(), found));
  ASSERT_EQ(stat(step.c_str(), &named), 0);
  EXPECT_TRUE(KeloDRCore::Posix::IsSameFile(found, named));
}

TEST_F(InterceptedLockTest, ADirectoryThatCannotBeLookedAtIsNotTaken) {
  ASSERT_EQ(mkdir(Path("step").c_str(), 0755), 0);
  const Fault::Interception failure("fstat", 1, EIO);
  EXPECT_FALSE(OpenStepwise(dir, Path("step"), MakeNothing).IsOpen());
  EXPECT_TRUE(failure.HasRun());
}

TEST_F(InterceptedLockTest, AStepThatCannotBeMadeIsLeftToTheCaller) {
  const Fault::Interception refusal("mkdirat", 1, EACCES);
  std::vector<std::string> made;
  const Descriptor opened = OpenStepwise(dir, Path("step/lower"), [&](const std::string& path) {
    made.push_back(path);
    return mkdir(path.c_str(), 0755) == 0;
  });
  EXPECT_TRUE(opened.IsOpen());
  EXPECT_EQ(made, std::vector<std::string>{Path("step")});
}

// It is the process that has no descriptor left: nobody planted anything.
TEST_F(InterceptedLockTest, AStepThatCannotBeOpenedAtTheMomentStays) {
  const std::string step = Path("step/lower");
  ASSERT_TRUE(std::filesystem::create_directories(step));
  const uid_t owner = geteuid() == 0 ? kStranger : geteuid();
  ASSERT_EQ(chown(step.c_str(), owner, static_cast<gid_t>(-1)), 0);
  const Fault::Interception refusal("openat", 3, EMFILE);
  EXPECT_FALSE(OpenStepwise(dir, step, MakeNothing).IsOpen());
  EXPECT_TRUE(refusal.HasRun());
  EXPECT_TRUE(std::filesystem::is_directory(step));
}

TEST_F(InterceptedLockTest, AnOrdinaryUserLosesNoFileOfHisOwn) {
  ASSERT_EQ(chmod(dir.c_str(), 0777), 0);
  const std::string step = Path("step");
  EXPECT_EQ(RunInChild([&] {
              const uid_t user = geteuid() == 0 ? kStranger : geteuid();
              ASSERT_EQ(setresuid(user, user, user), 0);
              WriteText(step, "his own");
              std::vector<std::string> made;
              const auto note = [&](const std::string& path) {
                made.push_back(path);
                return false;
              };
              EXPECT_FALSE(OpenStepwise(dir, step + "/lower", note).IsOpen());
              EXPECT_EQ(made, std::vector<std::string>{step});
              EXPECT_EQ(ReadText(step), "his own");
            }),
            0);
}

TEST_F(InterceptedLockTest, AStepThatNeverComesIntoBeingIsGivenUpAfterTenAttempts) {
  int attempts = 0;
  const auto claimToMake = [&](const std::string& /*path*/) {
    ++attempts;
    return true;
  };
  EXPECT_FALSE(OpenStepwise("/proc", "/proc/step", claimToMake).IsOpen());
  EXPECT_EQ(attempts, 10);
}

}  // namespace
