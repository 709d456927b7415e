// JSON text read and written.

#include <locale>

#include "growth/operations.h"
#include "growth/texts.h"
#include "kelodrcore/json_value.h"

namespace {

using KeloDRCore::JsonValue::fromString;
using KeloDRCore::JsonValue::toString;

std::string NumbersText(size_t count) { return "[" + Repeated(count, "1.25,") + "1]"; }

std::string QuotedText(size_t count, const std::string& unit) {
  return '"' + Repeated(count, unit) + '"';
}

std::string OneNameText(size_t count) { return "{" + Repeated(count, R"("a": 1,)") + R"("a":1})"; }

std::string LinesText(size_t count) { return "[" + Repeated(count, " // a comment\n\n\t") + "1]"; }

Work Parsing(const std::string& text) {
  return [text] {
    Json::Value value;
    Require(fromString(value, text), "fromString");
  };
}

Work Printing(const std::string& text) {
  Json::Value value;
  Require(fromString(value, text), "fromString");
  return [value] { Require(!toString(value).empty(), "toString"); };
}

Work Refusing(const std::string& text) {
  return [text] {
    Json::Value value;
    Require(!fromString(value, text), "refusing");
  };
}

// A locale with another decimal point: the library takes the points out of the numbers.
Work WithComma(const Work& work) {
  class Comma : public std::numpunct<char> {
    char do_decimal_point() const override { return ','; }
  };
  return [work] {
    const std::locale before = std::locale::global(std::locale(std::locale(), new Comma));
    work();
    std::locale::global(before);
  };
}

}  // namespace

void AddDocuments(std::vector<Operation>& operations) {
  struct Document {
    const char* name;
    size_t size;
    std::function<std::string(size_t)> text;
    bool isKept = true;  // it grows the value, too
  };
  const Document documents[] = {
      {"numbers", 256, NumbersText},
      {"members in no order", 128, MembersText},
      {"a text", 4096, [](size_t count) { return QuotedText(count, "x"); }},
      {"a text of quotes", 1024, [](size_t count) { return QuotedText(count, "\\\""); }},
      {"a text of escapes", 1024, [](size_t count) { return QuotedText(count, "\\u0001\\t"); }},
      {"a text not in ASCII", 1024, [](size_t count) { return QuotedText(count, "\xC3\xA9"); }},
      {"one name again and again", 1024, OneNameText, false},
      {"blank lines and comments", 256, LinesText, false},
  };
  for (const auto& [name, size, text, isKept] : documents) {
    const std::string of = std::string(" of ") + name;
    const auto make = text;
    operations.push_back({"fromString" + of, size, [make](size_t n) { return Parsing(make(n)); }});
    if (isKept)
      operations.push_back({"toString" + of, size, [make](size_t n) { return Printing(make(n)); }});
    operations.push_back({"fromString in a locale with a comma" + of, size,
                          [make](size_t n) { return WithComma(Parsing(make(n))); }});
  }
  operations.push_back({"fromString of too many levels", 2048,
                        [](size_t n) { return Refusing(Repeated(n + 2048, "[")); },
                        Growth::kConstant, Growth::kConstant});
  operations.push_back({"fromString of comments without an end", 256,
                        [](size_t n) { return Refusing(Repeated(n, "/*x")); }});
  operations.push_back({"fromString of such comments in a locale with a comma", 2048,
                        [](size_t n) { return WithComma(Refusing(Repeated(n, "/*x"))); }});
}
