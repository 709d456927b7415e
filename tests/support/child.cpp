#include "support/child.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdio>

pid_t StartChild(const std::function<int()>& body) {
  constexpr unsigned int kLongest = 240;  // seconds
  fflush(nullptr);
  const pid_t child = fork();
  if (child != 0) return child;
  alarm(kLongest);
  const int status = body();
  fflush(nullptr);
  _exit(testing::Test::HasFailure() ? 99 : status);
}

int JoinChild(pid_t child) {
  int status = -1;
  while (waitpid(child, &status, 0) < 0 && errno == EINTR) {
  }
  return status;
}

int RunInChild(const std::function<void()>& body) {
  constexpr int kPassed = 96;  // a body that ends its process itself cannot pass by chance
  constexpr int kEndedEarly = 97;
  const int status = JoinChild(StartChild([&] {
    body();
    return kPassed;
  }));
  if (status == W_EXITCODE(kPassed, 0)) return 0;
  return status == 0 ? W_EXITCODE(kEndedEarly, 0) : status;
}

Holder::Holder(const std::function<bool()>& body) {
  int ready[2];
  EXPECT_EQ(pipe2(ready, O_CLOEXEC), 0);
  pid = StartChild([&] {
    const char answer = body() ? 'y' : 'n';
    if (write(ready[1], &answer, 1) != 1) return 1;
    while (true) pause();
  });
  close(ready[1]);
  char answer = 0;
  EXPECT_EQ(read(ready[0], &answer, 1), 1);
  EXPECT_EQ(answer, 'y') << "the child could not do its part";
  close(ready[0]);
}

void Holder::Kill() {
  if (pid <= 0) return;
  kill(pid, SIGKILL);
  JoinChild(pid);
  pid = -1;
}
