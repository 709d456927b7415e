// The limit's side of the SQL work: what a programmer writes by hand on SQLite's own interface.

#ifndef KELODRCORE_BENCH_RAW_CALLS_H_
#define KELODRCORE_BENCH_RAW_CALLS_H_

#include <sqlite3.h>

#include <string>
#include <vector>

#include "nodes.h"

namespace bench {

// Appends a text as a literal: in quotes, the quotes in it doubled.
void AppendLiteral(std::string& text, const char* begin, const char* end);

// Appends a number that the caller has made room for.
void AppendNumber(std::string& text, long long number);

// The INSERT statement of a node.
void RenderInsert(const Node& node, std::string& text);

// What inserting one rendered statement needs: two log lines, the look for the table, the
// statement.
void InsertRaw(sqlite3* db, const std::string& sql);

// Every row of the statement into a map of its own.
void SelectRaw(sqlite3* db, const char* sql, std::vector<Record>& records);

}  // namespace bench

#endif  // KELODRCORE_BENCH_RAW_CALLS_H_
