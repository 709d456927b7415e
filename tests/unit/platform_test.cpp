// The stand-ins for the platform's libraries: text, files, random numbers and pid files. Programs
// are in platform_program_test.cpp, forks in platform_fork_test.cpp.

#include <fcntl.h>
#include <sys/mount.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <atomic>
#include <cerrno>
#include <climits>
#include <csignal>
#include <cstdlib>
#include <functional>
#include <string>
#include <thread>

#include "kelocore.h"
#include "kelorandom.h"
#include "support/clean_test.h"
#include "support/process.h"

namespace {

std::string Trimmed(std::string text, const char* set) {
  EXPECT_EQ(KLIBCStrTrim(text.data(), set, nullptr), text.data());
  return text.c_str();
}

using StrTrimTest = CleanTest;

TEST_F(StrTrimTest, TakesWhiteSpaceOffBothEndsByDefault) {
  EXPECT_EQ(Trimmed(" \t\n\r\v\fa b\t\f\v\r\n ", nullptr), "a b");
  EXPECT_EQ(Trimmed("left ", nullptr), "left");
  EXPECT_EQ(Trimmed(" right", nullptr), "right");
}

TEST_F(StrTrimTest, LeavesOtherTextAlone) {
  EXPECT_EQ(Trimmed("a \n b", nullptr), "a \n b");
  for (int byte = 1; byte < 256; ++byte) {
    const std::string text(3, static_cast<char>(byte));
    const bool isWhite = byte == ' ' || (byte >= '\t' && byte <= '\r');
    EXPECT_EQ(Trimmed(text, nullptr), isWhite ? "" : text) << byte;
  }
  EXPECT_EQ(Trimmed("", nullptr), "");
}

TEST_F(StrTrimTest, MakesABlankTextEmpty) { EXPECT_EQ(Trimmed(" \n\t ", nullptr), ""); }

TEST_F(StrTrimTest, TakesTheGivenCharactersOnly) {
  EXPECT_EQ(Trimmed("-+ a+-b +-", "+-"), " a+-b ");
  EXPECT_EQ(Trimmed(" a ", ""), " a ");
}

class FileTest : public CleanTest {
 protected:
  void SetUp() override {
    CleanTest::SetUp();
    WriteText(Path("file"), "");
    ASSERT_EQ(symlink("file", Path("link").c_str()), 0);
    ASSERT_EQ(symlink(dir.c_str(), Path("dirlink").c_str()), 0);
    ASSERT_EQ(symlink("nowhere", Path("dangling").c_str()), 0);
  }
};

TEST_F(FileTest, ExistsWhateverItIs) {
  EXPECT_EQ(KLIBCFileExist(Path("file").c_str()), 1);
  EXPECT_EQ(KLIBCFileExist(dir.c_str()), 1);
  EXPECT_EQ(KLIBCFileExist(Path("link").c_str()), 1);
  EXPECT_EQ(KLIBCFileExist("/dev/null"), 1);
}

TEST_F(FileTest, DoesNotExistWhereNothingIs) {
  EXPECT_EQ(KLIBCFileExist(Path("no").c_str()), 0);
  EXPECT_EQ(KLIBCFileExist(Path("no/no").c_str()), 0);
  EXPECT_EQ(KLIBCFileExist(Path("file/x").c_str()), 0);
  EXPECT_EQ(KLIBCFileExist(Path("dangling").c_str()), 0);
  EXPECT_EQ(KLIBCFileExist(""), 0);
}

TEST_F(FileTest, ExistsBeyondTwoGibibytes) {
  ASSERT_EQ(truncate(Path("file").c_str(), off_t{3} << 30), 0);
  EXPECT_EQ(KLIBCFileExist(Path("file").c_str()), 1);
}

TEST_F(FileTest, IsADirectoryOrNot) {
  EXPECT_EQ(KLIBCFileCheckDir(dir.c_str()), 1);
  EXPECT_EQ(KLIBCFileCheckDir(Path("dirlink").c_str()), 1);
  EXPECT_EQ(KLIBCFileCheckDir(Path("file").c_str()), 0);
  EXPECT_EQ(KLIBCFileCheckDir(Path("dangling").c_str()), 0);
  EXPECT_EQ(KLIBCFileCheckDir(Path("no").c_str()), 0);
  EXPECT_EQ(KLIBCFileCheckDir(""), 0);
}

// The start time as proc(5) gives it, cut out with other means than the ones under test.
std::string StartTime(pid_t pid) {
  std::string stat = ReadText("/proc/" + std::to_string(pid) + "/stat");
  stat.erase(0, stat.rfind(')') + 2);
  for (int field = 3; field < 22; ++field) stat.erase(0, stat.find(' ') + 1);
  return stat.substr(0, stat.find(' '));
}

class PidFileTest : public CleanTest {
 protected:
  void SetUp() override {
    CleanTest::SetUp();
    path = Path("pid");
  }

