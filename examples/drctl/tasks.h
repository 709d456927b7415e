// Background tasks of the web API: each has an id and a JSON file that tells how far it is.

#ifndef DRCTL_TASKS_H_
#define DRCTL_TASKS_H_

#include <functional>
#include <string>

namespace drctl {

enum class TaskState { kUnknown, kRunning, kSucceeded, kFailed };

// What became of the start of a task: its id, or an empty one with a code of `ERR` and the reason.
struct Started {
  std::string id;
  int code = 0;
  std::string reason;
};

class Tasks {
 public:
  // `stateDir` is where the files are; created with the first task.
  explicit Tasks(const std::string& stateDir);

  // Runs `work` in a process of its own, which outlives this one and shares none of its streams.
  // Forgets tasks of yesterday.
  Started Start(const std::function<bool()>& work);

  // A task whose process died before its end has failed. Unknown for an id that Start never gave.
  TaskState Poll(const std::string& id) const;

 private:
  void ForgetOld() const;
  std::string StateFile(const std::string& id) const;
  bool WriteState(const std::string& id, TaskState state) const;
  TaskState ReadState(const std::string& id) const;

  std::string dir;
};

}  // namespace drctl

#endif  // DRCTL_TASKS_H_
