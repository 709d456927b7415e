#include <kelodrcore/cache.h>
#include <kelodrcore/sqlite_db.h>

#include <filesystem>
#include <iostream>

using namespace KeloDRCore;

const SqliteTableHandler kNodes("node", "name TEXT PRIMARY KEY");

class NodeCount : public Cache {
 public:
  NodeCount(const std::string& dir, const std::string& database)
      : Cache(dir, "nodes", 3600, false, 3), dbPath(database) {}

  Json::Value GetInfo() const override { return "nodes"; }

  // May run in a forked process. A handle that was open before the fork must not be used there, so
  // the fetch opens one of its own and never takes a member or a global one.
  bool GetUpdatedData(Json::Value& out) const override {
    SqliteDB db(dbPath, 3, "cookbook");
    int count = 0;
    if (!db.CreateTable(kNodes) || !db.GetCount(kNodes, count)) return false;
    out["count"] = count;
    return true;
  }

  bool IsValidData(const Json::Value& data) const override {
    return data.isObject() && data["count"].isInt();
  }

 private:
  std::string dbPath;
};

int main() {
  SqliteDB db("nodes.db", 3, "cookbook");  // stays open, for what else the program does
  InsertCommand insert;
  insert.SetTable(kNodes);
  insert.AddFieldValue("name", "nas1");
  if (!db.InsertRecord(insert)) return 1;

  const NodeCount nodes(std::filesystem::absolute("cache").string(),
                        std::filesystem::absolute("nodes.db").string());
  const Json::Value answer = nodes.Read();
  if (!nodes.IsValidData(answer)) return 1;
  std::cout << answer["count"] << " node\n";
}
