// The one rule for calls that a signal interrupts: they are made again.

#ifndef KELODRCORE_SRC_RETRY_H_
#define KELODRCORE_SRC_RETRY_H_

#include <cerrno>
#include <cstdio>
#include <type_traits>

namespace KeloDRCore {

// Far more than the signals that interrupt any wait.
constexpr int kMostInterruptions = 1000000;

// Makes a call that answers -1, or null, when it fails, until it does not fail with EINTR. Where
// the interruptions do not end, EINTR is a failure like any other: nobody hangs.
template <typename Call>
auto Retry(Call call) {
  const auto isFailure = [](auto result) {
    if constexpr (std::is_pointer_v<decltype(result)>) {
      return result == nullptr;
    } else {
      return result == -1;
    }
  };
  auto result = call();
  for (int i = 0; i < kMostInterruptions && isFailure(result) && errno == EINTR; ++i) {
    result = call();
  }
  return result;
}

// getc, which getline and fgets cannot stand in for: they lose what they have read when a signal
// handler returns into them.
inline int GetByte(FILE* stream) {
  int byte = getc(stream);
  for (int i = 0; i < kMostInterruptions && byte == EOF; ++i) {
    if (ferror(stream) == 0 || errno != EINTR) break;
    clearerr(stream);
    byte = getc(stream);
  }
  return byte;
}

}  // namespace KeloDRCore

#endif  // KELODRCORE_SRC_RETRY_H_
