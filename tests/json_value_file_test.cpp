// Documents in files: whole, replaced in one step, whoever writes and whatever fails.

#include <fcntl.h>
#include <poll.h>
#include <sched.h>
#include <sys/file.h>
#include <sys/inotify.h>
#include <sys/mman.h>
#include <sys/mount.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <csignal>
#include <new>
#include <set>
#include <string>
#include <vector>

#include "kelodrcore/json_value.h"
#include "support/clean_test.h"
#include "support/test_clock.h"

namespace {

using KeloDRCore::JsonValue::fromFile;
using KeloDRCore::JsonValue::toFile;

constexpr uid_t kOther = 65534;

Json::Value Document(const std::string& text) {
  Json::Value value;
  value["text"] = text;
  return value;
}

struct stat StatOf(const std::string& path) {
  struct stat found = {};
  EXPECT_EQ(lstat(path.c_str(), &found), 0) << path;
  return found;
}

mode_t ModeOf(const std::string& path) { return StatOf(path).st_mode & 07777; }

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

TEST_F(JsonValueFileTest, AWrittenDocumentIsTheTextWithoutANewline) {
  ASSERT_TRUE(toFile(Document("x"), Path("a")));
  EXPECT_EQ(ReadText(Path("a")), "{\"text\":\"x\"}");
  ExpectDocument(Path("a"), Document("x"));
  EXPECT_EQ(NamesIn(dir), Names{"a"});
}

TEST_F(JsonValueFileTest, ALargeDocumentComesBackWhole) {
  const Json::Value large = Document(std::string(9000001, 'x'));
  ASSERT_TRUE(toFile(large, Path("a")));
  ExpectDocument(Path("a"), large);
}

TEST_F(JsonValueFileTest, AFileWithoutASizeIsReadToItsEnd) {
  const std::string path = "/proc/sys/kernel/pid_max";
  ExpectDocument(path, std::stoi(ReadText(path)));
}

TEST_F(JsonValueFileTest, WhatCannotBeReadLeavesTheValue) {
  ASSERT_EQ(mkfifo(Path("queue").c_str(), 0600), 0);
  ASSERT_EQ(symlink("loop", Path("loop").c_str()), 0);
  ExpectNotRead("", EINVAL);
  ExpectNotRead(Path("missing"), ENOENT);
  ExpectNotRead(dir, EINVAL);
  ExpectNotRead(Path("queue"), EINVAL);
  ExpectNotRead(Path("loop"), ELOOP);
  ExpectNotRead("/dev/null", EINVAL);
  WriteText(Path("text"), "{\"a\":1} x");
  Json::Value value("untouched");
  EXPECT_FALSE(fromFile(value, Path("text")));
  EXPECT_EQ(value, Json::Value("untouched"));
}

// A file of zeros that take no room, on a file system that has no limit of its own.
TEST_F(JsonValueFileTest, AFileLongerThanATextCanBeIsNotRead) {
  if (!RunWithOwnMounts([this] {
        ASSERT_EQ(mount("tmpfs", dir.c_str(), "tmpfs", 0, "size=64k"), 0);
        WriteText(Path("a"), "");
        ASSERT_EQ(truncate(Path("a").c_str(), static_cast<off_t>(std::string().max_size())), 0);
        ExpectNotRead(Path("a"), EFBIG);
      })) {
    GTEST_SKIP() << "needs the right to mount a file system";
  }
}

TEST_F(JsonValueFileTest, APathWithANulByteNamesNoFile) {
  WriteText(Path("a"), "1");
  const std::string path = Path("a") + std::string("\0b", 2);
  ExpectNotRead(path, EINVAL);
  ExpectNotWritten(path, EINVAL);
  EXPECT_EQ(ReadText(Path("a")), "1");
}

TEST_F(JsonValueFileTest, ANameWithoutASlashIsInTheWorkingDirectory) {
  EXPECT_EQ(RunInChild([this] {
              ASSERT_EQ(chdir(dir.c_str()), 0);
              EXPECT_TRUE(toFile(Document("x"), "a"));
              ExpectDocument("a", Document("x"));
              EXPECT_TRUE(toFile(Document("y"), "./a"));
              ExpectDocument("a", Document("y"));
            }),
            0);
  EXPECT_EQ(NamesIn(dir), Names{"a"});
}

TEST_F(JsonValueFileTest, ANameOfTheGreatestLengthIsWritten) {
  const std::string name = "x" + std::string(254 / 2 * 2, 'n');
  std::string utf8;
  while (utf8.size() < 254) utf8 += "\xC3\xA9";
  const std::string odd = "x" + utf8;  // whose hundredth byte begins a character
  ASSERT_EQ(name.size(), 255U);
  ASSERT_EQ(odd.size(), 255U);
  for (const std::string& longest : {name, utf8, odd}) {
    WriteText(Path(TemporaryOf(longest.substr(0, longest == odd ? 99 : 100))), "left");
    EXPECT_TRUE(toFile(Document("x"), Path(longest)));
    ExpectDocument(Path(longest), Document("x"));
  }
  EXPECT_EQ(NamesIn(dir), (Names{name, odd, utf8}));
  ExpectNotWritten(Path(name + "n"), ENAMETOOLONG);
}

TEST_F(JsonValueFileTest, ANewFileGetsItsModeFromTheUmask) {
  umask(027);
  ASSERT_TRUE(toFile(Document("x"), Path("a")));
  EXPECT_EQ(ModeOf(Path("a")), 0640U);
  umask(0);
  ASSERT_TRUE(toFile(Document("x"), Path("b")));
  EXPECT_EQ(ModeOf(Path("b")), 0666U);
}

TEST_F(JsonValueFileTest, AFileKeepsItsMode) {
  for (const mode_t mode :
       {0600U, 0666U, 0444U, 0640U, 0040U, 0U, 04755U, 02755U, 06711U, 01777U}) {
    WriteText(Path("a"), "1");
    ASSERT_EQ(chmod(Path("a").c_str(), mode), 0);
    ASSERT_TRUE(toFile(Document("x"), Path("a")));
    EXPECT_EQ(ModeOf(Path("a")), mode);
    unlink(Path("a").c_str());
  }
}

TEST_F(JsonValueFileTest, AFileKeepsItsOwnerAndTheSetIdBits) {
  if (geteuid() != 0) GTEST_SKIP() << "needs root to give files away";
  WriteText(Path("a"), "1");
  for (const uid_t uid : {0U, 1234U}) {
    for (const gid_t gid : {0U, 5678U}) {
      ASSERT_EQ(chown(Path("a").c_str(), uid, gid), 0);
      ASSERT_EQ(chmod(Path("a").c_str(), 06755), 0);
      ASSERT_TRUE(toFile(Document("x"), Path("a")));
      EXPECT_EQ(StatOf(Path("a")).st_uid, uid);
      EXPECT_EQ(StatOf(Path("a")).st_gid, gid);
      EXPECT_EQ(ModeOf(Path("a")), 06755U);
      ExpectDocument(Path("a"), Document("x"));
    }
  }
}

TEST_F(JsonValueFileTest, AnOwnerThatCannotBeKeptIsAFailure) {
  ExpectNotWrittenByAnother(0777, EPERM);
}

TEST_F(JsonValueFileTest, AnUnwritableDirectoryIsAFailure) {
  ExpectNotWrittenByAnother(0755, EACCES);
}

TEST_F(JsonValueFileTest, TheFileBehindALinkIsReplacedAndTheLinkStays) {
  ASSERT_EQ(mkdir(Path("sub").c_str(), 0755), 0);
  WriteText(Path("sub/file"), "1");
  ASSERT_EQ(symlink("file", Path("sub/second").c_str()), 0);
  ASSERT_EQ(symlink("sub/second", Path("relative").c_str()), 0);
  ASSERT_EQ(symlink(Path("sub/second").c_str(), Path("absolute").c_str()), 0);
  for (const char* link : {"relative", "absolute"}) {
    ASSERT_TRUE(toFile(Document(link), Path(link)));
    EXPECT_TRUE(S_ISLNK(StatOf(Path(link)).st_mode));
    EXPECT_TRUE(S_ISREG(StatOf(Path("sub/file")).st_mode));
    ExpectDocument(Path("sub/file"), Document(link));
  }
  EXPECT_EQ(NamesIn(Path("sub")), (Names{"file", "second"}));
}

TEST_F(JsonValueFileTest, ALinkToNothingMakesTheFileThatItNames) {
  ASSERT_EQ(symlink("target", Path("link").c_str()), 0);
  ASSERT_TRUE(toFile(Document("x"), Path("link")));
  EXPECT_TRUE(S_ISLNK(StatOf(Path("link")).st_mode));
  ExpectDocument(Path("target"), Document("x"));
}

TEST_F(JsonValueFileTest, AsManyLinksAreFollowedAsTheKernelFollows) {
  std::string path = Path("file");
  for (int link = 1; link <= 40; ++link) {
    const std::string next = Path("link" + std::to_string(link));
    ASSERT_EQ(symlink(path.c_str(), next.c_str()), 0);
    path = next;
  }
  ASSERT_TRUE(toFile(Document("x"), path));
  ExpectDocument(Path("file"), Document("x"));
  ASSERT_EQ(symlink(path.c_str(), Path("one more").c_str()), 0);
  ExpectNotWritten(Path("one more"), ELOOP);
}

TEST_F(JsonValueFileTest, ALoopOfLinksIsAFailure) {
  ASSERT_EQ(symlink("two", Path("one").c_str()), 0);
  ASSERT_EQ(symlink("one", Path("two").c_str()), 0);
  ExpectNotWritten(Path("one"), ELOOP);
  EXPECT_EQ(NamesIn(dir), (Names{"one", "two"}));
}

TEST_F(JsonValueFileTest, OnlyARegularFileIsReplaced) {
  ASSERT_EQ(mkfifo(Path("queue").c_str(), 0600), 0);
  ASSERT_EQ(mkdir(Path("sub").c_str(), 0755), 0);
  ExpectNotWritten("", EINVAL);
  ExpectNotWritten(Path("queue"), EINVAL);
  ExpectNotWritten(Path("sub"), EISDIR);
  ExpectNotWritten(Path("sub/"), EISDIR);
  ExpectNotWritten(Path("new/"), ENOENT);
  ExpectNotWritten(Path("missing/file"), ENOENT);
  ExpectNotWritten("/dev/null", EINVAL);
  EXPECT_TRUE(S_ISFIFO(StatOf(Path("queue")).st_mode));
  EXPECT_TRUE(S_ISCHR(StatOf("/dev/null").st_mode));
  EXPECT_EQ(NamesIn(dir), (Names{"queue", "sub"}));
}

TEST_F(JsonValueFileTest, AnotherNameOfTheFileKeepsTheOldDocument) {
  WriteText(Path("a"), "1");
  ASSERT_EQ(link(Path("a").c_str(), Path("b").c_str()), 0);
  ASSERT_TRUE(toFile(Document("x"), Path("a")));
  EXPECT_EQ(ReadText(Path("b")), "1");
}

TEST_F(JsonValueFileTest, ALeftTemporaryIsTakenAwayAndNeverWrittenTo) {
  WriteText(Path("other"), "mine");
  ASSERT_EQ(link(Path("other").c_str(), Path(TemporaryOf("a")).c_str()), 0);
  ASSERT_TRUE(toFile(Document("x"), Path("a")));
  EXPECT_EQ(ReadText(Path("other")), "mine");
  EXPECT_EQ(NamesIn(dir), (Names{"a", "other"}));
}

TEST_F(JsonValueFileTest, APlantedLinkOrQueueIsTakenAwayAndNotFollowed) {
  WriteText(Path("other"), "mine");
  ASSERT_EQ(symlink("other", Path(TemporaryOf("a")).c_str()), 0);
  ASSERT_TRUE(toFile(Document("x"), Path("a")));
  ASSERT_EQ(mkfifo(Path(TemporaryOf("a")).c_str(), 0600), 0);
  ASSERT_TRUE(toFile(Document("y"), Path("a")));
  EXPECT_EQ(ReadText(Path("other")), "mine");
  ExpectDocument(Path("a"), Document("y"));
  EXPECT_EQ(NamesIn(dir), (Names{"a", "other"}));
}

TEST_F(JsonValueFileTest, APlantedDirectoryIsAFailure) {
  WriteText(Path("a"), "1");
  ASSERT_EQ(mkdir(Path(TemporaryOf("a")).c_str(), 0755), 0);
  ExpectNotWritten(Path("a"), EISDIR);
  EXPECT_EQ(ReadText(Path("a")), "1");
}

// Returns when somebody has opened and closed the file so many times without writing.
void WaitUntilClosed(const std::string& path, int times) {
  const int events = inotify_init1(IN_CLOEXEC);
  ASSERT_GE(inotify_add_watch(events, path.c_str(), IN_CLOSE_NOWRITE), 0);
  while (times > 0) {
    inotify_event event;
    pollfd ready = {events, POLLIN, 0};
    ASSERT_EQ(poll(&ready, 1, 10000), 1) << "nobody tries the lock again and again";
    ASSERT_EQ(read(events, &event, sizeof event), static_cast<ssize_t>(sizeof event));
    --times;
  }
  close(events);
}

TEST_F(JsonValueFileTest, NothingStaysOpenWhereTheStandardStreamsWereClosed) {
  EXPECT_EQ(RunInChild([this] {
              for (int fd = 0; fd < 3; ++fd) close(fd);
              const bool written = toFile(Document("x"), Path("a"));
              Json::Value value;
              if (!written || !fromFile(value, Path("a"))) _exit(1);
              for (int fd = 0; fd < 3; ++fd) {
                if (fcntl(fd, F_GETFD) != -1) _exit(2);
              }
            }),
            0);
}

TEST_F(JsonValueFileTest, TheTemporaryOfALongNameThatIsNoUtf8KeepsItsFirstByte) {
  const std::string name(120, '\x80');
  WriteText(Path(TemporaryOf("\x80")), "half");
  ASSERT_TRUE(toFile(Document("x"), Path(name)));
  EXPECT_EQ(NamesIn(dir), Names{name});
}

// The temporary of a living writer is locked; here the test is that writer.
TEST_F(JsonValueFileTest, TheTemporaryOfALivingWriterIsWaitedFor) {
  WriteText(Path(TemporaryOf("a")), "half");
  const int held = open(Path(TemporaryOf("a")).c_str(), O_RDONLY | O_CLOEXEC);
  ASSERT_EQ(flock(held, LOCK_EX), 0);
  const pid_t writer = fork();
  if (writer == 0) {
    close(held);
    _exit(toFile(Document("x"), Path("a")) ? 0 : 1);
  }
  WaitUntilClosed(Path(TemporaryOf("a")), 3);
  EXPECT_EQ(ReadText(Path(TemporaryOf("a"))), "half");
  EXPECT_EQ(NamesIn(dir), Names{TemporaryOf("a")});
  ASSERT_EQ(rename(Path(TemporaryOf("a")).c_str(), Path("a").c_str()), 0);
  int status = -1;
  ASSERT_EQ(waitpid(writer, &status, 0), writer);
  close(held);
  EXPECT_EQ(status, 0);
  ExpectDocument(Path("a"), Document("x"));
}

// A living writer of the file "a", which the test lets end when the writer under test has waited.
class WaitingWriterTest : public JsonValueFileTest {
 protected:
  void SetUp() override {
    JsonValueFileTest::SetUp();
    WriteText(Path(TemporaryOf("a")), "half");
    other = open(Path(TemporaryOf("a")).c_str(), O_RDONLY | O_CLOEXEC);
    ASSERT_EQ(flock(other, LOCK_EX), 0);
  }
  void TearDown() override {
    close(other);
    JsonValueFileTest::TearDown();
  }

