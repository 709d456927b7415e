#include "kelodrcore/sqlite_command.h"

#include <string_view>

#include "kelodrcore/container.h"
#include "log.h"
#include "value_access.h"

namespace KeloDRCore {
namespace {

bool SetField(SqliteValueList& list, const std::string& field, const SqliteValue& value) {
  if (!field.empty() && value.IsValid()) return list.AddValue(field, value);
  KELODR_LOG(ERR, "AddFieldValue", "Bad Field [%s] /value[%s]", field.c_str(),
             value.ToFormatedValue().c_str());
  return false;
}

// Checks the condition, and leaves its text to the command's other SetCondition.
template <typename Command>
bool SetConditionText(Command& command, const SqliteCondition& condition) {
  if (!condition.IsValid()) {
    KELODR_LOG(ERR, "SetCondition", "%s", "Invalid condition");
    return false;
  }
  return command.SetCondition(condition.GetText());
}

// "name=literal" for each field, with "," between.
std::string Assignments(const SqliteValueList& list) {
  std::string text;
  for (const auto& [field, value] : list.GetValues()) {
    if (!text.empty()) text += ',';
    text += field;
    text += '=';
    ValueAccess::AppendLiteral(text, value);
  }
  return text;
}

std::string Where(const std::string& condition) {
  if (condition.empty()) return "";
  return " WHERE " + condition;
}

}  // namespace

SqliteCommand::SqliteCommand() = default;
SqliteCommand::SqliteCommand(const SqliteCommand& other) = default;
SqliteCommand& SqliteCommand::operator=(const SqliteCommand& other) = default;
SqliteCommand::~SqliteCommand() = default;

bool SqliteCommand::SetTable(const SqliteTableHandler& handler) {
  if (handler.tableName.empty()) {
    KELODR_LOG(ERR, __func__, "Invalid table [%s]", handler.tableName.c_str());
    return false;
  }
  table = handler;
  return true;
}

std::string SqliteCommand::ToStr() const {
  std::stringstream stream;
  stream << table.tableName << "]";
  DumpParam(stream);
  return stream.str();
}

InsertCommand::InsertCommand() = default;

bool InsertCommand::IsValid() const {
  return !GetTable().tableName.empty() && !fieldValues.GetValues().empty();
}

std::string InsertCommand::GetCommand() const {
  if (!IsValid()) {
    KELODR_LOG(ERR, __func__, "%s", "Bad insert parameter");
    return "";
  }
  return (replacable ? "INSERT OR REPLACE INTO " : "INSERT INTO ") + GetTable().tableName + " " +
         ToFormatedInsertValues() + ";";
}

std::string InsertCommand::ToFormatedInsertValues() const {
  std::string names;
  std::string literals;
  for (const auto& [field, value] : fieldValues.GetValues()) {
    if (!names.empty()) names += ',';
    names += field;
    // Behind text only, as Container::ToString joins: a literal may be the empty text.
    if (!literals.empty()) literals += ',';
    ValueAccess::AppendLiteral(literals, value);
  }
  return "(" + names + ") VALUES (" + literals + ")";
}

void InsertCommand::DumpParam(std::stringstream& stream) const {
  stream << "values:[" << Assignments(fieldValues) << "]";
}

void InsertCommand::SetFieldValues(const SqliteValueList& list) { fieldValues = list; }

void InsertCommand::SetReplacable(bool newReplacable) { replacable = newReplacable; }

bool InsertCommand::AddField(const std::string& field, const SqliteValue& value) {
  return SetField(fieldValues, field, value);
}

UpdateCommand::UpdateCommand() = default;

bool UpdateCommand::IsValid() const {
  return !GetTable().tableName.empty() && !fieldValues.GetValues().empty();
}

std::string UpdateCommand::GetCommand() const {
  if (!IsValid()) {
    KELODR_LOG(ERR, __func__, "%s", "Bad update command");
    return "";
  }
  return "UPDATE " + GetTable().tableName + " SET " + Assignments(fieldValues) + Where(condition);
}

void UpdateCommand::DumpParam(std::stringstream& stream) const {
  stream << "condition:[" << condition << "]/values:[" << Assignments(fieldValues) << "]";
}

void UpdateCommand::SetFieldValues(const SqliteValueList& list) { fieldValues = list; }

bool UpdateCommand::AddField(const std::string& field, const SqliteValue& value) {
  return SetField(fieldValues, field, value);
}

bool UpdateCommand::SetCondition(const std::string& text) {
  if (text.empty()) return false;
  condition = text;
  return true;
}

bool UpdateCommand::SetCondition(const SqliteCondition& newCondition) {
  return SetConditionText(*this, newCondition);
}

SelectCommand::SelectCommand() = default;

bool SelectCommand::IsValid() const {
  return !GetTable().tableName.empty() && (selectAll || !fields.empty());
}

std::string SelectCommand::GetCommand() const {
  if (!IsValid()) {
    KELODR_LOG(ERR, __func__, "%s", "Bad select command");
    return "";
  }
  std::string text = "SELECT ";
  if (!fields.empty()) {
    text += Container::ToString(fields, ",") + " ";
  } else if (selectAll) {
    text += " * ";
  }
  text += "FROM " + GetTable().tableName + Where(condition);
  if (!orderFields.empty()) {
    text += " ORDER BY " + Container::ToString(orderFields, ",") + (orderByASC ? " ASC" : " DESC");
  }
  if (limit >= 1) text += " LIMIT " + std::to_string(offset) + ", " + std::to_string(limit);
  return text;
}

void SelectCommand::DumpParam(std::stringstream& stream) const {
  const std::string names = Container::ToString(fields, ", ");
  std::string_view shown = names;
  if (selectAll) shown = "all";
  stream << "condition:[" << condition << "]/fields:[" << shown << "]";
}

bool SelectCommand::AddField(const std::string& field) {
  if (field.empty()) return false;
  fields.push_back(field);
  selectAll = false;
  return true;
}

bool SelectCommand::AddOrderField(const std::string& field) {
  if (field.empty()) return false;
  orderFields.push_back(field);
  return true;
}

void SelectCommand::SelectAll() {
  fields.clear();
  selectAll = true;
}

void SelectCommand::SetOrderByASC() { orderByASC = true; }

void SelectCommand::SetOrderByDESC() { orderByASC = false; }

bool SelectCommand::SetLimit(int newOffset, int count) {
  if (newOffset < 0 || count < 1) return false;
  offset = newOffset;
  limit = count;
  return true;
}

bool SelectCommand::SetLimit(int count) {
  if (count < 1) return false;
  limit = count;
  return true;
}

bool SelectCommand::SetCondition(const std::string& text) {
  if (text.empty()) {
    KELODR_LOG(ERR, __func__, "%s", "Empty condition");
    return false;
  }
  condition = text;
  return true;
}

bool SelectCommand::SetCondition(const SqliteCondition& newCondition) {
  return SetConditionText(*this, newCondition);
}

DeleteCommand::DeleteCommand() = default;

bool DeleteCommand::IsValid() const {
  return !GetTable().tableName.empty() && (deleteAll || !condition.empty());
}

std::string DeleteCommand::GetCommand() const {
  if (!IsValid()) {
    KELODR_LOG(ERR, __func__, "%s", "Bad delete command");
    return "";
  }
  return "DELETE FROM " + GetTable().tableName + Where(condition) + ";";
}

void DeleteCommand::DumpParam(std::stringstream& stream) const {
  std::string_view shown = condition;
  if (condition.empty() && deleteAll) shown = "all";
  stream << "condition:[" << shown << "]";
}

void DeleteCommand::DeleteAll() { deleteAll = true; }

bool DeleteCommand::SetCondition(const std::string& text) {
  if (text.empty()) return false;
  condition = text;
  deleteAll = false;
  return true;
}

bool DeleteCommand::SetCondition(const SqliteCondition& newCondition) {
  return SetConditionText(*this, newCondition);
}

}  // namespace KeloDRCore
