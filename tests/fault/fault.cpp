#include "fault/fault.h"

#include <json/json.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <atomic>
#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <iostream>
#include <new>
#include <utility>

#include "fault/interception.h"

namespace {

// Shared with forked children, so that their calls are part of one count.
struct State {
  std::atomic<bool> armed;
  Fault::Plan plan;
  std::atomic<int> calls;
  std::atomic<int> failures;
  std::array<const char*, 64> failed;  // literals, at the same place in a forked child
  std::atomic<long long> waited;       // microseconds

  // Of the whole test.
  std::atomic<int> runs;
  std::atomic<int> allFailures;
  std::atomic<int> shortTransfers;
  std::atomic<long long> longestWait;
};

State* state = nullptr;
thread_local int suspensions = 0;

// Whether this process armed, or is a child of the one that did: a parent that waits for it does
// not count.
bool isArmedHere = false;

State* NewState() {
  void* const memory =
      mmap(nullptr, sizeof(State), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
  if (memory == MAP_FAILED) abort();
  return new (memory) State{};
}

bool IsArmed() { return isArmedHere && state->armed; }

constexpr int kSignalsInARow = 10;  // no failure

// In seconds. The library's longest waits are for a minute each.
constexpr unsigned int kLongestRun = 60;
constexpr long long kLongestWait = 300;

// Not 0 for what sets errno.
int ErrnoOf(int error) {
  if (error == Fault::kNoMemory) return ENOMEM;
  if (error == Fault::kDiskFull) return ENOSPC;
  if (error == Fault::kSignals) return EINTR;
  return error > 0 ? error : 0;
}

// A transfer of less than was asked for is no failure.
bool IsFailure(int error) { return error != Fault::kOneByte && error != Fault::kHalf; }

std::string NameOf(int error) {
  switch (error) {
    case Fault::kNoMemory:
      return "fails: no memory";
    case Fault::kOneByte:
      return "moves one byte";
    case Fault::kHalf:
      return "moves a half";
    case Fault::kDiskFull:
      return "fills the disk";
    case Fault::kSignals:
      return "is interrupted";
    default:
      return "fails: " + (error > 0 ? strerror(error) : "error " + std::to_string(error));
  }
}

// The watchdog: ends this process. A forked child that goes on meets no failure any more.
[[noreturn]] void Bite(const char* why) {
  state->armed = false;
  dprintf(STDERR_FILENO,
          "watchdog: %s: call %d %s, from there on at most %d times; %d failed:", why,
          state->plan.first, NameOf(state->plan.error).c_str(), state->plan.times,
          state->failures.load());
  for (const std::string& call : Fault::FailedCalls()) dprintf(STDERR_FILENO, " %s", call.c_str());
  dprintf(STDERR_FILENO, "\n");
  _exit(1);
}

void BiteAtTheAlarm(int /*signal*/) { Bite("not over after a minute"); }

// True when an exception came out that is not to.
bool RunCaught(const Fault::Operation& operation, bool mayThrowJsonError, Fault::Outcome& outcome) {
  try {
    outcome.succeeded = operation.run();
  } catch (const std::bad_alloc&) {
    outcome.threw = true;
  } catch (const Json::RuntimeError&) {
    outcome.threw = true;
    return !mayThrowJsonError;
  }
  return outcome.threw && outcome.error != Fault::kNoMemory;
}

// Those that nobody could wait for.
void ReapChildren() {
  while (waitpid(-1, nullptr, 0) > 0) {
  }
}

void ExpectNothingLeft(const std::set<int>& descriptors, uid_t uid, gid_t gid) {
  EXPECT_EQ(OpenDescriptors(), descriptors) << "descriptors left open or closed";
  EXPECT_EQ(waitpid(-1, nullptr, WNOHANG), -1) << "a child was left behind";
  EXPECT_EQ(geteuid(), uid) << "effective uid not restored";
  EXPECT_EQ(getegid(), gid) << "effective gid not restored";
}

}  // namespace

namespace Fault {

void Arm(const Plan& plan) {
  state->plan = plan;
  state->calls = 0;
  state->failures = 0;
  state->failed = {};
  state->waited = 0;
  state->armed = true;
  isArmedHere = true;
}

int Failures() { return state->failures; }

int Disarm() {
  state->armed = false;
  isArmedHere = false;
  return Failures();
}

std::vector<std::string> FailedCalls() {
  return {state->failed.begin(), std::find(state->failed.begin(), state->failed.end(), nullptr)};
}

bool Outcome::Failed(const std::string& call) const {
  return std::any_of(failed.begin(), failed.end(),
                     [&](const std::string& name) { return PlainName(name) == call; });
}

bool Hits(const char* call, std::initializer_list<int> errors) {
  if (!IsArmed() || suspensions > 0 || LogCapture::IsRecording()) return false;
  const Plan& plan = state->plan;
  int error = plan.error;
  if (error == kSignals) {
    // The kernel's generator is interrupted only until it has its first seed.
    if (strcmp(call, "getrandom") == 0) return false;
    error = EINTR;
  }
  if (std::find(errors.begin(), errors.end(), error) == errors.end()) return false;
  const int number = ++state->calls;
  if (number < plan.first || number - plan.first >= plan.times) return false;
  ++state->failures;
  size_t known = 0;
  while (state->failed[known] != nullptr && state->failed[known] != call) ++known;
  state->failed.at(known) = call;
  if (ErrnoOf(plan.error) != 0) errno = ErrnoOf(plan.error);
  return true;
}

bool Outcome::FailedForGood(const std::string& call) const {
  return error != EINTR && Failed(call);
}

void Wait(long long microseconds) {
  if (!IsArmed()) return;
  state->waited += microseconds;
  if (state->waited > kLongestWait * 1000000) Bite("more than five minutes of sleep");
}

bool IsSuspended() { return suspensions > 0; }
Suspension::Suspension() { ++suspensions; }
Suspension::~Suspension() { --suspensions; }

}  // namespace Fault

void FaultTest::SetUp() {
  CleanTest::SetUp();
  bystander = memfd_create("bystander", MFD_CLOEXEC);
  state = NewState();
  signal(SIGALRM, BiteAtTheAlarm);
}

void FaultTest::TearDown() {
  close(bystander);
  std::cout << "[  faults  ] " << state->runs << " runs, " << state->allFailures
            << " failed calls, " << state->shortTransfers << " short transfers, longest wait "
            << state->longestWait / 1000000 << " s\n";
  munmap(std::exchange(state, nullptr), sizeof(State));
  signal(SIGALRM, SIG_DFL);
  CleanTest::TearDown();
}

void FaultTest::SweepCalls(const Fault::Operation& operation) {
  for (const int error : {EINTR, EIO, ENOSPC, EMFILE, EACCES, EAGAIN, ENOMEM}) {
    Sweep(operation, error, Fault::kOnce);
    const int held = error == EAGAIN ? heldForGood : Fault::kForGood;
    Sweep(operation, error, error == EINTR ? kSignalsInARow : held);
  }
  if (interruptedStride > 0) Sweep(operation, Fault::kSignals, Fault::kForGood, interruptedStride);
}

void FaultTest::SweepMemory(const Fault::Operation& operation) {
  Sweep(operation, Fault::kNoMemory, Fault::kOnce);
  Sweep(operation, Fault::kNoMemory, Fault::kForGood);
}

void FaultTest::SweepTransfers(const Fault::Operation& operation) {
  operation.prepare();
  LogCapture::Clear();
  operation.run();
  undisturbedLog = LogCapture::Take();
  const int before = state->shortTransfers;
  for (const int portion : {Fault::kOneByte, Fault::kHalf}) {
    Sweep(operation, portion, Fault::kOnce);
    Sweep(operation, portion, Fault::kForGood);
  }
  EXPECT_GT(state->shortTransfers, before) << "nothing was moved";
  Sweep(operation, Fault::kDiskFull, Fault::kForGood);
}

void FaultTest::ExpectUndisturbed(const Fault::Outcome& outcome) const {
  EXPECT_TRUE(outcome.succeeded);
  EXPECT_FALSE(outcome.threw);
  EXPECT_EQ(outcome.log, undisturbedLog);
}

void FaultTest::Sweep(const Fault::Operation& operation, int error, int times, int stride) {
  for (int first = 1;; first += stride) {
    alarm(kLongestRun);
    if (!RunFailing(operation, {error, first, times}) || HasFailure()) break;
    RunUnfailed(operation);
  }
  alarm(0);
}

// False when no call was left to fail.
bool FaultTest::RunFailing(const Fault::Operation& operation, const Fault::Plan& plan) {
  operation.prepare();
  LogCapture::Clear();
  const std::set<int> descriptors = OpenDescriptors();
  const uid_t uid = geteuid();
  const gid_t gid = getegid();
  Fault::Outcome outcome{false, false, plan.error, 0, {}, {}};
  Fault::Arm(plan);
  const bool threwWrongly = RunCaught(operation, mayThrowJsonError, outcome);
  outcome.failures = Fault::Disarm();
  outcome.failed = Fault::FailedCalls();
  outcome.log = LogCapture::Take();
  SCOPED_TRACE("call " + std::to_string(plan.first) + " " + NameOf(plan.error) + ", " +
               std::to_string(outcome.failures) +
               " times: " + testing::PrintToString(outcome.failed));
  if (plan.error == Fault::kSignals && outcome.Failed("waitpid")) ReapChildren();
  ExpectNothingLeft(descriptors, uid, gid);
  EXPECT_EQ(lseek(bystander, 0, SEEK_END), 0) << "written to a file of the caller's";
  EXPECT_FALSE(threwWrongly) << "an exception came out";
  const int hits = outcome.failures;
  if (!IsFailure(plan.error)) {
    outcome = {outcome.succeeded, outcome.threw, 0, 0, {}, outcome.log};
    ExpectUndisturbed(outcome);
  }
  operation.check(outcome);
  ++state->runs;
  (IsFailure(plan.error) ? state->allFailures : state->shortTransfers) += hits;
  state->longestWait = std::max(state->longestWait.load(), state->waited.load());
  return hits > 0;
}

void FaultTest::RunUnfailed(const Fault::Operation& operation) {
  SCOPED_TRACE("the next call");
  Fault::Outcome outcome{false, false, 0, 0, {}, {}};
  EXPECT_FALSE(RunCaught(operation, false, outcome)) << "an exception came out";
  outcome.log = LogCapture::Take();
  EXPECT_TRUE(outcome.succeeded);
  operation.check(outcome);
}
