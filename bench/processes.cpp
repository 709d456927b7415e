#include "processes.h"

#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <vector>

#include "support.h"

namespace bench {
namespace {

struct Pipe {
  Pipe() { Require(pipe(ends) == 0, "no pipe"); }
  ~Pipe() {
    CloseReader();
    CloseWriter();
  }
  Pipe(const Pipe&) = delete;
  Pipe& operator=(const Pipe&) = delete;

  void CloseReader() { Close(ends[0]); }
  void CloseWriter() { Close(ends[1]); }
  static void Close(int& fd) {
    if (fd >= 0) close(fd);
    fd = -1;
  }

  int ends[2];
};

void Wait(pid_t child) {
  int status = 0;
  Require(waitpid(child, &status, 0) == child && status == 0, "a child process has failed");
}

}  // namespace

double NumberFromChild(const std::function<double()>& work) {
  Pipe result;
  const pid_t child = fork();
  Require(child >= 0, "no child process");
  if (child == 0) {
    const double number = work();
    _exit(write(result.ends[1], &number, sizeof(number)) == sizeof(number) ? 0 : 1);
  }
  double number = 0;
  Require(read(result.ends[0], &number, sizeof(number)) == sizeof(number), "no number");
  Wait(child);
  return number;
}

double SecondsOfCrowd(int count, const std::function<std::function<void()>()>& prepare) {
  Pipe ready;
  Pipe go;
  std::vector<pid_t> children;
  for (int i = 0; i < count; ++i) {
    children.push_back(fork());
    Require(children.back() >= 0, "no child process");
    if (children.back() == 0) {
      go.CloseWriter();
      const std::function<void()> work = prepare();
      char byte = 0;
      if (write(ready.ends[1], &byte, 1) != 1 || read(go.ends[0], &byte, 1) != 0) _exit(1);
      work();
      _exit(0);
    }
  }
  for (char byte = 0; count > 0; --count) {
    Require(read(ready.ends[0], &byte, 1) == 1, "a child process is not ready");
  }
  const auto begin = std::chrono::steady_clock::now();
  go.CloseWriter();  // the end of file lets all of them go
  for (const pid_t child : children) Wait(child);
  return std::chrono::duration<double>(std::chrono::steady_clock::now() - begin).count();
}

}  // namespace bench
