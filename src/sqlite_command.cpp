#include "kelodrcore/sqlite_command.h"

#include <utility>

#include "kelodrcore/container.h"
#include "log.h"
#include "value_access.h"

namespace KeloDRCore {
namespace {

template <typename T>
constexpr bool IsNull(const T& /*value*/) {
  return false;
}
bool IsNull(const char* value) { return value == nullptr; }

template <typename T>
bool AddField(SqliteValueList& list, const std::string& field, const T& value) {
  if (field.empty() || IsNull(value)) {
    KELODR_LOG(ERR, "AddFieldValue", "Bad Field [%s] /value[%s]", field.c_str(),
               SqliteValue(value).ToFormatedValue().c_str());
    return false;
  }
  ValueAccess::SetField(list, field, value);
  return true;
}

// Checks the condition; what its text means to the command stays with the command.
template <typename Command>
bool SetConditionText(Command& command, const SqliteCondition& condition) {
  if (!condition.IsValid()) {
    KELODR_LOG(ERR, "SetCondition", "%s", "Invalid condition");
    return false;
  }
  return command.SetCondition(condition.GetText());
}

// "name=literal" for each field, with "," between.
void AppendAssignments(std::string& text, const SqliteValueList& list) {
  bool isFirst = true;
  for (const auto& [field, value] : list.GetValues()) {
    if (!isFirst) text += ',';
    isFirst = false;
    text += field;
    text += '=';
    ValueAccess::AppendLiteral(text, value);
  }
}

// None of the names is empty.
void AppendNames(std::string& text, const std::vector<std::string>& names) {
  bool isFirst = true;
  for (const std::string& name : names) {
    if (!isFirst) text += ',';
    isFirst = false;
    text += name;
  }
}

// Room for a statement, so that most are built without growing.
constexpr size_t kFixedRoom = 64;
constexpr size_t kFieldRoom = 40;
constexpr size_t kNameRoom = 16;

void Reserve(std::string& text, const SqliteValueList& list) {
  text.reserve(kFixedRoom + kFieldRoom * list.GetValues().size());
}

void AppendWhere(std::string& text, const std::string& condition) {
  if (!condition.empty()) text.append(" WHERE ").append(condition);
}

void DumpValues(std::stringstream& stream, const SqliteValueList& list) {
  std::string assignments;
  AppendAssignments(assignments, list);
  stream << "values:[" << assignments << "]";
}

// "(names) VALUES (literals)". The comma stands only behind text, as Container::ToString joins: a
// literal may be the empty text.
void AppendInsertValues(std::string& text, const SqliteValueList& list) {
  text += '(';
  size_t start = text.size();
  for (const auto& entry : list.GetValues()) {
    if (text.size() != start) text += ',';
    text += entry.first;
  }
  text += ") VALUES (";
  start = text.size();
  for (const auto& entry : list.GetValues()) {
    if (text.size() != start) text += ',';
    ValueAccess::AppendLiteral(text, entry.second);
  }
  text += ')';
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
  std::string text;
  Reserve(text, fieldValues);
  text += replacable ? "INSERT OR REPLACE INTO " : "INSERT INTO ";
  text.append(GetTable().tableName) += ' ';
  AppendInsertValues(text, fieldValues);
  text += ';';
  return text;
}

std::string InsertCommand::ToFormatedInsertValues() const {
  std::string text;
  AppendInsertValues(text, fieldValues);
  return text;
}

void InsertCommand::DumpParam(std::stringstream& stream) const { DumpValues(stream, fieldValues); }

void InsertCommand::SetFieldValues(const SqliteValueList& list) { fieldValues = list; }

void InsertCommand::SetReplacable(bool isReplacable) { replacable = isReplacable; }

template <typename T, typename>
bool InsertCommand::AddFieldValue(const std::string& field, const T& value) {
  return AddField(fieldValues, field, value);
}

bool InsertCommand::AddFieldValue(const std::string& field, const char* value) {
  return AddField(fieldValues, field, value);
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
  std::string text;
  Reserve(text, fieldValues);
  text += "UPDATE ";
  text.append(GetTable().tableName).append(" SET ");
  AppendAssignments(text, fieldValues);
  AppendWhere(text, condition);
  return text;
}

void UpdateCommand::DumpParam(std::stringstream& stream) const {
  stream << "condition:[" << condition << "]/";
  DumpValues(stream, fieldValues);
}

void UpdateCommand::SetFieldValues(const SqliteValueList& list) { fieldValues = list; }

template <typename T, typename>
bool UpdateCommand::AddFieldValue(const std::string& field, const T& value) {
  return AddField(fieldValues, field, value);
}

bool UpdateCommand::AddFieldValue(const std::string& field, const char* value) {
  return AddField(fieldValues, field, value);
}

bool UpdateCommand::SetCondition(const std::string& text) {
  if (text.empty()) return false;
  condition = text;
  return true;
}

bool UpdateCommand::SetCondition(const SqliteCondition& sqliteCondition) {
  return SetConditionText(*this, sqliteCondition);
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
  std::string text;
  text.reserve(kFixedRoom + kNameRoom * fields.size());
  text += "SELECT ";
  if (!fields.empty()) {
    AppendNames(text, fields);
    text += ' ';
  } else if (selectAll) {
    text += " * ";  // two blanks in front of the asterisk, as readers of the statements expect it
  }
  text.append("FROM ").append(GetTable().tableName);
  AppendWhere(text, condition);
  if (!orderFields.empty()) {
    text += " ORDER BY ";
    AppendNames(text, orderFields);
    text += orderByASC ? " ASC" : " DESC";
  }
  if (limit >= 1) {
    text.append(" LIMIT ").append(std::to_string(offset));
    text.append(", ").append(std::to_string(limit));
  }
  return text;
}

void SelectCommand::DumpParam(std::stringstream& stream) const {
  std::string names = "all";
  if (!selectAll) names = Container::ToString(fields, ", ");
  stream << "condition:[" << condition << "]/fields:[" << names << "]";
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

bool SelectCommand::SetLimit(int first, int count) {
  if (first < 0 || count < 1) return false;
  offset = first;
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

bool SelectCommand::SetCondition(const SqliteCondition& sqliteCondition) {
  return SetConditionText(*this, sqliteCondition);
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
  std::string text = "DELETE FROM ";
  text += GetTable().tableName;
  AppendWhere(text, condition);
  text += ';';
  return text;
}

void DeleteCommand::DumpParam(std::stringstream& stream) const {
  std::string rows = condition;
  if (rows.empty() && deleteAll) rows = "all";
  stream << "condition:[" << rows << "]";
}

void DeleteCommand::DeleteAll() { deleteAll = true; }

bool DeleteCommand::SetCondition(const std::string& text) {
  if (text.empty()) return false;
  condition = text;
  deleteAll = false;
  return true;
}

bool DeleteCommand::SetCondition(const SqliteCondition& sqliteCondition) {
  return SetConditionText(*this, sqliteCondition);
}

template KELODR_EXPORT bool InsertCommand::AddFieldValue(const std::string& field,
                                                         const std::string& value);
template KELODR_EXPORT bool InsertCommand::AddFieldValue(const std::string& field,
                                                         const bool& value);
template KELODR_EXPORT bool InsertCommand::AddFieldValue(const std::string& field,
                                                         const int& value);
template KELODR_EXPORT bool InsertCommand::AddFieldValue(const std::string& field,
                                                         const unsigned int& value);
template KELODR_EXPORT bool InsertCommand::AddFieldValue(const std::string& field,
                                                         const long& value);

template KELODR_EXPORT bool UpdateCommand::AddFieldValue(const std::string& field,
                                                         const std::string& value);
template KELODR_EXPORT bool UpdateCommand::AddFieldValue(const std::string& field,
                                                         const bool& value);
template KELODR_EXPORT bool UpdateCommand::AddFieldValue(const std::string& field,
                                                         const int& value);
template KELODR_EXPORT bool UpdateCommand::AddFieldValue(const std::string& field,
                                                         const unsigned int& value);
template KELODR_EXPORT bool UpdateCommand::AddFieldValue(const std::string& field,
                                                         const long& value);

}  // namespace KeloDRCore
