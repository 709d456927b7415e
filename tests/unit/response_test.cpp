#include "kelodrcore/response.h"

#include <json/json.h>

#include <cstdint>
#include <functional>
#include <map>
#include <string>
#include <utility>
#include <vector>

#include "kelodrcore/json_value.h"
#include "support/clean_test.h"
#include "unit/json_text.h"

namespace {

using KeloDRCore::Response;

using ResponseTest = CleanTest;

using Answers = std::map<std::string, std::string>;

std::string Show(bool value) { return value ? "true" : "false"; }
std::string Show(int value) { return std::to_string(value); }
std::string Show(const std::string& value) { return '"' + value + '"'; }
std::string Show(const Json::Value& value) { return KeloDRCore::JsonValue::toString(value); }

// One query, and what it answers when it finds nothing.
struct Query {
  std::string name;
  std::string nothing;
  std::function<std::string(const Response&)> ask;
};

// clang-format off
const Query kQueries[] = {
    {"isValid", "false", [](const Response& r) { return Show(r.isValid()); }},
    {"isSuccess", "false", [](const Response& r) { return Show(r.isSuccess()); }},
    {"getErrCode", "-1", [](const Response& r) { return Show(r.getErrCode()); }},
    {"getErrMsg", "null", [](const Response& r) { return Show(r.getErrMsg()); }},
    {"getErr", "null", [](const Response& r) { return Show(r.getErr()); }},
    {"hasData", "false", [](const Response& r) { return Show(r.hasData()); }},
    {"getData", "null", [](const Response& r) { return Show(r.getData()); }},
    {"hasDataField", "false", [](const Response& r) { return Show(r.hasDataField("f")); }},
    {"getDataField", "null", [](const Response& r) { return Show(r.getDataField("f")); }},
    {"getDataFieldtoStr", "\"\"",
     [](const Response& r) { return Show(r.getDataFieldtoStr("f")); }},
    {"isPollFinish", "false", [](const Response& r) { return Show(r.isPollFinish()); }},
    {"isPollSuccess", "false", [](const Response& r) { return Show(r.isPollSuccess()); }},
    {"getTaskId", "\"\"", [](const Response& r) { return Show(r.getTaskId()); }},
    {"hasAdditional", "false", [](const Response& r) { return Show(r.hasAdditional()); }},
    {"getAdditional", "null", [](const Response& r) { return Show(r.getAdditional()); }},
    {"hasField", "false", [](const Response& r) { return Show(r.hasField("f")); }},
    {"getField", "null", [](const Response& r) { return Show(r.getField("f")); }},
};
// clang-format on

// The queries that convert the reply's "success", directly or through the one they build on.
const char* const kAfterSuccess[] = {"isSuccess",         "getErrCode",    "hasData",
                                     "getData",           "hasDataField",  "getDataField",
                                     "getDataFieldtoStr", "isPollFinish",  "isPollSuccess",
                                     "getTaskId",         "hasAdditional", "getAdditional"};

std::string Ask(const Query& query, const Response& response) {
  try {
    return query.ask(response);
  } catch (const Json::LogicError&) {
    return "LogicError";
  }
}

// Asks every query of `document`. The queries that `found` does not name must find nothing.
void ExpectAnswers(const Json::Value& document, const Answers& found) {
  const Response response(document);
  for (const Query& query : kQueries) {
    const auto expected = found.find(query.name);
    EXPECT_EQ(Ask(query, response), expected != found.end() ? expected->second : query.nothing)
        << query.name << " of " << Show(document);
  }
}

// Values of every JSON type, as text.
const char* const kAllTypes[] = {"null",  "true", "false",  "7",  "-7",         "4000000000", "2.5",
                                 "\"t\"", "\"\"", "[1, 2]", "[]", "{\"k\": 1}", "{}"};

bool Converts(const Json::Value& value) {
  return !value.isString() && !value.isArray() && !value.isObject();
}

std::string BoolOrError(const Json::Value& value) {
  return Converts(value) ? Show(value.asBool()) : "LogicError";
}

// A reply with every member that is read.
const Json::Value& FullReply() {
  static const Json::Value reply = Parse(R"({
      "success": true,
      "data": {"finish": true, "success": true, "task_id": "t1", "additional": {"a": 1}, "f": "x"},
      "error": {"code": 105, "errors": ["e"]},
      "f": [5]})");
  return reply;
}

