#include "output.h"

#include <kelodrcore/json_value.h>

#include <algorithm>
#include <iostream>

namespace drctl {

using KeloDRCore::SqliteValueList;
namespace JsonValue = KeloDRCore::JsonValue;

namespace {

// Control characters in a name must not reach the terminal as such.
std::string Printable(std::string text) {
  std::replace_if(
      text.begin(), text.end(),
      [](char c) { return static_cast<unsigned char>(c) < 0x20 || c == 0x7f; }, '?');
  return text;
}

std::vector<std::string> Cells(const SqliteValueList& row, const std::vector<Column>& columns) {
  const Json::Value json = ToJson(row, columns);
  std::vector<std::string> cells;
  for (const Column& column : columns) cells.push_back(Printable(json[column.name].asString()));
  return cells;
}

void PrintTable(const std::vector<std::vector<std::string>>& lines,
                const std::vector<Column>& columns) {
  std::vector<size_t> widths(columns.size());
  for (const auto& line : lines) {
    for (size_t i = 0; i < widths.size(); ++i) widths[i] = std::max(widths[i], line[i].size());
  }
  for (const auto& line : lines) {
    std::string text;
    for (size_t i = 0; i < widths.size(); ++i) {
      const std::string padding(widths[i] - line[i].size(), ' ');
      if (i > 0) text += "  ";
      text += columns[i].isNumber ? padding + line[i] : line[i] + padding;
    }
    text.erase(text.find_last_not_of(' ') + 1);
    std::cout << text << '\n';
  }
}

}  // namespace

void Print(const Rows& rows, const std::vector<Column>& columns, bool asJson) {
  if (asJson) return PrintJson(ToJson(rows, columns));
  std::vector<std::vector<std::string>> lines(1);
  for (const Column& column : columns) lines.front().push_back(column.name);
  for (const SqliteValueList& row : rows) lines.push_back(Cells(row, columns));
  PrintTable(lines, columns);
}

void PrintJson(const Json::Value& value) { std::cout << JsonValue::toString(value) << '\n'; }

int Complain(const std::string& what, const Json::Value& err) {
  std::cerr << "drctl: " << what << ": " << JsonValue::toString(err) << '\n';
  return 1;
}

}  // namespace drctl
