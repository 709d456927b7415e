#include <algorithm>

#include "kelodrcore/sqlite_transaction.h"
#include "storm/soak.h"

using KeloDRCore::InsertCommand;
using KeloDRCore::SelectCommand;
using KeloDRCore::SqliteTableHandler;
using KeloDRCore::SqliteTransaction;
using KeloDRCore::SqliteValueList;

namespace {

constexpr unsigned int kRetries = 1000;
constexpr int kParts = 4;       // of a group that is more than one row
constexpr int kMostKept = 100;  // groups, before the older half is deleted

const SqliteTableHandler& Table() {
  static const SqliteTableHandler table(
      "t", "team INTEGER, part INTEGER, size INTEGER, filler TEXT, UNIQUE(team, part)");
  return table;
}

std::string Filler(int group, int part) {
  return std::string(static_cast<size_t>((group * 37 + part * 11) % 1500), 'x');
}

SqliteValueList Row(int group, int part, int size) {
  SqliteValueList row;
  row.AddValue("team", group);
  row.AddValue("part", part);
  row.AddValue("size", size);
  row.AddValue("filler", Filler(group, part));
  return row;
}

}  // namespace

Rows::Rows(const Settings& settings, Shared& state, std::mt19937& draws)
    : shared(state), random(draws), db(settings.dir + "/base", kRetries, "") {}

void Rows::Insert() {
  if (shared.nextGroup - shared.oldestGroup > kMostKept) return Trim();
  const int group = shared.nextGroup++;
  if (group >= kMostGroups) return Expect(false, "too many groups");
  const Kind kind = static_cast<Kind>(Draw(random, kRollback + 1));
  const Operation operation(shared, kind);
  const bool isDone = kind == kRow           ? InsertRow(group, 0, 1)
                      : kind == kBulk        ? InsertBulk(group)
                      : kind == kTransaction ? InsertTransaction(group)
                                             : InsertAndRollBack(group);
  if (Draw(random, 3) == 0) db.Close();
  // Somebody may have seen the group and deleted it already.
  Group unknown = Group::kUnknown;
  if (operation.End(isDone)) {
    shared.groups[group].compare_exchange_strong(unknown,
                                                 kind == kRollback ? Group::kGone : Group::kThere);
  }
}

bool Rows::InsertRow(int group, int part, int size) {
  InsertCommand insert;
  insert.SetTable(Table());
  insert.SetFieldValues(Row(group, part, size));
  return db.InsertRecord(insert);
}

bool Rows::InsertBulk(int group) {
  std::vector<SqliteValueList> rows;
  for (int part = 0; part < kParts; ++part) rows.push_back(Row(group, part, kParts));
  return db.InsertRecords(Table(), rows);
}

// All but the last, in a transaction that is open.
bool Rows::InsertFirstParts(int group) {
  return InsertRow(group, 0, kParts) &&
         db.InsertRecords(Table(), {Row(group, 1, kParts), Row(group, 2, kParts)});
}

bool Rows::InsertTransaction(int group) {
  SqliteTransaction transaction(db);
  return transaction.IsOpen() && InsertFirstParts(group) && transaction.IsOpen() &&
         InsertRow(group, kParts - 1, kParts) && transaction.Commit();
}

bool Rows::InsertAndRollBack(int group) {
  SqliteTransaction transaction(db);
  const bool isDone = transaction.IsOpen() && InsertFirstParts(group);
  if (Draw(random, 3) == 0) db.Close();
  return isDone;
}

bool Rows::Select(int newest, std::map<int, Found>& found) {
  const int next = shared.nextGroup;
  const int first = std::max(0, next - newest);
  const std::vector<Group> known(shared.groups + first, shared.groups + next);
  SelectCommand select;
  select.SetTable(Table());
  select.SelectAll();
  const bool isRead = db.SelectEach(select, [&](const SqliteValueList& row) {
    int group = -1;
    int part = -1;
    std::string filler;
    const bool isWhole = row.GetValue("team", group) && row.GetValue("part", part) &&
                         row.GetValue("size", found[group].size) && row.GetValue("filler", filler);
    Expect(isWhole && filler == Filler(group, part), "half a row");
    ++found[group].rows;
    return true;
  });
  if (isRead) Compare(first, known, found);
  return isRead;
}

// `known` is from before `found`.
void Rows::Compare(int first, const std::vector<Group>& known,
                   const std::map<int, Found>& found) const {
  for (const auto& [group, rows] : found) {
    Expect(rows.rows == rows.size, "a part of a group");
  }
  for (size_t i = 0; i < known.size(); ++i) {
    const int group = first + static_cast<int>(i);
    const bool isFound = found.count(group) == 1;
    const bool isKept = known[i] == Group::kThere && shared.groups[group] == Group::kThere;
    Expect(isFound || !isKept, "an acknowledged insert is lost");
    Expect(!isFound || known[i] != Group::kGone, "a group that was deleted is back");
  }
}

void Rows::Check(int newest) {
  const Operation operation(shared, kSelect);
  std::map<int, Found> found;
  operation.End(Select(newest, found));
}

void Rows::Trim() {
  const Operation operation(shared, kDelete);
  const int kept = shared.nextGroup - kMostKept / 2;
  SqliteTransaction transaction(db);
  std::map<int, Found> found;
  const bool isChecked = transaction.IsOpen() && Select(kRecentGroups, found);
  found.erase(found.lower_bound(kept), found.end());
  if (isChecked) {
    for (const auto& [group, rows] : found) shared.groups[group] = Group::kLeaving;
  }
  const std::string condition = "team < " + std::to_string(kept);
  const bool isDone = isChecked && db.DeleteRecord(condition, Table()) && transaction.Commit();
  if (!operation.End(isDone)) return;
  for (const auto& [group, rows] : found) shared.groups[group] = Group::kGone;
  Raise(shared.oldestGroup, kept);
}

bool Rows::IsSound() {
  std::vector<SqliteValueList> rows;
  return db.SelectByCommand("PRAGMA integrity_check", rows) && rows.size() == 1 &&
         rows[0].ToStr() == "integrity_check:'ok'";
}
