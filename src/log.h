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

// Logs one line at `level` (ERR, WARN, NOTICE, INFO or DEBUG) in the name of `function`, the public
// operation that the caller called. A message without arguments goes through "%s". syslog is called
// right here, so that the compiler checks the format and "%m" still sees the caller's errno;
// __extension__ because "%m" is the system's, not the C++ standard's.
#define KELODR_LOG(level, function, format, ...)                                             \
  __extension__ syslog(KELODR_PRIORITY_##level, "%s:%d(%s)[%s][%d]: " format, __FILE_NAME__, \
                       __LINE__, function, #level, static_cast<int>(getpid()), __VA_ARGS__)

#endif  // KELODRCORE_SRC_LOG_H_
