#include "kelodrcore/sqlite_condition.h"

#include <random>
#include <string>
#include <type_traits>
#include <vector>

#include "support/clean_test.h"

namespace {

using KeloDRCore::SqliteAnd;
using KeloDRCore::SqliteCondition;
using KeloDRCore::SqliteEqual;
using KeloDRCore::SqliteIn;
using KeloDRCore::SqliteInFamily;
using KeloDRCore::SqliteIsNull;
using KeloDRCore::SqliteNotEqual;
using KeloDRCore::SqliteNotIn;
using KeloDRCore::SqliteOr;
using KeloDRCore::SqliteValue;

using Values = std::vector<SqliteValue>;

class SqliteConditionTest : public CleanTest {
 protected:
  // Every setter's line carries the same name.
  static void ExpectError(const std::string& message) {
    ExpectLog({Err("sqlite_condition.cpp", "SetValue", message)});
  }
};

// Puts the class into the names of the tests that run for several.
struct ClassName {
  template <typename Condition>
  static std::string GetName(int /*index*/) {
    if (std::is_same_v<Condition, SqliteEqual>) return "Equal";
    if (std::is_same_v<Condition, SqliteNotEqual>) return "NotEqual";
    return std::is_same_v<Condition, SqliteAnd> ? "And" : "Or";
  }
};

void ExpectCondition(const SqliteCondition& condition, const std::string& text) {
  EXPECT_EQ(condition.GetText(), text);
  EXPECT_EQ(condition.IsValid(), !text.empty());
}

TEST_F(SqliteConditionTest, ShapeOfTheFamily) {
  static_assert(std::is_polymorphic_v<SqliteCondition>);
  static_assert(!std::has_virtual_destructor_v<SqliteCondition>);
  static_assert(!std::has_virtual_destructor_v<SqliteIn>);
  static_assert(std::is_base_of_v<SqliteInFamily, SqliteIn>);
  static_assert(std::is_base_of_v<SqliteInFamily, SqliteNotIn>);
  static_assert(std::is_base_of_v<SqliteCondition, SqliteInFamily>);
  static_assert(!std::is_constructible_v<SqliteEqual, std::string, double>);
  static_assert(!std::is_constructible_v<SqliteEqual, std::string, void*>);
}

TEST_F(SqliteConditionTest, WithoutOperandsThereIsNoCondition) {
  ExpectCondition(SqliteCondition(), "");
  ExpectCondition(SqliteEqual(), "");
  ExpectCondition(SqliteNotEqual(), "");
  ExpectCondition(SqliteAnd(), "");
  ExpectCondition(SqliteOr(), "");
  ExpectCondition(SqliteIsNull(), "");
}

TEST_F(SqliteConditionTest, ATextIsTakenUnchanged) {
  ExpectCondition(SqliteCondition(" id = 'a'b' "), " id = 'a'b' ");
  ExpectCondition(SqliteCondition(" "), " ");
  ExpectCondition(SqliteCondition(""), "");
}

TEST_F(SqliteConditionTest, EqualHasNoBlanks) {
  ExpectCondition(SqliteEqual("name", "a'b"), "name='a''b'");
  ExpectCondition(SqliteEqual("n", true), "n=1");
  ExpectCondition(SqliteEqual("n", -5), "n=-5");
  ExpectCondition(SqliteEqual("n", ""), "n=''");
  ExpectCondition(SqliteEqual("n", 4294967296LL), "n=");
}

TEST_F(SqliteConditionTest, NotEqualHasNoBlanks) {
  ExpectCondition(SqliteNotEqual("id", 3), "id!=3");
  ExpectCondition(SqliteNotEqual("name", "a'b"), "name!='a''b'");
}

TEST_F(SqliteConditionTest, TheLeftSideIsWrittenAsGiven) {
  ExpectCondition(SqliteEqual(" a'b; ", 1), " a'b; =1");
  ExpectCondition(SqliteNotEqual("lower(x)", 1), "lower(x)!=1");
  ExpectCondition(SqliteIsNull("\"a b\""), "\"a b\" IS NULL");
  ExpectCondition(SqliteIn("a'b", "1"), "a'b IN ( 1 )");
}

template <typename Comparison>
class SqliteComparisonTest : public SqliteConditionTest {};
using Comparisons = testing::Types<SqliteEqual, SqliteNotEqual>;
TYPED_TEST_SUITE(SqliteComparisonTest, Comparisons, ClassName);

TYPED_TEST(SqliteComparisonTest, BadOperandsGiveAnEmptyCondition) {
  ExpectCondition(TypeParam("", "it's"), "");
  this->ExpectError("Bad lvalue[] or rvalue['it''s']");
  ExpectCondition(TypeParam("a", SqliteValue()), "");
  this->ExpectError("Bad lvalue[a] or rvalue[]");
  ExpectCondition(TypeParam("a", nullptr), "");
  this->ExpectError("Bad lvalue[a] or rvalue[]");
}

TYPED_TEST(SqliteComparisonTest, BadOperandsLeaveTheTextAlone) {
  TypeParam condition("a", 1);
  const std::string before = condition.GetText();
  EXPECT_FALSE(condition.SetValue("", 2));
  this->ExpectError("Bad lvalue[] or rvalue[2]");
  EXPECT_FALSE(condition.SetValue("b", SqliteValue()));
  this->ExpectError("Bad lvalue[b] or rvalue[]");
  ExpectCondition(condition, before);
}

TYPED_TEST(SqliteComparisonTest, SettingAgainReplacesTheText) {
  TypeParam condition("a", 1);
  EXPECT_TRUE(condition.SetValue("b", "x"));
  ExpectCondition(condition, TypeParam("b", "x").GetText());
}

TYPED_TEST(SqliteComparisonTest, TheOwnTextCanBeAnOperand) {
  TypeParam condition("a", 1);
  const std::string text = condition.GetText();
  EXPECT_TRUE(condition.SetValue(condition.GetText(), "x"));
  ExpectCondition(condition, TypeParam(text, "x").GetText());
  const std::string longer = condition.GetText();
  EXPECT_TRUE(condition.SetValue("b", condition.GetText()));
  ExpectCondition(condition, TypeParam("b", longer).GetText());
}

TEST_F(SqliteConditionTest, AndJoinsTwoTexts) {
  ExpectCondition(SqliteAnd("a=1", "b=2"), "(a=1) AND (b=2)");
  ExpectCondition(SqliteAnd(SqliteEqual("a", 1), SqliteIsNull("b")), "(a=1) AND (b IS NULL)");
}

TEST_F(SqliteConditionTest, OrJoinsTwoTexts) {
  ExpectCondition(SqliteOr("a=1", "b=2"), "(a=1) OR (b=2)");
  ExpectCondition(SqliteOr(SqliteNotEqual("a", 1), SqliteIn("b", "2")), "(a!=1) OR (b IN ( 2 ))");
}

TEST_F(SqliteConditionTest, ConditionsNest) {
  const SqliteCondition x("x");
  const SqliteCondition y("y");
  const SqliteCondition z("z");
  ExpectCondition(SqliteOr(SqliteAnd(x, y), z), "((x) AND (y)) OR (z)");
  ExpectCondition(SqliteAnd(x, SqliteOr(y, SqliteAnd(z, z))), "(x) AND ((y) OR ((z) AND (z)))");
}

template <typename Group>
class SqliteGroupTest : public SqliteConditionTest {
 protected:
  static std::string Join(const std::string& left, const std::string& right) {
    return "(" + left + ") " + (std::is_same_v<Group, SqliteAnd> ? "AND" : "OR") + " (" + right +
           ")";
  }
};
using Groups = testing::Types<SqliteAnd, SqliteOr>;
TYPED_TEST_SUITE(SqliteGroupTest, Groups, ClassName);

TYPED_TEST(SqliteGroupTest, SettingAgainAppendsDirectlyBehind) {
  TypeParam condition("a=1", "b=2");
  EXPECT_TRUE(condition.SetValue("c=3", "d=4"));
  ExpectCondition(condition, this->Join("a=1", "b=2") + this->Join("c=3", "d=4"));
}

TYPED_TEST(SqliteGroupTest, AnEmptySideIsRefused) {
  ExpectCondition(TypeParam("", "b=2"), "");
  this->ExpectError("Bad lvalue[] or rvalue[b=2]");
  ExpectCondition(TypeParam("a=1", ""), "");
  this->ExpectError("Bad lvalue[a=1] or rvalue[]");
  ExpectCondition(TypeParam(SqliteCondition(), SqliteEqual("b", 2)), "");
  this->ExpectError("Bad lvalue[] or rvalue[b=2]");
  ExpectCondition(TypeParam(SqliteEqual("a", 1), SqliteCondition()), "");
  this->ExpectError("Bad lvalue[a=1] or rvalue[]");
}

TYPED_TEST(SqliteGroupTest, AnEmptySideLeavesTheTextAlone) {
  TypeParam condition("a=1", "b=2");
  EXPECT_FALSE(condition.SetValue("", ""));
  this->ExpectError("Bad lvalue[] or rvalue[]");
  ExpectCondition(condition, this->Join("a=1", "b=2"));
}

// Has a text but says that it is not valid.
class NeverValid : public SqliteCondition {
 public:
  using SqliteCondition::SqliteCondition;
  bool IsValid() const override { return false; }
};

TYPED_TEST(SqliteGroupTest, ValidityOfTheOperandsIsNotAsked) {
  const NeverValid operand("a=1");
  ExpectCondition(TypeParam(operand, operand), this->Join("a=1", "a=1"));
  ExpectCondition(TypeParam(SqliteIn(), operand), "");  // valid, without a text
  this->ExpectError("Bad lvalue[] or rvalue[a=1]");
}

TYPED_TEST(SqliteGroupTest, TheOwnTextCanBeAnOperand) {
  TypeParam condition("a", "b");
  const std::string text = condition.GetText();
  EXPECT_TRUE(condition.SetValue(condition.GetText(), condition.GetText()));
  ExpectCondition(condition, text + this->Join(text, text));
}

TEST_F(SqliteConditionTest, IsNullReplacesTheTextAndReturnsFalse) {
  SqliteIsNull condition("x");
  ExpectCondition(condition, "x IS NULL");
  EXPECT_FALSE(condition.SetValue("y")) << "deliberately, also on success";
  ExpectCondition(condition, "y IS NULL");
  EXPECT_FALSE(condition.SetValue(condition.GetText()));
  ExpectCondition(condition, "y IS NULL IS NULL");
}

TEST_F(SqliteConditionTest, IsNullRefusesAnEmptyLeftSide) {
  ExpectCondition(SqliteIsNull(""), "");
  ExpectError("Bad lvalue[]");
  SqliteIsNull condition("x");
  EXPECT_FALSE(condition.SetValue(""));
  ExpectError("Bad lvalue[]");
  ExpectCondition(condition, "x IS NULL");
}

TEST_F(SqliteConditionTest, InListsItsValues) {
  ExpectCondition(SqliteIn("id", Values{1, 2, 3}), "id IN ( 1,2,3 )");
  ExpectCondition(SqliteIn("id", Values{"a'b"}), "id IN ( 'a''b' )");
  ExpectCondition(SqliteNotIn("id", Values{true, "x"}), "id NOT IN ( 1,'x' )");
}

TEST_F(SqliteConditionTest, AnEmptyListLeavesTwoBlanks) {
  ExpectCondition(SqliteIn("id", Values{}), "id IN (  )");
  ExpectCondition(SqliteNotIn("id", Values{}), "id NOT IN (  )");
}

TEST_F(SqliteConditionTest, ACommaStandsBeforeEveryValueButTheFirst) {
  ExpectCondition(SqliteIn("id", Values{4294967296LL, 1, 4294967296LL}), "id IN ( ,1, )");
}

TEST_F(SqliteConditionTest, InTakesATextAsItIs) {
  ExpectCondition(SqliteNotIn("id", "SELECT id FROM t"), "id NOT IN ( SELECT id FROM t )");
  ExpectCondition(SqliteIn("id", "'a', 'it's'"), "id IN ( 'a', 'it's' )");
}

TEST_F(SqliteConditionTest, ValuesInBracesAreAlwaysAList) {
  EXPECT_EQ(SqliteIn("name", {"a", "b'"}).GetText(), "name IN ( 'a','b''' )");
  EXPECT_EQ(SqliteNotIn("name", {"a", "b"}).GetText(), "name NOT IN ( 'a','b' )");
  EXPECT_EQ(SqliteIn("id", {1, 2}).GetText(), "id IN ( 1,2 )");
  EXPECT_EQ(SqliteNotIn("id", {1}).GetText(), "id NOT IN ( 1 )");
  EXPECT_EQ(SqliteIn("id", {}).GetText(), "id IN (  )");
  EXPECT_EQ(SqliteIn("id", {1, "a"}).GetText(), "id IN ( 1,'a' )");
  EXPECT_EQ(SqliteNotIn("id", {"a", 3}).GetText(), "id NOT IN ( 'a',3 )");
  EXPECT_EQ(SqliteIn("id", {SqliteValue(1), SqliteValue("a")}).GetText(), "id IN ( 1,'a' )");
  EXPECT_EQ(SqliteInFamily("IN", "id", {1, 2}).GetText(), "id IN ( 1,2 )");
  EXPECT_EQ(SqliteInFamily("NOT IN", "id", {1, "a"}).GetText(), "id NOT IN ( 1,'a' )");
  SqliteIn condition;
  EXPECT_TRUE(condition.SetValue("id", {1, 2}));
  EXPECT_EQ(condition.GetText(), "id IN ( 1,2 )");
  EXPECT_TRUE(condition.SetValue("id", {"a", 2}));
  EXPECT_EQ(condition.GetText(), "id IN ( 'a',2 )");
  EXPECT_FALSE(condition.SetValue("id", {SqliteValue(1), SqliteValue()}));
  EXPECT_EQ(condition.GetText(), "");
  ExpectError("Invalid rvalue []");
}

// As the text of the list it would be SQL.
TEST_F(SqliteConditionTest, OneTextInBracesIsAListToo) {
  const std::string text = "a') OR 1=1 --";
  const std::string list = "( 'a'') OR 1=1 --' )";
  EXPECT_EQ(SqliteIn("name", {text}).GetText(), "name IN " + list);
  EXPECT_EQ(SqliteNotIn("name", {text}).GetText(), "name NOT IN " + list);
  EXPECT_EQ(SqliteInFamily("IN", "name", {text}).GetText(), "name IN " + list);
  EXPECT_EQ(SqliteIn("name", {"a') OR 1=1 --"}).GetText(), "name IN " + list);
  SqliteIn condition;
  EXPECT_TRUE(condition.SetValue("name", {text}));
  EXPECT_EQ(condition.GetText(), "name IN " + list);
}

TEST_F(SqliteConditionTest, SettingInAgainReplacesTheText) {
  SqliteIn condition("id", Values{1});
  EXPECT_TRUE(condition.SetValue("n", Values{2}));
  ExpectCondition(condition, "n IN ( 2 )");
  EXPECT_TRUE(condition.SetValue("m", "3"));
  ExpectCondition(condition, "m IN ( 3 )");
}

// The keyword makes it valid, whatever its text is.
void ExpectValidWithText(const SqliteCondition& condition, const std::string& text) {
  EXPECT_EQ(condition.GetText(), text);
  EXPECT_TRUE(condition.IsValid());
}

TEST_F(SqliteConditionTest, InWithoutOperandsIsValidAndEmpty) {
  ExpectValidWithText(SqliteIn(), "");
  ExpectValidWithText(SqliteNotIn(), "");
  EXPECT_EQ(SqliteIn().GetKeyword(), "IN");
  EXPECT_EQ(SqliteNotIn().GetKeyword(), "NOT IN");
}

TEST_F(SqliteConditionTest, AnInvalidValueInTheListEmptiesTheText) {
  ExpectValidWithText(SqliteIn("id", Values{1, SqliteValue()}), "");
  ExpectError("Invalid rvalue []");
  SqliteIn condition("id", Values{1});
  SqliteValue invalid;
  invalid = SqliteValue("it's");
  EXPECT_FALSE(condition.SetValue("n", Values{2, invalid, 3}));
  ExpectError("Invalid rvalue ['it''s']");
  ExpectValidWithText(condition, "");
}

TEST_F(SqliteConditionTest, AnEmptyLeftSideLeavesTheTextOfInAlone) {
  SqliteIn condition("id", Values{1});
  EXPECT_FALSE(condition.SetValue("", Values{SqliteValue()}));
  ExpectError("Bad lvalue[]");
  EXPECT_FALSE(condition.SetValue("", "2"));
  ExpectError("Bad lvalue[] or value[2]");
  ExpectValidWithText(condition, "id IN ( 1 )");
  ExpectValidWithText(SqliteNotIn("", Values{1}), "");
  ExpectError("Bad lvalue[]");
}

TEST_F(SqliteConditionTest, AnEmptyTextIsNoList) {
  SqliteNotIn condition("id", "1");
  EXPECT_FALSE(condition.SetValue("n", ""));
  ExpectError("Bad lvalue[n] or value[]");
  ExpectValidWithText(condition, "id NOT IN ( 1 )");
}

TEST_F(SqliteConditionTest, TheOwnTextCanBeAnOperandOfIn) {
  SqliteIn condition("a", "1");
  EXPECT_TRUE(condition.SetValue(condition.GetText(), Values{2}));
  ExpectCondition(condition, "a IN ( 1 ) IN ( 2 )");
  EXPECT_TRUE(condition.SetValue("b", condition.GetText()));
  ExpectCondition(condition, "b IN ( a IN ( 1 ) IN ( 2 ) )");
  EXPECT_TRUE(condition.SetValue(condition.GetKeyword(), condition.GetKeyword()));
  ExpectCondition(condition, "IN IN ( IN )");
}

TEST_F(SqliteConditionTest, TheTwoKeywordsAreAcceptedAsTheyAre) {
  ExpectValidWithText(SqliteInFamily("IN"), "");
  ExpectValidWithText(SqliteInFamily("NOT IN", "id", "1"), "id NOT IN ( 1 )");
  ExpectValidWithText(SqliteInFamily("IN", "id", Values{1}), "id IN ( 1 )");
}

TEST_F(SqliteConditionTest, AnyOtherKeywordIsRefusedFirst) {
  for (const std::string keyword : {"in", "Not In", "", "IN ", " IN", "NOT  IN", "NOTIN", "LIKE"}) {
    SqliteInFamily condition(keyword);
    EXPECT_FALSE(condition.SetValue("", Values{SqliteValue()}));
    ExpectError("Bad keyword [" + keyword + "]");
    EXPECT_FALSE(condition.SetValue("", ""));
    ExpectError("Bad keyword [" + keyword + "]");
    EXPECT_FALSE(SqliteInFamily(keyword, "id", Values{1}).IsValid());
    ExpectError("Bad keyword [" + keyword + "]");
    EXPECT_FALSE(SqliteInFamily(keyword, "id", "1").IsValid());
    ExpectError("Bad keyword [" + keyword + "]");
    EXPECT_FALSE(condition.IsValid());
    EXPECT_EQ(condition.GetText(), "");
    EXPECT_EQ(condition.GetKeyword(), keyword);
  }
}

TEST_F(SqliteConditionTest, BothSettersOfInAskTheVirtualValidity) {
  class Refusing : public SqliteIn {
   public:
    bool IsValid() const override { return false; }
  };
  Refusing condition;
  EXPECT_FALSE(condition.SetValue("id", Values{1}));
  ExpectError("Bad keyword [IN]");
  EXPECT_FALSE(condition.SetValue("id", "1"));
  ExpectError("Bad keyword [IN]");
  class Accepting : public SqliteInFamily {
   public:
    Accepting() : SqliteInFamily("GLOB") {}
    bool IsValid() const override { return true; }
  };
  Accepting accepting;
  EXPECT_TRUE(accepting.SetValue("id", Values{1}));
  EXPECT_EQ(accepting.GetText(), "id GLOB ( 1 )");
}

TEST_F(SqliteConditionTest, CopiesKeepTextAndKeyword) {
  SqliteNotIn condition("id", "1");
  SqliteNotIn copy(condition);
  EXPECT_TRUE(condition.SetValue("n", "2"));
  ExpectCondition(copy, "id NOT IN ( 1 )");
  EXPECT_EQ(copy.GetKeyword(), "NOT IN");
  copy = condition;
  ExpectCondition(copy, "n NOT IN ( 2 )");
  const SqliteCondition text(condition);
  ExpectCondition(text, "n NOT IN ( 2 )");
}

TEST_F(SqliteConditionTest, AnyListIsItsLiteralsWithCommasBetween) {
  std::mt19937 random(5);
  for (int round = 0; round < 500; ++round) {
    Values values;
    std::string expected;
    for (auto left = random() % 10; left > 0; --left) {
      const auto number = static_cast<int>(random());
      const bool isText = random() % 2 == 0;
      values.push_back(isText ? SqliteValue(std::to_string(number)) : SqliteValue(number));
      if (!expected.empty()) expected += ',';
      expected += isText ? "'" + std::to_string(number) + "'" : std::to_string(number);
    }
    ASSERT_EQ(SqliteIn("n", values).GetText(), "n IN ( " + expected + " )");
    ASSERT_EQ(SqliteNotIn("n", values).GetText(), "n NOT IN ( " + expected + " )");
  }
}

}  // namespace
