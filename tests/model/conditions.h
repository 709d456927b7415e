// Conditions.

#ifndef KELODRCORE_TESTS_MODEL_CONDITIONS_H_
#define KELODRCORE_TESTS_MODEL_CONDITIONS_H_

#include <memory>
#include <string>
#include <vector>

#include "kelodrcore/sqlite_condition.h"
#include "model/values.h"

namespace Model {

class Condition {
 public:
  Condition() = default;
  Condition(const std::string& given) : text(given) {}
  virtual ~Condition() = default;
  virtual bool IsValid() const { return !text.empty(); }
  const std::string& GetText() const { return text; }

 protected:
  bool Refuse(const char* format, const std::string& left, const std::string& right = "") {
    Trace::Log(Err, "sqlite_condition.cpp", "SetValue", format, left.c_str(), right.c_str());
    return false;
  }

  std::string text;
};

template <char Sign>  // '=' or '!'
class Comparison : public Condition {
 public:
  Comparison() = default;
  Comparison(const std::string& left, const Value& right) { SetValue(left, right); }
  bool SetValue(const std::string& left, const Value& right) {
    if (left.empty() || !right.IsValid()) {
      return Refuse("Bad lvalue[%s] or rvalue[%s]", left, right.ToFormatedValue());
    }
    text = left + (Sign == '=' ? "=" : "!=") + right.ToFormatedValue();
    return true;
  }
};

template <bool IsAnd>
class Group : public Condition {
 public:
  Group() = default;
  Group(const std::string& left, const std::string& right) { SetValue(left, right); }
  Group(const Condition& left, const Condition& right) {
    SetValue(left.GetText(), right.GetText());
  }
  bool SetValue(const std::string& left, const std::string& right) {
    if (left.empty() || right.empty()) return Refuse("Bad lvalue[%s] or rvalue[%s]", left, right);
    text += "(" + left + ") " + (IsAnd ? "AND" : "OR") + " (" + right + ")";
    return true;
  }
};

class IsNull : public Condition {
 public:
  IsNull() = default;
  IsNull(const std::string& left) { SetValue(left); }
  bool SetValue(const std::string& left) {
    if (left.empty()) return Refuse("Bad lvalue[%s]", left);
    text = left + " IS NULL";
    return false;
  }
};

class InFamily : public Condition {
 public:
  InFamily(const std::string& word) : keyword(word) {}
  template <typename Values>
  InFamily(const std::string& word, const std::string& left, const Values& values) : keyword(word) {
    SetValue(left, values);
  }
  bool IsValid() const override { return keyword == "IN" || keyword == "NOT IN"; }
  bool SetValue(const std::string& left, const std::vector<Value>& values) {
    if (!IsValid()) return Refuse("Bad keyword [%s]", keyword);
    if (left.empty()) return Refuse("Bad lvalue[%s]", left);
    text = left + " " + keyword + " ( ";
    for (size_t i = 0; i < values.size(); ++i) {
      if (!values[i].IsValid()) {
        text.clear();
        return Refuse("Invalid rvalue [%s]", values[i].ToFormatedValue());
      }
      text += (i == 0 ? "" : ",") + values[i].ToFormatedValue();
    }
    text += " )";
    return true;
  }
  bool SetValue(const std::string& left, const std::string& value) {
    if (!IsValid()) return Refuse("Bad keyword [%s]", keyword);
    if (left.empty() || value.empty()) return Refuse("Bad lvalue[%s] or value[%s]", left, value);
    text = left + " " + keyword + " ( " + value + " )";
    return true;
  }
  const std::string& GetKeyword() const { return keyword; }

 private:
  std::string keyword;
};

class In : public InFamily {
 public:
  In() : InFamily("IN") {}
  template <typename Values>
  In(const std::string& left, const Values& values) : InFamily("IN", left, values) {}
};

class NotIn : public InFamily {
 public:
  NotIn() : InFamily("NOT IN") {}
  template <typename Values>
  NotIn(const std::string& left, const Values& values) : InFamily("NOT IN", left, values) {}
};

}  // namespace Model

using ConditionTwin =
    Twin<std::shared_ptr<KeloDRCore::SqliteCondition>, std::shared_ptr<Model::Condition>>;

class Conditions {
 public:
  void Step() {
    switch (Draw::Below(8)) {
      case 0:
        return OfText();
      case 1:
        return Comparisons<KeloDRCore::SqliteEqual, Model::Comparison<'='>>();
      case 2:
        return Comparisons<KeloDRCore::SqliteNotEqual, Model::Comparison<'!'>>();
      case 3:
        return Groups<KeloDRCore::SqliteAnd, Model::Group<true>>();
      case 4:
        return Groups<KeloDRCore::SqliteOr, Model::Group<false>>();
      case 5:
        return IsNulls();
      case 6:
        return Lists<KeloDRCore::SqliteIn, Model::In>();
      default:
        if (Draw::Once(2)) return Lists<KeloDRCore::SqliteNotIn, Model::NotIn>();
        static const std::vector<std::string> words = {"IN", "NOT IN", "in", "", "IN ", "LIKE"};
        return Lists<KeloDRCore::SqliteInFamily, Model::InFamily>(Draw::Of(words));
    }
  }

