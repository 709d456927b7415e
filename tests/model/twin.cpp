#include "model/twin.h"

#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <sstream>

namespace Draw {
namespace {
std::mt19937_64 generator;
}  // namespace

void Seed(unsigned long long seed) { generator.seed(seed); }
size_t Below(size_t count) { return static_cast<size_t>(generator() % count); }

std::string Name() {
  static const std::vector<std::string> odd = {"", "it's", "%s%n", "count", "two words"};
  static const std::vector<std::string> columns = {"a", "b", "id", "name", "x"};
  return Of(Once(6) ? odd : columns);
}

std::string Text() {
  static const std::vector<std::string> texts = {"a",
                                                 "",
                                                 "O'Brien's",
                                                 "''",
                                                 "%d %s",
                                                 "x\ny",
                                                 "\xc3\xa9",
                                                 "\xff\xfe",
                                                 "1",
                                                 "NULL",
                                                 "\"q\\\"",
                                                 "'",
                                                 " b ",
                                                 "\t\x01",
                                                 std::string("n\0z", 3),
                                                 std::string(3000, 'l') + "'"};
  return Of(texts);
}

Json::Value Document(int depth) {
  static const std::vector<std::string> keys = {"api",   "method", "version",   "success", "data",
                                                "error", "finish", "task_id",   "code",    "errors",
                                                "",      "id",     "additional"};
  Json::Value document;
  const size_t kind = depth == 0 ? Below(9) : Below(20);
  if (kind == 0) return document;
  if (kind < 3) return Once(2);
  if (kind < 5) return static_cast<int>(Below(300)) - 100;
  if (kind == 5) return Json::UInt64(1) << Below(64);
  if (kind == 6) return 0.5 + double(Below(3));
  if (kind < 9) return Text();
  if (kind == 9) {
    document = Json::arrayValue;
    for (size_t i = Below(3); i > 0; --i) document.append(Document(depth - 1));
    return document;
  }
  document = Json::objectValue;
  for (size_t i = Below(6); i > 0; --i) document[Of(keys)] = Document(depth - 1);
  if (Once(2)) document["success"] = !Once(4);
  return document;
}

}  // namespace Draw

std::string ToText(const Json::Value& document) {
  Json::StreamWriterBuilder builder;
  builder["indentation"] = "";
  builder["commentStyle"] = "None";
  builder["emitUTF8"] = true;
  return Json::writeString(builder, document);
}

namespace Trace {
namespace {

unsigned long count = 0;
bool isModel = false;
std::vector<std::string> events;

// The library's lines have been recorded apart: they come before what happens next.
void AddLines() {
  for (const LogLine& line : LogCapture::Take()) {
    std::ostringstream text;
    text << line;
    events.push_back(text.str());
  }
}

std::vector<std::string> Run(bool onModel, const std::function<std::string()>& act) {
  isModel = onModel;
  events.clear();
  Calls::Begin();
  try {
    Add("result: " + act());
  } catch (const Json::LogicError&) {
    Add("not to be converted");
  }
  AddLines();
  return events;
}

std::string At(const std::vector<std::string>& trace, size_t index) {
  return index < trace.size() ? trace[index] : "(nothing)";
}

}  // namespace

void Add(const std::string& event) {
  AddLines();
  events.push_back(event);
}

bool IsModel() { return isModel; }

void Log(LogLine (*level)(const std::string&, const std::string&, const std::string&),
         const char* file, const char* function, const char* format, ...) {
  va_list arguments;
  va_start(arguments, format);
  char* text = nullptr;
  if (vasprintf(&text, format, arguments) < 0) abort();
  va_end(arguments);
  std::ostringstream line;
  line << level(file, function, text);
  free(text);
  Add(line.str());
}

void Compare(const std::string& operation, const std::function<std::string()>& onLibrary,
             const std::function<std::string()>& onModel) {
  ++count;
  const Calls::Ids ids = Calls::ids;
  const std::vector<std::string> actual = Run(false, onLibrary);
  Calls::ids = ids;
  const std::vector<std::string> expected = Run(true, onModel);
  if (actual == expected) return;
  size_t i = 0;
  printf("operation %lu: %s\n", count, operation.c_str());
  if (!Calls::fault.kind.empty()) {
    printf("  fault: %s %d+%d answers %d%s\n", Calls::fault.kind.c_str(), Calls::fault.first,
           Calls::fault.count, Calls::fault.code, Calls::fault.isReal ? ", made" : "");
  }
  for (; At(actual, i) == At(expected, i); ++i) printf("  both:    %s\n", actual[i].c_str());
  printf("  library: %s\n  model:   %s\n", At(actual, i).c_str(), At(expected, i).c_str());
  exit(1);
}

unsigned long Count() { return count; }

}  // namespace Trace
