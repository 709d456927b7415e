// The text form of documents; the files are in json_value_file_test.cpp.

#include "kelodrcore/json_value.h"

#include <pthread.h>

#include <clocale>
#include <cmath>
#include <cstdlib>
#include <cstring>
#include <limits>
#include <locale>
#include <memory>
#include <string>
#include <vector>

#include "support/clean_test.h"
#include "unit/random_json.h"

namespace {

using KeloDRCore::JsonValue::fromString;
using KeloDRCore::JsonValue::toString;

using JsonValueTest = CleanTest;

Json::Value Parsed(const std::string& text) {
  Json::Value value("untouched");
  EXPECT_TRUE(fromString(value, text)) << text;
  return value;
}

void ExpectRefused(const std::string& text) {
  Json::Value value("untouched");
  EXPECT_FALSE(fromString(value, text)) << text;
  EXPECT_EQ(value, Json::Value("untouched")) << text;
}

std::string Nested(int levels) {
  return std::string(static_cast<size_t>(levels), '[') +
         std::string(static_cast<size_t>(levels), ']');
}

std::string WrittenByJsonCpp(const Json::Value& value) {
  Json::StreamWriterBuilder builder;
  builder["indentation"] = "";
  builder["commentStyle"] = "None";
  builder["emitUTF8"] = true;
  return Json::writeString(builder, value);
}

TEST_F(JsonValueTest, WritesOneCompactLineInTheOrderOfNames) {
  Json::Value value;
  value["b"].append(1);
  value["b"].append("x");
  value["a"] = Json::Value(Json::objectValue);
  value["c"] = Json::Value(Json::arrayValue);
  value["d"] = true;
  value["e"];
  EXPECT_EQ(toString(value), R"({"a":{},"b":[1,"x"],"c":[],"d":true,"e":null})");
}

TEST_F(JsonValueTest, WritesNoComments) {
  Json::Value value;
  Json::CharReaderBuilder collecting;
  const std::unique_ptr<Json::CharReader> reader(collecting.newCharReader());
  const std::string text = "// before\n{\"a\": /*in*/ 1} // after\n";
  ASSERT_TRUE(reader->parse(text.data(), text.data() + text.size(), &value, nullptr));
  ASSERT_TRUE(value.hasComment(Json::commentBefore));
  EXPECT_EQ(toString(value), "{\"a\":1}");
}

TEST_F(JsonValueTest, WritesUtf8AsItIs) {
  EXPECT_EQ(toString("\xC3\xA9\xE2\x82\xAC\xF0\x9F\x98\x80\x7F/"),
            "\"\xC3\xA9\xE2\x82\xAC\xF0\x9F\x98\x80\x7F/\"");
}

TEST_F(JsonValueTest, EscapesQuoteBackslashAndControlBytes) {
  EXPECT_EQ(toString(std::string("\"\\\b\f\n\r\t\0\x01\x1f", 10)),
            R"("\"\\\b\f\n\r\t\u0000\u0001\u001f")");
}

TEST_F(JsonValueTest, EveryByteOfTextsAndNamesComesBack) {
  std::string bytes;
  for (int c = 0; c < 256; ++c) bytes += static_cast<char>(c);
  Json::Value value;
  value[bytes] = bytes;
  EXPECT_EQ(Parsed(toString(value)), value);
}

TEST_F(JsonValueTest, WritesIntegersWhole) {
  EXPECT_EQ(toString(Json::Value::minLargestInt), "-9223372036854775808");
  EXPECT_EQ(toString(Json::Value::maxLargestUInt), "18446744073709551615");
}

TEST_F(JsonValueTest, WritesDoublesAsDoubles) {
  EXPECT_EQ(toString(1.0), "1.0");
  EXPECT_EQ(toString(-0.0), "-0.0");
  EXPECT_EQ(toString(1.5), "1.5");
  EXPECT_EQ(toString(0.1), "0.10000000000000001");
  EXPECT_EQ(toString(1e300), "1.0000000000000001e+300");
}

TEST_F(JsonValueTest, WritesNumbersThatJsonLacksAsJsonCppDoes) {
  const double infinity = std::numeric_limits<double>::infinity();
  EXPECT_EQ(toString(std::nan("")), "null");
  EXPECT_EQ(toString(infinity), "1e+9999");
  EXPECT_EQ(toString(-infinity), "-1e+9999");
}

TEST_F(JsonValueTest, WritesNullForTheGapsOfAnArray) {
  Json::Value value;
  value[2] = 1;
  EXPECT_EQ(toString(value), "[null,null,1]");
}

TEST_F(JsonValueTest, RandomDocumentsComeBackAndReadAsJsonCppWritesThem) {
  RandomJson random(1);
  for (int i = 0; i < 20000; ++i) {
    const Json::Value value = random.Value(4);
    const std::string text = toString(value);
    ASSERT_EQ(text, WrittenByJsonCpp(value));
    ASSERT_EQ(text.find('\n'), std::string::npos);
    const Json::Value back = Parsed(text);
    ASSERT_EQ(back, value) << text;
    ASSERT_EQ(toString(back), text);
  }
}

// The document with bytes put in, taken out and replaced.
std::string Mutated(std::string text, RandomJson& random) {
  static const char* const kPieces[] = {
      "{",    "}",           "[",       "]",        ",",
      ":",    "\"",          "\\",      "/**/",     "+",
      "-",    "//\n",        "1e400",   "1e-400",   "-.5",
      "1.",   "1e+",         "007",     " ",        "'",
      "/",    "\\ud83d",     "\\udc00", "\\u00e",   "99999999999999999999",
      "*",    "n",           "true",    "Infinity", "\"x\":[1,",
      "\xFF", "\xEF\xBB\xBF"};
  for (unsigned changes = random.Below(4); changes > 0; --changes) {
    const size_t at = random.Below(static_cast<unsigned>(text.size()) + 1);
    const size_t length = random.Below(3);
    const unsigned piece = random.Below(sizeof kPieces / sizeof *kPieces + 1);
    text.replace(at, length, piece > 0 ? kPieces[piece - 1] : "");
  }
  return text;
}

// What is read is all of the text, and it comes back.
void ExpectPromisesKept(const std::string& text, const Json::Value& value, RandomJson& random) {
  ASSERT_EQ(Parsed(toString(value)), value) << text;
  ASSERT_EQ(toString(Parsed(text + "\n/* end */ // end")), toString(value)) << text;
  for (const char* rest : {"\n{}", "\n@", "\n/", "\n\x01", "\n\xFF"}) ExpectRefused(text + rest);
  std::string cut = text;
  cut.insert(random.Below(static_cast<unsigned>(text.size()) + 1), 1, '\0');
  ExpectRefused(cut);
}

TEST_F(JsonValueTest, RandomTextsAreReadWholeOrRefused) {
  RandomJson random(2);
  int accepted = 0;
  for (int i = 0; i < 30000; ++i) {
    const std::string text = Mutated(toString(random.Value(3)), random);
    Json::Value value("untouched");
    if (!fromString(value, text)) {
      ASSERT_EQ(value, Json::Value("untouched")) << text;
      continue;
    }
    ++accepted;
    ASSERT_NO_FATAL_FAILURE(ExpectPromisesKept(text, value, random));
  }
  EXPECT_GT(accepted, 5000);
}

TEST_F(JsonValueTest, RandomBytesNeverThrowAndChangeNothingOnFailure) {
  RandomJson random(3);
  for (int i = 0; i < 20000; ++i) {
    Json::Value value("untouched");
    if (fromString(value, random.Text())) continue;
    ASSERT_EQ(value, Json::Value("untouched"));
  }
}

TEST_F(JsonValueTest, ReadsValuesOfEveryType) {
  EXPECT_EQ(Parsed("null"), Json::Value());
  EXPECT_EQ(Parsed(" \t\r\ntrue\n"), Json::Value(true));
  EXPECT_TRUE(Parsed("7").isInt());
  EXPECT_EQ(Parsed("-9223372036854775808"), Json::Value(Json::Value::minLargestInt));
  EXPECT_EQ(Parsed("9223372036854775807"), Json::Value(Json::Value::maxLargestInt));
  EXPECT_EQ(Parsed("18446744073709551615"), Json::Value(Json::Value::maxLargestUInt));
  EXPECT_EQ(Parsed("18446744073709551616"), Json::Value(18446744073709551616.0));
  EXPECT_EQ(Parsed("-2.5e-1"), Json::Value(-0.25));
  EXPECT_EQ(Parsed(R"("\u00e9\ud83d\ude00\/")"), Json::Value("\xC3\xA9\xF0\x9F\x98\x80/"));
  EXPECT_EQ(Parsed(R"({"a":[1,{}]})")["a"].size(), 2U);
}

TEST_F(JsonValueTest, ReadsEscapesAtEachBoundOfTheUtf8Lengths) {
  EXPECT_EQ(Parsed(R"("\u00AF\u00fA")"), Json::Value("\xC2\xAF\xC3\xBA"));
  EXPECT_EQ(Parsed(R"("\u007f\u0080")"), Json::Value("\x7F\xC2\x80"));
  EXPECT_EQ(Parsed(R"("\u07ff\u0800")"), Json::Value("\xDF\xBF\xE0\xA0\x80"));
  EXPECT_EQ(Parsed(R"("\uffff\ud800\udc00")"), Json::Value("\xEF\xBF\xBF\xF0\x90\x80\x80"));
  EXPECT_EQ(Parsed(R"("\udbff\udfff")"), Json::Value("\xF4\x8F\xBF\xBF"));
}

// JsonCpp 1.9.5 refuses it.
TEST_F(JsonValueTest, ANumberBeyondADoublesRangeIsRefusedOrInfinite) {
  for (const char* text : {"1e400", "-1e400", "1.5e99999999999999999999"}) {
    Json::Value value(0);
    if (fromString(value, text)) {
      EXPECT_TRUE(std::isinf(value.asDouble())) << text;
    } else {
      EXPECT_EQ(value, Json::Value(0)) << text;
    }
  }
}

TEST_F(JsonValueTest, ReplacesWhatTheValueHeldCommentsIncluded) {
  Json::Value value;
  value["old"] = 1;
  value.setComment(std::string("// old"), Json::commentBefore);
  ASSERT_TRUE(fromString(value, "{\"new\":2}"));
  EXPECT_EQ(toString(value), "{\"new\":2}");
  EXPECT_FALSE(value.hasComment(Json::commentBefore));
}

TEST_F(JsonValueTest, AcceptsAndDropsComments) {
  const Json::Value value = Parsed("/*a*/ // b\n{ /*c*/ \"x\": /*d*/ [1 /*e*/, 2] /*f*/ } // g");
  EXPECT_EQ(toString(value), "{\"x\":[1,2]}");
  EXPECT_EQ(value.getComment(Json::commentBefore), "");
}

TEST_F(JsonValueTest, ACommentEndsAtACarriageReturnAsWell) {
  EXPECT_EQ(toString(Parsed("[1, // one\r2, // two\r\n3]")), "[1,2,3]");
}

TEST_F(JsonValueTest, SkipsOneByteOrderMark) {
  EXPECT_EQ(Parsed("\xEF\xBB\xBF[1] ").size(), 1U);
  ExpectRefused("\xEF\xBB\xBF[1]]");
  ExpectRefused("\xEF\xBB\xBF\xEF\xBB\xBF[1]");
  ExpectRefused(" \xEF\xBB\xBF[1]");
  ExpectRefused("\xEF\xBB[1]");
}

TEST_F(JsonValueTest, IsAsLenientAsJsonCppInsideTheDocument) {
  EXPECT_EQ(Parsed("[1,]").size(), 1U);
  EXPECT_EQ(Parsed("{\"a\":1,}").size(), 1U);
  EXPECT_EQ(Parsed(R"({"a":{"x":1},"a":{"y":2}})"), Parsed(R"({"a":{"y":2}})"));
  EXPECT_EQ(Parsed("007"), Json::Value(7));
  EXPECT_EQ(Parsed("\"a\nb\""), Json::Value("a\nb"));
}

TEST_F(JsonValueTest, RefusesAnythingBehindTheDocument) {
  for (const char* text :
       {"{} x", "{}{}", "[1]]", "1 2", "{},", "{} /", "{} /* x", "{} /* x /", "{} /*/", "{} /**/x",
        "\"a\"b", "{}@", "{}\v", "{} \xEF\xBB\xBF", "1.5.", "{} // x\n@"}) {
    ExpectRefused(text);
  }
  ExpectRefused(std::string("{}\0", 3));
  ExpectRefused(std::string("{}\0{}", 5));
  ExpectRefused(std::string("{} \n\0", 5));
  ExpectRefused(std::string("[\"a\0\"]", 6));
  ExpectRefused(std::string("[/*\0*/]", 7));
  for (int byte = 1; byte < 256; ++byte) {
    const std::string text(1, static_cast<char>(byte));
    if (strchr(" \t\r\n", byte) == nullptr) ExpectRefused("{} " + text);
    if (strchr("\r\n", byte) == nullptr) Parsed("{} //" + text + "x");
  }
  EXPECT_EQ(Parsed("{} \n // end\n /* end */ \t"), Json::Value(Json::objectValue));
}

TEST_F(JsonValueTest, RefusesTextsWithoutADocument) {
  for (const char* text : {"", " ", "\n", "// x", "/* x */", "\xEF\xBB\xBF"}) ExpectRefused(text);
}

TEST_F(JsonValueTest, RefusesSyntaxErrors) {
  for (const char* text :
       {"{",     "[",        "[1",        "[1 2]",     "{\"a\"}",     "{\"a\" 1}",
        "{a:1}", "{1:1}",    "[,]",       "[1,,2]",    "tru",         "True",
        "'a'",   "\"a",      "\"\\x\"",   "\"\\u12\"", "\"\\ud800\"", "\"\\ud800x\"",
        "NaN",   "Infinity", "-Infinity", "1e",        "1e+",         "]",
        "}",     ":",        "[}",        "{]",        "{\"\\x\""}) {
    ExpectRefused(text);
  }
  ExpectRefused(std::string("\"\\\0\"", 4));
}

TEST_F(JsonValueTest, RefusesMoreThanAThousandLevels) {
  EXPECT_TRUE(Parsed(Nested(1000)).isArray());
  ExpectRefused(Nested(1001));
  ExpectRefused(std::string(1000000, '['));
  // A comment may stand in the place of what follows a value.
  for (const std::string object : {"{\"a\":1}", "{\"a\":/**/1}"}) {
    ExpectRefused(std::string(999, '[') + object + std::string(999, ']'));
  }
  EXPECT_TRUE(Parsed(std::string(998, '[') + "{\"a\":1}" + std::string(998, ']')).isArray());
}

// Below, the most that 1,000 levels may take: the header says so to who starts threads.
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
constexpr size_t kStack = size_t{8} << 20;
#else
constexpr size_t kStack = size_t{1} << 20;
#endif

void* ReadAndWriteNested(void* read) {
  Json::Value value;
  std::string text = "[]";  // arrays and objects in turns
  for (int level = 1; level < 1000; ++level) {
    text = level % 2 == 0 ? "[" + text + "]" : "{\"a\":" + text + "}";
  }
  *static_cast<bool*>(read) = fromString(value, text) && toString(value) == text;
  return nullptr;
}

TEST_F(JsonValueTest, AThousandLevelsNeedNoMoreStackThanTheHeaderSays) {
  pthread_attr_t attributes;
  ASSERT_EQ(pthread_attr_init(&attributes), 0);
  ASSERT_EQ(pthread_attr_setstacksize(&attributes, kStack), 0);
  pthread_t thread;
  bool read = false;
  ASSERT_EQ(pthread_create(&thread, &attributes, ReadAndWriteNested, &read), 0);
  EXPECT_EQ(pthread_join(thread, nullptr), 0);
  EXPECT_EQ(pthread_attr_destroy(&attributes), 0);
  EXPECT_TRUE(read);
}

class CommaPoint : public std::numpunct<char> {
  char do_decimal_point() const override { return ','; }
  char do_thousands_sep() const override { return '.'; }
  std::string do_grouping() const override { return "\3"; }
};

// Streams write and read 1234.5 as 1.234,5 while it lives.
class CommaLocale {
 public:
  CommaLocale() : before(std::locale::global(std::locale(std::locale(), new CommaPoint))) {}
  CommaLocale(const CommaLocale&) = delete;
  CommaLocale& operator=(const CommaLocale&) = delete;
  ~CommaLocale() { std::locale::global(before); }

