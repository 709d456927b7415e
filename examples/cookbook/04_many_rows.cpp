#include <kelodrcore/json_value.h>
#include <kelodrcore/sqlite_db.h>
#include <kelodrcore/sqlite_transaction.h>

#include <iostream>

using namespace KeloDRCore;

const SqliteTableHandler kFiles("file", "path TEXT PRIMARY KEY, size INTEGER NOT NULL");
const SqliteTableHandler kScans("scan", "volume TEXT PRIMARY KEY, files INTEGER NOT NULL");

SqliteValueList File(const std::string& path, unsigned int size) {
  SqliteValueList row;
  row.AddValue("path", path);
  row.AddValue("size", size);
  return row;
}

// Two tables change together: both or none. The destructor of a transaction that was not committed
// undoes it and leaves the error as it is.
bool StoreScan(SqliteDB& db, const std::string& volume, const std::vector<SqliteValueList>& files) {
  SqliteTransaction transaction(db);
  SqliteValueList scan;
  scan.AddValue("volume", volume);
  scan.AddValue("files", static_cast<unsigned int>(files.size()));
  return transaction.IsOpen() && db.InsertRecords(kFiles, files) &&
         db.InsertOrReplaceRecords(kScans, {scan}) && transaction.Commit();
}

// Adds up the sizes; one row at a time is in memory.
bool SumSizes(SqliteDB& db, long long& sum) {
  SelectCommand select;
  select.SetTable(kFiles);
  select.AddField("size");
  sum = 0;
  return db.SelectEach(select, [&sum](const SqliteValueList& row) {
    unsigned int size = 0;
    if (row.GetValue("size", size)) sum += size;
    return true;  // go on
  });
}

int main() {
  SqliteDB db("files.db", 3, "cookbook");
  std::vector<SqliteValueList> files;
  for (unsigned int i = 0; i < 10000; ++i) {
    files.push_back(File("/volume1/" + std::to_string(i), i));
  }
  long long sum = 0;
  if (!StoreScan(db, "/volume1", files) || !SumSizes(db, sum)) return 1;
  std::cout << "10000 files of " << sum << " bytes\n";

  // The second file is there already, so that nothing of this scan is stored.
  if (StoreScan(db, "/volume2", {File("/volume2/new", 1), File("/volume1/7", 1)})) return 1;
  std::cout << JsonValue::toString(db.GetErr()) << '\n';
  int scans = 0;
  if (!SumSizes(db, sum) || !db.GetCount(kScans, scans)) return 1;
  std::cout << "still " << sum << " bytes, " << scans << " scan\n";
}
