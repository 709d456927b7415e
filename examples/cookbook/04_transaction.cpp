#include <kelodrcore/json_value.h>
#include <kelodrcore/sqlite_db.h>

#include <iostream>

using namespace KeloDRCore;

const SqliteTableHandler kFiles("file", "path TEXT PRIMARY KEY, size INTEGER NOT NULL");

struct FileEntry {
  std::string path;
  unsigned int size;
};

bool AddFile(SqliteDB& db, const FileEntry& file) {
  InsertCommand insert;
  insert.SetTable(kFiles);
  insert.AddFieldValue("path", file.path);
  insert.AddFieldValue("size", file.size);
  return db.InsertRecord(insert);
}

// All of the files or none of them. Closing rolls back what was begun, leaves the error as it is,
// and the next statement opens the file again.
bool AddFiles(SqliteDB& db, const std::vector<FileEntry>& files) {
  bool isGood = db.Exec("BEGIN IMMEDIATE");
  for (size_t i = 0; isGood && i < files.size(); ++i) isGood = AddFile(db, files[i]);
  if (isGood) isGood = db.Exec("COMMIT");
  if (!isGood) db.Close();
  return isGood;
}

int main() {
  SqliteDB db("files.db", 3, "cookbook");
  std::vector<FileEntry> files;
  for (unsigned int i = 0; i < 1000; ++i) files.push_back({"/volume1/" + std::to_string(i), i});

  int count = 0;
  if (!AddFiles(db, files) || !db.GetCount(kFiles, count)) return 1;
  std::cout << count << " files\n";

  // The second one is there already, so the first one does not stay either.
  if (AddFiles(db, {{"/volume1/new", 1}, {"/volume1/7", 1}})) return 1;
  std::cout << JsonValue::toString(db.GetErr()) << '\n';
  if (!db.GetCount(kFiles, count)) return 1;
  std::cout << count << " files\n";
}
