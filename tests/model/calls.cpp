// The calls of SQLite and of the system that are events: each is recorded, or answered with a
// fault, and passed on. The linker lets them stand before those of the libraries.

#include <dlfcn.h>
#include <sqlite3.h>
#include <unistd.h>

#include <cerrno>
#include <map>
#include <optional>
#include <set>

#include "model/twin.h"

namespace Calls {

Fault fault;
Ids ids;

namespace {

std::map<std::string, int> counts;  // of the calls of each kind in this operation
std::optional<int> injected;        // the code of the last call, if it was replaced
std::set<void*> texts;              // messages that are to be freed
int depth = 0;                      // above 0 within a call: what SQLite does itself is no event
std::vector<sqlite3*> holders;      // other connections
sqlite3* last[2];                   // the connections opened last

struct Inside {
  Inside() { ++depth; }
  ~Inside() { --depth; }
};

template <typename Function>
Function Real(const char* name) {
  return reinterpret_cast<Function>(dlsym(RTLD_NEXT, name));
}
#define REAL(name) static const auto real = Real<decltype(&(name))>(#name)

// Whether this call of `kind` is to fail.
bool Fails(const char* kind) {
  const int number = counts[kind]++;
  const bool fails =
      fault.kind == kind && number >= fault.first && number < fault.first + fault.count;
  injected = fails ? std::optional<int>(fault.code) : std::nullopt;
  return fails;
}

// What the faults put in place of SQLite's message.
std::string Message() { return "injected " + std::to_string(*injected); }

// The savepoint of many records has a name of nobody's concern.
std::string WithoutName(const std::string& sql) {
  for (const std::string verb : {"SAVEPOINT", "RELEASE"}) {
    if (sql.rfind(verb + " ", 0) == 0 && sql.find(';') == std::string::npos) return verb;
  }
  return sql;
}

// The model's file for a file of the library.
std::string OfTwin(const std::string& path) {
  const size_t at = path.find("/own/");
  return at == std::string::npos ? path : std::string(path).replace(at, 5, "/twin/");
}

}  // namespace

void Begin() {
  counts.clear();
  injected.reset();
}

std::string Place(const std::string& path) { return Trace::IsModel() ? OfTwin(path) : path; }

void Hold(const std::string& path) {
  const Inside inside;
  for (const std::string& place : {path, OfTwin(path)}) {
    if (access(place.c_str(), F_OK) != 0) continue;
    sqlite3* holder = nullptr;
    sqlite3_open(place.c_str(), &holder);
    sqlite3_exec(holder, "BEGIN EXCLUSIVE", nullptr, nullptr, nullptr);
    holders.push_back(holder);
  }
}

void LetGo() {
  const Inside inside;
  for (sqlite3* const holder : holders) sqlite3_close(holder);
  holders.clear();
}

void Sleep(unsigned int microseconds) {
  if (depth > 0) return;
  const bool isExpected = microseconds >= 1000000 && microseconds <= 2000000;
  Trace::Add("pause of " + (isExpected ? "1000 to 2000 ms" : std::to_string(microseconds) + " us"));
}

std::string DumpDatabase() {
  const Inside inside;
  sqlite3* const connection = last[Trace::IsModel() ? 1 : 0];
  if (connection == nullptr) return "closed";
  std::string dump = sqlite3_get_autocommit(connection) != 0 ? "free;" : "in a transaction;";
  const auto add = [](void* text, int count, char** values, char** /*names*/) {
    for (int i = 0; i < count; ++i) {
      *static_cast<std::string*>(text) += std::string(values[i] ? values[i] : "NULL") + ";";
    }
    return 0;
  };
  for (const char* sql :
       {"SELECT name, sql FROM sqlite_master", "SELECT * FROM t", "SELECT * FROM u"}) {
    sqlite3_exec(connection, sql, add, &dump, nullptr);
  }
  return dump;
}

}  // namespace Calls

using namespace Calls;  // NOLINT(google-build-using-namespace)

