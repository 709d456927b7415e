// The baseline's side of the SQL work: what a programmer writes by hand on SQLite's own interface.

#ifndef KELODRCORE_BENCH_RAW_CALLS_H_
#define KELODRCORE_BENCH_RAW_CALLS_H_

#include <json/json.h>
#include <sqlite3.h>

#include <string>
#include <vector>

#include "nodes.h"

namespace bench {

// Appends a text as a literal: in quotes, the quotes in it doubled.
void AppendLiteral(std::string& text, const char* begin, const char* end);

// Appends a number that the caller has made room for.
void AppendNumber(std::string& text, long long number);

// Appends a stored text or number. In the header, so that the compiler sees through it where it is
// measured.
inline void AppendValue(std::string& text, const Json::Value& value) {
  const char* begin = nullptr;
  const char* end = nullptr;
  if (value.getString(&begin, &end)) {
    AppendLiteral(text, begin, end);
  } else {
    AppendNumber(text, value.asInt64());
  }
}

// The INSERT statement of a node.
void RenderInsert(const Node& node, std::string& text);

// What inserting one rendered statement needs: two log lines, the look for the table, the
// statement.
void InsertRaw(sqlite3* db, const std::string& sql);

// The row of the statement.
Record ReadRaw(sqlite3_stmt* statement);

// Every row of the statement into a map of its own.
void SelectRaw(sqlite3* db, const char* sql, std::vector<Record>& records);

}  // namespace bench

#endif  // KELODRCORE_BENCH_RAW_CALLS_H_
