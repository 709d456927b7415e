// Fails the calls that the library makes to the system, one after the other.
//
// This test binary's own definitions stand before those of the C library, for the library under
// test and for the libraries that it uses alike (fault_calls.cpp). They pass every call on, but for
// the one that is to fail. Only programs that are meant to sweep link them.

#ifndef KELODRCORE_TESTS_FAULT_FAULT_H_
#define KELODRCORE_TESTS_FAULT_FAULT_H_

#include <climits>
#include <functional>
#include <initializer_list>
#include <string>
#include <vector>

#include "support/clean_test.h"

namespace Fault {

// Stands in place of an errno: what fails is memory that operator new, malloc or SQLite asks for.
constexpr int kNoMemory = -1;

// Stand in its place too: a call that moves data to or from a file moves one byte, or a half of
// what it is asked to. That is no failure.
constexpr int kOneByte = -2;
constexpr int kHalf = -3;

// The disk becomes full: the first write of the plan writes a half, the others fail with ENOSPC.
constexpr int kDiskFull = -4;

// Signals without end.
constexpr int kSignals = -5;

constexpr int kOnce = 1;
constexpr int kForGood = INT_MAX;

struct Plan {
  int error;  // only calls that can fail with it count
  int first;  // the number of the first call to fail, from 1
  int times;  // how many calls fail in a row
};

// From now on counts the calls that can fail with `plan.error` and fails those that the plan names.
// The calls of children forked later count too, until Disarm().
void Arm(const Plan& plan);

// The number of calls that failed, so far and when the plan ends.
int Failures();
int Disarm();

// The names of the calls that failed since Arm(), each once, in the order of the first failures.
std::vector<std::string> FailedCalls();

// Whether this call, one that can fail with `errors`, is to fail; errno is set then.
bool Hits(const char* call, std::initializer_list<int> errors);

bool IsSuspended();

// Counts a sleep of the operation's, which takes no time here.
void Wait(long long microseconds);

// Calls made while it lives neither count nor fail.
class Suspension {
 public:
  Suspension();
  ~Suspension();
  Suspension(const Suspension&) = delete;
  Suspension& operator=(const Suspension&) = delete;
};

// What a run came to.
struct Outcome {
  bool succeeded;
  bool threw;  // std::bad_alloc came out
  int error;   // the error of the plan, 0 when nothing was to fail
  int failures;
  std::vector<std::string> failed;  // the calls that failed, see FailedCalls()
  std::vector<LogLine> log;         // everything logged

  // `call` is a name as in the manual page, whatever it is called for large files and late dates.
  bool Failed(const std::string& call) const;
  // Failed, and not just because of a signal, after which most calls are made again.
  bool FailedForGood(const std::string& call) const;
};

struct Operation {
  std::function<void()> prepare;  // makes the state in which the operation begins
  std::function<bool()> run;      // the operation; only its calls fail
  std::function<void(const Outcome&)> check;
};

}  // namespace Fault

// Runs an operation with call 1 failing, then call 2, until no call is left to fail; once and for
// good; with each errno. After each run nothing may be left open, running or raised, the
// operation's own check must hold, and the next run, in which nothing fails, must succeed.
//
// A watchdog ends the program, and says why, when a run lasts longer than a minute or would sleep
// for longer than five: nothing waits for the end of a fault.
class FaultTest : public CleanTest {
 protected:
  void SetUp() override;
  void TearDown() override;

  void SweepCalls(const Fault::Operation& operation);
  void SweepMemory(const Fault::Operation& operation);
  // Moves less than asked, which is to change nothing: result, log and effect. Fills the disk as
  // well.
  void SweepTransfers(const Fault::Operation& operation);
  // One error, `times` calls in a row, from each `stride`-th call on.
  void Sweep(const Fault::Operation& operation, int error, int times, int stride = 1);

  // Whether JsonCpp's own exception may come out where it finds no memory.
  bool mayThrowJsonError = false;

  // Signals without end are a failure at last (posix/retry.h), but only after a million calls: not
  // each call is tried. 0 where there is no such end: SQLite makes its calls again for ever.
  int interruptedStride = 11;

  // How many calls find a lock held "for good"; less where the operation waits for its holder.
  int heldForGood = Fault::kForGood;

 private:
  bool RunFailing(const Fault::Operation& operation, const Fault::Plan& plan);
  void RunUnfailed(const Fault::Operation& operation);
  void ExpectUndisturbed(const Fault::Outcome& outcome) const;

  // An empty file that the test's process happens to have open; nobody may write to it.
  int bystander = -1;
  std::vector<LogLine> undisturbedLog;
};

#endif  // KELODRCORE_TESTS_FAULT_FAULT_H_
