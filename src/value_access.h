// What the library's own sources may do with values and records, and callers may not.

#ifndef KELODRCORE_SRC_VALUE_ACCESS_H_
#define KELODRCORE_SRC_VALUE_ACCESS_H_

#include <string>

#include "kelodrcore/sqlite_value.h"

namespace KeloDRCore {

class ValueAccess {
 public:
  // The payload; its JSON type is the value's type.
  static const Json::Value& Payload(const SqliteValue& value) { return value.value; }

  // Appends what `value.ToFormatedValue()` returns, without a text in between.
  static void AppendLiteral(std::string& text, const SqliteValue& value);

  // What `list.AddValue(field, SqliteValue(payload))` does, without a value in between. The name
  // must not be empty, and the value must be valid.
  template <typename T>
  static void SetField(SqliteValueList& list, const std::string& field, const T& payload) {
    // Fields mostly come in order: look at the end first.
    list.values.insert_or_assign(list.values.end(), field, payload);
  }
};

}  // namespace KeloDRCore

#endif  // KELODRCORE_SRC_VALUE_ACCESS_H_