  ConditionTwin& Any() { return pool[Draw::Below(pool.size())]; }

 private:
  // Makes a condition from `operands`, sets it to `others` after that, at times twice, and keeps
  // it. Both are functions that call their argument with the operands of a side.
  template <typename R, typename M, typename Operands, typename Others>
  void Make(const std::string& what, const Operands& operands, const Others& others) {
    Twin<std::shared_ptr<R>, std::shared_ptr<M>> made;
    Do("make a condition: " + what, [&](auto side) {
      operands(side, [&](const auto&... given) {
        side(made) = std::make_shared<std::decay_t<decltype(*side(made))>>(given...);
      });
      return Show(side(made)->IsValid(), side(made)->GetText());
    });
    for (size_t i = Draw::Below(3); i > 0; --i) {
      Do("SetValue: " + what, [&](auto side) {
        bool result = false;
        others(side, [&](const auto&... given) { result = side(made)->SetValue(given...); });
        return Show(result, side(made)->IsValid(), side(made)->GetText());
      });
    }
    Any() = {made.library, made.model};
  }

  void OfText() {
    const std::string text = Draw::Name();
    Twin<KeloDRCore::SqliteCondition, Model::Condition> made;
    Do("a condition of a text", [&](auto side) {
      if (text != "x") side(made) = text;
      return Show(side(made).IsValid(), side(made).GetText());
    });
    Any() = {std::make_shared<KeloDRCore::SqliteCondition>(made.library),
             std::make_shared<Model::Condition>(made.model)};
  }

  template <typename R, typename M>
  void Comparisons() {
    const std::string left = Draw::Name();
    ValueTwin value = DrawValue();
    const auto operands = [&](auto side, const auto& take) { take(left, side(value)); };
    if (Draw::Once(2)) return Make<R, M>("comparison", operands, operands);
    Make<R, M>(
        "comparison", [](auto, const auto& take) { take(); }, operands);
  }

  template <typename R, typename M>
  void Groups() {
    ConditionTwin left = Any();
    ConditionTwin right = Any();
    if (left.model->GetText().size() + right.model->GetText().size() > 4000)
      left = right = {std::make_shared<KeloDRCore::SqliteCondition>(),
                      std::make_shared<Model::Condition>()};
    const auto texts = [&](auto side, const auto& take) {
      take(side(left)->GetText(), side(right)->GetText());
    };
    const auto nothing = [](auto, const auto& take) { take(); };
    const auto conditions = [&](auto side, const auto& take) { take(*side(left), *side(right)); };
    switch (Draw::Below(3)) {
      case 0:
        return Make<R, M>("group of conditions", conditions, texts);
      case 1:
        return Make<R, M>("group of texts", texts, texts);
      default:
        return Make<R, M>("empty group", nothing, texts);
    }
  }

  void IsNulls() {
    const std::string left = Draw::Name();
    const auto operands = [&](auto, const auto& take) { take(left); };
    Make<KeloDRCore::SqliteIsNull, Model::IsNull>("IS NULL", operands, operands);
  }

  template <typename R, typename M, typename... Word>
  void Lists(const Word&... word) {
    const std::string left = Draw::Name();
    const std::string text = Draw::Text();
    Twin<std::vector<KeloDRCore::SqliteValue>, std::vector<Model::Value>> values;
    for (size_t i = Draw::Below(4); i > 0; --i) {
      const ValueTwin value = DrawValue();
      values.library.push_back(value.library);
      values.model.push_back(value.model);
    }
    const auto list = [&](auto side, const auto& take) { take(left, side(values)); };
    const auto verbatim = [&](auto, const auto& take) { take(left, text); };
    switch (Draw::Below(3)) {
      case 0:
        return Make<R, M>(
            "list", [&](auto, const auto& take) { take(word...); }, list);
      case 1:
        return Make<R, M>(
            "list", [&](auto side, const auto& take) { take(word..., left, side(values)); },
            verbatim);
      default:
        return Make<R, M>(
            "list", [&](auto, const auto& take) { take(word..., left, text); }, list);
    }
  }

  std::vector<ConditionTwin> pool = std::vector<ConditionTwin>(
      6, {std::make_shared<KeloDRCore::SqliteCondition>(), std::make_shared<Model::Condition>()});
};

#endif  // KELODRCORE_TESTS_MODEL_CONDITIONS_H_
