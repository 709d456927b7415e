#include <kelodrcore/file.h>
#include <kelodrcore/file_lock.h>
#include <kelodrcore/json_value.h>
#include <sys/file.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <iostream>

using namespace KeloDRCore;

constexpr int kProcesses = 4;
constexpr int kRounds = 5;
constexpr unsigned int kTimeoutSeconds = 60;

// Reads the count, adds one and writes it back. Without the lock two processes could read the same
// number, and one of them would have counted for nothing.
bool Count(const std::string& file) {
  FileLock lock(file + ".lock");
  if (!lock.lock(LOCK_EX | LOCK_NB, kTimeoutSeconds)) return false;
  Json::Value document;
  if (!File::Read(file, document)) return false;  // the first process finds no file: that is a 0
  document["count"] = document["count"].asInt() + 1;
  return JsonValue::toFile(document, file);
}  // the destructor releases the lock

int main() {
  // An absolute path: whoever counts in this file takes the same lock, from wherever it runs.
  const std::string file = std::filesystem::absolute("counter.json").string();
  for (int process = 0; process < kProcesses; ++process) {
    const pid_t child = fork();
    if (child < 0) return 1;
    if (child > 0) continue;
    for (int round = 0; round < kRounds; ++round) {
      if (!Count(file)) _exit(1);
    }
    _exit(0);
  }
  for (int status = 0; wait(&status) > 0;) {
    if (status != 0) return 1;
  }
  Json::Value document;
  if (!JsonValue::fromFile(document, file)) return 1;
  std::cout << kProcesses << " processes, " << kRounds << " rounds: " << document["count"] << '\n';
}
