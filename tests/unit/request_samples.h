// What the tests of the web API call share.

#ifndef KELODRCORE_TESTS_UNIT_REQUEST_SAMPLES_H_
#define KELODRCORE_TESTS_UNIT_REQUEST_SAMPLES_H_

#include <gtest/gtest.h>
#include <json/json.h>

#include <string>
#include <vector>

#include "kelodrcore/request.h"
#include "unit/json_text.h"

// The keys that no parameter can have.
inline const char* const kReserved[] = {"api", "method", "version"};

// Parameters to which no member can be added: neither null nor an object.
inline std::vector<Json::Value> ParamsWithoutRoom() {
  return {Parse("[]"), Parse(R"([{"api": "A"}, 2])"), 7, 2.5, true, "text", ""};
}

// A valid call with these parameters.
inline KeloDRCore::Request WithParams(const Json::Value& params) {
  return KeloDRCore::Request("A", 1, "list", params);
}

// Every field away from its default.
inline KeloDRCore::Request Filled() {
  KeloDRCore::Request request("A", 3, "get", Parse(R"({"id": 7})"));
  request.setTimeout(5);
  request.setEncryptRequired(true);
  request.setUploadFile({"/tmp/local", "remote"});
  return request;
}

inline void ExpectClientSettings(const KeloDRCore::Request& request, int timeout, bool encrypt,
                                 const std::string& path, const std::string& name) {
  EXPECT_EQ(request.getTimeout(), timeout);
  EXPECT_EQ(request.isEncryptRequired(), encrypt);
  EXPECT_EQ(request.getUploadFile().path, path);
  EXPECT_EQ(request.getUploadFile().name, name);
}

#endif  // KELODRCORE_TESTS_UNIT_REQUEST_SAMPLES_H_
