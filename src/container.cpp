#include "kelodrcore/container.h"

#include <cmath>

namespace KeloDRCore::Container {
namespace {

void Append(std::string& text, const std::string& element) { text += element; }

void Append(std::string& text, int element) { text += static_cast<char>(element); }

void Append(std::string& text, bool element) { text += static_cast<char>(element); }

// The cast of a double that does not fit is undefined, so the value is brought into range first.
void Append(std::string& text, double element) {
  const double byte = std::isfinite(element) ? std::fmod(std::trunc(element), 256.0) : 0.0;
  text += static_cast<char>(static_cast<int>(byte));
}

}  // namespace

template <typename T>
Json::Value ToJsonArray(const std::vector<T>& values) {
  Json::Value array(Json::arrayValue);
  for (const T& element : values) array.append(Json::Value(element));
  return array;
}

template <typename T>
std::string ToString(const std::vector<T>& values, const std::string& separator) {
  std::string text;
  // By value or by reference as the vector hands it out: vector<bool> has no references.
  for (auto&& element : values) {
    if (!text.empty()) text += separator;
    Append(text, element);
  }
  return text;
}

template KELODR_EXPORT Json::Value ToJsonArray(const std::vector<std::string>& values);
template KELODR_EXPORT Json::Value ToJsonArray(const std::vector<int>& values);
template KELODR_EXPORT Json::Value ToJsonArray(const std::vector<bool>& values);
template KELODR_EXPORT Json::Value ToJsonArray(const std::vector<double>& values);

template KELODR_EXPORT std::string ToString(const std::vector<std::string>& values,
                                            const std::string& separator);
template KELODR_EXPORT std::string ToString(const std::vector<int>& values,
                                            const std::string& separator);
template KELODR_EXPORT std::string ToString(const std::vector<bool>& values,
                                            const std::string& separator);
template KELODR_EXPORT std::string ToString(const std::vector<double>& values,
                                            const std::string& separator);

}  // namespace KeloDRCore::Container
