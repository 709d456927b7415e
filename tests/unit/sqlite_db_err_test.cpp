// The recorded error: its holder, its classes, and what a subclass makes of it.

#include <cstring>
#include <type_traits>

#include "kelodrcore/err.h"
#include "kelodrcore/sqlite_db.h"
#include "support/database.h"

namespace {

using KeloDRCore::ErrRecorder;

class NamingRecorder : public ErrRecorder {
 public:
  std::string GetErrCodeStr(int code) const override { return KeloDRCore::ERR::ToString(code); }
};

class OpenRecorder : public ErrRecorder {
 public:
  OpenRecorder(int code, const Json::Value& message) {
    errCode = code;
    errMsg = message;
  }
};

TEST(ErrRecorderTest, FreshOneHasOnlyCodeZero) { EXPECT_EQ(ErrRecorder().GetErr(), Error(0)); }

TEST(ErrRecorderTest, HasNoNameForAnyCode) {
  for (const int code : {0, 401, 404, 405, -1}) EXPECT_EQ(ErrRecorder().GetErrCodeStr(code), "");
}

TEST(ErrRecorderTest, NamesItsCodeThroughTheOverride) {
  class Naming : public NamingRecorder {
   public:
    Naming() { errCode = 401; }
  };
  Json::Value expected = Error(401);
  expected["err_code_str"] = KeloDRCore::ERR::ToString(401);
  EXPECT_EQ(Naming().GetErr(), expected);
  EXPECT_EQ(static_cast<const ErrRecorder&>(Naming()).GetErr(), expected);
}

TEST(ErrRecorderTest, ShowsDetailsUnlessTheyAreNull) {
  EXPECT_EQ(OpenRecorder(404, Json::Value()).GetErr(), Error(404));
  for (const Json::Value& details : {Json::Value("text"), Json::Value(""), Json::Value(0),
                                     Json::Value(Json::objectValue), Json::Value(false)}) {
    Json::Value expected = Error(-7);
    expected["err_msg"] = details;
    EXPECT_EQ(OpenRecorder(-7, details).GetErr(), expected);
  }
}

TEST(ErrRecorderTest, CopiesCodeAndDetails) {
  const OpenRecorder original(5, "database is locked");
  const ErrRecorder copy = original;
  EXPECT_EQ(copy.GetErr(), original.GetErr());
  ErrRecorder assigned;
  assigned = original;
  EXPECT_EQ(assigned.GetErr(), original.GetErr());
  static_assert(!std::has_virtual_destructor_v<ErrRecorder>);
  static_assert(std::has_virtual_destructor_v<SqliteDB>);
  static_assert(!std::is_copy_constructible_v<SqliteDB> && !std::is_copy_assignable_v<SqliteDB>);
}

// A pointer to a virtual member holds its offset in the virtual table plus one.
TEST(ErrRecorderTest, KeepsTheOrderOfItsSlots) {
  const auto slot = [](auto member) {
    size_t word = 0;
    std::memcpy(&word, &member, sizeof word);
    return (word - 1) / sizeof(void*);
  };
  EXPECT_EQ(slot(&ErrRecorder::GetErr), 0U);
  EXPECT_EQ(slot(&ErrRecorder::GetErrCodeStr), 1U);
}

using SqliteDBTest = DatabaseTest;

TEST_F(SqliteDBTest, SetDBErrOfCodeZeroDoesNothing) {
  db->SetDBErr(7, "kept");
  db->SetDBErr(0, "other");
  db->SetDBErr(0, nullptr);
  EXPECT_EQ(db->GetErr(), OpenRecorder(7, "kept").GetErr());
}

TEST_F(SqliteDBTest, SetDBErrTakesTheGivenMessageOrTheConnections) {
  const SqliteDB& constant = *db;
  constant.SetDBErr(26, "given");
  EXPECT_EQ(db->GetErr(), OpenRecorder(26, "given").GetErr());
  constant.SetDBErr(-3, "");
  EXPECT_EQ(db->GetErr(), OpenRecorder(-3, "").GetErr());
  ASSERT_TRUE(db->Open());
  constant.SetDBErr(8, nullptr);
  EXPECT_EQ(db->GetErr(), OpenRecorder(8, "not an error").GetErr());
}

TEST_F(SqliteDBTest, SetDBErrClassifiesBusyAndLockedAsALockAndAllElseAsAFailure) {
  const SqliteDB& constant = *db;
  for (const int code : {5, 6}) {
    constant.SetDBErr(OpenRecorder(code, "text"));
    EXPECT_EQ(db->GetErr(), Error(405, code, "text"));
  }
  for (const int code : {1, 2, 3, 4, 7, 8, 10, 26, 100, 101, 261, 262, 404, 405, -5}) {
    constant.SetDBErr(OpenRecorder(code, "text"));
    EXPECT_EQ(db->GetErr(), Error(404, code, "text"));
  }
}

TEST_F(SqliteDBTest, SetDBErrKeepsOnlyTheDetailsThatAreThere) {
  db->SetDBErr(7, "before");
  db->SetDBErr(ErrRecorder());
  EXPECT_EQ(db->GetErr(), Error(404));
  db->SetDBErr(OpenRecorder(5, Json::Value()));
  Json::Value codeOnly = Error(405);
  codeOnly["err_msg"]["sqlite_errcode"] = 5;
  EXPECT_EQ(db->GetErr(), codeOnly);
  db->SetDBErr(OpenRecorder(0, "text"));
  Json::Value textOnly = Error(404);
  textOnly["err_msg"]["sqlite_errmsg"] = "text";
  EXPECT_EQ(db->GetErr(), textOnly);
}

TEST_F(SqliteDBTest, SetDBErrClassifiesItsOwnError) {
  db->SetDBErr(6, "database table is locked");
  db->SetDBErr(*db);
  EXPECT_EQ(db->GetErr(), Error(405, 6, "database table is locked"));
}

TEST_F(SqliteDBTest, ErrorsCarryNoName) { EXPECT_EQ(db->GetErrCodeStr(404), ""); }

TEST_F(SqliteDBTest, FailureLinesShowTheErrorOfTheSubclass) {
  class OtherDB : public SqliteDB {
   public:
    using SqliteDB::SqliteDB;
    Json::Value GetErr() const override {
      Json::Value err = SqliteDB::GetErr();
      err["label"] = "other";
      return err;
    }
    std::string GetErrCodeStr(int code) const override { return KeloDRCore::ERR::ToString(code); }
  };
  OtherDB other(path, 0, "");
  Json::Value expected = Error(404, 1, "no such table: missing");
  expected["err_code_str"] = KeloDRCore::ERR::ToString(404);
  expected["label"] = "other";
  const std::string sql = "SELECT * FROM missing";
  EXPECT_FALSE(other.Exec(sql));
  EXPECT_EQ(other.GetErr(), expected);
  EXPECT_FALSE(other.SelectByCommand(sql, record));
  EXPECT_FALSE(other.SelectByCommand(sql, records));
  ExpectLog({ExecFailed("Exec", 0, sql, expected), SelectFailed(0, sql, expected),
             ExecFailed("SelectByCommand", 0, sql, expected)});
}

class ThrowingDB : public SqliteDB {
 public:
  using SqliteDB::SqliteDB;
  std::string GetErrCodeStr(int /*code*/) const override { throw Json::LogicError("own"); }
};

TEST_F(SqliteDBTest, WhatTheNamingOfACodeThrowsPassesUnchanged) {
  ThrowingDB throwing(path, 0, "label");
  EXPECT_THROW((void)throwing.GetErr(), Json::LogicError);
  EXPECT_THROW(throwing.Exec("nonsense"), Json::LogicError);
  EXPECT_THROW(throwing.SelectByCommand("nonsense", record), Json::LogicError);
  EXPECT_THROW(throwing.SelectByCommand("nonsense", records), Json::LogicError);
}

}  // namespace