  int ReadOf(const std::string& text) {
    WriteText(path, text);
    return KLIBCReadPidFile(path.c_str());
  }

  // A process whose files may have so many bytes makes no pid file, and leaves nothing of one.
  void ExpectNothingOfAFileWithin(rlim_t bytes) const {
    EXPECT_EQ(RunInChild([&] {
                signal(SIGXFSZ, SIG_IGN);
                LowerLimit(RLIMIT_FSIZE, bytes);
                EXPECT_EQ(KLIBCProcPidFileCreate(path.c_str()), -1);
                EXPECT_EQ(errno, EFBIG);
              }),
              0);
    EXPECT_EQ(NamesIn(dir), std::vector<std::string>{});
  }

  std::string path;
};

TEST_F(PidFileTest, ReadsAPidAlone) {
  EXPECT_EQ(ReadOf("1234"), 1234);
  EXPECT_EQ(ReadOf("1234\n"), 1234);
  EXPECT_EQ(ReadOf("\n \t1234 \r\n\n"), 1234);
  EXPECT_EQ(ReadOf("1"), 1);
  EXPECT_EQ(ReadOf(std::to_string(INT_MAX)), INT_MAX);
}

TEST_F(PidFileTest, ReadsZeroForWhatIsNotAPid) {
  for (const std::string& text :
       {std::string(), std::string("\n"), std::string("0"), std::string("-5"), std::string("+5"),
        std::string("abc"), std::string("12x"), std::string("x12"), std::string("0x10"),
        std::string("1.5"), std::string("12 34"), std::string("2147483648"),
        std::string("4294967297"), std::string("18446744073709551617"), std::string("12\0", 3),
        std::string(200, '1'), "12" + std::string(200, ' ') + "x",
        std::string(100000, ' ') + "1"}) {
    EXPECT_EQ(ReadOf(text), 0) << text.substr(0, 30);
  }
}

TEST_F(PidFileTest, ReadsZeroForAMissingFile) { EXPECT_EQ(KLIBCReadPidFile(path.c_str()), 0); }

TEST_F(PidFileTest, ReadsZeroForADirectory) { EXPECT_EQ(KLIBCReadPidFile(dir.c_str()), 0); }

TEST_F(PidFileTest, ReadsZeroForAnUnreadableFile) {
  WriteText(path, "1234");
  EXPECT_EQ(KLIBCReadPidFile(path.c_str()), 1234);
  ASSERT_EQ(chmod(path.c_str(), 0), 0);
  ASSERT_EQ(chmod(dir.c_str(), 0755), 0);
  EXPECT_EQ(RunInChild([&] {
              ASSERT_TRUE(!IsRoot() || setuid(PrivateUid()) == 0);
              EXPECT_EQ(KLIBCReadPidFile(path.c_str()), 0);
            }),
            0);
}

TEST_F(PidFileTest, IsNotHeldUpByAFifo) {
  ASSERT_EQ(mkfifo(path.c_str(), 0600), 0);
  EXPECT_EQ(KLIBCReadPidFile(path.c_str()), 0);
}

TEST_F(PidFileTest, ReadsAPidWhoseStartTimeMatches) {
  const std::string pid = std::to_string(getpid());
  EXPECT_EQ(ReadOf(pid + "\n" + StartTime(getpid()) + "\n"), getpid());
  EXPECT_EQ(ReadOf(pid + "\n" + StartTime(getpid())), getpid());
}

TEST_F(PidFileTest, ReadsZeroForAReusedPid) {
  const std::string pid = std::to_string(getpid());
  const std::string other = std::to_string(std::stoull(StartTime(getpid())) + 1);
  EXPECT_EQ(ReadOf(pid + "\n" + other + "\n"), 0);
}

TEST_F(PidFileTest, ReadsAFileOfLessThan128Bytes) {
  EXPECT_EQ(ReadOf("1234" + std::string(123, ' ')), 1234);
  EXPECT_EQ(ReadOf("1234" + std::string(124, ' ')), 0);
}

TEST_F(PidFileTest, ReadsZeroForASecondLineThatIsNoStartTime) {
  const std::string pid = std::to_string(getpid());
  EXPECT_EQ(ReadOf(pid + "\nabc\n"), 0);
  EXPECT_EQ(ReadOf(pid + "\n" + StartTime(getpid()) + "\nmore\n"), 0);
}

TEST_F(PidFileTest, ReadsZeroForAFileWhoseFirstByteIsNotWrittenYet) {
  const std::string rest = std::to_string(getpid()) + "\n" + StartTime(getpid()) + "\n";
  EXPECT_EQ(ReadOf(std::string(1, '\0') + rest), 0);
}

TEST_F(PidFileTest, ReadsZeroWithAStartTimeOnceTheProcessIsGone) {
  EXPECT_EQ(RunInChild([&] { EXPECT_EQ(KLIBCProcPidFileCreate(path.c_str()), 0); }), 0);
  EXPECT_NE(ReadText(path), "");
  EXPECT_EQ(KLIBCReadPidFile(path.c_str()), 0);
}

TEST_F(PidFileTest, HoldsThePidAndTheStartTimeOfTheCaller) {
  EXPECT_EQ(KLIBCProcPidFileCreate(path.c_str()), 0);
  EXPECT_EQ(ReadText(path), std::to_string(getpid()) + "\n" + StartTime(getpid()) + "\n");
  EXPECT_EQ(KLIBCReadPidFile(path.c_str()), getpid());
}

TEST_F(PidFileTest, WorksForAProcessNameFullOfBrackets) {
  EXPECT_EQ(RunInChild([&] {
              ASSERT_EQ(prctl(PR_SET_NAME, ") Z 1 (2) 3"), 0);
              EXPECT_EQ(KLIBCProcPidFileCreate(path.c_str()), 0);
              EXPECT_EQ(ReadText(path),
                        std::to_string(getpid()) + "\n" + StartTime(getpid()) + "\n");
              EXPECT_EQ(KLIBCReadPidFile(path.c_str()), getpid());
              EXPECT_EQ(KLIBCProcAlive(getpid()), 1);
            }),
            0);
}

TEST_F(PidFileTest, IsReadableByEverybodyUnderAnyUmask) {
  const mode_t before = umask(0077);
  EXPECT_EQ(KLIBCProcPidFileCreate(path.c_str()), 0);
  umask(before);
  struct stat info {};
  ASSERT_EQ(stat(path.c_str(), &info), 0);
  EXPECT_EQ(info.st_mode & 07777, 0644U);
}

TEST_F(PidFileTest, ReplacesALongerOldFile) {
  WriteText(path, std::string(5000, '9'));
  EXPECT_EQ(KLIBCProcPidFileCreate(path.c_str()), 0);
  EXPECT_EQ(KLIBCReadPidFile(path.c_str()), getpid());
  EXPECT_EQ(NamesIn(dir), std::vector<std::string>{"pid"});
}

TEST_F(PidFileTest, DoesNotWriteThroughAPlantedLink) {
  WriteText(Path("victim"), "precious");
  ASSERT_EQ(symlink("victim", path.c_str()), 0);
  EXPECT_EQ(KLIBCProcPidFileCreate(path.c_str()), 0);
  EXPECT_EQ(ReadText(Path("victim")), "precious");
  EXPECT_EQ(KLIBCReadPidFile(path.c_str()), getpid());
}

TEST_F(PidFileTest, DoesNotWriteThroughAPlantedHardLink) {
  WriteText(Path("victim"), "precious");
  ASSERT_EQ(link(Path("victim").c_str(), path.c_str()), 0);
  EXPECT_EQ(KLIBCProcPidFileCreate(path.c_str()), 0);
  EXPECT_EQ(ReadText(Path("victim")), "precious");
}

// Whoever may write to the directory can put the link back at any moment.
TEST_F(PidFileTest, DoesNotWriteThroughALinkPlantedAgainAndAgain) {
  WriteText(Path("victim"), "precious");
  std::atomic<bool> done{false};
  std::thread attacker([&] {
    while (!done) {
      if (symlink("victim", path.c_str()) != 0 && errno != EEXIST) abort();
    }
  });
  for (int i = 0; i < 5000; ++i) {
    if (KLIBCProcPidFileCreate(path.c_str()) != 0) {
      EXPECT_EQ(errno, EEXIST);
    }
  }
  done = true;
  attacker.join();
  EXPECT_EQ(ReadText(Path("victim")), "precious");
}

TEST_F(PidFileTest, FailsWithErrnoInAMissingDirectory) {
  EXPECT_EQ(KLIBCProcPidFileCreate(Path("no/pid").c_str()), -1);
  EXPECT_EQ(errno, ENOENT);
}

TEST_F(PidFileTest, FailsWithErrnoOverADirectory) {
  ASSERT_EQ(mkdir(path.c_str(), 0755), 0);
  EXPECT_EQ(KLIBCProcPidFileCreate(path.c_str()), -1);
  EXPECT_EQ(errno, EISDIR);
  EXPECT_EQ(KLIBCFileCheckDir(path.c_str()), 1);
}

TEST_F(PidFileTest, LeavesNothingBehindWhenItCannotBeWritten) { ExpectNothingOfAFileWithin(0); }

// A file written to the limit in part is as bad as one not written.
TEST_F(PidFileTest, LeavesNothingBehindWhenItIsCutShort) { ExpectNothingOfAFileWithin(2); }

TEST_F(PidFileTest, IsNeverSeenHalfWritten) {
  std::atomic<bool> done{false};
  std::atomic<int> seen{0};
  std::atomic<int> wrong{0};
  std::thread reader([&] {
    while (!done) {
      const int pid = KLIBCReadPidFile(path.c_str());
      if (pid == getpid()) ++seen;
      if (pid != 0 && pid != getpid()) ++wrong;
    }
  });
  for (int i = 0; i < 2000 || seen == 0; ++i) {
    ASSERT_EQ(KLIBCProcPidFileCreate(path.c_str()), 0);
  }
  done = true;
  reader.join();
  EXPECT_EQ(wrong, 0);
}

using ProcAliveTest = CleanTest;

TEST_F(ProcAliveTest, IsOneForRunningProcesses) {
  EXPECT_EQ(KLIBCProcAlive(getpid()), 1);
  EXPECT_EQ(KLIBCProcAlive(1), 1);
}

TEST_F(ProcAliveTest, IsZeroForWhatIsNoPid) {
  for (const int pid : {0, -1, INT_MIN, INT_MAX}) EXPECT_EQ(KLIBCProcAlive(pid), 0) << pid;
}

TEST_F(ProcAliveTest, TurnsZeroWithTheZombie) {
  const pid_t child = StartChild(pause);
  EXPECT_EQ(KLIBCProcAlive(child), 1);
  kill(child, SIGKILL);
  siginfo_t info;
  ASSERT_EQ(waitid(P_PID, static_cast<id_t>(child), &info, WEXITED | WNOWAIT), 0);
  EXPECT_EQ(KLIBCProcAlive(child), 0) << "zombie";
  ASSERT_EQ(waitpid(child, nullptr, 0), child);
  EXPECT_EQ(KLIBCProcAlive(child), 0) << "gone";
}

TEST_F(ProcAliveTest, IsOneForAStoppedProcess) {
  const pid_t child = StartChild(pause);
  kill(child, SIGSTOP);
  ASSERT_EQ(waitpid(child, nullptr, WUNTRACED), child);
  EXPECT_EQ(KLIBCProcAlive(child), 1);
  kill(child, SIGKILL);
  ASSERT_EQ(waitpid(child, nullptr, 0), child);
}

TEST_F(ProcAliveTest, IsOneForAProcessOfAnotherUser) {
  const pid_t others = IsRoot() ? getpid() : 1;
  if (!IsRoot() && kill(others, 0) == 0) GTEST_SKIP() << "needs a process of another user";
  EXPECT_EQ(RunInChild([others] {
              ASSERT_TRUE(!IsRoot() || setuid(PrivateUid()) == 0);
              ASSERT_EQ(kill(others, 0), -1);
              ASSERT_EQ(errno, EPERM);
              EXPECT_EQ(KLIBCProcAlive(others), 1);
            }),
            0);
}

TEST_F(ProcAliveTest, IsOneWhereTheProcessCannotBeLookedAt) {
  WriteText(Path("pid"), std::to_string(getpid()) + "\n1\n");
  if (!RunAsRoot([&] {
        ASSERT_EQ(chroot(dir.c_str()), 0);
        EXPECT_EQ(KLIBCProcAlive(getppid()), 1);
        EXPECT_EQ(KLIBCReadPidFile("/pid"), getppid());
        EXPECT_EQ(KLIBCProcPidFileCreate("/mine"), -1);
      })) {
    GTEST_SKIP() << "needs root, or a user namespace";
  }
}

// What another kernel, or another file system at /proc, would tell of this process.
class ProcStatTest : public CleanTest {
 protected:
  static bool RunWithStat(const std::string& text, const std::function<void()>& body) {
    return RunWithOwnMounts([&] {
      const std::string own = "/proc/" + std::to_string(getpid());
      ASSERT_EQ(mount("tmpfs", "/proc", "tmpfs", 0, "size=64k"), 0);
      ASSERT_EQ(mkdir(own.c_str(), 0755), 0);
      WriteText(own + "/stat", text);
      body();
    });
  }
};

constexpr char kNoMount[] = "needs the right to mount a file system";

TEST_F(ProcStatTest, AnotherFormTellsNothing) {
  for (const char* const text : {"", "1234", "1234 (x", "1234 (x) S", "1234 (x) S 1 2 3"}) {
    if (!RunWithStat(text, [this] {
          EXPECT_EQ(KLIBCProcAlive(getpid()), 1);
          WriteText(Path("pid"), std::to_string(getpid()) + "\n1\n");
          EXPECT_EQ(KLIBCReadPidFile(Path("pid").c_str()), getpid());
          errno = 0;
          EXPECT_EQ(KLIBCProcPidFileCreate(Path("mine").c_str()), -1);
          EXPECT_EQ(errno, ENOENT);
        })) {
      GTEST_SKIP() << kNoMount;
    }
    EXPECT_EQ(NamesIn(dir), std::vector<std::string>{"pid"}) << text;
  }
}

// Kernels have shown it for a moment between a process's end and its removal.
TEST_F(ProcStatTest, ADeadProcessIsNotAlive) {
  const std::string rest = " 1 1 1 0 -1 4194304 1 0 0 0 0 0 0 0 20 0 1 0 77 0 0";
  if (!RunWithStat("1 (x) X" + rest, [] { EXPECT_EQ(KLIBCProcAlive(getpid()), 0); }) ||
      !RunWithStat("1 (x) S" + rest, [] { EXPECT_EQ(KLIBCProcAlive(getpid()), 1); })) {
    GTEST_SKIP() << kNoMount;
  }
}

// /proc calls a process a zombie as soon as its first thread ends.
TEST_F(ProcAliveTest, IsOneWhileAnyThreadRuns) {
  int release[2];
  ASSERT_EQ(pipe(release), 0);
  const pid_t child = StartChild([&]() -> int {
    close(release[1]);
    std::thread([&] {
      char byte;
      _exit(read(release[0], &byte, 1) == 0 ? 0 : 1);
    }).detach();
    syscall(SYS_exit, 0);  // this thread alone; pthread_exit unwinds into the test runner
    return 1;
  });
  close(release[0]);
  while (ReadText("/proc/" + std::to_string(child) + "/stat").find(") Z ") == std::string::npos) {
    std::this_thread::yield();
  }
  EXPECT_EQ(KLIBCProcAlive(child), 1);
  close(release[1]);
  EXPECT_EQ(JoinChild(child), 0);
}

unsigned int Draw(unsigned int min, unsigned int max) {
  return KELO::RANDOM::KELORandom().urandom(min, max);
}

using RandomTest = CleanTest;

TEST_F(RandomTest, StaysInTheClosedRangeAndReachesBothBounds) {
  std::array<int, 3> hits{};
  for (int i = 0; i < 1000; ++i) {
    const unsigned int value = Draw(UINT_MAX - 2, UINT_MAX);
    ASSERT_GE(value, UINT_MAX - 2);
    ++hits.at(value - (UINT_MAX - 2));
  }
  for (const int count : hits) EXPECT_GT(count, 0);
}

TEST_F(RandomTest, GivesTheOnlyNumberOfARangeOfOne) {
  for (const unsigned int only : {0U, 7U, UINT_MAX}) EXPECT_EQ(Draw(only, only), only);
}

TEST_F(RandomTest, TakesTheBoundsInEitherOrder) {
  for (int i = 0; i < 100; ++i) {
    const unsigned int value = Draw(20, 10);
    EXPECT_TRUE(value >= 10 && value <= 20) << value;
  }
}

TEST_F(RandomTest, CoversTheFullRange) {
  unsigned int ones = 0;
  unsigned int zeros = 0;
  for (int i = 0; i < 200; ++i) {
    const unsigned int value = Draw(0, UINT_MAX);
    ones |= value;
    zeros |= ~value;
  }
  EXPECT_EQ(ones, UINT_MAX);
  EXPECT_EQ(zeros, UINT_MAX);
}

// Chi-square with 9 degrees of freedom: above 70 once in 10^11 runs.
TEST_F(RandomTest, IsUniform) {
  std::array<int, 10> hits{};
  const int draws = 100000;
  for (int i = 0; i < draws; ++i) ++hits.at(Draw(300, 309) - 300);
  const double expected = draws / 10.0;
  double chiSquare = 0;
  for (const int count : hits) chiSquare += (count - expected) * (count - expected) / expected;
  EXPECT_LT(chiSquare, 70);
}

// A plain remainder would give the lowest third of this range half of the draws: 5000, not 3333
// with a standard deviation of 47.
TEST_F(RandomTest, HasNoRemainderBias) {
  int low = 0;
  for (int i = 0; i < 10000; ++i) low += Draw(0, 0xBFFFFFFF) < 0x40000000 ? 1 : 0;
  EXPECT_NEAR(low, 3333, 400);
}

}  // namespace
