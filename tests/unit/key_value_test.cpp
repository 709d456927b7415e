#include <fcntl.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cmath>
#include <cstring>
#include <limits>
#include <locale>
#include <map>
#include <random>
#include <sstream>
#include <string>
#include <vector>

#include "kelodrcore/file.h"
#include "support/clean_test.h"
#include "support/special_files.h"
#include "unit/key_value_reference.h"

namespace {

namespace File = KeloDRCore::File;

using Strings = std::map<std::string, std::string>;
using Ints = std::map<std::string, int>;
using Doubles = std::map<std::string, double>;

const LogLine kEmptyLine = Warn("file.cpp", "parseLineKeyValue", "Bad Parameter.");

LogLine NoSeparator(const std::string& line) {
  return Notice("file.cpp", "parseLineKeyValue", "Cannot find separator[=] in line[" + line + "]");
}

class KeyValueTest : public CleanTest {
 protected:
  LogLine NotParsed(const std::string& line) const {
    return Notice("file.cpp", "Read",
                  "Failed to parse line[" + line + "] from file [" + Path("kv") + "]");
  }

  // Reads `text` from a file.
  template <typename V>
  int Read(const std::string& text, std::map<std::string, V>& map) const {
    WriteText(Path("kv"), text);
    return File::Read<std::string, V>(Path("kv"), map);
  }

