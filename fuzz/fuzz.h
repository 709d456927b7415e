// What the fuzz targets share.

#ifndef KELODRCORE_FUZZ_FUZZ_H_
#define KELODRCORE_FUZZ_FUZZ_H_

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <string>

// Ends the program, which libFuzzer reports with the input, when a promise is broken.
inline void Require(bool holds, const char* promise) {
  if (holds) return;
  fprintf(stderr, "broken promise: %s\n", promise);
  abort();
}

// Hands an input out piece by piece.
class Input {
 public:
  Input(const uint8_t* data, size_t size) : at(data), end(data + size) {}

  bool IsEmpty() const { return at == end; }

  uint8_t Byte() { return at != end ? *at++ : 0; }

  // Up to 255 bytes: a length, then the bytes.
  std::string Text() {
    size_t length = Byte();
    const size_t left = size_t(end - at);
    if (length > left) length = left;
    std::string text(reinterpret_cast<const char*>(at), length);
    at += length;
    return text;
  }

  std::string Rest() {
    std::string text(reinterpret_cast<const char*>(at), size_t(end - at));
    at = end;
    return text;
  }

  template <typename Integer>
  Integer Number() {
    uint64_t bits = 0;
    for (size_t i = 0; i < sizeof(Integer); ++i) bits = bits << 8 | Byte();
    return static_cast<Integer>(bits);
  }

 private:
  const uint8_t* at;
  const uint8_t* end;
};

#endif  // KELODRCORE_FUZZ_FUZZ_H_
