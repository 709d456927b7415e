#include "registry.h"

#include <kelodrcore/err.h>
#include <kelodrcore/sqlite_condition.h>

#include <algorithm>
#include <charconv>

namespace drctl {

using namespace KeloDRCore;

namespace {

constexpr unsigned int kRetries = 10;
constexpr int kSqliteConstraint = 19;

const SqliteTableHandler kNodes("node",
                                "name TEXT PRIMARY KEY NOT NULL, address TEXT NOT NULL, "
                                "port INTEGER NOT NULL, state TEXT NOT NULL");

// Sizes are kept in MiB: a literal holds at most 32 bits.
const SqliteTableHandler kVolumes("volume",
                                  "mount_point TEXT PRIMARY KEY NOT NULL, device TEXT NOT NULL, "
                                  "fs_type TEXT NOT NULL, size_mib INTEGER NOT NULL, "
                                  "free_mib INTEGER NOT NULL, scanned_at INTEGER NOT NULL");

// The value of a filter in the type of its column; invalid when it does not fit.
SqliteValue FilterValue(const Column& column, const std::string& text) {
  if (!column.isNumber) return text;
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

Registry::Registry(const std::string& path) : SqliteDB(path, kRetries, "[drctl]") {}

std::string Registry::GetErrCodeStr(int code) const { return code != 0 ? ERR::ToString(code) : ""; }

bool Registry::Fail(int code, const std::string& message) {
  errCode = code;
  errMsg = message;
  return false;
}

// BEGIN IMMEDIATE takes the write lock at once, so that what the steps read stays true. Closing
// rolls back and keeps the error of the step that failed; the next statement opens the file again.
bool Registry::InTransaction(const std::function<bool()>& steps) {
  if (Exec("BEGIN IMMEDIATE") && steps() && Exec("COMMIT")) return true;
  Close();
  return false;
}

bool Registry::AddNode(const SqliteValueList& node) {
  const std::string complaint = CheckNode(node, true);
  if (!complaint.empty()) return Fail(ERR::BAD_PARAMETER, complaint);
  InsertCommand command;
  command.SetTable(kNodes);
  command.SetFieldValues(node);
  if (InsertRecord(command)) return true;
  // The primary key decides, so that two processes cannot add the same name.
  if (GetErr()["err_msg"].get("sqlite_errcode", 0) == kSqliteConstraint) {
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
  command.SetCondition(SqliteEqual("name", name));
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
  command.SetCondition(SqliteEqual("name", name));
  Rows rows;
  if (IsExisted() && !SelectRecords(command, rows)) return false;
  if (rows.empty()) return Fail(ERR::ERR_NODE_NOT_EXIST, "there is no node of that name");
  node = std::move(rows.front());
  return true;
}

bool Registry::ListNodes(const Query& query, Rows& rows) {
  return List(kNodes, NodeColumns(), query, rows);
}

bool Registry::CountNodes(int& count) {
  count = 0;
  return !IsExisted() || (CreateTable(kNodes) && GetCount(kNodes, count));
}

bool Registry::InsertAll(const SqliteTableHandler& table, const Rows& rows) {
  return std::all_of(rows.begin(), rows.end(), [&](const SqliteValueList& row) {
    InsertCommand command;
    command.SetTable(table);
    command.SetReplacable(true);
    command.SetFieldValues(row);
    return InsertRecord(command);
  });
}

bool Registry::ReplaceVolumes(const Rows& volumes) {
  return InTransaction([&] { return DeleteAllRecords(kVolumes) && InsertAll(kVolumes, volumes); });
}

bool Registry::ListVolumes(const Query& query, Rows& rows) {
  return List(kVolumes, VolumeColumns(), query, rows);
}

bool Registry::ReplaceAll(const Rows& nodes, const Rows& volumes) {
  return InTransaction([&] {
    return DeleteAllRecords(kNodes) && InsertAll(kNodes, nodes) && DeleteAllRecords(kVolumes) &&
           InsertAll(kVolumes, volumes);
  });
}

bool Registry::SetFilters(SelectCommand& command, const std::vector<Column>& columns,
                          const std::vector<std::string>& filters) {
  SqliteCondition all;
  for (const std::string& filter : filters) {
    const SqliteCondition condition = ParseFilter(columns, filter);
    if (!condition.IsValid()) return Fail(ERR::BAD_PARAMETER, "bad filter: " + filter);
    all = all.IsValid() ? SqliteCondition(SqliteAnd(all, condition)) : condition;
  }
  return !all.IsValid() || command.SetCondition(all);
}

bool Registry::SetOrder(SelectCommand& command, const std::vector<Column>& columns,
                        const std::vector<std::string>& order) {
  for (const std::string& field : order) {
    if (FindColumn(columns, field) == nullptr) {
      return Fail(ERR::BAD_PARAMETER, "no such field: " + field);
    }
    command.AddOrderField(field);
  }
  return true;
}

// A missing file is an empty registry.
bool Registry::List(const SqliteTableHandler& table, const std::vector<Column>& columns,
                    const Query& query, Rows& rows) {
  SelectCommand command;
  command.SetTable(table);
  command.SelectAll();
  if (query.ascending) command.SetOrderByASC();
  if (!SetFilters(command, columns, query.filters)) return false;
  if (!SetOrder(command, columns, query.order)) return false;
  // A count of rows that no table reaches stands for all of them.
  command.SetLimit(query.offset, query.limit > 0 ? query.limit : INT32_MAX);
  return !IsExisted() || SelectRecords(command, rows);
}

}  // namespace drctl
