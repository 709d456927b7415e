// Starting programs and processes; the rest of the platform's core library is in kelocore.cpp.

#include <fcntl.h>
#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdarg>
#include <cstring>
#include <memory>
#include <mutex>
#include <optional>
#include <utility>
#include <vector>

#include "kelocore.h"
#include "posix/descriptor.h"
#include "posix/fork_mutex.h"
#include "posix/pipe.h"
#include "posix/retry.h"

namespace {

namespace Posix = KeloDRCore::Posix;
using Posix::Descriptor;
using Posix::kFirstFreeDescriptor;
using Posix::Retry;

Descriptor OpenNull() {
  return Posix::AboveStandardStreams(
      Descriptor(Retry([] { return open("/dev/null", O_RDWR | O_CLOEXEC); })));
}

// Blocks every signal while it lives, so that no handler of the caller runs in a helper process.
class SignalBlock {
 public:
  SignalBlock() {
    sigset_t all;
    sigfillset(&all);
    pthread_sigmask(SIG_SETMASK, &all, &before);
  }
  ~SignalBlock() { pthread_sigmask(SIG_SETMASK, &before, nullptr); }
  SignalBlock(const SignalBlock&) = delete;
  SignalBlock& operator=(const SignalBlock&) = delete;

 private:
  sigset_t before;
};

// Waits until the child is gone; who takes its status (this call, the kernel where SIGCHLD is
// ignored, or a handler of the caller) does not matter.
void Reap(pid_t child) {
  const int savedErrno = errno;
  Retry([&] { return waitpid(child, nullptr, 0); });
  errno = savedErrno;
}

// A program runs under a supervisor, a fork of the caller that starts it, waits for it and reports
// its wait status through a pipe. A direct child's status is lost where the caller ignores SIGCHLD
// or its handler reaps whatever it finds, and changing the disposition meanwhile would leave the
// caller's other children as zombies.
struct Program {
  pid_t supervisor = -1;
  Descriptor report;
};

// What becomes the standard streams of a program; kKept for those that it shares with the caller.
using Streams = std::array<int, kFirstFreeDescriptor>;
constexpr int kKept = -1;

// The caller's own environment could change what a program does: it may be that of an ordinary
// user who has started a set-id program.
constexpr const char* kEnvironment[] = {"PATH=/usr/sbin:/usr/bin:/sbin:/bin", "LC_ALL=C", nullptr};

// Returns an errno, 0 for a running program. Ids stay as they are: a caller that is root only
// effectively runs the program as such.
int Spawn(const char* program, char* const argv[], pid_t* pid) {
  sigset_t all;
  sigset_t none;
  sigfillset(&all);
  sigemptyset(&none);
  posix_spawnattr_t attributes;
  int error = posix_spawnattr_init(&attributes);
  if (error != 0) return error;
  posix_spawnattr_setsigdefault(&attributes, &all);
  posix_spawnattr_setsigmask(&attributes, &none);
  posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGDEF | POSIX_SPAWN_SETSIGMASK);
  error =
      posix_spawn(pid, program, nullptr, &attributes, argv, const_cast<char* const*>(kEnvironment));
  posix_spawnattr_destroy(&attributes);
  return error;
}

// Leaves the standard streams and, above them, only the report. After a failure nothing may be put
// on the numbers meant: they are still files of the caller's.
bool ArrangeDescriptors(const Streams& streams, int report) {
  for (int target = 0; target < kFirstFreeDescriptor; ++target) {
    const int fd = streams[static_cast<size_t>(target)];
    if (fd != kKept && Retry([&] { return dup2(fd, target); }) < 0) return false;
  }
  if (report != kFirstFreeDescriptor &&
      Retry([&] { return dup3(report, kFirstFreeDescriptor, O_CLOEXEC); }) < 0) {
    return false;
  }
  closefrom(kFirstFreeDescriptor + 1);
  return true;
}

// The supervisor's whole life, with every signal blocked. It lets go of the standard streams once
// the program has them: the end of the program's output must not wait for the supervisor's.
[[noreturn]] void Supervise(const char* program, char* const argv[], const Streams& streams,
                            int report) {
  signal(SIGCHLD, SIG_DFL);
  if (!ArrangeDescriptors(streams, report)) {
    Posix::Send(report, errno);
    _exit(0);
  }
  pid_t pid = -1;
  const int error = Spawn(program, argv, &pid);
  Posix::Send(kFirstFreeDescriptor, error);
  if (error != 0) _exit(0);
  for (int fd = 0; fd < kFirstFreeDescriptor; ++fd) close(fd);
  int status = -1;
  Retry([&] { return waitpid(pid, &status, 0); });
  Posix::Send(kFirstFreeDescriptor, status);
  _exit(0);
}

// False with errno when the program cannot be started; nothing is left of it then.
bool Start(const char* program, char* const argv[], const Streams& streams, Program* started) {
  Posix::Pipe report;
  if (!report.Open()) return false;
  {
    const SignalBlock block;
    started->supervisor = fork();
    if (started->supervisor == 0) Supervise(program, argv, streams, report.writeEnd.Get());
  }
  if (started->supervisor < 0) return false;
  report.writeEnd.Close();
  const int error = Posix::Receive(report.readEnd.Get()).value_or(ECHILD);
  if (error == 0) {
    started->report = std::move(report.readEnd);
    return true;
  }
  Reap(started->supervisor);
  errno = error;
  return false;
}

