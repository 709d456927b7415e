// Compiles with the installed headers, links the installed library, and calls it.

#include <kelodrcore/err.h>
#include <kelodrcore/json_value.h>
#include <kelodrcore/sqlite_db.h>

#include <iostream>

int main() {
  KeloDRCore::SqliteDB db(":memory:", 0, "consumer");
  const bool isAlive = db.Exec("CREATE TABLE node (name TEXT)");
  const Json::Value name = KeloDRCore::ERR::ToString(KeloDRCore::ERR::BAD_PARAMETER);
  std::cout << KeloDRCore::JsonValue::toString(name) << ' ' << isAlive << '\n';
  return isAlive && name.asString() == "BAD_PARAMETER" ? 0 : 1;
}
