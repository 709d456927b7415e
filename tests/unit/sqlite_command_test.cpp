#include "kelodrcore/sqlite_command.h"

#include <limits>
#include <sstream>
#include <string>
#include <type_traits>
#include <utility>

#include "unit/command.h"

namespace {

using KeloDRCore::SqliteCommand;

std::string Dump(const SqliteCommand& command) {
  std::stringstream stream;
  command.DumpParam(stream);
  return stream.str();
}

TEST_F(SqliteCommandTest, ShapeOfTheClasses) {
  static_assert(std::is_abstract_v<SqliteCommand>);
  static_assert(std::has_virtual_destructor_v<SqliteCommand>);
  static_assert(std::is_base_of_v<SqliteCommand, InsertCommand>);
  static_assert(std::is_base_of_v<SqliteCommand, UpdateCommand>);
  static_assert(std::is_base_of_v<SqliteCommand, SelectCommand>);
  static_assert(std::is_base_of_v<SqliteCommand, DeleteCommand>);
}

// What all commands share.

template <typename Command>
class AnyCommandTest : public SqliteCommandTest {
 protected:
  static std::string Complaint() {
    if (std::is_same_v<Command, InsertCommand>) return "Bad insert parameter";
    if (std::is_same_v<Command, UpdateCommand>) return "Bad update command";
    return std::is_same_v<Command, SelectCommand> ? "Bad select command" : "Bad delete command";
  }

