#include "support/clean_test.h"

#include <dirent.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>

#include "support/mounts.h"

namespace {

const uid_t startUid = geteuid();
const gid_t startGid = getegid();

}  // namespace

std::set<int> OpenDescriptors() {
  std::set<int> result;
  DIR* dir = opendir("/proc/self/fd");
  if (dir == nullptr) return result;
  while (const dirent* entry = readdir(dir)) {
    const int fd = atoi(entry->d_name);
    if (entry->d_name[0] != '.' && fd != dirfd(dir)) result.insert(fd);
  }
  closedir(dir);
  return result;
}

std::vector<std::string> NamesIn(const std::string& dir) {
  std::set<std::string> names;
  std::error_code error;
  for (const auto& entry : std::filesystem::directory_iterator(dir, error)) {
    names.insert(entry.path().filename().string());
  }
  return {names.begin(), names.end()};
}

std::string ReadText(const std::string& path) {
  std::ifstream in(path, std::ios::binary);
  return {std::istreambuf_iterator<char>(in), {}};
}

void WriteText(const std::string& path, const std::string& text) {
  std::ofstream(path, std::ios::binary) << text;
}

namespace {

// False when `enter` says that this process may not do what it is for.
bool RunInside(bool (*enter)(), const std::function<void()>& body) {
  constexpr int kNotAllowed = 77;
  const int status = RunInChild([&] {
    if (!enter()) _exit(kNotAllowed);
    body();
  });
  if (WIFEXITED(status) && WEXITSTATUS(status) == kNotAllowed) return false;
  EXPECT_EQ(status, 0);
  return true;
}

}  // namespace

bool RunWithOwnMounts(const std::function<void()>& body) { return RunInside(EnterOwnMounts, body); }
bool RunAsRoot(const std::function<void()>& body) { return RunInside(BecomeRoot, body); }

void RunWithOwnTmp(const std::string& size, const std::function<void()>& body) {
  if (!RunWithOwnMounts([&] {
        ASSERT_EQ(mount("tmpfs", "/tmp", "tmpfs", 0, ("size=" + size).c_str()), 0);
        body();
      })) {
    GTEST_SKIP() << "needs the right to mount a file system";
  }
}

bool RunWithProgram(const std::string& path, const std::string& file,
                    const std::function<void()>& body) {
  return RunWithOwnMounts([&] {
    ASSERT_EQ(mount(file.c_str(), path.c_str(), nullptr, MS_BIND, nullptr), 0);
    body();
  });
}

void CleanTest::SetUp() {
  std::string pattern =
      (std::filesystem::temp_directory_path() / "kelodrcore-test-XXXXXX").string();
  ASSERT_NE(mkdtemp(pattern.data()), nullptr);
  dir = pattern;
  LogCapture::Clear();
  descriptorsBefore = OpenDescriptors();
}

void CleanTest::TearDown() {
  EXPECT_EQ(OpenDescriptors(), descriptorsBefore) << "descriptors left open or closed";
  EXPECT_EQ(waitpid(-1, nullptr, WNOHANG), -1) << "a child was left behind";
  EXPECT_EQ(errno, ECHILD);
  EXPECT_EQ(geteuid(), startUid) << "effective uid not restored";
  EXPECT_EQ(getegid(), startGid) << "effective gid not restored";
  EXPECT_EQ(LogCapture::Take(), std::vector<LogLine>{}) << "log lines nobody looked at";
  LogCapture::MirrorTo("");
  std::error_code error;
  std::filesystem::remove_all(dir, error);
}

bool CleanTest::RunWithScript(const std::string& program, const std::string& script,
                              const std::function<void()>& body) const {
  const std::string path = Path("program");
  WriteText(path, "#!/bin/sh\n" + script + "\n");
  EXPECT_EQ(chmod(path.c_str(), 0755), 0);
  return RunWithProgram(program, path, body);
}

void CleanTest::ExpectLog(const std::vector<LogLine>& expected) {
  EXPECT_EQ(LogCapture::Take(), expected);
}
