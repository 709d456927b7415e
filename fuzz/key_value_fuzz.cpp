// Any bytes as a key=value file, against a reader made of the standard library's extraction alone.

#include <kelodrcore/file.h>
#include <sys/mman.h>
#include <unistd.h>

#include <map>

#include "fuzz.h"
#include "unit/key_value_reference.h"

namespace {

namespace File = KeloDRCore::File;

// A NaN is equal to nothing.
template <typename V>
bool IsSame(const V& one, const V& other) {
  return one == other || (one != one && other != other);
}

template <typename V>
void Check(const std::string& path, const std::string& text) {
  std::map<std::string, V> map;
  const int count = File::Read(path, map);
  const std::map<std::string, V> expected = Reference<V>(text);
  Require(count == int(expected.size()) && map.size() == expected.size(),
          "the entries are counted");
  auto other = expected.begin();
  for (const auto& [key, value] : map) {
    Require(key == other->first, "keys are those of formatted extraction");
    Require(IsSame(value, other->second), "values are those of formatted extraction");
    ++other;
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  static const int fd = memfd_create("fuzz", MFD_CLOEXEC);
  static const std::string path = "/proc/self/fd/" + std::to_string(fd);
  const std::string text = FuzzedDataProvider(data, size).ConsumeRemainingBytesAsString();
  Require(ftruncate(fd, 0) == 0 && pwrite(fd, text.data(), size, 0) == ssize_t(size),
          "the file is there");
  Check<std::string>(path, text);
  Check<int>(path, text);
  Check<double>(path, text);
  return 0;
}
