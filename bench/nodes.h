// The rows that the SQL benchmarks insert and select, and the table they lie in.

#ifndef KELODRCORE_BENCH_NODES_H_
#define KELODRCORE_BENCH_NODES_H_

#include <json/json.h>

#include <map>
#include <string>
#include <vector>

#include "kelodrcore/sqlite_command.h"
#include "kelodrcore/sqlite_value.h"

struct sqlite3;

namespace bench {

inline constexpr int kRows = 20000;

struct Node {
  std::string address;
  int id;
  std::string name;
  bool online;
  unsigned int port;
};

using Record = std::map<std::string, Json::Value>;

// Every eighth name has a quote in it.
std::vector<Node> MakeNodes(int count);

KeloDRCore::SqliteTableHandler NodeTable();

// An empty database file with an empty node table.
void MakeDatabase(const std::string& path);

// The same with `count` nodes in it; made once for each count.
std::string DatabaseOf(int count);

sqlite3* OpenRaw(const std::string& path);
void ExecRaw(sqlite3* db, const char* sql);

// Insert the nodes into the empty table inside one transaction: with the library, a command for
// each row or one for all of them, and by hand.
void InsertWithLibrary(const std::string& path, const std::vector<Node>& nodes);
void InsertWithOneCommand(const std::string& path, const std::vector<Node>& nodes);
void InsertByHand(const std::string& path, const std::vector<Node>& nodes);

// The nodes as records; all of them at once, and by hand with one prepared statement.
std::vector<KeloDRCore::SqliteValueList> RecordsOf(const std::vector<Node>& nodes);
void InsertAllWithLibrary(const std::string& path,
                          const std::vector<KeloDRCore::SqliteValueList>& records);
void InsertPrepared(const std::string& path, const std::vector<Node>& nodes);

// All rows of the table as one text, to hold databases against each other.
std::string Contents(const std::string& path);

}  // namespace bench

#endif  // KELODRCORE_BENCH_NODES_H_
