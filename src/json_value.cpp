#include "kelodrcore/json_value.h"

#include "document_file.h"
#include "json_text.h"

namespace KeloDRCore::JsonValue {

std::string toString(const Json::Value& value) { return WriteJson(value); }

bool fromString(Json::Value& value, const std::string& text) {
  return ParseJson(value, text, Origin::kText);
}

bool fromFile(Json::Value& value, const std::string& path) {
  return ReadDocument(value, path, Whose::kAnybodys);
}

bool toFile(const Json::Value& value, const std::string& path) {
  return ReplaceDocument(value, path, Whose::kAnybodys);
}

}  // namespace KeloDRCore::JsonValue
