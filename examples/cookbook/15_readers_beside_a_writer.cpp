#include <kelodrcore/sqlite_db.h>
#include <kelodrcore/sqlite_transaction.h>

#include <iostream>

using namespace KeloDRCore;

const SqliteTableHandler kNodes("node", "name TEXT PRIMARY KEY");

// The journal mode stays with the file, the wait with the connection: `Open` sets 1000 ms again
// after each `Close`.
bool OpenForCrowds(SqliteDB& db) {
  SqliteValueList row;
  std::string mode;
  return db.SelectByCommand("PRAGMA journal_mode=WAL", row) && row.GetValue("journal_mode", mode) &&
         mode == "wal" && db.Exec("PRAGMA busy_timeout=5000");
}

bool AddNode(SqliteDB& db, const std::string& name) {
  InsertCommand insert;
  insert.SetTable(kNodes);
  insert.AddFieldValue("name", name);
  return db.InsertRecord(insert);
}

void Show(SqliteDB& db, const char* when) {
  int count = 0;
  if (db.GetCount(kNodes, count)) std::cout << when << ": " << count << " node(s)\n";
}

int main() {
  SqliteDB writer("nodes.db", 3, "cookbook");
  SqliteDB reader("nodes.db", 3, "cookbook");
  if (!OpenForCrowds(writer) || !OpenForCrowds(reader) || !AddNode(writer, "nas1")) return 1;

  SqliteTransaction transaction(writer);
  if (!transaction.IsOpen() || !AddNode(writer, "nas2")) return 1;
  Show(reader, "a reader does not wait for the writer, and sees the last commit");
  if (!transaction.Commit()) return 1;
  Show(reader, "now");
}
