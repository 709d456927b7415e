#include "kelodrcore/json_value.h"

#include <cstdio>
#include <memory>
#include <utility>

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
  const std::unique_ptr<std::FILE, int (*)(std::FILE*)> file(std::fopen(path.c_str(), "re"),
                                                             &std::fclose);
  if (!file) return false;
  std::string text;
  char chunk[4096];
  size_t size;
  while ((size = std::fread(chunk, 1, sizeof chunk, file.get())) > 0) text.append(chunk, size);
  return std::ferror(file.get()) == 0 && fromString(value, text);
}

}  // namespace KeloDRCore::JsonValue
