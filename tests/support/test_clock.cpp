#include "support/test_clock.h"

#include <dlfcn.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cstring>
#include <utility>

#include "support/next.h"

namespace {

std::optional<time_t> fixedTime;
SleepStandIn sleepStandIn;
std::vector<unsigned int> sleeps;
bool counting = false;
unsigned int nextDraw = 0;

// The `timespec` of calls without 64-bit times, whatever this program itself is compiled with.
struct Length {
  long seconds;
  long nanoseconds;
};

std::optional<int> Ask(useconds_t microseconds) {
  return sleepStandIn ? sleepStandIn(microseconds) : std::nullopt;
}

// What the stand-in answers to a sleep of a shared library.
std::optional<int> AskFor(const void* caller, const Length* length) {
  Dl_info calling = {};
  Dl_info own = {};
  const bool isOwn = dladdr(caller, &calling) != 0 && dladdr(&sleeps, &own) != 0 &&
                     calling.dli_fbase == own.dli_fbase;
  if (isOwn) return std::nullopt;
  return Ask(static_cast<useconds_t>(length->seconds * 1000000 + length->nanoseconds / 1000));
}

}  // namespace

// The linker lets these stand before the C library's. Their own names differ, so that the headers'
// declarations, which vary with the size of times, do not matter.
extern "C" {

time_t time(time_t* out) noexcept {
  time_t now = 0;
  if (fixedTime) {
    now = *fixedTime;
  } else {
    timespec real{};
    clock_gettime(CLOCK_REALTIME_COARSE, &real);  // the clock of time() and of file systems
    now = real.tv_sec;
  }
  if (out != nullptr) *out = now;
  return now;
}

int usleep(useconds_t microseconds) {
  if (const std::optional<int> answer = Ask(microseconds)) return *answer;
  return Next<int(useconds_t)>("usleep")(microseconds);
}

int TestClock_nanosleep(const Length* length, Length* rest) __asm__("nanosleep");
int TestClock_nanosleep(const Length* length, Length* rest) {
  if (const auto answer = AskFor(__builtin_return_address(0), length)) return *answer;
  return Next<int(const Length*, Length*)>("nanosleep")(length, rest);
}

int TestClock_clock_nanosleep(int clock, int flags, const Length* length,
                              Length* rest) __asm__("clock_nanosleep");
int TestClock_clock_nanosleep(int clock, int flags, const Length* length, Length* rest) {
  if (flags == 0) {  // else the length is a point in time
    if (const auto answer = AskFor(__builtin_return_address(0), length)) return *answer;
  }
  return Next<int(int, int, const Length*, Length*)>("clock_nanosleep")(clock, flags, length, rest);
}

ssize_t getrandom(void* data, size_t size, unsigned int flags) {
  if (!counting || size != sizeof nextDraw) return syscall(SYS_getrandom, data, size, flags);
  std::memcpy(data, &nextDraw, size);
  ++nextDraw;
  return static_cast<ssize_t>(size);
}

}  // extern "C"

void ReplaceSleeps(SleepStandIn standIn) { sleepStandIn = std::move(standIn); }

namespace TestClock {

void SetTime(time_t now) { fixedTime = now; }

void SkipSleeps(std::function<void()> duringSleep) {
  ReplaceSleeps([duringSleep = std::move(duringSleep)](useconds_t microseconds) {
    sleeps.push_back(microseconds);
    if (duringSleep) duringSleep();
    return 0;
  });
}

std::vector<unsigned int> TakeSleeps() { return std::exchange(sleeps, {}); }

void Reset() {
  fixedTime.reset();
  ReplaceSleeps(nullptr);
  sleeps.clear();
}

}  // namespace TestClock

CountingGenerator::CountingGenerator() {
  nextDraw = 0;
  counting = true;
}

CountingGenerator::~CountingGenerator() { counting = false; }
