#include "tasks.h"

#include <fcntl.h>
#include <kelodrcore/err.h>
#include <kelodrcore/file.h>
#include <kelodrcore/file_lock.h>
#include <kelodrcore/json_value.h>
#include <kelodrcore/utils.h>
#include <sys/file.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <filesystem>

#include "paths.h"

namespace drctl {

using namespace KeloDRCore;

namespace {

// Ids come from outside: what is not made like one of ours never becomes a path.
bool IsUuid(const std::string& text) {
  return text.size() == 36 && text.find_first_not_of("0123456789abcdef-") == std::string::npos;
}

// The caller's streams stay with the caller, who may wait for their end.
void LeaveStreams() {
  const int null = open("/dev/null", O_RDWR | O_CLOEXEC);
  for (int fd = STDIN_FILENO; fd <= STDERR_FILENO; ++fd) dup2(null, fd);
}

void RemoveLock(const std::string& stateFile) {
  unlink(FileLock::getLockFilePath(stateFile).c_str());
}

// Runs `body` in a process without a parent to wait for it; false when that could not be started.
bool RunDetached(const std::function<void()>& body) {
  const pid_t between = fork();
  if (between < 0) return false;
  if (between == 0) {
    setsid();
    const pid_t child = fork();
    if (child == 0) {
      LeaveStreams();
      body();
    }
    _exit(child < 0 ? 1 : 0);
  }
  int status = 0;
  while (waitpid(between, &status, 0) < 0 && errno == EINTR) {
  }
  return status == 0;
}

}  // namespace

Tasks::Tasks(const std::string& stateDir) : dir(AbsolutePath(stateDir)) {}

std::string Tasks::StateFile(const std::string& id) const { return dir + "/" + id + ".json"; }

// In one step, so that a poll never reads half of it.
bool Tasks::WriteState(const std::string& id, TaskState state) const {
  Json::Value document;
  document["finish"] = state != TaskState::kRunning;
  document["success"] = state == TaskState::kSucceeded;
  return JsonValue::toFile(document, StateFile(id));
}

TaskState Tasks::ReadState(const std::string& id) const {
  Json::Value document;
  if (!IsUuid(id) || !File::Read(StateFile(id), document) || !document.isObject()) {
    return TaskState::kUnknown;
  }
  if (document["finish"] != true) return TaskState::kRunning;
  return document["success"] == true ? TaskState::kSucceeded : TaskState::kFailed;
}

void Tasks::ForgetOld() const {
  const auto yesterday = std::filesystem::file_time_type::clock::now() - std::chrono::hours(24);
  std::error_code ignored;  // a file that another process has just removed
  for (const auto& entry : std::filesystem::directory_iterator(dir, ignored)) {
    if (entry.last_write_time(ignored) >= yesterday || ignored) continue;
    std::filesystem::remove(entry.path(), ignored);
    RemoveLock(entry.path());  // it is there still where the task's process was killed
  }
}

// The task's process holds a lock for as long as it lives. This process takes it, so that it is
// held from the first poll on, and passes it on through the fork.
Started Tasks::Start(const std::function<bool()>& work) {
  const std::string id = GenerateUUID();
  if (!IsUuid(id)) return {"", ERR::ERR_UNKNOWN, "/usr/bin/uuidgen gives no id"};
  if (!File::CreateDir(dir, 0700)) {
    return {"", ERR::ERR_UNKNOWN, "the directory " + dir + " cannot be made"};
  }
  ForgetOld();
  FileLock life(StateFile(id));
  if (!life.lock(LOCK_EX | LOCK_NB, 5)) {
    return {"", ERR::ERR_UNKNOWN, "the lock of the task cannot be taken"};
  }
  if (!WriteState(id, TaskState::kRunning)) {
    return {"", ERR::ERR_UNKNOWN, "the file " + StateFile(id) + " cannot be written"};
  }
  const bool isStarted = RunDetached([&] {
    WriteState(id, work() ? TaskState::kSucceeded : TaskState::kFailed);
    RemoveLock(StateFile(id));
  });
  if (isStarted) return {id, 0, ""};
  unlink(StateFile(id).c_str());
  return {"", ERR::ERR_FORK_FAILED, "no process can be started"};
}

TaskState Tasks::Poll(const std::string& id) const {
  if (ReadState(id) != TaskState::kRunning) return ReadState(id);
  if (!FileLock(StateFile(id)).tryLock(LOCK_SH | LOCK_NB)) return TaskState::kRunning;
  // Nobody works on it any more; it may have come to its end just before.
  return ReadState(id) == TaskState::kSucceeded ? TaskState::kSucceeded : TaskState::kFailed;
}

}  // namespace drctl
