#include "storm/storm.h"

#include <fcntl.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <atomic>
#include <csignal>
#include <cstdio>
#include <ctime>
#include <fstream>
#include <utility>

namespace {

std::function<void(const char*)> logWatcher;
std::atomic<int>& wrong = MakeShared<std::atomic<int>>();
const int messages = fcntl(STDERR_FILENO, F_DUPFD_CLOEXEC, 0);  // for those without streams, too

}  // namespace

// The linker lets this stand before the C library's, for the shared library as well.
extern "C" void syslog(int /*priority*/, const char* format, ...) {
  if (logWatcher) logWatcher(format);
}
extern "C" void __syslog_chk(int /*priority*/, int /*flag*/, const char* format, ...) {
  if (logWatcher) logWatcher(format);
}

void WatchLog(std::function<void(const char* format)> watcher) { logWatcher = std::move(watcher); }

void Expect(bool holds, const std::string& what) {
  constexpr int kMostMessages = 100;
  if (!holds && ++wrong <= kMostMessages) dprintf(messages, "wrong: %s\n", what.c_str());
}

bool IsAllWell() { return wrong == 0; }

Json::Value Numbered(int number) {
  Json::Value document;
  document["first"] = number;
  document["filler"] = std::string(static_cast<size_t>(number % 97) * 41, 'x');
  document["last"] = number;
  return document;
}

bool IsWhole(const Json::Value& document) {
  return document.isObject() && document["first"].isInt() &&
         document == Numbered(document["first"].asInt());
}

std::mt19937 Generator(const Settings& settings, int worker, int life) {
  std::seed_seq seeds{settings.seed, worker, life};
  return std::mt19937(seeds);
}

int Draw(std::mt19937& generator, int below) {
  return std::uniform_int_distribution<int>(0, below - 1)(generator);
}

void SleepMs(int milliseconds) {
  const timespec rest{milliseconds / 1000, static_cast<long>(milliseconds % 1000) * 1000000};
  nanosleep(&rest, nullptr);
}

bool IsAlive(pid_t pid) {
  std::ifstream in("/proc/" + std::to_string(pid) + "/stat");
  std::string text;
  std::getline(in, text);
  const size_t nameEnd = text.rfind(") ");
  return nameEnd != std::string::npos && text[nameEnd + 2] != 'Z' && text[nameEnd + 2] != 'X';
}

Workers::Workers(int count, const Body& work)
    : body(work), pids(static_cast<size_t>(count)), lives(static_cast<size_t>(count)) {
  for (size_t worker = 0; worker < pids.size(); ++worker) Start(worker);
}

void Workers::Start(size_t worker) {
  fflush(nullptr);
  pids[worker] = fork();
  if (pids[worker] != 0) return;
  prctl(PR_SET_PDEATHSIG, SIGKILL);  // a storm that is broken off leaves nobody behind
  body(static_cast<int>(worker), lives[worker]);
  _exit(0);
}

void Workers::Kill(int worker) {
  const pid_t pid = pids[static_cast<size_t>(worker)];
  kill(pid, SIGKILL);
  int status = 0;
  if (waitpid(pid, &status, 0) == pid) Take(pid, status, true);
}

void Workers::Take(pid_t pid, int status, bool restart) {
  const bool wasKilled = WIFSIGNALED(status) && WTERMSIG(status) == SIGKILL;
  Expect(wasKilled || status == 0, "a process ended with status " + std::to_string(status));
  killed += wasKilled;
  for (size_t worker = 0; worker < pids.size(); ++worker) {
    if (pids[worker] != pid || !wasKilled || !restart) continue;
    ++lives[worker];
    Start(worker);
  }
}

void Workers::TakeAll(int options, bool restart) {
  int status = 0;
  for (pid_t pid; (pid = waitpid(-1, &status, options)) > 0;) Take(pid, status, restart);
}

void Workers::Reap() { TakeAll(WNOHANG, true); }

void Workers::Join(bool isKillingOver) { TakeAll(0, !isKillingOver); }