// The wait status, or -1 with errno when nobody can tell it any more.
int Finish(const Program& program) {
  const std::optional<int> status = Posix::Receive(program.report.Get());
  if (!status) errno = ECHILD;
  Reap(program.supervisor);
  return status.value_or(-1);
}

// The open streams of KLIBCPopen.
struct Running {
  FILE* stream = nullptr;
  Program program;
  std::unique_ptr<Running> next;
};

std::unique_ptr<Running>* const running = new std::unique_ptr<Running>;  // outlives every user

void Remember(std::unique_ptr<Running> entry) {
  const std::lock_guard<std::mutex> guard(Posix::forkMutex);
  entry->next = std::move(*running);
  *running = std::move(entry);
}

std::unique_ptr<Running> Forget(const FILE* stream) {
  const std::lock_guard<std::mutex> guard(Posix::forkMutex);
  std::unique_ptr<Running>* link = running;
  while (*link && (*link)->stream != stream) link = &(*link)->next;
  std::unique_ptr<Running> found = std::move(*link);
  if (found) *link = std::move(found->next);
  return found;
}

FILE* OpenStream(const char* program, const char* mode, char* const argv[]) {
  const bool reading = strcmp(mode, "r") == 0;
  auto entry = std::make_unique<Running>();
  Posix::Pipe pipe;
  if (!pipe.Open()) return nullptr;
  Descriptor& own = reading ? pipe.readEnd : pipe.writeEnd;
  const Descriptor& other = reading ? pipe.writeEnd : pipe.readEnd;
  entry->stream = fdopen(own.Get(), mode);
  if (entry->stream == nullptr) return nullptr;
  own.Release();
  Streams streams{kKept, kKept, kKept};
  streams[reading ? STDOUT_FILENO : STDIN_FILENO] = other.Get();
  if (!Start(program, argv, streams, &entry->program)) {
    const int savedErrno = errno;
    fclose(entry->stream);
    errno = savedErrno;
    return nullptr;
  }
  FILE* const stream = entry->stream;
  Remember(std::move(entry));
  return stream;
}

// Forks twice, so that the child's parent is gone at once. The process in between reports the
// child's pid, or the negative errno of the second fork.
pid_t ForkDetached() {
  Posix::Pipe report;
  if (!report.Open()) return -1;
  const SignalBlock block;
  const pid_t between = fork();
  if (between < 0) return -1;
  if (between == 0) {
    const pid_t child = fork();
    if (child == 0) return 0;
    Posix::Send(report.writeEnd.Get(), child > 0 ? child : -errno);
    _exit(0);
  }
  report.writeEnd.Close();
  const int result = Posix::Receive(report.readEnd.Get()).value_or(-ECHILD);
  Reap(between);
  if (result > 0) return result;
  errno = -result;
  return -1;
}

constexpr int kForkDetached = 1;
constexpr int kForkSession = 64;

}  // namespace

extern "C" {

int KLIBCExec(const char* program, const char* a1, const char* a2, const char* a3, const char* a4) {
  const char* argv[] = {program, a1, a2, a3, a4, nullptr};
  const Descriptor null = OpenNull();
  const Streams streams{null.Get(), null.Get(), null.Get()};
  Program started;
  if (!null.IsOpen() || !Start(program, const_cast<char* const*>(argv), streams, &started)) {
    return -1;
  }
  return Finish(started) == 0 ? 0 : -1;
}

FILE* KLIBCPopen(const char* program, const char* mode, ...) {
  if (strcmp(mode, "r") != 0 && strcmp(mode, "w") != 0) {
    errno = EINVAL;
    return nullptr;
  }
  std::vector<const char*> argv{program};
  va_list arguments;
  va_start(arguments, mode);
  // NOLINTNEXTLINE(clang-analyzer-valist.Uninitialized): lost sight of by the loop
  while (argv.back() != nullptr) argv.push_back(va_arg(arguments, const char*));
  va_end(arguments);
  return OpenStream(program, mode, const_cast<char* const*>(argv.data()));
}

int KLIBCPclose(FILE* stream) {
  const std::unique_ptr<Running> entry = Forget(stream);
  if (!entry) {
    errno = EINVAL;
    return -1;
  }
  fclose(stream);
  return Finish(entry->program);
}

// /dev/null is opened before the fork, while a failure can still be told.
int KLIBCProcForkEx(int flags) {
  Descriptor null;
  if ((flags & kForkSession) != 0) {
    null = OpenNull();
    if (!null.IsOpen()) return -1;
  }
  const pid_t pid = (flags & kForkDetached) != 0 ? ForkDetached() : fork();
  if (pid != 0 || (flags & kForkSession) == 0) return pid;
  setsid();
  for (int fd = 0; fd < kFirstFreeDescriptor; ++fd) {
    Retry([&] { return dup2(null.Get(), fd); });
  }
  return 0;
}

}  // extern "C"