const Answers& FullAnswers() {
  static const Answers answers = {
      {"isValid", "true"},
      {"isSuccess", "true"},
      {"getErrCode", "0"},
      {"getErrMsg", R"(["e"])"},
      {"getErr", R"({"code":105,"errors":["e"]})"},
      {"hasData", "true"},
      {"getData", Show(FullReply()["data"])},
      {"hasDataField", "true"},
      {"getDataField", "\"x\""},
      {"getDataFieldtoStr", "\"x\""},
      {"isPollFinish", "true"},
      {"isPollSuccess", "true"},
      {"getTaskId", "\"t1\""},
      {"hasAdditional", "true"},
      {"getAdditional", R"({"a":1})"},
      {"hasField", "true"},
      {"getField", "[5]"},
  };
  return answers;
}

Answers Without(Answers answers, const std::vector<std::string>& names) {
  for (const std::string& name : names) answers.erase(name);
  return answers;
}

Answers With(Answers answers, const Answers& changes) {
  for (const auto& [name, answer] : changes) answers[name] = answer;
  return answers;
}

const std::vector<std::string> kInsideData = {"hasDataField",  "getDataField",  "getDataFieldtoStr",
                                              "isPollFinish",  "isPollSuccess", "getTaskId",
                                              "hasAdditional", "getAdditional"};

const std::vector<std::string> kData = [] {
  std::vector<std::string> names = kInsideData;
  names.insert(names.end(), {"hasData", "getData"});
  return names;
}();

TEST_F(ResponseTest, StartsWithANullDocument) {
  const Response response;
  EXPECT_TRUE(response.getField("success").isNull());
  for (const Query& query : kQueries) EXPECT_EQ(Ask(query, response), query.nothing) << query.name;
}

TEST_F(ResponseTest, ClearEmptiesAnObjectAndMakesAnythingElseNull) {
  for (const char* text : kAllTypes) {
    Response response(Parse(text));
    EXPECT_NO_THROW(response.clear()) << text;
    for (const Query& query : kQueries) EXPECT_EQ(Ask(query, response), query.nothing) << text;
  }
  Response response(FullReply());
  response.clear();
  for (const Query& query : kQueries) EXPECT_EQ(Ask(query, response), query.nothing) << query.name;
}

TEST_F(ResponseTest, AnswersEveryQueryOfAFullReply) { ExpectAnswers(FullReply(), FullAnswers()); }

TEST_F(ResponseTest, AReplyThatIsNoObjectHasNothing) {
  for (const char* text : kAllTypes) ExpectAnswers(Parse(text), {});
  ExpectAnswers(Parse(R"([{"success": true, "data": {"f": 1}, "error": {}}])"), {});
}

TEST_F(ResponseTest, AReplyWithoutSuccessIsInvalidButHasItsTopLevelMembers) {
  Json::Value reply = FullReply();
  reply.removeMember("success");
  ExpectAnswers(
      reply, {{"getErr", FullAnswers().at("getErr")}, {"hasField", "true"}, {"getField", "[5]"}});
}

TEST_F(ResponseTest, AFailedReplyHasNoDataEvenWhenItCarriesData) {
  Json::Value reply = FullReply();
  reply["success"] = false;
  ExpectAnswers(
      reply, With(Without(FullAnswers(), kData), {{"isSuccess", "false"}, {"getErrCode", "105"}}));
}

TEST_F(ResponseTest, SuccessIsConvertedWhateverItsType) {
  for (const char* text : kAllTypes) {
    Json::Value reply = FullReply();
    reply["success"] = Parse(text);
    Answers expected = FullAnswers();
    if (!Converts(reply["success"])) {
      for (const char* name : kAfterSuccess) expected[name] = "LogicError";
    } else if (!reply["success"].asBool()) {
      expected = With(Without(expected, kData), {{"isSuccess", "false"}, {"getErrCode", "105"}});
    }
    ExpectAnswers(reply, expected);
  }
}

