// What the tests of documents in files share.

#ifndef KELODRCORE_TESTS_UNIT_JSON_FILE_H_
#define KELODRCORE_TESTS_UNIT_JSON_FILE_H_

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <string>
#include <vector>

#include "kelodrcore/json_value.h"
#include "support/clean_test.h"
#include "support/test_clock.h"

using KeloDRCore::JsonValue::fromFile;
using KeloDRCore::JsonValue::toFile;

inline constexpr uid_t kOther = 65534;

inline Json::Value Document(const std::string& text) {
  Json::Value value;
  value["text"] = text;
  return value;
}

inline struct stat StatOf(const std::string& path) {
  struct stat found = {};
  EXPECT_EQ(lstat(path.c_str(), &found), 0) << path;
  return found;
}

inline mode_t ModeOf(const std::string& path) { return StatOf(path).st_mode & 07777; }

class JsonValueFileTest : public CleanTest {
 protected:
  using Names = std::vector<std::string>;

  void SetUp() override {
    CleanTest::SetUp();
    umaskBefore = umask(022);
  }
  void TearDown() override {
    TestClock::Reset();
    umask(umaskBefore);
    CleanTest::TearDown();
  }

  // The name of the temporary of `name`, as the header tells it.
  static std::string TemporaryOf(const std::string& name) {
    return "." + name + ".kelodr-" + std::to_string(geteuid());
  }

  void ExpectDocument(const std::string& path, const Json::Value& expected) {
    Json::Value value;
    EXPECT_TRUE(fromFile(value, path)) << path;
    EXPECT_EQ(value, expected);
  }

  void ExpectNotRead(const std::string& path, int error) {
    Json::Value value("untouched");
    errno = 0;
    EXPECT_FALSE(fromFile(value, path)) << path;
    EXPECT_EQ(errno, error) << path;
    EXPECT_EQ(value, Json::Value("untouched"));
  }

  void ExpectNotWritten(const std::string& path, int error) {
    errno = 0;
    EXPECT_FALSE(toFile(Document("new"), path)) << path;
    EXPECT_EQ(errno, error) << path;
  }

  // Another user cannot write the file "a" in a directory of this mode, and nothing changes.
  void ExpectNotWrittenByAnother(mode_t directoryMode, int error) {
    if (geteuid() != 0) GTEST_SKIP() << "needs root to become another user";
    WriteText(Path("a"), "1");
    ASSERT_EQ(chmod(dir.c_str(), directoryMode), 0);
    EXPECT_EQ(RunInChild([&] {
                ASSERT_EQ(setresuid(kOther, kOther, kOther), 0);
                ExpectNotWritten(Path("a"), error);
              }),
              0);
    EXPECT_EQ(ReadText(Path("a")), "1");
    EXPECT_EQ(NamesIn(dir), Names{"a"});
  }

 private:
  mode_t umaskBefore = 0;
};

#endif  // KELODRCORE_TESTS_UNIT_JSON_FILE_H_
