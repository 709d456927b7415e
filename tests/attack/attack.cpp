#include "attack/attack.h"

#include <grp.h>
#include <sys/mount.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <csignal>

namespace {

constexpr unsigned int kHangs = 40;  // seconds
constexpr std::chrono::seconds kRace(2);

void BecomeUser() {
  ASSERT_EQ(setgroups(0, nullptr), 0);
  ASSERT_EQ(setresgid(kUser, kUser, kUser), 0);
  ASSERT_EQ(setresuid(kUser, kUser, kUser), 0);
}

void SetScene() {
  ASSERT_EQ(mount("tmpfs", "/tmp", "tmpfs", 0, "mode=1777,size=64m"), 0);
  ASSERT_EQ(chdir("/tmp"), 0);
  umask(022);
  alarm(kHangs);
  MakeDir(kSafeDir, 0700);
  MakeDir(kHome, 0755, kUser);
  WriteText(kSecret, "secret");
  ASSERT_EQ(chmod(kSecret, 0600), 0);
}

void ExpectNoHarm() {
  EXPECT_EQ(ReadText(kSecret), "secret");
  ExpectFile(kSecret, 0, 0600);
  EXPECT_EQ(NamesIn(kSafeDir), Names{"secret"});
}

}  // namespace

void AsUser(const std::function<void()>& body) {
  const int status = RunInChild([&] {
    alarm(kHangs);
    BecomeUser();
    if (!testing::Test::HasFailure()) body();
  });
  EXPECT_EQ(status, 0);
}

UserLoop::UserLoop(const std::function<void()>& step)
    : user(StartChild([&] {
        BecomeUser();
        prctl(PR_SET_PDEATHSIG, SIGKILL);
        while (!testing::Test::HasFailure()) step();
        return 1;
      })) {}

UserLoop::~UserLoop() {
  kill(user, SIGKILL);
  const int status = JoinChild(user);
  EXPECT_TRUE(WIFSIGNALED(status)) << status;
}

void Race(const std::function<void()>& step) {
  const auto end = std::chrono::steady_clock::now() + kRace;
  while (std::chrono::steady_clock::now() < end) step();
}

void MakeDir(const std::string& path, mode_t mode, uid_t owner) {
  ASSERT_EQ(mkdir(path.c_str(), 0700), 0) << path;
  ASSERT_EQ(chmod(path.c_str(), mode), 0) << path;
  ASSERT_EQ(chown(path.c_str(), owner, owner), 0) << path;
}

void MakeLink(const std::string& target, const std::string& path) {
  ASSERT_EQ(symlink(target.c_str(), path.c_str()), 0) << path;
}

void MakeQueue(const std::string& path) { ASSERT_EQ(mkfifo(path.c_str(), 0666), 0) << path; }

struct stat LookAt(const std::string& path) {
  struct stat found = {};
  EXPECT_EQ(lstat(path.c_str(), &found), 0) << path;
  return found;
}

bool IsThere(const std::string& path) {
  struct stat found = {};
  return lstat(path.c_str(), &found) == 0;
}

void ExpectFile(const std::string& path, uid_t owner, mode_t mode) {
  const struct stat found = LookAt(path);
  EXPECT_EQ(found.st_uid, owner) << path;
  EXPECT_EQ(found.st_mode, S_IFREG | mode) << path;
}

void AttackTest::Attack(const std::function<void()>& body) {
  if (geteuid() != 0) GTEST_SKIP() << "needs root, to be more than the user";
  const bool isAllowed = RunWithOwnMounts([&] {
    SetScene();
    if (HasFailure()) return;
    body();
    ExpectNoHarm();
  });
  if (!isAllowed) GTEST_SKIP() << "needs the right to mount a file system";
}
