#include <kelodrcore/sqlite_db.h>

#include <iostream>

using namespace KeloDRCore;

int main() {
  const SqliteTableHandler nodes("node", "name TEXT PRIMARY KEY, port INTEGER, state TEXT");
  SqliteDB db("nodes.db", 3, "conditions");
  for (const char* name : {"nas1", "nas2", "nas3"}) {
    InsertCommand insert;
    insert.SetTable(nodes);
    insert.AddFieldValue("name", name);
    insert.AddFieldValue("port", 5566);
    if (!db.InsertRecord(insert)) return 1;
  }

  const SqliteOr isDue(SqliteIsNull("state"), SqliteNotEqual("state", "online"));
  const SqliteAnd wanted(SqliteNotIn("name", {SqliteValue("nas2"), SqliteValue("nas9")}), isDue);
  std::cout << wanted.GetText() << '\n';

  SelectCommand select;
  select.SetTable(nodes);
  if (!select.AddField("name") || !select.SetCondition(wanted)) return 1;
  const auto print = [](const SqliteValueList& row) {
    std::cout << row.ToStr() << '\n';
    return true;  // go on
  };
  if (!db.SelectEach(select, print)) return 1;

  DeleteCommand remove;
  remove.SetTable(nodes);
  // A setter that refuses leaves the command without a condition: look at what it answers.
  if (!remove.SetCondition(SqliteIn("name", {SqliteValue("nas1"), SqliteValue("nas3")}))) return 1;
  if (!db.DeleteRecord(remove)) return 1;
  int left = 0;
  if (!db.GetCount(nodes, left)) return 1;
  std::cout << left << " left\n";
}
