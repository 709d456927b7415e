// The registry: the replication nodes and this machine's volumes, in one SQLite file.

#ifndef DRCTL_REGISTRY_H_
#define DRCTL_REGISTRY_H_

#include <kelodrcore/sqlite_command.h>
#include <kelodrcore/sqlite_db.h>

#include <functional>
#include <string>
#include <vector>

#include "rows.h"

namespace drctl {

// What a list shows: rows that meet every filter, sorted, a part of them.
struct Query {
  std::vector<std::string> filters;  // FIELD=VALUE or FIELD!=VALUE
  std::vector<std::string> order;
  bool ascending = true;
  int offset = 0;
  int limit = 0;  // 0: all
};

// Takes one row; false to be given no more.
using Take = std::function<bool(const KeloDRCore::SqliteValueList& row)>;

// Every operation answers false on failure and leaves the reason in GetErr(), with the code's name.
class Registry : public KeloDRCore::SqliteDB {
 public:
  explicit Registry(const std::string& db);

  Json::Value GetErr() const override;
  std::string GetErrCodeStr(int code) const override;

  // Fails when there is no file: a user who lists a missing registry may have named a wrong file.
  bool CheckThere();

  // `node` holds name, address, port and state. Fails for a bad field or a name that is taken.
  bool AddNode(const KeloDRCore::SqliteValueList& node);

  // Changes the given fields of a node that exists.
  bool SetNode(const std::string& name, const KeloDRCore::SqliteValueList& changes);

  bool RemoveNode(const std::string& name);
  bool GetNode(const std::string& name, KeloDRCore::SqliteValueList& node);
  bool CountNodes(int& count);

  // Hand the rows over one by one, or collect them in an array. A missing file has none.
  bool EachNode(const Query& query, const Take& take);
  bool EachVolume(const Query& query, const Take& take);
  bool ReadNodes(const Query& query, Json::Value& nodes);
  bool ReadVolumes(const Query& query, Json::Value& volumes);

  // Stores one row a mount point, and forgets the mount points that are not among them.
  bool ReplaceVolumes(const Rows& volumes);

  // Replaces nodes and volumes at once, or changes nothing. `tell` is told how many rows are in.
  bool ReplaceAll(const Rows& nodes, const Rows& volumes,
                  const std::function<void(size_t done)>& tell);

  // Records a failure of the program's own; false.
  bool Fail(int code, const std::string& message);

 private:
  bool InTransaction(const std::function<bool()>& steps);
  bool ChangeNode(const std::string& name, const std::function<bool()>& change);
  bool Replace(const KeloDRCore::SqliteTableHandler& table, const Rows& rows,
               const std::function<void(size_t done)>& tell);
  bool Each(const KeloDRCore::SqliteTableHandler& table, const std::vector<Column>& columns,
            const Query& query, const Take& take);
  bool SetFilters(KeloDRCore::SelectCommand& command, const std::vector<Column>& columns,
                  const std::vector<std::string>& filters);
  bool SetOrder(KeloDRCore::SelectCommand& command, const std::vector<Column>& columns,
                const std::vector<std::string>& order);

  std::string path;
};

}  // namespace drctl

#endif  // DRCTL_REGISTRY_H_
