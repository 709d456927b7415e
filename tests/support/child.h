// Forked children of a test.

#ifndef KELODRCORE_TESTS_SUPPORT_CHILD_H_
#define KELODRCORE_TESTS_SUPPORT_CHILD_H_

#include <sys/types.h>

#include <functional>

// Starts a child that runs `body`. Its exit status is what `body` returns, or 99 when an
// expectation failed in it. SIGALRM kills it after four minutes, so that nobody waits for ever.
pid_t StartChild(const std::function<int()>& body);

// Waits for a child; its wait status.
int JoinChild(pid_t child);

// Runs `body` in a child and returns its wait status: 0 when it returned and no expectation of it
// failed; never 0 when it ended the process itself. Failed expectations of the child are printed by
// the child.
int RunInChild(const std::function<void()>& body);

// A child that runs `body`, which tells whether it could do its part, and then lives until it is
// killed.
class Holder {
 public:
  explicit Holder(const std::function<bool()>& body);
  ~Holder() { Kill(); }
  Holder(const Holder&) = delete;
  Holder& operator=(const Holder&) = delete;

  void Kill();

 private:
  pid_t pid;
};

#endif  // KELODRCORE_TESTS_SUPPORT_CHILD_H_
