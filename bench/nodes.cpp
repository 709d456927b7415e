#include "nodes.h"

#include <sqlite3.h>
#include <unistd.h>

#include "kelodrcore/sqlite_db.h"
#include "raw_calls.h"
#include "support.h"

namespace bench {
namespace {

constexpr char kColumns[] =
    "address TEXT, id INTEGER PRIMARY KEY, name TEXT, online INTEGER, port INTEGER";

int AppendRow(void* contents, int columns, char** values, char** /*names*/) {
  for (int i = 0; i < columns; ++i) static_cast<std::string*>(contents)->append(values[i]) += '\n';
  return 0;
}

void SetFields(KeloDRCore::InsertCommand& command, const Node& node) {
  command.AddFieldValue("address", node.address);
  command.AddFieldValue("id", node.id);
  command.AddFieldValue("name", node.name);
  command.AddFieldValue("online", node.online);
  command.AddFieldValue("port", node.port);
}

KeloDRCore::InsertCommand InsertOf(const KeloDRCore::SqliteTableHandler& table, const Node& node) {
  KeloDRCore::InsertCommand command;
  command.SetTable(table);
  SetFields(command, node);
  return command;
}

}  // namespace

std::vector<Node> MakeNodes(int count) {
  std::vector<Node> nodes;
  nodes.reserve(static_cast<size_t>(count));
  for (int i = 0; i < count; ++i) {
    const std::string number = std::to_string(i);
    nodes.push_back({"192.168." + std::to_string(i / 250 % 250) + "." + std::to_string(i % 250), i,
                     i % 8 == 0 ? "node " + number + " of O'Brien" : "node " + number + " of site",
                     i % 3 != 0, static_cast<unsigned int>(5566 + i % 10)});
  }
  return nodes;
}

KeloDRCore::SqliteTableHandler NodeTable() { return {"nodes", kColumns}; }

sqlite3* OpenRaw(const std::string& path) {
  sqlite3* db = nullptr;
  Require(sqlite3_open(path.c_str(), &db) == SQLITE_OK, "cannot open " + path);
  sqlite3_busy_timeout(db, 1000);
  return db;
}

void ExecRaw(sqlite3* db, const char* sql) {
  Require(sqlite3_exec(db, sql, nullptr, nullptr, nullptr) == SQLITE_OK, sqlite3_errmsg(db));
}

void MakeDatabase(const std::string& path) {
  unlink(path.c_str());
  sqlite3* const db = OpenRaw(path);
  ExecRaw(db, (std::string("CREATE TABLE nodes (") + kColumns + ")").c_str());
  sqlite3_close(db);
}

std::string DatabaseOf(int count) {
  const std::string path = ScratchPath("nodes" + std::to_string(count) + ".db");
  if (access(path.c_str(), F_OK) == 0) return path;
  MakeDatabase(path);
  sqlite3* const db = OpenRaw(path);
  ExecRaw(db, "BEGIN");
  std::string text;
  for (const Node& node : MakeNodes(count)) {
    RenderInsert(node, text);
    ExecRaw(db, text.c_str());
  }
  ExecRaw(db, "COMMIT");
  sqlite3_close(db);
  return path;
}

std::string Contents(const std::string& path) {
  std::string contents;
  sqlite3* const db = OpenRaw(path);
  sqlite3_exec(db, "SELECT * FROM nodes ORDER BY id", AppendRow, &contents, nullptr);
  sqlite3_close(db);
  return contents;
}

void InsertWithLibrary(const std::string& path, const std::vector<Node>& nodes) {
  const KeloDRCore::SqliteTableHandler table = NodeTable();
  KeloDRCore::SqliteDB db(path, 3, "bench");
  Require(db.Exec("BEGIN"), "BEGIN");
  for (const Node& node : nodes) Require(db.InsertRecord(InsertOf(table, node)), "InsertRecord");
  Require(db.Exec("COMMIT"), "COMMIT");
}

void InsertWithOneCommand(const std::string& path, const std::vector<Node>& nodes) {
  KeloDRCore::InsertCommand command;
  command.SetTable(NodeTable());
  KeloDRCore::SqliteDB db(path, 3, "bench");
  Require(db.Exec("BEGIN"), "BEGIN");
  for (const Node& node : nodes) {
    SetFields(command, node);
    Require(db.InsertRecord(command), "InsertRecord");
  }
  Require(db.Exec("COMMIT"), "COMMIT");
}

void InsertByHand(const std::string& path, const std::vector<Node>& nodes) {
  sqlite3* const db = OpenRaw(path);
  ExecRaw(db, "BEGIN");
  std::string sql;
  for (const Node& node : nodes) {
    RenderInsert(node, sql);
    InsertRaw(db, sql);
  }
  ExecRaw(db, "COMMIT");
  sqlite3_close(db);
}

std::vector<KeloDRCore::SqliteValueList> RecordsOf(const std::vector<Node>& nodes) {
  std::vector<KeloDRCore::SqliteValueList> records(nodes.size());
  auto record = records.begin();
  for (const Node& node : nodes) {
    record->AddValue("address", node.address);
    record->AddValue("id", node.id);
    record->AddValue("name", node.name);
    record->AddValue("online", node.online);
    record->AddValue("port", node.port);
    ++record;
  }
  return records;
}

void InsertAllWithLibrary(const std::string& path,
                          const std::vector<KeloDRCore::SqliteValueList>& records) {
  KeloDRCore::SqliteDB db(path, 3, "bench");
  Require(db.InsertRecords(NodeTable(), records), "InsertRecords");
}

void InsertPrepared(const std::string& path, const std::vector<Node>& nodes) {
  sqlite3* const db = OpenRaw(path);
  ExecRaw(db, "BEGIN IMMEDIATE");
  sqlite3_stmt* statement = nullptr;
  sqlite3_prepare_v2(db, "INSERT INTO nodes (address,id,name,online,port) VALUES (?,?,?,?,?);", -1,
                     &statement, nullptr);
  for (const Node& node : nodes) {
    sqlite3_bind_text(statement, 1, node.address.data(), static_cast<int>(node.address.size()),
                      SQLITE_STATIC);
    sqlite3_bind_int(statement, 2, node.id);
    sqlite3_bind_text(statement, 3, node.name.data(), static_cast<int>(node.name.size()),
                      SQLITE_STATIC);
    sqlite3_bind_int(statement, 4, node.online ? 1 : 0);
    sqlite3_bind_int64(statement, 5, node.port);
    Require(sqlite3_step(statement) == SQLITE_DONE, sqlite3_errmsg(db));
    sqlite3_reset(statement);
  }
  sqlite3_finalize(statement);
  ExecRaw(db, "COMMIT");
  sqlite3_close(db);
}

}  // namespace bench
