// Runs each operation twice, on the library and on a plain model of it, and compares what happens
// event by event: calls of SQLite, log lines, pauses, changes of the effective ids, and the result.

#ifndef KELODRCORE_TESTS_MODEL_TWIN_H_
#define KELODRCORE_TESTS_MODEL_TWIN_H_

#include <json/json.h>

#include <functional>
#include <memory>
#include <random>
#include <string>
#include <type_traits>
#include <utility>
#include <vector>

#include "support/log_capture.h"

// An object of the library and its model. The body of an operation is written once: it asks its
// argument `side` for the one of the two that it is to act on.
template <typename R, typename M>
struct Twin {
  R library;
  M model;
};

struct Library {
  template <typename R, typename M>
  R& operator()(Twin<R, M>& twin) const {
    return twin.library;
  }
};

struct Modelled {
  template <typename R, typename M>
  M& operator()(Twin<R, M>& twin) const {
    return twin.model;
  }
};

// Draws that depend on the seed only, the same on every machine.
namespace Draw {

void Seed(unsigned long long seed);
size_t Below(size_t count);
inline bool Once(size_t in) { return Below(in) == 0; }

template <typename T>
const T& Of(const std::vector<T>& choices) {
  return choices[Below(choices.size())];
}

// Names, values and other texts: plain ones, and what quoting and formatting could spoil.
std::string Name();
std::string Text();
// Any document; the members are those that web API messages have, and others.
Json::Value Document(int depth = 3);

}  // namespace Draw

// A document as compact JSON text.
std::string ToText(const Json::Value& document);

// What a result looks like in a trace.
inline std::string Show(bool value) { return value ? "true" : "false"; }
inline std::string Show(const std::string& value) { return "\"" + value + "\""; }
inline std::string Show(const char* value) { return value; }
inline std::string Show(const Json::Value& value) { return ToText(value); }
template <typename T>
std::enable_if_t<std::is_arithmetic_v<T> && !std::is_same_v<T, bool>, std::string> Show(T value) {
  return std::to_string(value);
}
template <typename T, typename... Rest>
std::string Show(const T& value, const Rest&... rest) {
  return Show(value) + " " + Show(rest...);
}

namespace Trace {

// Adds an event to the operation under way.
void Add(const std::string& event);

// Whether it is the model that acts.
bool IsModel();

// The model's lines.
[[gnu::format(printf, 4, 5)]] void Log(LogLine (*level)(const std::string&, const std::string&,
                                                        const std::string&),
                                       const char* file, const char* function, const char* format,
                                       ...);

// Runs `act` on both sides. Ends the program with a report when their traces differ.
void Compare(const std::string& operation, const std::function<std::string()>& onLibrary,
             const std::function<std::string()>& onModel);

// How many operations there were.
unsigned long Count();

}  // namespace Trace

// One operation. `body` takes a side and returns what is to be compared.
template <typename Body>
void Do(const std::string& operation, const Body& body) {
  Trace::Compare(
      operation, [&] { return body(Library{}); }, [&] { return body(Modelled{}); });
}

// The calls that this program makes instead of the system's and passes on: see calls.cpp.
namespace Calls {

// The calls of one kind, counted from 0 in each operation, that answer `code`.
struct Fault {
  std::string kind;  // "open", "busy_timeout", "exec", "prepare", "step", "text", "setres"
  int first = 0;
  int count = 0;
  int code = 0;
  bool isReal = false;  // the call is made all the same, only its result is replaced
};
extern Fault fault;

struct Ids {
  unsigned int uid = 0;
  unsigned int gid = 0;
};
extern Ids ids;  // what this process takes for its effective ids

// Lets another connection hold the database at `path`, of both sides, until it lets go of it.
void Hold(const std::string& path);
void LetGo();

// In place of a sleep: it takes no time, and is an event unless it is SQLite's own.
void Sleep(unsigned int microseconds);

void Begin();                                // an operation of one side
std::string Place(const std::string& path);  // where the file of this side is: each has its own
std::string DumpDatabase();                  // what the connection opened last holds

}  // namespace Calls

#endif  // KELODRCORE_TESTS_MODEL_TWIN_H_
