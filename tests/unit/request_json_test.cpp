#include <json/json.h>

#include <cstdint>
#include <string>
#include <vector>

#include "kelodrcore/request.h"
#include "support/clean_test.h"
#include "unit/json_text.h"
#include "unit/random_json.h"
#include "unit/request_samples.h"

namespace {

using KeloDRCore::Request;

using RequestJsonTest = CleanTest;

TEST_F(RequestJsonTest, LoadsACall) {
  Request request;
  request.setRequest(Parse(R"({"api": "A", "method": "get", "version": 3, "id": 7, "list": [1]})"));
  EXPECT_EQ(request.getAPI(), "A");
  EXPECT_EQ(request.getMethod(), "get");
  EXPECT_EQ(request.getVersion(), 3);
  EXPECT_EQ(request.getParams(), Parse(R"({"id": 7, "list": [1]})"));
}

TEST_F(RequestJsonTest, LoadingReplacesTheParams) {
  Request request = Filled();
  request.setRequest(Parse(R"({"other": 1})"));
  EXPECT_EQ(request.getParams(), Parse(R"({"other": 1})"));
}

TEST_F(RequestJsonTest, LoadingLeavesFieldsOfMissingMembers) {
  Request request = Filled();
  request.setRequest(Parse("{}"));
  EXPECT_EQ(request.toStr(), "A/get/3");
  EXPECT_EQ(request.getParams(), Parse("{}"));
}

TEST_F(RequestJsonTest, LoadingDoesNotTouchTheClientSettings) {
  Request request = Filled();
  request.setRequest(Parse(
      R"({"api": "B", "timeout": 9, "encrypt_required": false, "upload_file": {"path": "p"}})"));
  ExpectClientSettings(request, 5, true, "/tmp/local", "remote");
}

TEST_F(RequestJsonTest, LoadingTakesEmptyTextsToo) {
  Request request = Filled();
  request.setRequest(Parse(R"({"api": "", "method": ""})"));
  EXPECT_EQ(request.toStr(), "//3");
  EXPECT_EQ(request.getParams(), Parse("{}"));
}

TEST_F(RequestJsonTest, LoadingKeepsNulBytesOfTexts) {
  Json::Value call;
  call["api"] = std::string("A\0B", 3);
  EXPECT_EQ(Request(call).getAPI(), std::string("A\0B", 3));
}

TEST_F(RequestJsonTest, LoadingLeavesAnApiOrMethodOfAnotherTypeAmongTheParams) {
  for (const char* key : {"api", "method"}) {
    for (const char* text : {"null", "5", "2.5", "true", "[\"A\"]", "{\"api\": \"A\"}"}) {
      Json::Value call;
      call[key] = Parse(text);
      Request request = Filled();
      request.setRequest(call);
      EXPECT_EQ(request.toStr(), "A/get/3") << key << text;
      EXPECT_EQ(request.getParams(), call) << key << text;
    }
  }
}

TEST_F(RequestJsonTest, LoadingTakesAVersionThatIsAnInt) {
  struct Row {
    Json::Value value;
    int version;
  };
  const Row rows[] = {{0, 0},  {-5, -5}, {INT32_MAX, INT32_MAX}, {INT32_MIN, INT32_MIN},
                      {7U, 7}, {3.0, 3}, {Json::Int64{12}, 12}};
  for (const Row& row : rows) {
    Json::Value call;
    call["version"] = row.value;
    Request request = Filled();
    request.setRequest(call);
    EXPECT_EQ(request.getVersion(), row.version);
    EXPECT_EQ(request.getParams(), Parse("{}"));
  }
}

TEST_F(RequestJsonTest, LoadingLeavesAVersionThatIsNoIntAmongTheParams) {
  for (const char* text :
       {"null", "\"3\"", "true", "2.5", "2147483648", "-2147483649", "1e30", "[3]", "{}"}) {
    Json::Value call;
    call["version"] = Parse(text);
    Request request;
    request.setVersion(9);
    request.setRequest(call);
    EXPECT_EQ(request.getVersion(), 9) << text;
    EXPECT_EQ(request.getParams(), call) << text;
    EXPECT_EQ(request.toJson()["version"], Json::Value(9)) << text;
  }
}

TEST_F(RequestJsonTest, LoadingTakesMembersIndependently) {
  Request request = Filled();
  request.setRequest(Parse(R"({"api": 5, "method": "list", "version": "3"})"));
  EXPECT_EQ(request.toStr(), "A/list/3");
  EXPECT_EQ(request.getParams(), Parse(R"({"api": 5, "version": "3"})"));
}

TEST_F(RequestJsonTest, LoadingIsCaseSensitive) {
  Request request = Filled();
  request.setRequest(Parse(R"({"API": "B", "Method": "m", "VERSION": 1})"));
  EXPECT_EQ(request.toStr(), "A/get/3");
  EXPECT_EQ(request.getParams(), Parse(R"({"API": "B", "Method": "m", "VERSION": 1})"));
}

TEST_F(RequestJsonTest, LoadingAnythingButAnObjectOnlySetsTheParams) {
  std::vector<Json::Value> all = ParamsWithoutRoom();
  all.emplace_back();
  for (const Json::Value& call : all) {
    Request request = Filled();
    request.setRequest(call);
    EXPECT_EQ(request.getParams(), call);
    EXPECT_EQ(request.toStr(), "A/get/3");
    EXPECT_EQ(Request(call).getParams(), call);
  }
}

TEST_F(RequestJsonTest, LoadsItsOwnParams) {
  Request request = WithParams(Parse(R"({"api": "B", "version": 2, "in": {"method": "m"}})"));
  request.setRequest(request.getParams());
  EXPECT_EQ(request.toStr(), "B/list/2");
  EXPECT_EQ(request.getParams(), Parse(R"({"in": {"method": "m"}})"));
  request.setRequest(request.getParams()["in"]);
  EXPECT_EQ(request.toStr(), "B/m/2");
  EXPECT_EQ(request.getParams(), Parse("{}"));
}

TEST_F(RequestJsonTest, JsonFormSetsTheThreeReservedMembersBesideTheParams) {
  const Json::Value json = Request("A", 2, "get", Parse(R"({"id": 7})")).toJson();
  EXPECT_EQ(json, Parse(R"({"api": "A", "method": "get", "version": 2, "id": 7})"));
  EXPECT_EQ(json["version"].type(), Json::intValue);
}

TEST_F(RequestJsonTest, JsonFormOfADefaultRequest) {
  EXPECT_EQ(Request().toJson(), Parse(R"({"api": "", "method": "", "version": -1})"));
}

TEST_F(RequestJsonTest, JsonFormHasNoClientSettings) {
  EXPECT_EQ(Filled().toJson(), Parse(R"({"api": "A", "method": "get", "version": 3, "id": 7})"));
}

TEST_F(RequestJsonTest, JsonFormOverwritesReservedKeysOfTheParams) {
  const Json::Value params = Parse(R"({"api": 5, "method": [1], "version": "3", "id": 7})");
  const Request request = WithParams(params);
  EXPECT_EQ(request.toJson(), Parse(R"({"api": "A", "method": "list", "version": 1, "id": 7})"));
  EXPECT_EQ(request.getParams(), params);
}

TEST_F(RequestJsonTest, JsonFormLeavesOutParamsThatCannotHoldMembers) {
  for (const Json::Value& params : ParamsWithoutRoom()) {
    const Request request = WithParams(params);
    EXPECT_EQ(request.toJson(), Parse(R"({"api": "A", "method": "list", "version": 1})"));
    EXPECT_EQ(request.getParams(), params);
  }
}

TEST_F(RequestJsonTest, JsonFormIsACopy) {
  const Request request = Filled();
  request.toJson()["id"] = 8;
  EXPECT_EQ(request.getParams(), Parse(R"({"id": 7})"));
}

Json::Value RandomCall(RandomJson& random) {
  Json::Value call = random.Object(4);
  call["api"] = random.Text();
  call["method"] = random.Text();
  call["version"] = static_cast<int>(random.Below(UINT32_MAX));
  return call;
}

TEST_F(RequestJsonTest, JsonFormGivesBackAnyCallThatWasLoaded) {
  RandomJson random(20260901);
  Request request;
  for (int round = 0; round < 2000; ++round) {
    const Json::Value call = RandomCall(random);
    request.setRequest(call);
    ASSERT_EQ(request.toJson(), call);
    for (const char* key : kReserved) ASSERT_FALSE(request.getParams().isMember(key));
  }
}

TEST_F(RequestJsonTest, MergingEqualsAddingTheMembersOneByOne) {
  RandomJson random(20260901);
  for (int round = 0; round < 1000; ++round) {
    const Json::Value before = random.Object(3);
    const Json::Value members = round % 2 == 0 ? random.Object(3) : RandomCall(random);
    Request merged = WithParams(before);
    ASSERT_TRUE(merged.addParam(members));
    Request single = WithParams(before);
    for (const std::string& key : members.getMemberNames()) single.addParam(key, members[key]);
    ASSERT_EQ(merged.getParams(), single.getParams());
  }
}

}  // namespace
