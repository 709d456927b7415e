#include "fault/fault.h"
#include "kelodrcore/utils.h"

using Fault::Outcome;
using UtilsFaultTest = FaultTest;

TEST_F(UtilsFaultTest, AUuidComesWholeOrNotAtAll) {
  std::string uuid;
  const auto prepare = [] {};
  const auto run = [&] {
    uuid.clear();
    uuid = KeloDRCore::GenerateUUID();
    return !uuid.empty();
  };
  const auto check = [&](const Outcome& outcome) {
    EXPECT_EQ(uuid.size(), outcome.succeeded ? 36U : 0U);
    EXPECT_TRUE(!outcome.succeeded || outcome.log.empty());
    const LogLine notStarted =
        Err("utils.cpp", "GenerateUUID", "Failed to exec the command [/usr/bin/uuidgen].");
    for (const LogLine& line : outcome.log) EXPECT_EQ(line, notStarted);
    EXPECT_LE(outcome.log.size(), 1U);
    // A tool that was started and whose output could not be read is not told.
    EXPECT_TRUE(outcome.succeeded || outcome.Failed("read") || outcome.Failed("fstat") ||
                outcome.threw || !outcome.log.empty() || outcome.error == Fault::kNoMemory);
  };
  SweepCalls({prepare, run, check});
  SweepMemory({prepare, run, check});
}

TEST_F(UtilsFaultTest, APauseIsMadeWhateverInterruptsTheDraw) {
  const auto prepare = [] {};
  const auto run = [] { return KeloDRCore::RandomSleepInMSec(1, 2); };
  const auto check = [](const Outcome& outcome) {
    EXPECT_TRUE(outcome.succeeded);
    EXPECT_TRUE(outcome.log.empty());
  };
  SweepCalls({prepare, run, check});
  SweepMemory({prepare, run, check});
}
