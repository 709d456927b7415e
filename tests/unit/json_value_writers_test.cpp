// Several writers of one document: the temporaries of living, dead and hostile ones.

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

#include "unit/json_file.h"

namespace {

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
  const pid_t writer = StartChild([&] {
    close(held);
    return toFile(Document("x"), Path("a")) ? 0 : 1;
  });
  WaitUntilClosed(Path(TemporaryOf("a")), 3);
  EXPECT_EQ(ReadText(Path(TemporaryOf("a"))), "half");
  EXPECT_EQ(NamesIn(dir), Names{TemporaryOf("a")});
  ASSERT_EQ(rename(Path(TemporaryOf("a")).c_str(), Path("a").c_str()), 0);
  EXPECT_EQ(JoinChild(writer), 0);
  close(held);
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
  if (!RunWithOwnMounts([this] {
        ASSERT_EQ(mount("tmpfs", dir.c_str(), "tmpfs", 0, "size=64k"), 0);
        EXPECT_TRUE(toFile(Document("old"), Path("a")));
        ExpectNotWritten(Path(std::string(300, 'n')), ENAMETOOLONG);
        errno = 0;
        EXPECT_FALSE(toFile(Document(std::string(200000, 'x')), Path("a")));
        EXPECT_EQ(errno, ENOSPC);
        ExpectDocument(Path("a"), Document("old"));
        EXPECT_EQ(NamesIn(dir), Names{"a"});
      })) {
    GTEST_SKIP() << "needs the right to mount a file system";
  }
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
    writers.insert(StartChild([&] {
      prctl(PR_SET_PDEATHSIG, SIGKILL);  // it would wait for ever
      for (int n = 1; n <= kEach; ++n) {
        const int seen = *reads;
        if (!toFile(Numbered(writer, n), Path("a"))) return 1;
        while (*reads == seen) sched_yield();  // some reads come between two writes
      }
      return 0;
    }));
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
