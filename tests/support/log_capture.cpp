#include "support/log_capture.h"

#include <fcntl.h>
#include <syslog.h>
#include <unistd.h>

#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <iterator>
#include <memory>
#include <mutex>
#include <ostream>
#include <regex>
#include <tuple>

namespace {

std::mutex mutex;
std::vector<LogLine> lines;
std::string mirrorPath;
thread_local bool recording = false;

struct RecordingScope {
  RecordingScope() { recording = true; }
  ~RecordingScope() { recording = false; }
};

LogLine Parse(int priority, const std::string& text, const std::string& pid) {
  static const std::regex common(R"(^([^:\s]+):[1-9]\d*\((\w*|~\w+)\)\[(\w+)\]\[(\d+)\]: )");
  static const std::regex bracket(R"(^([^:\s]+):[1-9]\d* )");
  std::smatch match;
  // The prefix is searched in a bounded head: std::regex recurses a stack frame a byte.
  const std::string head = text.substr(0, 300);
  if (std::regex_search(head, match, common) && match[4] == pid) {
    return {priority, match[3], match[1], match[2], text.substr(size_t(match.length(0)))};
  }
  if (std::regex_search(head, match, bracket)) {
    return {priority, "", "", "", match[1].str() + " " + text.substr(size_t(match.length(0)))};
  }
  return {priority, "", "", "", text};
}

void Mirror(int priority, const std::string& text) {
  // Fields and records end in bytes that no log text holds.
  const std::string record =
      std::to_string(priority) + '\x1f' + std::to_string(getpid()) + '\x1f' + text + '\x1e';
  const int fd = open(mirrorPath.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0666);
  if (fd >= 0) {
    if (write(fd, record.data(), record.size()) != ssize_t(record.size())) abort();
    close(fd);
  }
}

const bool isOrdinaryUser = geteuid() != 0;

// Every privilege bracket of an ordinary user logs that it is refused, for another reason in a user
// namespace. Tests that begin as root and look at that themselves see it.
bool IsRefusalToOrdinaryUser(int priority, const std::string& text) {
  return isOrdinaryUser && priority == (LOG_AUTH | LOG_ERR) &&
         (text.find(" ERROR: setres") != std::string::npos ||
          text.find(" ERROR: ENTERCriticalSection") != std::string::npos);
}

void Record(int priority, const char* format, va_list arguments) {
  const int savedErrno = errno;
  const RecordingScope scope;
  char* text = nullptr;
  errno = savedErrno;  // for "%m"
  if (vasprintf(&text, format, arguments) < 0) abort();
  const std::unique_ptr<char, void (*)(void*)> owner(text, free);
  if (!IsRefusalToOrdinaryUser(priority, text)) {
    const std::lock_guard<std::mutex> guard(mutex);
    lines.push_back(Parse(priority, text, std::to_string(getpid())));
    if (!mirrorPath.empty()) Mirror(priority, text);
  }
  errno = savedErrno;
}

LogLine Line(int priority, const char* word, const std::string& file, const std::string& function,
             const std::string& message) {
  return {priority, word, file, function, message};
}

}  // namespace

// The linker lets these stand before the C library's, for the shared library as well.
extern "C" {

void syslog(int priority, const char* format, ...) {
  va_list arguments;
  va_start(arguments, format);
  Record(priority, format, arguments);
  va_end(arguments);
}

// What syslog is called under _FORTIFY_SOURCE.
void __syslog_chk(int priority, int /*flag*/, const char* format, ...) {
  va_list arguments;
  va_start(arguments, format);
  Record(priority, format, arguments);
  va_end(arguments);
}

}  // extern "C"

bool LogLine::operator==(const LogLine& other) const {
  return std::tie(priority, word, file, function, message) ==
         std::tie(other.priority, other.word, other.file, other.function, other.message);
}

std::ostream& operator<<(std::ostream& out, const LogLine& line) {
  return out << "{" << line.priority << " " << line.file << "(" << line.function << ")["
             << line.word << "]: " << line.message << "}";
}

LogLine Err(const std::string& file, const std::string& function, const std::string& message) {
  return Line(LOG_ERR, "ERR", file, function, message);
}
LogLine Warn(const std::string& file, const std::string& function, const std::string& message) {
  return Line(LOG_WARNING, "WARN", file, function, message);
}
LogLine Notice(const std::string& file, const std::string& function, const std::string& message) {
  return Line(LOG_NOTICE, "NOTICE", file, function, message);
}
LogLine Info(const std::string& file, const std::string& function, const std::string& message) {
  return Line(LOG_INFO, "INFO", file, function, message);
}
LogLine Debug(const std::string& file, const std::string& function, const std::string& message) {
  return Line(LOG_DEBUG, "DEBUG", file, function, message);
}

LogLine Auth(int priority, const std::string& text) { return {priority, "", "", "", text}; }

namespace LogCapture {

std::vector<LogLine> Take() {
  const std::lock_guard<std::mutex> guard(mutex);
  std::vector<LogLine> taken;
  taken.swap(lines);
  return taken;
}

void Clear() { Take(); }

bool IsRecording() { return recording; }

void MirrorTo(const std::string& path) {
  const std::lock_guard<std::mutex> guard(mutex);
  mirrorPath = path;
}

std::vector<LogLine> ReadMirror(const std::string& path) {
  std::ifstream in(path, std::ios::binary);
  std::vector<LogLine> result;
  std::string record;
  while (std::getline(in, record, '\x1e')) {
    const size_t first = record.find('\x1f');
    const size_t second = record.find('\x1f', first + 1);
    result.push_back(Parse(std::stoi(record.substr(0, first)), record.substr(second + 1),
                           record.substr(first + 1, second - first - 1)));
  }
  return result;
}

}  // namespace LogCapture
