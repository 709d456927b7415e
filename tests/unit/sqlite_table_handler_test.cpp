#include "kelodrcore/sqlite_table_handler.h"

#include <memory>
#include <string>
#include <type_traits>

#include "support/clean_test.h"

namespace {

using KeloDRCore::SqliteTableHandler;

using SqliteTableHandlerTest = CleanTest;

TEST_F(SqliteTableHandlerTest, ADefaultHandlerHasEmptyFields) {
  const SqliteTableHandler handler;
  EXPECT_EQ(handler.tableName, "");
  EXPECT_EQ(handler.columnDefs, "");
}

TEST_F(SqliteTableHandlerTest, TakesNameAndColumnsInThatOrder) {
  const SqliteTableHandler handler("job", "id INTEGER");
  EXPECT_EQ(handler.tableName, "job");
  EXPECT_EQ(handler.columnDefs, "id INTEGER");
}

TEST_F(SqliteTableHandlerTest, ChecksAndChangesNothing) {
  const std::string odd("my table; DROP \"x\" '\0\n", 22);
  const SqliteTableHandler handler(odd, odd);
  EXPECT_EQ(handler.tableName, odd);
  EXPECT_EQ(handler.columnDefs, odd);
  EXPECT_EQ(SqliteTableHandler("", "id INTEGER").columnDefs, "id INTEGER");
  EXPECT_EQ(SqliteTableHandler("job", "").tableName, "job");
}

TEST_F(SqliteTableHandlerTest, AssigningCopiesBothFields) {
  SqliteTableHandler handler("old", "old columns");
  SqliteTableHandler other("job", "id INTEGER");
  EXPECT_EQ(&(handler = other), &handler);
  other.tableName = "changed";
  other.columnDefs.clear();
  EXPECT_EQ(handler.tableName, "job");
  EXPECT_EQ(handler.columnDefs, "id INTEGER");
}

TEST_F(SqliteTableHandlerTest, AssigningToItselfChangesNothing) {
  SqliteTableHandler handler("job", "id INTEGER");
  const SqliteTableHandler& same = handler;
  handler = same;
  EXPECT_EQ(handler.tableName, "job");
  EXPECT_EQ(handler.columnDefs, "id INTEGER");
}

TEST_F(SqliteTableHandlerTest, CopyingCopiesBothFields) {
  const SqliteTableHandler handler("job", "id INTEGER");
  const SqliteTableHandler copy(handler);
  EXPECT_EQ(copy.tableName, "job");
  EXPECT_EQ(copy.columnDefs, "id INTEGER");
}

TEST_F(SqliteTableHandlerTest, AnOwnTableIsDestroyedThroughTheBase) {
  static_assert(std::has_virtual_destructor_v<SqliteTableHandler>);
  bool isDestroyed = false;
  struct OwnTable : SqliteTableHandler {
    explicit OwnTable(bool& flag) : SqliteTableHandler("own", ""), destroyed(flag) {}
    ~OwnTable() override { destroyed = true; }
    bool& destroyed;
  };
  std::unique_ptr<SqliteTableHandler> handler = std::make_unique<OwnTable>(isDestroyed);
  EXPECT_EQ(handler->tableName, "own");
  handler.reset();
  EXPECT_TRUE(isDestroyed);
}

}  // namespace
