// The one rule for calls that a signal interrupts: they are made again.

#ifndef KELODRCORE_POSIX_RETRY_H_
#define KELODRCORE_POSIX_RETRY_H_

#include <cerrno>
#include <cstdio>
#include <type_traits>

namespace KeloDRCore::Posix {

// Whether a call that has just failed, after so many interruptions, is to be made again. Where they
// do not end, EINTR is a failure like any other: nobody hangs.
inline bool IsInterrupted(int before) {
  constexpr int kMost = 1000000;  // far more than the signals that interrupt any wait
  return errno == EINTR && before < kMost;
}

// Makes a call that answers -1, or null, when it fails, until it does not fail with EINTR.
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
  for (int i = 0; isFailure(result) && IsInterrupted(i); ++i) result = call();
  return result;
}

// getc, which getline and fgets cannot stand in for: they lose what they have read when a signal
// handler returns into them.
inline int GetByte(FILE* stream) {
  int byte = getc(stream);
  for (int i = 0; byte == EOF && ferror(stream) != 0 && IsInterrupted(i); ++i) {
    clearerr(stream);
    byte = getc(stream);
  }
  return byte;
}

}  // namespace KeloDRCore::Posix

#endif  // KELODRCORE_POSIX_RETRY_H_
