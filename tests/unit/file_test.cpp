#include "kelodrcore/file.h"

#include <fcntl.h>
#include <sys/ioctl.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <atomic>
#include <csignal>
#include <cstdlib>
#include <map>
#include <string>

#include "kelodrcore/json_value.h"
#include "support/clean_test.h"
#include "support/special_files.h"
#include "unit/json_text.h"

namespace {

std::atomic<int> syncs{0};
std::atomic<int> syncsWithoutCloseOnExec{0};

}  // namespace

// Stands before the C library's, for the shared library as well: counts, then syncs.
extern "C" int fsync(int fd) {
  ++syncs;
  if ((fcntl(fd, F_GETFD) & FD_CLOEXEC) == 0) ++syncsWithoutCloseOnExec;
  return static_cast<int>(syscall(SYS_fsync, fd));
}

namespace {

namespace File = KeloDRCore::File;
namespace JsonValue = KeloDRCore::JsonValue;

class FileTest : public CleanTest {
 protected:
  void SetUp() override {
    CleanTest::SetUp();
    syncs = 0;
    syncsWithoutCloseOnExec = 0;
  }

  static bool IsOpen(int fd) { return fcntl(fd, F_GETFD) != -1; }

  int OpenText(const std::string& text) const {
    WriteText(Path("text"), text);
    return open(Path("text").c_str(), O_RDONLY | O_CLOEXEC);
  }

