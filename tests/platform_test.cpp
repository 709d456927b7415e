#include "kelocore.h"

#include "support/clean_test.h"

namespace {

using ExecTest = CleanTest;

TEST_F(ExecTest, GivesZeroForExitStatusZero) {
  EXPECT_EQ(KLIBCExec("/bin/true", nullptr, nullptr, nullptr, nullptr), 0);
}

TEST_F(ExecTest, GivesAnErrorForAnotherExitStatus) {
  EXPECT_NE(KLIBCExec("/bin/sh", "-c", "exit 1", nullptr, nullptr), 0);
}

TEST_F(ExecTest, GivesAnErrorForAMissingProgram) {
  EXPECT_NE(KLIBCExec(Path("no").c_str(), nullptr, nullptr, nullptr, nullptr), 0);
  EXPECT_EQ(errno, ENOENT);
}

}  // namespace
