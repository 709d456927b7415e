// Records the library's log lines: this test binary's own syslog stands before the C library's.

#ifndef KELODRCORE_TESTS_SUPPORT_LOG_CAPTURE_H_
#define KELODRCORE_TESTS_SUPPORT_LOG_CAPTURE_H_

#include <iosfwd>
#include <string>
#include <vector>

// One line as it was sent to the system log: everything but the source line and the pid, which the
// capture checks itself (a number above 0, and the pid of the sending process).
struct LogLine {
  int priority;
  std::string word;
  std::string file;
  std::string function;
  std::string message;  // the whole text, should it not have the common prefix

  bool operator==(const LogLine& other) const;
};

std::ostream& operator<<(std::ostream& out, const LogLine& line);

// A whole expected line at the priority of its level word.
LogLine Err(const std::string& file, const std::string& function, const std::string& message);
LogLine Warn(const std::string& file, const std::string& function, const std::string& message);
LogLine Notice(const std::string& file, const std::string& function, const std::string& message);
LogLine Info(const std::string& file, const std::string& function, const std::string& message);
LogLine Debug(const std::string& file, const std::string& function, const std::string& message);

// A line without the common prefix, as the privilege bracket writes them: "FILE:LINE message" with
// the source line taken out, so that it reads "FILE message".
LogLine Auth(int priority, const std::string& text);

namespace LogCapture {

// The lines since the last call of this process or Clear(), oldest first; a forked child inherits
// what its parent had and sends nothing back. What the privilege bracket logs of an ordinary user
// is left out.
std::vector<LogLine> Take();

void Clear();

// Whether this thread is inside the capture: what it calls there is not the library's doing.
bool IsRecording();

// Also appends every line that this process and its children send to `path`, each as one write, for
// tests that look at other processes; an empty path stops it.
void MirrorTo(const std::string& path);

// The lines of a mirror file.
std::vector<LogLine> ReadMirror(const std::string& path);

}  // namespace LogCapture

#endif  // KELODRCORE_TESTS_SUPPORT_LOG_CAPTURE_H_
