/// @file
/// Several operations of one database handle that happen all or not at all.

#ifndef KELODRCORE_SQLITE_TRANSACTION_H_
#define KELODRCORE_SQLITE_TRANSACTION_H_

#include "kelodrcore/export.h"
#include "kelodrcore/sqlite_db.h"

namespace KeloDRCore {

/// A write transaction on one handle: what the handle does while it is open is kept by `Commit`, or
/// undone by `Rollback`, by the destructor, and by the end of the process.
///
/// The handle outlives the transaction. Closing the handle ends the transaction without keeping
/// anything. So do some failures of SQLite, for instance a full disk: ask `IsOpen` after one.
/// Statements of one's own that begin or end a transaction on the handle do not go together with
/// it.
class KELODR_EXPORT SqliteTransaction {
 public:
  /// Opens the database if it is closed, creating a missing file, and begins the transaction with
  /// `BEGIN IMMEDIATE`, as `SqliteDB::Exec` would, retries and lines included: other connections
  /// can read meanwhile, but not write. When that fails, which `IsOpen` tells, the error is
  /// recorded in `db`. It always fails while another transaction is open on the handle.
  explicit SqliteTransaction(SqliteDB& db);

  SqliteTransaction(const SqliteTransaction&) = delete;
  SqliteTransaction& operator=(const SqliteTransaction&) = delete;

  /// `Rollback`.
  ~SqliteTransaction();

  /// True from a successful beginning until the transaction ends.
  [[nodiscard]] bool IsOpen() const;

  /// Keeps the changes and ends the transaction, as `SqliteDB::Exec` would, retries and lines
  /// included. After a failure it is still open in most cases, and can be committed again. Fails
  /// with 404 and a line at ERR when it is not open.
  bool Commit();

  /// Undoes the changes and ends the transaction, if it is open. The recorded error stays as it
  /// was.
  void Rollback();

 private:
  KELODR_LOCAL bool IsOwner() const;

  SqliteDB& handle;
};

}  // namespace KeloDRCore

#endif  // KELODRCORE_SQLITE_TRANSACTION_H_
