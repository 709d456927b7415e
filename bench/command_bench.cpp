// ToFormatedValue and GetCommand: data becoming SQL text.

#include <sqlite3.h>

#include <cstring>
#include <regex>

#include "kelodrcore/sqlite_command.h"
#include "nodes.h"
#include "raw_calls.h"
#include "support.h"

namespace bench {
namespace {

// A text of which every n-th byte is a quote; none with `every` 0.
std::string QuotedText(size_t size, size_t every) {
  std::string text(size, 'x');
  for (size_t i = 0; every != 0 && i < size; i += every) text[i] = '\'';
  return text;
}

std::string ReplaceByRegex(const std::string& text) {
  return "'" + std::regex_replace(text, std::regex("'"), "''") + "'";
}

void MeasureLiteral(size_t size, const std::string& share, size_t every) {
  const std::string work = SizeName(size) + " with " + share + " quotes";
  const std::string text = QuotedText(size, every);
  const KeloDRCore::SqliteValue value(text);
  std::string expected;
  AppendLiteral(expected, text.data(), text.data() + text.size());
  Require(value.ToFormatedValue() == expected, "the literals differ");
  Register("ToFormatedValue", work, kLibrary, [=](benchmark::State& state) {
    for (auto _ : state) benchmark::DoNotOptimize(value.ToFormatedValue());
  });
  Register("ToFormatedValue", work, Contestant{"sqlite3_mprintf", 1}, [=](benchmark::State& state) {
    for (auto _ : state) {
      char* const literal = sqlite3_mprintf("%Q", text.c_str());
      benchmark::DoNotOptimize(literal);
      sqlite3_free(literal);
    }
  });
  if (size > 4096) return;
  Register("ToFormatedValue", work, Contestant{"regex_replace"}, [=](benchmark::State& state) {
    for (auto _ : state) benchmark::DoNotOptimize(ReplaceByRegex(text));
  });
}

// The baseline's statements are made of the same stored data: names and JSON values in order.
struct Statement {
  std::string table = "nodes";
  Record fields;
  std::string condition = "id=7";
};

std::string InsertText(const Statement& statement) {
  std::string text;
  text.reserve(64 + statement.fields.size() * 48);
  text.append("INSERT INTO ").append(statement.table).append(" (");
  for (const auto& field : statement.fields) text.append(field.first) += ',';
  text.back() = ')';
  text += " VALUES (";
  for (const auto& field : statement.fields) {
    AppendValue(text, field.second);
    text += ',';
  }
  text.back() = ')';
  text += ';';
  return text;
}

std::string UpdateText(const Statement& statement) {
  std::string text;
  text.reserve(64 + statement.fields.size() * 48);
  text.append("UPDATE ").append(statement.table).append(" SET ");
  for (const auto& field : statement.fields) {
    text.append(field.first) += '=';
    AppendValue(text, field.second);
    text += ',';
  }
  text.pop_back();
  return text.append(" WHERE ").append(statement.condition);
}

std::string SelectText(const std::vector<std::string>& names, const Statement& statement) {
  std::string text;
  text.reserve(64 + names.size() * 24);
  text += "SELECT ";
  for (const std::string& name : names) text.append(name) += ',';
  text.back() = ' ';
  text.append("FROM ").append(statement.table);
  return text.append(" WHERE ").append(statement.condition);
}

std::string DeleteText(const Statement& statement) {
  std::string text;
  text.reserve(24 + statement.table.size() + statement.condition.size());
  text.append("DELETE FROM ").append(statement.table);
  return text.append(" WHERE ").append(statement.condition) += ';';
}

template <typename ByHand>
void MeasureCommand(const std::string& work, std::shared_ptr<KeloDRCore::SqliteCommand> command,
                    const ByHand& byHand) {
  command->SetTable(NodeTable());
  Require(command->GetCommand() == byHand(), "the statements differ: " + byHand());
  Register("GetCommand", work, kLibrary, [=](benchmark::State& state) {
    for (auto _ : state) benchmark::DoNotOptimize(command->GetCommand());
  });
  Register("GetCommand", work, Baseline(2.5), [=](benchmark::State& state) {
    for (auto _ : state) benchmark::DoNotOptimize(byHand());
  });
}

// Two texts, of which one has a quote, then two numbers, and so on.
Json::Value FieldValue(int i) {
  if (i % 4 == 0) return "O'Brien's node in the second site";
  if (i % 4 == 1) return "192.168.1." + std::to_string(i);
  return i * 1000;
}

void MeasureCommands(int count) {
  Statement statement;
  std::vector<std::string> names;
  const auto insert = std::make_shared<KeloDRCore::InsertCommand>();
  const auto update = std::make_shared<KeloDRCore::UpdateCommand>();
  const auto select = std::make_shared<KeloDRCore::SelectCommand>();
  for (int i = 0; i < count; ++i) {
    const std::string name = "field_" + std::to_string(i);
    const Json::Value value = FieldValue(i);
    names.push_back(name);
    statement.fields[name] = value;
    select->AddField(name);
    if (value.isString()) {
      insert->AddFieldValue(name, value.asString());
      update->AddFieldValue(name, value.asString());
    } else {
      insert->AddFieldValue(name, value.asInt());
      update->AddFieldValue(name, value.asInt());
    }
  }
  update->SetCondition(statement.condition);
  select->SetCondition(statement.condition);
  const std::string fields = " of " + std::to_string(count) + " fields";
  MeasureCommand("insert" + fields, insert, [=] { return InsertText(statement); });
  MeasureCommand("update" + fields, update, [=] { return UpdateText(statement); });
  MeasureCommand("select" + fields, select, [=] { return SelectText(names, statement); });
}

void MeasureDelete() {
  const Statement statement;
  const auto command = std::make_shared<KeloDRCore::DeleteCommand>();
  command->SetCondition(statement.condition);
  MeasureCommand("delete", command, [=] { return DeleteText(statement); });
}

const Benchmarks registered([] {
  for (const size_t size :
       {size_t{16}, size_t{256}, size_t{4096}, size_t{65536}, size_t{1} << 20}) {
    MeasureLiteral(size, "0 %", 0);
    MeasureLiteral(size, "1 %", 100);
    MeasureLiteral(size, "10 %", 10);
  }
  MeasureCommands(5);
  MeasureCommands(50);
  MeasureDelete();
});

}  // namespace
}  // namespace bench
