#include "kelodrcore/utils.h"

#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <functional>
#include <regex>
#include <set>
#include <string>
#include <thread>
#include <vector>

#include "support/clean_test.h"
#include "support/test_clock.h"

namespace {

using KeloDRCore::GenerateUUID;
using KeloDRCore::RandomSleepInMSec;
using KeloDRCore::Validator::IsVolPath;

class RandomSleepTest : public CleanTest {
 protected:
  void SetUp() override {
    CleanTest::SetUp();
    ReplaceSleeps([this](useconds_t microseconds) {
      sleeps.push_back(microseconds);
      return usleepResult;
    });
  }
  void TearDown() override {
    ReplaceSleeps(nullptr);
    CleanTest::TearDown();
  }

  void ExpectRefused(unsigned int min, unsigned int max, const std::string& period) {
    EXPECT_FALSE(RandomSleepInMSec(min, max));
    EXPECT_EQ(sleeps, std::vector<useconds_t>{}) << "a refused period must not sleep";
    ExpectLog({Err("utils.cpp", "RandomSleepInMSec", "Invalid period " + period + " to sleep")});
  }

  std::vector<useconds_t> sleeps;  // what usleep was called with
  int usleepResult = 0;
};

TEST_F(RandomSleepTest, RefusesAPeriodThatStartsAtZero) {
  ExpectRefused(0, 100, "[0 - 100]");
  ExpectRefused(0, 4294967295U, "[0 - 4294967295]");
}

TEST_F(RandomSleepTest, RefusesAPeriodThatEndsAtZero) {
  ExpectRefused(0, 0, "[0 - 0]");
  ExpectRefused(1, 0, "[1 - 0]");
}

TEST_F(RandomSleepTest, RefusesEqualBounds) {
  ExpectRefused(100, 100, "[100 - 100]");
  ExpectRefused(1, 1, "[1 - 1]");
  ExpectRefused(4294967295U, 4294967295U, "[4294967295 - 4294967295]");
}

TEST_F(RandomSleepTest, RefusesBoundsInTheWrongOrder) {
  ExpectRefused(200, 100, "[200 - 100]");
  ExpectRefused(4294967295U, 1, "[4294967295 - 1]");
}

TEST_F(RandomSleepTest, SleepsOnceWithinTheBounds) {
  for (int i = 0; i < 1000; ++i) {
    sleeps.clear();
    ASSERT_TRUE(RandomSleepInMSec(300, 1000));
    ASSERT_EQ(sleeps.size(), 1U);
    EXPECT_GE(sleeps[0], 300000U);
    EXPECT_LE(sleeps[0], 1000000U);
    EXPECT_EQ(sleeps[0] % 1000, 0U) << "whole milliseconds";
  }
}

TEST_F(RandomSleepTest, DrawsEveryMillisecondOfTheClosedRangeAlike) {
  constexpr int kDraws = 30000;
  for (int i = 0; i < kDraws; ++i) ASSERT_TRUE(RandomSleepInMSec(1, 3));
  for (const useconds_t period : {1000U, 2000U, 3000U}) {
    // A third of the draws, give or take six standard deviations.
    const auto count = static_cast<double>(std::count(sleeps.begin(), sleeps.end(), period));
    EXPECT_NEAR(count, kDraws / 3, 490) << period;
  }
  EXPECT_EQ(sleeps.size(), size_t{kDraws});
}

TEST_F(RandomSleepTest, AcceptsTheSmallestAndTheLargestPeriod) {
  EXPECT_TRUE(RandomSleepInMSec(1, 2));
  EXPECT_TRUE(RandomSleepInMSec(1, 4294967295U));
  EXPECT_EQ(sleeps.size(), 2U);
}

TEST_F(RandomSleepTest, MicrosecondsAreKeptTo32Bits) {
  for (int i = 0; i < 100; ++i) ASSERT_TRUE(RandomSleepInMSec(4294968, 4294969));
  // 4294968 and 4294969 times 1000, less 2 to the 32nd.
  EXPECT_EQ(std::set<useconds_t>(sleeps.begin(), sleeps.end()), (std::set<useconds_t>{704, 1704}));
}

TEST_F(RandomSleepTest, AnInterruptedSleepIsASleep) {
  usleepResult = -1;
  EXPECT_TRUE(RandomSleepInMSec(1, 2));
  EXPECT_EQ(sleeps.size(), 1U);
}

constexpr char kTool[] = "/usr/bin/uuidgen";

class GenerateUUIDTest : public CleanTest {
 protected:
  static bool IsUUID(const std::string& text) {
    static const std::regex form("[0-9a-f]{8}(-[0-9a-f]{4}){3}-[0-9a-f]{12}");
    return std::regex_match(text, form);
  }

