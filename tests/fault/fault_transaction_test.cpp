#include <gmock/gmock.h>

#include <exception>
#include <functional>
#include <new>
#include <optional>

#include "fault/failing_vfs.h"
#include "fault/fault_database.h"
#include "kelodrcore/sqlite_transaction.h"

using KeloDRCore::SqliteTransaction;

namespace {

using AnyOf = std::vector<Rows>;

const Rows kKept = {"1 new", "2 two", "3 next"};
const Rows kUndone = {"1 one", "2 two", "3 next"};

class TransactionFaultTest : public DatabaseFaultTest {
 protected:
  using Action = std::function<bool(SqliteDB&, SqliteTransaction&)>;
  using Judgement = std::function<AnyOf(SqliteDB&, SqliteTransaction&, bool isDone)>;

  // Sweeps what is done with a transaction in which a row was changed: the calls of `action` fail.
  // Then nothing fails any more. `judge` ends the transaction and answers what the table holds, and
  // the handle adds one more row.
  void SweepOpen(const Action& action, const Judgement& judge);
};

void TransactionFaultTest::SweepOpen(const Action& action, const Judgement& judge) {
  AnyOf expected;
  const auto run = [&] {
    std::optional<Fault::Suspension> calm(std::in_place);
    MakeFile();
    error = Json::Value();
    SqliteDB db(path, kRetries, "label");
    SqliteTransaction transaction(db);
    EXPECT_TRUE(transaction.IsOpen());
    EXPECT_TRUE(db.Exec("UPDATE t SET s = 'new' WHERE n = 1"));
    bool isDone = false;
    std::exception_ptr thrown;
    calm.reset();
    try {
      isDone = action(db, transaction);
    } catch (const std::bad_alloc&) {
      thrown = std::current_exception();
    }
    calm.emplace();
    if (!isDone && !thrown) error = db.GetErr();
    expected = judge(db, transaction, isDone);
    EXPECT_FALSE(transaction.IsOpen());
    EXPECT_TRUE(db.Exec("BEGIN; REPLACE INTO t VALUES (3, 'next'); COMMIT")) << "usable no more";
    if (thrown) std::rethrow_exception(thrown);
    return isDone;
  };
  const auto check = [&](const Outcome& outcome) {
    EXPECT_EQ(sqlite3_memory_used(), memoryBefore);
    CheckError(outcome);
    EXPECT_THAT(expected, testing::Contains(Read()));
    EXPECT_TRUE(outcome.succeeded || outcome.threw || !outcome.log.empty());
  };
  const Fault::Operation operation = {[] {}, run, check};
  SweepCalls(operation);
  SweepMemory(operation);
  SweepFileCalls(operation);
}

TEST_F(TransactionFaultTest, ATransactionIsKeptWholeOrNotAtAll) {
  const std::vector<SqliteValueList> records = ManyRecords();
  const auto action = [&](SqliteDB& db) {
    SqliteTransaction transaction(db);
    return transaction.IsOpen() && db.Exec("UPDATE t SET s = 'new' WHERE n = 1") &&
           db.InsertOrReplaceRecords(table, records) && transaction.Commit();
  };
  Rows after = kAfterMany;
  after[0] = "1 new";
  SweepWriting([this] { MakeFile(); }, action, after);
}

// What an insert of many leaves behind when it fails inside a transaction that is committed then.
TEST_F(TransactionFaultTest, ATransactionHoldsNoPartOfAFailedInsert) {
  const std::vector<SqliteValueList> records = ManyRecords();
  MakeFile();
  const auto run = [&] {
    error = Json::Value();
    SqliteDB db(path, 0, "label");
    SqliteTransaction transaction(db);
    bool isDone = false;
    try {
      isDone = transaction.IsOpen() && db.InsertOrReplaceRecords(table, records);
    } catch (const std::bad_alloc&) {
    }
    const Fault::Suspension suspension;
    transaction.Commit();
    return isDone;
  };
  const auto check = [&](const Outcome& outcome) {
    EXPECT_EQ(sqlite3_memory_used(), memoryBefore);
    const Rows rows = Read();
    EXPECT_EQ(rows, outcome.succeeded ? kAfterMany : kBefore);
  };
  const Fault::Operation operation = {[this] { MakeFile(); }, run, check};
  SweepMemory(operation);
  for (const int failure : {FailingVfs::kError, FailingVfs::kFull}) {
    Sweep(operation, failure, Fault::kOnce);
    Sweep(operation, failure, Fault::kForGood);
  }
}

// SQLite ends some transactions that fail; one of them is kept: that whose lock was not given back.
TEST_F(TransactionFaultTest, ACommitThatFailedCanBeTriedAgainOrKeepsAllOrNothing) {
  SweepOpen([](SqliteDB&, SqliteTransaction& transaction) { return transaction.Commit(); },
            [](SqliteDB&, SqliteTransaction& transaction, bool isCommitted) {
              if (!isCommitted && !transaction.IsOpen()) return AnyOf{kKept, kUndone};
              EXPECT_TRUE(isCommitted || transaction.Commit());
              return AnyOf{kKept};
            });
}

TEST_F(TransactionFaultTest, ARollbackUndoesAllAndLeavesTheError) {
  isUnfinished = true;
  Json::Value before;
  SweepOpen(
      [&](SqliteDB& db, SqliteTransaction& transaction) {
        {
          const Fault::Suspension suspension;
          EXPECT_FALSE(db.Exec("nonsense"));
          before = db.GetErr();
        }
        transaction.Rollback();
        return true;
      },
      [&](SqliteDB& db, SqliteTransaction&, bool isDone) {
        EXPECT_TRUE(isDone);
        EXPECT_EQ(db.GetErr(), before);
        return AnyOf{kUndone};
      });
}

// That it is not open is the success here.
TEST_F(TransactionFaultTest, ASecondTransactionOnTheHandleIsNotOpenAndLeavesTheFirst) {
  SweepOpen(
      [](SqliteDB& db, SqliteTransaction&) {
        const SqliteTransaction second(db);
        return !second.IsOpen();
      },
      [](SqliteDB&, SqliteTransaction& first, bool) {
        return AnyOf{first.IsOpen() && first.Commit() ? kKept : kUndone};
      });
}

TEST_F(TransactionFaultTest, OfManyRecordsInATransactionAllAreThereOrNone) {
  const std::vector<SqliteValueList> records = ManyRecords();
  SweepOpen(
      [&](SqliteDB& db, SqliteTransaction&) { return db.InsertOrReplaceRecords(table, records); },
      [](SqliteDB& db, SqliteTransaction& transaction, bool isInserted) {
        if (!transaction.IsOpen()) return AnyOf{kUndone};
        int count = -1;
        EXPECT_TRUE(db.GetCount({"t", ""}, count));
        EXPECT_EQ(count, isInserted ? 6 : 2);
        EXPECT_TRUE(db.Exec("DELETE FROM t WHERE n > 2"));
        EXPECT_TRUE(transaction.Commit());
        return AnyOf{kKept};
      });
}

}  // namespace
