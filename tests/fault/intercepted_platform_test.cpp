// Calls of the platform's stand-ins that fail where nothing else does.

#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <functional>
#include <set>

#include "fault/interception.h"
#include "kelocore.h"
#include "kelorandom.h"
#include "support/clean_test.h"
#include "support/process.h"

namespace {

using Fault::Interception;

int Exec(const char* program) { return KLIBCExec(program, nullptr, nullptr, nullptr, nullptr); }

// Runs `body` in a child that has nothing open but these streams.
void RunWithStreams(const std::set<int>& streams, const std::function<void()>& body) {
  EXPECT_EQ(RunInChild([&] {
              for (const int fd : OpenDescriptors()) {
                if (streams.count(fd) == 0) close(fd);
              }
              body();
              EXPECT_EQ(OpenDescriptors(), streams);
            }),
            0);
}

using InterceptedProgramTest = CleanTest;

// /dev/null and both ends of the pipe come on numbers of standard streams, and are to be moved.
TEST_F(InterceptedProgramTest, FailsWhereAPipeCannotBeMovedAboveTheStreams) {
  for (const int number : {1, 2, 3}) {
    RunWithStreams({}, [number] {
      const Interception noDescriptor("fcntl", number, EMFILE);
      errno = 0;
      EXPECT_EQ(Exec("/bin/true"), -1);
      EXPECT_EQ(errno, EMFILE);
      EXPECT_TRUE(noDescriptor.HasRun());
    });
  }
}

// The end that the supervisor reports through has the number that it would be moved to: another
// thread has just given that back.
TEST_F(InterceptedProgramTest, RunsWhereThePipeIsInPlaceAlready) {
  RunWithStreams({STDIN_FILENO, STDOUT_FILENO}, [] {
    const int first = fcntl(STDIN_FILENO, F_DUPFD_CLOEXEC, STDERR_FILENO + 1);
    const Interception otherThread("pipe2", 1, [first] {
      close(first);
      return Fault::kGoOn;
    });
    EXPECT_EQ(Exec("/bin/true"), 0);
    EXPECT_TRUE(otherThread.HasRun());
    EXPECT_EQ(Exec("/bin/false"), -1);
  });
}

TEST_F(InterceptedProgramTest, TellsWhyAStreamCannotBePutInPlace) {
  for (const char* const call : {"dup2", "dup3"}) {
    const Interception failure(call, 1, EBADF);
    errno = 0;
    EXPECT_EQ(KLIBCExec("/bin/touch", Path("run").c_str(), nullptr, nullptr, nullptr), -1);
    EXPECT_EQ(errno, EBADF) << call;
    EXPECT_TRUE(NamesIn(dir).empty()) << "the program was run";
  }
}

TEST_F(InterceptedProgramTest, FailsWithoutAProcess) {
  const Interception exec("fork", 1, EAGAIN);
  errno = 0;
  EXPECT_EQ(Exec("/bin/true"), -1);
  EXPECT_EQ(errno, EAGAIN);
  const Interception popen("fork", 1, EAGAIN);
  errno = 0;
  EXPECT_EQ(KLIBCPopen("/bin/true", "r", nullptr), nullptr);
  EXPECT_EQ(errno, EAGAIN);
}

// No handler of the caller's runs in the process that starts the program.
TEST_F(InterceptedProgramTest, BlocksEverySignalMeanwhile) {
  const Interception look("dup2", 1, [] {
    sigset_t mask;
    sigemptyset(&mask);
    pthread_sigmask(SIG_BLOCK, nullptr, &mask);
    for (const int number : {SIGHUP, SIGTERM, SIGUSR1, SIGCHLD, SIGRTMAX}) {
      if (sigismember(&mask, number) != 1) return EINVAL;
    }
    return Fault::kGoOn;
  });
  EXPECT_EQ(Exec("/bin/true"), 0);
}

// The process that starts the program is killed before it tells anything.
TEST_F(InterceptedProgramTest, FailsWhereNobodyTellsOfTheStart) {
  const Interception death("dup2", 1, []() -> int { _exit(0); });
  errno = 0;
  EXPECT_EQ(Exec("/bin/true"), -1);
  EXPECT_EQ(errno, ECHILD);
}

// A program that another thread starts just then inherits nothing.
TEST_F(InterceptedProgramTest, ClosesAllThatIsOpenedOnExec) {
  const std::set<int> before = OpenDescriptors();
  int opened = 0;
  const auto look = [&] {
    for (const int fd : OpenDescriptors()) {
      if (before.count(fd) > 0) continue;
      EXPECT_EQ(fcntl(fd, F_GETFD), FD_CLOEXEC) << fd;
      ++opened;
    }
    return Fault::kGoOn;
  };
  const Interception pidFile("fchmod", 1, look);
  EXPECT_EQ(KLIBCProcPidFileCreate(Path("pid").c_str()), 0);
  const Interception program("fork", 1, look);
  EXPECT_EQ(Exec("/bin/true"), 0);
  EXPECT_EQ(opened, 4) << "the pid file, /dev/null and a pipe";
}

using InterceptedPidFileTest = CleanTest;

TEST_F(InterceptedPidFileTest, LeavesNothingWhereItCannotBeWritten) {
  const Interception failure("fchmod", 1, EIO);
  errno = 0;
  EXPECT_EQ(KLIBCProcPidFileCreate(Path("pid").c_str()), -1);
  EXPECT_EQ(errno, EIO);
  EXPECT_TRUE(NamesIn(dir).empty());
}

using InterceptedForkTest = CleanTest;

// The process in between, which is killed before it tells anything.
TEST_F(InterceptedForkTest, FailsWhereNobodyTellsOfADetachedChild) {
  const Interception death("fork", 2, []() -> int { _exit(0); });
  errno = 0;
  EXPECT_EQ(KLIBCProcForkEx(1), -1);
  EXPECT_EQ(errno, ECHILD);
}

TEST_F(InterceptedForkTest, FailsWithoutAProcess) {
  for (const int flags : {0, 1, 64, 65}) {
    const Interception noProcess("fork", 1, EAGAIN);
    errno = 0;
    EXPECT_EQ(KLIBCProcForkEx(flags), -1) << flags;
    EXPECT_EQ(errno, EAGAIN);
  }
}

TEST_F(InterceptedForkTest, FailsWithoutDescriptors) {
  const Interception noPipe("pipe2", 1, EMFILE);
  const Interception noStream("open", 1, EMFILE);
  for (const int flags : {1, 64}) {
    errno = 0;
    EXPECT_EQ(KLIBCProcForkEx(flags), -1) << flags;
    EXPECT_EQ(errno, EMFILE);
  }
}

TEST_F(InterceptedForkTest, OpensNothingForAChildThatKeepsItsStreams) {
  const Interception noDescriptor("open", 1, EMFILE);
  const pid_t pid = KLIBCProcForkEx(0);
  if (pid == 0) _exit(0);
  EXPECT_EQ(waitpid(pid, nullptr, 0), pid);
  EXPECT_FALSE(noDescriptor.HasRun());
}

constexpr int kAborted = 3;

using InterceptedRandomTest = CleanTest;

TEST_F(InterceptedRandomTest, AnInterruptedDrawIsMadeAgain) {
  const Interception signal("getrandom", 1, EINTR);
  const unsigned int drawn = KELO::RANDOM::KELORandom().urandom(5, 6);
  EXPECT_TRUE(drawn == 5 || drawn == 6) << drawn;
  EXPECT_TRUE(signal.HasRun());
}

// No number would be honest.
TEST_F(InterceptedRandomTest, AKernelWithoutTheCallEndsTheProcess) {
  const int status = RunInChild([] {
    Handle(
        SIGABRT, [](int /*number*/) { _exit(kAborted); }, 0);
    const Interception missing("getrandom", 1, ENOSYS);
    KELO::RANDOM::KELORandom().urandom(5, 6);
  });
  ASSERT_TRUE(WIFEXITED(status));
  EXPECT_EQ(WEXITSTATUS(status), kAborted);
}

}  // namespace