  // The statement of a command that holds nothing but its table.
  static std::string BareStatement(const std::string& table) {
    if (std::is_same_v<Command, InsertCommand>) return "INSERT INTO " + table + " () VALUES ();";
    if (std::is_same_v<Command, UpdateCommand>) return "UPDATE " + table + " SET ";
    return std::is_same_v<Command, SelectCommand> ? "SELECT FROM " + table
                                                  : "DELETE FROM " + table + ";";
  }
};
using AllCommands = testing::Types<InsertCommand, UpdateCommand, SelectCommand, DeleteCommand>;
TYPED_TEST_SUITE(AnyCommandTest, AllCommands, CommandName);

TYPED_TEST(AnyCommandTest, AFreshOneIsInvalidAndSaysSo) {
  const TypeParam command;
  EXPECT_FALSE(command.IsValid());
  EXPECT_EQ(command.GetCommand(), "");
  this->ExpectError("GetCommand", this->Complaint());
}

TYPED_TEST(AnyCommandTest, ATableAloneIsNotEnough) {
  const auto command = OnTable<TypeParam>();
  EXPECT_FALSE(command.IsValid());
  EXPECT_EQ(command.GetCommand(), "");
  this->ExpectError("GetCommand", this->Complaint());
}

TYPED_TEST(AnyCommandTest, AnEmptyTableNameIsRefusedAndTheOldTableStays) {
  TypeParam command;
  EXPECT_TRUE(command.SetTable(SqliteTableHandler("job", "id INTEGER")));
  EXPECT_FALSE(command.SetTable(SqliteTableHandler("", "n TEXT")));
  this->ExpectError("SetTable", "Invalid table []");
  EXPECT_EQ(command.GetTable().tableName, "job");
  EXPECT_EQ(command.GetTable().columnDefs, "id INTEGER");
  TypeParam fresh;
  EXPECT_FALSE(fresh.SetTable(SqliteTableHandler()));
  this->ExpectError("SetTable", "Invalid table []");
}

TYPED_TEST(AnyCommandTest, TheTableIsCopied) {
  TypeParam command;
  {
    SqliteTableHandler handler("job", "id INTEGER");
    EXPECT_TRUE(command.SetTable(handler));
    handler.tableName = "other";
  }
  EXPECT_EQ(command.GetTable().tableName, "job");
  EXPECT_TRUE(command.SetTable(SqliteTableHandler("new", "")));
  EXPECT_TRUE(command.SetTable(command.GetTable()));
  EXPECT_EQ(command.GetTable().tableName, "new");
  EXPECT_EQ(command.GetTable().columnDefs, "");
}

TYPED_TEST(AnyCommandTest, ACopyKeepsTheTableWhateverBecomesOfTheOriginal) {
  auto command = OnTable<TypeParam>("first");
  const TypeParam copy = command;
  TypeParam assigned;
  assigned = command;
  EXPECT_TRUE(command.SetTable(SqliteTableHandler("second", "")));
  EXPECT_EQ(copy.GetTable().tableName, "first");
  EXPECT_EQ(assigned.GetTable().tableName, "first");
}

TYPED_TEST(AnyCommandTest, TheDumpStartsWithTheTableAndAClosingBracket) {
  const auto command = OnTable<TypeParam>("a b");
  EXPECT_EQ(command.ToStr(), "a b]" + Dump(command));
  EXPECT_EQ(TypeParam().ToStr(), "]" + Dump(TypeParam()));
}

TYPED_TEST(AnyCommandTest, DumpParamAppends) {
  std::stringstream stream;
  stream << "before ";
  const TypeParam command;
  command.DumpParam(stream);
  EXPECT_EQ(stream.str(), "before " + Dump(command));
}

TYPED_TEST(AnyCommandTest, GetCommandAsksTheVirtualValidity) {
  class Refusing : public TypeParam {
   public:
    bool IsValid() const override { return false; }
  };
  EXPECT_EQ(OnTable<Refusing>().GetCommand(), "");
  this->ExpectError("GetCommand", this->Complaint());
  class Accepting : public TypeParam {
   public:
    bool IsValid() const override { return true; }
  };
  const std::string odd = "a, \"it's\"; -- \n";  // a name is written as given
  EXPECT_EQ(OnTable<Accepting>(odd).GetCommand(), this->BareStatement(odd));
}

// What insert and update share.

template <typename Command>
class FieldCommandTest : public SqliteCommandTest {};
using FieldCommands = testing::Types<InsertCommand, UpdateCommand>;
TYPED_TEST_SUITE(FieldCommandTest, FieldCommands, CommandName);

TYPED_TEST(FieldCommandTest, FieldsWithoutATableAreInvalid) {
  TypeParam command;
  EXPECT_TRUE(command.AddFieldValue("id", 1));
  EXPECT_FALSE(command.IsValid());
}

TYPED_TEST(FieldCommandTest, EveryTypeIsRenderedAsItsLiteral) {
  TypeParam command;
  EXPECT_TRUE(command.AddFieldValue("a", std::string("it's")));
  EXPECT_TRUE(command.AddFieldValue("b", true));
  EXPECT_TRUE(command.AddFieldValue("c", -5));
  EXPECT_TRUE(command.AddFieldValue("d", 4294967295U));
  EXPECT_TRUE(command.AddFieldValue("e", -2147483647L));
  EXPECT_TRUE(command.AddFieldValue("f", "true"));
  EXPECT_TRUE(command.template AddFieldValue<std::string>("g", ""));
  char buffer[] = "h'";
  EXPECT_TRUE(command.AddFieldValue("h", buffer));
  EXPECT_TRUE(command.AddFieldValue("i", static_cast<char*>(buffer)));
  EXPECT_NE(Dump(command).find("values:[a='it''s',b=1,c=-5,d=4294967295,e=-2147483647,f='true',"
                               "g='',h='h''',i='h''']"),
            std::string::npos);
}

TYPED_TEST(FieldCommandTest, AValueOfEachTypeReplacesTheOneBefore) {
  TypeParam command;
  for (const char* const name : {"a", "b", "c", "d", "e", "f"}) {
    EXPECT_TRUE(command.AddFieldValue(name, "before"));
  }
  EXPECT_TRUE(command.AddFieldValue("a", std::string("x")));
  EXPECT_TRUE(command.AddFieldValue("b", true));
  EXPECT_TRUE(command.AddFieldValue("c", -5));
  EXPECT_TRUE(command.AddFieldValue("d", 5U));
  EXPECT_TRUE(command.AddFieldValue("e", 6L));
  EXPECT_TRUE(command.AddFieldValue("f", "y"));
  EXPECT_NE(Dump(command).find("values:[a='x',b=1,c=-5,d=5,e=6,f='y']"), std::string::npos);
}

TYPED_TEST(FieldCommandTest, AnEmptyNameIsRefused) {
  TypeParam command;
  const std::string before = Dump(command);
  EXPECT_FALSE(command.AddFieldValue("", std::string("it's")));
  this->ExpectError("AddFieldValue", "Bad Field [] /value['it''s']");
  EXPECT_FALSE(command.AddFieldValue("", true));
  this->ExpectError("AddFieldValue", "Bad Field [] /value[1]");
  EXPECT_FALSE(command.AddFieldValue("", -5));
  this->ExpectError("AddFieldValue", "Bad Field [] /value[-5]");
  EXPECT_FALSE(command.AddFieldValue("", 5U));
  this->ExpectError("AddFieldValue", "Bad Field [] /value[5]");
  EXPECT_FALSE(command.AddFieldValue("", 5L));
  this->ExpectError("AddFieldValue", "Bad Field [] /value[5]");
  EXPECT_FALSE(command.AddFieldValue("", "x"));
  this->ExpectError("AddFieldValue", "Bad Field [] /value['x']");
  EXPECT_EQ(Dump(command), before);
}

TYPED_TEST(FieldCommandTest, ANullPointerIsRefused) {
  auto command = OnTable<TypeParam>();
  EXPECT_TRUE(command.AddFieldValue("a", 1));
  const std::string before = command.GetCommand();
  const char* const null = nullptr;
  EXPECT_FALSE(command.AddFieldValue("a", null));
  this->ExpectError("AddFieldValue", "Bad Field [a] /value[]");
  EXPECT_FALSE(command.AddFieldValue("a", nullptr));
  this->ExpectError("AddFieldValue", "Bad Field [a] /value[]");
  EXPECT_EQ(command.GetCommand(), before);
}

TYPED_TEST(FieldCommandTest, ReplacesAllFieldsWithACopyOfAList) {
  SqliteValueList list;
  list.AddValue("b", 2);
  auto command = OnTable<TypeParam>();
  EXPECT_TRUE(command.AddFieldValue("a", 1));
  command.SetFieldValues(list);
  list.AddValue("c", 3);
  EXPECT_NE(Dump(command).find("values:[b=2]"), std::string::npos);
  EXPECT_TRUE(command.IsValid());
  command.SetFieldValues(SqliteValueList());
  EXPECT_FALSE(command.IsValid());
}

TYPED_TEST(FieldCommandTest, ALongIsStoredWhole) {
  TypeParam command;
  EXPECT_TRUE(command.AddFieldValue("n", std::numeric_limits<long>::max()));
  const std::string literal = sizeof(long) > 4 ? "" : "2147483647";
  EXPECT_NE(Dump(command).find("values:[n=" + literal + "]"), std::string::npos);
}

using InsertCommandTest = SqliteCommandTest;

TEST_F(InsertCommandTest, NamesTheColumnsInByteOrder) {
  auto command = OnTable<InsertCommand>();
  EXPECT_TRUE(command.AddFieldValue("name", "a'b"));
  EXPECT_TRUE(command.AddFieldValue("id", 5));
  EXPECT_TRUE(command.IsValid());
  EXPECT_EQ(command.GetCommand(), "INSERT INTO job (id,name) VALUES (5,'a''b');");
  EXPECT_EQ(command.ToFormatedInsertValues(), "(id,name) VALUES (5,'a''b')");
}

TEST_F(InsertCommandTest, CanReplace) {
  auto command = OnTable<InsertCommand>();
  EXPECT_TRUE(command.AddFieldValue("id", 5));
  command.SetReplacable(true);
  EXPECT_EQ(command.GetCommand(), "INSERT OR REPLACE INTO job (id) VALUES (5);");
  command.SetReplacable(false);
  EXPECT_EQ(command.GetCommand(), "INSERT INTO job (id) VALUES (5);");
}

TEST_F(InsertCommandTest, OneFieldHasNoComma) {
  auto command = OnTable<InsertCommand>();
  EXPECT_TRUE(command.AddFieldValue("name", "x"));
  EXPECT_EQ(command.ToFormatedInsertValues(), "(name) VALUES ('x')");
}

TEST_F(InsertCommandTest, NamesAReplacedFieldOnce) {
  auto command = OnTable<InsertCommand>();
  EXPECT_TRUE(command.AddFieldValue("id", 5));
  EXPECT_TRUE(command.AddFieldValue("id", "x"));
  EXPECT_EQ(command.GetCommand(), "INSERT INTO job (id) VALUES ('x');");
}

TEST_F(InsertCommandTest, AnEmptyLiteralAtTheStartIsFollowedByNoComma) {
  SqliteValueList list;
  list.AddValue("a", 4294967296LL);
  list.AddValue("b", 1);
  list.AddValue("c", 4294967296LL);
  list.AddValue("d", 2);
  auto command = OnTable<InsertCommand>();
  command.SetFieldValues(list);
  EXPECT_EQ(command.GetCommand(), "INSERT INTO job (a,b,c,d) VALUES (1,,2);");
  EXPECT_EQ(command.ToFormatedInsertValues(), "(a,b,c,d) VALUES (1,,2)");
}

TEST_F(InsertCommandTest, FormattedValuesOfAFreshCommandAreTwoEmptyLists) {
  EXPECT_EQ(InsertCommand().ToFormatedInsertValues(), "() VALUES ()");
}

TEST_F(InsertCommandTest, DumpsItsValues) {
  auto command = OnTable<InsertCommand>();
  EXPECT_EQ(command.ToStr(), "job]values:[]");
  EXPECT_TRUE(command.AddFieldValue("b", "x'y"));
  EXPECT_TRUE(command.AddFieldValue("a", 1));
  command.SetReplacable(true);
  EXPECT_EQ(command.ToStr(), "job]values:[a=1,b='x''y']");
}

using UpdateCommandTest = SqliteCommandTest;

TEST_F(UpdateCommandTest, SetsTheFieldsWhereTheConditionHolds) {
  auto command = OnTable<UpdateCommand>();
  EXPECT_TRUE(command.AddFieldValue("name", "x"));
  EXPECT_TRUE(command.AddFieldValue("id", 5));
  EXPECT_TRUE(command.SetCondition("id = 5"));
  EXPECT_EQ(command.GetCommand(), "UPDATE job SET id=5,name='x' WHERE id = 5");
}

TEST_F(UpdateCommandTest, WithoutAConditionSetsEveryRow) {
  auto command = OnTable<UpdateCommand>();
  EXPECT_TRUE(command.AddFieldValue("id", 5));
  EXPECT_TRUE(command.IsValid());
  EXPECT_EQ(command.GetCommand(), "UPDATE job SET id=5");
}

TEST_F(UpdateCommandTest, AnEmptyLiteralKeepsItsPlace) {
  SqliteValueList list;
  list.AddValue("a", 4294967296LL);
  list.AddValue("b", 1);
  auto command = OnTable<UpdateCommand>();
  command.SetFieldValues(list);
  EXPECT_EQ(command.GetCommand(), "UPDATE job SET a=,b=1");
}

TEST_F(UpdateCommandTest, DumpsConditionAndValues) {
  auto command = OnTable<UpdateCommand>();
  EXPECT_EQ(command.ToStr(), "job]condition:[]/values:[]");
  EXPECT_TRUE(command.AddFieldValue("b", "x"));
  EXPECT_TRUE(command.AddFieldValue("a", 1));
  EXPECT_TRUE(command.SetCondition("id=1"));
  EXPECT_EQ(command.ToStr(), "job]condition:[id=1]/values:[a=1,b='x']");
}

using DeleteCommandTest = SqliteCommandTest;

TEST_F(DeleteCommandTest, DeletesByItsCondition) {
  auto command = OnTable<DeleteCommand>();
  EXPECT_TRUE(command.SetCondition("id=1"));
  EXPECT_TRUE(command.IsValid());
  EXPECT_EQ(command.GetCommand(), "DELETE FROM job WHERE id=1;");
}

TEST_F(DeleteCommandTest, DeletesAllRowsOnlyWithPermission) {
  auto command = OnTable<DeleteCommand>();
  command.DeleteAll();
  EXPECT_TRUE(command.IsValid());
  EXPECT_EQ(command.GetCommand(), "DELETE FROM job;");
}

TEST_F(DeleteCommandTest, PermissionWithoutATableIsInvalid) {
  DeleteCommand command;
  command.DeleteAll();
  EXPECT_FALSE(command.IsValid());
  EXPECT_TRUE(command.SetCondition("id=1"));
  EXPECT_FALSE(command.IsValid());
}

TEST_F(DeleteCommandTest, PermissionKeepsAConditionAndItIsUsed) {
  auto command = OnTable<DeleteCommand>();
  EXPECT_TRUE(command.SetCondition("id=1"));
  command.DeleteAll();
  EXPECT_EQ(command.GetCommand(), "DELETE FROM job WHERE id=1;");
  EXPECT_EQ(command.ToStr(), "job]condition:[id=1]");
}

TEST_F(DeleteCommandTest, ARefusedConditionLeavesThePermission) {
  auto command = OnTable<DeleteCommand>();
  command.DeleteAll();
  EXPECT_FALSE(command.SetCondition(""));
  EXPECT_FALSE(command.SetCondition(SqliteIn()));
  EXPECT_EQ(command.ToStr(), "job]condition:[all]");
  EXPECT_TRUE(command.IsValid());
}

TEST_F(DeleteCommandTest, AConditionAfterThePermissionIsUsed) {
  auto command = OnTable<DeleteCommand>();
  command.DeleteAll();
  EXPECT_TRUE(command.SetCondition("id=1"));
  EXPECT_EQ(command.ToStr(), "job]condition:[id=1]");
  EXPECT_EQ(command.GetCommand(), "DELETE FROM job WHERE id=1;");
}

TEST_F(DeleteCommandTest, DumpsItsConditionOrAll) {
  auto command = OnTable<DeleteCommand>();
  EXPECT_EQ(command.ToStr(), "job]condition:[]");
  command.DeleteAll();
  EXPECT_EQ(command.ToStr(), "job]condition:[all]");
}

}  // namespace
