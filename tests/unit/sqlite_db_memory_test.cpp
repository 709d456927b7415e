// The database handle when memory runs out: the n-th allocation fails, for every n.

#include <gtest/gtest.h>
#include <sqlite3.h>

#include <cstdlib>
#include <new>

#include "kelodrcore/sqlite_transaction.h"
#include "support/database.h"

namespace {

// Allocations until one fails; below 0 none does.
int allocationsLeft = -1;

}  // namespace

void* operator new(std::size_t size) {
  if (allocationsLeft >= 0 && allocationsLeft-- == 0) throw std::bad_alloc();
  void* const memory = std::malloc(size != 0 ? size : 1);
  if (memory == nullptr) throw std::bad_alloc();
  return memory;
}

void operator delete(void* memory) noexcept { std::free(memory); }
void operator delete(void* memory, std::size_t /*size*/) noexcept { std::free(memory); }

namespace {

using KeloDRCore::SqliteTransaction;

class SqliteDBMemoryTest : public DatabaseTest {
 protected:
  // Runs `action` with the n-th allocation failing until n is beyond its last. Nothing but
  // std::bad_alloc may come out, and closing must give back all that SQLite took, which it does
  // not while a statement is left.
  void FailEachAllocation(const std::function<void(SqliteDB&)>& action) {
    const sqlite3_int64 memory = sqlite3_memory_used();
    bool isThrough = false;
    int allocation = 0;
    for (; !isThrough; ++allocation) {
      ASSERT_LT(allocation, 100000);
      SqliteDB scarce(path, 0, "label");
      allocationsLeft = allocation;
      try {
        action(scarce);
        isThrough = allocationsLeft >= 0;
      } catch (const std::bad_alloc&) {
      }
      allocationsLeft = -1;
      scarce.Close();
      ASSERT_EQ(sqlite3_memory_used(), memory) << "allocation " << allocation;
      LogCapture::Clear();
    }
    EXPECT_GT(allocation, 5);
  }

  void SetUp() override {
    DatabaseTest::SetUp();
    ASSERT_TRUE(db->Exec("CREATE TABLE t (n, s); INSERT INTO t VALUES (1, 'a long enough text')"));
    db->Close();
  }
};

TEST_F(SqliteDBMemoryTest, ExecFailsCleanly) {
  FailEachAllocation([](SqliteDB& scarce) { scarce.Exec("DROP TABLE a_table_that_is_missing"); });
}

TEST_F(SqliteDBMemoryTest, QueriesFailCleanly) {
  FailEachAllocation([](SqliteDB& scarce) {
    SqliteValueList row;
    scarce.SelectByCommand("SELECT n, s, NULL AS empty FROM t", row);
  });
  FailEachAllocation([](SqliteDB& scarce) {
    Records rows;
    scarce.SelectByCommand("SELECT n, s, abs(-9223372036854775808) FROM t", rows);
  });
}

TEST_F(SqliteDBMemoryTest, NoRowIsGivenHalf) {
  FailEachAllocation([](SqliteDB& scarce) {
    Records rows;
    try {
      scarce.SelectByCommand("SELECT n, s FROM t UNION ALL SELECT 2, s FROM t", rows);
    } catch (const std::bad_alloc&) {
      allocationsLeft = -1;
      for (const SqliteValueList& row : rows) EXPECT_EQ(row.GetValues().size(), 2U);
      throw;
    }
  });
}

TEST_F(SqliteDBMemoryTest, CommandsFailCleanly) {
  const SqliteTableHandler table("t", "n, s");
  FailEachAllocation([&](SqliteDB& scarce) {
    InsertCommand insert = InsertOf(table, "n", 2);
    insert.AddFieldValue("s", "it's a text");
    scarce.InsertRecord(insert);
  });
  FailEachAllocation([&](SqliteDB& scarce) {
    Records rows;
    scarce.SelectRecords(SelectAll(table), rows);
  });
}

TEST_F(SqliteDBMemoryTest, BulkInsertsFailCleanlyAndLeaveNoRow) {
  Records rows(3);
  for (SqliteValueList& row : rows) row.AddValue("s", "a text that is long enough");
  rows.back().AddValue("n", 5);
  const SqliteTableHandler table("bulk", "n, s");
  FailEachAllocation([&](SqliteDB& scarce) {
    bool isDone = false;
    const auto check = [&] {
      allocationsLeft = -1;
      SqliteDB other(path, 0, "other");
      int count = 0;
      if (other.IsTableExisted("bulk")) other.GetCount(table, count);
      EXPECT_TRUE(count == 3 || (count == 0 && !isDone)) << count;
      EXPECT_TRUE(scarce.Exec("BEGIN; ROLLBACK")) << "a transaction was left open";
      other.Exec("DROP TABLE bulk");
    };
    try {
      isDone = scarce.InsertRecords(table, rows);
    } catch (const std::bad_alloc&) {
      check();
      throw;
    }
    if (allocationsLeft < 0) return;
    check();
    allocationsLeft = 1;
  });
}

TEST_F(SqliteDBMemoryTest, TransactionsFailCleanly) {
  FailEachAllocation([&](SqliteDB& scarce) {
    SqliteTransaction transaction(scarce);
    scarce.InsertRecord(InsertOf(SqliteTableHandler("t", "n, s"), "n", 3));
    transaction.Commit();
  });
}

TEST_F(SqliteDBMemoryTest, RowsAreHandedOverCleanly) {
  FailEachAllocation([&](SqliteDB& scarce) {
    scarce.SelectEach(SelectAll(SqliteTableHandler("t", "n, s")),
                      [](const SqliteValueList& row) { return row.GetValues().size() == 2; });
  });
}

}  // namespace
