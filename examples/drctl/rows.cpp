#include "rows.h"

#include <algorithm>

namespace drctl {

using KeloDRCore::SqliteValue;
using KeloDRCore::SqliteValueList;

namespace {

// The value of a member in the type of its column; invalid when it does not fit.
SqliteValue ToValue(const Column& column, const Json::Value& member) {
  if (column.IsNumber()) return member.isUInt() ? SqliteValue(member.asUInt()) : SqliteValue();
  return member.isString() ? SqliteValue(member.asString()) : SqliteValue();
}

// A statement ends at a NUL byte, so no text may hold one.
std::string CheckText(const SqliteValueList& row, const std::string& field) {
  std::string text;
  if (!row.HasField(field) || !row.GetValue(field, text) || text.empty()) {
    return field + " must be a text";
  }
  return text.find('\0') == std::string::npos ? "" : field + " holds a NUL byte";
}

std::string CheckPort(const SqliteValueList& row) {
  int port = 0;
  const bool isGood =
      row.HasField("port") && row.GetValue("port", port) && port >= 1 && port <= 65535;
  return isGood ? "" : "port must be a number from 1 to 65535";
}

std::string CheckColumn(const SqliteValueList& row, const Column& column) {
  if (column.name == "port") return CheckPort(row);
  if (!column.IsNumber()) return CheckText(row, column.name);
  return row.HasField(column.name) ? "" : column.name + " is missing";
}

std::string CheckRow(const SqliteValueList& row, const std::vector<Column>& columns, bool isWhole) {
  for (const Column& column : columns) {
    if (!isWhole && !row.HasField(column.name)) continue;
    std::string complaint = CheckColumn(row, column);
    if (!complaint.empty()) return complaint;
  }
  return "";
}

}  // namespace

const std::vector<Column>& NodeColumns() {
  static const std::vector<Column> columns = {{"name", Kind::kText, 20},
                                              {"address", Kind::kText, 20},
                                              {"port", Kind::kNumber, 5},
                                              {"state", Kind::kText, 10}};
  return columns;
}

const std::vector<Column>& VolumeColumns() {
  static const std::vector<Column> columns = {
      {"mount_point", Kind::kText, 24}, {"device", Kind::kText, 16},
      {"fs_type", Kind::kText, 8},      {"size_mib", Kind::kNumber, 10},
      {"free_mib", Kind::kNumber, 10},  {"scanned_at", Kind::kTime, 20}};
  return columns;
}

std::string Names(const std::vector<Column>& columns) {
  std::string names;
  for (const Column& column : columns) names += (names.empty() ? "" : ", ") + column.name;
  return names;
}

const Column* FindColumn(const std::vector<Column>& columns, const std::string& name) {
  const auto found = std::find_if(columns.begin(), columns.end(),
                                  [&](const Column& column) { return column.name == name; });
  return found != columns.end() ? &*found : nullptr;
}

Json::Value ToJson(const SqliteValueList& row, const std::vector<Column>& columns) {
  Json::Value object(Json::objectValue);
  for (const Column& column : columns) {
    if (!row.HasField(column.name)) continue;
    unsigned int number = 0;
    std::string text;
    if (column.IsNumber() && row.GetValue(column.name, number)) {
      object[column.name] = number;
    } else if (!column.IsNumber() && row.GetValue(column.name, text)) {
      object[column.name] = text;
    }
  }
  return object;
}

Json::Value ToJson(const Rows& rows, const std::vector<Column>& columns) {
  Json::Value array(Json::arrayValue);
  for (const SqliteValueList& row : rows) array.append(ToJson(row, columns));
  return array;
}

std::string FromJson(const Json::Value& object, const std::vector<Column>& columns,
                     SqliteValueList& row) {
  if (!object.isObject()) return "not an object";
  for (const std::string& member : object.getMemberNames()) {
    const Column* const column = FindColumn(columns, member);
    if (column == nullptr) return "unknown member '" + member + "'";
    const SqliteValue value = ToValue(*column, object[member]);
    if (!value.IsValid()) {
      return member + (column->IsNumber() ? " must be a number" : " must be a text");
    }
    row.AddValue(member, value);
  }
  return "";
}

std::string CheckNode(const SqliteValueList& node, bool isWhole) {
  return CheckRow(node, NodeColumns(), isWhole);
}

std::string CheckVolume(const SqliteValueList& volume) {
  return CheckRow(volume, VolumeColumns(), true);
}

}  // namespace drctl
