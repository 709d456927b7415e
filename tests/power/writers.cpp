#include "power/writers.h"

#include <sqlite3.h>
#include <unistd.h>

#include <memory>
#include <string>

#include "kelodrcore/json_value.h"
#include "kelodrcore/sqlite_db.h"
#include "power/disk.h"

using KeloDRCore::SqliteDB;
namespace JsonValue = KeloDRCore::JsonValue;

namespace {

std::string Path(const char* name) { return std::string(kDiskDir) + "/" + name; }

Json::Value Document(int number, size_t size) {
  Json::Value document;
  document["first"] = number;
  document["filler"] = std::string(size, static_cast<char>('a' + number % 26));
  document["last"] = number;
  return document;
}

size_t SmallSize(int number) { return static_cast<size_t>(number % 97) * 41; }
size_t LargeSize(int number) { return static_cast<size_t>(2 + number % 4) << 20; }

template <size_t Size(int number)>
Step ReplaceDocument(const std::string& path) {
  return [path](int number) { return JsonValue::toFile(Document(number, Size(number)), path); };
}

template <size_t Size(int number)>
int FindDocument(const std::string& path) {
  if (access(path.c_str(), F_OK) != 0) return 0;
  Json::Value document;
  if (!JsonValue::fromFile(document, path) || !document["first"].isInt()) return -1;
  const int number = document["first"].asInt();
  return document == Document(number, Size(number)) ? number : -1;
}

Step InsertRows(const std::string& path, const std::string& setting) {
  const auto db = std::make_shared<SqliteDB>(path, 0, "power");
  const bool isReady =
      db->Open() && db->Exec(setting) && db->Exec("CREATE TABLE IF NOT EXISTS t (n INTEGER)");
  return [db, isReady](int number) {
    return isReady && db->Exec("INSERT INTO t VALUES (" + std::to_string(number) + ")");
  };
}

// The text of the only value; empty when the query fails.
std::string Ask(sqlite3* db, const char* query) {
  sqlite3_stmt* statement = nullptr;
  std::string answer;
  if (sqlite3_prepare_v2(db, query, -1, &statement, nullptr) == SQLITE_OK &&
      sqlite3_step(statement) == SQLITE_ROW) {
    answer = reinterpret_cast<const char*>(sqlite3_column_text(statement, 0));
  }
  sqlite3_finalize(statement);
  return answer;
}

// The rows are 1, 2, 3 and so on: as many as the last one says.
int FindRows(const std::string& path) {
  sqlite3* db = nullptr;
  sqlite3_open(path.c_str(), &db);
  const bool isSound = Ask(db, "PRAGMA integrity_check") == "ok";
  const bool hasTable = Ask(db, "SELECT count(*) FROM sqlite_master") == "1";
  const std::string count = hasTable ? Ask(db, "SELECT count(*) FROM t") : "0";
  const std::string last = hasTable ? Ask(db, "SELECT ifnull(max(n), 0) FROM t") : "0";
  sqlite3_close(db);
  return isSound && !count.empty() && count == last ? std::stoi(count) : -1;
}

}  // namespace

const Writer kWriters[kWriterCount] = {
    {"small documents", 40, 0, [] { return ReplaceDocument<SmallSize>(Path("small")); },
     [] { return FindDocument<SmallSize>(Path("small")); }},
    {"large documents", 5, 0, [] { return ReplaceDocument<LargeSize>(Path("large")); },
     [] { return FindDocument<LargeSize>(Path("large")); }},
    {"rows", 40, 1, [] { return InsertRows(Path("default.db"), "PRAGMA synchronous"); },
     [] { return FindRows(Path("default.db")); }},
    {"rows by synchronous=EXTRA", 40, 0,
     [] { return InsertRows(Path("extra.db"), "PRAGMA synchronous=EXTRA"); },
     [] { return FindRows(Path("extra.db")); }},
};