extern "C" {

int sqlite3_open(const char* path, sqlite3** out) {
  REAL(sqlite3_open);
  if (depth > 0) return real(path, out);
  const Inside inside;
  Trace::Add(std::string("open ") + path);
  const bool fails = Fails("open");
  *out = nullptr;
  if (fails && fault.code == SQLITE_OK) return SQLITE_OK;  // without a connection
  const int code = real(Place(path).c_str(), out);
  last[Trace::IsModel() ? 1 : 0] = *out;
  return fails ? fault.code : code;
}

int sqlite3_busy_timeout(sqlite3* connection, int length) {
  REAL(sqlite3_busy_timeout);
  if (depth > 0) return real(connection, length);
  Trace::Add("busy_timeout " + std::to_string(length));
  if (Fails("busy_timeout")) return fault.code;
  return connection != nullptr ? real(connection, length) : SQLITE_OK;
}

int sqlite3_exec(sqlite3* connection, const char* sql, int (*callback)(void*, int, char**, char**),
                 void* argument, char** error) {
  REAL(sqlite3_exec);
  if (depth > 0) return real(connection, sql, callback, argument, error);
  const Inside inside;
  const std::string text = sql;
  // Of an attempt that failed only the effect counts.
  if (text == "ROLLBACK" || text.rfind("ROLLBACK TO ", 0) == 0) {
    return real(connection, sql, callback, argument, error);
  }
  Trace::Add("exec " + WithoutName(text) + (callback != nullptr || argument != nullptr ? "!" : ""));
  const bool fails = Fails("exec");
  int code = SQLITE_OK;
  if (error != nullptr) *error = nullptr;
  if (!fails || fault.isReal) code = real(connection, sql, callback, argument, error);
  if (fails) {
    code = fault.code;
    if (error != nullptr && *error == nullptr && fault.first % 2 == 0 && code != SQLITE_OK) {
      *error = sqlite3_mprintf("%s", Message().c_str());
    }
  }
  if (error != nullptr && *error != nullptr) texts.insert(*error);
  return code;
}

void sqlite3_free(void* memory) {
  REAL(sqlite3_free);
  if (depth == 0 && texts.erase(memory) > 0) Trace::Add("free");
  real(memory);
}

const char* sqlite3_errmsg(sqlite3* connection) {
  REAL(sqlite3_errmsg);
  if (depth > 0 || !injected) return real(connection);
  static std::string message;
  message = Message();
  return message.c_str();
}

int sqlite3_prepare_v2(sqlite3* connection, const char* sql, int length, sqlite3_stmt** out,
                       const char** tail) {
  REAL(sqlite3_prepare_v2);
  if (depth > 0) return real(connection, sql, length, out, tail);
  const Inside inside;
  Trace::Add("prepare " + std::to_string(length) + " " + sql + (tail != nullptr ? "!" : ""));
  *out = nullptr;
  const bool fails = Fails("prepare");
  const int code = !fails || fault.isReal ? real(connection, sql, length, out, tail) : SQLITE_OK;
  return fails ? fault.code : code;
}

int sqlite3_step(sqlite3_stmt* statement) {
  REAL(sqlite3_step);
  if (depth > 0) return real(statement);
  const Inside inside;
  Trace::Add("step");
  const bool fails = Fails("step");
  const int code = !fails || fault.isReal ? real(statement) : SQLITE_OK;
  return fails ? fault.code : code;
}

const unsigned char* sqlite3_column_text(sqlite3_stmt* statement, int column) {
  REAL(sqlite3_column_text);
  if (depth == 0 && Fails("text")) return nullptr;
  return real(statement, column);
}

int sqlite3_finalize(sqlite3_stmt* statement) {
  REAL(sqlite3_finalize);
  if (depth > 0) return real(statement);
  const Inside inside;
  if (statement != nullptr) Trace::Add("finalize");
  return real(statement);
}

int sqlite3_close(sqlite3* connection) {
  REAL(sqlite3_close);
  if (depth > 0) return real(connection);
  const Inside inside;
  Trace::Add("close");
  if (last[Trace::IsModel() ? 1 : 0] == connection) last[Trace::IsModel() ? 1 : 0] = nullptr;
  return real(connection);
}

// What is written here outlives nothing: the disk is not waited for.
int fsync(int /*fd*/) { return 0; }
int fdatasync(int /*fd*/) { return 0; }

// The effective ids are those of a play: no right is needed to change them, and none is gained.

uid_t geteuid() noexcept { return ids.uid; }
gid_t getegid() noexcept { return ids.gid; }

static int SetId(const char* name, const unsigned int (&arguments)[3], unsigned int& id) {
  std::string call = name;
  for (const unsigned int argument : arguments) call += " " + std::to_string(int(argument));
  Trace::Add(call);
  if (Fails("setres")) {
    errno = EPERM;
    return -1;
  }
  id = arguments[1];
  return 0;
}

int setresuid(uid_t real, uid_t effective, uid_t saved) noexcept {
  return SetId("setresuid", {real, effective, saved}, ids.uid);
}
int setresgid(gid_t real, gid_t effective, gid_t saved) noexcept {
  return SetId("setresgid", {real, effective, saved}, ids.gid);
}

}  // extern "C"
