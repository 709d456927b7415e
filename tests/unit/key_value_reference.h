// What a key=value file means, told with the standard library's extraction alone: a stream a token.

#ifndef KELODRCORE_TESTS_UNIT_KEY_VALUE_REFERENCE_H_
#define KELODRCORE_TESTS_UNIT_KEY_VALUE_REFERENCE_H_

#include <locale>
#include <map>
#include <sstream>
#include <string>

template <typename V>
V Extracted(const std::string& text) {
  std::istringstream stream(text);
  stream.imbue(std::locale::classic());
  V value{};
  stream >> value;
  return value;
}

// The entries of the file with this text.
template <typename V>
std::map<std::string, V> Reference(const std::string& text) {
  std::map<std::string, V> map;
  std::istringstream lines(text);
  for (std::string line; std::getline(lines, line);) {
    const size_t separator = line.find('=');
    if (separator == std::string::npos || separator == 0 || separator + 1 == line.size()) continue;
    map[Extracted<std::string>(line.substr(0, separator))] =
        Extracted<V>(line.substr(separator + 1));
  }
  return map;
}

#endif  // KELODRCORE_TESTS_UNIT_KEY_VALUE_REFERENCE_H_
