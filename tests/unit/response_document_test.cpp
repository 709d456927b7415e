#include <json/json.h>

#include <memory>
#include <string>
#include <type_traits>
#include <utility>

#include "kelodrcore/response.h"
#include "support/clean_test.h"
#include "unit/json_text.h"

namespace {

using KeloDRCore::Response;

static_assert(std::has_virtual_destructor_v<Response>);

using ResponseDocumentTest = CleanTest;

Json::Value Reply() {
  return Parse(R"({"success": true, "data": {"f": [1], "additional": 5}, "error": {"code": 2}})");
}

TEST_F(ResponseDocumentTest, ParsesATextOfEachKind) {
  const std::string text = R"({"success": true, "f": 5})";
  EXPECT_EQ(Response(text).getField("f"), Json::Value(5));
  EXPECT_EQ(Response(text.c_str()).getField("f"), Json::Value(5));
  EXPECT_EQ(Response(R"({"f": 6})").getField("f"), Json::Value(6));
  std::string copy = text;
  EXPECT_EQ(Response(copy.data()).getField("f"), Json::Value(5));
}

TEST_F(ResponseDocumentTest, CopiesAJsonDocument) {
  Json::Value document = Reply();
  const Response response(document);
  document.clear();
  EXPECT_EQ(response.getData(), Reply()["data"]);
}

TEST_F(ResponseDocumentTest, AJsonTextValueIsADocumentAndNotParsed) {
  const Response response(Json::Value(R"({"success": true})"));
  EXPECT_FALSE(response.isValid());
}

TEST_F(ResponseDocumentTest, RepliesGoWhereAResponseIsExpected) {
  static_assert(std::is_convertible_v<std::string, Response>);
  static_assert(std::is_convertible_v<const char*, Response>);
  static_assert(std::is_convertible_v<char*, Response>);
  static_assert(std::is_convertible_v<Json::Value, Response>);
  const Response response = R"({"success": true})";
  EXPECT_TRUE(response.isSuccess());
}

template <typename T, typename = void>
struct CanSetResp : std::false_type {};
template <typename T>
struct CanSetResp<T, std::void_t<decltype(std::declval<Response&>().setResp(std::declval<T>()))>>
    : std::true_type {};

TEST_F(ResponseDocumentTest, NoOtherPointerTurnsIntoADocument) {
  static_assert(!std::is_constructible_v<Response, int*>);
  static_assert(!std::is_constructible_v<Response, const void*>);
  static_assert(!std::is_constructible_v<Response, unsigned char*>);
  static_assert(!std::is_constructible_v<Response, Json::Value*>);
  static_assert(!CanSetResp<int*>::value && !CanSetResp<const void*>::value);
  static_assert(!CanSetResp<unsigned char*>::value && !CanSetResp<Json::Value*>::value);
  static_assert(CanSetResp<char*>::value && CanSetResp<const char*>::value);
}

TEST_F(ResponseDocumentTest, SetRespOfATextTellsWhetherItParsed) {
  static_assert(std::is_same_v<decltype(Response().setResp(std::string())), bool>);
  static_assert(std::is_same_v<decltype(Response().setResp("")), bool>);
  static_assert(std::is_void_v<decltype(Response().setResp(Json::Value()))>);
}

TEST_F(ResponseDocumentTest, ATextThatDoesNotParseGivesANullDocument) {
  const char* const noText = nullptr;
  for (const Response& response :
       {Response("{\"success\":"), Response(""), Response(std::string("success")),
        Response(std::string()), Response(noText), Response(nullptr)}) {
    EXPECT_FALSE(response.isValid());
    EXPECT_FALSE(response.hasField("success"));
    EXPECT_TRUE(response.getErr().isNull());
  }
}

TEST_F(ResponseDocumentTest, SetRespReplacesTheDocument) {
  Response response(Reply());
  EXPECT_TRUE(response.setResp(R"({"f": 1})"));
  EXPECT_EQ(response.getField("f"), Json::Value(1));
  EXPECT_FALSE(response.isValid());
  EXPECT_TRUE(response.setResp(std::string(R"({"f": 2})")));
  EXPECT_EQ(response.getField("f"), Json::Value(2));
  response.setResp(Parse(R"({"f": 3})"));
  EXPECT_EQ(response.getField("f"), Json::Value(3));
}

TEST_F(ResponseDocumentTest, SetRespOfATextThatDoesNotParseLeavesTheDocument) {
  Response response(Reply());
  const char* const noText = nullptr;
  EXPECT_FALSE(response.setResp(""));
  EXPECT_FALSE(response.setResp("{"));
  EXPECT_FALSE(response.setResp(std::string("{} {}")));
  EXPECT_FALSE(response.setResp(std::string("{}\0", 3)));
  EXPECT_FALSE(response.setResp(noText));
  EXPECT_EQ(response.getData(), Reply()["data"]);
}

TEST_F(ResponseDocumentTest, SetRespTakesPartOfItsOwnDocument) {
  Response response(R"({"success": true, "data": {"success": true, "f": {"f": [7]}}})");
  response.setResp(response.getData());
  EXPECT_EQ(response.getField("f"), Parse(R"({"f": [7]})"));
  response.setResp(response.getField("f"));
  EXPECT_EQ(response.getField("f"), Parse("[7]"));
  response.setResp(response.getField("missing"));
  EXPECT_FALSE(response.hasField("f"));
}

TEST_F(ResponseDocumentTest, SetRespParsesATextInsideItsOwnDocument) {
  Response response(R"({"f": "{\"success\": true, \"f\": 5}"})");
  EXPECT_TRUE(response.setResp(response.getField("f").asCString()));
  EXPECT_TRUE(response.isSuccess());
  EXPECT_EQ(response.getField("f"), Json::Value(5));
}

TEST_F(ResponseDocumentTest, ACopyHasItsOwnDocument) {
  Response response(Reply());
  const Response copy(response);
  response.clear();
  EXPECT_EQ(copy.getData(), Reply()["data"]);
}

TEST_F(ResponseDocumentTest, AssignmentCopiesTheDocument) {
  Response response(Reply());
  Response other("{\"f\": 1}");
  other = response;
  response.clear();
  EXPECT_EQ(other.getData(), Reply()["data"]);
  Response& self = other;
  other = self;
  EXPECT_EQ(other.getData(), Reply()["data"]);
}

TEST_F(ResponseDocumentTest, EachObjectAnswersWithANullValueOfItsOwn) {
  const Response response(R"({"success": false})");
  auto copy = std::make_unique<Response>(response);
  Response assigned;
  const Json::Value& before = assigned.getData();
  assigned = response;
  EXPECT_EQ(&assigned.getData(), &before);
  EXPECT_NE(&copy->getData(), &response.getData());
  EXPECT_NE(&assigned.getData(), &response.getData());
  const Json::Value& null = response.getField("missing");
  copy.reset();
  EXPECT_TRUE(null.isNull());
}

TEST_F(ResponseDocumentTest, EveryAccessorThatMissesAnswersWithTheSameNullValue) {
  Response response(R"({"success": false, "data": {"additional": 1}})");
  const Json::Value& null = response.getData();
  EXPECT_TRUE(null.isNull());
  EXPECT_EQ(&response.getDataField("additional"), &null);
  EXPECT_EQ(&response.getDataField(nullptr), &null);
  EXPECT_EQ(&response.getAdditional(), &null);
  EXPECT_EQ(&response.getField("missing"), &null);
  EXPECT_EQ(&response.getField(nullptr), &null);
  response.setResp(Reply());
  EXPECT_EQ(&response.getField("missing"), &null);
  EXPECT_TRUE(null.isNull());
}

TEST_F(ResponseDocumentTest, AccessorsThatFindAnswerWithTheDocumentItself) {
  const Response response(Reply());
  const Json::Value& data = response.getData();
  EXPECT_EQ(&response.getField("data"), &data);
  EXPECT_EQ(&response.getDataField("f"), &data["f"]);
  EXPECT_EQ(&response.getAdditional(), &data["additional"]);
}

}  // namespace
