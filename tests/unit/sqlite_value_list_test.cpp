#include <algorithm>
#include <limits>
#include <map>
#include <random>
#include <string>
#include <utility>
#include <vector>

#include "kelodrcore/sqlite_value.h"
#include "support/clean_test.h"

namespace {

using KeloDRCore::SqliteRecord;
using KeloDRCore::SqliteValue;
using KeloDRCore::SqliteValueList;

class SqliteValueListTest : public CleanTest {
 protected:
  static void ExpectBadField(const std::string& name, const std::string& literal) {
    ExpectLog({Err("sqlite_value.cpp", "AddValue",
                   "Bad Field[" + name + "] or value [" + literal + "]")});
  }
  static void ExpectInvalidField(const std::string& function) {
    ExpectLog({Err("sqlite_value.cpp", function, "Invalid field []")});
  }
};

std::vector<std::string> NamesOf(const SqliteValueList& list) {
  std::vector<std::string> names;
  for (const auto& [name, value] : list.GetValues()) names.push_back(name);
  return names;
}

SqliteValueList ListOf(const std::vector<std::pair<std::string, SqliteValue>>& fields) {
  SqliteValueList list;
  for (const auto& [name, value] : fields) EXPECT_TRUE(list.AddValue(name, value));
  return list;
}

TEST_F(SqliteValueListTest, AFreshListIsEmpty) {
  const SqliteValueList list;
  EXPECT_TRUE(list.GetValues().empty());
  EXPECT_EQ(list.ToStr(), "");
}

TEST_F(SqliteValueListTest, FieldsAreOrderedByteByByteByName) {
  const SqliteValueList list =
      ListOf({{"b", 1}, {"a", 1}, {"\xC3\xA9", 1}, {"B", 1}, {"ab", 1}, {"10", 1}, {"9", 1}});
  EXPECT_EQ(NamesOf(list), (std::vector<std::string>{"10", "9", "B", "a", "ab", "b", "\xC3\xA9"}));
}

TEST_F(SqliteValueListTest, AddingAgainReplacesTheValueOnly) {
  const SqliteValueList list = ListOf({{"b", 1}, {"a", 2}, {"b", "last"}});
  EXPECT_EQ(list.ToStr(), "a:2, b:'last'");
  EXPECT_EQ(NamesOf(list), (std::vector<std::string>{"a", "b"}));
  EXPECT_TRUE(list.GetValue("b").IsValid());
}

TEST_F(SqliteValueListTest, AnEmptyNameIsRefused) {
  SqliteValueList list = ListOf({{"a", 1}});
  EXPECT_FALSE(list.AddValue("", "it's"));
  ExpectBadField("", "'it''s'");
  EXPECT_EQ(list.ToStr(), "a:1");
}

TEST_F(SqliteValueListTest, AnInvalidValueIsRefused) {
  SqliteValueList list = ListOf({{"a", 1}});
  EXPECT_FALSE(list.AddValue("b", SqliteValue()));
  ExpectBadField("b", "");
  EXPECT_FALSE(list.AddValue("a", SqliteValue()));
  ExpectBadField("a", "");
  EXPECT_FALSE(list.AddValue("", SqliteValue()));
  ExpectBadField("", "");
  EXPECT_EQ(list.ToStr(), "a:1");
}

TEST_F(SqliteValueListTest, AnInvalidValueWithAPayloadIsRefusedAndShown) {
  SqliteValueList list;
  SqliteValue value;
  value = SqliteValue(5);
  EXPECT_FALSE(list.AddValue("a", value));
  ExpectBadField("a", "5");
  EXPECT_FALSE(list.AddValue("a", nullptr));
  ExpectBadField("a", "");
  EXPECT_TRUE(list.GetValues().empty());
}

TEST_F(SqliteValueListTest, AValueThatRendersAsNothingIsAccepted) {
  const SqliteValueList list = ListOf({{"a", 4294967296LL}, {"b", 1}});
  EXPECT_EQ(list.ToStr(), "a:, b:1");
}

TEST_F(SqliteValueListTest, ALiteralIsAText) {
  SqliteValueList list;
  EXPECT_TRUE(list.AddValue("a", "true"));
  EXPECT_EQ(list.ToStr(), "a:'true'");
}

TEST_F(SqliteValueListTest, AValueOfTheListItselfCanBeAdded) {
  SqliteValueList list = ListOf({{"a", "text"}});
  EXPECT_TRUE(list.AddValue("b", list.GetValue("a")));
  EXPECT_TRUE(list.AddValue("a", list.GetValue("a")));
  EXPECT_TRUE(list.AddValue(list.GetValues().begin()->first, 5));
  EXPECT_EQ(list.ToStr(), "a:5, b:'text'");
}

TEST_F(SqliteValueListTest, AppendingAListPutsItsValuesOverTheOwn) {
  SqliteValueList list = ListOf({{"a", 1}, {"c", 3}});
  EXPECT_EQ(&(list += ListOf({{"b", "x"}, {"c", "y"}})), &list);
  EXPECT_EQ(list.ToStr(), "a:1, b:'x', c:'y'");
}

TEST_F(SqliteValueListTest, AppendingAListToItselfChangesNothing) {
  SqliteValueList list = ListOf({{"a", 1}, {"b", "x"}});
  const SqliteValueList& same = list;
  list += same;
  EXPECT_EQ(list.ToStr(), "a:1, b:'x'");
}

TEST_F(SqliteValueListTest, AssigningReplacesAllFields) {
  SqliteValueList list = ListOf({{"a", 1}});
  const SqliteValueList other = ListOf({{"b", 2}});
  EXPECT_EQ(&(list = other), &list);
  EXPECT_EQ(list.ToStr(), "b:2");
  EXPECT_EQ(other.ToStr(), "b:2");
  list = SqliteValueList();
  EXPECT_TRUE(list.GetValues().empty());
}

TEST_F(SqliteValueListTest, AListGivenToItselfKeepsItsFields) {
  SqliteValueList list = ListOf({{"a", 1}});
  SqliteValueList& same = list;
  list = same;
  EXPECT_EQ(list.ToStr(), "a:1");
  list = std::move(same);
  EXPECT_EQ(list.ToStr(), "a:1");
}

TEST_F(SqliteValueListTest, AListThatWasMovedFromIsEmpty) {
  SqliteValueList row = ListOf({{"a", 1}});
  SqliteValueList target(std::move(row));
  EXPECT_EQ(target.ToStr(), "a:1");
  EXPECT_EQ(row.ToStr(), "");  // NOLINT(bugprone-use-after-move): told in the header
  row = ListOf({{"b", 2}});
  target = std::move(row);
  EXPECT_EQ(target.ToStr(), "b:2");
  EXPECT_EQ(row.ToStr(), "");  // NOLINT(bugprone-use-after-move): told in the header
}

TEST_F(SqliteValueListTest, AMovedListBringsNoFieldsOfItsTargetAlong) {
  std::vector<SqliteValueList> out = {ListOf({{"old", 0}}), SqliteValueList()};
  SqliteValueList row = ListOf({{"a", 1}});
  out[0] = std::move(row);
  row.AddValue("b", 2);  // NOLINT(bugprone-use-after-move): told in the header
  out[1] = std::move(row);
  EXPECT_EQ(out[0].ToStr(), "a:1");
  EXPECT_EQ(out[1].ToStr(), "b:2");
}

TEST_F(SqliteValueListTest, AddValueHasOneForm) {
  bool (SqliteValueList::*const add)(const std::string&, const SqliteValue&) =
      &SqliteValueList::AddValue;
  const auto same = &SqliteValueList::AddValue;
  SqliteValueList list;
  EXPECT_TRUE((list.*add)("a", 1));
  EXPECT_TRUE((list.*same)("b", 2));
  EXPECT_EQ(list.ToStr(), "a:1, b:2");
}

TEST_F(SqliteValueListTest, CopiesAreIndependent) {
  SqliteValueList list = ListOf({{"a", 1}});
  const SqliteValueList copy(list);
  list.AddValue("a", 2);
  EXPECT_EQ(copy.ToStr(), "a:1");
  const SqliteValueList moved(std::move(list));
  EXPECT_EQ(moved.ToStr(), "a:2");
  EXPECT_FALSE(copy.GetValue("b").IsValid());
  EXPECT_FALSE(moved.GetValue("b").IsValid());
  const LogLine line = Warn("sqlite_value.cpp", "GetValue", "Failed to find field [b]");
  ExpectLog({line, line});
}

TEST_F(SqliteValueListTest, AStoredFieldIsFound) {
  const SqliteValueList list = ListOf({{"a", 1}});
  EXPECT_EQ(&list.GetValue("a"), &list.GetValues().at("a"));
  EXPECT_TRUE(list.HasField("a"));
  EXPECT_FALSE(list.HasField("b")) << "and nothing is logged";
}

TEST_F(SqliteValueListTest, AMissingFieldGivesAnInvalidValueThatLivesWithTheList) {
  const SqliteValueList list = ListOf({{"a", 1}});
  const SqliteValue& missing = list.GetValue("it's");
  ExpectLog({Warn("sqlite_value.cpp", "GetValue", "Failed to find field [it's]")});
  EXPECT_FALSE(missing.IsValid());
  EXPECT_EQ(missing.ToFormatedValue(), "");
  EXPECT_EQ(&missing, &list.GetValue("other"));
  LogCapture::Clear();
}

// Expects that the field is not read as a `T` and leaves `value` alone.
template <typename T>
void ExpectNotRead(const SqliteValueList& list, const std::string& field, const T& value) {
  T out = value;
  EXPECT_FALSE(list.GetValue(field, out)) << field;
  EXPECT_EQ(out, value) << field;
}

// For each type that can be read.
void ExpectNotRead(const SqliteValueList& list, const std::string& field) {
  ExpectNotRead<bool>(list, field, true);
  ExpectNotRead<int>(list, field, 7);
  ExpectNotRead<unsigned int>(list, field, 7);
  ExpectNotRead<long>(list, field, 7);
  ExpectNotRead<unsigned long>(list, field, 7);
  ExpectNotRead<long long>(list, field, 7);
  ExpectNotRead<unsigned long long>(list, field, 7);
  ExpectNotRead<std::string>(list, field, "seven");
}

constexpr size_t kReadableTypes = 8;

TEST_F(SqliteValueListTest, AnEmptyNameIsNoField) {
  const SqliteValueList list = ListOf({{"a", 1}});
  EXPECT_FALSE(list.GetValue("").IsValid());
  ExpectInvalidField("GetValue");
  EXPECT_FALSE(list.HasField(""));
  ExpectInvalidField("HasField");
  ExpectNotRead(list, "");
  ExpectLog(std::vector<LogLine>(kReadableTypes,
                                 Err("sqlite_value.cpp", "GetValue", "Invalid field []")));
}

TEST_F(SqliteValueListTest, AMissingFieldLeavesOutAlone) {
  const SqliteValueList list = ListOf({{"a", 1}});
  ExpectNotRead(list, "b");
  ExpectLog(std::vector<LogLine>(
      kReadableTypes, Debug("sqlite_value.cpp", "GetValue", "field [b] is not existed")));
}

TEST_F(SqliteValueListTest, AFieldOfAnotherTypeLeavesOutAlone) {
  const SqliteValueList list = ListOf({{"a", "x"}});
  int out = 7;
  EXPECT_FALSE(list.GetValue("a", out));
  EXPECT_EQ(out, 7);
  ExpectLog({Warn("sqlite_value.cpp", "GetValue", "[\"x\"] is not int")});
}

template <typename T>
T Read(const SqliteValueList& list, const std::string& field) {
  T out{};
  EXPECT_TRUE(list.GetValue(field, out)) << field;
  return out;
}

TEST_F(SqliteValueListTest, EveryTypeIsReadByName) {
  const SqliteValueList list = ListOf({{"b", true}, {"n", 5}, {"t", "it's"}});
  EXPECT_EQ(Read<bool>(list, "b"), true);
  EXPECT_EQ(Read<int>(list, "n"), 5);
  EXPECT_EQ(Read<unsigned int>(list, "n"), 5U);
  EXPECT_EQ(Read<long>(list, "n"), 5L);
  EXPECT_EQ(Read<unsigned long>(list, "n"), 5UL);
  EXPECT_EQ(Read<long long>(list, "n"), 5LL);
  EXPECT_EQ(Read<unsigned long long>(list, "n"), 5ULL);
  EXPECT_EQ(Read<std::string>(list, "t"), "it's");
}

TEST_F(SqliteValueListTest, TheDumpIsOneLineOfNamesAndLiterals) {
  EXPECT_EQ(ListOf({{"name", "a'b"}, {"id", 5}}).ToStr(), "id:5, name:'a''b'");
  EXPECT_EQ(ListOf({{"a", false}}).ToStr(), "a:0");
}

// A random value and the literal it must have.
std::pair<SqliteValue, std::string> RandomValue(std::mt19937& random) {
  const auto number = static_cast<int>(random());
  switch (random() % 6) {
    case 0:
      return {SqliteValue(), ""};
    case 1:
      return {SqliteValue(number), std::to_string(number)};
    case 2:
      return {SqliteValue(number % 2 == 0), number % 2 == 0 ? "1" : "0"};
    case 3:
      return {SqliteValue(4294967296LL + random()), ""};
    case 4:
      return {SqliteValue("a'" + std::to_string(number)), "'a''" + std::to_string(number) + "'"};
    default:
      return {SqliteValue(static_cast<unsigned int>(number)),
              std::to_string(static_cast<unsigned int>(number))};
  }
}

TEST_F(SqliteValueListTest, AnySequenceOfAddsKeepsTheLastValueOfEachNameInOrder) {
  std::mt19937 random(11);
  for (int round = 0; round < 2000; ++round) {
    SqliteValueList list;
    std::vector<std::pair<std::string, std::string>> expected;  // in no order
    for (auto left = random() % 12; left > 0; --left) {
      const std::string name = std::string(random() % 3, "aB\xFF"[random() % 3]);
      const auto [value, literal] = RandomValue(random);
      const bool isGood = !name.empty() && value.IsValid();
      ASSERT_EQ(list.AddValue(name, value), isGood);
      if (!isGood) continue;
      const auto found = std::find_if(expected.begin(), expected.end(),
                                      [&](const auto& entry) { return entry.first == name; });
      if (found != expected.end()) expected.erase(found);
      expected.emplace_back(name, literal);
    }
    std::sort(expected.begin(), expected.end());
    std::string dump;
    for (const auto& [name, literal] : expected) {
      dump += (dump.empty() ? "" : ", ") + name + ":" + literal;
    }
    ASSERT_EQ(list.ToStr(), dump);
    ASSERT_EQ(list.GetValues().size(), expected.size());
    LogCapture::Clear();
  }
}

class Volume : public SqliteRecord {
 public:
  SqliteValueList ConvertColumns(const std::vector<std::string>& names) const override {
    SqliteValueList list;
    for (const std::string& column : names) list.AddValue(column, "value of " + column);
    return list;
  }
  bool FromSqliteRecord(const SqliteValueList& /*record*/) override {
    ADD_FAILURE() << "the library never calls it";
    return false;
  }
  std::vector<std::string> GetColumns() const override { return columns; }

  std::vector<std::string> columns;
};

TEST_F(SqliteValueListTest, ARecordConvertsItsColumns) {
  Volume volume;
  EXPECT_TRUE(volume.ToSqliteRecord().GetValues().empty());
  volume.columns = {"path", "id"};
  EXPECT_EQ(volume.ToSqliteRecord().ToStr(), "id:'value of id', path:'value of path'");
}

}  // namespace
