#include "kelodrcore/json_value.h"

#include <memory>

#include "document_file.h"

namespace KeloDRCore::JsonValue {
namespace {

Json::CharReaderBuilder MakeReaderBuilder() {
  Json::CharReaderBuilder builder;
  builder["collectComments"] = false;
  builder["failIfExtra"] = true;
  builder["stackLimit"] = 1000;
  return builder;
}

}  // namespace

std::string toString(const Json::Value& value) {
  static const Json::StreamWriterBuilder builder = [] {
    Json::StreamWriterBuilder made;
    made["indentation"] = "";
    made["commentStyle"] = "None";
    made["emitUTF8"] = true;
    return made;
  }();
  return Json::writeString(builder, value);
}

bool fromString(Json::Value& value, const std::string& text) {
  static const Json::CharReaderBuilder builder = MakeReaderBuilder();
  const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
  Json::Value parsed;
  try {
    if (!reader->parse(text.data(), text.data() + text.size(), &parsed, nullptr)) return false;
  } catch (const Json::Exception&) {
    return false;  // nested too deeply
  }
  value.swap(parsed);
  return true;
}

bool fromFile(Json::Value& value, const std::string& path) {
  std::string text;
  return ReadDocumentFile(path, text) && fromString(value, text);
}

bool toFile(const Json::Value& value, const std::string& path) {
  return ReplaceDocumentFile(path, toString(value));
}

}  // namespace KeloDRCore::JsonValue
