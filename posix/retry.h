// The one rule for calls that a signal interrupts: they are made again.

#ifndef KELODRCORE_POSIX_RETRY_H_
#define KELODRCORE_POSIX_RETRY_H_

#include <cerrno>
#include <type_traits>

namespace KeloDRCore::Posix {

// Whether to make a failed call again: it was interrupted, and not `kMost` times before. After that
// EINTR is a failure like any other.
inline bool MustRetry(int before) {
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
  for (int i = 0; isFailure(result) && MustRetry(i); ++i) result = call();
  return result;
}

}  // namespace KeloDRCore::Posix

#endif  // KELODRCORE_POSIX_RETRY_H_
