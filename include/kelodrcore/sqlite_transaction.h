/// @file
/// Several operations of one database handle that happen all or not at all.

#ifndef KELODRCORE_SQLITE_TRANSACTION_H_
#define KELODRCORE_SQLITE_TRANSACTION_H_

#include "kelodrcore/export.h"
#include "kelodrcore/sqlite_db.h"

namespace KeloDRCore {

/// A write transaction on one handle. `Commit` keeps what the handle did since it began;
/// `Rollback`, the destructor and the end of the process undo it.
///
/// The handle outlives the transaction. Closing the handle ends it and keeps nothing, and so do
/// some failures of SQLite, for instance a full disk: statements after such a failure are outside
/// the transaction, so ask `IsOpen` first. Before the call: no text of the caller's begins or ends
/// a transaction on the handle meanwhile.
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
