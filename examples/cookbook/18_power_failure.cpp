#include <kelodrcore/json_value.h>
#include <kelodrcore/sqlite_db.h>

#include <iostream>

using namespace KeloDRCore;

const SqliteTableHandler kOrders("orders", "id INTEGER PRIMARY KEY, item TEXT NOT NULL");

// A handle whose acknowledged changes also survive the loss of power. The setting belongs to the
// connection: it is made again after each `Close`.
bool OpenDurably(SqliteDB& db) { return db.Exec("PRAGMA synchronous=EXTRA"); }

bool Store(SqliteDB& db, const std::string& item) {
  InsertCommand insert;
  insert.SetTable(kOrders);
  insert.AddFieldValue("item", item);
  return db.InsertRecord(insert);
}

// A document: the old one or the new one is there, whole, and the new one once the result is true.
bool StoreSettings(const std::string& language) {
  Json::Value settings;
  settings["language"] = language;
  return JsonValue::toFile(settings, "settings.json");
}

int main() {
  SqliteDB db("orders.db", 3, "cookbook");
  if (!OpenDurably(db) || !Store(db, "disk") || !StoreSettings("en")) return 1;
  SqliteValueList row;
  int level = 0;
  if (!db.SelectByCommand("PRAGMA synchronous", row) || !row.GetValue("synchronous", level)) {
    return 1;
  }
  std::cout << "stored for good, at level " << level << " (EXTRA)\n";
}
