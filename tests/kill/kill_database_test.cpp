// Inserts, of one record and of many, killed at every system call.

#include <sqlite3.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <functional>
#include <string>
#include <vector>

#include "kelodrcore/sqlite_transaction.h"
#include "kill/recovery.h"
#include "support/clean_test.h"
#include "support/tracer.h"

namespace {

using KeloDRCore::InsertCommand;
using KeloDRCore::SqliteDB;
using KeloDRCore::SqliteTableHandler;
using KeloDRCore::SqliteTransaction;
using KeloDRCore::SqliteValueList;
using testing::Values;
using Tracer::Moment;

// Whether the table is there, or the insert creates it.
class KilledInsertTest : public CleanTest, public testing::WithParamInterface<bool> {
 protected:
  void SetUp() override {
    CleanTest::SetUp();
    path = Path("base");
    if (GetParam()) Insert(1);
    LogCapture::Clear();
    std::filesystem::copy_file(path, Path("copy"), copyError);
  }

  void Prepare() const {
    for (const std::string& name : {path, path + "-journal", Ack(2), Ack(3)}) unlink(name.c_str());
    std::error_code error;
    std::filesystem::copy_file(Path("copy"), path, error);
    EXPECT_EQ(error, copyError);
  }

  bool Insert(int number) const {
    SqliteDB db(path, 0, "");
    return Insert(db, number);
  }

  static bool Insert(SqliteDB& db, int number) {
    InsertCommand insert;
    insert.SetTable(kTable);
    insert.AddFieldValue("n", number);
    insert.AddFieldValue("filler", std::string(10000, 'x'));
    return db.InsertRecord(insert);
  }

  // 2 and all from 20 on. The cache is small, so that rows reach the file before the commit.
  static bool InsertMany(SqliteDB& db) {
    std::vector<SqliteValueList> records(kMany);
    for (int i = 0; i < kMany; ++i) {
      records[static_cast<size_t>(i)].AddValue("n", i == 0 ? 2 : 20 + i);
      records[static_cast<size_t>(i)].AddValue("filler", std::string(10000, 'x'));
    }
    return db.Exec("PRAGMA cache_size=5") && db.InsertRecords(kTable, records);
  }

  // Sweeps an operation that stores what InsertMany does and `more` rows, or nothing.
  void SweepMany(const std::function<bool()>& operation, size_t more) const {
    bool sawRows = false;
    bool sawNone = false;
    const std::vector<int> kills =
        Tracer::Sweep([this] { Prepare(); },
                      [&] {
                        if (operation()) WriteText(Ack(2), "");
                      },
                      [&](const Moment& moment) {
                        ExpectNextInsertSucceeds(moment);
                        const size_t rows = Select("SELECT n FROM t WHERE n = 2 OR n > 4").size();
                        EXPECT_EQ(rows, IsThere(2) ? kMany + more : 0U) << moment;
                        (rows > 0 ? sawRows : sawNone) = true;
                      });
    ASSERT_EQ(kills.size(), 1U);
    EXPECT_GT(kills[0], 50);
    EXPECT_TRUE(sawRows && sawNone);
    RecordProperty("kills", kills[0]);
  }

  // Tells by a file that the insert succeeded.
  std::string Ack(int number) const { return Path("ack" + std::to_string(number)); }
  void InsertAndAcknowledge(int number) const {
    if (Insert(number)) WriteText(Ack(number), "");
  }

  std::vector<SqliteValueList> Select(const std::string& sql) const {
    SqliteDB db(path, 0, "");
    std::vector<SqliteValueList> rows;
    EXPECT_TRUE(db.SelectByCommand(sql, rows)) << db.GetErr();
    return rows;
  }

  bool IsThere(int number) const {
    return !Select("SELECT n FROM t WHERE length(filler) = 10000 AND n = " + std::to_string(number))
                .empty();
  }

  void ExpectSound(const Moment& moment) const {
    const std::vector<SqliteValueList> rows = Select("PRAGMA integrity_check");
    ASSERT_EQ(rows.size(), 1U) << moment;
    EXPECT_EQ(rows[0].ToStr(), "integrity_check:'ok'") << moment;
  }

  void ExpectThereIfAcknowledged(int number, const Moment& moment) const {
    if (access(Ack(number).c_str(), F_OK) != 0) return;
    EXPECT_TRUE(IsThere(number)) << number << " at " << moment;
    unlink(Ack(number).c_str());
  }

  // The killed inserts were of 2 and then perhaps of 3; the next one is of 4.
  void ExpectNextInsertSucceeds(const Moment& moment) const {
    ExpectPrompt([&] {
      ExpectSound(moment);
      EXPECT_TRUE(Insert(4)) << moment;
    });
    ExpectSound(moment);
    EXPECT_EQ(IsThere(1), GetParam()) << moment;
    EXPECT_TRUE(IsThere(4)) << moment;
    ExpectThereIfAcknowledged(2, moment);
    ExpectThereIfAcknowledged(3, moment);
    for (const std::string& name : NamesIn(dir)) {
      EXPECT_TRUE(name == "base" || name == "copy") << name << " at " << moment;
    }
    LogCapture::Clear();
  }

  static constexpr int kMany = 12;
  static inline const SqliteTableHandler kTable{"t", "n INTEGER UNIQUE, filler TEXT"};

  std::string path;
  std::error_code copyError;
};

INSTANTIATE_TEST_SUITE_P(IntoATable, KilledInsertTest, Values(true, false), [](const auto& tested) {
  return tested.param ? "ThatIsThere" : "ThatItCreates";
});

TEST_P(KilledInsertTest, LeavesTheRowOrNotAndTheDatabaseSound) {
  bool sawRow = false;
  bool sawNone = false;
  const std::vector<int> kills =
      Tracer::Sweep([this] { Prepare(); }, [this] { InsertAndAcknowledge(2); },
                    [&](const Moment& moment) {
                      ExpectNextInsertSucceeds(moment);
                      (IsThere(2) ? sawRow : sawNone) = true;
                    });
  ASSERT_EQ(kills.size(), 1U);
  EXPECT_GT(kills[0], 50);
  EXPECT_TRUE(sawRow && sawNone);
  RecordProperty("kills", kills[0]);
}

TEST_P(KilledInsertTest, OfManyRecordsLeavesAllOrNone) {
  SweepMany(
      [this] {
        SqliteDB db(path, 0, "");
        return InsertMany(db);
      },
      0);
}

TEST_P(KilledInsertTest, InATransactionLeavesAllOrNone) {
  SweepMany(
      [this] {
        SqliteDB db(path, 0, "");
        SqliteTransaction transaction(db);
        return Insert(db, 10) && InsertMany(db) && Insert(db, 11) && transaction.Commit();
      },
      2);
}

// A sample of the pairs of a kill and a kill of the insert after it, which rolls the first one
// back.
TEST_P(KilledInsertTest, MayBeFollowedByAnotherKilledInsert) {
  const int kills = SweepPairs(
      {7, 5}, [this] { Prepare(); },
      {[this] { InsertAndAcknowledge(2); }, [this] { InsertAndAcknowledge(3); }},
      [this](const Moment& second) { ExpectNextInsertSucceeds(second); });
  EXPECT_GT(kills, 30);
  RecordProperty("kills", kills);
}

}  // namespace
