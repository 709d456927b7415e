// The stand-ins for the platform's libraries: forking. Everything that changes signals, limits or
// ids happens in a child of the test.

#include <fcntl.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <functional>
#include <set>
#include <string>

#include "kelocore.h"
#include "support/clean_test.h"
#include "support/process.h"

namespace {

// A pipe between a test and the processes that it forks.
class Channel {
 public:
  Channel() {
    if (pipe2(ends, O_CLOEXEC) != 0) abort();
  }
  ~Channel() {
    CloseReader();
    CloseWriter();
  }
  Channel(const Channel&) = delete;
  Channel& operator=(const Channel&) = delete;

  void CloseReader() { Close(0); }
  void CloseWriter() { Close(1); }
  int Writer() const { return ends[1]; }
  void Send(int number) const {
    if (write(ends[1], &number, sizeof number) != ssize_t(sizeof number)) _exit(98);
  }
  // -1 at the end.
  int Receive() const {
    int number = -1;
    return read(ends[0], &number, sizeof number) == ssize_t(sizeof number) ? number : -1;
  }

 private:
  void Close(int end) {
    if (ends[end] >= 0) close(ends[end]);
    ends[end] = -1;
  }

  int ends[2];
};

// Orphans come to the test, which reaps them: their parent can be told, and none is left.
class ForkTest : public CleanTest {
 protected:
  void SetUp() override {
    CleanTest::SetUp();
    ASSERT_EQ(prctl(PR_SET_CHILD_SUBREAPER, 1), 0);
  }
  void TearDown() override {
    while (wait(nullptr) > 0) {
    }
    prctl(PR_SET_CHILD_SUBREAPER, 0);
    CleanTest::TearDown();
  }

  // Forks with `flags` and expects the pid of the child, as the child itself tells it.
  void ExpectPidOfChild(int flags) const {
    const pid_t pid = KLIBCProcForkEx(flags);
    if (pid == 0) {
      up.Send(getpid());
      _exit(0);
    }
    EXPECT_GT(pid, 0);
    EXPECT_EQ(up.Receive(), pid);
  }

