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

// A handle on a file of its own, not there yet, without retries.
class DatabaseTest : public CleanTest {
 protected:
  void SetUp() override;
  void TearDown() override;

  bool HasFile() const;

  std::string path;
  std::unique_ptr<KeloDRCore::SqliteDB> db;
};

// The error documents: a bare code, and a code with SQLite's own code and message.
Json::Value Error(int code);
Json::Value Error(int code, int sqliteCode, const std::string& sqliteMessage);

// The selected records as text, "name:literal, ..." each; failed expectations when the query fails.
std::vector<std::string> Rows(KeloDRCore::SqliteDB& db, const std::string& sql);

// The line of a statement that failed for good: Exec's wording, which the query for many records
// shares, and the wording of the query for one.
LogLine ExecFailed(const std::string& function, unsigned int retries, const std::string& sql,
                   const Json::Value& error);
LogLine SelectFailed(unsigned int retries, const std::string& sql, const Json::Value& error);

// The pauses between two attempts: this test binary's own usleep stands before the C library's.
// Sleeps of a second or more are the library's and end at once, shorter ones are SQLite's.
namespace Pauses {

// Forgets what was recorded and sets what runs in place of each pause, and in place of SQLite's own
// sleeps, which are real without it.
void Start(const std::function<void()>& onPause = nullptr,
           const std::function<void()>& onSqliteSleep = nullptr);

// The lengths of the library's pauses in milliseconds.
std::vector<unsigned int> Lengths();

// What SQLite asked to sleep in total, in milliseconds.
unsigned int SqliteWait();

}  // namespace Pauses

// Gives every connection opened from now on the SQL function fail(code): it fails with that SQLite
// result code for the next `times` calls, and returns the code after them. `onCall` runs in each
// call.
void FailNextCalls(int times, const std::function<void()>& onCall = nullptr);

#endif  // KELODRCORE_TESTS_SUPPORT_DATABASE_H_
