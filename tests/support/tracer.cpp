#include "support/tracer.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/ptrace.h>
#include <sys/syscall.h>
#include <sys/user.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <climits>
#include <csignal>
#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <map>
#include <optional>

#include "support/child.h"

namespace Tracer {
namespace {

constexpr int kMostCalls = 20000;  // of one process; a body that makes more does not end
constexpr int kSystemCallStop = SIGTRAP | 0x80;
constexpr long kOptions = PTRACE_O_TRACESYSGOOD | PTRACE_O_EXITKILL | PTRACE_O_TRACEFORK |
                          PTRACE_O_TRACEVFORK | PTRACE_O_TRACECLONE | PTRACE_O_TRACEEXEC;

// One system call that is about to be made.
struct Call {
  pid_t pid;
  Moment moment;
  uint64_t number;
  const uint64_t* arguments;
};
using Watcher = std::function<void(const Call&)>;

// A child under ptrace and everything that it starts.
class Tree {
 public:
  explicit Tree(const Watcher& watcher) : watch(watcher) {}

  void Run(const std::function<void()>& body) {
    const pid_t child = Start(body);
    Adopt(child);
    ptrace(PTRACE_SYSCALL, child, nullptr, nullptr);
    int status = 0;
    for (pid_t pid; (pid = waitpid(-1, &status, __WALL)) > 0;) {
      if (WIFSTOPPED(status)) Continue(pid, status);
    }
  }

 private:
  static pid_t Start(const std::function<void()>& body) {
    const pid_t child = StartChild([&]() -> int {
      ptrace(PTRACE_TRACEME, 0, nullptr, nullptr);
      raise(SIGSTOP);
      body();
      _exit(0);
    });
    int status = 0;
    EXPECT_EQ(waitpid(child, &status, 0), child);
    EXPECT_EQ(ptrace(PTRACE_SETOPTIONS, child, nullptr, kOptions), 0);
    return child;
  }

  // A process shows itself either by its parent's event or by its own first stop.
  void Adopt(pid_t pid) { processes.emplace(pid, Moment{static_cast<int>(processes.size()), 0}); }

  void Continue(pid_t pid, int status) {
    Adopt(pid);
    const int event = status >> 16;
    int signalToDeliver = 0;
    if (WSTOPSIG(status) == kSystemCallStop) {
      Look(pid);
    } else if (event != 0) {
      AdoptBorn(pid, event);
    } else if (WSTOPSIG(status) != SIGSTOP) {
      signalToDeliver = WSTOPSIG(status);
    }
    ptrace(PTRACE_SYSCALL, pid, nullptr, signalToDeliver);
  }

  void AdoptBorn(pid_t pid, int event) {
    unsigned long born = 0;
    if (event == PTRACE_EVENT_EXEC) return;
    if (ptrace(PTRACE_GETEVENTMSG, pid, nullptr, &born) == 0) Adopt(static_cast<pid_t>(born));
  }

  void Look(pid_t pid) {
    __ptrace_syscall_info info = {};
    const long size = ptrace(PTRACE_GET_SYSCALL_INFO, pid, sizeof info, &info);
    if (size <= 0 || info.op != PTRACE_SYSCALL_INFO_ENTRY) return;
    Moment& moment = processes[pid];
    EXPECT_LT(moment.call, kMostCalls);
    if (moment.call >= kMostCalls) kill(pid, SIGKILL);
    watch({pid, moment, info.entry.nr, info.entry.args});
    ++moment.call;
  }

