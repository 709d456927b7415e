#include <kelodrcore/err.h>
#include <kelodrcore/sqlite_db.h>

#include <fstream>
#include <iostream>

using namespace KeloDRCore;

const SqliteTableHandler kNodes("node", "name TEXT PRIMARY KEY");

// What a program does about a failure is told by the code alone.
std::string Judge(const Json::Value& err) {
  switch (err["err_code"].asInt()) {
    case ERR::ERR_DATABASE_LOCK:
      return "locked: try again later";
    case ERR::ERR_DATABASE_OPERATION:
      return "broken: " + err["err_msg"]["sqlite_errmsg"].asString();
    default:
      return "a mistake of the program: " + ERR::ToString(err["err_code"].asInt());
  }
}

void AddNode(SqliteDB& db, const std::string& name) {
  InsertCommand insert;
  insert.SetTable(kNodes);
  if (!name.empty()) insert.AddFieldValue("name", name);
  std::cout << (db.InsertRecord(insert) ? "stored" : Judge(db.GetErr())) << '\n';
}

int main() {
  SqliteDB db("nodes.db", 0, "cookbook");  // no retries, so that this program ends soon
  AddNode(db, "nas1");

  SqliteDB other("nodes.db", 0, "cookbook");
  if (!other.Exec("BEGIN EXCLUSIVE")) return 1;
  AddNode(db, "nas2");
  if (!other.Exec("COMMIT")) return 1;
  AddNode(db, "nas2");

  std::ofstream("notes.db") << "This file is not a database, whatever its name says.\n";
  SqliteDB notes("notes.db", 0, "cookbook");
  AddNode(notes, "nas1");

  AddNode(db, "");
}