  bool ReadDescriptor(const std::string& text, Json::Value& value) const {
    return File::Read(OpenText(text), value);
  }
};

// --- Read(path) ----------------------------------------------------------------------------------

TEST_F(FileTest, ReadOfAnEmptyPathFails) {
  Json::Value value("kept");
  EXPECT_FALSE(File::Read("", value));
  EXPECT_EQ(value, Json::Value("kept"));
  ExpectLog({Err("file.cpp", "Read", "Invalid path")});
}

TEST_F(FileTest, ReadOfAMissingFileSucceedsAndLeavesTheValue) {
  Json::Value value("kept");
  EXPECT_TRUE(File::Read(Path("none"), value));
  EXPECT_EQ(value, Json::Value("kept"));
  ExpectLog({Debug("file.cpp", "Read", "file[" + Path("none") + "] is not existed")});
}

TEST_F(FileTest, ReadOfAFileThatCannotBeOpenedFails) {
  const std::string path = Path("socket");
  MakeSocket(path);
  Json::Value value("kept");
  EXPECT_FALSE(File::Read(path, value));
  EXPECT_EQ(value, Json::Value("kept"));
  ExpectLog({Err("file.cpp", "Read", "File[" + path + "] is not opened.")});
}

TEST_F(FileTest, ReadParsesTheDocument) {
  WriteText(Path("a"), R"({"a":[1,"x",null]})");
  Json::Value value;
  EXPECT_TRUE(File::Read(Path("a"), value));
  EXPECT_EQ(value, Parse(R"({"a":[1,"x",null]})"));
}

TEST_F(FileTest, ReadTakesALiteralAsAPathAndZeroAsADescriptor) {
  Json::Value value("kept");
  EXPECT_TRUE(File::Read("/nonexistent/file", value));
  ExpectLog({Debug("file.cpp", "Read", "file[/nonexistent/file] is not existed")});
  EXPECT_EQ(RunInChild([] {
              Json::Value read;
              close(0);
              EXPECT_FALSE(File::Read(0, read));
              ExpectLog({Err("file.cpp", "Read", "Failed to open file descriptor [0]")});
            }),
            0);
}

TEST_F(FileTest, ReadJoinsTheLinesOfAPathWithNothingBetween) {
  WriteText(Path("a"), "{\"a\":\n1\n2,\n\"b\":\"x\ny\"}\n\n");
  Json::Value value;
  EXPECT_TRUE(File::Read(Path("a"), value));
  EXPECT_EQ(value, Parse(R"({"a":12,"b":"xy"})"));
}

TEST_F(FileTest, ReadOfTextThatDoesNotParseFailsSilently) {
  for (const std::string text : {"", "\n", "{", "{}x", "nul"}) {
    WriteText(Path("a"), text);
    Json::Value value("kept");
    EXPECT_FALSE(File::Read(Path("a"), value)) << text;
    EXPECT_EQ(value, Json::Value("kept"));
  }
}

TEST_F(FileTest, ReadRefusesANulByteBehindTheDocument) {
  WriteText(Path("a"), std::string("{}\0", 3));
  Json::Value value("kept");
  EXPECT_FALSE(File::Read(Path("a"), value));
  EXPECT_EQ(value, Json::Value("kept"));
}

TEST_F(FileTest, ReadOfADirectoryFailsSilently) {
  Json::Value value("kept");
  EXPECT_FALSE(File::Read(dir, value));
  EXPECT_EQ(value, Json::Value("kept"));
}

TEST_F(FileTest, ReadOfALargeDocumentIsWhole) {
  Json::Value written;
  for (int i = 0; i < 2000; ++i)
    written["k" + std::to_string(i)] = std::string(static_cast<size_t>(i), 'x');
  std::string text = JsonValue::toString(written);
  for (size_t at = text.find(','); at != std::string::npos; at = text.find(',', at + 2)) {
    text.insert(at + 1, "\n");
  }
  WriteText(Path("a"), text);
  Json::Value value;
  EXPECT_TRUE(File::Read(Path("a"), value));
  EXPECT_EQ(value, written);
  EXPECT_TRUE(ReadDescriptor(text, value));
  EXPECT_EQ(value, written);
}

// Nobody writes to the queue, then somebody who has nothing to say yet.
TEST_F(FileTest, ReadDoesNotWaitForAQueue) {
  ASSERT_EQ(mkfifo(Path("queue").c_str(), 0600), 0);
  Json::Value value("kept");
  EXPECT_FALSE(File::Read(Path("queue"), value));
  const int writer = open(Path("queue").c_str(), O_RDWR | O_CLOEXEC);
  EXPECT_FALSE(File::Read(Path("queue"), value));
  EXPECT_EQ(value, Json::Value("kept"));
  close(writer);
}

// A link to /dev/zero would be read until the memory runs out.
TEST_F(FileTest, ReadOfADocumentRefusesWhatIsNotARegularFile) {
  ASSERT_EQ(mkfifo(Path("queue").c_str(), 0600), 0);
  const int queue = open(Path("queue").c_str(), O_RDWR | O_CLOEXEC);
  ASSERT_EQ(write(queue, "{}", 2), 2);
  Json::Value value("kept");
  EXPECT_FALSE(File::Read(Path("queue"), value));
  int unread = 0;
  EXPECT_EQ(ioctl(queue, FIONREAD, &unread), 0);
  EXPECT_EQ(unread, 2) << "bytes of somebody else's queue";
  EXPECT_EQ(value, Json::Value("kept"));
  close(queue);
}

TEST_F(FileTest, WhatIsReadCanBePutIntoAnotherDocumentWrittenAndReadBack) {
  Json::Value written;
  ASSERT_TRUE(
      JsonValue::fromString(written["a"]["b"], std::string(1000, '[') + std::string(1000, ']')));
  ASSERT_TRUE(File::Write(Path("a"), written));
  Json::Value value;
  EXPECT_TRUE(File::Read(Path("a"), value));
  EXPECT_EQ(value, written);
  value.clear();
  EXPECT_TRUE(File::Read(open(Path("a").c_str(), O_RDONLY | O_CLOEXEC), value));
  EXPECT_EQ(value, written);
}

// A terminal of one's own would end the daemon by ^C.
TEST_F(FileTest, ReadTakesNoTerminalForItsOwn) {
  const int terminal = posix_openpt(O_RDWR | O_NOCTTY | O_CLOEXEC);
  if (terminal < 0) GTEST_SKIP() << "no terminals here";
  ASSERT_EQ(grantpt(terminal), 0);
  ASSERT_EQ(unlockpt(terminal), 0);
  const std::string path = ptsname(terminal);
  EXPECT_EQ(RunInChild([&] {
              ASSERT_NE(setsid(), -1);
              Json::Value value;
              std::map<std::string, int> map;
              EXPECT_FALSE(File::Read(path, value));
              EXPECT_FALSE(JsonValue::fromFile(value, path));
              EXPECT_EQ(File::Read(path, map), -1);
              EXPECT_EQ(open("/dev/tty", O_RDWR | O_CLOEXEC), -1);
              LogCapture::Clear();
            }),
            0);
  close(terminal);
}

// --- Read(fd) ------------------------------------------------------------------------------------

TEST_F(FileTest, ReadOfABadDescriptorFails) {
  Json::Value value("kept");
  EXPECT_FALSE(File::Read(-1, value));
  EXPECT_FALSE(File::Read(9999, value));
  EXPECT_EQ(value, Json::Value("kept"));
  ExpectLog({Err("file.cpp", "Read", "Failed to open file descriptor [-1]"),
             Err("file.cpp", "Read", "Failed to open file descriptor [9999]")});
}

TEST_F(FileTest, ReadOfAWriteOnlyDescriptorFailsAndLeavesItOpen) {
  const int fd = open(Path("a").c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600);
  Json::Value value;
  EXPECT_FALSE(File::Read(fd, value));
  ExpectLog(
      {Err("file.cpp", "Read", "Failed to open file descriptor [" + std::to_string(fd) + "]")});
  EXPECT_TRUE(IsOpen(fd));
  close(fd);
}

TEST_F(FileTest, ReadClosesItsDescriptorWhateverTheResult) {
  for (const std::string text : {"{}", "{", ""}) {
    const int fd = OpenText(text);
    Json::Value value;
    EXPECT_EQ(File::Read(fd, value), text == "{}");
    EXPECT_FALSE(IsOpen(fd)) << text;
  }
}

TEST_F(FileTest, ReadKeepsTheNewlinesOfADescriptor) {
  Json::Value value;
  EXPECT_TRUE(ReadDescriptor("{\"a\":\n\"x\ny\"}\n", value));
  EXPECT_EQ(value["a"].asString(), "x\ny");
  EXPECT_FALSE(ReadDescriptor("{\"a\":1\n2}", value));
}

TEST_F(FileTest, ReadStartsAtThePositionOfTheDescriptor) {
  const int fd = OpenText("garbage[1]");
  ASSERT_EQ(lseek(fd, 7, SEEK_SET), 7);
  Json::Value value;
  EXPECT_TRUE(File::Read(fd, value));
  EXPECT_EQ(value, Parse("[1]"));
}

TEST_F(FileTest, ReadOfADescriptorIsWholeAtEveryLengthAroundItsPieces) {
  for (size_t length = 1000; length < 1050; ++length) {
    for (const char* end : {"", "\n"}) {
      Json::Value value;
      const std::string text(length, 'x');
      EXPECT_TRUE(ReadDescriptor("\"" + text + "\"" + end, value)) << length;
      EXPECT_EQ(value.asString(), text);
    }
  }
}

TEST_F(FileTest, ANulByteHidesTheRestOfItsPieceOfADescriptor) {
  Json::Value value;
  EXPECT_TRUE(ReadDescriptor(std::string("[1,\0hidden\n2]", 13), value));
  EXPECT_EQ(value, Parse("[1,2]"));
  value = Json::Value();
  EXPECT_TRUE(ReadDescriptor(std::string("[1,\n\0hidden\n2]", 14), value));
  EXPECT_EQ(value, Parse("[1,2]"));
  // A piece ends after 1023 bytes, so that the NUL byte before its end hides nothing.
  value = Json::Value();
  const std::string piece = std::string(1019, ' ') + "[1," + '\0';
  EXPECT_TRUE(ReadDescriptor(piece + "2]", value));
  EXPECT_EQ(value, Parse("[1,2]"));
}

std::atomic<int>* signalsHandled = nullptr;

// Whether the process sleeps in a system call.
bool IsAsleep(pid_t pid) {
  const std::string stat = ReadText("/proc/" + std::to_string(pid) + "/stat");
  const size_t end = stat.rfind(')');
  return end != std::string::npos && stat.compare(end, 3, ") S") == 0;
}

TEST_F(FileTest, ASignalDoesNotCutADescriptorShort) {
  void* shared = mmap(nullptr, 4096, PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
  signalsHandled = new (shared) std::atomic<int>(0);
  struct sigaction action = {};
  struct sigaction before = {};
  action.sa_handler = [](int) { ++*signalsHandled; };
  ASSERT_EQ(sigaction(SIGUSR1, &action, &before), 0);
  int ends[2];
  ASSERT_EQ(pipe2(ends, O_CLOEXEC), 0);

  const pid_t parent = getpid();
  const pid_t child = StartChild([&] {
    const auto interrupt = [&] {
      const int handled = *signalsHandled;
      while (!IsAsleep(parent)) sched_yield();
      kill(parent, SIGUSR1);
      while (*signalsHandled == handled) sched_yield();
    };
    interrupt();
    bool written = write(ends[1], "{\"a\":", 5) == 5;
    interrupt();
    interrupt();
    written = write(ends[1], "1}", 2) == 2 && written;
    interrupt();
    return written ? 0 : 1;
  });
  close(ends[1]);
  Json::Value value;
  EXPECT_TRUE(File::Read(ends[0], value));
  EXPECT_EQ(value, Parse(R"({"a":1})"));
  EXPECT_EQ(JoinChild(child), 0);
  EXPECT_EQ(*signalsHandled, 4);
  sigaction(SIGUSR1, &before, nullptr);
  munmap(shared, 4096);
}

// --- Write ---------------------------------------------------------------------------------------

TEST_F(FileTest, WriteToAnEmptyPathFails) {
  EXPECT_FALSE(File::Write("", Json::Value(1)));
  ExpectLog({Err("file.cpp", "Write", "Empty path to write.")});
}

TEST_F(FileTest, WriteToAPathThatCannotBeOpenedFails) {
  EXPECT_FALSE(File::Write(dir, Json::Value(1)));
  EXPECT_FALSE(File::Write(Path("no/dir"), Json::Value(1)));
  ExpectLog({Err("file.cpp", "Write", "Failed to open file [" + dir + "]"),
             Err("file.cpp", "Write", "Failed to open file [" + Path("no/dir") + "]")});
}

TEST_F(FileTest, WriteReplacesTheTextAndSyncsOnce) {
  WriteText(Path("a"), std::string(1000, 'x'));
  EXPECT_TRUE(File::Write(Path("a"), Parse(R"({"b":"100%s","a":1})")));
  EXPECT_EQ(ReadText(Path("a")), R"({"a":1,"b":"100%s"})");
  EXPECT_EQ(syncs, 1);
}

TEST_F(FileTest, WriteOpensItsFileCloseOnExec) {
  EXPECT_TRUE(File::Write(Path("a"), Json::Value(1)));
  EXPECT_EQ(syncsWithoutCloseOnExec, 0);
}

TEST_F(FileTest, WriteCreatesAFileWithThePermissionsOfTheUmask) {
  const mode_t before = umask(027);
  EXPECT_TRUE(File::Write(Path("a"), Json::Value(1)));
  umask(before);
  struct stat status = {};
  ASSERT_EQ(stat(Path("a").c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 07777U, 0640U);
}

TEST_F(FileTest, WriteNamesTheDocumentAndThePathWhenWritingFails) {
  // More than the stream's buffer, so that the device is reached before the flush.
  const Json::Value value(std::string(100000, 'x'));
  EXPECT_FALSE(File::Write("/dev/full", value));
  ExpectLog({Err("file.cpp", "Write",
                 "Failed to write [" + JsonValue::toString(value) + "] to [/dev/full].")});
  EXPECT_EQ(syncs, 0);
}

TEST_F(FileTest, WriteNamesThePathWhenFlushingFails) {
  EXPECT_FALSE(File::Write("/dev/full", Json::Value(1)));
  ExpectLog({Err("file.cpp", "Write", "Failed to flush file[/dev/full]")});
  EXPECT_EQ(syncs, 0);
}

TEST_F(FileTest, WriteNamesThePathWhenSyncingFails) {
  EXPECT_FALSE(File::Write("/dev/null", Json::Value(1)));
  ExpectLog({Err("file.cpp", "Write", "Failed to sync file [/dev/null]")});
  EXPECT_EQ(syncs, 1);
}

TEST_F(FileTest, WriteToABadDescriptorFails) {
  EXPECT_FALSE(File::Write(-1, Json::Value(1)));
  const int fd = OpenText("x");
  EXPECT_FALSE(File::Write(fd, Json::Value(1)));
  EXPECT_TRUE(IsOpen(fd));
  close(fd);
  ExpectLog(
      {Err("file.cpp", "Write", "Failed to open file descriptor [-1]"),
       Err("file.cpp", "Write", "Failed to open file descriptor [" + std::to_string(fd) + "]")});
}

TEST_F(FileTest, WriteToADescriptorWritesInPlaceSyncsAndCloses) {
  WriteText(Path("a"), "0123456789");
  const int fd = open(Path("a").c_str(), O_RDWR | O_CLOEXEC);
  ASSERT_EQ(lseek(fd, 2, SEEK_SET), 2);
  EXPECT_TRUE(File::Write(fd, Parse("[1]")));
  EXPECT_FALSE(IsOpen(fd));
  EXPECT_EQ(ReadText(Path("a")), "01[1]56789");
  EXPECT_EQ(syncs, 1);
}

TEST_F(FileTest, WriteToADescriptorNamesEachFailedStepAndCloses) {
  const Json::Value large(std::string(100000, 'x'));
  int fd = open("/dev/full", O_WRONLY | O_CLOEXEC);
  EXPECT_FALSE(File::Write(fd, large));
  EXPECT_FALSE(IsOpen(fd));
  ExpectLog({Err(
      "file.cpp", "Write",
      "Failed to write [" + JsonValue::toString(large) + "] to fd[" + std::to_string(fd) + "]")});
  fd = open("/dev/full", O_WRONLY | O_CLOEXEC);
  EXPECT_FALSE(File::Write(fd, Json::Value(1)));
  EXPECT_FALSE(IsOpen(fd));
  ExpectLog({Err("file.cpp", "Write", "Failed to flush file")});
  fd = open("/dev/null", O_WRONLY | O_CLOEXEC);
  EXPECT_FALSE(File::Write(fd, Json::Value(1)));
  EXPECT_FALSE(IsOpen(fd));
  ExpectLog({Err("file.cpp", "Write", "Failed to sync file")});
}

TEST_F(FileTest, WhatIsWrittenReadsBackTheSameBothWays) {
  const Json::Value value = Parse(R"({"a":[1,-2.5,"x\ny",null,true],"b":{"":"\u0000"}})");
  Json::Value read;
  EXPECT_TRUE(File::Write(Path("a"), value));
  EXPECT_TRUE(File::Read(Path("a"), read));
  EXPECT_EQ(read, value);
  read = Json::Value();
  const int out = open(Path("b").c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600);
  EXPECT_TRUE(File::Write(out, value));
  EXPECT_TRUE(File::Read(open(Path("b").c_str(), O_RDONLY | O_CLOEXEC), read));
  EXPECT_EQ(read, value);
}

}  // namespace
