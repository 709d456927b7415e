// Commands.

#ifndef KELODRCORE_TESTS_MODEL_COMMANDS_H_
#define KELODRCORE_TESTS_MODEL_COMMANDS_H_

#include <sstream>
#include <string>
#include <vector>

#include "kelodrcore/container.h"
#include "kelodrcore/sqlite_command.h"
#include "model/conditions.h"

namespace Model {

struct Table {
  std::string tableName;
  std::string columnDefs;
};

// The separator is written only after a text that is not empty.
inline std::string Join(const std::vector<std::string>& texts, const std::string& separator) {
  std::string joined;
  for (const std::string& text : texts) joined += (joined.empty() ? "" : separator) + text;
  return joined;
}

class Command {
 public:
  virtual ~Command() = default;
  virtual std::string GetCommand() const = 0;
  virtual bool IsValid() const = 0;
  virtual void DumpParam(std::stringstream& stream) const = 0;

  bool SetTable(const Table& handler) {
    if (handler.tableName.empty()) {
      Trace::Log(Err, kFile, "SetTable", "Invalid table [%s]", handler.tableName.c_str());
      return false;
    }
    table = handler;
    return true;
  }
  const Table& GetTable() const { return table; }
  std::string ToStr() const {
    std::stringstream stream;
    stream << table.tableName << "]";
    DumpParam(stream);
    return stream.str();
  }

 protected:
  static constexpr const char* kFile = "sqlite_command.cpp";

  static std::string Bad(const char* message) {
    Trace::Log(Err, kFile, "GetCommand", "%s", message);
    return "";
  }
  static bool IsUsable(const Condition& condition) {
    if (!condition.IsValid()) Trace::Log(Err, kFile, "SetCondition", "Invalid condition");
    return condition.IsValid();
  }

  Table table;
};

// What INSERT and UPDATE have in common.
class WriteCommand : public Command {
 public:
  bool IsValid() const override {
    return !table.tableName.empty() && !fieldValues.GetValues().empty();
  }
  void SetFieldValues(const ValueList& list) { fieldValues = list; }
  bool AddFieldValue(const std::string& field, const Value& value) {
    if (!field.empty() && value.IsValid()) return fieldValues.AddValue(field, value);
    Trace::Log(Err, kFile, "AddFieldValue", "Bad Field [%s] /value[%s]", field.c_str(),
               value.ToFormatedValue().c_str());
    return false;
  }

 protected:
  std::string Assignments() const {
    std::string text;
    for (const auto& [field, value] : fieldValues.GetValues()) {
      text += (text.empty() ? "" : ",") + field + "=" + value.ToFormatedValue();
    }
    return text;
  }

  ValueList fieldValues;
};

class InsertCommand : public WriteCommand {
 public:
  void SetReplacable(bool value) { replacable = value; }
  std::string ToFormatedInsertValues() const {
    std::vector<std::string> names;
    std::vector<std::string> literals;
    for (const auto& [field, value] : fieldValues.GetValues()) {
      names.push_back(field);
      literals.push_back(value.ToFormatedValue());
    }
    return "(" + Join(names, ",") + ") VALUES (" + Join(literals, ",") + ")";
  }
  std::string GetCommand() const override {
    if (!IsValid()) return Bad("Bad insert parameter");
    return std::string(replacable ? "INSERT OR REPLACE INTO" : "INSERT INTO") + " " +
           table.tableName + " " + ToFormatedInsertValues() + ";";
  }
  void DumpParam(std::stringstream& stream) const override {
    stream << "values:[" << Assignments() << "]";
  }

 private:
  bool replacable = false;
};

class UpdateCommand : public WriteCommand {
 public:
  std::string GetCommand() const override {
    if (!IsValid()) return Bad("Bad update command");
    return "UPDATE " + table.tableName + " SET " + Assignments() +
           (condition.empty() ? "" : " WHERE " + condition);
  }
  void DumpParam(std::stringstream& stream) const override {
    stream << "condition:[" << condition << "]/values:[" << Assignments() << "]";
  }
  bool SetCondition(const std::string& text) {
    if (text.empty()) return false;
    condition = text;
    return true;
  }
  bool SetCondition(const Condition& given) {
    return IsUsable(given) && SetCondition(given.GetText());
  }