  const Watcher& watch;
  std::map<pid_t, Moment> processes;  // the dead ones stay: their numbers are not given again
};

// The calls that change files, each with the place of the descriptor or path that it is about.
enum class Named { kByDescriptor, kByPath, kByPathAt, kByTwoPaths, kByTwoPathsAt };
struct FileCall {
  uint64_t number;
  const char* name;
  Named named;
};
const FileCall kFileCalls[] = {
    {SYS_openat, "create", Named::kByPathAt},        {SYS_open, "create", Named::kByPath},
    {SYS_write, "write", Named::kByDescriptor},      {SYS_pwrite64, "write", Named::kByDescriptor},
    {SYS_writev, "write", Named::kByDescriptor},     {SYS_fchmod, "mode", Named::kByDescriptor},
    {SYS_fchown, "owner", Named::kByDescriptor},
#ifdef SYS_fchown32
    {SYS_fchown32, "owner", Named::kByDescriptor},
#endif
    {SYS_ftruncate, "cut", Named::kByDescriptor},
#ifdef SYS_ftruncate64
    {SYS_ftruncate64, "cut", Named::kByDescriptor},
#endif
    {SYS_fsync, "sync", Named::kByDescriptor},       {SYS_fdatasync, "sync", Named::kByDescriptor},
    {SYS_rename, "rename", Named::kByTwoPaths},      {SYS_renameat, "rename", Named::kByTwoPathsAt},
    {SYS_renameat2, "rename", Named::kByTwoPathsAt}, {SYS_unlink, "remove", Named::kByPath},
    {SYS_unlinkat, "remove", Named::kByPathAt},
};

std::string Link(pid_t pid, const std::string& name) {
  std::error_code error;
  return std::filesystem::read_symlink("/proc/" + std::to_string(pid) + "/" + name, error).string();
}

std::string OpenFile(pid_t pid, uint64_t fd) {
  return Link(pid, "fd/" + std::to_string(static_cast<int>(fd)));
}

std::string Text(pid_t pid, uint64_t address) {
  char buffer[PATH_MAX] = {};
  const int memory = open(("/proc/" + std::to_string(pid) + "/mem").c_str(), O_RDONLY | O_CLOEXEC);
  const ssize_t size = pread(memory, buffer, sizeof buffer - 1, static_cast<off_t>(address));
  close(memory);
  return size > 0 ? buffer : "";
}

std::string PathAt(pid_t pid, uint64_t directory, uint64_t address) {
  const std::string path = Text(pid, address);
  if (path.empty() || path.front() == '/') return path;
  const bool isWorkingDirectory = static_cast<int>(directory) == AT_FDCWD;
  return (isWorkingDirectory ? Link(pid, "cwd") : OpenFile(pid, directory)) + "/" + path;
}

std::vector<std::string> FilesOf(const Call& call, Named named) {
  constexpr uint64_t kHere = static_cast<uint64_t>(AT_FDCWD);
  const uint64_t* const a = call.arguments;
  switch (named) {
    case Named::kByDescriptor:
      return {OpenFile(call.pid, a[0])};
    case Named::kByPath:
      return {PathAt(call.pid, kHere, a[0])};
    case Named::kByPathAt:
      return {PathAt(call.pid, a[0], a[1])};
    case Named::kByTwoPaths:
      return {PathAt(call.pid, kHere, a[0]), PathAt(call.pid, kHere, a[1])};
    case Named::kByTwoPathsAt:
      return {PathAt(call.pid, a[0], a[1]), PathAt(call.pid, a[2], a[3])};
  }
  return {};
}

bool Creates(const Call& call) {
  const uint64_t flags = call.arguments[call.number == SYS_openat ? 2 : 1];
  return (flags & O_CREAT) != 0;
}

std::optional<std::string> Below(const std::string& directory, const std::string& path) {
  if (path == directory) return ".";
  if (path.compare(0, directory.size() + 1, directory + "/") != 0) return std::nullopt;
  return path.substr(directory.size() + 1);
}

std::optional<std::string> Describe(const Call& call, const std::string& directory) {
  const auto* const known =
      std::find_if(std::begin(kFileCalls), std::end(kFileCalls),
                   [&](const FileCall& one) { return one.number == call.number; });
  if (known == std::end(kFileCalls)) return std::nullopt;
  if ((call.number == SYS_openat || call.number == SYS_open) && !Creates(call)) return std::nullopt;
  std::string text = known->name;
  for (const std::string& path : FilesOf(call, known->named)) {
    const std::optional<std::string> name = Below(directory, path);
    if (!name) return std::nullopt;
    text += " " + *name;
  }
  return text;
}

bool Moves(const Call& call) {
  constexpr uint64_t kMoving[] = {SYS_read, SYS_write, SYS_pread64, SYS_pwrite64};
  return std::count(std::begin(kMoving), std::end(kMoving), call.number) > 0 &&
         call.arguments[2] > 1;
}

// The register keeps the size after the call, which to the function that makes it is a scratch
// register.
void SetSize(pid_t pid, long size) {
#ifdef __x86_64__
  constexpr size_t kThirdArgument = offsetof(user, regs) + offsetof(user_regs_struct, rdx);
#else
  constexpr size_t kThirdArgument = offsetof(user, regs) + offsetof(user_regs_struct, edx);
#endif
  EXPECT_EQ(ptrace(PTRACE_POKEUSER, pid, kThirdArgument, size), 0);
}

}  // namespace

std::ostream& operator<<(std::ostream& out, const Moment& moment) {
  return out << "call " << moment.call << " of process " << moment.process;
}

bool KilledAt(const Moment& moment, const std::function<void()>& body) {
  bool killed = false;
  const Watcher watch = [&](const Call& call) {
    if (call.moment.process != moment.process || call.moment.call != moment.call) return;
    // The kernel does not make the call of a process that is killed before it.
    kill(call.pid, SIGKILL);
    killed = true;
  };
  Tree(watch).Run(body);
  return killed;
}

std::vector<int> Sweep(const std::function<void()>& prepare, const std::function<void()>& body,
                       const std::function<void(const Moment&)>& check) {
  std::vector<int> kills;
  Moment moment;
  while (true) {
    prepare();
    if (KilledAt(moment, body)) {
      check(moment);
      ++moment.call;
    } else if (moment.call > 0) {
      kills.push_back(moment.call);
      moment = {moment.process + 1, 0};
    } else {
      return kills;
    }
    if (testing::Test::HasFailure()) return kills;  // one of them tells enough
  }
}

std::vector<std::string> FileCalls(const std::string& directory,
                                   const std::function<void()>& body) {
  std::vector<std::string> calls;
  const Watcher watch = [&](const Call& call) {
    const std::optional<std::string> text = Describe(call, directory);
    if (text) calls.push_back(*text);
  };
  Tree(watch).Run(body);
  return calls;
}

int CutTransfers(const std::string& directory, int first, const std::function<void()>& body) {
  int seen = 0;
  int cut = 0;
  const Watcher watch = [&](const Call& call) {
    if (!Moves(call) || !Below(directory, OpenFile(call.pid, call.arguments[0]))) return;
    if (++seen < first) return;
    SetSize(call.pid, 1);
    ++cut;
  };
  Tree(watch).Run(body);
  return cut;
}

}  // namespace Tracer
