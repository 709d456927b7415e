// Data becoming SQL text, and lists becoming text.

#include "growth/operations.h"
#include "growth/texts.h"
#include "kelodrcore/container.h"
#include "kelodrcore/sqlite_command.h"
#include "kelodrcore/sqlite_condition.h"
#include "kelodrcore/sqlite_value.h"

namespace {

using namespace KeloDRCore;

const SqliteTableHandler kTable("t", "a TEXT");

Work Rendered(const std::string& text) {
  return [value = SqliteValue(text)] { Require(!value.ToFormatedValue().empty(), "rendering"); };
}

SqliteValueList Fields(size_t count) {
  SqliteValueList fields;
  for (size_t i = 0; i < count; ++i) fields.AddValue(Name(i, count), "it's");
  return fields;
}

template <typename Command>
Work Built(size_t count) {
  Command command;
  command.SetTable(kTable);
  command.SetFieldValues(Fields(count));
  return [command] { Require(!command.GetCommand().empty(), "GetCommand"); };
}

Work BuiltSelect(size_t count) {
  SelectCommand command;
  command.SetTable(kTable);
  for (size_t i = 0; i < count; ++i) {
    command.AddField(Name(i, count));
    command.AddOrderField(Name(i, count));
  }
  return [command] { Require(!command.GetCommand().empty(), "GetCommand"); };
}

Work FilledCommand(size_t count) {
  return [count] {
    InsertCommand command;
    for (size_t i = 0; i < count; ++i) command.AddFieldValue(Name(i, count), "a text");
  };
}

// One step more of a chain. Each condition holds its whole text, so a chain of n steps copies n
// times what it holds.
Work Joined(size_t count) {
  return [chain = SqliteCondition(Repeated(count, "(a=1) AND "))] {
    Require(SqliteAnd(chain, SqliteEqual("b", 1)).IsValid(), "joining");
  };
}

// Separate conditions joined by one object, as callers do who do not nest.
Work JoinedAgain(size_t count) {
  return [count] {
    SqliteOr condition;
    for (size_t i = 0; i < count; ++i) condition.SetValue("a=1", "b=1");
  };
}

Work Listed(size_t count) {
  return [values = std::vector<SqliteValue>(count, SqliteValue("it's"))] {
    Require(SqliteIn("a", values).IsValid(), "listing");
  };
}

}  // namespace

void AddStatements(std::vector<Operation>& operations) {
  const auto add = [&](const char* name, size_t size, const std::function<Work(size_t)>& prepared) {
    operations.push_back({name, size, prepared});
  };
  add("ToFormatedValue", 16384, [](size_t n) { return Rendered(Repeated(n, "x")); });
  add("ToFormatedValue of quotes", 4096, [](size_t n) { return Rendered(Repeated(n, "'")); });
  add("insert of fields", 256, Built<InsertCommand>);
  add("update of fields", 256, Built<UpdateCommand>);
  add("select of fields in an order", 256, BuiltSelect);
  add("AddFieldValue", 256, FilledCommand);
  add("one condition more", 1024, Joined);
  add("conditions in one object", 256, JoinedAgain);
  add("IN list", 256, Listed);
  add("SqliteValueList::ToStr", 256,
      [](size_t n) { return [fields = Fields(n)] { Require(!fields.ToStr().empty(), "ToStr"); }; });
  add("SqliteValueList +=", 256,
      [](size_t n) { return [fields = Fields(n)] { SqliteValueList() += fields; }; });
  add("Container::ToString", 1024, [](size_t n) {
    return [list = std::vector<std::string>(n, "element")] {
      Require(!Container::ToString(list, ", ").empty(), "ToString");
    };
  });
  add("Container::ToJsonArray", 256, [](size_t n) {
    return [list = std::vector<std::string>(n, "element")] {
      Require(!Container::ToJsonArray(list).empty(), "ToJsonArray");
    };
  });
}
