#include <kelodrcore/sqlite_db.h>

#include <iostream>

using namespace KeloDRCore;

const SqliteTableHandler kDisks("disk", "name TEXT PRIMARY KEY, temperature REAL, note TEXT");

// A column that is left out is NULL. A REAL column stores the text of a number as that number.
bool AddDisk(SqliteDB& db, const std::string& name, const std::string& temperature) {
  InsertCommand insert;
  insert.SetTable(kDisks);
  insert.AddFieldValue("name", name);
  if (!temperature.empty()) insert.AddFieldValue("temperature", temperature);
  return db.InsertRecord(insert);
}

int main() {
  SqliteDB db("disks.db", 3, "cookbook");
  if (!AddDisk(db, "sda", "36.5") || !AddDisk(db, "sdb", "")) return 1;

  // A field is the text of an SQL expression. Without these two it would be left out of the row,
  // with a line at WARN.
  SelectCommand select;
  select.SetTable(kDisks);
  select.AddField("name");
  select.AddField("CAST(COALESCE(temperature, -1) AS TEXT) AS temperature");
  select.AddField("COALESCE(note, 'no note') AS note");
  select.AddOrderField("name");
  select.SetOrderByASC();
  const bool isRead = db.SelectEach(select, [](const SqliteValueList& row) {
    std::string temperature;
    if (row.GetValue("temperature", temperature) && std::stod(temperature) > 36) {
      std::cout << "warm: ";
    }
    std::cout << row.ToStr() << '\n';
    return true;
  });
  return isRead ? 0 : 1;
}
