#include <kelodrcore/err.h>
#include <kelodrcore/json_value.h>
#include <kelodrcore/request.h>
#include <kelodrcore/sqlite_db.h>

#include <iostream>

#include "common/reply.h"

using namespace KeloDRCore;

const SqliteTableHandler kNodes("node", "name TEXT PRIMARY KEY");

Json::Value CreateNode(SqliteDB& db, const Json::Value& params) {
  const Json::Value& name = params["name"];
  if (!name.isString()) return reply::Failure(ERR::BAD_PARAMETER, "name is missing");
  InsertCommand insert;
  insert.SetTable(kNodes);
  insert.AddFieldValue("name", name.asString());
  if (!db.InsertRecord(insert)) return reply::Failure(ERR::ERR_NODE_CREATE, db.GetErr());
  return reply::Success(params);
}

Json::Value CountNodes(SqliteDB& db) {
  Json::Value data;
  int count = 0;
  if (!db.CreateTable(kNodes) || !db.GetCount(kNodes, count)) {
    return reply::Failure(ERR::ERR_NODE_LIST, db.GetErr());
  }
  data["count"] = count;
  return reply::Success(data);
}

Json::Value Answer(SqliteDB& db, const std::string& text) {
  Json::Value call;
  if (!JsonValue::fromString(call, text))
    return reply::Failure(ERR::BAD_PARAMETER, "not a JSON document");
  const Request request(call);
  if (!request.isValid())
    return reply::Failure(ERR::BAD_PARAMETER, "api, method and version are needed");
  if (request.toStr() == "Node/create/1") return CreateNode(db, request.getParams());
  if (request.toStr() == "Node/count/1") return CountNodes(db);
  return reply::Failure(ERR::ERR_NO_SUCH_API, request.toStr());
}

// Answers one call a line.
int main() {
  SqliteDB db("nodes.db", 3, "cookbook");
  for (std::string line; std::getline(std::cin, line);) {
    std::cout << JsonValue::toString(Answer(db, line)) << '\n';
  }
}
