// Texts of a size.

#ifndef KELODRCORE_TESTS_GROWTH_TEXTS_H_
#define KELODRCORE_TESTS_GROWTH_TEXTS_H_

#include <json/json.h>

#include <cstddef>
#include <string>

inline std::string Repeated(size_t count, const std::string& unit) {
  std::string text;
  for (; count > 0; --count) text += unit;
  return text;
}

// All of one width. With a power of two as `count`, all names from 0 on, in no order.
inline std::string Name(size_t i, size_t count) {
  return "name_" + std::to_string(100000 + i * 7919 % count);
}

inline std::string MembersText(size_t count) {
  std::string text = "{";
  for (size_t i = 0; i < count; ++i) {
    text += (i == 0 ? "\"" : ",\n\"") + Name(i, count) + R"(": {"on": true, "size": 1.25})";
  }
  return text + "}";
}

inline Json::Value Members(size_t count) {
  Json::Value members;
  for (size_t i = 0; i < count; ++i) members[Name(i, count)] = "a text";
  return members;
}

#endif  // KELODRCORE_TESTS_GROWTH_TEXTS_H_
