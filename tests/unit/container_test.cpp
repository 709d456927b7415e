#include "kelodrcore/container.h"

#include <cmath>
#include <limits>
#include <string>
#include <vector>

#include "support/clean_test.h"

namespace {

namespace Container = KeloDRCore::Container;

using ContainerTest = CleanTest;
using Texts = std::vector<std::string>;

template <typename T>
std::string OneCharacter(T element) {
  return Container::ToString(std::vector<T>{element}, "separator");
}

std::string Byte(int value) { return std::string(1, static_cast<char>(value)); }

TEST_F(ContainerTest, AnEmptyVectorGivesAnEmptyArrayNotNull) {
  const Json::Value empty(Json::arrayValue);
  EXPECT_EQ(Container::ToJsonArray(Texts{}), empty);
  EXPECT_EQ(Container::ToJsonArray(std::vector<int>{}), empty);
  EXPECT_EQ(Container::ToJsonArray(std::vector<bool>{}), empty);
  EXPECT_EQ(Container::ToJsonArray(std::vector<double>{}), empty);
  EXPECT_TRUE(Container::ToJsonArray(Texts{}).isArray());
}

TEST_F(ContainerTest, TextsBecomeJsonStringsInOrder) {
  const std::string withNul("n\0l", 3);
  const Json::Value array = Container::ToJsonArray(Texts{"b", "", "a", "b", withNul});
  ASSERT_EQ(array.size(), 5U);
  EXPECT_EQ(array[0], Json::Value("b"));
  EXPECT_EQ(array[1], Json::Value(""));
  EXPECT_EQ(array[2], Json::Value("a"));
  EXPECT_EQ(array[3], Json::Value("b"));
  EXPECT_EQ(array[4].asString(), withNul);
  EXPECT_TRUE(array[1].isString());
}

TEST_F(ContainerTest, IntsBecomeJsonInts) {
  const int lowest = std::numeric_limits<int>::min();
  const Json::Value array = Container::ToJsonArray(std::vector<int>{3, lowest, 0});
  ASSERT_EQ(array.size(), 3U);
  for (const Json::Value& element : array) EXPECT_EQ(element.type(), Json::intValue);
  EXPECT_EQ(array[0].asInt(), 3);
  EXPECT_EQ(array[1].asInt(), lowest);
  EXPECT_EQ(array[2].asInt(), 0);
}

TEST_F(ContainerTest, BoolsBecomeJsonBooleans) {
  const Json::Value array = Container::ToJsonArray(std::vector<bool>{true, false});
  ASSERT_EQ(array.size(), 2U);
  EXPECT_EQ(array[0], Json::Value(true));
  EXPECT_EQ(array[1], Json::Value(false));
}

TEST_F(ContainerTest, DoublesBecomeJsonReals) {
  const Json::Value array = Container::ToJsonArray(std::vector<double>{1.5, 2.0});
  ASSERT_EQ(array.size(), 2U);
  EXPECT_EQ(array[0], Json::Value(1.5));
  EXPECT_EQ(array[1].type(), Json::realValue) << "a whole number stays a real";
}

TEST_F(ContainerTest, TextsAreJoinedWithTheSeparatorBetween) {
  EXPECT_EQ(Container::ToString(Texts{"id", "name"}, ", "), "id, name");
  EXPECT_EQ(Container::ToString(Texts{"b", "a", "b"}, ","), "b,a,b");
  EXPECT_EQ(Container::ToString(Texts{"a", "b"}, ""), "ab");
}

TEST_F(ContainerTest, OneTextHasNoSeparator) {
  EXPECT_EQ(Container::ToString(Texts{"id"}, ", "), "id");
}

TEST_F(ContainerTest, NothingJoinedIsEmpty) {
  EXPECT_EQ(Container::ToString(Texts{}, ","), "");
  EXPECT_EQ(Container::ToString(std::vector<int>{}, ","), "");
  EXPECT_EQ(Container::ToString(std::vector<bool>{}, ","), "");
  EXPECT_EQ(Container::ToString(std::vector<double>{}, ","), "");
}

TEST_F(ContainerTest, EmptyTextsAtTheStartLeaveNoSeparators) {
  EXPECT_EQ(Container::ToString(Texts{"", "b"}, ","), "b");
  EXPECT_EQ(Container::ToString(Texts{"", "", "a"}, ","), "a");
  EXPECT_EQ(Container::ToString(Texts{"", "", ""}, ","), "");
}

TEST_F(ContainerTest, LaterEmptyTextsKeepTheirSeparators) {
  EXPECT_EQ(Container::ToString(Texts{"a", "", "b"}, ","), "a,,b");
  EXPECT_EQ(Container::ToString(Texts{"", "a", ""}, ","), "a,");
}

TEST_F(ContainerTest, AnIntIsOneCharacterOfItsLowEightBits) {
  EXPECT_EQ(Container::ToString(std::vector<int>{65, 66}, ","), "A,B");
  EXPECT_EQ(OneCharacter(321), "A");
  EXPECT_EQ(OneCharacter(0), Byte(0));
  EXPECT_EQ(OneCharacter(256), Byte(0));
  EXPECT_EQ(OneCharacter(-1), Byte(0xFF));
  EXPECT_EQ(OneCharacter(-191), "A");
  EXPECT_EQ(OneCharacter(std::numeric_limits<int>::max()), Byte(0xFF));
  EXPECT_EQ(OneCharacter(std::numeric_limits<int>::min()), Byte(0));
}

TEST_F(ContainerTest, ABoolIsTheByteOneOrZero) {
  EXPECT_EQ(Container::ToString(std::vector<bool>{true, false}, ""), Byte(1) + Byte(0));
  EXPECT_EQ(Container::ToString(std::vector<bool>{false, true}, ","), Byte(0) + "," + Byte(1));
}

TEST_F(ContainerTest, TheByteZeroIsTextThatASeparatorFollows) {
  EXPECT_EQ(Container::ToString(std::vector<int>{0, 0, 65}, ","),
            Byte(0) + "," + Byte(0) + "," + "A");
  EXPECT_EQ(Container::ToString(std::vector<double>{0.5, 65}, "--"), Byte(0) + "--" + "A");
}

TEST_F(ContainerTest, ADoubleIsTruncatedTowardZero) {
  EXPECT_EQ(OneCharacter(65.9), "A");
  EXPECT_EQ(OneCharacter(0.99), Byte(0));
  EXPECT_EQ(OneCharacter(-0.99), Byte(0));
  EXPECT_EQ(OneCharacter(-1.5), Byte(0xFF));
  EXPECT_EQ(Container::ToString(std::vector<double>{65.0, 66.5}, ","), "A,B");
}

TEST_F(ContainerTest, ADoubleBeyondACharacterIsTakenModulo256) {
  EXPECT_EQ(OneCharacter(321.9), "A");
  EXPECT_EQ(OneCharacter(255.0), Byte(0xFF));
  EXPECT_EQ(OneCharacter(256.0), Byte(0));
  EXPECT_EQ(OneCharacter(-191.5), "A");
  EXPECT_EQ(OneCharacter(4294967296.0 + 65), "A");
  EXPECT_EQ(OneCharacter(-(4294967296.0 + 191)), "A");
  EXPECT_EQ(OneCharacter(std::ldexp(1.0, 52) + 65), "A");
  EXPECT_EQ(OneCharacter(1e300), Byte(0)) << "a multiple of 256";
  EXPECT_EQ(OneCharacter(std::numeric_limits<double>::max()), Byte(0));
  EXPECT_EQ(OneCharacter(std::numeric_limits<double>::lowest()), Byte(0));
  EXPECT_EQ(OneCharacter(std::numeric_limits<double>::denorm_min()), Byte(0));
}

TEST_F(ContainerTest, ADoubleThatIsNoNumberIsTheByteZero) {
  EXPECT_EQ(OneCharacter(std::numeric_limits<double>::quiet_NaN()), Byte(0));
  EXPECT_EQ(OneCharacter(std::numeric_limits<double>::infinity()), Byte(0));
  EXPECT_EQ(OneCharacter(-std::numeric_limits<double>::infinity()), Byte(0));
}

TEST_F(ContainerTest, TheArgumentsAreLeftAlone) {
  const Texts texts{"a", "b"};
  const std::string separator = ",";
  EXPECT_EQ(Container::ToString(texts, separator), "a,b");
  EXPECT_EQ(Container::ToString(texts, texts[0]), "aab") << "a separator out of the vector";
  EXPECT_EQ(texts, (Texts{"a", "b"}));
}

}  // namespace
