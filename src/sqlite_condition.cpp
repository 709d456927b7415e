#include "kelodrcore/sqlite_condition.h"

#include <utility>

#include "log.h"
#include "value_access.h"

namespace KeloDRCore {
namespace {

const char* const kIn = "IN";
const char* const kNotIn = "NOT IN";

// Every setter builds its new text before it replaces the old one: an operand may be the old one.

bool SetComparison(std::string& text, const std::string& lvalue, const char* comparison,
                   const SqliteValue& value) {
  if (lvalue.empty() || !value.IsValid()) {
    KELODR_LOG(ERR, "SetValue", "Bad lvalue[%s] or rvalue[%s]", lvalue.c_str(),
               value.ToFormatedValue().c_str());
    return false;
  }
  std::string rendered = lvalue + comparison;
  ValueAccess::AppendLiteral(rendered, value);
  text = std::move(rendered);
  return true;
}

bool AppendGroup(std::string& text, const std::string& left, const char* keyword,
                 const std::string& right) {
  if (left.empty() || right.empty()) {
    KELODR_LOG(ERR, "SetValue", "Bad lvalue[%s] or rvalue[%s]", left.c_str(), right.c_str());
    return false;
  }
  text += "(" + left + ") " + keyword + " (" + right + ")";
  return true;
}

// Logs when the keyword is refused. Asks the virtual operation: a subclass may know other keywords.
bool RequireKeyword(const SqliteInFamily& condition) {
  if (condition.IsValid()) return true;
  KELODR_LOG(ERR, "SetValue", "Bad keyword [%s]", condition.GetKeyword().c_str());
  return false;
}

}  // namespace

SqliteCondition::SqliteCondition() = default;
SqliteCondition::SqliteCondition(const std::string& newText) : text(newText) {}

bool SqliteCondition::IsValid() const { return !text.empty(); }

SqliteEqual::SqliteEqual() = default;
SqliteEqual::SqliteEqual(const std::string& lvalue, const SqliteValue& value) {
  SetValue(lvalue, value);
}

bool SqliteEqual::SetValue(const std::string& lvalue, const SqliteValue& value) {
  return SetComparison(text, lvalue, "=", value);
}

SqliteNotEqual::SqliteNotEqual() = default;
SqliteNotEqual::SqliteNotEqual(const std::string& lvalue, const SqliteValue& value) {
  SetValue(lvalue, value);
}

bool SqliteNotEqual::SetValue(const std::string& lvalue, const SqliteValue& value) {
  return SetComparison(text, lvalue, "!=", value);
}

SqliteAnd::SqliteAnd() = default;
SqliteAnd::SqliteAnd(const std::string& left, const std::string& right) { SetValue(left, right); }
SqliteAnd::SqliteAnd(const SqliteCondition& left, const SqliteCondition& right)
    : SqliteAnd(left.GetText(), right.GetText()) {}

bool SqliteAnd::SetValue(const std::string& left, const std::string& right) {
  return AppendGroup(text, left, "AND", right);
}

SqliteOr::SqliteOr() = default;
SqliteOr::SqliteOr(const std::string& left, const std::string& right) { SetValue(left, right); }
SqliteOr::SqliteOr(const SqliteCondition& left, const SqliteCondition& right)
    : SqliteOr(left.GetText(), right.GetText()) {}

bool SqliteOr::SetValue(const std::string& left, const std::string& right) {
  return AppendGroup(text, left, "OR", right);
}

SqliteIsNull::SqliteIsNull() = default;
SqliteIsNull::SqliteIsNull(const std::string& lvalue) { SetValue(lvalue); }

bool SqliteIsNull::SetValue(const std::string& lvalue) {
  if (lvalue.empty()) {
    KELODR_LOG(ERR, __func__, "Bad lvalue[%s]", lvalue.c_str());
  } else {
    text = lvalue + " IS NULL";
  }
  return false;
}

SqliteInFamily::SqliteInFamily(const std::string& newKeyword) : keyword(newKeyword) {}
SqliteInFamily::SqliteInFamily(const std::string& newKeyword, const std::string& lvalue,
                               const std::vector<SqliteValue>& values)
    : keyword(newKeyword) {
  SetValue(lvalue, values);
}
SqliteInFamily::SqliteInFamily(const std::string& newKeyword, const std::string& lvalue,
                               const std::string& value)
    : keyword(newKeyword) {
  SetValue(lvalue, value);
}

SqliteInFamily::SqliteInFamily(const std::string& newKeyword, const std::string& lvalue,
                               std::initializer_list<SqliteValue> values)
    : SqliteInFamily(newKeyword, lvalue, std::vector<SqliteValue>(values)) {}

bool SqliteInFamily::IsValid() const { return keyword == kIn || keyword == kNotIn; }

bool SqliteInFamily::SetValue(const std::string& lvalue, const std::vector<SqliteValue>& values) {
  if (!RequireKeyword(*this)) return false;
  if (lvalue.empty()) {
    KELODR_LOG(ERR, __func__, "Bad lvalue[%s]", lvalue.c_str());
    return false;
  }
  std::string rendered = lvalue + " " + keyword + " ( ";
  bool isFirst = true;
  for (const SqliteValue& value : values) {
    if (!value.IsValid()) {
      text.clear();
      KELODR_LOG(ERR, __func__, "Invalid rvalue [%s]", value.ToFormatedValue().c_str());
      return false;
    }
    if (!isFirst) rendered += ',';
    isFirst = false;
    ValueAccess::AppendLiteral(rendered, value);
  }
  rendered += " )";
  text = std::move(rendered);
  return true;
}

bool SqliteInFamily::SetValue(const std::string& lvalue,
                              std::initializer_list<SqliteValue> values) {
  return SetValue(lvalue, std::vector<SqliteValue>(values));
}

bool SqliteInFamily::SetValue(const std::string& lvalue, const std::string& value) {
  if (!RequireKeyword(*this)) return false;
  if (lvalue.empty() || value.empty()) {
    KELODR_LOG(ERR, __func__, "Bad lvalue[%s] or value[%s]", lvalue.c_str(), value.c_str());
    return false;
  }
  text = lvalue + " " + keyword + " ( " + value + " )";
  return true;
}

SqliteIn::SqliteIn() : SqliteInFamily(kIn) {}
SqliteIn::SqliteIn(const std::string& lvalue, const std::vector<SqliteValue>& values)
    : SqliteInFamily(kIn, lvalue, values) {}
SqliteIn::SqliteIn(const std::string& lvalue, std::initializer_list<SqliteValue> values)
    : SqliteInFamily(kIn, lvalue, values) {}
SqliteIn::SqliteIn(const std::string& lvalue, const std::string& value)
    : SqliteInFamily(kIn, lvalue, value) {}

SqliteNotIn::SqliteNotIn() : SqliteInFamily(kNotIn) {}
SqliteNotIn::SqliteNotIn(const std::string& lvalue, const std::vector<SqliteValue>& values)
    : SqliteInFamily(kNotIn, lvalue, values) {}
SqliteNotIn::SqliteNotIn(const std::string& lvalue, std::initializer_list<SqliteValue> values)
    : SqliteInFamily(kNotIn, lvalue, values) {}
SqliteNotIn::SqliteNotIn(const std::string& lvalue, const std::string& value)
    : SqliteInFamily(kNotIn, lvalue, value) {}

}  // namespace KeloDRCore