  void EndOther() const { EXPECT_EQ(flock(other, LOCK_UN), 0); }

 private:
  int other = -1;
};

TEST_F(WaitingWriterTest, GivesUpAfterAMinute) {
  TestClock::SkipSleeps();
  ExpectNotWritten(Path("a"), EBUSY);
  EXPECT_EQ(TestClock::TakeSleeps(), std::vector<unsigned int>(60000, 1000));
  EXPECT_EQ(NamesIn(dir), Names{TemporaryOf("a")});
  EXPECT_EQ(ReadText(Path(TemporaryOf("a"))), "half");
}

TEST_F(WaitingWriterTest, KeepsTheModeThatTheFileGotMeanwhile) {
  WriteText(Path("a"), "1");
  ASSERT_EQ(chmod(Path("a").c_str(), 0644), 0);
  TestClock::SkipSleeps([this] {
    EXPECT_EQ(chmod(Path("a").c_str(), 0640), 0);
    EndOther();
  });
  ASSERT_TRUE(toFile(Document("x"), Path("a")));
  EXPECT_EQ(ModeOf(Path("a")), 0640U);
}

TEST_F(WaitingWriterTest, KeepsTheModeOfAFileThatWentAwayMeanwhile) {
  WriteText(Path("a"), "1");
  ASSERT_EQ(chmod(Path("a").c_str(), 0640), 0);
  TestClock::SkipSleeps([this] {
    EXPECT_EQ(unlink(Path("a").c_str()), 0);
    EndOther();
  });
  ASSERT_TRUE(toFile(Document("x"), Path("a")));
  EXPECT_EQ(ModeOf(Path("a")), 0640U);
}

// The directory is locked by another writer that takes the link away.
TEST_F(JsonValueFileTest, APlantedLinkIsTakenAwayOnceItsDirectoryIsFree) {
  ASSERT_EQ(symlink("nowhere", Path(TemporaryOf("a")).c_str()), 0);
  const int directory = open(dir.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  ASSERT_EQ(flock(directory, LOCK_EX), 0);
  TestClock::SkipSleeps([&] { EXPECT_EQ(flock(directory, LOCK_UN), 0); });
  EXPECT_TRUE(toFile(Document("x"), Path("a")));
  EXPECT_EQ(TestClock::TakeSleeps(), std::vector<unsigned int>{1000});
  EXPECT_EQ(NamesIn(dir), Names{"a"});
  close(directory);
}

TEST_F(JsonValueFileTest, AFullDiskLeavesTheOldDocumentAndNothingElse) {
  const std::string disk = Path("disk");
  ASSERT_EQ(mkdir(disk.c_str(), 0755), 0);
  if (mount("tmpfs", disk.c_str(), "tmpfs", 0, "size=64k") != 0) {
    GTEST_SKIP() << "needs the right to mount a file system";
  }
  EXPECT_TRUE(toFile(Document("old"), disk + "/a"));
  ExpectNotWritten(disk + "/" + std::string(300, 'n'), ENAMETOOLONG);
  errno = 0;
  EXPECT_FALSE(toFile(Document(std::string(200000, 'x')), disk + "/a"));
  EXPECT_EQ(errno, ENOSPC);
  ExpectDocument(disk + "/a", Document("old"));
  EXPECT_EQ(NamesIn(disk), Names{"a"});
  EXPECT_EQ(umount(disk.c_str()), 0);
}

// A document that tells whether it is whole.
Json::Value Numbered(int writer, int number) {
  Json::Value value;
  value["writer"] = writer;
  value["number"] = number;
  value["pad"] = std::string(static_cast<size_t>((writer * 7919 + number * 104729) % 60000), 'p');
  return value;
}

bool IsWhole(const Json::Value& value) {
  return value == Numbered(value["writer"].asInt(), value["number"].asInt());
}

class Writers : public JsonValueFileTest, public testing::WithParamInterface<int> {};
INSTANTIATE_TEST_SUITE_P(TwoAndEight, Writers, testing::Values(2, 8));

TEST_P(Writers, DoNotDisturbEachOtherAndReadersSeeWholeDocuments) {
  constexpr int kEach = 40;
  ASSERT_TRUE(toFile(Numbered(0, 0), Path("a")));
  const int shared = MAP_SHARED | MAP_ANONYMOUS;
  void* const memory = mmap(nullptr, sizeof(int), PROT_READ | PROT_WRITE, shared, -1, 0);
  ASSERT_NE(memory, MAP_FAILED);
  auto* const reads = new (memory) std::atomic<int>(0);
  std::set<pid_t> writers;
  for (int writer = 1; writer <= GetParam(); ++writer) {
    const pid_t child = fork();
    if (child == 0) {
      prctl(PR_SET_PDEATHSIG, SIGKILL);  // it would wait for ever
      for (int n = 1; n <= kEach; ++n) {
        const int seen = *reads;
        if (!toFile(Numbered(writer, n), Path("a"))) _exit(1);
        while (*reads == seen) sched_yield();  // some reads come between two writes
      }
      _exit(0);
    }
    writers.insert(child);
  }
  while (!writers.empty()) {
    Json::Value value;
    EXPECT_TRUE(fromFile(value, Path("a")) && IsWhole(value));
    ++*reads;
    int status = 0;
    const pid_t ended = waitpid(-1, &status, WNOHANG);
    if (ended <= 0) continue;
    EXPECT_EQ(status, 0) << "a writer failed";
    writers.erase(ended);
  }
  Json::Value last;
  ASSERT_TRUE(fromFile(last, Path("a")));
  EXPECT_EQ(last["number"].asInt(), kEach) << "the last document is not the last of any writer";
  munmap(memory, sizeof(int));
  EXPECT_EQ(NamesIn(dir), Names{"a"});
}

}  // namespace
