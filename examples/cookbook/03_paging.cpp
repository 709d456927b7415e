#include <kelodrcore/sqlite_db.h>

#include <iostream>

using namespace KeloDRCore;

const SqliteTableHandler kNodes("node", "name TEXT PRIMARY KEY");
constexpr int kPageSize = 3;

bool AddNodes(SqliteDB& db) {
  for (int i = 1; i <= 7; ++i) {
    InsertCommand insert;
    insert.SetTable(kNodes);
    insert.AddFieldValue("name", "nas" + std::to_string(i));
    if (!db.InsertRecord(insert)) return false;
  }
  return true;
}

// The order has to be one of all rows, or a row could stand on two pages or on none.
bool ReadPage(SqliteDB& db, int page, std::vector<SqliteValueList>& rows) {
  SelectCommand select;
  select.SetTable(kNodes);
  select.AddField("name");
  select.AddOrderField("name");
  select.SetOrderByASC();
  select.SetLimit(page * kPageSize, kPageSize);
  rows.clear();  // rows are appended
  return db.SelectRecords(select, rows);
}

int main() {
  SqliteDB db("nodes.db", 3, "cookbook");
  int count = 0;
  if (!AddNodes(db) || !db.GetCount(kNodes, count)) return 1;

  const int pages = (count + kPageSize - 1) / kPageSize;
  for (int page = 0; page < pages; ++page) {
    std::vector<SqliteValueList> rows;
    if (!ReadPage(db, page, rows)) return 1;
    std::cout << "page " << page + 1 << " of " << pages << ':';
    for (const SqliteValueList& row : rows) {
      std::string name;
      if (row.GetValue("name", name)) std::cout << ' ' << name;
    }
    std::cout << '\n';
  }
}
