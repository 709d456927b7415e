// Database files with changed bytes, beside journals with changed bytes, under all operations.
//
// An input is a database (plain, with the journal of a killed writer, or with a write-ahead log),
// what is changed in its files, and the operations that run on it. SQLite is not what is tested:
// the handle is, with all that SQLite can answer.

#include <kelodrcore/sqlite_db.h>
#include <kelodrcore/sqlite_transaction.h>
#include <sqlite3.h>
#include <sys/resource.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <csignal>

#include "sandbox.h"

namespace {

using namespace KeloDRCore;

constexpr int kRows = 12;
const SqliteTableHandler kJob("job", "id INTEGER PRIMARY KEY, name TEXT UNIQUE, size INTEGER");

// The bytes of a database's files, none for a missing one.
constexpr const char* kEndings[] = {"", "-journal", "-wal"};
using Files = std::array<std::string, std::size(kEndings)>;

sqlite3* open = nullptr;  // the connection of the handle
int steps = 0;            // thousands of SQLite's instructions that the operation took

int CountStep(void* /*unused*/) {
  Require(++steps < 10000, "every operation ends");
  return 0;
}

// SQLite calls it for each connection.
int Watch(sqlite3* db, char** /*message*/, const sqlite3_api_routines* /*unused*/) {
  open = db;
  sqlite3_progress_handler(db, 1000, CountStep, nullptr);
  return SQLITE_OK;
}

bool IsInTransaction() { return open != nullptr && sqlite3_get_autocommit(open) == 0; }

std::string Path() {
  static const Sandbox sandbox;
  return sandbox.Path() + "/db";
}

Files ReadFiles() {
  return {BytesOf(Path()), BytesOf(Path() + "-journal"), BytesOf(Path() + "-wal")};
}

void WriteFiles(const Files& files) {
  unlink((Path() + "-shm").c_str());
  for (size_t i = 0; i < files.size(); ++i) {
    unlink((Path() + kEndings[i]).c_str());
    if (i == 0 || !files[i].empty()) PutFile(Path() + kEndings[i], files[i]);
  }
}

SqliteValueList MakeRecord(const std::string& name, int size) {
  SqliteValueList record;
  record.AddValue("name", name);
  record.AddValue("size", size);
  return record;
}

// The files of a database in which `killed` was running when its process was killed.
Files MakeFiles(const std::string& mode, const std::string& killed) {
  WriteFiles({});
  SqliteDB db(Path(), 0, "fuzz");
  Require(db.Exec("PRAGMA page_size=512; PRAGMA journal_mode=" + mode), "a mode is set");
  std::vector<SqliteValueList> records;
  for (int i = 0; i < kRows; ++i)
    records.push_back(MakeRecord("job " + std::string(50, char('a' + i)), i));
  Require(db.InsertRecords(kJob, records), "the rows are there");
  Require(db.Exec("PRAGMA cache_size=1; BEGIN IMMEDIATE; " + killed), "a writer is at work");
  return ReadFiles();
}

const Files& TakeFiles(FuzzedDataProvider& input) {
  static const Files files[] = {
      MakeFiles("DELETE", ""),
      MakeFiles("DELETE", "UPDATE job SET name = name || 'y'; DELETE FROM job WHERE id > 3"),
      MakeFiles("WAL", "")};
  return files[input.ConsumeIntegralInRange(0, 2)];
}

void Change(FuzzedDataProvider& input, std::string& bytes) {
  const int change = input.ConsumeIntegralInRange(0, 4);
  if (change == 1) bytes = input.ConsumeRandomLengthString();
  if (change == 2) bytes.resize(input.ConsumeIntegralInRange<size_t>(0, bytes.size()));
  if (change < 3 || bytes.empty()) return;
  const size_t last = change == 3 ? std::min<size_t>(bytes.size(), 128) - 1 : bytes.size() - 1;
  for (int i = input.ConsumeIntegralInRange(1, 8); i > 0; --i) {
    bytes[input.ConsumeIntegralInRange<size_t>(0, last)] = input.ConsumeIntegral<char>();
  }
}

InsertCommand InsertionOf(const SqliteValueList& record) {
  InsertCommand command;
  command.SetTable(kJob);
  command.SetFieldValues(record);
  return command;
}

UpdateCommand UpdateTo(const SqliteValueList& record) {
  UpdateCommand command;
  command.SetTable(kJob);
  command.SetFieldValues(record);
  command.SetCondition(SqliteNotEqual("id", 1));
  return command;
}

SelectCommand TakeSelect(FuzzedDataProvider& input) {
  SelectCommand select;
  select.SetTable(kJob);
  select.AddField("id");
  select.AddField("name");
  if (input.ConsumeBool()) select.AddOrderField("name");
  if (input.ConsumeBool()) select.SetCondition(SqliteEqual("id", input.ConsumeIntegral<int>()));
  return select;
}

bool RunText(FuzzedDataProvider& input, SqliteDB& db) {
  return db.Exec(input.PickValueInArray({
      "BEGIN",
      "SAVEPOINT one",
      "COMMIT",
      "ROLLBACK",
      "BEGIN; UPDATE job SET size = size + 1; DROP INDEX missing",
      "INSERT INTO job (name) SELECT name || 'z' FROM job; SELECT * FROM job",
      "VACUUM",
      "REINDEX",
      "DROP TABLE job",
      "PRAGMA journal_mode=WAL",
      "PRAGMA journal_mode=DELETE",
      "PRAGMA wal_checkpoint",
  }));
}

bool RunTransaction(FuzzedDataProvider& input, SqliteDB& db) {
  SqliteTransaction transaction(db);
  if (!transaction.IsOpen()) return false;
  db.InsertRecord(InsertionOf(MakeRecord("in a transaction", 1)));
  return !transaction.IsOpen() || input.ConsumeBool() || transaction.Commit();
}

// By the connection alone, so that the handle's error stays; -1 when the table cannot be read.
int CountRows() {
  int count = -1;
  const auto take = [](void* out, int, char** values, char**) {
    *static_cast<int*>(out) = std::stoi(values[0]);
    return 0;
  };
  if (open != nullptr)
    sqlite3_exec(open, "SELECT count(*) FROM job NOT INDEXED", take, &count, nullptr);
  return count;
}

bool Insert(FuzzedDataProvider& input, SqliteDB& db, bool replaces) {
  std::vector<SqliteValueList> records;
  for (int i = input.ConsumeIntegralInRange(1, 3); i > 0; --i) {
    records.push_back(MakeRecord(std::string(input.ConsumeIntegral<uint8_t>(), 'n'), i));
  }
  const bool wasInTransaction = IsInTransaction();
  const int before = CountRows();
  const bool isDone =
      replaces ? db.InsertOrReplaceRecords(kJob, records) : db.InsertRecords(kJob, records);
  if (isDone || before < 0 || wasInTransaction != IsInTransaction()) return isDone;
  Require(CountRows() == before, "all records are inserted or none");
  return false;
}

bool Operate(FuzzedDataProvider& input, SqliteDB& db) {
  SqliteValueList record = MakeRecord("new", input.ConsumeIntegral<uint8_t>());
  std::vector<SqliteValueList> records;
  int count = input.ConsumeIntegralInRange(0, 3);
  switch (input.ConsumeIntegralInRange(0, 13)) {
    case 0:
      return db.InsertRecord(InsertionOf(record));
    case 1:
      return db.UpdateRecord(UpdateTo(record));
    case 2:
      return db.DeleteRecord("size > 5", kJob);
    case 3:
      return db.DeleteAllRecords(kJob);
    case 4:
      return db.SelectRecord(TakeSelect(input), record);
    case 5:
      return db.SelectRecords(TakeSelect(input), records);
    case 6:
      return db.SelectEach(TakeSelect(input), [&](const auto&) { return count-- > 0; });
    case 7:
      return db.IsTableExisted("job") || db.GetErr()["err_code"] == 0;
    case 8:
      return db.GetCount(kJob, count);
    case 9:
      return db.CreateTable({"other", "a"});
    case 10:
      return RunTransaction(input, db);
    case 11:
      return Insert(input, db, true);
    case 12:
      return Insert(input, db, false);
    default:
      return RunText(input, db);
  }
}

void CheckOperation(FuzzedDataProvider& input, SqliteDB& db) {
  const bool wasInTransaction = IsInTransaction();
  steps = 0;
  const bool answer = Operate(input, db);
  const Json::Value err = db.GetErr();
  const int code = err["err_code"].asInt();
  if (answer) return;
  Require(code == 404 || code == 405, "a failure has its code");
  Require(err["err_msg"]["sqlite_errcode"].asInt() > 0, "a failure has SQLite's code");
  Require(wasInTransaction || !IsInTransaction(), "a failure leaves no transaction open");
}

// What SQLite takes for no database. A single byte is an empty one.
bool IsForeign(const Files& files) {
  return files[0].size() > 1 && files[0].rfind("SQLite format 3", 0) != 0 && files[1].empty() &&
         files[2].empty();
}

int LowestDescriptor() {
  const int fd = dup(STDERR_FILENO);
  close(fd);
  return fd;
}

// A journal may tell of a database of terabytes. libFuzzer would end the program for it.
bool Prepare() {
  const rlimit limit = {1 << 24, 1 << 24};
  return signal(SIGXFSZ, SIG_IGN) != SIG_ERR && setrlimit(RLIMIT_FSIZE, &limit) == 0 &&
         sqlite3_auto_extension(reinterpret_cast<void (*)()>(Watch)) == SQLITE_OK;
}

}  // namespace

// In place of SQLite's: it would refuse to close a connection whose statements are not finalized.
extern "C" int sqlite3_close(sqlite3* db) {
  Require(sqlite3_next_stmt(db, nullptr) == nullptr, "no statement is left");
  if (db == open) open = nullptr;
  return sqlite3_close_v2(db);
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  static const bool isPrepared = Prepare();
  Require(isPrepared, "files stay small and connections are watched");
  FuzzedDataProvider input(data, size);
  const Files& whole = TakeFiles(input);
  Files files = whole;
  for (std::string& bytes : files) Change(input, bytes);
  WriteFiles(files);
  const int descriptor = LowestDescriptor();
  const sqlite3_int64 memory = sqlite3_memory_used();
  {
    SqliteDB db(Path(), 0, "fuzz");
    int count = -1;
    if (files == whole)
      Require(db.GetCount(kJob, count) && count == kRows, "what was written is there");
    while (input.remaining_bytes() > 0) CheckOperation(input, db);
  }
  Require(sqlite3_memory_used() == memory, "SQLite's memory is given back");
  Require(LowestDescriptor() == descriptor, "no descriptor is left");
  if (IsForeign(files)) Require(BytesOf(Path()) == files[0], "what is no database is left alone");
  return 0;
}
