#include "kelodrcore/request.h"

#include <json/json.h>

#include <cstdint>
#include <string>
#include <type_traits>
#include <vector>

#include "support/clean_test.h"
#include "unit/json_text.h"
#include "unit/request_samples.h"

namespace {

using KeloDRCore::Request;

static_assert(std::has_virtual_destructor_v<Request>);

using RequestTest = CleanTest;

// A key that a C string would cut off at "a".
const std::string kKeyWithNul("a\0b", 3);

TEST_F(RequestTest, StartsWithTheDefaults) {
  const Request request;
  EXPECT_EQ(request.getVersion(), -1);
  EXPECT_EQ(request.getAPI(), "");
  EXPECT_EQ(request.getMethod(), "");
  EXPECT_TRUE(request.getParams().isNull());
  ExpectClientSettings(request, 120, false, "", "");
}

TEST_F(RequestTest, TakesApiVersionMethodAndParamsInThisOrder) {
  const Request request("A", 2, "list", Parse(R"({"id": 7})"));
  EXPECT_EQ(request.getAPI(), "A");
  EXPECT_EQ(request.getVersion(), 2);
  EXPECT_EQ(request.getMethod(), "list");
  EXPECT_EQ(request.getParams(), Parse(R"({"id": 7})"));
  ExpectClientSettings(request, 120, false, "", "");
}

TEST_F(RequestTest, ConstructorKeepsReservedKeysOfParams) {
  const Json::Value params = Parse(R"({"api": "B", "method": "m", "version": 9, "id": 7})");
  const Request request = WithParams(params);
  EXPECT_EQ(request.getParams(), params);
  EXPECT_EQ(request.getAPI(), "A");
  EXPECT_EQ(request.getMethod(), "list");
  EXPECT_EQ(request.getVersion(), 1);
}

TEST_F(RequestTest, ConstructorKeepsParamsOfAnyType) {
  for (const Json::Value& params : ParamsWithoutRoom()) {
    EXPECT_EQ(WithParams(params).getParams(), params);
  }
}

TEST_F(RequestTest, ConstructorLoadsACall) {
  const Request request(Parse(R"({"api": "A", "method": "get", "version": 2, "id": 7})"));
  EXPECT_EQ(request.toStr(), "A/get/2");
  EXPECT_EQ(request.getParams(), Parse(R"({"id": 7})"));
  ExpectClientSettings(request, 120, false, "", "");
}

TEST_F(RequestTest, ConstructorFromAnEmptyCallKeepsTheDefaults) {
  const Request request{Json::Value(Json::objectValue)};
  EXPECT_EQ(request.toStr(), "//-1");
  EXPECT_EQ(request.getParams(), Json::Value(Json::objectValue));
}

TEST_F(RequestTest, AJsonCallGoesWhereARequestIsExpected) {
  static_assert(std::is_convertible_v<Json::Value, Request>);
  const Request request = Parse(R"({"api": "A"})");
  EXPECT_EQ(request.getAPI(), "A");
}

TEST_F(RequestTest, ACopyIsIndependent) {
  Request request = Filled();
  const Request copy = request;
  request.clear();
  request.setEncryptRequired(false);
  EXPECT_EQ(copy.toStr(), "A/get/3");
  EXPECT_EQ(copy.getParams(), Parse(R"({"id": 7})"));
  ExpectClientSettings(copy, 5, true, "/tmp/local", "remote");
}

TEST_F(RequestTest, SettersSetTheirOneFieldUnchecked) {
  Request request;
  request.setAPI("A");
  EXPECT_EQ(request.toStr(), "A//-1");
  request.setMethod("list");
  EXPECT_EQ(request.toStr(), "A/list/-1");
  request.setVersion(-5);
  EXPECT_EQ(request.toStr(), "A/list/-5");
  ExpectClientSettings(request, 120, false, "", "");
  request.setTimeout(-1);
  ExpectClientSettings(request, -1, false, "", "");
  request.setEncryptRequired(true);
  ExpectClientSettings(request, -1, true, "", "");
  request.setUploadFile({"/tmp/local", "remote"});
  ExpectClientSettings(request, -1, true, "/tmp/local", "remote");
  EXPECT_EQ(request.toStr(), "A/list/-5");
  EXPECT_TRUE(request.getParams().isNull());
}

TEST_F(RequestTest, SettersTakeTheRequestsOwnFields) {
  Request request = Filled();
  request.setAPI(request.getAPI());
  request.setMethod(request.getAPI());
  request.setUploadFile(request.getUploadFile());
  EXPECT_EQ(request.toStr(), "A/A/3");
  ExpectClientSettings(request, 5, true, "/tmp/local", "remote");
}

TEST_F(RequestTest, AnEncryptionFlagCanBeTakenBack) {
  Request request = Filled();
  request.setEncryptRequired(false);
  EXPECT_FALSE(request.isEncryptRequired());
}

TEST_F(RequestTest, IsValidWithApiMethodAndAVersionOfAtLeastOne) {
  struct Row {
    const char* api;
    const char* method;
    int version;
    bool valid;
  };
  const Row rows[] = {
      {"", "", -1, false},
      {"A", "list", 1, true},
      {"A", "list", 2, true},
      {"", "list", 1, false},
      {"A", "", 1, false},
      {"A", "list", 0, false},
      {"A", "list", -5, false},
      {"A", "list", INT32_MAX, true},
      {"A", "list", INT32_MIN, false},
      {" ", " ", 1, true},
  };
  for (const Row& row : rows) {
    const Request request(row.api, row.version, row.method, Json::Value());
    EXPECT_EQ(request.isValid(), row.valid) << request.toStr();
  }
}

TEST_F(RequestTest, ValidityIgnoresTheRest) {
  Request request = WithParams(Parse(R"({"api": 5})"));
  request.setTimeout(-1);
  request.setUploadFile({"", "name only"});
  EXPECT_TRUE(request.isValid());
  EXPECT_TRUE(WithParams("no object").isValid());
}

TEST_F(RequestTest, ExactlyThreeKeysAreReserved) {
  for (const char* key : kReserved) EXPECT_FALSE(Request::isValidKey(key)) << key;
  for (const std::string key :
       {"", "API", "Api", "apis", "ap", " api", "api ", "Method", "VERSION", "id"}) {
    EXPECT_TRUE(Request::isValidKey(key)) << key;
  }
  EXPECT_TRUE(Request::isValidKey(std::string("api\0", 4)));
}

TEST_F(RequestTest, AddsOneParam) {
  Request request;
  EXPECT_TRUE(request.addParam("id", 7));
  EXPECT_EQ(request.getParams(), Parse(R"({"id": 7})"));
  EXPECT_TRUE(request.addParam("list", Parse("[1, {}]")));
  EXPECT_TRUE(request.addParam("none", Json::Value()));
  EXPECT_EQ(request.getParams(), Parse(R"({"id": 7, "list": [1, {}], "none": null})"));
}

TEST_F(RequestTest, AddingAParamAgainReplacesIt) {
  Request request;
  request.addParam("id", Parse(R"({"a": 1, "b": 2})"));
  EXPECT_TRUE(request.addParam("id", Parse(R"({"c": 3})")));
  EXPECT_EQ(request.getParams(), Parse(R"({"id": {"c": 3}})"));
}

TEST_F(RequestTest, RefusesAReservedKey) {
  for (const char* key : kReserved) {
    Request request;
    EXPECT_FALSE(request.addParam(key, "x"));
    EXPECT_TRUE(request.getParams().isNull());
    request.addParam("id", 7);
    EXPECT_FALSE(request.addParam(key, "x"));
    EXPECT_EQ(request.getParams(), Parse(R"({"id": 7})"));
    EXPECT_EQ(request.toStr(), "//-1");
  }
}

TEST_F(RequestTest, AddsAParamUnderTheEmptyKey) {
  Request request;
  EXPECT_TRUE(request.addParam("", 7));
  EXPECT_EQ(request.getParams(), Parse(R"({"": 7})"));
}

TEST_F(RequestTest, AddsAParamUnderAKeyWithANulByte) {
  Request request;
  EXPECT_TRUE(request.addParam(kKeyWithNul, 7));
  EXPECT_TRUE(request.addParam(std::string("api\0", 4), 8));
  EXPECT_EQ(request.getParams().getMemberNames(),
            (std::vector<std::string>{kKeyWithNul, std::string("api\0", 4)}));
}

TEST_F(RequestTest, AParamIsACopy) {
  Json::Value value = Parse("[1]");
  Request request;
  request.addParam("list", value);
  value.append(2);
  EXPECT_EQ(request.getParams(), Parse(R"({"list": [1]})"));
}

TEST_F(RequestTest, MergesTheMembersOfAnObject) {
  Request request = WithParams(Parse(R"({"a": 1, "b": {"x": 1}})"));
  EXPECT_TRUE(request.addParam(Parse(R"({"b": {"y": 2}, "c": null, "": 3})")));
  EXPECT_EQ(request.getParams(), Parse(R"({"": 3, "a": 1, "b": {"y": 2}, "c": null})"));
}

TEST_F(RequestTest, MergingIntoNullParamsMakesAnObject) {
  Request request;
  EXPECT_TRUE(request.addParam(Parse(R"({"a": 1, "b": "x"})")));
  EXPECT_EQ(request.getParams(), Parse(R"({"a": 1, "b": "x"})"));
}

TEST_F(RequestTest, MergingSkipsReservedKeysSilently) {
  Request request;
  const Json::Value members =
      Parse(R"({"aaa": 1, "api": "B", "method": "m", "version": 9, "zzz": 2})");
  EXPECT_TRUE(request.addParam(members));
  EXPECT_EQ(request.getParams(), Parse(R"({"aaa": 1, "zzz": 2})"));
  EXPECT_EQ(request.toStr(), "//-1");
}

TEST_F(RequestTest, MergingOnlyReservedKeysLeavesNullParamsNull) {
  Request request;
  EXPECT_TRUE(request.addParam(Parse(R"({"api": "B"})")));
  EXPECT_TRUE(request.addParam(Parse("{}")));
  EXPECT_TRUE(request.getParams().isNull());
}

TEST_F(RequestTest, MergingKeepsReservedKeysThatParamsHold) {
  Request request = WithParams(Parse(R"({"api": 5, "id": 7})"));
  EXPECT_TRUE(request.addParam(Parse(R"({"api": 6, "id": 8})")));
  EXPECT_EQ(request.getParams(), Parse(R"({"api": 5, "id": 8})"));
}

TEST_F(RequestTest, MergesKeysWithNulBytes) {
  Json::Value members;
  members[kKeyWithNul] = 1;
  members["a"] = 2;
  Request request;
  EXPECT_TRUE(request.addParam(members));
  EXPECT_EQ(request.getParams(), members);
}

TEST_F(RequestTest, MergingAnArrayNamesItsElementsByTheirIndices) {
  Request request = WithParams(Parse(R"({"1": "old", "id": 7})"));
  EXPECT_TRUE(request.addParam(Parse(R"(["a", {"b": 1}, null])")));
  EXPECT_EQ(request.getParams(), Parse(R"({"0": "a", "1": {"b": 1}, "2": null, "id": 7})"));
  Json::Value sparse;
  sparse[11] = "x";
  Request empty;
  EXPECT_TRUE(empty.addParam(sparse));
  EXPECT_EQ(empty.getParams()["11"], "x");
}

TEST_F(RequestTest, MergingAValueWithoutMembersSucceedsAndAddsNothing) {
  for (const Json::Value& members :
       {Json::Value(), Parse("{}"), Parse("[]"), Json::Value(7), Json::Value(2.5),
        Json::Value(true), Json::Value("text"), Parse(R"({"api": 1, "version": 2})")}) {
    Request request = WithParams(Parse(R"({"id": 7})"));
    EXPECT_TRUE(request.addParam(members));
    EXPECT_EQ(request.getParams(), Parse(R"({"id": 7})"));
    Request empty;
    EXPECT_TRUE(empty.addParam(members));
    EXPECT_TRUE(empty.getParams().isNull());
    for (const Json::Value& params : ParamsWithoutRoom()) {
      Request full = WithParams(params);
      EXPECT_TRUE(full.addParam(members));
      EXPECT_EQ(full.getParams(), params);
    }
  }
}

TEST_F(RequestTest, NothingIsAddedToParamsThatCannotHoldMembers) {
  for (const Json::Value& params : ParamsWithoutRoom()) {
    Request request = WithParams(params);
    EXPECT_FALSE(request.addParam("id", 7));
    EXPECT_FALSE(request.addParam("api", 7));
    EXPECT_FALSE(request.addParam(Parse(R"({"api": 1, "id": 7})")));
    EXPECT_FALSE(request.addParam(Parse("[1]")));
    EXPECT_EQ(request.getParams(), params);
  }
}

TEST_F(RequestTest, AParamMayBeTheParamsThemselves) {
  Request request = WithParams(Parse(R"({"id": 7})"));
  EXPECT_TRUE(request.addParam("all", request.getParams()));
  EXPECT_EQ(request.getParams(), Parse(R"({"all": {"id": 7}, "id": 7})"));
  Request empty;
  EXPECT_TRUE(empty.addParam("all", empty.getParams()));
  EXPECT_EQ(empty.getParams(), Parse(R"({"all": null})"));
}

TEST_F(RequestTest, AParamMayBePartOfTheParamItReplaces) {
  Request request = WithParams(Parse(R"({"id": {"deep": {"x": [1, 2]}}})"));
  EXPECT_TRUE(request.addParam("id", request.getParams()["id"]["deep"]));
  EXPECT_EQ(request.getParams(), Parse(R"({"id": {"x": [1, 2]}})"));
  EXPECT_TRUE(request.addParam("id", request.getParams()["id"]));
  EXPECT_EQ(request.getParams(), Parse(R"({"id": {"x": [1, 2]}})"));
}

TEST_F(RequestTest, MergingTheParamsIntoThemselvesChangesNothing) {
  const Json::Value params = Parse(R"({"a": {"b": 1}, "api": 5, "c": [1]})");
  Request request = WithParams(params);
  EXPECT_TRUE(request.addParam(request.getParams()));
  EXPECT_EQ(request.getParams(), params);
}

TEST_F(RequestTest, MergesAnObjectThatTheMergeReplaces) {
  Request request = WithParams(Parse(R"({"m": {"a": 1, "m": {"long": "text"}, "z": [2]}})"));
  EXPECT_TRUE(request.addParam(request.getParams()["m"]));
  EXPECT_EQ(request.getParams(), Parse(R"({"a": 1, "m": {"long": "text"}, "z": [2]})"));
}

TEST_F(RequestTest, MergesAnObjectInsideAnArrayThatTheMergeReplaces) {
  Request request = WithParams(Parse(R"({"m": [0, {"a": {"b": 1}, "m": "new", "z": [2]}]})"));
  EXPECT_TRUE(request.addParam(request.getParams()["m"][1]));
  EXPECT_EQ(request.getParams(), Parse(R"({"a": {"b": 1}, "m": "new", "z": [2]})"));
}

TEST_F(RequestTest, MergesAnObjectInsideAMemberThatTheMergeReplaces) {
  Request request =
      WithParams(Parse(R"({"m": {"n": {"a": {"b": 1}, "m": "new", "z": {"y": 2}}}, "z": 0})"));
  EXPECT_TRUE(request.addParam(request.getParams()["m"]["n"]));
  EXPECT_EQ(request.getParams(), Parse(R"({"a": {"b": 1}, "m": "new", "z": {"y": 2}})"));
}

TEST_F(RequestTest, ShortNameHasApiMethodAndVersion) {
  EXPECT_EQ(WithParams(Json::Value()).toStr(), "A/list/1");
  EXPECT_EQ(Request().toStr(), "//-1");
  EXPECT_EQ(Request(" a/b ", INT32_MIN, "", Json::Value()).toStr(), " a/b //-2147483648");
}

TEST_F(RequestTest, ClearGoesBackToTheDefaultsButForTheEncryptionFlag) {
  Request request = Filled();
  request.clear();
  EXPECT_EQ(request.getVersion(), -1);
  EXPECT_EQ(request.getAPI(), "");
  EXPECT_EQ(request.getMethod(), "");
  ExpectClientSettings(request, 120, true, "", "");
  Request plain;
  plain.clear();
  EXPECT_FALSE(plain.isEncryptRequired());
}

TEST_F(RequestTest, ClearEmptiesAnObjectOrAnArrayAndMakesOtherParamsNull) {
  Request request = Filled();
  request.clear();
  EXPECT_EQ(request.getParams(), Json::Value(Json::objectValue));
  for (const Json::Value& params : ParamsWithoutRoom()) {
    Request other = WithParams(params);
    other.clear();
    EXPECT_EQ(other.getParams(), params.isArray() ? Parse("[]") : Json::Value());
  }
  Request null;
  null.clear();
  EXPECT_TRUE(null.getParams().isNull());
}

TEST_F(RequestTest, AClearedRequestCanBeFilledAgain) {
  Request request = Filled();
  request.clear();
  EXPECT_TRUE(request.addParam("id", 8));
  EXPECT_EQ(request.toJson(), Parse(R"({"api": "", "method": "", "version": -1, "id": 8})"));
}

}  // namespace