 private:
  std::string condition;
};

class SelectCommand : public Command {
 public:
  bool IsValid() const override {
    return !table.tableName.empty() && (selectAll || !fields.empty());
  }
  std::string GetCommand() const override {
    if (!IsValid()) return Bad("Bad select command");
    std::string sql = "SELECT ";
    sql += fields.empty() ? " * " : Join(fields, ",") + " ";
    sql += "FROM " + table.tableName;
    if (!condition.empty()) sql += " WHERE " + condition;
    if (!orderFields.empty()) {
      sql += " ORDER BY " + Join(orderFields, ",") + (orderByASC ? " ASC" : " DESC");
    }
    if (limit >= 1) sql += " LIMIT " + std::to_string(offset) + ", " + std::to_string(limit);
    return sql;
  }
  void DumpParam(std::stringstream& stream) const override {
    stream << "condition:[" << condition << "]/fields:[" << (selectAll ? "all" : Join(fields, ", "))
           << "]";
  }
  bool AddField(const std::string& field) {
    if (field.empty()) return false;
    fields.push_back(field);
    selectAll = false;
    return true;
  }
  bool AddOrderField(const std::string& field) {
    if (!field.empty()) orderFields.push_back(field);
    return !field.empty();
  }
  void SelectAll() {
    fields.clear();
    selectAll = true;
  }
  void SetOrderByASC() { orderByASC = true; }
  void SetOrderByDESC() { orderByASC = false; }
  bool SetLimit(int first, int count) {
    if (first < 0 || count < 1) return false;
    offset = first;
    limit = count;
    return true;
  }
  bool SetLimit(int count) {
    if (count >= 1) limit = count;
    return count >= 1;
  }
  bool SetCondition(const std::string& text) {
    if (text.empty()) {
      Trace::Log(Err, kFile, "SetCondition", "Empty condition");
      return false;
    }
    condition = text;
    return true;
  }
  bool SetCondition(const Condition& given) {
    return IsUsable(given) && SetCondition(given.GetText());
  }

 private:
  bool selectAll = false;
  bool orderByASC = false;
  int offset = 0;
  int limit = -1;
  std::vector<std::string> fields;
  std::vector<std::string> orderFields;
  std::string condition;
};

class DeleteCommand : public Command {
 public:
  bool IsValid() const override {
    return !table.tableName.empty() && (deleteAll || !condition.empty());
  }
  std::string GetCommand() const override {
    if (!IsValid()) return Bad("Bad delete command");
    return "DELETE FROM " + table.tableName + (condition.empty() ? "" : " WHERE " + condition) +
           ";";
  }
  void DumpParam(std::stringstream& stream) const override {
    stream << "condition:[" << (condition.empty() && deleteAll ? "all" : condition) << "]";
  }
  void DeleteAll() { deleteAll = true; }
  bool SetCondition(const std::string& text) {
    if (text.empty()) return false;
    condition = text;
    deleteAll = false;
    return true;
  }
  bool SetCondition(const Condition& given) {
    return IsUsable(given) && SetCondition(given.GetText());
  }

 private:
  bool deleteAll = false;
  std::string condition;
};

}  // namespace Model

using TableTwin = Twin<KeloDRCore::SqliteTableHandler, Model::Table>;
using InsertTwin = Twin<KeloDRCore::InsertCommand, Model::InsertCommand>;
using UpdateTwin = Twin<KeloDRCore::UpdateCommand, Model::UpdateCommand>;
using SelectTwin = Twin<KeloDRCore::SelectCommand, Model::SelectCommand>;
using DeleteTwin = Twin<KeloDRCore::DeleteCommand, Model::DeleteCommand>;

// Tables that can be made and ones that cannot, and names that break a statement.
inline TableTwin DrawTable() {
  static const std::string columns = "id INTEGER PRIMARY KEY, name TEXT, a, b INTEGER, x REAL";
  static const std::vector<Model::Table> odd = {{"t", ""},
                                                {"missing", ""},
                                                {"v", "no ("},
                                                {"", columns},
                                                {"", ""},
                                                {"it's", columns},
                                                {"t' WHERE 0 UNION SELECT NULL --", ""},
                                                {"t' UNION SELECT 'x' ORDER BY 1 DESC --", ""},
                                                {std::string("t\0z", 3), columns}};
  static const std::vector<Model::Table> usual = {
      {"t", columns}, {"t", columns}, {"u", columns + ", UNIQUE(name)"}};
  const Model::Table& table = Draw::Of(Draw::Once(3) ? odd : usual);
  return {{table.tableName, table.columnDefs}, table};
}

inline std::string DrawCondition() {
  static const std::vector<std::string> odd = {"", "no such", "id=(", "%s%n",
                                               std::string("id=2\0 OR 1", 10)};
  static const std::vector<std::string> usual = {"id=1", "id > 2",        "name='a'",
                                                 "1",    "id IN (1,2,3)", "x IS NULL"};
  return Draw::Of(Draw::Once(4) ? odd : usual);
}

class Commands {
 public:
  Commands(Values& itsValues, Conditions& itsConditions)
      : values(itsValues), conditions(itsConditions) {}

