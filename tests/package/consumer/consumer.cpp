// Compiles with the installed headers, links the installed library, and calls it.

#include <kelodrcore/err.h>
#include <kelodrcore/json_value.h>
#include <kelodrcore/sqlite_db.h>
#include <kelodrcore/version.h>

#include <iostream>
#include <string>

int main(int argc, char** argv) {
  const std::string numbers = std::to_string(KELODRCORE_VERSION_MAJOR) + '.' +
                              std::to_string(KELODRCORE_VERSION_MINOR) + '.' +
                              std::to_string(KELODRCORE_VERSION_PATCH);
  const std::string wanted = argc > 1 ? argv[1] : KELODRCORE_VERSION;
  if (numbers != wanted || wanted != KELODRCORE_VERSION) {
    std::cerr << "version " << numbers << ", " << KELODRCORE_VERSION << ", not " << wanted << '\n';
    return 1;
  }

  KeloDRCore::SqliteDB db(":memory:", 0, "consumer");
  const bool isAlive = db.Exec("CREATE TABLE node (name TEXT)");
  const Json::Value name = KeloDRCore::ERR::ToString(KeloDRCore::ERR::BAD_PARAMETER);
  std::cout << KeloDRCore::JsonValue::toString(name) << ' ' << isAlive << '\n';
  return isAlive && name.asString() == "BAD_PARAMETER" ? 0 : 1;
}
