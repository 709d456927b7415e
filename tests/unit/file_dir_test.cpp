#include <fcntl.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <functional>
#include <string>
#include <utility>
#include <vector>

#include "kelodrcore/file.h"
#include "support/clean_test.h"
#include "unit/root_ids/root_ids.h"

namespace {

namespace File = KeloDRCore::File;

constexpr uid_t kOther = 65534;
constexpr char kNeedsRoot[] = "needs root: mkdir or rm is to run with other rights";

using FileDirTest = CleanTest;

// The bracket around mkdir has nothing to raise where the ids say root from the beginning.
class FileDirRootTest : public CleanTest {
 protected:
  // `body` calls `program` exactly so: its name and arguments, each in brackets, a call a line.
  void ExpectCalls(const std::string& program, const std::function<void()>& body,
                   const std::string& expected) const {
    const std::string script = R"((printf '[%s]' "$0" "$@"; echo) >> ')" + Path("calls") + "'";
    if (!RunWithScript(program, script, body)) {
      GTEST_SKIP() << "needs the right to put another program in place";
    }
    EXPECT_EQ(ReadText(Path("calls")), expected);
  }
};

unsigned int ModeOf(const std::string& path) {
  struct stat status = {};
  EXPECT_EQ(stat(path.c_str(), &status), 0) << path;
  return status.st_mode & 07777U;
}

TEST_F(FileDirTest, CreateDirOfAnEmptyPathFailsSilently) {
  EXPECT_FALSE(File::CreateDir("", 0755));
}

TEST_F(FileDirTest, CreateDirOfADirectoryDoesNothingWhateverTheMode) {
  ASSERT_EQ(chmod(dir.c_str(), 0700), 0);
  for (const int mode : {0755, 01000, -1}) EXPECT_TRUE(File::CreateDir(dir, mode));
  EXPECT_EQ(ModeOf(dir), 0700U);
}

TEST_F(FileDirRootTest, CreateDirGivesTheModeWhateverTheUmaskAndItsParentsTheUmasks) {
  const mode_t before = umask(027);
  EXPECT_TRUE(File::CreateDir(Path("p/q/a"), 0777));
  EXPECT_TRUE(File::CreateDir(Path("b"), 0));
  EXPECT_TRUE(File::CreateDir(Path("c c"), 0705));
  umask(before);
  EXPECT_EQ(ModeOf(Path("p/q/a")), 0777U);
  EXPECT_EQ(ModeOf(Path("p")), 0750U);
  EXPECT_EQ(ModeOf(Path("b")), 0U);
  EXPECT_EQ(ModeOf(Path("c c")), 0705U);
}

TEST_F(FileDirTest, CreateDirRefusesAModeAbove0777) {
  EXPECT_FALSE(File::CreateDir(Path("a"), 01000));
  EXPECT_FALSE(File::CreateDir(Path("a"), 0x7fffffff));
  ExpectLog({Err("file.cpp", "CreateDir", "Directory mode error: 1000"),
             Err("file.cpp", "CreateDir", "Directory mode error: 17777777777")});
  EXPECT_EQ(NamesIn(dir), std::vector<std::string>{});
}

TEST_F(FileDirTest, CreateDirRefusesANegativeMode) {
  EXPECT_FALSE(File::CreateDir(Path("a"), -1));
  ExpectLog({Err("file.cpp", "CreateDir", "snprintf error with mode [37777777777]")});
  EXPECT_EQ(NamesIn(dir), std::vector<std::string>{});
}

TEST_F(FileDirRootTest, CreateDirNamesPathAndModeWhenMkdirFails) {
  WriteText(Path("file"), "x");
  for (const std::string& path : {Path("file"), Path("file/sub")}) {
    EXPECT_FALSE(File::CreateDir(path, 0750));
    ExpectLog(
        {Err("file.cpp", "CreateDir", "Failed to create dir [" + path + "] with mode [750]")});
  }
}

TEST_F(FileDirRootTest, CreateDirRunsMkdirWithThePathBeforeTheMode) {
  ExpectCalls(
      "/bin/mkdir",
      [this] {
        EXPECT_TRUE(File::CreateDir(Path("a b"), 0750));
        EXPECT_TRUE(File::CreateDir("-x", 07));
      },
      "[/bin/mkdir][-p][" + Path("a b") + "][-m][750]\n[/bin/mkdir][-p][./-x][-m][7]\n");
}

TEST_F(FileDirRootTest, CreateDirRunsNothingWhenThereIsNothingToMake) {
  ExpectCalls(
      "/bin/mkdir",
      [this] {
        EXPECT_TRUE(File::CreateDir(dir, 0755));
        EXPECT_FALSE(File::CreateDir("", 0755));
        EXPECT_FALSE(File::CreateDir(Path("a"), 01000));
        LogCapture::Clear();
      },
      "");
}

TEST_F(FileDirRootTest, CreateDirHidesNothingFromAShell) {
  const std::string path = Path("a; touch b $(touch c)");
  EXPECT_TRUE(File::CreateDir(path, 0755));
  EXPECT_EQ(NamesIn(dir), std::vector<std::string>{"a; touch b $(touch c)"});
}

TEST_F(FileDirRootTest, CreateDirWorksAsRootUnderOtherEffectiveIdsAndRestoresThem) {
  if (!RootIds::AreReal()) GTEST_SKIP() << kNeedsRoot;
  EXPECT_EQ(RunInChild([this] {
              ASSERT_EQ(setresgid(gid_t(-1), kOther, gid_t(-1)), 0);
              ASSERT_EQ(setresuid(uid_t(-1), kOther, uid_t(-1)), 0);
              EXPECT_TRUE(File::CreateDir(Path("p/a"), 0755));
              EXPECT_EQ(geteuid(), kOther);
              EXPECT_EQ(getegid(), kOther);
              ExpectLog({Auth(LOG_AUTH | LOG_DEBUG, "file.cpp WARNING: setresgid(-1, 0, -1)"),
                         Auth(LOG_AUTH | LOG_DEBUG, "file.cpp WARNING: setresuid(-1, 0, -1)"),
                         Auth(LOG_AUTH | LOG_DEBUG, "file.cpp WARNING: setresuid(-1, 0, -1)")});
            }),
            0);
  for (const std::string& path : {Path("p"), Path("p/a")}) {
    struct stat status = {};
    ASSERT_EQ(stat(path.c_str(), &status), 0);
    EXPECT_EQ(status.st_uid, 0U);
    EXPECT_EQ(status.st_gid, 0U);
  }
  EXPECT_EQ(ModeOf(Path("p/a")), 0755U);
}

TEST_F(FileDirRootTest, CreateDirNamesAFailureBeforeItRestoresTheIds) {
  WriteText(Path("file"), "x");
  EXPECT_EQ(RunInChild([this] {
              ASSERT_EQ(setresuid(uid_t(-1), kOther, uid_t(-1)), 0);
              EXPECT_FALSE(File::CreateDir(Path("file/a"), 0755));
              const LogLine raised =
                  Auth(LOG_AUTH | LOG_DEBUG, "file.cpp WARNING: setresuid(-1, 0, -1)");
              ExpectLog({raised,
                         Err("file.cpp", "CreateDir",
                             "Failed to create dir [" + Path("file/a") + "] with mode [755]"),
                         raised});
              EXPECT_EQ(geteuid(), kOther);
            }),
            0);
}

TEST_F(FileDirRootTest, CreateDirRunsMkdirEvenWhenRaisingFails) {
  if (!RootIds::AreReal()) GTEST_SKIP() << kNeedsRoot;
  ASSERT_EQ(chmod(dir.c_str(), 0755), 0);
  ASSERT_TRUE(File::CreateDir(Path("open"), 0777));
  const std::vector<LogLine> refused = {
      Auth(LOG_AUTH | LOG_ERR, "file.cpp ERROR: setresgid(-1, 0, -1) [Operation not permitted]"),
      Auth(LOG_AUTH | LOG_ERR, "file.cpp ERROR: ENTERCriticalSection")};
  EXPECT_EQ(RunInChild([&] {
              ASSERT_EQ(setresgid(kOther, kOther, kOther), 0);
              ASSERT_EQ(setresuid(kOther, kOther, kOther), 0);
              EXPECT_TRUE(File::CreateDir(Path("open/a"), 0750));
              ExpectLog(refused);
              EXPECT_FALSE(File::CreateDir(Path("b"), 0750));
              std::vector<LogLine> lines = refused;
              lines.push_back(Err("file.cpp", "CreateDir",
                                  "Failed to create dir [" + Path("b") + "] with mode [750]"));
              ExpectLog(lines);
            }),
            0);
  struct stat status = {};
  ASSERT_EQ(stat(Path("open/a").c_str(), &status), 0);
  EXPECT_EQ(status.st_uid, kOther);
}

TEST_F(FileDirTest, RemoveDirLeavesWhatIsNotADirectory) {
  WriteText(Path("file"), "x");
  EXPECT_TRUE(File::RemoveDir(Path("file")));
  EXPECT_TRUE(File::RemoveDir(Path("none")));
  EXPECT_TRUE(File::RemoveDir(""));
  EXPECT_EQ(ReadText(Path("file")), "x");
}

TEST_F(FileDirRootTest, RemoveDirRemovesTheWholeTree) {
  ASSERT_TRUE(File::CreateDir(Path("a/b/c"), 0755));
  WriteText(Path("a/b/file"), "x");
  WriteText(Path("kept"), "x");
  EXPECT_TRUE(File::RemoveDir(Path("a")));
  EXPECT_EQ(NamesIn(dir), std::vector<std::string>{"kept"});
}

TEST_F(FileDirRootTest, RemoveDirRunsRmWithThePath) {
  ExpectCalls(
      "/bin/rm", [this] { EXPECT_TRUE(File::RemoveDir(dir)); }, "[/bin/rm][-rf][" + dir + "]\n");
}

// mkdir and rm take what begins with "-" for an option, as far as the environment has them do so.
TEST_F(FileDirRootTest, APathThatBeginsWithAHyphenIsAPath) {
  EXPECT_EQ(RunInChild([this] {
              ASSERT_EQ(chdir(dir.c_str()), 0);
              for (const std::string path : {"-m", "-v/sub", "--help", "-"}) {
                EXPECT_TRUE(File::CreateDir(path, 0700)) << path;
                EXPECT_EQ(ModeOf("./" + path), 0700U) << path;
              }
              for (const std::string path : {"-m", "-v", "--help", "-"}) {
                EXPECT_TRUE(File::RemoveDir(path)) << path;
              }
            }),
            0);
  EXPECT_EQ(NamesIn(dir), std::vector<std::string>{});
}

TEST_F(FileDirRootTest, RemoveDirRunsNothingForWhatIsNoDirectory) {
  WriteText(Path("file"), "x");
  ExpectCalls(
      "/bin/rm",
      [this] {
        EXPECT_TRUE(File::RemoveDir(Path("file")));
        EXPECT_TRUE(File::RemoveDir(Path("none")));
      },
      "");
}

TEST_F(FileDirRootTest, RemoveDirFailsSilentlyAndRaisesNoPrivileges) {
  if (!RootIds::AreReal()) GTEST_SKIP() << kNeedsRoot;
  ASSERT_EQ(chmod(dir.c_str(), 0755), 0);
  ASSERT_TRUE(File::CreateDir(Path("a"), 0755));
  EXPECT_EQ(RunInChild([this] {
              ASSERT_EQ(setresuid(uid_t(-1), kOther, uid_t(-1)), 0);
              EXPECT_FALSE(File::RemoveDir(Path("a")));
              ExpectLog({});
            }),
            0);
  EXPECT_EQ(NamesIn(dir), std::vector<std::string>{"a"});
}

// --- GetParentDir and IsRegularFile --------------------------------------------------------------

TEST_F(FileDirTest, GetParentDirIsWhatStandsBeforeTheLastSlash) {
  const std::pair<const char*, const char*> rows[] = {
      {"", ""},       {"file", "file"},  {"/file", ""}, {"/", ""},
      {"/a/b", "/a"}, {"/a/b/", "/a/b"}, {"a/b", "a"},  {"/a//b", "/a/"},
      {"//", "/"},    {"a/", "a"},       {"./a", "."},  {"/a/../b", "/a/.."}};
  for (const auto& [path, parent] : rows) EXPECT_EQ(File::GetParentDir(path), parent) << path;
}

TEST_F(FileDirTest, OnlyAnOpenRegularFileIsARegularFile) {
  WriteText(Path("file"), "x");
  const int file = open(Path("file").c_str(), O_RDONLY | O_CLOEXEC);
  const int directory = open(dir.c_str(), O_RDONLY | O_CLOEXEC);
  const int device = open("/dev/null", O_RDONLY | O_CLOEXEC);
  int ends[2];
  ASSERT_EQ(pipe2(ends, O_CLOEXEC), 0);
  EXPECT_TRUE(File::IsRegularFile(file));
  for (const int fd : {-1, INT32_MIN, 9999, directory, device, ends[0], ends[1]}) {
    EXPECT_FALSE(File::IsRegularFile(fd)) << fd;
  }
  unlink(Path("file").c_str());
  EXPECT_TRUE(File::IsRegularFile(file));
  for (const int fd : {file, directory, device, ends[0], ends[1]}) close(fd);
  EXPECT_FALSE(File::IsRegularFile(file));
}

TEST_F(FileDirTest, ARegularFileMayHaveTheNumberOfTheStandardInput) {
  WriteText(Path("file"), "x");
  EXPECT_EQ(RunInChild([this] {
              close(STDIN_FILENO);
              ASSERT_EQ(open(Path("file").c_str(), O_RDONLY | O_CLOEXEC), STDIN_FILENO);
              EXPECT_TRUE(File::IsRegularFile(STDIN_FILENO));
            }),
            0);
}

}  // namespace
