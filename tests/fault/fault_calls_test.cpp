// Holds the fault injector against what the library really calls.

#include <dlfcn.h>
#include <fcntl.h>
#include <unistd.h>

#include <cstdio>
#include <ctime>
#include <set>
#include <sstream>
#include <string>

#include "fault/fault.h"
#include "kelodrcore/file.h"

namespace {

// Calls that cannot fail, or not in a way that a caller could do anything about.
const std::set<std::string> kHarmless = {
    // Memory and text.
    "free", "memchr", "memcmp", "memcpy", "memmove", "memset", "snprintf", "strchr", "strcmp",
    "strerror", "strerror_r", "strlen", "strrchr", "strspn", "__isoc99_sscanf", "__isoc23_sscanf",
    "__snprintf_chk", "__memcpy_chk", "__memmove_chk",
    // Numbers.
    "fmod", "trunc", "difftime", "__difftime64", "__udivdi3", "__umoddi3", "__divdi3", "__moddi3",
    "__ctzdi2", "uselocale",
    // The process itself.
    "_exit", "abort", "alarm", "closefrom", "environ", "__environ", "getegid", "geteuid", "getpid",
    "kill", "pthread_mutex_lock", "pthread_mutex_unlock", "pthread_self", "pthread_sigmask",
    "setlogmask", "setsid", "sigaction", "sigaddset", "sigemptyset", "sigfillset", "signal",
    "posix_spawnattr_destroy", "posix_spawnattr_setflags", "posix_spawnattr_setsigdefault",
    "posix_spawnattr_setsigmask", "__errno_location", "__stack_chk_fail", "__tls_get_addr",
    "___tls_get_addr", "tzset",
    // Made while the library is loaded, before any test runs.
    "__register_atfork", "pthread_atfork",
    // Streams that are there already.
    "clearerr", "ferror", "fileno"};

bool StartsWith(const std::string& text, const std::string& start) {
  return text.compare(0, start.size(), start) == 0;
}

// Of other libraries, or of the compiler.
bool IsForeign(const std::string& symbol) {
  for (const char* const start : {"_Z", "_ITM_", "_Unwind_", "__cxa_", "__gmon_start__", "__gxx_",
                                  "__asan_", "__ubsan_", "__sanitizer_", "KLIBC", "sqlite3_"}) {
    if (StartsWith(symbol, start)) return true;
  }
  return false;
}

void* const thisProgram = [] {
  Dl_info info = {};
  dladdr(reinterpret_cast<void*>(&StartsWith), &info);
  return info.dli_fbase;
}();

// Whether a library that calls `symbol` reaches this program.
bool IsInterposed(const std::string& symbol) {
  Dl_info info = {};
  void* const found = dlsym(RTLD_DEFAULT, symbol.c_str());
  return found != nullptr && dladdr(found, &info) != 0 && info.dli_fbase == thisProgram;
}

std::set<std::string> ImportsOfTheLibrary() {
  Dl_info info = {};
  dladdr(reinterpret_cast<void*>(&KeloDRCore::File::IsRegularFile), &info);
  const std::string command =
      std::string(KELODR_NM) + " -D --undefined-only '" + info.dli_fname + "'";
  FILE* const output = popen(command.c_str(), "r");
  std::set<std::string> imports;
  char line[1024];
  while (fgets(line, sizeof line, output) != nullptr) {
    std::string mark;
    std::string symbol;
    std::istringstream(line) >> mark >> symbol;
    imports.insert(symbol.substr(0, symbol.find('@')));
  }
  EXPECT_EQ(pclose(output), 0);
  return imports;
}

using FaultCallsTest = FaultTest;

}  // namespace

TEST_F(FaultCallsTest, EveryCallThatTheLibraryMakesCanBeFailed) {
  const std::set<std::string> imports = ImportsOfTheLibrary();
  EXPECT_EQ(imports.count("syslog") + imports.count("__syslog_chk"), 1U);
  for (const std::string& symbol : imports) {
    if (IsForeign(symbol) || kHarmless.count(symbol) > 0) continue;
    EXPECT_TRUE(IsInterposed(symbol)) << symbol;
  }
}

