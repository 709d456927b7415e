#include <kelodrcore/sqlite_db.h>

#include <iostream>

using namespace KeloDRCore;

const SqliteTableHandler kRuns("run", "id INTEGER PRIMARY KEY, state TEXT NOT NULL");

// Both tell what the last statement of this handle did: ask at once, on the same handle.
bool AskNumber(SqliteDB& db, const std::string& what, int& number) {
  SqliteValueList row;
  return db.SelectByCommand("SELECT " + what + " AS number", row) && row.GetValue("number", number);
}

bool StartRun(SqliteDB& db, int& id) {
  InsertCommand insert;
  insert.SetTable(kRuns);
  insert.AddFieldValue("state", "running");
  return db.InsertRecord(insert) && AskNumber(db, "last_insert_rowid()", id);
}

// Ends the runs that are running, and tells how many these were.
bool EndRuns(SqliteDB& db, int& changed) {
  UpdateCommand update;
  update.SetTable(kRuns);
  update.AddFieldValue("state", "ended");
  // Without a condition every row would be changed: look at the result.
  if (!update.SetCondition(SqliteEqual("state", "running"))) return false;
  return db.UpdateRecord(update) && AskNumber(db, "changes()", changed);
}

int main() {
  SqliteDB db("runs.db", 3, "cookbook");
  int id = 0;
  int changed = 0;
  for (int i = 0; i < 3; ++i) {
    if (!StartRun(db, id)) return 1;
    std::cout << "run " << id << " started\n";
  }
  if (!EndRuns(db, changed)) return 1;
  std::cout << changed << " runs ended\n";
  if (!EndRuns(db, changed)) return 1;
  std::cout << changed << " runs ended\n";
}
