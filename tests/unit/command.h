// What the tests of the commands share.

#ifndef KELODRCORE_TESTS_UNIT_COMMAND_H_
#define KELODRCORE_TESTS_UNIT_COMMAND_H_

#include <string>
#include <type_traits>

#include "kelodrcore/sqlite_command.h"
#include "support/clean_test.h"

using KeloDRCore::DeleteCommand;
using KeloDRCore::InsertCommand;
using KeloDRCore::SelectCommand;
using KeloDRCore::SqliteIn;
using KeloDRCore::SqliteTableHandler;
using KeloDRCore::SqliteValueList;
using KeloDRCore::UpdateCommand;

class SqliteCommandTest : public CleanTest {
 protected:
  static void ExpectError(const std::string& function, const std::string& message) {
    ExpectLog({Err("sqlite_command.cpp", function, message)});
  }
};

// Puts the class into the names of the tests that run for several.
struct CommandName {
  template <typename Command>
  static std::string GetName(int /*index*/) {
    if (std::is_same_v<Command, InsertCommand>) return "Insert";
    if (std::is_same_v<Command, UpdateCommand>) return "Update";
    return std::is_same_v<Command, SelectCommand> ? "Select" : "Delete";
  }
};

template <typename Command>
Command OnTable(const std::string& name = "job") {
  Command command;
  EXPECT_TRUE(command.SetTable(SqliteTableHandler(name, "")));
  return command;
}

#endif  // KELODRCORE_TESTS_UNIT_COMMAND_H_
