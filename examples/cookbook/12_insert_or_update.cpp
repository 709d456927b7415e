#include <kelodrcore/sqlite_db.h>

#include <iostream>

using namespace KeloDRCore;

const SqliteTableHandler kNodes("node",
                                "name TEXT PRIMARY KEY, address TEXT NOT NULL, "
                                "seen INTEGER NOT NULL DEFAULT 1");

// A new node, or a new address and one more sight of a known one. INSERT OR REPLACE would not do:
// it deletes the old row, and `seen` with it. The table must be there, as for every statement of
// one's own.
bool See(SqliteDB& db, const std::string& name, const std::string& address) {
  InsertCommand insert;
  if (!insert.SetTable(kNodes) || !insert.AddFieldValue("name", name) ||
      !insert.AddFieldValue("address", address)) {
    return false;
  }
  return db.CreateTable(kNodes) &&
         db.Exec("INSERT INTO node " + insert.ToFormatedInsertValues() +
                 " ON CONFLICT(name) DO UPDATE SET address=excluded.address, seen=seen+1");
}

int main() {
  SqliteDB db("nodes.db", 3, "cookbook");
  if (!See(db, "nas1", "192.0.2.10") || !See(db, "nas2", "192.0.2.20") ||
      !See(db, "nas1", "192.0.2.11")) {
    return 1;
  }
  SelectCommand select;
  select.SetTable(kNodes);
  select.SelectAll();
  select.AddOrderField("name");
  select.SetOrderByASC();
  const bool isRead = db.SelectEach(select, [](const SqliteValueList& row) {
    std::cout << row.ToStr() << '\n';
    return true;
  });
  return isRead ? 0 : 1;
}
