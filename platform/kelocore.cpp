// Text, files and pid files; programs and processes are in kelocore_process.cpp.

#include "kelocore.h"

#include <fcntl.h>
#include <signal.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <charconv>
#include <climits>
#include <cstring>
#include <new>
#include <string>
#include <string_view>
#include <utility>

#include "posix/file_io.h"
#include "posix/retry.h"

namespace {

namespace Posix = KeloDRCore::Posix;
using Posix::Descriptor;
using Posix::Retry;

constexpr char kWhiteSpace[] = " \t\n\r\v\f";

// The first `limit` bytes of a file. A FIFO planted under the name does not hold the reader up. No
// exception: the callers are C functions.
bool ReadStart(const char* path, size_t limit, std::string& text) try {
  const Descriptor file = Posix::Open(path, O_RDONLY | Posix::kHarmless);
  return file.IsOpen() && Posix::ReadAll(file.Get(), text, limit);
} catch (const std::bad_alloc&) {
  return Posix::Fail(ENOMEM);
}

struct ProcStat {
  char state;
  int threads;
  unsigned long long startTime;  // clock ticks since boot
};

// Reads what proc(5) lists as fields 3, 20 and 22. The name, field 2, may hold any byte, brackets
// and blanks included.
bool ReadProcStat(int pid, ProcStat* stat) {
  char path[32];
  snprintf(path, sizeof path, "/proc/%d/stat", pid);
  std::string text;
  if (!ReadStart(path, 1024, text)) return false;
  const size_t nameEnd = text.rfind(')');
  if (nameEnd == std::string::npos ||
      sscanf(&text[nameEnd + 1],
             " %c %*s %*s %*s %*s %*s %*s %*s %*s %*s %*s %*s %*s %*s %*s %*s %*s %d %*s %llu",
             &stat->state, &stat->threads, &stat->startTime) != 3) {
    return Posix::Fail(ENOENT);  // not what proc(5) describes
  }
  return true;
}

bool Exists(int pid) { return kill(pid, 0) == 0 || errno == EPERM; }

// Where the start time cannot be read (processes of others may be hidden), nothing speaks against
// a process that exists.
bool MayHaveStartedAt(int pid, unsigned long long startTime) {
  ProcStat stat = {};
  if (!ReadProcStat(pid, &stat)) return Exists(pid);
  return stat.startTime == startTime;
}

std::string_view Trim(std::string_view text) {
  const size_t first = text.find_first_not_of(kWhiteSpace);
  if (first == std::string_view::npos) return {};
  return text.substr(first, text.find_last_not_of(kWhiteSpace) - first + 1);
}

// Digits only, from end to end.
bool ParseNumber(std::string_view text, unsigned long long* number) {
  const char* const end = text.data() + text.size();
  const auto [rest, error] = std::from_chars(text.data(), end, *number);
  return error == std::errc() && rest == end;
}

// The first byte comes last and alone. Before it a reader finds no digit there and thus no pid,
// however many writes the rest takes and wherever they break off.
bool WritePidFile(int fd, std::string text) {
  const char first = std::exchange(text.front(), '\0');
  return Posix::SetMode(fd, 0644) && Posix::WriteAll(fd, text) &&
         Retry([&] { return pwrite(fd, &first, 1, 0); }) == 1;
}

}  // namespace

extern "C" {

char* KLIBCStrTrim(char* text, const char* set, ...) {
  if (set == nullptr) set = kWhiteSpace;
  const char* const first = text + strspn(text, set);
  size_t length = strlen(first);
  while (length > 0 && strchr(set, first[length - 1]) != nullptr) --length;
  memmove(text, first, length);
  text[length] = '\0';
  return text;
}

int KLIBCFileExist(const char* path) {
  struct stat info;
  return Retry([&] { return stat(path, &info); }) == 0 ? 1 : 0;
}

int KLIBCFileCheckDir(const char* path) {
  struct stat info;
  return Retry([&] { return stat(path, &info); }) == 0 && S_ISDIR(info.st_mode) ? 1 : 0;
}

int KLIBCReadPidFile(const char* path) {
  constexpr size_t kTooLong = 128;
  std::string content;
  if (!ReadStart(path, kTooLong, content) || content.size() == kTooLong) return 0;
  const std::string_view text = Trim(content);
  const size_t newline = text.find('\n');
  unsigned long long pid = 0;
  if (!ParseNumber(Trim(text.substr(0, newline)), &pid) || pid > INT_MAX) return 0;
  const int result = static_cast<int>(pid);
  if (newline == std::string_view::npos) return result;
  unsigned long long startTime = 0;
  if (!ParseNumber(Trim(text.substr(newline)), &startTime)) return 0;
  return MayHaveStartedAt(result, startTime) ? result : 0;
}

int KLIBCProcAlive(int pid) {
  if (pid <= 0) return 0;
  ProcStat stat = {};
  if (ReadProcStat(pid, &stat)) {
    // A process whose first thread has ended looks like a zombie while its other threads run.
    if (stat.state == 'X' || (stat.state == 'Z' && stat.threads <= 1)) return 0;
  }
  return Exists(pid) ? 1 : 0;
}

// The old file is removed, not written to: whoever planted a link under the name gains nothing, and
// no reader meets a mixture of old and new. No temporary stands beside it, so none can stay behind;
// a writer killed half-way leaves no file or one without its first byte, both of which name nobody.
int KLIBCProcPidFileCreate(const char* path) {
  ProcStat self = {};
  if (!ReadProcStat(getpid(), &self)) return -1;
  char text[64];
  snprintf(text, sizeof text, "%d\n%llu\n", static_cast<int>(getpid()), self.startTime);
  if (unlink(path) != 0 && errno != ENOENT) return -1;
  const Descriptor file(Retry(
      [&] { return open(path, O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0644); }));
  if (!file.IsOpen()) return -1;
  if (WritePidFile(file.Get(), text)) return 0;
  const int savedErrno = errno;
  unlink(path);
  errno = savedErrno;
  return -1;
}

}  // extern "C"
