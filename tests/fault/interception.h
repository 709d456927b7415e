// Steps in before one call that the library makes to the system: another process that comes between
// two calls, or a call that fails where no other one does. For programs that link fault_calls.cpp.

#ifndef KELODRCORE_TESTS_FAULT_INTERCEPTION_H_
#define KELODRCORE_TESTS_FAULT_INTERCEPTION_H_

#include <functional>
#include <string>
#include <string_view>

namespace Fault {

// Lets the call go on.
constexpr int kGoOn = 0;

// Stands in place of an errno: a call that moves data moves nothing, which is no failure to it.
constexpr int kMoveNothing = -1;

// While it lives, `action` runs before the `number`-th call of `call`, counted from 1 since it was
// made; that call then fails with the errno that `action` answered, unless that is kGoOn. `call` is
// the name in the manual page, whatever it is called for large files and late dates. What `action`
// itself calls is not counted. A child forked meanwhile goes on with a count of its own.
class Interception {
 public:
  Interception(std::string call, int number, std::function<int()> action);
  // The call fails with `error`, nothing else happens.
  Interception(std::string call, int number, int error);
  ~Interception();
  Interception(const Interception&) = delete;
  Interception& operator=(const Interception&) = delete;

  // Whether the call has come, in this process.
  bool HasRun() const { return number <= 0; }

 private:
  friend bool Intercepts(std::string_view call);

  const std::string call;
  int number;  // how many calls are still to come, this one included
  const std::function<int()> action;
};

// "fstatat64" and "__fstatat64_time64" are "fstatat".
std::string_view PlainName(std::string_view name);

// Runs the action that waits for this call, if any. Whether the call is to fail; errno is set then.
bool Intercepts(std::string_view call);

}  // namespace Fault

#endif  // KELODRCORE_TESTS_FAULT_INTERCEPTION_H_
