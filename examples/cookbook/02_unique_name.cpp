#include <kelodrcore/err.h>
#include <kelodrcore/json_value.h>
#include <kelodrcore/sqlite_db.h>

#include <iostream>

using namespace KeloDRCore;

const SqliteTableHandler kPlans("plan", "name TEXT PRIMARY KEY");
constexpr int kConstraint = 19;  // SQLITE_CONSTRAINT of sqlite3.h

bool IsTaken(const Json::Value& err) {
  return err["err_code"] == ERR::ERR_DATABASE_OPERATION &&
         err["err_msg"]["sqlite_errcode"] == kConstraint;
}

// Stores `wanted`, or `wanted` with the first number that makes it new. Empty when the database
// failed for another reason.
std::string AddPlan(SqliteDB& db, const std::string& wanted) {
  std::string name = wanted;
  for (int number = 2;; ++number) {
    InsertCommand insert;
    insert.SetTable(kPlans);
    insert.AddFieldValue("name", name);
    if (db.InsertRecord(insert)) return name;
    if (!IsTaken(db.GetErr())) return "";
    name = wanted + "-" + std::to_string(number);
  }
}

int main() {
  SqliteDB db("plans.db", 3, "cookbook");
  for (int i = 0; i < 3; ++i) {
    const std::string name = AddPlan(db, "nightly");
    if (name.empty()) {
      std::cerr << JsonValue::toString(db.GetErr()) << '\n';
      return 1;
    }
    std::cout << name << '\n';
  }
}
