#include "drctl/program.h"

#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <cstdlib>

#include "support/clean_test.h"

namespace {

void Redirect(const std::string& path, int flags, int target) {
  const int fd = open(path.c_str(), flags, 0600);
  if (fd < 0 || dup2(fd, target) < 0) _exit(126);
  close(fd);
}

[[noreturn]] void Become(const std::vector<std::string>& arguments, const std::string& streams,
                         const std::vector<std::string>& environment) {
  Redirect(streams + ".in", O_RDONLY, STDIN_FILENO);
  Redirect(streams + ".out", O_WRONLY | O_CREAT | O_TRUNC, STDOUT_FILENO);
  Redirect(streams + ".err", O_WRONLY | O_CREAT | O_TRUNC, STDERR_FILENO);
  for (const std::string& variable : environment) putenv(const_cast<char*>(variable.c_str()));
  std::vector<char*> argv;
  for (const std::string& argument : arguments) argv.push_back(const_cast<char*>(argument.c_str()));
  argv.push_back(nullptr);
  execv(argv[0], argv.data());
  _exit(127);
}

std::string TakeText(const std::string& path) {
  const std::string text = ReadText(path);
  unlink(path.c_str());
  return text;
}

}  // namespace

Outcome RunProgram(const std::string& dir, const std::vector<std::string>& arguments,
                   const std::string& input, const std::vector<std::string>& environment) {
  static std::atomic<int> runs{0};
  const std::string streams =
      dir + "/.run-" + std::to_string(getpid()) + "-" + std::to_string(++runs);
  WriteText(streams + ".in", input);
  const int status =
      JoinChild(StartChild([&]() -> int { Become(arguments, streams, environment); }));
  unlink((streams + ".in").c_str());
  return {WIFEXITED(status) ? WEXITSTATUS(status) : -1, TakeText(streams + ".out"),
          TakeText(streams + ".err")};
}