// So that its memory can fail under a sanitizer too, which has the other calls to itself.
TEST_F(FaultCallsTest, TheLibrarysOwnMemoryComesFromOperatorNew) {
  const std::set<std::string> imports = ImportsOfTheLibrary();
  for (const char* const call : {"malloc", "calloc", "realloc", "reallocarray", "strdup", "strndup",
                                 "aligned_alloc", "posix_memalign", "asprintf", "vasprintf"}) {
    EXPECT_EQ(imports.count(call), 0U) << call;
  }
  EXPECT_TRUE(IsInterposed("_Znwm") || IsInterposed("_Znwj"));
}

TEST_F(FaultCallsTest, CallsFailFromTheOneNamedForAsManyAsNamed) {
  Fault::Arm({EIO, 2, 2});
  EXPECT_NE(access("/", F_OK), -1);
  EXPECT_EQ(access("/", F_OK), -1);
  EXPECT_EQ(errno, EIO);
  EXPECT_EQ(access("/", F_OK), -1);
  EXPECT_NE(access("/", F_OK), -1);
  EXPECT_EQ(Fault::Disarm(), 2);
  EXPECT_EQ(Fault::FailedCalls(), std::vector<std::string>{"access"});
}

TEST_F(FaultCallsTest, OnlyCallsThatCanFailWithTheErrorCount) {
  Fault::Arm({ENOSPC, 1, 1});
  EXPECT_NE(access("/", F_OK), -1);
  EXPECT_EQ(Fault::Disarm(), 0);
}

TEST_F(FaultCallsTest, CallsOfAForkedChildCountToo) {
  Fault::Arm({EACCES, 2, 1});
  EXPECT_EQ(RunInChild([] { EXPECT_NE(access("/", F_OK), -1); }), 0);
  EXPECT_EQ(access("/", F_OK), -1);
  EXPECT_EQ(Fault::Disarm(), 1);
}

TEST_F(FaultCallsTest, AShortTransferMovesAByteOrAHalf) {
  WriteText(Path("file"), "123456");
  const int fd = open(Path("file").c_str(), O_RDWR | O_CLOEXEC);
  char data[6];
  Fault::Arm({Fault::kOneByte, 1, 1});
  EXPECT_EQ(read(fd, data, sizeof data), 1);
  EXPECT_EQ(read(fd, data, sizeof data), 5);
  EXPECT_EQ(Fault::Disarm(), 1);
  Fault::Arm({Fault::kHalf, 1, 2});
  EXPECT_EQ(pwrite(fd, "abcdef", 6, 0), 3);
  EXPECT_EQ(write(fd, "ghij", 4), 2);
  EXPECT_EQ(Fault::Disarm(), 2);
  close(fd);
  EXPECT_EQ(ReadText(Path("file")), "abc456gh");
}

TEST_F(FaultCallsTest, AFullDiskTakesAHalfAndThenNothing) {
  const int fd = open(Path("file").c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600);
  Fault::Arm({Fault::kDiskFull, 2, Fault::kForGood});
  EXPECT_EQ(write(fd, "ab", 2), 2);
  EXPECT_EQ(write(fd, "cdef", 4), 2);
  EXPECT_EQ(write(fd, "ef", 2), -1);
  EXPECT_EQ(errno, ENOSPC);
  EXPECT_EQ(Fault::Disarm(), 2);
  close(fd);
  EXPECT_EQ(ReadText(Path("file")), "abcd");
}

// One version of SQLite waits by usleep, another by nanosleep or clock_nanosleep.
TEST_F(FaultCallsTest, NoSleepTakesTime) {
  constexpr timespec kHour = {3600, 0};
  EXPECT_EQ(RunInChild([&] {
              alarm(5);
              EXPECT_EQ(usleep(999999), 0);
              EXPECT_EQ(sleep(3600), 0U);
              EXPECT_EQ(nanosleep(&kHour, nullptr), 0);
              EXPECT_EQ(clock_nanosleep(CLOCK_MONOTONIC, 0, &kHour, nullptr), 0);
            }),
            0);
}

// Their reports are a few bytes long, and those go as a whole.
TEST_F(FaultCallsTest, APipeIsNeverShort) {
  int ends[2];
  ASSERT_EQ(pipe2(ends, O_CLOEXEC), 0);
  Fault::Arm({Fault::kOneByte, 1, 1});
  EXPECT_EQ(write(ends[1], "1234", 4), 4);
  EXPECT_EQ(Fault::Disarm(), 0);
  close(ends[0]);
  close(ends[1]);
}
