// What the tests of the database handle share.

#ifndef KELODRCORE_TESTS_SUPPORT_DATABASE_H_
#define KELODRCORE_TESTS_SUPPORT_DATABASE_H_

#include <json/json.h>

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "kelodrcore/sqlite_db.h"
#include "support/clean_test.h"

using KeloDRCore::DeleteCommand;
using KeloDRCore::InsertCommand;
using KeloDRCore::SelectCommand;
using KeloDRCore::SqliteDB;
using KeloDRCore::SqliteTableHandler;
using KeloDRCore::SqliteValueList;
using KeloDRCore::UpdateCommand;

using Records = std::vector<SqliteValueList>;

// A handle on a file of its own, not there yet, without retries, and what it selects into.
class DatabaseTest : public CleanTest {
 protected:
  void SetUp() override;
  void TearDown() override;

  bool HasFile() const;

  // The handle's own file in its log lines.
  static constexpr const char* kFile = "sqlite_db.cpp";

  std::string path;
  std::unique_ptr<SqliteDB> db;
  SqliteValueList record;
  Records records;
};

// An insert of one field; the select of all columns.
template <typename T>
InsertCommand InsertOf(const SqliteTableHandler& table, const std::string& field, const T& value) {
  InsertCommand command;
  EXPECT_TRUE(command.SetTable(table));
  EXPECT_TRUE(command.AddFieldValue(field, value));
  return command;
}
SelectCommand SelectAll(const SqliteTableHandler& table);

// The error documents: a bare code, and a code with SQLite's own code and message.
Json::Value Error(int code);
Json::Value Error(int code, int sqliteCode, const std::string& sqliteMessage);

// Records as text, "name:literal, ..." each, and those of a query, which must succeed.
std::vector<std::string> Texts(const Records& records);
std::vector<std::string> Rows(SqliteDB& db, const std::string& sql);

// The line of a statement that failed for good: Exec's wording, which the query for many records
// shares, and the wording of the query for one.
LogLine ExecFailed(const std::string& function, unsigned int retries, const std::string& sql,
                   const Json::Value& error);
LogLine SelectFailed(unsigned int retries, const std::string& sql, const Json::Value& error);

// The pauses between two attempts. Sleeps of a second or more are the library's and end at once,
// shorter ones are SQLite's.
namespace Pauses {

// Forgets what was recorded and sets what runs in place of each pause, and in place of SQLite's own
// sleeps, which are real without it.
void Start(const std::function<void()>& onPause = nullptr,
           const std::function<void()>& onSqliteSleep = nullptr);

// The lengths of the library's pauses in milliseconds.
std::vector<unsigned int> Lengths();

// Expects that many pauses since Start, each of 1 to 2 s.
void ExpectCount(size_t count);

// What SQLite asked to sleep in total, in milliseconds.
unsigned int SqliteWait();

}  // namespace Pauses

// Gives every connection opened from now on the SQL function fail(code): it fails with that SQLite
// result code for the next `times` calls, and returns the code after them. `onCall` runs in each
// call.
void FailNextCalls(int times, const std::function<void()>& onCall = nullptr);

#endif  // KELODRCORE_TESTS_SUPPORT_DATABASE_H_