  // One call with this script as the tool, which must not log.
  void ExpectOutput(const std::string& script, const std::string& expected) const {
    if (!RunWithScript(kTool, script, [&] {
          EXPECT_EQ(GenerateUUID(), expected);
          ExpectLog({});
        })) {
      GTEST_SKIP() << "needs root, to put another tool in place";
    }
  }
};

TEST_F(GenerateUUIDTest, GivesAnotherUUIDEachTime) {
  if (access(kTool, X_OK) != 0) GTEST_SKIP() << "needs /usr/bin/uuidgen";
  std::set<std::string> seen;
  for (int i = 0; i < 20; ++i) {
    const std::string uuid = GenerateUUID();
    EXPECT_TRUE(IsUUID(uuid)) << uuid;
    EXPECT_TRUE(seen.insert(uuid).second) << uuid;
  }
}

TEST_F(GenerateUUIDTest, CanBeCalledFromSeveralThreads) {
  if (access(kTool, X_OK) != 0) GTEST_SKIP() << "needs /usr/bin/uuidgen";
  std::vector<std::vector<std::string>> uuids(4);
  std::vector<std::thread> threads;
  for (std::vector<std::string>& own : uuids) {
    threads.emplace_back([&own] {
      for (int i = 0; i < 10; ++i) own.push_back(GenerateUUID());
    });
  }
  for (std::thread& thread : threads) thread.join();
  std::set<std::string> seen;
  for (const std::vector<std::string>& own : uuids) {
    for (const std::string& uuid : own) EXPECT_TRUE(IsUUID(uuid) && seen.insert(uuid).second);
  }
  EXPECT_EQ(seen.size(), 40U);
}

TEST_F(GenerateUUIDTest, WorksWhereChildrenAreIgnored) {
  if (access(kTool, X_OK) != 0) GTEST_SKIP() << "needs /usr/bin/uuidgen";
  EXPECT_EQ(RunInChild([] {
              signal(SIGCHLD, SIG_IGN);
              EXPECT_TRUE(IsUUID(GenerateUUID()));
            }),
            0);
}

TEST_F(GenerateUUIDTest, AToolThatCannotBeStartedIsLogged) {
  if (!RunWithProgram(kTool, "/dev/null", [] {
        EXPECT_EQ(GenerateUUID(), "");
        ExpectLog(
            {Err("utils.cpp", "GenerateUUID", "Failed to exec the command [/usr/bin/uuidgen].")});
      })) {
    GTEST_SKIP() << "needs root, to put another tool in place";
  }
}

TEST_F(GenerateUUIDTest, AFailedStartLeavesNothingBehind) {
  if (!RunWithProgram(kTool, "/dev/null", [] {
        const std::set<int> before = OpenDescriptors();
        for (int i = 0; i < 3; ++i) EXPECT_EQ(GenerateUUID(), "");
        EXPECT_EQ(OpenDescriptors(), before);
        EXPECT_EQ(waitpid(-1, nullptr, WNOHANG), -1);
        EXPECT_EQ(LogCapture::Take().size(), 3U) << "one line a call";
      })) {
    GTEST_SKIP() << "needs root, to put another tool in place";
  }
}

TEST_F(GenerateUUIDTest, AToolThatPrintsNothingGivesAnEmptyTextWithoutALine) {
  ExpectOutput("exit 0", "");
}

TEST_F(GenerateUUIDTest, AToolThatFailsIsNotLoggedEither) { ExpectOutput("exit 3", ""); }

TEST_F(GenerateUUIDTest, TheTextIsTrimmedAndOtherwiseTakenAsPrinted) {
  ExpectOutput(R"(printf ' \tNot-A uuid \t\r\n')", "Not-A uuid");
}

TEST_F(GenerateUUIDTest, OnlyTheFirstLineCounts) {
  ExpectOutput(R"(printf 'first\nsecond\n')", "first");
  ExpectOutput(R"(printf '\nsecond\n')", "");
}

TEST_F(GenerateUUIDTest, ALineWithoutNewlineCounts) { ExpectOutput("printf abc", "abc"); }

TEST_F(GenerateUUIDTest, TheExitStatusOfTheToolIsNotLookedAt) {
  ExpectOutput("echo abc; exit 1", "abc");
}

TEST_F(GenerateUUIDTest, TheToolIsGivenNoArguments) { ExpectOutput(R"(echo "$#")", "0"); }

TEST_F(GenerateUUIDTest, TheFirst64KiBOfALineCount) {
  ExpectOutput("head -c 70000 /dev/zero | tr '\\0' x", std::string(65536, 'x'));
}

TEST_F(GenerateUUIDTest, ASignalDoesNotCutTheTextShort) {
  // Signals the caller once it sleeps; it is awake when kill has returned.
  const std::string interrupt =
      "while ! grep -q '^State:.S' /proc/$caller/status; do :; done; kill -USR1 $caller\n";
  const std::string script = "read caller <" + Path("caller") + "\n" + interrupt + "printf a\n" +
                             interrupt + interrupt + "echo b\n" + interrupt;
  if (!RunWithScript(kTool, script, [&] {
        static volatile sig_atomic_t signals = 0;
        struct sigaction action = {};
        action.sa_handler = [](int) { signals = signals + 1; };
        ASSERT_EQ(sigaction(SIGUSR1, &action, nullptr), 0);
        WriteText(Path("caller"), std::to_string(getpid()) + "\n");
        EXPECT_EQ(GenerateUUID(), "ab");
        EXPECT_EQ(signals, 4);
      })) {
    GTEST_SKIP() << "needs root, to put another tool in place";
  }
}

TEST_F(GenerateUUIDTest, TheToolIsWaitedFor) {
  if (!RunWithScript(kTool, "echo abc; exec >&-; : > '" + Path("done") + "'", [this] {
        EXPECT_EQ(GenerateUUID(), "abc");
        EXPECT_EQ(NamesIn(dir), (std::vector<std::string>{"done", "program"}));
        EXPECT_EQ(waitpid(-1, nullptr, WNOHANG), -1);
      })) {
    GTEST_SKIP() << "needs root, to put another tool in place";
  }
}

using IsVolPathTest = CleanTest;

TEST_F(IsVolPathTest, APathThatBeginsWithVolumeIs) {
  for (const char* path : {"/volume", "/volume1", "/volume1/share", "/volume2/tmp",
                           "/volumeUSB1/usbshare", "/volume/../etc", "/volumes", "/volume "}) {
    EXPECT_TRUE(IsVolPath(path)) << path;
  }
}

TEST_F(IsVolPathTest, EveryOtherPathIsNot) {
  for (const char* path :
       {"", "/", "/vol", "/volum", "volume1", "/Volume1", "/VOLUME1", "//volume1", " /volume1",
        "/mnt/volume1", "./volume1", "/volune", "/etc/../volume1", "\x80/volume"}) {
    EXPECT_FALSE(IsVolPath(path)) << path;
  }
}

TEST_F(IsVolPathTest, ANulByteIsAByteLikeAnother) {
  EXPECT_TRUE(IsVolPath(std::string("/volume\0x", 9)));
  EXPECT_FALSE(IsVolPath(std::string("\0/volume", 8)));
  EXPECT_FALSE(IsVolPath(std::string("/volum\0e", 8)));
}

}  // namespace
