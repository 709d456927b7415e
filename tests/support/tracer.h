// Processes under ptrace: watched, or killed at any one of their system calls.

#ifndef KELODRCORE_TESTS_SUPPORT_TRACER_H_
#define KELODRCORE_TESTS_SUPPORT_TRACER_H_

#include <functional>
#include <ostream>
#include <string>
#include <vector>

namespace Tracer {

// An instant in the life of a forked child and of all processes that it leads to: right before a
// system call of one of them. The child is number 0 and the others follow in the order of their
// births; each one's calls count from 0. What a process did to the outside changes with its calls
// only, so that these are all the instants at which a kill makes a difference.
struct Moment {
  int process = 0;
  int call = 0;
};

std::ostream& operator<<(std::ostream& out, const Moment& moment);

// Runs `body` in a forked child, kills one process at `moment`, and returns when all of them have
// ended. False when nobody was killed: there is no such process, or it made fewer calls. The caller
// must have no other children.
bool KilledAt(const Moment& moment, const std::function<void()>& body);

// Kills `body` at each of its moments in turn: the calls of process 0, then those of process 1, and
// so on. `prepare` runs before each run and `check` after each kill. Returns how many kills there
// were of each process.
std::vector<int> Sweep(const std::function<void()>& prepare, const std::function<void()>& body,
                       const std::function<void(const Moment&)>& check);

// What `body` does to the files below `directory`, in order, named from there: "create a",
// "write a", "mode a", "owner a", "cut a", "sync a", "rename a b", "remove a". The directory itself
// is ".".
std::vector<std::string> FileCalls(const std::string& directory, const std::function<void()>& body);

// Runs `body` in a forked child, where from its `first`-th read or write of a file below
// `directory` on each moves one byte only, as the kernel may; those that the C library makes for
// its streams are among them. Returns how many were cut so.
int CutTransfers(const std::string& directory, int first, const std::function<void()>& body);

}  // namespace Tracer

#endif  // KELODRCORE_TESTS_SUPPORT_TRACER_H_
