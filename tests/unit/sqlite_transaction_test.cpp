#include "kelodrcore/sqlite_transaction.h"

#include <gmock/gmock.h>

#include "support/database.h"

namespace {

using KeloDRCore::SqliteTransaction;
using testing::ElementsAre;
using testing::IsEmpty;

class SqliteTransactionTest : public DatabaseTest {
 protected:
  void SetUp() override {
    DatabaseTest::SetUp();
    ASSERT_TRUE(db->Exec("CREATE TABLE t (n INTEGER PRIMARY KEY)"));
  }

  // What is on disk, as another connection sees it.
  std::vector<std::string> Kept() const {
    SqliteDB other(path, 0, "other");
    return Rows(other, "SELECT n FROM t ORDER BY n");
  }

  void Insert(int n) { EXPECT_TRUE(db->Exec("INSERT INTO t VALUES (" + std::to_string(n) + ")")); }
};

TEST_F(SqliteTransactionTest, CommitKeepsTheChanges) {
  SqliteTransaction transaction(*db);
  EXPECT_TRUE(transaction.IsOpen());
  Insert(1);
  EXPECT_THAT(Kept(), IsEmpty());
  EXPECT_TRUE(transaction.Commit());
  EXPECT_FALSE(transaction.IsOpen());
  EXPECT_THAT(Kept(), ElementsAre("n:1"));
  EXPECT_EQ(db->GetErr(), Error(0));
}

TEST_F(SqliteTransactionTest, RollbackUndoesTheChanges) {
  SqliteTransaction transaction(*db);
  Insert(1);
  transaction.Rollback();
  EXPECT_FALSE(transaction.IsOpen());
  Insert(2);
  EXPECT_THAT(Kept(), ElementsAre("n:2"));
}

}  // namespace
