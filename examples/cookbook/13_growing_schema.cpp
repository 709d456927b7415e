#include <kelodrcore/sqlite_db.h>
#include <kelodrcore/sqlite_transaction.h>

#include <iostream>

using namespace KeloDRCore;

// What each version adds to the one before it. A step that was once delivered is never changed:
// there are files that it has made.
const std::vector<std::string> kSteps = {
    "CREATE TABLE node (name TEXT PRIMARY KEY, address TEXT NOT NULL)",
    "ALTER TABLE node ADD COLUMN state TEXT NOT NULL DEFAULT 'unknown'",
    "CREATE INDEX node_by_state ON node (state)"};

// Without column definitions no command makes the table: only the steps do.
const SqliteTableHandler kNodes("node", "");

bool ReadVersion(SqliteDB& db, unsigned int& version) {
  SqliteValueList row;
  return db.SelectByCommand("PRAGMA user_version", row) && row.GetValue("user_version", version);
}

// Brings the file to the version `target`, in one transaction: a killed process leaves the old
// version, and two processes do not upgrade at once. A file of a newer program is refused.
bool Upgrade(SqliteDB& db, size_t target) {
  SqliteTransaction transaction(db);
  unsigned int version = 0;
  if (!transaction.IsOpen() || !ReadVersion(db, version) || version > target) return false;
  for (size_t step = version; step < target; ++step) {
    if (!db.Exec(kSteps[step])) return false;
  }
  return db.Exec("PRAGMA user_version=" + std::to_string(target)) && transaction.Commit();
}

int main() {
  SqliteDB db("nodes.db", 3, "cookbook");
  InsertCommand insert;
  insert.SetTable(kNodes);
  insert.AddFieldValue("name", "nas1");
  insert.AddFieldValue("address", "192.0.2.10");
  if (!Upgrade(db, 1) || !db.InsertRecord(insert)) return 1;  // the first edition of the program
  if (!Upgrade(db, kSteps.size())) return 1;                  // and today's

  SelectCommand select;
  select.SetTable(kNodes);
  select.SelectAll();
  SqliteValueList row;
  unsigned int version = 0;
  if (!db.SelectRecord(select, row) || !ReadVersion(db, version)) return 1;
  std::cout << "version " << version << ": " << row.ToStr() << '\n';
  std::cout << "back to version 1: " << (Upgrade(db, 1) ? "done" : "refused") << '\n';
}
