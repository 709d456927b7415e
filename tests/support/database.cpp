#include "support/database.h"

#include <gmock/gmock.h>
#include <sqlite3.h>
#include <unistd.h>

#include "kelodrcore/json_value.h"
#include "support/test_clock.h"

namespace {

constexpr useconds_t kSecond = 1000000;

std::vector<unsigned int> pauseLengths;
useconds_t sqliteSleeps = 0;

int failuresLeft = 0;
std::function<void()> callAction;

void Fail(sqlite3_context* context, int /*count*/, sqlite3_value** arguments) {
  const int code = sqlite3_value_int(arguments[0]);
  if (callAction) callAction();
  if (failuresLeft > 0) {
    --failuresLeft;
    sqlite3_result_error_code(context, code);
  } else {
    sqlite3_result_int(context, code);
  }
}

int AddFail(sqlite3* db, char** /*error*/, const void* /*api*/) {
  return sqlite3_create_function(db, "fail", 1, SQLITE_UTF8, nullptr, Fail, nullptr, nullptr);
}

std::string FailureText(unsigned int retries, const std::string& wording, const std::string& sql,
                        const Json::Value& error) {
  return "Reach retry limit [" + std::to_string(retries) + "], failed to " + wording + "[" + sql +
         "] with err [" + KeloDRCore::JsonValue::toString(error) + "]";
}

}  // namespace

void DatabaseTest::SetUp() {
  CleanTest::SetUp();
  path = Path("it's a base");
  db = std::make_unique<SqliteDB>(path, 0U, "label");
  Pauses::Start();
}

void DatabaseTest::TearDown() {
  db.reset();
  CleanTest::TearDown();
}

bool DatabaseTest::HasFile() const { return access(path.c_str(), F_OK) == 0; }

Json::Value Error(int code) {
  Json::Value error;
  error["err_code"] = code;
  return error;
}

Json::Value Error(int code, int sqliteCode, const std::string& sqliteMessage) {
  Json::Value error = Error(code);
  error["err_msg"]["sqlite_errcode"] = sqliteCode;
  error["err_msg"]["sqlite_errmsg"] = sqliteMessage;
  return error;
}

SelectCommand SelectAll(const SqliteTableHandler& table) {
  SelectCommand command;
  EXPECT_TRUE(command.SetTable(table));
  command.SelectAll();
  return command;
}

std::vector<std::string> Texts(const Records& records) {
  std::vector<std::string> texts;
  for (const SqliteValueList& record : records) texts.push_back(record.ToStr());
  return texts;
}

std::vector<std::string> Rows(SqliteDB& db, const std::string& sql) {
  Records records;
  EXPECT_TRUE(db.SelectByCommand(sql, records)) << db.GetErr();
  return Texts(records);
}

LogLine ExecFailed(const std::string& function, unsigned int retries, const std::string& sql,
                   const Json::Value& error) {
  return Err("sqlite_db.cpp", function, FailureText(retries, "exec command ", sql, error));
}

LogLine SelectFailed(unsigned int retries, const std::string& sql, const Json::Value& error) {
  return Err("sqlite_db.cpp", "SelectByCommand",
             FailureText(retries, "select command", sql, error));
}

namespace Pauses {

void Start(const std::function<void()>& onPause, const std::function<void()>& onSqliteSleep) {
  pauseLengths.clear();
  sqliteSleeps = 0;
  ReplaceSleeps([=](useconds_t microseconds) -> std::optional<int> {
    if (microseconds >= kSecond) {
      pauseLengths.push_back(microseconds / 1000);
      if (onPause) onPause();
      return 0;
    }
    sqliteSleeps += microseconds;
    if (!onSqliteSleep) return std::nullopt;
    onSqliteSleep();
    return 0;
  });
}

std::vector<unsigned int> Lengths() { return pauseLengths; }

void ExpectCount(size_t count) {
  using testing::AllOf;
  using testing::Ge;
  using testing::Le;
  EXPECT_THAT(pauseLengths,
              AllOf(testing::SizeIs(count), testing::Each(AllOf(Ge(1000U), Le(2000U)))));
}

unsigned int SqliteWait() { return sqliteSleeps / 1000; }

}  // namespace Pauses

void FailNextCalls(int times, const std::function<void()>& onCall) {
  failuresLeft = times;
  callAction = onCall;
  sqlite3_auto_extension(reinterpret_cast<void (*)()>(AddFail));
}
