#include "kelodrcore/sqlite_transaction.h"

#include <sqlite3.h>

#include "kelodrcore/err.h"
#include "log.h"

namespace KeloDRCore {
namespace {

// A connection keeps one pointer for its user, the argument of its rollback hook (there is no hook
// here). It holds the transaction that is open, and goes away with the connection, so that what a
// later connection does is never taken for a transaction of an earlier one.

void SetOwner(sqlite3* db, const SqliteTransaction* owner) {
  sqlite3_rollback_hook(db, nullptr, const_cast<SqliteTransaction*>(owner));
}

const void* GetOwner(sqlite3* db) {
  void* const owner = sqlite3_rollback_hook(db, nullptr, nullptr);
  sqlite3_rollback_hook(db, nullptr, owner);
  return owner;
}

}  // namespace

SqliteTransaction::SqliteTransaction(SqliteDB& db) : handle(db) {
  if (handle.Exec("BEGIN IMMEDIATE")) SetOwner(handle.dbHandle, this);
}

SqliteTransaction::~SqliteTransaction() { Rollback(); }

bool SqliteTransaction::IsOwner() const {
  return handle.dbHandle != nullptr && GetOwner(handle.dbHandle) == this;
}

bool SqliteTransaction::IsOpen() const { return IsOwner() && handle.IsInTransaction(); }

bool SqliteTransaction::Commit() {
  if (!IsOpen()) {
    handle.SetErr(ERR::ERR_DATABASE_OPERATION);
    KELODR_LOG(ERR, __func__, "No transaction is open in db[%s]", handle.dbPath.c_str());
    return false;
  }
  if (!handle.Exec("COMMIT")) return false;
  SetOwner(handle.dbHandle, nullptr);
  return true;
}

void SqliteTransaction::Rollback() {
  if (!IsOwner()) return;
  SetOwner(handle.dbHandle, nullptr);
  if (handle.IsInTransaction()) handle.AbandonTransaction();
}

}  // namespace KeloDRCore
