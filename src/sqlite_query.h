// One attempt of a query.

#ifndef KELODRCORE_SRC_SQLITE_QUERY_H_
#define KELODRCORE_SRC_SQLITE_QUERY_H_

#include <sqlite3.h>

#include <new>
#include <string>
#include <vector>

namespace KeloDRCore {

// Columns count from 0.
class Query {
 public:
  Query(sqlite3* db, const std::string& sql)
      : code(sqlite3_prepare_v2(db, sql.c_str(), -1, &stmt, nullptr)) {}
  Query(const Query&) = delete;
  Query& operator=(const Query&) = delete;
  ~Query() { sqlite3_finalize(stmt); }

  // True when there is one more row.
  bool Next() {
    if (code == SQLITE_OK || code == SQLITE_ROW) code = sqlite3_step(stmt);
    return code == SQLITE_ROW;
  }

  // SQLite's result code of the last step.
  int Code() const { return code; }

  // The names of the columns of a row. They are asked for once: SQLite locks the connection for
  // each. Before the first row they may still change, because the first step may prepare anew.
  const std::vector<std::string>& Names() {
    if (names.empty()) ReadNames();
    return names;
  }

  int Type(int column) const { return sqlite3_column_type(stmt, column); }
  long long Integer(int column) const { return sqlite3_column_int64(stmt, column); }

  // A null text is an empty one, but for the one that SQLite has no memory for.
  const char* Text(int column) const {
    const auto* const text = reinterpret_cast<const char*>(sqlite3_column_text(stmt, column));
    if (text != nullptr) return text;
    if (sqlite3_errcode(sqlite3_db_handle(stmt)) == SQLITE_NOMEM) throw std::bad_alloc();
    return "";
  }

 private:
  void ReadNames() {
    const int columns = sqlite3_column_count(stmt);
    for (int column = 0; column < columns; ++column) {
      const char* const name = sqlite3_column_name(stmt, column);
      if (name == nullptr) throw std::bad_alloc();  // the only reason that SQLite has for it
      names.emplace_back(name);
    }
  }

  sqlite3_stmt* stmt = nullptr;
  int code;
  std::vector<std::string> names;
};

}  // namespace KeloDRCore

#endif  // KELODRCORE_SRC_SQLITE_QUERY_H_
