// The stand-ins for the platform's libraries: running programs. Everything that changes signals,
// limits or ids happens in a child of the test.

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/time.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <csignal>
#include <cstdio>
#include <set>
#include <string>
#include <thread>
#include <vector>

#include "kelocore.h"
#include "support/clean_test.h"
#include "support/process.h"

namespace {

int Shell(const std::string& script, const char* a1 = nullptr, const char* a2 = nullptr) {
  return KLIBCExec("/bin/sh", "-c", script.c_str(), a1, a2);
}

std::atomic<int> signalCount{0};
void Count(int /*signalNumber*/) { ++signalCount; }

// Interrupts every blocking call of this process, over and over.
void StartSignalStorm() {
  Handle(SIGALRM, Count, 0);
  const itimerval every{{0, 500}, {0, 500}};
  setitimer(ITIMER_REAL, &every, nullptr);
}

using ExecTest = CleanTest;

TEST_F(ExecTest, GivesZeroForExitStatusZeroOnly) {
  EXPECT_EQ(Shell("exit 0"), 0);
  EXPECT_NE(Shell("exit 1"), 0);
  EXPECT_NE(Shell("exit 255"), 0);
  EXPECT_NE(Shell("kill -KILL $$"), 0);
}

TEST_F(ExecTest, FailsWithErrnoForAProgramThatCannotBeStarted) {
  EXPECT_NE(KLIBCExec(Path("no").c_str(), nullptr, nullptr, nullptr, nullptr), 0);
  EXPECT_EQ(errno, ENOENT);
  WriteText(Path("text"), "exit 0\n");
  EXPECT_NE(KLIBCExec(Path("text").c_str(), nullptr, nullptr, nullptr, nullptr), 0);
  EXPECT_EQ(errno, EACCES);
}

TEST_F(ExecTest, FailsWithErrnoWithoutFreeDescriptors) {
  EXPECT_EQ(RunInChild([] {
              LeaveNoDescriptors();
              EXPECT_NE(Shell("exit 0"), 0);
              EXPECT_EQ(errno, EMFILE);
            }),
            0);
}

TEST_F(ExecTest, GivesEachArgumentToTheProgramAsItIs) {
  const std::string file = Path("$HOME `x` \"*\" ; exit 3");
  EXPECT_EQ(KLIBCExec("/bin/mkdir", "-p", file.c_str(), "-m", "700"), 0);
  EXPECT_EQ(NamesIn(dir), std::vector<std::string>{"$HOME `x` \"*\" ; exit 3"});
}

TEST_F(ExecTest, EndsTheArgumentsAtTheFirstNull) {
  EXPECT_EQ(Shell("test $# = 0"), 0);
  EXPECT_EQ(Shell("test $# = 0", "name"), 0);
  EXPECT_EQ(Shell("test $# = 1 && test -z \"$1\"", "name", ""), 0);
  EXPECT_EQ(Shell("test $# = 0", nullptr, "unseen"), 0);
}

TEST_F(ExecTest, LearnsTheStatusWhereSigchldIsIgnored) {
  EXPECT_EQ(RunInChild([] {
              Handle(SIGCHLD, SIG_IGN, 0);
              EXPECT_EQ(Shell("exit 0"), 0);
              EXPECT_NE(Shell("exit 3"), 0);
              EXPECT_EQ(Disposition(SIGCHLD).sa_handler, SIG_IGN);
            }),
            0);
}

TEST_F(ExecTest, LearnsTheStatusWhereChildrenAreNotKept) {
  EXPECT_EQ(RunInChild([] {
              Handle(SIGCHLD, Count, SA_NOCLDWAIT);
              EXPECT_EQ(Shell("exit 0"), 0);
              EXPECT_NE(Shell("exit 3"), 0);
              EXPECT_EQ(Disposition(SIGCHLD).sa_handler, Count);
              EXPECT_NE(Disposition(SIGCHLD).sa_flags & SA_NOCLDWAIT, 0);
            }),
            0);
}

TEST_F(ExecTest, LearnsTheStatusWhereAHandlerReapsEverything) {
  EXPECT_EQ(RunInChild([] {
              Handle(SIGCHLD, ReapEverything, SA_RESTART);
              for (int i = 0; i < 20; ++i) {
                EXPECT_EQ(Shell("exit 0"), 0);
                EXPECT_NE(Shell("exit 3"), 0);
              }
            }),
            0);
}

// The program kills another child of the caller and sees it go, which a zombie does not.
TEST_F(ExecTest, LeavesOtherChildrenToTheKernelWhereSigchldIsIgnored) {
  EXPECT_EQ(RunInChild([] {
              Handle(SIGCHLD, SIG_IGN, 0);
              const pid_t other = StartChild(pause);
              EXPECT_EQ(Shell("kill -KILL $0; for i in $(seq 1000); do kill -0 $0 2>/dev/null || "
                              "exit 0; sleep 0.01; done; exit 1",
                              std::to_string(other).c_str()),
                        0);
            }),
            0);
}

TEST_F(ExecTest, LeavesOtherChildrenToTheCaller) {
  const pid_t other = StartChild([] { return 7; });
  EXPECT_EQ(Shell("exit 0"), 0);
  EXPECT_EQ(JoinChild(other), W_EXITCODE(7, 0));
}

TEST_F(ExecTest, WaitsThroughAStormOfSignals) {
  EXPECT_EQ(RunInChild([&] {
              StartSignalStorm();
              EXPECT_EQ(Shell("sleep 0.2; echo > \"$0\"", Path("done").c_str()), 0);
              EXPECT_EQ(KLIBCFileExist(Path("done").c_str()), 1);
              EXPECT_GT(signalCount, 0);
            }),
            0);
}

int handlerReport = -1;

void ReportOwnPid(int /*signalNumber*/) {
  const pid_t pid = getpid();
  if (write(handlerReport, &pid, sizeof pid) != ssize_t(sizeof pid)) _exit(98);
}

TEST_F(ExecTest, RunsTheCallersHandlersInTheCallerOnly) {
  EXPECT_EQ(RunInChild([&] {
              ASSERT_EQ(setpgid(0, 0), 0);
              handlerReport = open(Path("pids").c_str(), O_WRONLY | O_CREAT | O_APPEND, 0600);
              Handle(SIGUSR1, ReportOwnPid, SA_RESTART);
              EXPECT_EQ(Shell("trap '' USR1; kill -USR1 0"), 0);
              const pid_t self = getpid();
              EXPECT_EQ(ReadText(Path("pids")),
                        std::string(reinterpret_cast<const char*>(&self), sizeof self));
            }),
            0);
}

TEST_F(ExecTest, LeavesTheSignalMaskOfTheCaller) {
  EXPECT_EQ(RunInChild([] {
              sigset_t mask;
              sigemptyset(&mask);
              sigaddset(&mask, SIGTERM);
              sigprocmask(SIG_SETMASK, &mask, nullptr);
              EXPECT_EQ(Shell("exit 0"), 0);
              sigprocmask(SIG_SETMASK, nullptr, &mask);
              EXPECT_EQ(sigismember(&mask, SIGTERM), 1);
              EXPECT_EQ(sigismember(&mask, SIGCHLD), 0);
            }),
            0);
}

// One of the signal sets, a hexadecimal number, in a copy of /proc/self/status.
unsigned long long SignalSet(const std::string& file, const std::string& name) {
  const std::string text = ReadText(file);
  return std::stoull(text.substr(text.find(name + ":") + name.size() + 1), nullptr, 16);
}

TEST_F(ExecTest, GivesTheProgramDefaultSignals) {
  const std::string file = Path("status");
  EXPECT_EQ(RunInChild([&] {
              for (int number = 1; number < SIGRTMIN; ++number) Handle(number, SIG_IGN, 0);
              sigset_t all;
              sigfillset(&all);
              sigprocmask(SIG_SETMASK, &all, nullptr);
              EXPECT_EQ(KLIBCExec("/bin/cp", "/proc/self/status", file.c_str(), nullptr, nullptr),
                        0);
            }),
            0);
  EXPECT_EQ(SignalSet(file, "SigBlk"), 0U);
  // The C library keeps two signals below the real-time ones, 32 and 33, to itself.
  EXPECT_EQ(SignalSet(file, "SigIgn") & 0x7FFFFFFF, 0U);
}

TEST_F(ExecTest, LeaksNoDescriptor) {
  const std::string file = Path("list");
  const int low = open(file.c_str(), O_RDONLY | O_CREAT, 0600);
  const int high = fcntl(low, F_DUPFD, 200);
  EXPECT_EQ(Shell("exec ls /proc/self/fd > \"$0\"", file.c_str()), 0);
  close(low);
  close(high);
  EXPECT_EQ(ReadText(file), "0\n1\n2\n3\n");  // 3 is the directory that ls reads
}

// A caller's data file may have the number of a standard stream.
TEST_F(ExecTest, PutsTheStandardStreamsOnDevNull) {
  const std::string file = Path("text");
  WriteText(file, "data");
  EXPECT_EQ(RunInChild([&] {
              const int fd = open(file.c_str(), O_RDWR | O_APPEND);
              for (const int standard : {0, 1, 2}) dup2(fd, standard);
              EXPECT_EQ(Shell("read x && exit 1; echo out; echo err >&2"), 0);
            }),
            0);
  EXPECT_EQ(ReadText(file), "data");
}

// The shell adds three variables of its own.
constexpr char kTellsEnvironment[] =
    "test \"$(env | grep -v -e ^PWD= -e ^SHLVL= -e ^_= | sort | xargs)\" = "
    "'LC_ALL=C PATH=/usr/sbin:/usr/bin:/sbin:/bin'";

TEST_F(ExecTest, GivesTheProgramAFixedEnvironment) {
  EXPECT_EQ(RunInChild([] {
              setenv("POSIXLY_CORRECT", "1", 1);
              setenv("PATH", "/nowhere", 1);
              EXPECT_EQ(Shell(kTellsEnvironment), 0);
              clearenv();
              EXPECT_EQ(Shell(kTellsEnvironment), 0);
            }),
            0);
}

TEST_F(ExecTest, WorksWithoutStandardStreams) {
  EXPECT_EQ(RunInChild([] {
              for (const int standard : {0, 1, 2}) close(standard);
              EXPECT_EQ(Shell("exit 0"), 0);
              EXPECT_NE(Shell("exit 3"), 0);
            }),
            0);
}

TEST_F(ExecTest, StaysRootWhereTheCallerIsRootOnlyEffectively) {
  if (!IsRoot()) GTEST_SKIP() << "needs root";
  const std::string made = Path("a/b");
  EXPECT_EQ(RunInChild([&] {
              ASSERT_EQ(setresuid(PrivateUid(), 0, 0), 0);
              EXPECT_EQ(KLIBCExec("/bin/mkdir", "-p", made.c_str(), "-m", "0711"), 0);
            }),
            0);
  struct stat info {};
  ASSERT_EQ(stat(made.c_str(), &info), 0);
  EXPECT_EQ(info.st_uid, 0U);
  EXPECT_EQ(info.st_mode & 07777, 0711U);
}

std::string ReadAll(FILE* stream) {
  std::string text;
  for (int c = fgetc(stream); c != EOF; c = fgetc(stream)) text += static_cast<char>(c);
  return text;
}

using PopenTest = CleanTest;

FILE* PopenShell(const char* mode, const char* script) {
  return KLIBCPopen("/bin/sh", mode, "-c", script, nullptr);
}

TEST_F(PopenTest, ReadsTheOutputAndGivesTheWaitStatus) {
  FILE* stream = KLIBCPopen("/bin/sh", "r", "-c", "printf '%s.' \"$@\"; exit 3", "0", "a b", "",
                            "*", "4", "5", "6", nullptr);
  ASSERT_NE(stream, nullptr);
  EXPECT_EQ(ReadAll(stream), "a b..*.4.5.6.");
  const int status = KLIBCPclose(stream);
  EXPECT_TRUE(WIFEXITED(status));
  EXPECT_EQ(WEXITSTATUS(status), 3);
}

TEST_F(PopenTest, RunsAProgramWithoutArguments) {
  FILE* stream = KLIBCPopen("/bin/pwd", "r", nullptr);
  ASSERT_NE(stream, nullptr);
  EXPECT_EQ(ReadAll(stream).front(), '/');
  EXPECT_EQ(KLIBCPclose(stream), 0);
}

TEST_F(PopenTest, GivesTheProgramAFixedEnvironment) {
  EXPECT_EQ(RunInChild([] {
              setenv("POSIXLY_CORRECT", "1", 1);
              FILE* stream = PopenShell("r", kTellsEnvironment);
              ASSERT_NE(stream, nullptr);
              EXPECT_EQ(KLIBCPclose(stream), 0);
            }),
            0);
}

TEST_F(PopenTest, WritesTheInput) {
  const std::string file = Path("copy");
  FILE* stream = KLIBCPopen("/bin/sh", "w", "-c", "cat > \"$0\"", file.c_str(), nullptr);
  ASSERT_NE(stream, nullptr);
  EXPECT_GE(fputs("text", stream), 0);
  EXPECT_EQ(KLIBCPclose(stream), 0);
  EXPECT_EQ(ReadText(file), "text");
}

TEST_F(PopenTest, IsNullForAProgramThatCannotBeStarted) {
  EXPECT_EQ(KLIBCPopen(Path("no").c_str(), "r", nullptr), nullptr);
  EXPECT_EQ(errno, ENOENT);
  WriteText(Path("text"), "exit 0\n");
  EXPECT_EQ(KLIBCPopen(Path("text").c_str(), "w", nullptr), nullptr);
  EXPECT_EQ(errno, EACCES);
}

// The program kills the process that would tell its status.
TEST_F(PopenTest, FailsWithErrnoWhereNobodyCanTellTheStatus) {
  FILE* const stream = KLIBCPopen("/bin/sh", "w", "-c", "read line; kill -KILL $PPID", nullptr);
  ASSERT_NE(stream, nullptr);
  fputs("now\n", stream);
  errno = 0;
  EXPECT_EQ(KLIBCPclose(stream), -1);
  EXPECT_EQ(errno, ECHILD);
}

TEST_F(PopenTest, IsNullForAnotherMode) {
  for (const char* mode : {"", "x", "rw"}) {
    EXPECT_EQ(KLIBCPopen("/bin/true", mode, nullptr), nullptr) << mode;
    EXPECT_EQ(errno, EINVAL);
  }
}

TEST_F(PopenTest, IsNullWithoutFreeDescriptors) {
  EXPECT_EQ(RunInChild([] {
              LeaveNoDescriptors();
              EXPECT_EQ(KLIBCPopen("/bin/true", "r", nullptr), nullptr);
              EXPECT_EQ(errno, EMFILE);
            }),
            0);
}

TEST_F(PopenTest, GivesTheStatusWhereSigchldIsIgnored) {
  EXPECT_EQ(RunInChild([] {
              Handle(SIGCHLD, SIG_IGN, 0);
              FILE* stream = PopenShell("r", "echo x; exit 3");
              ASSERT_NE(stream, nullptr);
              EXPECT_EQ(ReadAll(stream), "x\n");
              EXPECT_EQ(WEXITSTATUS(KLIBCPclose(stream)), 3);
              EXPECT_EQ(Disposition(SIGCHLD).sa_handler, SIG_IGN);
            }),
            0);
}

TEST_F(PopenTest, ClosesThroughAStormOfSignals) {
  EXPECT_EQ(RunInChild([] {
              StartSignalStorm();
              FILE* stream = PopenShell("w", "sleep 0.2; exit 3");
              ASSERT_NE(stream, nullptr);
              EXPECT_EQ(WEXITSTATUS(KLIBCPclose(stream)), 3);
              EXPECT_GT(signalCount, 0);
            }),
            0);
}

TEST_F(PopenTest, ClosesItsDescriptorsOnExec) {
  const std::set<int> before = OpenDescriptors();
  FILE* stream = PopenShell("w", "cat");
  ASSERT_NE(stream, nullptr);
  for (const int fd : OpenDescriptors()) {
    const bool closes = (fcntl(fd, F_GETFD) & FD_CLOEXEC) != 0;
    EXPECT_TRUE(before.count(fd) == 1 || closes) << fd;
  }
  EXPECT_EQ(KLIBCPclose(stream), 0);
}

TEST_F(PopenTest, LeaksNoDescriptor) {
  const int open = dup(0);
  FILE* stream = KLIBCPopen("/bin/ls", "r", "/proc/self/fd", nullptr);
  close(open);
  ASSERT_NE(stream, nullptr);
  EXPECT_EQ(ReadAll(stream), "0\n1\n2\n3\n");
  EXPECT_EQ(KLIBCPclose(stream), 0);
}

TEST_F(PopenTest, WorksWithoutStandardStreams) {
  EXPECT_EQ(RunInChild([] {
              for (const int standard : {0, 1, 2}) close(standard);
              FILE* stream = PopenShell("r", "echo x");
              ASSERT_NE(stream, nullptr);
              EXPECT_EQ(ReadAll(stream), "x\n");
              EXPECT_EQ(KLIBCPclose(stream), 0);
            }),
            0);
}

// Each program would wait for ever did another hold the writing end of its input.
TEST_F(PopenTest, KeepsSeveralStreamsApart) {
  std::vector<FILE*> streams;
  for (const char* script : {"cat; exit 1", "cat; exit 2", "cat; exit 3"}) {
    streams.push_back(PopenShell("w", script));
    ASSERT_NE(streams.back(), nullptr);
  }
  EXPECT_EQ(WEXITSTATUS(KLIBCPclose(streams[1])), 2);
  EXPECT_EQ(WEXITSTATUS(KLIBCPclose(streams[0])), 1);
  EXPECT_EQ(WEXITSTATUS(KLIBCPclose(streams[2])), 3);
}

TEST_F(PopenTest, ServesSeveralThreadsAtOnce) {
  std::atomic<int> wrong{0};
  std::vector<std::thread> threads;
  for (int number = 1; number <= 4; ++number) {
    threads.emplace_back([number, &wrong] {
      const std::string script = "exit " + std::to_string(number);
      for (int i = 0; i < 20; ++i) {
        FILE* stream = PopenShell("r", script.c_str());
        if (stream == nullptr || WEXITSTATUS(KLIBCPclose(stream)) != number) ++wrong;
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(wrong, 0);
}

TEST_F(PopenTest, EndsWithTheProgramsOutputNotWithTheProgram) {
  const std::string fifo = Path("fifo");
  ASSERT_EQ(mkfifo(fifo.c_str(), 0600), 0);
  FILE* stream =
      KLIBCPopen("/bin/sh", "r", "-c", "echo x; exec >&-; read y < \"$0\"", fifo.c_str(), nullptr);
  ASSERT_NE(stream, nullptr);
  EXPECT_EQ(ReadAll(stream), "x\n");
  WriteText(fifo, "go\n");
  EXPECT_EQ(KLIBCPclose(stream), 0);
}

TEST_F(PopenTest, NobodyElseKeepsTheProgramsInputOpen) {
  EXPECT_EQ(RunInChild([this] {
              Handle(SIGPIPE, SIG_IGN, 0);
              const std::string fifo = Path("fifo");
              ASSERT_EQ(mkfifo(fifo.c_str(), 0600), 0);
              FILE* stream = KLIBCPopen("/bin/sh", "w", "-c", "exec <&-; read y < \"$0\"",
                                        fifo.c_str(), nullptr);
              ASSERT_NE(stream, nullptr);
              while (fputc('x', stream) != EOF && fflush(stream) == 0) {
              }
              EXPECT_EQ(errno, EPIPE);
              WriteText(fifo, "go\n");
              EXPECT_EQ(KLIBCPclose(stream), 0);
            }),
            0);
}

TEST_F(PopenTest, EndsAProgramWhoseOutputNobodyReads) {
  EXPECT_EQ(RunInChild([] {
              Handle(SIGPIPE, SIG_IGN, 0);
              FILE* stream = KLIBCPopen("/usr/bin/yes", "r", nullptr);
              ASSERT_NE(stream, nullptr);
              EXPECT_EQ(fgetc(stream), 'y');
              const int status = KLIBCPclose(stream);
              EXPECT_TRUE(WIFSIGNALED(status));
              EXPECT_EQ(WTERMSIG(status), SIGPIPE);
            }),
            0);
}

TEST_F(PopenTest, RefusesToCloseAStreamOfOthers) {
  FILE* stream = tmpfile();
  ASSERT_NE(stream, nullptr);
  EXPECT_EQ(KLIBCPclose(stream), -1);
  EXPECT_EQ(errno, EINVAL);
  EXPECT_EQ(fclose(stream), 0);
}

}  // namespace
