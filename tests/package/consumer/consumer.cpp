// Compiles with the installed headers, links the installed library, and calls it.

#include <json/json.h>
#include <kelodrcore/err.h>

#include <iostream>

int main() {
  const Json::Value name = KeloDRCore::ERR::ToString(KeloDRCore::ERR::BAD_PARAMETER);
  std::cout << name.asString() << '\n';
  return name.asString() == "BAD_PARAMETER" ? 0 : 1;
}
