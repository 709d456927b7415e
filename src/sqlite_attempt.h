// One attempt to change a database.

#ifndef KELODRCORE_SRC_SQLITE_ATTEMPT_H_
#define KELODRCORE_SRC_SQLITE_ATTEMPT_H_

#include <sqlite3.h>

#include "kelodrcore/sqlite_db.h"

namespace KeloDRCore {

// Unless it is kept, its end leaves the handle in the transaction state in which its start found
// it.
class SqliteDB::Attempt {
 public:
  explicit Attempt(SqliteDB& handle) : db(handle), isInner(handle.IsInTransaction()) {}
  Attempt(const Attempt&) = delete;
  Attempt& operator=(const Attempt&) = delete;

  ~Attempt() {
    if (isKept || !db.IsInTransaction()) return;
    if (!isInner || (hasSavepoint && !UndoSavepoint())) db.AbandonTransaction();
  }

  void Keep() { isKept = true; }

  // What happens from here to the release is one change. Outside a transaction the savepoint is
  // one: its release commits. Both record a failure raw.
  bool SetSavepoint() {
    hasSavepoint = db.DoExecSqliteCommand("SAVEPOINT records");
    return hasSavepoint;
  }
  bool ReleaseSavepoint() {
    isKept = db.DoExecSqliteCommand("RELEASE records");
    return isKept;
  }

 private:
  bool UndoSavepoint() const {
    const char* const undo = "ROLLBACK TO records; RELEASE records";
    return sqlite3_exec(db.dbHandle, undo, nullptr, nullptr, nullptr) == SQLITE_OK;
  }

  SqliteDB& db;
  const bool isInner;
  bool hasSavepoint = false;
  bool isKept = false;
};

}  // namespace KeloDRCore

#endif  // KELODRCORE_SRC_SQLITE_ATTEMPT_H_
