#include <limits>
#include <map>
#include <random>
#include <sstream>
#include <string>
#include <type_traits>
#include <vector>

#include "kelodrcore/sqlite_command.h"
#include "unit/command.h"
#include "unit/grouping_locale.h"

namespace {

using KeloDRCore::SqliteCondition;
using KeloDRCore::SqliteEqual;
using KeloDRCore::SqliteNotIn;
using KeloDRCore::SqliteValue;

using SelectCommandTest = SqliteCommandTest;

SelectCommand SelectOf(const std::vector<std::string>& fields) {
  auto command = OnTable<SelectCommand>();
  for (const std::string& field : fields) EXPECT_TRUE(command.AddField(field));
  return command;
}

TEST_F(SelectCommandTest, NamesItsFieldsInTheOrderAdded) {
  EXPECT_EQ(SelectOf({"id", "name"}).GetCommand(), "SELECT id,name FROM job");
  EXPECT_EQ(SelectOf({"b", "a", "b"}).GetCommand(), "SELECT b,a,b FROM job");
  EXPECT_EQ(SelectOf({"count(*)"}).GetCommand(), "SELECT count(*) FROM job");
}

TEST_F(SelectCommandTest, NamesAHundredFields) {
  std::string names = "f";
  for (int i = 1; i < 100; ++i) names += ",f";
  EXPECT_EQ(SelectOf(std::vector<std::string>(100, "f")).GetCommand(),
            "SELECT " + names + " FROM job");
}

TEST_F(SelectCommandTest, AnEmptyFieldIsRefusedWithoutALine) {
  auto command = SelectOf({});
  EXPECT_FALSE(command.AddField(""));
  EXPECT_FALSE(command.IsValid());
  command.SelectAll();
  EXPECT_FALSE(command.AddField(""));
  EXPECT_EQ(command.GetCommand(), "SELECT  * FROM job") << "all columns are still selected";
}

TEST_F(SelectCommandTest, FieldsWithoutATableAreInvalid) {
  SelectCommand command;
  EXPECT_TRUE(command.AddField("id"));
  EXPECT_FALSE(command.IsValid());
  command.SelectAll();
  EXPECT_FALSE(command.IsValid());
}

TEST_F(SelectCommandTest, AllColumnsHaveTwoBlanksBeforeTheAsterisk) {
  auto command = SelectOf({});
  command.SelectAll();
  EXPECT_TRUE(command.IsValid());
  EXPECT_EQ(command.GetCommand(), "SELECT  * FROM job");
}

TEST_F(SelectCommandTest, TheLaterChoiceOfColumnsWins) {
  auto command = SelectOf({"name"});
  command.SelectAll();
  EXPECT_EQ(command.GetCommand(), "SELECT  * FROM job");
  EXPECT_TRUE(command.AddField("id"));
  EXPECT_EQ(command.GetCommand(), "SELECT id FROM job");
}

TEST_F(SelectCommandTest, SortsDescendingByDefault) {
  auto command = SelectOf({"id"});
  EXPECT_TRUE(command.AddOrderField("name"));
  EXPECT_TRUE(command.AddOrderField("id"));
  EXPECT_EQ(command.GetCommand(), "SELECT id FROM job ORDER BY name,id DESC");
}

TEST_F(SelectCommandTest, TheLastDirectionCounts) {
  auto command = SelectOf({"id"});
  EXPECT_TRUE(command.AddOrderField("id"));
  command.SetOrderByASC();
  EXPECT_EQ(command.GetCommand(), "SELECT id FROM job ORDER BY id ASC");
  command.SetOrderByDESC();
  EXPECT_EQ(command.GetCommand(), "SELECT id FROM job ORDER BY id DESC");
}

TEST_F(SelectCommandTest, ADirectionWithoutFieldsSortsNothing) {
  auto command = SelectOf({"id"});
  command.SetOrderByASC();
  EXPECT_FALSE(command.AddOrderField(""));
  EXPECT_EQ(command.GetCommand(), "SELECT id FROM job");
}

TEST_F(SelectCommandTest, LimitsWithTheOffsetFirst) {
  auto command = SelectOf({"id"});
  EXPECT_TRUE(command.SetLimit(20, 10));
  EXPECT_EQ(command.GetCommand(), "SELECT id FROM job LIMIT 20, 10");
  EXPECT_TRUE(command.SetLimit(5));
  EXPECT_EQ(command.GetCommand(), "SELECT id FROM job LIMIT 20, 5");
  EXPECT_TRUE(command.SetLimit(1));
  EXPECT_EQ(command.GetCommand(), "SELECT id FROM job LIMIT 20, 1");
  EXPECT_TRUE(command.SetLimit(0, 1));
  EXPECT_EQ(command.GetCommand(), "SELECT id FROM job LIMIT 0, 1");
  const int most = std::numeric_limits<int>::max();
  EXPECT_TRUE(command.SetLimit(most, most));
  EXPECT_EQ(command.GetCommand(), "SELECT id FROM job LIMIT 2147483647, 2147483647");
}

TEST_F(SelectCommandTest, ACountAloneStartsAtZero) {
  auto command = SelectOf({});
  command.SelectAll();
  EXPECT_TRUE(command.AddOrderField("id"));
  EXPECT_TRUE(command.SetLimit(10));
  EXPECT_EQ(command.GetCommand(), "SELECT  * FROM job ORDER BY id DESC LIMIT 0, 10");
}

TEST_F(SelectCommandTest, ALimitOutOfRangeChangesNothing) {
  const int least = std::numeric_limits<int>::min();
  auto command = SelectOf({"id"});
  const auto refuseAll = [&command] {
    EXPECT_FALSE(command.SetLimit(0));
    EXPECT_FALSE(command.SetLimit(-1));
    EXPECT_FALSE(command.SetLimit(least));
    EXPECT_FALSE(command.SetLimit(-1, 5));
    EXPECT_FALSE(command.SetLimit(least, 5));
    EXPECT_FALSE(command.SetLimit(3, 0));
    EXPECT_FALSE(command.SetLimit(3, -1));
  };
  refuseAll();
  EXPECT_EQ(command.GetCommand(), "SELECT id FROM job");
  EXPECT_TRUE(command.SetLimit(7, 8));
  refuseAll();
  EXPECT_EQ(command.GetCommand(), "SELECT id FROM job LIMIT 7, 8");
}

TEST_F(SelectCommandTest, ThePiecesFollowTheirOrder) {
  auto command = SelectOf({"id", "name"});
  EXPECT_TRUE(command.SetLimit(1, 2));
  EXPECT_TRUE(command.AddOrderField("name"));
  EXPECT_TRUE(command.SetCondition(SqliteEqual("name", "it's")));
  EXPECT_EQ(command.GetCommand(),
            "SELECT id,name FROM job WHERE name='it''s' ORDER BY name DESC LIMIT 1, 2");
}

TEST_F(SelectCommandTest, NamesAndTextsAreWrittenAsGiven) {
  auto command = OnTable<SelectCommand>("a, \"b c\"; --");
  EXPECT_TRUE(command.AddField("it's"));
  EXPECT_TRUE(command.AddOrderField("x y"));
  EXPECT_TRUE(command.SetCondition(" 'a'b' "));
  EXPECT_EQ(command.GetCommand(),
            "SELECT it's FROM a, \"b c\"; -- WHERE  'a'b'  ORDER BY x y DESC");
}

TEST_F(SelectCommandTest, DumpsConditionAndFields) {
  auto command = SelectOf({});
  EXPECT_EQ(command.ToStr(), "job]condition:[]/fields:[]");
  command.SelectAll();
  EXPECT_EQ(command.ToStr(), "job]condition:[]/fields:[all]");
  EXPECT_TRUE(command.AddField("id"));
  EXPECT_TRUE(command.AddField("name"));
  EXPECT_TRUE(command.SetCondition("id=1"));
  EXPECT_TRUE(command.AddOrderField("id"));
  EXPECT_TRUE(command.SetLimit(3));
  EXPECT_EQ(command.ToStr(), "job]condition:[id=1]/fields:[id, name]");
}

TEST_F(SelectCommandTest, OnlyASelectLogsAnEmptyConditionText) {
  SelectCommand select;
  EXPECT_FALSE(select.SetCondition(""));
  ExpectError("SetCondition", "Empty condition");
  EXPECT_FALSE(UpdateCommand().SetCondition(""));
  EXPECT_FALSE(DeleteCommand().SetCondition(""));
  ExpectLog({});
}

TEST_F(SelectCommandTest, OnlyASelectLogsAValidConditionWithoutText) {
  SelectCommand select;
  EXPECT_FALSE(select.SetCondition(SqliteIn()));
  ExpectError("SetCondition", "Empty condition");
  EXPECT_FALSE(UpdateCommand().SetCondition(SqliteNotIn()));
  EXPECT_FALSE(DeleteCommand().SetCondition(SqliteIn()));
  ExpectLog({});
}

// What update, select and delete share.

template <typename Command>
class ConditionCommandTest : public SqliteCommandTest {
 protected:
  static std::string Where(const Command& command) {
    const std::string dump = command.ToStr();
    const size_t start = dump.find("condition:[") + 11;
    return dump.substr(start, dump.find(']', start) - start);
  }
};
using ConditionCommands = testing::Types<UpdateCommand, SelectCommand, DeleteCommand>;
TYPED_TEST_SUITE(ConditionCommandTest, ConditionCommands, CommandName);

TYPED_TEST(ConditionCommandTest, TakesATextOrAConditionsText) {
  TypeParam command;
  EXPECT_TRUE(command.SetCondition("a = 1"));
  EXPECT_EQ(this->Where(command), "a = 1");
  EXPECT_TRUE(command.SetCondition(std::string("b = 2")));
  EXPECT_EQ(this->Where(command), "b = 2");
  EXPECT_TRUE(command.SetCondition(SqliteEqual("name", "it's")));
  EXPECT_EQ(this->Where(command), "name='it''s'");
}

TYPED_TEST(ConditionCommandTest, TheConditionIsCopied) {
  TypeParam command;
  SqliteEqual condition("a", 1);
  EXPECT_TRUE(command.SetCondition(condition));
  EXPECT_TRUE(condition.SetValue("b", 2));
  EXPECT_EQ(this->Where(command), "a=1");
}

TYPED_TEST(ConditionCommandTest, AnEmptyTextLeavesTheCondition) {
  TypeParam command;
  EXPECT_TRUE(command.SetCondition("a=1"));
  EXPECT_FALSE(command.SetCondition(""));
  EXPECT_FALSE(command.SetCondition(SqliteIn()));
  EXPECT_EQ(this->Where(command), "a=1");
  LogCapture::Clear();
}

TYPED_TEST(ConditionCommandTest, AnInvalidConditionIsRefused) {
  TypeParam command;
  EXPECT_TRUE(command.SetCondition("a=1"));
  EXPECT_FALSE(command.SetCondition(SqliteCondition()));
  this->ExpectError("SetCondition", "Invalid condition");
  EXPECT_EQ(this->Where(command), "a=1");
}

TYPED_TEST(ConditionCommandTest, TheVirtualValidityIsAsked) {
  class Refusing : public SqliteCondition {
   public:
    Refusing() : SqliteCondition("a=1") {}
    bool IsValid() const override { return false; }
  };
  TypeParam command;
  EXPECT_FALSE(command.SetCondition(Refusing()));
  this->ExpectError("SetCondition", "Invalid condition");
  EXPECT_EQ(this->Where(command), "");
}

TEST_F(SelectCommandTest, NumbersArePlainWhateverTheLocale) {
  const GroupingLocale locale;
  auto command = SelectOf({"id"});
  EXPECT_TRUE(command.SetLimit(1234567, 7654321));
  EXPECT_TRUE(command.SetCondition(SqliteEqual("n", 1234567)));
  EXPECT_EQ(command.GetCommand(), "SELECT id FROM job WHERE n=1234567 LIMIT 1234567, 7654321");
  UpdateCommand update;
  EXPECT_TRUE(update.AddFieldValue("n", 1234567));
  EXPECT_EQ(update.ToStr(), "]condition:[]/values:[n=1234567]");
}

// Plain builders, with which the commands are compared.
struct Reference {
  std::map<std::string, std::string> literals;
  std::vector<std::string> fields;
  std::string condition;

