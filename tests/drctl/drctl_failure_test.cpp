// The example program where something is in its way.

#include <fcntl.h>
#include <kelodrcore/file_lock.h>
#include <kelodrcore/response.h>
#include <sys/file.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <functional>

#include "drctl/locks.h"
#include "drctl/program.h"

namespace {

using KeloDRCore::FileLock;
using KeloDRCore::Response;

class DrctlFailureTest : public LocksTest {
 protected:
  // Runs "drctl --db registry.db ARGUMENTS" in this test's directory, by a shell.
  Outcome RunHere(const std::string& arguments, const std::string& input = "") {
    const std::string command = "cd \"$1\" && exec \"$2\" --db registry.db " + arguments;
    return RunProgram(dir, {"/bin/sh", "-c", command, "sh", dir, DRCTL}, input);
  }

  // Asks how far a task is whose state is kept in that directory.
  Response Poll(const std::string& stateDir, const std::string& id) {
    const std::string call =
        R"({"api":"Volume","method":"poll","version":1,"task_id":")" + id + "\"}";
    return RunHere("call --state-dir " + stateDir, call).out;
  }
};

TEST_F(DrctlFailureTest, OutputThatCannotBeWrittenFails) {
  ASSERT_EQ(RunHere("node add a --address b --port 1").status, 0);
  const Outcome outcome = RunHere("node list >/dev/full");
  EXPECT_EQ(outcome.status, 1);
  EXPECT_EQ(outcome.err, "drctl: cannot write to standard output\n");
}

TEST_F(DrctlFailureTest, AnExportThatCannotBeWrittenSaysWhy) {
  ASSERT_EQ(RunHere("node add a --address b --port 1").status, 0);
  const Outcome outcome = RunHere("export no/such/dir.json");
  EXPECT_EQ(outcome.status, 1);
  EXPECT_EQ(outcome.err,
            "drctl: cannot write 'no/such/dir.json': No such file or directory (ERR_UNKNOWN)\n");
}

TEST_F(DrctlFailureTest, AFailedImportLeavesTheRegistryAsItWas) {
  ASSERT_EQ(RunHere("node add a --address b --port 1").status, 0);
  ASSERT_EQ(RunHere("export good.json").status, 0);
  ASSERT_EQ(
      RunProgram(dir, {DRCTL, "--db", Path("registry.db"), "node", "set", "a", "--state", "x"})
          .status,
      0);
  const std::string before = RunHere("node list --json").out;
  // SQLite refuses the journal of a change.
  ASSERT_EQ(mkdir(Path("registry.db-journal").c_str(), 0700), 0);
  EXPECT_EQ(RunHere("import good.json").status, 1);
  ASSERT_EQ(rmdir(Path("registry.db-journal").c_str()), 0);
  EXPECT_EQ(RunHere("node list --json").out, before);
}

// The task's process holds a lock whose name is that of the state file.
TEST_F(DrctlFailureTest, ATaskRunsOnWhereverItIsPolledFrom) {
  if (!CanMakeLocks()) GTEST_SKIP() << kNeedsLocks;
  const std::string id = "00000000-0000-4000-8000-000000000000";
  ASSERT_EQ(mkdir(Path("tasks").c_str(), 0700), 0);
  WriteText(Path("tasks/" + id + ".json"), R"({"finish":false,"success":false})");
  FileLock life(Path("tasks/" + id + ".json"));
  ASSERT_TRUE(life.lock(LOCK_EX | LOCK_NB, 0));
  for (const char* const state : {"tasks", "./tasks", "tasks/../tasks"}) {
    const Response reply = Poll(state, id);
    EXPECT_TRUE(reply.isSuccess()) << state;
    EXPECT_FALSE(reply.isPollFinish()) << state;
  }
}

// Runs `body` where nobody can make a lock; false when this process may not prepare that.
bool RunWithoutLocks(const std::function<void()>& body) {
  return RunWithOwnMounts([&] {
    mkdir(kLockDir, 0755);
    ASSERT_EQ(mount("none", kLockDir, "tmpfs", MS_RDONLY, nullptr), 0);
    body();
  });
}

TEST_F(DrctlFailureTest, WhoCanTakeNoLockStillSeesTheMounts) {
  const bool isAllowed = RunWithoutLocks([&] {
    const Outcome outcome = RunHere("--verbose volume list --cached --cache-dir cache");
    EXPECT_EQ(outcome.status, 0);
    EXPECT_NE(outcome.out.find(" tmpfs "), std::string::npos) << outcome.out;
    EXPECT_NE(outcome.err.find("answered from a fresh scan"), std::string::npos) << outcome.err;
  });
  if (!isAllowed) GTEST_SKIP() << "needs the right to mount";
}

TEST_F(DrctlFailureTest, AScanWithoutALockTellsTheReason) {
  const bool isAllowed = RunWithoutLocks([&] {
    const Outcome outcome = RunHere("call", R"({"api":"Volume","method":"scan","version":1})");
    EXPECT_NE(outcome.out.find("the scan is not started: the lock of the task cannot be taken"),
              std::string::npos)
        << outcome.out;
  });
  if (!isAllowed) GTEST_SKIP() << "needs the right to mount";
}

TEST_F(DrctlFailureTest, TheLockOfAForgottenTaskIsRemoved) {
  if (!CanMakeLocks()) GTEST_SKIP() << kNeedsLocks;
  const std::string state = Path("tasks/00000000-0000-4000-8000-000000000000.json");
  ASSERT_EQ(mkdir(Path("tasks").c_str(), 0700), 0);
  WriteText(state, R"({"finish":false,"success":false})");
  const timespec longAgo[2] = {{1000, 0}, {1000, 0}};
  ASSERT_EQ(utimensat(AT_FDCWD, state.c_str(), longAgo, 0), 0);
  const std::string lock = FileLock::getLockFilePath(state);
  ASSERT_TRUE(FileLock(state).tryLock(LOCK_EX | LOCK_NB));
  ASSERT_EQ(access(lock.c_str(), F_OK), 0);
  const Outcome started =
      RunHere("call --state-dir tasks", R"({"api":"Volume","method":"scan","version":1})");
  const std::string id = Response(started.out).getTaskId();
  EXPECT_NE(access(lock.c_str(), F_OK), 0);
  EXPECT_NE(access(state.c_str(), F_OK), 0);
  while (!Poll("tasks", id).isPollFinish()) {
  }
}

}  // namespace
