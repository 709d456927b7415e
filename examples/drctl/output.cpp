#include "output.h"

#include <kelodrcore/err.h>
#include <kelodrcore/json_value.h>

#include <algorithm>
#include <array>
#include <ctime>
#include <iostream>

namespace drctl {

using namespace KeloDRCore;

namespace {

// ISO 8601 in UTC.
std::string TimeText(unsigned int seconds) {
  const std::time_t time = seconds;
  std::tm parts = {};
  std::array<char, 32> text{};
  gmtime_r(&time, &parts);
  return {text.data(), std::strftime(text.data(), text.size(), "%Y-%m-%dT%H:%M:%SZ", &parts)};
}

std::string Cell(const Json::Value& value, const Column& column) {
  if (column.kind == Kind::kTime && value.isUInt()) return TimeText(value.asUInt());
  return Printable(value.asString());
}

// The characters of a text in UTF-8: every byte but those that continue one.
size_t Length(const std::string& text) {
  return static_cast<size_t>(
      std::count_if(text.begin(), text.end(), [](char c) { return (c & 0xc0) != 0x80; }));
}

void PrintLine(const std::vector<std::string>& cells, const std::vector<Column>& columns) {
  std::string line;
  for (size_t i = 0; i < cells.size(); ++i) {
    const size_t length = Length(cells[i]);
    const std::string padding(columns[i].width - std::min(columns[i].width, length), ' ');
    if (i > 0) line += "  ";
    line += columns[i].IsNumber() ? padding + cells[i] : cells[i] + padding;
  }
  line.erase(line.find_last_not_of(' ') + 1);
  std::cout << line << '\n';
}

// The reason as a sentence: the program's own, or SQLite's.
std::string Reason(const Json::Value& message) {
  return message.isObject() ? message["sqlite_errmsg"].asString() : message.asString();
}

}  // namespace

std::string Printable(std::string text) {
  for (size_t i = 0; i < text.size(); ++i) {
    const auto byte = static_cast<unsigned char>(text[i]);
    const auto next = static_cast<unsigned char>(i + 1 < text.size() ? text[i + 1] : 0);
    // U+0080 to U+009F are control characters too.
    const bool isTwoBytes = byte == 0xc2 && next >= 0x80 && next <= 0x9f;
    if (byte >= 0x20 && byte != 0x7f && !isTwoBytes) continue;
    text.replace(i, isTwoBytes ? 2 : 1, "?");
  }
  return text;
}

void RowPrinter::Begin() {
  if (isBegun) return;
  isBegun = true;
  if (asJson) {
    std::cout << '[';
    return;
  }
  std::vector<std::string> headings;
  for (const Column& column : columns) headings.push_back(column.name);
  PrintLine(headings, columns);
}

bool RowPrinter::Print(const SqliteValueList& row) {
  if (asJson && isBegun) std::cout << ',';
  Begin();
  const Json::Value json = ToJson(row, columns);
  if (asJson) {
    std::cout << JsonValue::toString(json);
    return std::cout.good();
  }
  std::vector<std::string> cells;
  for (const Column& column : columns) cells.push_back(Cell(json[column.name], column));
  PrintLine(cells, columns);
  return std::cout.good();
}

void RowPrinter::End() {
  Begin();
  if (asJson) std::cout << "]\n";
}

void PrintJson(const Json::Value& value) { std::cout << JsonValue::toString(value) << '\n'; }

void PrintDone(const std::string& sentence, const Json::Value& counts, bool asJson) {
  if (asJson) return PrintJson(counts);
  std::cout << sentence << '\n';
}

Json::Value MakeErr(int code, const Json::Value& message) {
  Json::Value err;
  err["err_code"] = code;
  err["err_code_str"] = ERR::ToString(code);
  err["err_msg"] = message;
  return err;
}

int Complain(const std::string& what, const Json::Value& err, bool asJson) {
  if (asJson) {
    std::cerr << JsonValue::toString(err) << '\n';
  } else {
    std::cerr << "drctl: " << Printable(what) << ": " << Printable(Reason(err["err_msg"])) << " ("
              << err["err_code_str"].asString() << ")\n";
  }
  return 1;
}

}  // namespace drctl
