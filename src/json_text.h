// JSON text: JsonCpp reads and writes it, with what JsonCpp leaves open settled.

#ifndef KELODRCORE_SRC_JSON_TEXT_H_
#define KELODRCORE_SRC_JSON_TEXT_H_

#include <json/value.h>

#include <string>

namespace KeloDRCore {

// A document may become a part of another one, as the cache wraps what it keeps. A file therefore
// holds a few levels more than a text: what was read can be written and read back.
enum class Origin { kText, kFile };

// See JsonValue::fromString and toString.
bool ParseJson(Json::Value& value, const std::string& text, Origin origin);
std::string WriteJson(const Json::Value& value);

}  // namespace KeloDRCore

#endif  // KELODRCORE_SRC_JSON_TEXT_H_
