// Random JSON documents, the same ones for the same seed.

#ifndef KELODRCORE_TESTS_UNIT_RANDOM_JSON_H_
#define KELODRCORE_TESTS_UNIT_RANDOM_JSON_H_

#include <json/json.h>

#include <cstdint>
#include <random>
#include <string>

class RandomJson {
 public:
  explicit RandomJson(unsigned seed) : generator(seed) {}

  // A value of any type, with at most `depth` levels of arrays and objects.
  Json::Value Value(int depth);
  Json::Value Array(int depth);
  Json::Value Object(int depth);

  // Any finite number.
  double Double();
  // Bytes of all values.
  std::string Text();
  // A number from 0 to `limit` - 1.
  unsigned Below(unsigned limit) { return static_cast<unsigned>(generator() % limit); }

 private:
  uint64_t Bits() { return generator(); }

  std::mt19937_64 generator;
};

#endif  // KELODRCORE_TESTS_UNIT_RANDOM_JSON_H_
