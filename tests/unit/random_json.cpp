#include "unit/random_json.h"

#include <cmath>
#include <cstring>

Json::Value RandomJson::Value(int depth) {
  switch (Below(depth > 0 ? 8 : 6)) {
    case 0:
      return {};
    case 1:
      return Below(2) == 0;
    case 2:
      return static_cast<Json::Int64>(Bits());
    case 3:
      return static_cast<Json::UInt64>(Bits() | (uint64_t{1} << 63));
    case 4:
      return Double();
    case 5:
      return Text();
    case 6:
      return Array(depth);
    default:
      return Object(depth);
  }
}

Json::Value RandomJson::Array(int depth) {
  Json::Value array(Json::arrayValue);
  for (unsigned size = Below(5); size > 0; --size) array.append(Value(depth - 1));
  return array;
}

Json::Value RandomJson::Object(int depth) {
  Json::Value object(Json::objectValue);
  for (unsigned size = Below(5); size > 0; --size) object[Text()] = Value(depth - 1);
  return object;
}

double RandomJson::Double() {
  double number;
  do {
    const uint64_t bits = Bits();
    static_assert(sizeof number == sizeof bits);
    std::memcpy(&number, &bits, sizeof number);
  } while (!std::isfinite(number));
  return number;
}

std::string RandomJson::Text() {
  std::string text;
  for (unsigned length = Below(12); length > 0; --length) text += static_cast<char>(Below(256));
  return text;
}