TEST_F(ResponseTest, ConversionOfSuccessFollowsTheJsonLibrary) {
  for (const char* text : {"true", "1", "-1", "0.5", "4000000000"}) {
    EXPECT_TRUE(Response(std::string("{\"success\":") + text + "}").isSuccess()) << text;
  }
  for (const char* text : {"false", "0", "0.0", "null"}) {
    EXPECT_FALSE(Response(std::string("{\"success\":") + text + "}").isSuccess()) << text;
  }
  for (const char* text : {"\"true\"", "\"\"", "[]", "{}"}) {
    const Response response(std::string("{\"success\":") + text + "}");
    EXPECT_TRUE(response.isValid());
    EXPECT_THROW(response.isSuccess(), Json::LogicError) << text;
  }
}

TEST_F(ResponseTest, ASuccessfulReplyWithoutDataHasNone) {
  Json::Value reply = FullReply();
  reply.removeMember("data");
  ExpectAnswers(reply, Without(FullAnswers(), kData));
}

TEST_F(ResponseTest, DataThatIsNoObjectIsThereButHasNoFields) {
  for (const char* text : kAllTypes) {
    Json::Value reply = FullReply();
    reply["data"] = Parse(text);
    ExpectAnswers(reply,
                  With(Without(FullAnswers(), kInsideData), {{"getData", Show(reply["data"])}}));
  }
}

TEST_F(ResponseTest, EachFieldOfDataCanBeMissing) {
  const std::map<std::string, std::vector<std::string>> readBy = {
      {"finish", {"isPollFinish"}},
      {"success", {"isPollSuccess"}},
      {"task_id", {"getTaskId"}},
      {"additional", {"hasAdditional", "getAdditional"}},
      {"f", {"hasDataField", "getDataField", "getDataFieldtoStr"}},
  };
  for (const auto& [field, names] : readBy) {
    Json::Value reply = FullReply();
    reply["data"].removeMember(field);
    ExpectAnswers(reply, With(Without(FullAnswers(), names), {{"getData", Show(reply["data"])}}));
  }
}

TEST_F(ResponseTest, EachFieldOfDataCanBeOfAnyType) {
  for (const char* text : kAllTypes) {
    const Json::Value value = Parse(text);
    const std::string taskId =
        value.isArray() || value.isObject() ? "LogicError" : Show(value.asString());
    const std::map<std::string, Answers> answersByField = {
        {"finish", {{"isPollFinish", BoolOrError(value)}}},
        {"success", {{"isPollSuccess", BoolOrError(value)}}},
        {"task_id", {{"getTaskId", taskId}}},
        {"additional", {{"getAdditional", Show(value)}}},
        {"f",
         {{"getDataField", Show(value)},
          {"getDataFieldtoStr", value.isString() ? Show(value.asString()) : "\"\""}}},
    };
    for (const auto& [field, answers] : answersByField) {
      Json::Value reply = FullReply();
      reply["data"][field] = value;
      ExpectAnswers(reply, With(With(FullAnswers(), answers), {{"getData", Show(reply["data"])}}));
    }
  }
}

TEST_F(ResponseTest, ErrorThatIsMissingOrNoObjectHasNoCodeAndNoErrors) {
  Json::Value reply = FullReply();
  reply["success"] = false;
  const Answers expected = With(Without(FullAnswers(), kData), {{"isSuccess", "false"}});
  reply.removeMember("error");
  ExpectAnswers(reply, Without(expected, {"getErrCode", "getErrMsg", "getErr"}));
  for (const char* text : kAllTypes) {
    reply["error"] = Parse(text);
    ExpectAnswers(reply, With(Without(expected, {"getErrCode", "getErrMsg"}),
                              {{"getErr", Show(reply["error"])}}));
  }
}

TEST_F(ResponseTest, ErrorCodeMustBeAnInt) {
  const std::pair<const char*, int> rows[] = {{"105", 105},
                                              {"0", 0},
                                              {"-3", -3},
                                              {"105.0", 105},
                                              {"2147483647", INT32_MAX},
                                              {"\"105\"", -1},
                                              {"null", -1},
                                              {"true", -1},
                                              {"105.5", -1},
                                              {"2147483648", -1},
                                              {"[105]", -1},
                                              {"{}", -1},
                                              {"-2147483649", -1},
                                              {"-2147483648", INT32_MIN}};
  for (const auto& [text, code] : rows) {
    const std::string error = std::string("\"error\": {\"code\": ") + text + "}}";
    EXPECT_EQ(Response("{\"success\": false, " + error).getErrCode(), code) << text;
    EXPECT_EQ(Response("{\"success\": true, " + error).getErrCode(), 0) << text;
    EXPECT_EQ(Response("{" + error).getErrCode(), -1) << text;
  }
}

