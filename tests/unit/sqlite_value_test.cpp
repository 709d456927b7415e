#include "kelodrcore/sqlite_value.h"

#include <sqlite3.h>

#include <algorithm>
#include <cstdint>
#include <limits>
#include <memory>
#include <random>
#include <regex>
#include <string>
#include <type_traits>
#include <utility>
#include <vector>

#include "support/clean_test.h"
#include "unit/grouping_locale.h"

namespace {

using KeloDRCore::SqliteRecord;
using KeloDRCore::SqliteValue;
using KeloDRCore::SqliteValueList;

constexpr long long kBeyond32Bits = 4294967296LL;

class SqliteValueTest : public CleanTest {
 protected:
  template <typename T>
  static void ExpectRead(const SqliteValue& value, const T& expected) {
    T out{};
    EXPECT_TRUE(value.GetValue(out)) << value.ToFormatedValue();
    EXPECT_EQ(out, expected);
  }

  template <typename T>
  static void ExpectRefused(const SqliteValue& value, const T& before, const std::string& message) {
    T out = before;
    EXPECT_FALSE(value.GetValue(out)) << message;
    EXPECT_EQ(out, before) << message;
    ExpectLog({Warn("sqlite_value.cpp", "GetValue", message)});
  }

  // Every integer type reads `value` as the 8-bit `expected`.
  static void ExpectReadByEveryInteger(const SqliteValue& value, int expected) {
    ExpectRead<int>(value, expected);
    ExpectRead<unsigned int>(value, static_cast<unsigned int>(expected));
    ExpectRead<long>(value, expected);
    ExpectRead<unsigned long>(value, static_cast<unsigned long>(expected));
    ExpectRead<long long>(value, expected);
    ExpectRead<unsigned long long>(value, static_cast<unsigned long long>(expected));
  }

