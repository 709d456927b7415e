#include "sqlite_bulk.h"

#include <sqlite3.h>

#include <algorithm>
#include <memory>

#include "value_access.h"

namespace KeloDRCore {
namespace {

using Field = std::map<std::string, SqliteValue>::value_type;

bool HasNul(const std::string& text) { return text.find('\0') != std::string::npos; }

bool IsBindable(const Field& field) {
  const Json::Value& payload = ValueAccess::Payload(field.second);
  return !HasNul(field.first) && (payload.isString() || payload.isBool() || payload.isInt64());
}

bool IsBindableRecord(const SqliteValueList& record) {
  const auto& values = record.GetValues();
  return !values.empty() && std::all_of(values.begin(), values.end(), IsBindable);
}

bool HasSameFields(const SqliteValueList& one, const SqliteValueList& other) {
  const auto& values = one.GetValues();
  const auto& others = other.GetValues();
  return std::equal(values.begin(), values.end(), others.begin(), others.end(),
                    [](const Field& a, const Field& b) { return a.first == b.first; });
}

// The record outlives the statement's use of its texts.
int Bind(sqlite3_stmt* stmt, int place, const Json::Value& payload) {
  if (!payload.isString()) return sqlite3_bind_int64(stmt, place, payload.asInt64());
  const char* begin = "";
  const char* end = begin;
  payload.getString(&begin, &end);
  return sqlite3_bind_text64(stmt, place, begin, static_cast<sqlite3_uint64>(end - begin),
                             SQLITE_STATIC, SQLITE_UTF8);
}

int InsertOne(sqlite3_stmt* stmt, const SqliteValueList& record) {
  int place = 0;
  for (const auto& [name, value] : record.GetValues()) {
    const int code = Bind(stmt, ++place, ValueAccess::Payload(value));
    if (code != SQLITE_OK) return code;
  }
  const int code = sqlite3_step(stmt);
  return code == SQLITE_DONE ? sqlite3_reset(stmt) : code;
}

}  // namespace

bool BulkInsert::IsValid() const {
  return !table.empty() && !HasNul(table) &&
         std::all_of(records.begin(), records.end(), IsBindableRecord);
}

std::string BulkInsert::CommandFor(const SqliteValueList& record) const {
  std::string names;
  std::string marks;
  for (const auto& [name, value] : record.GetValues()) {
    names.append(names.empty() ? "" : ",").append(name);
    marks += marks.empty() ? "?" : ",?";
  }
  return std::string(verb) + " INTO " + table + " (" + names + ") VALUES (" + marks + ");";
}

int BulkInsert::Run(sqlite3* db, std::string& message) const {
  int code = SQLITE_OK;
  for (auto next = records.begin(); code == SQLITE_OK && next != records.end();) {
    const SqliteValueList& first = *next;
    sqlite3_stmt* stmt = nullptr;
    code = sqlite3_prepare_v2(db, CommandFor(first).c_str(), -1, &stmt, nullptr);
    const std::unique_ptr<sqlite3_stmt, int (*)(sqlite3_stmt*)> owner(stmt, sqlite3_finalize);
    while (code == SQLITE_OK && next != records.end() && HasSameFields(first, *next)) {
      code = InsertOne(stmt, *next++);
    }
    if (code != SQLITE_OK) message = sqlite3_errmsg(db);
  }
  return code;
}

}  // namespace KeloDRCore
