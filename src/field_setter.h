// Sets fields of a record without a value in between.

#ifndef KELODRCORE_SRC_FIELD_SETTER_H_
#define KELODRCORE_SRC_FIELD_SETTER_H_

#include <string>

#include "kelodrcore/sqlite_value.h"

namespace KeloDRCore {

class FieldSetter {
 public:
  // What SqliteValueList::AddValue does with SqliteValue(payload), which must be valid, and a name,
  // which must not be empty.
  template <typename Payload>
  static void Set(SqliteValueList& list, const std::string& field, const Payload& payload) {
    auto& values = list.values;
    const size_t size = values.size();
    // Fields mostly come in order: look at the end first.
    const auto place = values.try_emplace(values.end(), field, payload);
    if (values.size() == size) place->second = SqliteValue(payload);
  }
};

}  // namespace KeloDRCore

#endif  // KELODRCORE_SRC_FIELD_SETTER_H_
