#include "sqlite_bulk.h"

#include <sqlite3.h>

#include <algorithm>
#include <memory>

#include "value_access.h"

namespace KeloDRCore {
namespace {

// The record begins a new run.
constexpr int kOtherFields = -2;

using Names = std::vector<const std::string*>;

Names NamesOf(const SqliteValueList& record) {
  Names names;
  for (const auto& entry : record.GetValues()) names.push_back(&entry.first);
  return names;
}

// The record outlives the statement's use of its texts.
int Bind(sqlite3_stmt* stmt, int place, const Json::Value& payload) {
  const char* begin = nullptr;
  const char* end = nullptr;
  if (payload.getString(&begin, &end)) {
    return sqlite3_bind_text64(stmt, place, begin, static_cast<sqlite3_uint64>(end - begin),
                               SQLITE_STATIC, SQLITE_UTF8);
  }
  if (!payload.isInt64() && !payload.isBool()) return BulkInsert::kInvalidRecord;
  return sqlite3_bind_int64(stmt, place, payload.asInt64());
}

// Each record is looked at once: many do not fit in the processor's cache.
int InsertOne(sqlite3_stmt* stmt, const Names& names, const SqliteValueList& record) {
  if (record.GetValues().size() != names.size()) return kOtherFields;
  size_t column = 0;
  for (const auto& [name, value] : record.GetValues()) {
    if (name != *names[column++]) return kOtherFields;
    const int code = Bind(stmt, static_cast<int>(column), ValueAccess::Payload(value));
    if (code != SQLITE_OK) return code;
  }
  const int code = sqlite3_step(stmt);
  return code == SQLITE_DONE ? sqlite3_reset(stmt) : code;
}

}  // namespace

bool BulkInsert::IsValid() const {
  return !table.empty() && std::all_of(records.begin(), records.end(), [](const auto& record) {
    return !record.GetValues().empty();
  });
}

std::string BulkInsert::CommandFor(const SqliteValueList& record) const {
  std::string names;
  std::string marks;
  for (const auto& entry : record.GetValues()) {
    names.append(names.empty() ? "" : ",").append(entry.first);
    marks += marks.empty() ? "?" : ",?";
  }
  return std::string(verb) + " INTO " + table + " (" + names + ") VALUES (" + marks + ");";
}

// A run of records with the same fields is one statement.
int BulkInsert::Run(sqlite3* db, std::string& message) const {
  int code = SQLITE_OK;
  for (auto next = records.begin(); code == SQLITE_OK && next != records.end();) {
    const std::string sql = CommandFor(*next);
    if (sql.find('\0') != std::string::npos) return kInvalidRecord;
    sqlite3_stmt* stmt = nullptr;
    code = sqlite3_prepare_v2(db, sql.c_str(), -1, &stmt, nullptr);
    const std::unique_ptr<sqlite3_stmt, int (*)(sqlite3_stmt*)> owner(stmt, sqlite3_finalize);
    const Names names = NamesOf(*next);
    while (code == SQLITE_OK && next != records.end()) {
      code = InsertOne(stmt, names, *next);
      if (code == SQLITE_OK) ++next;
    }
    if (code > SQLITE_OK) message = sqlite3_errmsg(db);
    if (code == kOtherFields) code = SQLITE_OK;
  }
  return code;
}

}  // namespace KeloDRCore
