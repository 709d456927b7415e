// Names of error codes, vectors as text and as JSON, and random pauses.

#ifndef KELODRCORE_TESTS_MODEL_BASICS_H_
#define KELODRCORE_TESTS_MODEL_BASICS_H_

#include <map>
#include <string>
#include <vector>

#include "kelodrcore/container.h"
#include "kelodrcore/err.h"
#include "kelodrcore/utils.h"
#include "model/twin.h"

namespace Model {

inline std::string NameOf(int code) {
  static const std::map<int, std::vector<std::string>> bands = {
      {400,
       {"ERR_DR_MIN", "BAD_PARAMETER", "ERR_ALLOCATE_MEMORY", "ERR_NULL_POINTER",
        "ERR_DATABASE_OPERATION", "ERR_DATABASE_LOCK", "ERR_FORK_FAILED", "ERR_UNKNOWN"}},
      {500,
       {"ERR_CONNECTION_FAILED",
        "ERR_LOGIN_AUTH_INVALID",
        "ERR_LOGIN_AUTH_DISABLED",
        "ERR_LOGIN_AUTH_PRIVILEGE",
        "ERR_LOGIN_AUTH_REQUIRED_OTP",
        "ERR_LOGIN_AUTH_INVALID_OTP",
        "ERR_INIT_CREDENTIAL",
        "ERR_NODE_NOT_EXIST",
        "ERR_NODE_EXIST",
        "ERR_NODE_INVALID_REMOTE_SESSION_CREATE",
        "ERR_NODE_CREATE",
        "ERR_NODE_SESSION_CREATE",
        "ERR_NODE_SESSION_REMOVE",
        "ERR_NODE_GET",
        "ERR_NODE_SET",
        "ERR_NODE_LIST",
        "ERR_CRED_NOT_EXIST",
        "ERR_INVALID_CONN",
        "ERR_NOT_SAME_NODE",
        "ERR_GET_NODE_INFO",
        "ERR_INVALID_SENDER",
        "ERR_INVALID_SESSION",
        "ERR_NOT_AVALIABLE_CONN",
        "ERR_LOGIN_AUTH",
        "ERR_CREDENTIAL_OPERATION",
        "ERR_NO_PERMISSION",
        "ERR_NO_SUCH_API",
        "ERR_INVALID_USER",
        "ERR_SESSION_GET"}},
      {599, {"ERR_NODE_UNKNOWN"}},
      {673, {"ERR_DR_MAX"}}};
  for (const auto& [first, names] : bands) {
    if (code >= first && code < first + static_cast<int>(names.size()))
      return names[size_t(code - first)];
  }
  return "<UNKNOWN ERR CODE>";
}

// The character that an element adds to a text; a text adds itself.
inline std::string Contribution(const std::string& text) { return text; }
inline std::string Contribution(int number) {
  return std::string(1, static_cast<char>(number % 256));
}
inline std::string Contribution(bool truth) { return std::string(1, truth ? '\1' : '\0'); }
inline std::string Contribution(double number) { return Contribution(static_cast<int>(number)); }

template <typename T>
std::string ToString(const std::vector<T>& values, const std::string& separator) {
  std::string text;
  for (const T& value : values) text += (text.empty() ? "" : separator) + Contribution(value);
  return text;
}

template <typename T>
Json::Value ToJsonArray(const std::vector<T>& values) {
  Json::Value array = Json::arrayValue;
  for (const T& value : values) array.append(value);
  return array;
}

inline bool Sleep(unsigned int min, unsigned int max) {
  if (min == 0 || max == 0 || min >= max) {
    Trace::Log(Err, "utils.cpp", "RandomSleepInMSec", "Invalid period [%u - %u] to sleep", min,
               max);
    return false;
  }
  Trace::Add("pause of 1000 to 2000 ms");
  return true;
}

}  // namespace Model

class Basics {
 public:
  static void Step() {
    static const std::vector<unsigned int> bounds = {0, 1000, 1001, 1500, 1999, 2000};
    const auto number = [] { return static_cast<int>(Draw::Below(2000)) - 1000; };
    switch (Draw::Below(6)) {
      case 0:
        return OfCode(static_cast<int>(Draw::Below(320)) + 380);
      case 1:
        return OfVector<std::string>(Draw::Text);
      case 2:
        return OfVector<int>(number);
      case 3:
        return OfVector<bool>([] { return Draw::Once(2); });
      case 4:
        return OfVector<double>([&] { return number() / 8.0; });
      default:
        return OfPause(Draw::Of(bounds), Draw::Of(bounds));
    }
  }

 private:
  static void OfCode(int code) {
    Do("ERR::ToString", [&](auto /*side*/) {
      std::string names;
      for (int i = code; i < code + 20; ++i) {
        names += (Trace::IsModel() ? Model::NameOf(i) : KeloDRCore::ERR::ToString(i)) + " ";
      }
      return names;
    });
  }

  template <typename T, typename DrawOne>
  static void OfVector(const DrawOne& drawOne) {
    std::vector<T> values;
    for (size_t i = Draw::Below(4); i > 0; --i) values.push_back(drawOne());
    const std::string separator = Draw::Text();
    Do("a vector", [&](auto /*side*/) {
      return Trace::IsModel() ? Show(Model::ToString(values, separator), Model::ToJsonArray(values))
                              : Show(KeloDRCore::Container::ToString(values, separator),
                                     KeloDRCore::Container::ToJsonArray(values));
    });
  }

  static void OfPause(unsigned int min, unsigned int max) {
    Do("RandomSleepInMSec", [&](auto /*side*/) {
      return Show(Trace::IsModel() ? Model::Sleep(min, max)
                                   : KeloDRCore::RandomSleepInMSec(min, max));
    });
  }
};

#endif  // KELODRCORE_TESTS_MODEL_BASICS_H_