  std::string Where() const { return condition.empty() ? "" : " WHERE " + condition; }

  // "name=literal,name=literal"
  std::string Assignments() const {
    std::ostringstream out;
    size_t count = 0;
    for (const auto& [name, literal] : literals)
      out << (count++ ? "," : "") << name << "=" << literal;
    return out.str();
  }

  // Names, or literals, with a comma behind whatever is not empty.
  std::string Joined(bool isLiterals) const {
    std::string text;
    for (const auto& [name, literal] : literals) {
      text = text.empty() ? "" : text + ",";
      text += isLiterals ? literal : name;
    }
    return text;
  }

  std::string Fields(const std::string& separator) const {
    std::string text = fields[0];
    for (size_t i = 1; i < fields.size(); ++i) text += separator + fields[i];
    return text;
  }
};

class RandomCommandTest : public CleanTest {
 protected:
  std::string Name() { return std::string(1 + random() % 2, "abXY"[random() % 4]); }

  // The same random fields for the reference and for a list.
  SqliteValueList Fields(Reference& reference) {
    SqliteValueList list;
    for (auto left = 1 + random() % 5; left > 0; --left) {
      const std::string name = Name();
      const auto number = static_cast<int>(random());
      const std::string digits = std::to_string(number);
      const auto kind = random() % 3;
      EXPECT_TRUE(list.AddValue(name, kind == 0   ? SqliteValue(number)
                                      : kind == 1 ? SqliteValue("'" + digits)
                                                  : SqliteValue(1LL << 40)));
      reference.literals[name] = kind == 0 ? digits : kind == 1 ? "'''" + digits + "'" : "";
    }
    return list;
  }

