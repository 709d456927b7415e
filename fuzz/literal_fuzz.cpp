// A value as a literal, through SQLite, and back.

#include <kelodrcore/sqlite_db.h>

#include <limits>

#include "fuzz.h"

namespace {

using namespace KeloDRCore;

SqliteDB& Database() {
  static SqliteDB db(":memory:", 0, "fuzz");
  return db;
}

// The record of a query for one literal, named v.
SqliteValueList Select(const SqliteValue& value) {
  SqliteValueList record;
  Require(Database().SelectByCommand("SELECT " + value.ToFormatedValue() + " AS v", record),
          "a literal is SQL");
  return record;
}

template <typename T>
void CheckNumber(T number) {
  const SqliteValue value(number);
  Require(value.IsValid(), "a number is valid");
  const auto wide = static_cast<__int128>(number);
  const bool isRendered =
      wide >= std::numeric_limits<int>::min() && wide <= std::numeric_limits<unsigned int>::max();
  Require(value.ToFormatedValue().empty() != isRendered, "what fits 32 bits is rendered");
  if (!isRendered) return;
  long long back = 0;
  Require(Select(value).GetValue("v", back) && back == static_cast<long long>(number),
          "a number comes back");
}

void CheckText(std::string text) {
  text.resize(text.find('\0') != std::string::npos ? text.find('\0') : text.size());
  std::string back = "?";
  Require(Select(text).GetValue("v", back) && back == text, "a text comes back");
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  FuzzedDataProvider input(data, size);
  CheckNumber(input.ConsumeIntegral<int>());
  CheckNumber(input.ConsumeIntegral<unsigned int>());
  CheckNumber(input.ConsumeIntegral<long>());
  CheckNumber(input.ConsumeIntegral<unsigned long>());
  CheckNumber(input.ConsumeIntegral<long long>());
  CheckNumber(input.ConsumeIntegral<unsigned long long>());
  CheckText(input.ConsumeRemainingBytesAsString());
  return 0;
}
