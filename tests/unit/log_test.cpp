// The library's log lines as a compiler without __FILE_NAME__ makes them: this file is compiled
// without the macro.

#include "log.h"

#include <string_view>

#include "support/clean_test.h"

namespace {

using LogTest = CleanTest;
using KeloDRCore::BaseName;

TEST_F(LogTest, TheBaseNameStandsBehindTheLastSlash) {
  static_assert(BaseName("/home/user/src/file.cpp") == std::string_view("file.cpp"));
  static_assert(BaseName("file.cpp") == std::string_view("file.cpp"));
  static_assert(BaseName("../src/file.cpp") == std::string_view("file.cpp"));
  static_assert(BaseName("src/") == std::string_view());
  static_assert(BaseName("") == std::string_view());
}

#ifdef __FILE_NAME__
#error "the macro is there"
#endif

TEST_F(LogTest, ALineNamesItsSourceWithoutTheDirectory) {
  KELODR_LOG(WARN, "Function", "value [%d]", 7);
  ExpectLog({Warn("log_test.cpp", "Function", "value [7]")});
}

}  // namespace
