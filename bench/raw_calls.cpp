#include "raw_calls.h"

#include <syslog.h>
#include <unistd.h>

#include <charconv>
#include <cstring>

#include "support.h"

namespace bench {
namespace {

bool IsTableThere(sqlite3* db) {
  sqlite3_stmt* statement = nullptr;
  sqlite3_prepare_v2(db, "SELECT 1 FROM sqlite_master WHERE type='table' AND name='nodes';", -1,
                     &statement, nullptr);
  bool found = false;
  while (sqlite3_step(statement) == SQLITE_ROW) found = sqlite3_column_int64(statement, 0) == 1;
  sqlite3_finalize(statement);
  return found;
}

const char* TextOf(sqlite3_stmt* statement, int column) {
  return reinterpret_cast<const char*>(sqlite3_column_text(statement, column));
}

}  // namespace

void AppendLiteral(std::string& text, const char* begin, const char* end) {
  text += '\'';
  while (const void* found = memchr(begin, '\'', static_cast<size_t>(end - begin))) {
    const char* const next = static_cast<const char*>(found) + 1;
    text.append(begin, next);
    text += '\'';
    begin = next;
  }
  text.append(begin, end);
  text += '\'';
}

void AppendNumber(std::string& text, long long number) {
  char digits[24];
  text.append(digits, std::to_chars(digits, digits + sizeof(digits), number).ptr);
}

void RenderInsert(const Node& node, std::string& text) {
  text = "INSERT INTO nodes (address,id,name,online,port) VALUES (";
  AppendLiteral(text, node.address.data(), node.address.data() + node.address.size());
  text += ',';
  AppendNumber(text, node.id);
  text += ',';
  AppendLiteral(text, node.name.data(), node.name.data() + node.name.size());
  text += node.online ? ",1," : ",0,";
  AppendNumber(text, node.port);
  text += ");";
}

void InsertRaw(sqlite3* db, const std::string& sql) {
  syslog(LOG_INFO, "%s:%d(%s)[%s][%d]: %s Exec cmd: %s", "raw_calls.cpp", __LINE__, "Exec", "INFO",
         static_cast<int>(getpid()), "bench", sql.c_str());
  Require(IsTableThere(db), "the table is gone");
  ExecRaw(db, sql.c_str());
  syslog(LOG_INFO, "%s:%d(%s)[%s][%d]: %s Exec cmd success", "raw_calls.cpp", __LINE__, "Exec",
         "INFO", static_cast<int>(getpid()), "bench");
}

Record ReadRaw(sqlite3_stmt* statement) {
  Record record;
  const int columns = sqlite3_column_count(statement);
  for (int i = 0; i < columns; ++i) {
    const char* const name = sqlite3_column_name(statement, i);
    if (sqlite3_column_type(statement, i) == SQLITE_INTEGER) {
      record.emplace(name, static_cast<Json::Int64>(sqlite3_column_int64(statement, i)));
    } else {
      record.emplace(name, TextOf(statement, i));
    }
  }
  return record;
}

void SelectRaw(sqlite3* db, const char* sql, std::vector<Record>& records) {
  sqlite3_stmt* statement = nullptr;
  Require(sqlite3_prepare_v2(db, sql, -1, &statement, nullptr) == SQLITE_OK, sqlite3_errmsg(db));
  while (sqlite3_step(statement) == SQLITE_ROW) records.push_back(ReadRaw(statement));
  sqlite3_finalize(statement);
}

}  // namespace bench