 private:
  const std::locale before;
};

void ExpectPlainNumbers() {
  const std::string text = "[1234567,1.5,1234567.25,1.0000000000000001e+300]";
  EXPECT_EQ(toString(Parsed(text)), text);
  EXPECT_EQ(Parsed("1.500"), Json::Value(1.5));
  EXPECT_EQ(Parsed("-1.25E+2"), Json::Value(-125.0));
  EXPECT_EQ(Parsed("[1.e2,1.,-0.5e-1]"), Parsed("[1e2,1e0,-5e-2]"));
  EXPECT_EQ(Parsed("[\"1.5\\\"\", /* \"1.5 */ 1.5]")[0], Json::Value("1.5\""));
  EXPECT_EQ(Parsed("/**/1.5"), Json::Value(1.5));
  EXPECT_EQ(Parsed("[\"a\"//\"\n,1.5]")[1], Json::Value(1.5));
  for (const char* refused : {"1,5", "1.5e", "1.5e+", "-.", ".5", "1.5.5", "1.5-"}) {
    ExpectRefused(refused);
  }
}

TEST_F(JsonValueTest, NumbersDoNotDependOnTheGlobalCppLocale) {
  const CommaLocale comma;
  ExpectPlainNumbers();
}

TEST_F(JsonValueTest, RandomTextsReadTheSameInEveryCppLocale) {
  RandomJson random(4);
  for (int i = 0; i < 30000; ++i) {
    const std::string text = Mutated(toString(random.Value(3)), random);
    Json::Value expected;
    Json::Value value;
    const bool accepted = fromString(expected, text);
    const CommaLocale comma;
    ASSERT_EQ(fromString(value, text), accepted) << text;
    ASSERT_EQ(value, expected) << text;
  }
}

class JsonValueLocaleTest : public CleanTest, public testing::WithParamInterface<const char*> {};

TEST_P(JsonValueLocaleTest, NumbersDoNotDependOnTheCLocale) {
  const std::string language = GetParam();
  const std::string compile =
      "localedef -i " + language + " -f UTF-8 " + Path(language + ".UTF-8") + " >&2";
  if (std::system(compile.c_str()) != 0) GTEST_SKIP() << "localedef cannot build it here";
  EXPECT_EQ(RunInChild([&] {
              setenv("LOCPATH", dir.c_str(), 1);
              ASSERT_NE(std::setlocale(LC_ALL, (language + ".UTF-8").c_str()), nullptr);
              ASSERT_NE(std::to_string(1.5), "1.500000");
              ExpectPlainNumbers();
              ASSERT_NE(std::to_string(1.5), "1.500000");
            }),
            0);
}

// The decimal point of the second is none of JsonCpp's, and longer than a byte.
INSTANTIATE_TEST_SUITE_P(, JsonValueLocaleTest, testing::Values("de_DE", "ps_AF"));

}  // namespace