  template <typename Command>
  void MaybeCondition(Command& command, Reference& reference) {
    if (random() % 2 == 0) return;
    reference.condition = Name() + " > 1";
    EXPECT_TRUE(command.SetCondition(reference.condition));
  }

  std::mt19937 random{31};
};

TEST_F(RandomCommandTest, AnyInsertIsWhatThePlainBuilderBuilds) {
  for (int round = 0; round < 2000; ++round) {
    Reference reference;
    auto command = OnTable<InsertCommand>();
    command.SetFieldValues(Fields(reference));
    const bool isReplacing = random() % 2 == 0;
    command.SetReplacable(isReplacing);
    ASSERT_EQ(command.GetCommand(), std::string(isReplacing ? "INSERT OR REPLACE" : "INSERT") +
                                        " INTO job (" + reference.Joined(false) + ") VALUES (" +
                                        reference.Joined(true) + ");");
    ASSERT_EQ(command.ToStr(), "job]values:[" + reference.Assignments() + "]");
  }
}

TEST_F(RandomCommandTest, AnyUpdateIsWhatThePlainBuilderBuilds) {
  for (int round = 0; round < 2000; ++round) {
    Reference reference;
    auto command = OnTable<UpdateCommand>();
    command.SetFieldValues(Fields(reference));
    MaybeCondition(command, reference);
    ASSERT_EQ(command.GetCommand(),
              "UPDATE job SET " + reference.Assignments() + reference.Where());
    ASSERT_EQ(command.ToStr(), "job]condition:[" + reference.condition + "]/values:[" +
                                   reference.Assignments() + "]");
  }
}

TEST_F(RandomCommandTest, AnySelectIsWhatThePlainBuilderBuilds) {
  for (int round = 0; round < 2000; ++round) {
    Reference reference;
    Reference order;
    auto command = OnTable<SelectCommand>();
    for (auto left = random() % 4; left > 0; --left) reference.fields.push_back(Name());
    for (auto left = random() % 4; left > 0; --left) order.fields.push_back(Name());
    const bool isAll = reference.fields.empty();
    if (isAll) command.SelectAll();
    for (const std::string& field : reference.fields) EXPECT_TRUE(command.AddField(field));
    for (const std::string& field : order.fields) EXPECT_TRUE(command.AddOrderField(field));
    MaybeCondition(command, reference);
    const bool isAscending = random() % 2 == 0;
    if (isAscending) command.SetOrderByASC();
    const auto first = static_cast<int>(random() % 100) - 20;
    const auto count = static_cast<int>(random() % 100) - 20;
    const bool isLimited = command.SetLimit(first, count);
    ASSERT_EQ(isLimited, first >= 0 && count >= 1);

    std::ostringstream expected;
    expected << "SELECT " << (isAll ? " *" : reference.Fields(",")) << " FROM job"
             << reference.Where();
    if (!order.fields.empty()) {
      expected << " ORDER BY " << order.Fields(",") << (isAscending ? " ASC" : " DESC");
    }
    if (isLimited) expected << " LIMIT " << first << ", " << count;
    ASSERT_EQ(command.GetCommand(), expected.str());
    ASSERT_EQ(command.ToStr(), "job]condition:[" + reference.condition + "]/fields:[" +
                                   (isAll ? "all" : reference.Fields(", ")) + "]");
  }
}

}  // namespace