TEST_F(ResponseTest, ErrorCodeCanBeMissing) {
  EXPECT_EQ(Response(R"({"success": false, "error": {"errors": 5}})").getErrCode(), -1);
}

TEST_F(ResponseTest, ErrorListOfAnyTypeIsReturned) {
  for (const char* text : kAllTypes) {
    Json::Value reply = FullReply();
    reply["error"]["errors"] = Parse(text);
    ExpectAnswers(reply, With(FullAnswers(), {{"getErrMsg", Show(reply["error"]["errors"])},
                                              {"getErr", Show(reply["error"])}}));
  }
}

TEST_F(ResponseTest, ErrorListCanBeMissing) {
  Json::Value reply = FullReply();
  reply["error"].removeMember("errors");
  ExpectAnswers(reply,
                With(Without(FullAnswers(), {"getErrMsg"}), {{"getErr", R"({"code":105})"}}));
}

TEST_F(ResponseTest, ErrorAnswersAreCopies) {
  const Response response(FullReply());
  response.getErr()["code"] = 1;
  response.getErrMsg().append(1);
  EXPECT_EQ(response.getErr(), FullReply()["error"]);
}

TEST_F(ResponseTest, PollingReadsSuccessInsideData) {
  const Response ended(R"({"success": true, "data": {"finish": true, "success": false}})");
  EXPECT_TRUE(ended.isPollFinish());
  EXPECT_FALSE(ended.isPollSuccess());
  const Response running(R"({"success": true, "data": {"finish": false}})");
  EXPECT_FALSE(running.isPollFinish());
  EXPECT_FALSE(running.isPollSuccess());
}

TEST_F(ResponseTest, ANullMemberIsThere) {
  const Response response(
      R"({"success": true, "f": null, "data": {"f": null, "additional": null}})");
  EXPECT_TRUE(response.hasField("f"));
  EXPECT_TRUE(response.hasDataField("f"));
  EXPECT_TRUE(response.hasAdditional());
  EXPECT_NE(&response.getField("f"), &response.getField("missing"));
}

TEST_F(ResponseTest, ANullNameNamesNothing) {
  const Response response(FullReply());
  EXPECT_FALSE(response.hasField(nullptr));
  EXPECT_TRUE(response.getField(nullptr).isNull());
  EXPECT_FALSE(response.hasDataField(nullptr));
  EXPECT_TRUE(response.getDataField(nullptr).isNull());
  EXPECT_EQ(response.getDataFieldtoStr(nullptr), "");
}

TEST_F(ResponseTest, ANullNameIsAnsweredBeforeSuccessIsConverted) {
  const Response response(R"({"success": "yes"})");
  EXPECT_FALSE(response.hasDataField(nullptr));
  EXPECT_TRUE(response.getDataField(nullptr).isNull());
  EXPECT_EQ(response.getDataFieldtoStr(nullptr), "");
}

TEST_F(ResponseTest, TheEmptyNameIsANameLikeAnyOther) {
  const Response response(R"({"success": true, "": 1, "data": {"": "x"}})");
  EXPECT_EQ(response.getField(""), Json::Value(1));
  EXPECT_EQ(response.getDataFieldtoStr(""), "x");
  EXPECT_FALSE(Response(FullReply()).hasField(""));
}

TEST_F(ResponseTest, TextsKeepTheirNulBytes) {
  Json::Value reply = FullReply();
  const std::string text("a\0b", 3);
  reply["data"]["f"] = text;
  reply["data"]["task_id"] = text;
  EXPECT_EQ(Response(reply).getDataFieldtoStr("f"), text);
  EXPECT_EQ(Response(reply).getTaskId(), text);
}

TEST_F(ResponseTest, NoQueryAddsAMember) {
  Response response(R"({"success": true, "data": {}, "error": {}})");
  for (const Query& query : kQueries) Ask(query, response);
  EXPECT_EQ(response.getData(), Parse("{}"));
  EXPECT_EQ(response.getErr(), Parse("{}"));
  for (const char* name : {"f", "finish", "task_id", "additional", "code", "errors"}) {
    EXPECT_FALSE(response.hasField(name)) << name;
  }
}

}  // namespace
