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
    // Two sources have a copy of this for texts, and the linker keeps one of them: no test reaches
    // the other's ways out for exceptions.
    // Fields mostly come in order: look at the end first.
    const auto place = values.try_emplace(values.end(), field, payload);  // GCOVR_EXCL_BR_LINE
    if (values.size() != size) return;
    place->second = SqliteValue(payload);  // GCOVR_EXCL_BR_LINE
  }
};

}  // namespace KeloDRCore

#endif  // KELODRCORE_SRC_FIELD_SETTER_H_
