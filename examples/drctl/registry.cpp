#include "registry.h"

#include <kelodrcore/err.h>
#include <kelodrcore/sqlite_condition.h>
#include <kelodrcore/sqlite_transaction.h>

#include <algorithm>
#include <charconv>
#include <cstddef>

#include "paths.h"

namespace drctl {

using namespace KeloDRCore;

namespace {

constexpr unsigned int kRetries = 10;
constexpr int kSqliteConstraint = 19;
// The rows that are inserted between two reports of the progress.
constexpr std::ptrdiff_t kPortion = 1000;
constexpr char kBadName[] = "the name cannot be looked for";

const SqliteTableHandler kNodes("node",
                                "name TEXT PRIMARY KEY NOT NULL, address TEXT NOT NULL, "
                                "port INTEGER NOT NULL, state TEXT NOT NULL");

// Sizes are kept in MiB: a literal holds at most 32 bits.
const SqliteTableHandler kVolumes("volume",
                                  "mount_point TEXT PRIMARY KEY NOT NULL, device TEXT NOT NULL, "
                                  "fs_type TEXT NOT NULL, size_mib INTEGER NOT NULL, "
                                  "free_mib INTEGER NOT NULL, scanned_at INTEGER NOT NULL");

// The value of a filter in the type of its column; invalid when it does not fit. SQL cannot hold a
// NUL byte.
SqliteValue FilterValue(const Column& column, const std::string& text) {
  if (text.find('\0') != std::string::npos) return {};
  if (!column.IsNumber()) return text;
  unsigned int number = 0;
  const char* const end = text.data() + text.size();
  const auto result = std::from_chars(text.data(), end, number);
  if (result.ec != std::errc() || result.ptr != end) return {};
  return number;
}

// One filter as a condition; empty when it is malformed.
SqliteCondition ParseFilter(const std::vector<Column>& columns, const std::string& filter) {
  const size_t equal = filter.find('=');
  if (equal == std::string::npos || equal == 0) return {};
  const bool isNegated = filter[equal - 1] == '!';
  const Column* const column = FindColumn(columns, filter.substr(0, equal - (isNegated ? 1 : 0)));
  if (column == nullptr) return {};
  const SqliteValue value = FilterValue(*column, filter.substr(equal + 1));
  if (!value.IsValid()) return {};
  if (isNegated) return SqliteNotEqual(column->name, value);
  return SqliteEqual(column->name, value);
}

}  // namespace

Registry::Registry(const std::string& db) : SqliteDB(db, kRetries, "[drctl]"), path(db) {}

// SQLite has no message for a file that it could not open.
Json::Value Registry::GetErr() const {
  Json::Value err = SqliteDB::GetErr();
  if (err["err_code"] == ERR::ERR_DATABASE_OPERATION && !err.isMember("err_msg")) {
    err["err_msg"] = "'" + path + "' cannot be opened";
  }
  return err;
}

std::string Registry::GetErrCodeStr(int code) const { return code != 0 ? ERR::ToString(code) : ""; }

bool Registry::Fail(int code, const std::string& message) {
  errCode = code;
  errMsg = message;
  return false;
}

bool Registry::CheckThere() {
  return IsExisted() || Fail(ERR::ERR_DATABASE_OPERATION, "there is no registry at '" + path + "'");
}

// The write lock is taken at the beginning, so that what the steps read stays true.
bool Registry::InTransaction(const std::function<bool()>& steps) {
  SqliteTransaction transaction(*this);
  return transaction.IsOpen() && steps() && transaction.Commit();
}

bool Registry::AddNode(const SqliteValueList& node) {
  const std::string complaint = CheckNode(node, true);
  if (!complaint.empty()) return Fail(ERR::BAD_PARAMETER, complaint);
  MakeDefaultDir(path);
  InsertCommand command;
  command.SetTable(kNodes);
  command.SetFieldValues(node);
  if (InsertRecord(command)) return true;
  // The primary key decides, so that two processes cannot add the same name.
  if (errMsg.isObject() && errMsg["sqlite_errcode"] == kSqliteConstraint) {
    return Fail(ERR::ERR_NODE_EXIST, "there is a node of that name");
  }
  return false;
}

// A missing file has no nodes, and stays missing.
bool Registry::ChangeNode(const std::string& name, const std::function<bool()>& change) {
  SqliteValueList node;
  if (!IsExisted()) return GetNode(name, node);
  return InTransaction([&] { return GetNode(name, node) && change(); });
}

bool Registry::SetNode(const std::string& name, const SqliteValueList& changes) {
  const std::string complaint = CheckNode(changes, false);
  if (!complaint.empty()) return Fail(ERR::BAD_PARAMETER, complaint);
  UpdateCommand command;
  command.SetTable(kNodes);
  command.SetFieldValues(changes);
  // Without a condition every node would be changed.
  if (!command.SetCondition(SqliteEqual("name", name))) return Fail(ERR::BAD_PARAMETER, kBadName);
  return ChangeNode(name, [&] { return UpdateRecord(command); });
}

bool Registry::RemoveNode(const std::string& name) {
  return ChangeNode(name,
                    [&] { return DeleteRecord(SqliteEqual("name", name).GetText(), kNodes); });
}

bool Registry::GetNode(const std::string& name, SqliteValueList& node) {
  SelectCommand command;
  command.SetTable(kNodes);
  command.SelectAll();
  if (!command.SetCondition(SqliteEqual("name", name))) return Fail(ERR::BAD_PARAMETER, kBadName);
  Rows rows;
  if (IsExisted() && !SelectRecords(command, rows)) return false;
  if (rows.empty()) return Fail(ERR::ERR_NODE_NOT_EXIST, "there is no node of that name");
  node = std::move(rows.front());
  return true;
}

bool Registry::CountNodes(int& count) {
  count = 0;
  return CreateTable(kNodes) && GetCount(kNodes, count);
}

bool Registry::EachNode(const Query& query, const Take& take) {
  return Each(kNodes, NodeColumns(), query, take);
}

bool Registry::EachVolume(const Query& query, const Take& take) {
  return Each(kVolumes, VolumeColumns(), query, take);
}

bool Registry::ReadNodes(const Query& query, Json::Value& nodes) {
  nodes = Json::arrayValue;
  return EachNode(query, [&](const SqliteValueList& row) {
    nodes.append(ToJson(row, NodeColumns()));
    return true;
  });
}

bool Registry::ReadVolumes(const Query& query, Json::Value& volumes) {
  volumes = Json::arrayValue;
  return EachVolume(query, [&](const SqliteValueList& row) {
    volumes.append(ToJson(row, VolumeColumns()));
    return true;
  });
}

bool Registry::Replace(const SqliteTableHandler& table, const Rows& rows,
                       const std::function<void(size_t done)>& tell) {
  if (!DeleteAllRecords(table)) return false;
  auto first = rows.begin();
  while (first != rows.end()) {
    const auto last = first + std::min(kPortion, rows.end() - first);
    if (!InsertRecords(table, Rows(first, last))) return false;
    tell(static_cast<size_t>(last - first));
    first = last;
  }
  return true;
}

bool Registry::ReplaceVolumes(const Rows& volumes) {
  MakeDefaultDir(path);
  return InTransaction([&] { return Replace(kVolumes, volumes, [](size_t) {}); });
}

bool Registry::ReplaceAll(const Rows& nodes, const Rows& volumes,
                          const std::function<void(size_t done)>& tell) {
  MakeDefaultDir(path);
  return InTransaction(
      [&] { return Replace(kNodes, nodes, tell) && Replace(kVolumes, volumes, tell); });
}

bool Registry::SetFilters(SelectCommand& command, const std::vector<Column>& columns,
                          const std::vector<std::string>& filters) {
  SqliteCondition all;
  for (const std::string& filter : filters) {
    const SqliteCondition condition = ParseFilter(columns, filter);
    if (!condition.IsValid()) {
      return Fail(ERR::BAD_PARAMETER, "the filter '" + filter +
                                          "' is not FIELD=VALUE or FIELD!=VALUE with a FIELD of " +
                                          Names(columns) + " (numbers in digits)");
    }
    all = all.IsValid() ? SqliteCondition(SqliteAnd(all, condition)) : condition;
  }
  return !all.IsValid() || command.SetCondition(all);
}

bool Registry::SetOrder(SelectCommand& command, const std::vector<Column>& columns,
                        const std::vector<std::string>& order) {
  for (const std::string& field : order) {
    if (FindColumn(columns, field) == nullptr) {
      return Fail(ERR::BAD_PARAMETER,
                  "there is no field '" + field + "' to sort by, only " + Names(columns));
    }
    command.AddOrderField(field);
  }
  return true;
}

bool Registry::Each(const SqliteTableHandler& table, const std::vector<Column>& columns,
                    const Query& query, const Take& take) {
  SelectCommand command;
  command.SetTable(table);
  command.SelectAll();
  if (query.ascending) command.SetOrderByASC();
  if (!SetFilters(command, columns, query.filters)) return false;
  if (!SetOrder(command, columns, query.order)) return false;
  // A count of rows that no table reaches stands for all of them.
  command.SetLimit(query.offset, query.limit > 0 ? query.limit : INT32_MAX);
  return !IsExisted() || SelectEach(command, take);
}

}  // namespace drctl
