#include "soci_peer.h"

#include <soci/soci.h>
#include <soci/sqlite3/soci-sqlite3.h>

namespace bench {
namespace {

constexpr char kInsert[] =
    "INSERT INTO nodes (address,id,name,online,port) VALUES (:address,:id,:name,:online,:port)";

}  // namespace

void InsertWithSoci(const std::string& path, const std::vector<Node>& nodes) {
  soci::session session(soci::sqlite3, path);
  soci::transaction transaction(session);
  std::string address;
  std::string name;
  int id = 0;
  int online = 0;
  int port = 0;
  soci::statement statement =
      (session.prepare << kInsert, soci::use(address, "address"), soci::use(id, "id"),
       soci::use(name, "name"), soci::use(online, "online"), soci::use(port, "port"));
  for (const Node& node : nodes) {
    address = node.address;
    id = node.id;
    name = node.name;
    online = node.online ? 1 : 0;
    port = static_cast<int>(node.port);
    statement.execute(true);
  }
  transaction.commit();
}

struct SociSession::Session {
  soci::session db;
};

SociSession::SociSession(const std::string& path)
    : session(new Session{soci::session(soci::sqlite3, path)}) {}

SociSession::~SociSession() = default;

void SociSession::Select(const std::string& sql, std::vector<Record>& records) {
  const soci::rowset<soci::row> rows = (session->db.prepare << sql);
  for (const soci::row& row : rows) {
    Record record;
    for (size_t i = 0; i < row.size(); ++i) {
      const soci::column_properties& properties = row.get_properties(i);
      if (properties.get_data_type() == soci::dt_integer) {
        record.emplace(properties.get_name(), static_cast<Json::Int64>(row.get<int>(i)));
      } else {
        record.emplace(properties.get_name(), row.get<std::string>(i));
      }
    }
    records.push_back(std::move(record));
  }
}

}  // namespace bench
