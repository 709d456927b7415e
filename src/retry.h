// The one rule for calls that a signal interrupts: they are made again.

#ifndef KELODRCORE_SRC_RETRY_H_
#define KELODRCORE_SRC_RETRY_H_

#include <cerrno>
#include <type_traits>

namespace KeloDRCore {

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
  while (isFailure(result) && errno == EINTR) result = call();
  return result;
}

}  // namespace KeloDRCore

#endif  // KELODRCORE_SRC_RETRY_H_