  void Step() {
    switch (Draw::Below(4)) {
      case 0:
        return StepOf(insert, [&] { OfInsert(); });
      case 1:
        return StepOf(update, [&] { OfUpdate(); });
      case 2:
        return StepOf(select, [&] { OfSelect(); });
      default:
        return StepOf(erase, [&] { OfDelete(); });
    }
  }

  InsertTwin insert;
  UpdateTwin update;
  SelectTwin select;
  DeleteTwin erase;

 private:
  // What all commands have; now and then a new one.
  template <typename Command, typename OfItself>
  void StepOf(Command& command, const OfItself& ofItself) {
    if (Draw::Once(25)) command = {};
    const size_t kind = Draw::Below(8);
    if (kind == 0) {
      TableTwin table = DrawTable();
      Do("SetTable", [&](auto side) {
        const bool result = side(command).SetTable(side(table));
        return Show(result, side(command).GetTable().tableName,
                    side(command).GetTable().columnDefs);
      });
    } else if (kind < 3) {
      Do("GetCommand", [&](auto side) {
        std::stringstream stream;
        stream << "before";
        side(command).DumpParam(stream);
        return Show(side(command).IsValid(), side(command).GetCommand(), side(command).ToStr(),
                    stream.str());
      });
    } else {
      ofItself();
    }
  }

  template <typename Command>
  void AddFieldValue(Command& command) {
    static const std::vector<long> numbers = {0, 1, 5, -7, INT32_MAX, INT32_MIN, 3, 4, 2};
    const std::string field = Draw::Name();
    const long number = Draw::Of(numbers);
    const std::string text = Draw::Text();
    const size_t type = Draw::Below(7);
    Do("AddFieldValue", [&](auto side) {
      auto& it = side(command);
      switch (type) {
        case 0:
          return Show(it.AddFieldValue(field, text));
        case 1:
          return Show(it.AddFieldValue(field, number > 0));
        case 2:
          return Show(it.AddFieldValue(field, static_cast<int>(number)));
        case 3:
          return Show(it.AddFieldValue(field, static_cast<unsigned int>(number)));
        case 4:
          return Show(it.AddFieldValue(field, number));
        case 5:
          return Show(it.AddFieldValue(field, text.c_str()));
        default:
          return Show(it.AddFieldValue(field, static_cast<const char*>(nullptr)));
      }
    });
  }

  template <typename Command>
  void SetFieldValues(Command& command) {
    ListTwin list = values.AnyList();
    Do("SetFieldValues", [&](auto side) {
      side(command).SetFieldValues(side(list));
      return Show(side(command).IsValid());
    });
  }

  template <typename Command>
  void SetCondition(Command& command) {
    const std::string text = DrawCondition();
    ConditionTwin condition = conditions.Any();
    const bool isText = Draw::Once(2);
    Do("SetCondition", [&](auto side) {
      return Show(isText ? side(command).SetCondition(text)
                         : side(command).SetCondition(*side(condition)));
    });
  }

  void OfInsert() {
    const size_t kind = Draw::Below(8);
    if (kind > 2) return AddFieldValue(insert);
    if (kind == 0) return SetFieldValues(insert);
    const bool isReplacing = Draw::Once(2);
    Do("SetReplacable", [&](auto side) {
      side(insert).SetReplacable(isReplacing);
      return Show(side(insert).ToFormatedInsertValues());
    });
  }

  void OfUpdate() {
    const size_t kind = Draw::Below(8);
    if (kind > 3) return AddFieldValue(update);
    return kind == 0 ? SetFieldValues(update) : SetCondition(update);
  }

  void OfSelect() {
    const std::string field = Draw::Name();
    const int first = static_cast<int>(Draw::Below(5)) - 1;
    const int count = static_cast<int>(Draw::Below(8)) - 1;
    const size_t kind = Draw::Below(8);
    if (kind > 6) return SetCondition(select);
    Do("a setter of a select", [&](auto side) -> std::string {
      auto& it = side(select);
      switch (kind) {
        case 0:
          return Show(it.AddField(field));
        case 1:
          return Show(it.AddOrderField(field));
        case 2:
          it.SelectAll();
          return "";
        case 3:
          it.SetOrderByASC();
          return "";
        case 4:
          it.SetOrderByDESC();
          return "";
        case 5:
          return Show(it.SetLimit(first, count));
        default:
          return Show(it.SetLimit(count));
      }
    });
  }

  void OfDelete() {
    if (Draw::Once(2)) return SetCondition(erase);
    Do("DeleteAll", [&](auto side) {
      side(erase).DeleteAll();
      return Show(side(erase).IsValid());
    });
  }

  Values& values;
  Conditions& conditions;
};

#endif  // KELODRCORE_TESTS_MODEL_COMMANDS_H_
