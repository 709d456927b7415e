// The fixture of every test: a directory of its own, and a teardown that finds what was left
// behind.

#ifndef KELODRCORE_TESTS_SUPPORT_CLEAN_TEST_H_
#define KELODRCORE_TESTS_SUPPORT_CLEAN_TEST_H_

#include <gtest/gtest.h>

#include <functional>
#include <set>
#include <string>
#include <vector>

#include "support/child.h"
#include "support/log_capture.h"
#include "support/mounts.h"

// The descriptors open in this process.
std::set<int> OpenDescriptors();

// The names in a directory, "." and ".." left out, sorted; empty for a missing one.
std::vector<std::string> NamesIn(const std::string& dir);

std::string ReadText(const std::string& path);
void WriteText(const std::string& path, const std::string& text);

// Runs `body` in a child whose mounts are its own, and expects it to pass; false when this process
// may not do that. What `body` mounts is seen by nobody else and gone with the child.
bool RunWithOwnMounts(const std::function<void()>& body);

// Runs `body` as root in a child, which for an ordinary user is root in a user namespace; false
// when this process may not do that.
bool RunAsRoot(const std::function<void()>& body);

// RunWithOwnMounts() with an empty /tmp of `size`; skips the test when this process may not mount
// one.
void RunWithOwnTmp(const std::string& size, const std::function<void()>& body);

// RunWithOwnMounts() with `file` in the place of the program at `path`.
bool RunWithProgram(const std::string& path, const std::string& file,
                    const std::function<void()>& body);

// Each test has an empty directory and an empty log record. Teardown fails when the test left a
// descriptor open, a child (running or zombie) behind, other effective ids, or a log line that it
// did not Take().
class CleanTest : public testing::Test {
 protected:
  void SetUp() override;
  void TearDown() override;

  // The path of `name` in the test's own directory, which is removed at the end.
  std::string Path(const std::string& name) const { return dir + "/" + name; }

  // RunWithProgram() with a shell script, which is written to Path("program"), as the program.
  bool RunWithScript(const std::string& program, const std::string& script,
                     const std::function<void()>& body) const;

  // Expects exactly these lines since the last look at the log.
  static void ExpectLog(const std::vector<LogLine>& expected);

  std::string dir;

 private:
  std::set<int> descriptorsBefore;
};

#endif  // KELODRCORE_TESTS_SUPPORT_CLEAN_TEST_H_