  // The value that a line with `text` on its right side gives, which must parse.
  template <typename V>
  V Value(const std::string& text) const {
    std::map<std::string, V> map;
    EXPECT_EQ(Read("k=" + text, map), 1) << text;
    return map["k"];
  }
};

template <typename V>
class EveryInstanceTest : public KeyValueTest {
 public:
  using Map = std::map<std::string, V>;
};

struct InstanceNames {
  template <typename V>
  static std::string GetName(int) {
    return std::is_same_v<V, int> ? "Int" : std::is_same_v<V, double> ? "Double" : "String";
  }
};
using Instances = testing::Types<std::string, int, double>;
TYPED_TEST_SUITE(EveryInstanceTest, Instances, InstanceNames);

// --- the file ------------------------------------------------------------------------------------

TYPED_TEST(EveryInstanceTest, AnEmptyPathIsAnErrorThatLeavesTheMap) {
  typename TestFixture::Map map{{"old", {}}};
  EXPECT_EQ((File::Read<std::string, TypeParam>("", map)), -1);
  EXPECT_EQ(map.count("old"), 1U);
  this->ExpectLog({Err("file.cpp", "Read", "Invalid path")});
}

TYPED_TEST(EveryInstanceTest, AMissingFileIsSilentlyZeroAndLeavesTheMap) {
  typename TestFixture::Map map{{"old", {}}};
  EXPECT_EQ(File::Read(this->Path("none"), map), 0);
  EXPECT_EQ(map.count("old"), 1U);
}

TYPED_TEST(EveryInstanceTest, AFileThatCannotBeOpenedIsAnErrorThatLeavesTheMap) {
  const std::string path = this->Path("socket");
  MakeSocket(path);
  typename TestFixture::Map map{{"old", {}}};
  EXPECT_EQ(File::Read(path, map), -1);
  EXPECT_EQ(map.count("old"), 1U);
  this->ExpectLog({Warn("file.cpp", "Read", "File[" + path + "] is not opened.")});
}

// The memory of a process has a file, and nothing is mapped at its start.
TYPED_TEST(EveryInstanceTest, AFileThatCannotBeReadIsAnErrorThatLeavesTheMap) {
  typename TestFixture::Map map{{"old", {}}};
  EXPECT_EQ(File::Read("/proc/self/mem", map), -1);
  EXPECT_EQ(map.count("old"), 1U);
  this->ExpectLog({Warn("file.cpp", "Read", "File[/proc/self/mem] is not opened.")});
}

TYPED_TEST(EveryInstanceTest, AnEmptyFileClearsTheMap) {
  typename TestFixture::Map map{{"old", {}}};
  EXPECT_EQ(this->Read("", map), 0);
  EXPECT_TRUE(map.empty());
}

TYPED_TEST(EveryInstanceTest, ADirectoryReadsAsAnEmptyFile) {
  typename TestFixture::Map map{{"old", {}}};
  EXPECT_EQ(File::Read(this->dir, map), 0);
  EXPECT_TRUE(map.empty());
}

// A link to /dev/zero would be read until the memory runs out, and a queue may be waited for.
TYPED_TEST(EveryInstanceTest, AQueueIsAnErrorThatLeavesTheMap) {
  const std::string path = this->Path("queue");
  ASSERT_EQ(mkfifo(path.c_str(), 0600), 0);
  const int queue = open(path.c_str(), O_RDWR | O_CLOEXEC);
  for (const char* const text : {"", "a=1\n"}) {
    ASSERT_GE(write(queue, text, strlen(text)), 0);
    typename TestFixture::Map map{{"old", {}}};
    EXPECT_EQ(File::Read(path, map), -1);
    EXPECT_EQ(map.count("old"), 1U);
    this->ExpectLog({Warn("file.cpp", "Read", "File[" + path + "] is not opened.")});
  }
  int unread = 0;
  EXPECT_EQ(ioctl(queue, FIONREAD, &unread), 0);
  EXPECT_EQ(unread, 4) << "bytes of somebody else's queue";
  close(queue);
}

TYPED_TEST(EveryInstanceTest, TheLastLineOfAKeyWinsAndEntriesAreCounted) {
  typename TestFixture::Map map{{"old", {}}};
  EXPECT_EQ(this->Read("a=1\na=2\nb=3\n", map), 2);
  typename TestFixture::Map expected;
  std::istringstream("2") >> expected["a"];
  std::istringstream("3") >> expected["b"];
  EXPECT_EQ(map, expected);
}

TYPED_TEST(EveryInstanceTest, ThePathMayBeAKeyOfTheMap) {
  WriteText(this->Path("kv"), "a\nb=1\n");
  typename TestFixture::Map map{{this->Path("kv"), {}}};
  EXPECT_EQ(File::Read(map.begin()->first, map), 1);
  EXPECT_EQ(map.count("b"), 1U);
  this->ExpectLog({NoSeparator("a"), this->NotParsed("a")});
}

// --- the lines -----------------------------------------------------------------------------------

TYPED_TEST(EveryInstanceTest, AnEmptyLineIsWarnedOfAndSkipped) {
  typename TestFixture::Map map;
  EXPECT_EQ(this->Read("\na=1\n\n", map), 1);
  this->ExpectLog({kEmptyLine, this->NotParsed(""), kEmptyLine, this->NotParsed("")});
}

TYPED_TEST(EveryInstanceTest, ALineWithoutSeparatorIsLoggedAndSkipped) {
  typename TestFixture::Map map;
  EXPECT_EQ(this->Read("abc\n# note\n \n\r\n", map), 0);
  this->ExpectLog({NoSeparator("abc"), this->NotParsed("abc"), NoSeparator("# note"),
                   this->NotParsed("# note"), NoSeparator(" "), this->NotParsed(" "),
                   NoSeparator("\r"), this->NotParsed("\r")});
}

TYPED_TEST(EveryInstanceTest, AnEmptyKeyOrValueIsLoggedAndSkipped) {
  typename TestFixture::Map map;
  EXPECT_EQ(this->Read("key=\n=1\n=\n==\n", map), 0);
  this->ExpectLog({this->NotParsed("key="), this->NotParsed("=1"), this->NotParsed("="),
                   this->NotParsed("==")});
}

TYPED_TEST(EveryInstanceTest, AnEmptyValueDoesNotReplaceAnEarlierOne) {
  typename TestFixture::Map map;
  EXPECT_EQ(this->Read("a=1\na=\n", map), 1);
  typename TestFixture::Map expected;
  std::istringstream("1") >> expected["a"];
  EXPECT_EQ(map, expected);
  this->ExpectLog({this->NotParsed("a=")});
}

TYPED_TEST(EveryInstanceTest, ASideOfBlanksOnlyIsEmptyOrZero) {
  typename TestFixture::Map map;
  EXPECT_EQ(this->Read(" =1\n", map), 1);
  EXPECT_EQ(map.count(""), 1U);
  EXPECT_EQ(this->Read("a= \t\v\f\r\n", map), 1);
  EXPECT_EQ(map["a"], TypeParam());
}

TYPED_TEST(EveryInstanceTest, TheLastLineNeedsNoNewline) {
  typename TestFixture::Map map;
  EXPECT_EQ(this->Read("a=1\nb=2", map), 2);
}

TEST_F(KeyValueTest, ALineIsSplitAtItsFirstSeparator) {
  Strings map;
  EXPECT_EQ(Read("x=y=z\na==b\n", map), 2);
  EXPECT_EQ(map, (Strings{{"x", "y=z"}, {"a", "=b"}}));
}

TEST_F(KeyValueTest, ACommentSignIsPartOfTheKey) {
  Strings map;
  EXPECT_EQ(Read("#a=b\n", map), 1);
  EXPECT_EQ(map, (Strings{{"#a", "b"}}));
}

TEST_F(KeyValueTest, BlanksAroundKeyAndValueAreDroppedAndOnlyTheFirstWordIsKept) {
  Strings map;
  EXPECT_EQ(Read("key = value\n\t two words =\va b\r\nq=\"x y\"\n", map), 3);
  EXPECT_EQ(map, (Strings{{"key", "value"}, {"two", "a"}, {"q", "\"x"}}));
}

TEST_F(KeyValueTest, OnlyTheSixCharactersOfTheClassicLocaleAreBlank) {
  for (int byte = 1; byte < 256; ++byte) {
    if (byte == '\n') continue;
    const auto character = static_cast<char>(byte);
    const bool blank = strchr(" \t\v\f\r", byte) != nullptr;
    EXPECT_EQ(Value<std::string>("a" + std::string(1, character) + "b"),
              blank ? "a" : "a" + std::string(1, character) + "b")
        << byte;
  }
}

TEST_F(KeyValueTest, NulBytesAreKeptAndCutOnlyTheLogLine) {
  Strings map;
  EXPECT_EQ(Read(std::string("a\0b=c\0d\nx\0y\n", 12), map), 1);
  EXPECT_EQ(map, (Strings{{std::string("a\0b", 3), std::string("c\0d", 3)}}));
  ExpectLog({NoSeparator("x"),
             Notice("file.cpp", "Read", "Failed to parse line[x] from file [" + Path("kv") + "]")});
}

TEST_F(KeyValueTest, ALineMayBeLongerThanAnyBuffer) {
  const std::string word(300000, 'x');
  Strings map;
  EXPECT_EQ(Read(word + "=" + word + "\na=b\n", map), 2);
  EXPECT_EQ(map, (Strings{{word, word}, {"a", "b"}}));
}

// --- numbers -------------------------------------------------------------------------------------

TEST_F(KeyValueTest, AnIntIsReadAsFarAsItIsOne) {
  const std::pair<const char*, int> rows[] = {
      {"1", 1},    {" +7 ", 7},  {"-5", -5}, {"12abc", 12}, {"abc", 0}, {"0x10", 0},
      {"010", 10}, {"1.9", 1},   {"-", 0},   {"+", 0},      {"+-5", 0}, {"--5", 0},
      {"1e3", 1},  {"1,000", 1}, {"- 5", 0}, {"00012", 12}, {"-0", 0},  {"1=2", 1}};
  for (const auto& [text, expected] : rows) EXPECT_EQ(Value<int>(text), expected) << text;
}

TEST_F(KeyValueTest, AnIntOutOfRangeIsTheNearestBound) {
  EXPECT_EQ(Value<int>("2147483647"), INT32_MAX);
  EXPECT_EQ(Value<int>("2147483648"), INT32_MAX);
  EXPECT_EQ(Value<int>("-2147483648"), INT32_MIN);
  EXPECT_EQ(Value<int>("-2147483649"), INT32_MIN);
  EXPECT_EQ(Value<int>("99999999999999999999999"), INT32_MAX);
  EXPECT_EQ(Value<int>("-99999999999999999999999"), INT32_MIN);
}

TEST_F(KeyValueTest, ADoubleIsReadAsFarAsItIsOne) {
  const std::pair<const char*, double> rows[] = {
      {"1", 1},   {"-1.5e3", -1500}, {" .5 ", 0.5},  {"5.", 5},      {"1e", 0},
      {"1e+", 0}, {"1e+2", 100},     {"1E-2", 0.01}, {"0x10", 0},    {"inf", 0},
      {"nan", 0}, {"nan(1)", 0},     {".", 0},       {"1.2.3", 1.2}, {"1,5", 1},
      {"abc", 0}, {"12abc", 12},     {"1e5e5", 1e5}, {"+4", 4}};
  for (const auto& [text, expected] : rows) EXPECT_EQ(Value<double>(text), expected) << text;
  EXPECT_TRUE(std::signbit(Value<double>("-0")));
}

TEST_F(KeyValueTest, ADoubleOutOfRangeIsTheNearestBound) {
  EXPECT_EQ(Value<double>("1e999"), std::numeric_limits<double>::max());
  EXPECT_EQ(Value<double>("-1e999"), std::numeric_limits<double>::lowest());
  EXPECT_EQ(Value<double>("1e-999"), 0);
  EXPECT_EQ(Value<double>("4.9406564584124654e-324"), std::numeric_limits<double>::denorm_min());
}

// --- the whole, against streams ------------------------------------------------------------------

template <typename V>
bool SameValue(const V& a, const V& b) {
  if constexpr (std::is_same_v<V, double>) {
    return memcmp(&a, &b, sizeof(a)) == 0;  // -0 is not 0 here
  } else {
    return a == b;
  }
}

template <typename V>
bool Same(const std::map<std::string, V>& a, const std::map<std::string, V>& b) {
  if (a.size() != b.size()) return false;
  for (auto left = a.begin(), right = b.begin(); left != a.end(); ++left, ++right) {
    if (left->first != right->first || !SameValue(left->second, right->second)) return false;
  }
  return true;
}

// A text of bytes that matter to the reader, and now and then any byte.
std::string RandomText(std::mt19937& random, size_t length) {
  static const std::string telling("0123456789+-.eExXinfa,' \t\r\v\f\0==\n\n", 34);
  std::string text;
  for (size_t i = 0; i < length; ++i) {
    const uint32_t draw = static_cast<uint32_t>(random());
    text += draw % 16 == 0 ? static_cast<char>(draw >> 8) : telling[(draw >> 8) % telling.size()];
  }
  return text;
}

TYPED_TEST(EveryInstanceTest, AgreesWithAStreamATokenOverRandomBytes) {
  std::mt19937 random(20240229);
  for (int round = 0; round < 500; ++round) {
    const std::string text = RandomText(random, random() % 200);
    typename TestFixture::Map map{{"old", {}}};
    const int count = this->Read(text, map);
    EXPECT_EQ(count, static_cast<int>(map.size()));
    ASSERT_TRUE(Same(map, Reference<TypeParam>(text))) << testing::PrintToString(text);
  }
  LogCapture::Clear();
}

TYPED_TEST(EveryInstanceTest, AgreesWithAStreamATokenOverRandomNumbers) {
  std::mt19937 random(7);
  std::string text;
  for (int i = 0; i < 20000; ++i) {
    text += "k" + std::to_string(i) + "=";
    static const std::string telling("0123456789012345678901234567890123456789+-.eE");
    for (size_t left = 1 + random() % 30; left > 0; --left) {
      text += telling[random() % telling.size()];
    }
    text += '\n';
  }
  typename TestFixture::Map map;
  EXPECT_EQ(this->Read(text, map), 20000);
  EXPECT_TRUE(Same(map, Reference<TypeParam>(text)));
}

// A locale in which the classic texts mean something else.
struct OtherPunctuation : std::numpunct<char> {
  char do_decimal_point() const override { return ','; }
  char do_thousands_sep() const override { return '.'; }
  std::string do_grouping() const override { return "\3"; }
};

struct OtherSpace : std::ctype<char> {
  static const mask* Table() {
    static std::vector<mask> table(classic_table(), classic_table() + table_size);
    table['x'] |= space;
    table[' '] = print;
    return table.data();
  }
  OtherSpace() : std::ctype<char>(Table()) {}
};

TEST_F(KeyValueTest, TheLocaleOfTheProcessChangesNothing) {
  const std::locale before = std::locale::global(
      std::locale(std::locale(std::locale::classic(), new OtherPunctuation), new OtherSpace));
  const double number = Value<double>(" 1.234,5");
  const int whole = Value<int>(" 1.234");
  const auto word = Value<std::string>(" axb c");
  std::locale::global(before);
  EXPECT_EQ(number, 1.234);
  EXPECT_EQ(whole, 1);
  EXPECT_EQ(word, "axb");
}

// --- toType --------------------------------------------------------------------------------------

TEST_F(KeyValueTest, ToTypeOfAnEmptyTextIsTheDefault) {
  std::string out = "old";
  EXPECT_FALSE((File::toType<std::string, std::string>("", out, "default")));
  EXPECT_EQ(out, "default");
}

TEST_F(KeyValueTest, ToTypeTakesTheFirstWord) {
  std::string out = "old";
  EXPECT_TRUE((File::toType<std::string, std::string>(" \t one two", out, "default")));
  EXPECT_EQ(out, "one");
  EXPECT_TRUE(File::toType(std::string("\0x y", 4), out, std::string()));
  EXPECT_EQ(out, std::string("\0x", 2));
}

TEST_F(KeyValueTest, ToTypeOfBlanksLeavesTheValueAsAStreamDoes) {
  std::string out;
  EXPECT_TRUE(File::toType(std::string(" \t\n\v\f\r"), out, std::string("default")));
  EXPECT_EQ(out, "");
  out = "old";
  EXPECT_TRUE(File::toType(std::string("  "), out, std::string("default")));
  std::string streamed = "old";
  std::istringstream("  ") >> streamed;
  EXPECT_EQ(out, streamed);
}

TEST_F(KeyValueTest, ToTypeMayReadAndWriteOneString) {
  std::string text = "  one two";
  EXPECT_TRUE(File::toType(text, text, text));
  EXPECT_EQ(text, "one");
}

}  // namespace
