#include "fault/fault.h"

#include <json/json.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <atomic>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <iostream>
#include <new>

#include "fault/interception.h"

namespace {

// Shared with forked children, so that their calls are part of one count.
struct State {
  std::atomic<bool> armed;
  Fault::Plan plan;
  std::atomic<int> calls;
  std::atomic<int> failures;
  std::array<const char*, 64> failed;  // literals, at the same place in a forked child
};

State* state = nullptr;
thread_local int suspensions = 0;

State* NewState() {
  void* const memory =
      mmap(nullptr, sizeof(State), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
  if (memory == MAP_FAILED) abort();
  return new (memory) State{};
}

// A signal that never stops coming is no fault of the system's; this many in a row is bad enough.
constexpr int kSignalsInARow = 10;

// In seconds. A failure that lasts must not hang anybody: SIGALRM ends the test then.
constexpr unsigned int kLongestRun = 60;

// Not 0 for what sets errno.
int ErrnoOf(int error) {
  if (error == Fault::kNoMemory) return ENOMEM;
  if (error == Fault::kDiskFull) return ENOSPC;
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
    default:
      return "fails: " + (error > 0 ? strerror(error) : "error " + std::to_string(error));
  }
}

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

void ExpectNothingLeft(const std::set<int>& descriptors, uid_t uid, gid_t gid) {
  EXPECT_EQ(OpenDescriptors(), descriptors) << "descriptors left open or closed";
  EXPECT_EQ(waitpid(-1, nullptr, WNOHANG), -1) << "a child was left behind";
  EXPECT_EQ(geteuid(), uid) << "effective uid not restored";
  EXPECT_EQ(getegid(), gid) << "effective gid not restored";
}

}  // namespace

namespace Fault {

void Arm(const Plan& plan) {
  if (state == nullptr) state = NewState();
  state->plan = plan;
  state->calls = 0;
  state->failures = 0;
  state->failed = {};
  state->armed = true;
}

int Failures() { return state->failures; }

int Disarm() {
  state->armed = false;
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
  if (state == nullptr || !state->armed || suspensions > 0 || LogCapture::IsRecording()) {
    return false;
  }
  const Plan& plan = state->plan;
  if (std::find(errors.begin(), errors.end(), plan.error) == errors.end()) return false;
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

bool IsSuspended() { return suspensions > 0; }
Suspension::Suspension() { ++suspensions; }
Suspension::~Suspension() { --suspensions; }

}  // namespace Fault

void FaultTest::SetUp() {
  CleanTest::SetUp();
  bystander = memfd_create("bystander", MFD_CLOEXEC);
}

void FaultTest::TearDown() {
  close(bystander);
  std::cout << "[  faults  ] " << runs << " runs, " << failures << " failed calls, "
            << shortTransfers << " short transfers\n";
  CleanTest::TearDown();
}

void FaultTest::SweepCalls(const Fault::Operation& operation) {
  for (const int error : {EINTR, EIO, ENOSPC, EMFILE, EACCES, EAGAIN, ENOMEM}) {
    Sweep(operation, error, Fault::kOnce);
    const int held = error == EAGAIN ? heldForGood : Fault::kForGood;
    Sweep(operation, error, error == EINTR ? kSignalsInARow : held);
  }
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
  const int before = shortTransfers;
  for (const int portion : {Fault::kOneByte, Fault::kHalf}) {
    Sweep(operation, portion, Fault::kOnce);
    Sweep(operation, portion, Fault::kForGood);
  }
  EXPECT_GT(shortTransfers, before) << "nothing was moved";
  Sweep(operation, Fault::kDiskFull, Fault::kForGood);
}

void FaultTest::ExpectUndisturbed(const Fault::Outcome& outcome) const {
  EXPECT_TRUE(outcome.succeeded);
  EXPECT_FALSE(outcome.threw);
  EXPECT_EQ(outcome.log, undisturbedLog);
}

void FaultTest::Sweep(const Fault::Operation& operation, int error, int times) {
  for (int first = 1;; ++first) {
    if (!RunFailing(operation, {error, first, times}) || HasFailure()) return;
    RunUnfailed(operation);
  }
}

// False when no call was left to fail.
bool FaultTest::RunFailing(const Fault::Operation& operation, const Fault::Plan& plan) {
  operation.prepare();
  LogCapture::Clear();
  const std::set<int> descriptors = OpenDescriptors();
  const uid_t uid = geteuid();
  const gid_t gid = getegid();
  Fault::Outcome outcome{false, false, plan.error, 0, {}, {}};
  alarm(kLongestRun);
  Fault::Arm(plan);
  const bool threwWrongly = RunCaught(operation, mayThrowJsonError, outcome);
  outcome.failures = Fault::Disarm();
  alarm(0);
  outcome.failed = Fault::FailedCalls();
  outcome.log = LogCapture::Take();
  SCOPED_TRACE("call " + std::to_string(plan.first) + " " + NameOf(plan.error) + ", " +
               std::to_string(outcome.failures) +
               " times: " + testing::PrintToString(outcome.failed));
  ExpectNothingLeft(descriptors, uid, gid);
  EXPECT_EQ(lseek(bystander, 0, SEEK_END), 0) << "written to a file of the caller's";
  EXPECT_FALSE(threwWrongly) << "an exception came out";
  const int hits = outcome.failures;
  if (!IsFailure(plan.error)) {
    outcome = {outcome.succeeded, outcome.threw, 0, 0, {}, outcome.log};
    ExpectUndisturbed(outcome);
  }
  operation.check(outcome);
  ++runs;
  (IsFailure(plan.error) ? failures : shortTransfers) += hits;
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
