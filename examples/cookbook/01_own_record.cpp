#include <kelodrcore/sqlite_db.h>

#include <iostream>

using namespace KeloDRCore;

class Volume : public SqliteRecord {
 public:
  std::string mountPoint;
  unsigned int freeMiB = 0;  // an SQL literal has 32 bits; KiB would need more
  bool encrypted = false;

  SqliteValueList ConvertColumns(const std::vector<std::string>& columns) const override {
    SqliteValueList row;
    for (const std::string& column : columns) {
      if (column == "mount_point") row.AddValue(column, mountPoint);
      if (column == "free_mib") row.AddValue(column, freeMiB);
      if (column == "encrypted") row.AddValue(column, encrypted);
    }
    return row;
  }

  bool FromSqliteRecord(const SqliteValueList& row) override {
    return row.GetValue("mount_point", mountPoint) && row.GetValue("free_mib", freeMiB) &&
           row.GetValue("encrypted", encrypted);
  }

  std::vector<std::string> GetColumns() const override {
    return {"mount_point", "free_mib", "encrypted"};
  }
};

const SqliteTableHandler kVolumes(
    "volume",
    "mount_point TEXT PRIMARY KEY, free_mib INTEGER NOT NULL, encrypted INTEGER NOT NULL");

bool Store(SqliteDB& db, const Volume& volume) {
  InsertCommand insert;
  insert.SetTable(kVolumes);
  insert.SetReplacable(true);  // a row of that mount point gives way
  insert.SetFieldValues(volume.ToSqliteRecord());
  return db.InsertRecord(insert);
}

bool StoreFreeSpace(SqliteDB& db, const Volume& volume) {
  UpdateCommand update;
  update.SetTable(kVolumes);
  update.SetFieldValues(volume.ConvertColumns({"free_mib"}));
  // Without a condition every row would be set: a failure of this call must not pass unnoticed.
  return update.SetCondition(SqliteEqual("mount_point", volume.mountPoint)) &&
         db.UpdateRecord(update);
}

bool Find(SqliteDB& db, const std::string& mountPoint, Volume& volume) {
  SelectCommand select;
  select.SetTable(kVolumes);
  for (const std::string& column : volume.GetColumns()) select.AddField(column);
  SqliteValueList row;
  return select.SetCondition(SqliteEqual("mount_point", mountPoint)) &&
         db.SelectRecord(select, row) && !row.GetValues().empty() && volume.FromSqliteRecord(row);
}

int main() {
  Volume volume;
  volume.mountPoint = "/volume1";
  volume.freeMiB = 4'768'371;
  volume.encrypted = true;

  SqliteDB db("volumes.db", 3, "cookbook");
  if (!Store(db, volume)) return 1;
  volume.freeMiB = 1'907'348;
  if (!StoreFreeSpace(db, volume)) return 1;

  Volume found;
  if (!Find(db, "/volume1", found)) return 1;
  std::cout << found.mountPoint << ": " << found.freeMiB << " MiB free"
            << (found.encrypted ? ", encrypted" : "") << '\n';
  std::cout << "/volume2 is " << (Find(db, "/volume2", found) ? "there" : "not there") << '\n';
}