  static void ExpectRefusedByEveryInteger(const SqliteValue& value, const std::string& message) {
    ExpectRefused<int>(value, 7, message);
    ExpectRefused<unsigned int>(value, 7, message);
    ExpectRefused<long>(value, 7, message);
    ExpectRefused<unsigned long>(value, 7, message);
    ExpectRefused<long long>(value, 7, message);
    ExpectRefused<unsigned long long>(value, 7, message);
  }
};

TEST_F(SqliteValueTest, OnlyWhatHasAnSqlTypeCompiles) {
  static_assert(!std::is_constructible_v<SqliteValue, double>);
  static_assert(!std::is_constructible_v<SqliteValue, float>);
  static_assert(!std::is_constructible_v<SqliteValue, long double>);
  static_assert(!std::is_constructible_v<SqliteValue, void*>);
  static_assert(!std::is_constructible_v<SqliteValue, const int*>);
  static_assert(!std::is_constructible_v<SqliteValue, const unsigned char*>);
  static_assert(!std::is_constructible_v<SqliteValue, const wchar_t*>);
  static_assert(!std::is_constructible_v<SqliteValue, volatile char*>);
  static_assert(!std::is_constructible_v<SqliteValue, std::string*>);
  static_assert(!std::is_constructible_v<SqliteValue, void (*)()>);
  static_assert(!std::is_assignable_v<SqliteValue&, double>);
  static_assert(!std::is_assignable_v<SqliteValue&, void*>);
  static_assert(!std::is_convertible_v<double, SqliteValue>);
}

TEST_F(SqliteValueTest, ShapeOfTheClasses) {
  static_assert(!std::is_polymorphic_v<SqliteValue>);
  static_assert(std::has_virtual_destructor_v<SqliteValueList>);
  static_assert(std::is_abstract_v<SqliteRecord>);
  static_assert(!std::has_virtual_destructor_v<SqliteRecord>);
  static_assert(sizeof(SqliteRecord) == sizeof(void*), "no data of its own");
}

TEST_F(SqliteValueTest, ADefaultValueIsNoValue) {
  const SqliteValue none;
  EXPECT_FALSE(none.IsValid());
  EXPECT_EQ(none.ToFormatedValue(), "");
}

TEST_F(SqliteValueTest, EveryTypedValueIsValid) {
  EXPECT_TRUE(SqliteValue(0).IsValid());
  EXPECT_TRUE(SqliteValue(false).IsValid());
  EXPECT_TRUE(SqliteValue(0U).IsValid());
  EXPECT_TRUE(SqliteValue(0L).IsValid());
  EXPECT_TRUE(SqliteValue(0UL).IsValid());
  EXPECT_TRUE(SqliteValue(0LL).IsValid());
  EXPECT_TRUE(SqliteValue(0ULL).IsValid());
  EXPECT_TRUE(SqliteValue(std::string()).IsValid());
  EXPECT_TRUE(SqliteValue("").IsValid());
  EXPECT_TRUE(SqliteValue(kBeyond32Bits).IsValid());
  EXPECT_TRUE(SqliteValue(std::numeric_limits<unsigned long long>::max()).IsValid());
}

TEST_F(SqliteValueTest, TextsAreQuotedWithEveryQuoteDoubled) {
  EXPECT_EQ(SqliteValue(std::string()).ToFormatedValue(), "''");
  EXPECT_EQ(SqliteValue(std::string("it's")).ToFormatedValue(), "'it''s'");
  EXPECT_EQ(SqliteValue(std::string("O'Brien's")).ToFormatedValue(), "'O''Brien''s'");
  EXPECT_EQ(SqliteValue(std::string("''")).ToFormatedValue(), "''''''");
  EXPECT_EQ(SqliteValue(std::string("'a'")).ToFormatedValue(), "'''a'''");
}

TEST_F(SqliteValueTest, NothingButQuotesIsEscaped) {
  const std::string text = "\\ % _ \" ` ; -- \n\r\t\x01 \xC3\xA9 \xFF $& $1";
  EXPECT_EQ(SqliteValue(text).ToFormatedValue(), "'" + text + "'");
}

TEST_F(SqliteValueTest, ANulByteInATextIsKept) {
  const std::string text("a\0'b\0", 5);
  EXPECT_EQ(SqliteValue(text).ToFormatedValue(), std::string("'a\0''b\0'", 8));
  ExpectRead<std::string>(SqliteValue(text), text);
}

TEST_F(SqliteValueTest, BoolsAreDigits) {
  EXPECT_EQ(SqliteValue(true).ToFormatedValue(), "1");
  EXPECT_EQ(SqliteValue(false).ToFormatedValue(), "0");
}

TEST_F(SqliteValueTest, IntegersWithin32BitsAreDecimal) {
  EXPECT_EQ(SqliteValue(0).ToFormatedValue(), "0");
  EXPECT_EQ(SqliteValue(-1).ToFormatedValue(), "-1");
  EXPECT_EQ(SqliteValue(std::numeric_limits<int>::max()).ToFormatedValue(), "2147483647");
  EXPECT_EQ(SqliteValue(std::numeric_limits<int>::min()).ToFormatedValue(), "-2147483648");
  EXPECT_EQ(SqliteValue(4294967295U).ToFormatedValue(), "4294967295");
  EXPECT_EQ(SqliteValue(-5L).ToFormatedValue(), "-5");
  EXPECT_EQ(SqliteValue(4294967295UL).ToFormatedValue(), "4294967295");
  EXPECT_EQ(SqliteValue(2147483648LL).ToFormatedValue(), "2147483648");
  EXPECT_EQ(SqliteValue(-2147483648LL).ToFormatedValue(), "-2147483648");
  EXPECT_EQ(SqliteValue(4294967295ULL).ToFormatedValue(), "4294967295");
  EXPECT_EQ(SqliteValue('A').ToFormatedValue(), "65") << "a character is a small integer";
}

TEST_F(SqliteValueTest, IntegersBeyond32BitsAreValidButRenderAsNothing) {
  for (const long long number :
       {kBeyond32Bits, -2147483649LL, -kBeyond32Bits, std::numeric_limits<long long>::max(),
        std::numeric_limits<long long>::min()}) {
    EXPECT_TRUE(SqliteValue(number).IsValid());
    EXPECT_EQ(SqliteValue(number).ToFormatedValue(), "") << number;
  }
  EXPECT_EQ(SqliteValue(4294967296ULL).ToFormatedValue(), "");
  EXPECT_EQ(SqliteValue(std::numeric_limits<unsigned long long>::max()).ToFormatedValue(), "");
}

TEST_F(SqliteValueTest, ALongIsStoredWhole) {
  const bool isWide = sizeof(long) > 4;
  const SqliteValue value(std::numeric_limits<long>::min());
  EXPECT_TRUE(value.IsValid());
  EXPECT_EQ(value.ToFormatedValue(), isWide ? "" : "-2147483648");
  ExpectRead<long long>(value, std::numeric_limits<long>::min());
  const SqliteValue large(std::numeric_limits<unsigned long>::max());
  EXPECT_EQ(large.ToFormatedValue(), isWide ? "" : "4294967295");
  ExpectRead<unsigned long long>(large, std::numeric_limits<unsigned long>::max());
}

TEST_F(SqliteValueTest, ALiteralMeansText) {
  EXPECT_EQ(SqliteValue("abc").ToFormatedValue(), "'abc'");
  EXPECT_EQ(SqliteValue("").ToFormatedValue(), "''");
  char text[] = "it's";
  EXPECT_EQ(SqliteValue(text).ToFormatedValue(), "'it''s'");
  SqliteValue assigned(1);
  assigned = "x";
  EXPECT_EQ(assigned.ToFormatedValue(), "'x'");
}

TEST_F(SqliteValueTest, ANullPointerIsNoValue) {
  const char* const null = nullptr;
  SqliteValue value(null);
  EXPECT_FALSE(value.IsValid());
  EXPECT_EQ(value.ToFormatedValue(), "");
  EXPECT_FALSE(SqliteValue(nullptr).IsValid());
  value = SqliteValue(1);
  EXPECT_FALSE(value.IsValid()) << "assigning does not make it valid";
}

TEST_F(SqliteValueTest, CopyingCopiesPayloadAndValidity) {
  const SqliteValue valid(5);
  const SqliteValue copy(valid);
  EXPECT_TRUE(copy.IsValid());
  EXPECT_EQ(copy.ToFormatedValue(), "5");
  SqliteValue invalid;
  invalid = valid;
  const SqliteValue copyOfInvalid(invalid);
  EXPECT_FALSE(copyOfInvalid.IsValid());
  EXPECT_EQ(copyOfInvalid.ToFormatedValue(), "5");
}

TEST_F(SqliteValueTest, MovingCopies) {
  SqliteValue source("a'b");
  const SqliteValue constructed(std::move(source));
  SqliteValue assigned;
  assigned = std::move(source);   // NOLINT(bugprone-use-after-move): that it is whole is the test
  EXPECT_TRUE(source.IsValid());  // NOLINT(bugprone-use-after-move)
  for (const SqliteValue& value : {source, constructed, assigned}) {
    EXPECT_EQ(value.ToFormatedValue(), "'a''b'");
  }
  EXPECT_FALSE(assigned.IsValid());
}

TEST_F(SqliteValueTest, AssigningCopiesThePayloadOnly) {
  SqliteValue none;
  EXPECT_EQ(&(none = SqliteValue("a")), &none);
  EXPECT_FALSE(none.IsValid()) << "the target's validity stays";
  EXPECT_EQ(none.ToFormatedValue(), "'a'");
  ExpectRead<std::string>(none, "a");

  SqliteValue value("a");
  value = SqliteValue(3);
  EXPECT_TRUE(value.IsValid());
  EXPECT_EQ(value.ToFormatedValue(), "3") << "the type is the payload's";

  value = SqliteValue();
  EXPECT_FALSE(value.IsValid()) << "there is nothing in it";
  value = none;
  EXPECT_TRUE(value.IsValid()) << "its own validity was never lost";
  EXPECT_EQ(value.ToFormatedValue(), "'a'");
}

TEST_F(SqliteValueTest, AssigningToItselfChangesNothing) {
  SqliteValue value("a'b");
  const SqliteValue& same = value;
  value = same;
  EXPECT_TRUE(value.IsValid());
  EXPECT_EQ(value.ToFormatedValue(), "'a''b'");
}

TEST_F(SqliteValueTest, EveryIntegerTypeReadsEveryInteger) {
  ExpectReadByEveryInteger(SqliteValue(5), 5);
  ExpectReadByEveryInteger(SqliteValue(5U), 5);
  ExpectReadByEveryInteger(SqliteValue(5L), 5);
  ExpectReadByEveryInteger(SqliteValue(5UL), 5);
  ExpectReadByEveryInteger(SqliteValue(5LL), 5);
  ExpectReadByEveryInteger(SqliteValue(5ULL), 5);
}

TEST_F(SqliteValueTest, IntegerTypesRefuseEverythingElse) {
  ExpectRefusedByEveryInteger(SqliteValue("5"), "[\"5\"] is not int");
  ExpectRefusedByEveryInteger(SqliteValue(true), "[true] is not int");
  ExpectRefusedByEveryInteger(SqliteValue(), "[null] is not int");
}

TEST_F(SqliteValueTest, AnIntegerThatDoesNotFitIsRefused) {
  ExpectRefused<int>(2147483648U, 7, "[2147483648] is not int");
  ExpectRefused<int>(-2147483649LL, 7, "[-2147483649] is not int");
  ExpectRefused<unsigned int>(-1, 7, "[-1] is not int");
  ExpectRefused<unsigned int>(kBeyond32Bits, 7, "[4294967296] is not int");
  ExpectRefused<long>(9223372036854775808ULL, 7, "[9223372036854775808] is not int");
  ExpectRefused<unsigned long>(-1, 7, "[-1] is not int");
  ExpectRefused<long long>(9223372036854775808ULL, 7, "[9223372036854775808] is not int");
  ExpectRefused<unsigned long long>(-1, 7, "[-1] is not int");
}

TEST_F(SqliteValueTest, TheLimitsOfEachTypeAreRead) {
  ExpectRead<int>(2147483647U, 2147483647);
  ExpectRead<int>(-2147483648LL, std::numeric_limits<int>::min());
  ExpectRead<unsigned int>(4294967295LL, 4294967295U);
  ExpectRead<long long>(std::numeric_limits<long long>::min(),
                        std::numeric_limits<long long>::min());
  ExpectRead<long long>(9223372036854775807ULL, std::numeric_limits<long long>::max());
  ExpectRead<unsigned long long>(std::numeric_limits<unsigned long long>::max(),
                                 std::numeric_limits<unsigned long long>::max());
}

TEST_F(SqliteValueTest, LongsKeepTheLow32Bits) {
  ExpectRead<long>(kBeyond32Bits + 5, 5);
  ExpectRead<long>(4294967295U, -1);
  ExpectRead<long>(2147483648U, std::numeric_limits<int32_t>::min());
  ExpectRead<long>(-kBeyond32Bits - 5, -5);
  ExpectRead<unsigned long>(kBeyond32Bits + 5, 5UL);
  ExpectRead<unsigned long>(std::numeric_limits<unsigned long long>::max(), 4294967295UL);
}

TEST_F(SqliteValueTest, ABoolReadsBoolsAndTheIntegersZeroAndOne) {
  ExpectRead<bool>(true, true);
  ExpectRead<bool>(false, false);
  ExpectRead<bool>(1, true);
  ExpectRead<bool>(0, false);
  ExpectRead<bool>(1U, true);
  ExpectRead<bool>(1LL, true);
}

TEST_F(SqliteValueTest, ABoolRefusesEverythingElse) {
  ExpectRefused<bool>(2, true, "[2] is not bool");
  ExpectRefused<bool>(-1, true, "[-1] is not bool");
  ExpectRefused<bool>(std::numeric_limits<int>::min(), true, "[-2147483648] is not bool");
  ExpectRefused<bool>(kBeyond32Bits + 1, false, "[4294967297] is not bool");
  ExpectRefused<bool>("1", false, "[\"1\"] is not bool");
  ExpectRefused<bool>("true", false, "[\"true\"] is not bool");
  ExpectRefused<bool>(SqliteValue(), true, "[null] is not bool");
}

TEST_F(SqliteValueTest, AStringReadsTextsOnly) {
  ExpectRead<std::string>("it's", "it's");
  ExpectRead<std::string>("", "");
  ExpectRefused<std::string>(5, "old", "[5] is not string");
  ExpectRefused<std::string>(true, "old", "[true] is not string");
  ExpectRefused<std::string>(SqliteValue(), "old", "[null] is not string");
}

TEST_F(SqliteValueTest, ValidityIsNotAskedWhenReading) {
  SqliteValue value;
  value = SqliteValue(5);
  ASSERT_FALSE(value.IsValid());
  ExpectRead<int>(value, 5);
}

TEST_F(SqliteValueTest, NumbersArePlainWhateverTheLocale) {
  const GroupingLocale locale;
  EXPECT_EQ(SqliteValue(-1234567).ToFormatedValue(), "-1234567");
  EXPECT_EQ(SqliteValue(4294967295U).ToFormatedValue(), "4294967295");
  ExpectRefused<std::string>(1234567, "old", "[1234567] is not string");
}

// A random text of at most 200 characters, mostly short. `quotes` of 8 characters are quotes; the
// others are any byte but NUL or, when `isUtf8`, any character.
std::string RandomText(std::mt19937& random, unsigned int quotes, bool isUtf8) {
  static const std::vector<std::string> kCharacters = {
      "a", "\n", "\\", "\xC3\xA9", "\xE2\x82\xAC", "\xF0\x9F\x98\x80"};
  std::string text;
  const unsigned long most = random() % 10 == 0 ? 200 : 32;
  for (unsigned long left = random() % (most + 1); left > 0; --left) {
    if (random() % 8 < quotes) {
      text += '\'';
    } else if (isUtf8) {
      text += kCharacters[random() % kCharacters.size()];
    } else {
      text += static_cast<char>(1 + random() % 255);
    }
  }
  return text;
}

std::string LiteralByRegex(const std::string& text) {
  static const std::regex quote("'");
  return "'" + std::regex_replace(text, quote, "''") + "'";
}

// What SQLite reads a literal as.
std::string Select(sqlite3* db, const std::string& literal) {
  const std::string sql = "SELECT " + literal;
  sqlite3_stmt* prepared = nullptr;
  sqlite3_prepare_v2(db, sql.data(), static_cast<int>(sql.size()), &prepared, nullptr);
  const std::unique_ptr<sqlite3_stmt, int (*)(sqlite3_stmt*)> statement(prepared, sqlite3_finalize);
  if (sqlite3_step(prepared) != SQLITE_ROW) return "no row: " + sql;
  if (sqlite3_column_type(prepared, 0) != SQLITE_TEXT) return "no text: " + sql;
  const void* const bytes = sqlite3_column_blob(prepared, 0);
  const auto size = static_cast<size_t>(sqlite3_column_bytes(prepared, 0));
  return size == 0 ? std::string() : std::string(static_cast<const char*>(bytes), size);
}

TEST_F(SqliteValueTest, AnyTextIsRenderedAsTheRegexRendersItAndReadBackBySqlite) {
  sqlite3* opened = nullptr;
  ASSERT_EQ(sqlite3_open(":memory:", &opened), SQLITE_OK);
  const std::unique_ptr<sqlite3, int (*)(sqlite3*)> db(opened, sqlite3_close);
  std::mt19937 random(20240611);
  for (unsigned int i = 0; i < 100000; ++i) {
    const std::string text = RandomText(random, i % 9, i % 2 == 0);
    const std::string literal = SqliteValue(text).ToFormatedValue();
    ASSERT_EQ(literal, LiteralByRegex(text)) << "text " << i;
    ASSERT_EQ(Select(db.get(), literal), text) << "text " << i;
  }
}

TEST_F(SqliteValueTest, OneOrTwoQuotesAreDoubledWhereverTheyStand) {
  for (const size_t length : {1U, 7U, 8U, 9U, 15U, 16U, 17U, 24U, 63U, 64U, 65U, 200U}) {
    const std::string text(length, 'x');
    for (size_t first = 0; first < length; ++first) {
      for (size_t second = first; second < length; ++second) {
        std::string quoted = text;
        quoted[first] = quoted[second] = '\'';
        std::string expected = quoted;
        expected.insert(second, "'");
        if (first != second) expected.insert(first, "'");
        ASSERT_EQ(SqliteValue(quoted).ToFormatedValue(), "'" + expected + "'");
      }
    }
  }
}

TEST_F(SqliteValueTest, TextsWithNulBytesAreRenderedAsTheRegexRendersThem) {
  std::mt19937 random(7);
  for (unsigned int i = 0; i < 10000; ++i) {
    std::string text = RandomText(random, i % 9, false);
    for (char& byte : text) {
      if (random() % 4 == 0) byte = '\0';
    }
    ASSERT_EQ(SqliteValue(text).ToFormatedValue(), LiteralByRegex(text)) << "text " << i;
  }
}

}  // namespace
