// The library's log lines: one prefix, five levels.
//
// Every line is "FILE:LINE(FUNCTION)[LEVEL][PID]: message", sent with the priority of its level.
// Log readers match on whole lines, so the prefix and the level words stand nowhere else.

#ifndef KELODRCORE_SRC_LOG_H_
#define KELODRCORE_SRC_LOG_H_

#include <syslog.h>
#include <unistd.h>

#define KELODR_PRIORITY_ERR LOG_ERR
#define KELODR_PRIORITY_WARN LOG_WARNING
#define KELODR_PRIORITY_NOTICE LOG_NOTICE
#define KELODR_PRIORITY_INFO LOG_INFO
#define KELODR_PRIORITY_DEBUG LOG_DEBUG

namespace KeloDRCore {

// What stands behind the last slash of `path`.
constexpr const char* BaseName(const char* path) {
  const char* name = path;
  for (; *path != '\0'; ++path) {
    if (*path == '/') name = path + 1;
  }
  return name;
}

}  // namespace KeloDRCore

// The name of the source without its directory. g++ before 12 has no __FILE_NAME__.
#ifdef __FILE_NAME__
#define KELODR_FILE_NAME __FILE_NAME__
#else
#define KELODR_FILE_NAME ::KeloDRCore::BaseName(__FILE__)
#endif

// Logs one line at `level` (ERR, WARN, NOTICE, INFO or DEBUG) in the name of `function`, the public
// operation that the caller called. A message without arguments goes through "%s". syslog is called
// in place: the compiler checks the format, and "%m" sees the caller's errno. "%m" is no part of
// the C++ standard, hence __extension__.
#define KELODR_LOG(level, function, format, ...)                                                \
  __extension__ syslog(KELODR_PRIORITY_##level, "%s:%d(%s)[%s][%d]: " format, KELODR_FILE_NAME, \
                       __LINE__, function, #level, static_cast<int>(getpid()), __VA_ARGS__)

#endif  // KELODRCORE_SRC_LOG_H_
