// Rows on their way into records and back.

#include <gmock/gmock.h>

#include <cstdint>
#include <limits>
#include <random>

#include "kelodrcore/sqlite_db.h"
#include "support/database.h"

namespace {

using testing::ElementsAre;
using testing::IsEmpty;

class SqliteDBRowTest : public DatabaseTest {
 protected:
  // The first row of a query, which must succeed, left in `record`.
  const SqliteValueList& First(const std::string& sql) {
    record = SqliteValueList();
    EXPECT_TRUE(db->SelectByCommand(sql, record)) << db->GetErr();
    return record;
  }
};

template <typename T>
T Field(const SqliteValueList& record, const std::string& name) {
  T value = T();
  EXPECT_TRUE(record.GetValue(name, value)) << name;
  return value;
}

TEST_F(SqliteDBRowTest, KeepsIntegersAndTextsAndLeavesOutTheRest) {
  const std::string sql = "SELECT 1 AS i, 'x' AS t, NULL AS n, 1.5 AS r, x'00ff' AS b";
  EXPECT_EQ(First(sql).ToStr(), "i:1, t:'x'");
  EXPECT_EQ(db->GetErr(), Error(0));
  ExpectLog({Warn(kFile, "ParseRecord", "field [n] has null value"),
             Warn(kFile, "ParseRecord", "Not supported type [2] with field [r]"),
             Warn(kFile, "ParseRecord", "Not supported type [4] with field [b]")});
}

TEST_F(SqliteDBRowTest, LinesNameTheParserWhateverOperationWasCalled) {
  ASSERT_TRUE(db->Open());
  const std::string sql = "SELECT NULL AS n, 2.5 AS r";
  const std::vector<LogLine> lines = {
      Warn(kFile, "ParseRecord", "field [n] has null value"),
      Warn(kFile, "ParseRecord", "Not supported type [2] with field [r]")};
  EXPECT_TRUE(db->DoSelectSqliteRecord(sql, record));
  ExpectLog(lines);
  EXPECT_TRUE(db->DoSelectSqliteRecords(sql, records));
  ExpectLog(lines);
  EXPECT_TRUE(db->SelectByCommand(sql, record));
  ExpectLog(lines);
  EXPECT_TRUE(db->SelectByCommand(sql, records));
  ExpectLog(lines);
}

TEST_F(SqliteDBRowTest, ARowWithoutAUsableColumnIsAnEmptyRecord) {
  EXPECT_THAT(Rows(*db, "SELECT NULL AS n UNION ALL SELECT NULL"), ElementsAre("", ""));
  const LogLine line = Warn(kFile, "ParseRecord", "field [n] has null value");
  ExpectLog({line, line});
}

TEST_F(SqliteDBRowTest, ReadsIntegersOf64Bits) {
  for (const std::int64_t number :
       {std::int64_t{0}, std::int64_t{-1}, std::int64_t{2147483647}, std::int64_t{2147483648},
        std::int64_t{-2147483649}, std::int64_t{4294967296},
        std::numeric_limits<std::int64_t>::max(), std::numeric_limits<std::int64_t>::min() + 1}) {
    First("SELECT " + std::to_string(number) + " AS n");
    EXPECT_EQ(Field<long long>(record, "n"), number);
  }
}

TEST_F(SqliteDBRowTest, ReadsTextsAsTheyAre) {
  for (const std::string text : {"", " ", "it''s", "line\nline", "\xc3\xa4\xff", "123", "%s%n"}) {
    First("SELECT '" + text + "' AS t");
    EXPECT_EQ(Field<std::string>(record, "t"), text == "it''s" ? "it's" : text);
  }
}

TEST_F(SqliteDBRowTest, AnEmptyTextIsAFieldAndANullIsNone) {
  First("SELECT '' AS empty, NULL AS missing");
  EXPECT_TRUE(record.HasField("empty"));
  EXPECT_FALSE(record.HasField("missing"));
  ExpectLog({Warn(kFile, "ParseRecord", "field [missing] has null value")});
}

TEST_F(SqliteDBRowTest, ATextEndsAtItsFirstNul) {
  First("SELECT CAST(x'610062' AS TEXT) AS t");
  EXPECT_EQ(Field<std::string>(record, "t"), "a");
}

TEST_F(SqliteDBRowTest, ReadsATextOfSeveralMiB) {
  const std::string text(5 << 20, '\'');
  EXPECT_TRUE(db->InsertRecord(InsertOf(SqliteTableHandler("t", "v TEXT"), "v", text)));
  LogCapture::Clear();
  EXPECT_EQ(Field<std::string>(First("SELECT v FROM t"), "v"), text);
}

TEST_F(SqliteDBRowTest, TheAliasNamesTheField) {
  EXPECT_EQ(First("SELECT 1 AS \"a b\", 2 AS 'it''s', 3").ToStr(), "3:3, a b:1, it's:2");
}

TEST_F(SqliteDBRowTest, TheLastOfTwoColumnsOfOneNameCounts) {
  EXPECT_EQ(First("SELECT 1 AS n, 'x' AS n").ToStr(), "n:'x'");
  EXPECT_EQ(First("SELECT 'x' AS n, 1 AS n").ToStr(), "n:1");
  EXPECT_EQ(First("SELECT 1 AS n, NULL AS n").ToStr(), "n:1");
  ExpectLog({Warn(kFile, "ParseRecord", "field [n] has null value")});
}

TEST_F(SqliteDBRowTest, AColumnWithoutANameIsRefusedByTheRecord) {
  EXPECT_EQ(First("SELECT 1 AS \"\", 2 AS n, 'x' AS ''").ToStr(), "n:2");
  ExpectLog({Err("sqlite_value.cpp", "AddValue", "Bad Field[] or value [1]"),
             Err("sqlite_value.cpp", "AddValue", "Bad Field[] or value ['x']")});
}

TEST_F(SqliteDBRowTest, OneRecordIsReplacedNotMerged) {
  record.AddValue("old", 1);
  EXPECT_TRUE(db->SelectByCommand("SELECT 2 AS n UNION SELECT 3 ORDER BY n DESC", record));
  EXPECT_EQ(record.ToStr(), "n:3");
}

TEST_F(SqliteDBRowTest, OneRecordReadsOnlyTheFirstRow) {
  // The second row would fail.
  const std::string sql = "SELECT abs(column1) AS n FROM (VALUES (-4), (-9223372036854775808))";
  EXPECT_EQ(First(sql).ToStr(), "n:4");
  EXPECT_EQ(db->GetErr(), Error(0));
}

TEST_F(SqliteDBRowTest, NoRowLeavesTheRecordAsItWas) {
  record.AddValue("old", 1);
  db->SetDBErr(7, "before");
  EXPECT_TRUE(db->SelectByCommand("SELECT 1 AS n WHERE 0", record));
  EXPECT_EQ(record.ToStr(), "old:1");
  EXPECT_EQ(db->GetErr(), Error(0));
}

TEST_F(SqliteDBRowTest, AFailureLeavesTheRecordAsItWas) {
  record.AddValue("old", 1);
  const std::string sql = "SELECT abs(-9223372036854775808) AS n";
  EXPECT_FALSE(db->SelectByCommand(sql, record));
  EXPECT_EQ(record.ToStr(), "old:1");
  EXPECT_EQ(db->GetErr(), Error(404, 1, "integer overflow"));
  ExpectLog({SelectFailed(0, sql, Error(404, 1, "integer overflow"))});
}

TEST_F(SqliteDBRowTest, RowsAreAppendedInOrder) {
  record.AddValue("old", 1);
  records = {record};
  EXPECT_TRUE(db->SelectByCommand("SELECT 1 AS n WHERE 0", records));
  EXPECT_THAT(Texts(records), ElementsAre("old:1"));
  EXPECT_TRUE(db->SelectByCommand("SELECT 3 AS n UNION ALL SELECT 2", records));
  EXPECT_THAT(Texts(records), ElementsAre("old:1", "n:3", "n:2"));
}

TEST_F(SqliteDBRowTest, RowsReadBeforeAFailureStay) {
  const std::string sql =
      "SELECT abs(column1) AS n FROM (VALUES (-4), (5), (-9223372036854775808))";
  const Json::Value failure = Error(404, 1, "integer overflow");
  EXPECT_FALSE(db->SelectByCommand(sql, records));
  EXPECT_THAT(Texts(records), ElementsAre("n:4", "n:5"));
  EXPECT_EQ(db->GetErr(), failure);
  ExpectLog({ExecFailed("SelectByCommand", 0, sql, failure)});
}

// A random record of up to three fields of each kind; `read` is what the table gives back.
void MakeRandomRecord(std::mt19937& random, SqliteValueList& written, SqliteValueList& read) {
  const auto draw = [&](unsigned int below) { return static_cast<unsigned int>(random() % below); };
  for (const std::string suffix : {"1", "2", "3"}) {
    if (draw(3) != 0) {
      const int edges[] = {0, -1, std::numeric_limits<int>::min(), std::numeric_limits<int>::max()};
      const int number = draw(2) != 0 ? static_cast<int>(random()) : edges[draw(4)];
      written.AddValue("i" + suffix, number);
      read.AddValue("i" + suffix, static_cast<long long>(number));
    }
    if (draw(3) != 0) {
      const bool truth = draw(2) != 0;
      written.AddValue("b" + suffix, truth);
      read.AddValue("b" + suffix, static_cast<long long>(truth));
    }
    if (draw(3) != 0) {
      std::string text(draw(40), '\'');
      for (char& byte : text) {
        if (draw(4) != 0) byte = static_cast<char>(1 + draw(255));
      }
      written.AddValue("t" + suffix, text);
      read.AddValue("t" + suffix, text);
    }
  }
}

TEST_F(SqliteDBRowTest, RandomRecordsSurviveInsertAndSelect) {
  const SqliteTableHandler table("t", "id INTEGER,i1,i2,i3,b1,b2,b3,t1,t2,t3");
  std::mt19937 random(20250101);
  ASSERT_TRUE(db->Exec("CREATE TABLE t (id INTEGER,i1,i2,i3,b1,b2,b3,t1,t2,t3); BEGIN"));
  Records expected(500);
  for (size_t id = 0; id < expected.size(); ++id) {
    SqliteValueList written;
    MakeRandomRecord(random, written, expected[id]);
    written.AddValue("id", static_cast<unsigned int>(id));
    expected[id].AddValue("id", static_cast<long long>(id));
    InsertCommand insert;
    insert.SetTable(table);
    insert.SetFieldValues(written);
    ASSERT_TRUE(db->InsertRecord(insert)) << written.ToStr();
  }
  ASSERT_TRUE(db->Exec("COMMIT"));
  SelectCommand select = SelectAll(table);
  select.AddOrderField("id");
  select.SetOrderByASC();
  ASSERT_TRUE(db->SelectRecords(select, records));
  EXPECT_EQ(Texts(records), Texts(expected));
  LogCapture::Clear();
}

TEST_F(SqliteDBRowTest, AnIntegerOutside32BitsIsRefusedAsAStatement) {
  InsertCommand insert;
  SqliteValueList values;
  insert.SetTable(SqliteTableHandler("t", "n INTEGER"));
  values.AddValue("n", 4294967296LL);
  insert.SetFieldValues(values);
  EXPECT_FALSE(db->InsertRecord(insert));
  const Json::Value failure = Error(404, 1, "near \")\": syntax error");
  EXPECT_EQ(db->GetErr(), failure);
  EXPECT_THAT(Rows(*db, "SELECT * FROM t"), IsEmpty());
  const std::string sql = "INSERT INTO t (n) VALUES ();";
  ExpectLog({Info(kFile, "Exec", "label Exec cmd: " + sql), ExecFailed("Exec", 0, sql, failure),
             Err(kFile, "Exec", "Failed to exec [" + sql + "] in db[" + path + "]")});
}

}  // namespace
