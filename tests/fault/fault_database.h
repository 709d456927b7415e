// The fixture of the sweeps over databases. SQLite's own calls and memory fail as well as the
// library's: those of the C library, and those of SQLite's interface to the system.

#ifndef KELODRCORE_TESTS_FAULT_FAULT_DATABASE_H_
#define KELODRCORE_TESTS_FAULT_FAULT_DATABASE_H_

#include <sqlite3.h>

#include <functional>
#include <string>
#include <vector>

#include "fault/fault.h"
#include "kelodrcore/sqlite_db.h"

using Fault::Outcome;
using KeloDRCore::SqliteDB;
using KeloDRCore::SqliteTableHandler;
using KeloDRCore::SqliteValueList;

inline constexpr unsigned int kRetries = 1;

using Rows = std::vector<std::string>;

// What MakeFile() writes, and what the table holds once ManyRecords() are in it, too.
inline const Rows kBefore = {"1 one", "2 two"};
inline const Rows kAfterMany = {"1 one", "2 two", "3 three", "4 four", "5 five", "6 six"};

// Two runs of records with the same fields.
std::vector<SqliteValueList> ManyRecords();

class DatabaseFaultTest : public FaultTest {
 protected:
  void SetUp() override;

  void RemoveFile() const;
  // The file with kBefore in its table.
  void MakeFile() const;

  // The same file as a writer leaves it that is killed in the middle: changed, and its old pages in
  // the journal. Made once.
  void MakeUnfinishedFile();

  // Runs `action` with an object of its own; what `action` answers must agree with its error.
  bool With(const std::function<bool(SqliteDB&)>& action);

  // The rows of the table as SQLite itself reads them, once it has recovered the file.
  Rows Read() const;

  // Sweeps an operation that turns the rows that the file has after `prepare` into `after`.
  void SweepWriting(const std::function<void()>& prepare,
                    const std::function<bool(SqliteDB&)>& action, const Rows& after);
  // Sweeps one that gives `rows` into `found`, which it begins by emptying.
  void SweepReading(const std::function<bool(SqliteDB&)>& action, const Rows& rows);

  // Sweeps the calls of SQLite's interface to the system.
  void SweepFileCalls(const Fault::Operation& operation);
  // A lock that another has is waited for: in one attempt, or in two.
  void SweepBusyLocks(const Fault::Operation& operation);
  void SweepAll(const Fault::Operation& operation);

  void CheckError(const Outcome& outcome) const;
  bool TookAsMissing(const Outcome& outcome) const;

  bool missingIsNotTold = false;
  bool isUnfinished = false;  // a journal that seems to end early has nothing more to give back
  Json::Value error;          // of the last operation, null when it succeeded or threw
  std::string path;
  sqlite3_int64 memoryBefore = 0;
  Rows found;
  std::string unfinishedFile;
  std::string unfinishedJournal;
  const SqliteTableHandler table{"t", "n INTEGER PRIMARY KEY, s TEXT"};
};

#endif  // KELODRCORE_TESTS_FAULT_FAULT_DATABASE_H_
