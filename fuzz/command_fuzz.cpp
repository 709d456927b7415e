// Commands of any data: whatever the values hold, the statement stays what it is.

#include <kelodrcore/sqlite_command.h>
#include <kelodrcore/sqlite_condition.h>
#include <sqlite3.h>

#include "fuzz.h"

namespace {

using namespace KeloDRCore;

sqlite3* Database() {
  static sqlite3* db = [] {
    sqlite3* opened = nullptr;
    Require(sqlite3_open(":memory:", &opened) == SQLITE_OK, "SQLite opens");
    Require(sqlite3_exec(opened, "CREATE TABLE job (a, b)", nullptr, nullptr, nullptr) == SQLITE_OK,
            "the table is there");
    return opened;
  }();
  return db;
}

std::string WithoutNul(const std::string& text) { return text.substr(0, text.find('\0')); }

SqliteValue TakeValue(FuzzedDataProvider& input) {
  switch (input.ConsumeIntegralInRange(0, 3)) {
    case 0:
      return input.ConsumeIntegral<int>();
    case 1:
      return input.ConsumeBool();
    case 2:
      return input.ConsumeIntegral<unsigned int>();
    default:
      return WithoutNul(input.ConsumeRandomLengthString(255));
  }
}

SqliteCondition TakeCondition(FuzzedDataProvider& input, int depth) {
  const char* const column = input.ConsumeBool() ? "a" : "b";
  switch (input.ConsumeIntegralInRange(0, depth > 0 ? 6 : 3)) {
    case 0:
      return SqliteEqual(column, TakeValue(input));
    case 1:
      return SqliteNotEqual(column, TakeValue(input));
    case 2:
      return SqliteIsNull(column);
    case 3:
      return SqliteNotIn(column, {TakeValue(input), TakeValue(input)});
    case 4:
      return SqliteIn(
          column, std::vector<SqliteValue>(input.ConsumeIntegralInRange(0U, 4U), TakeValue(input)));
    case 5:
      return SqliteAnd(TakeCondition(input, depth - 1), TakeCondition(input, depth - 1));
    default:
      return SqliteOr(TakeCondition(input, depth - 1), TakeCondition(input, depth - 1));
  }
}

// SQLite takes the text as exactly one statement.
void CheckStatement(const SqliteCommand& command) {
  Require(command.IsValid(), "the command is valid");
  const std::string sql = command.GetCommand();
  sqlite3_stmt* statement = nullptr;
  const char* rest = nullptr;
  const int code = sqlite3_prepare_v2(Database(), sql.c_str(), -1, &statement, &rest);
  Require(code == SQLITE_OK && statement != nullptr, "SQLite parses the statement");
  Require(*rest == '\0', "the text is one statement");
  sqlite3_finalize(statement);
  Require(!command.ToStr().empty(), "the dump names the table");
}

template <typename Command>
Command Filled(FuzzedDataProvider& input) {
  Command command;
  command.SetTable(SqliteTableHandler("job", ""));
  SqliteValueList values;
  values.AddValue("a", TakeValue(input));
  values.AddValue("b", TakeValue(input));
  command.SetFieldValues(values);
  return command;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  FuzzedDataProvider input(data, size);
  CheckStatement(Filled<InsertCommand>(input));
  UpdateCommand update = Filled<UpdateCommand>(input);
  update.SetCondition(TakeCondition(input, 4));
  CheckStatement(update);
  DeleteCommand remove;
  remove.SetTable(SqliteTableHandler("job", ""));
  remove.SetCondition(TakeCondition(input, 4));
  CheckStatement(remove);
  SelectCommand select;
  select.SetTable(SqliteTableHandler("job", ""));
  select.AddField("a");
  select.AddOrderField("b");
  select.SetLimit(input.ConsumeIntegral<int>(), input.ConsumeIntegral<int>());
  select.SetCondition(TakeCondition(input, 4));
  CheckStatement(select);
  return 0;
}