  Channel up;
};

TEST_F(ForkTest, ForksPlainlyWithoutFlags) {
  const pid_t pid = KLIBCProcForkEx(0);
  if (pid == 0) _exit(7);
  int status = -1;
  ASSERT_EQ(waitpid(pid, &status, 0), pid);
  EXPECT_EQ(WEXITSTATUS(status), 7);
}

TEST_F(ForkTest, GivesThePidOfTheDetachedChild) { ExpectPidOfChild(1); }

TEST_F(ForkTest, LeavesTheDetachedChildToAnotherParentAtOnce) {
  Channel down;
  EXPECT_EQ(RunInChild([&] {
              if (KLIBCProcForkEx(1) == 0) {
                down.Receive();
                up.Send(getppid());
                _exit(0);
              }
              EXPECT_EQ(wait(nullptr), -1);
              EXPECT_EQ(errno, ECHILD);
              down.Send(0);
              EXPECT_EQ(up.Receive(), getppid());
            }),
            0);
}

TEST_F(ForkTest, DetachesWhereSigchldIsIgnored) {
  EXPECT_EQ(RunInChild([&] {
              Handle(SIGCHLD, SIG_IGN, 0);
              ExpectPidOfChild(65);
              EXPECT_EQ(Disposition(SIGCHLD).sa_handler, SIG_IGN);
            }),
            0);
}

TEST_F(ForkTest, DetachesWhereAHandlerReapsEverything) {
  EXPECT_EQ(RunInChild([&] {
              Handle(SIGCHLD, ReapEverything, SA_RESTART);
              ExpectPidOfChild(1);
            }),
            0);
}

std::string LinkOf(int fd) {
  char target[200];
  const ssize_t length =
      readlink(("/proc/self/fd/" + std::to_string(fd)).c_str(), target, sizeof target);
  return length < 0 ? "" : std::string(target, static_cast<size_t>(length));
}

// What a child of the flags finds: a bit for each thing that is as after flag 64.
int SessionSigns() {
  int signs = getsid(0) == getpid() ? 1 : 0;
  for (const int fd : {0, 1, 2}) {
    const bool open = LinkOf(fd) == "/dev/null" && (fcntl(fd, F_GETFD) & FD_CLOEXEC) == 0 &&
                      (fcntl(fd, F_GETFL) & O_ACCMODE) == O_RDWR;
    if (open) signs |= 2 << fd;
  }
  return signs;
}

TEST_F(ForkTest, GivesTheChildASessionAndNullStreams) {
  for (const int flags : {64, 65}) {
    if (KLIBCProcForkEx(flags) == 0) {
      up.Send(SessionSigns());
      _exit(0);
    }
    EXPECT_EQ(up.Receive(), 15) << flags;
  }
}

TEST_F(ForkTest, GivesTheChildNullStreamsWhereTheCallerHasNone) {
  EXPECT_EQ(RunInChild([&] {
              for (const int standard : {0, 1, 2}) close(standard);
              if (KLIBCProcForkEx(65) == 0) {
                up.Send(SessionSigns());
                _exit(0);
              }
              EXPECT_EQ(up.Receive(), 15);
            }),
            0);
}

TEST_F(ForkTest, KeepsSessionAndStreamsOtherwise) {
  const pid_t session = getsid(0);
  const std::string output = LinkOf(1);
  for (const int flags : {0, 1}) {
    if (KLIBCProcForkEx(flags) == 0) {
      up.Send(getsid(0) == session && LinkOf(1) == output ? 1 : 0);
      _exit(0);
    }
    EXPECT_EQ(up.Receive(), 1) << flags;
  }
}

TEST_F(ForkTest, LeaksNoDescriptorToEitherSideAndKeepsAllButTheStreams) {
  const std::set<int> before = OpenDescriptors();
  const std::string first = LinkOf(3);
  ASSERT_NE(first, "") << "up is open";
  for (const int flags : {0, 1, 64, 65}) {
    if (KLIBCProcForkEx(flags) == 0) {
      up.Send(OpenDescriptors() == before && LinkOf(3) == first ? 1 : 0);
      _exit(0);
    }
    EXPECT_EQ(up.Receive(), 1) << flags;
    EXPECT_EQ(OpenDescriptors(), before) << flags;
  }
}

TEST_F(ForkTest, KeepsTheSignalMaskOnBothSides) {
  sigset_t mask;
  for (const int flags : {0, 1, 64, 65}) {
    const pid_t pid = KLIBCProcForkEx(flags);
    pthread_sigmask(SIG_SETMASK, nullptr, &mask);
    if (pid == 0) {
      up.Send(sigismember(&mask, SIGTERM));
      _exit(0);
    }
    EXPECT_EQ(sigismember(&mask, SIGTERM), 0);
    EXPECT_EQ(up.Receive(), 0) << flags;
  }
}

// A web server reads a handler's output to its end; the refresher that the handler left behind
// must not hold it open.
TEST_F(ForkTest, DoesNotHoldTheOutputOfTheCallerOpen) {
  Channel output;
  Channel down;
  const pid_t handler = StartChild([&] {
    dup2(output.Writer(), STDOUT_FILENO);
    output.CloseWriter();
    down.CloseWriter();
    if (KLIBCProcForkEx(65) == 0) {
      down.Receive();
      up.Send(1);
    }
    return 0;
  });
  output.CloseWriter();
  EXPECT_EQ(output.Receive(), -1);
  EXPECT_EQ(JoinChild(handler), 0);
  EXPECT_EQ(wait4(-1, nullptr, WNOHANG, nullptr), 0) << "the detached child is to be running still";
  down.CloseWriter();
  EXPECT_EQ(up.Receive(), 1);
}

// Runs `body` as a user that may have `processes` processes, the calling one included.
int RunWithProcessLimit(rlim_t processes, const std::function<void()>& body) {
  const uid_t uid = PrivateUid();
  return RunInChild([&] {
    const rlimit limit{processes, processes};
    ASSERT_EQ(setrlimit(RLIMIT_NPROC, &limit), 0);
    ASSERT_EQ(setuid(uid), 0);
    ASSERT_EQ(prctl(PR_SET_DUMPABLE, 1), 0);  // lets the process look at its own descriptors
    body();
  });
}

TEST_F(ForkTest, FailsWithErrnoWhenTheFirstForkFails) {
  if (!IsRoot()) GTEST_SKIP() << "needs root";
  EXPECT_EQ(RunWithProcessLimit(1,
                                [] {
                                  const std::set<int> before = OpenDescriptors();
                                  for (const int flags : {0, 1, 64, 65}) {
                                    errno = 0;
                                    EXPECT_LT(KLIBCProcForkEx(flags), 0) << flags;
                                    EXPECT_EQ(errno, EAGAIN) << flags;
                                  }
                                  EXPECT_EQ(OpenDescriptors(), before);
                                }),
            0);
}

TEST_F(ForkTest, FailsWithErrnoWhenTheSecondForkFails) {
  if (!IsRoot()) GTEST_SKIP() << "needs root";
  EXPECT_EQ(RunWithProcessLimit(2,
                                [] {
                                  const std::set<int> before = OpenDescriptors();
                                  for (const int flags : {1, 65}) {
                                    errno = 0;
                                    EXPECT_LT(KLIBCProcForkEx(flags), 0) << flags;
                                    EXPECT_EQ(errno, EAGAIN) << flags;
                                  }
                                  EXPECT_EQ(OpenDescriptors(), before);
                                  EXPECT_EQ(wait(nullptr), -1) << "a child was left";
                                }),
            0);
}

TEST_F(ForkTest, FailsWithErrnoWithoutFreeDescriptors) {
  EXPECT_EQ(RunInChild([] {
              LeaveNoDescriptors();
              for (const int flags : {1, 64, 65}) {
                EXPECT_LT(KLIBCProcForkEx(flags), 0) << flags;
                EXPECT_EQ(errno, EMFILE) << flags;
              }
            }),
            0);
}

}  // namespace
