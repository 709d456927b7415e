#include "kelodrcore/request.h"

#include <string_view>
#include <utility>

namespace KeloDRCore {
namespace {

constexpr char kApi[] = "api";
constexpr char kMethod[] = "method";
constexpr char kVersion[] = "version";

// JsonCpp throws on a member access to any other type.
bool CanHoldMembers(const Json::Value& value) { return value.isNull() || value.isObject(); }

void MoveText(Json::Value& object, const char* key, std::string& field) {
  const Json::Value& member = std::as_const(object)[key];
  if (!member.isString()) return;
  field = member.asString();
  object.removeMember(key);
}

void MoveInt(Json::Value& object, const char* key, int& field) {
  const Json::Value& member = std::as_const(object)[key];
  if (!member.isInt()) return;
  field = member.asInt();
  object.removeMember(key);
}

}  // namespace

Request::Request() = default;

Request::Request(const std::string& newApi, int newVersion, const std::string& newMethod,
                 const Json::Value& newParams)
    : version(newVersion), api(newApi), method(newMethod), params(newParams) {}

Request::Request(const Json::Value& request) { setRequest(request); }

Request::~Request() = default;

void Request::setAPI(const std::string& newApi) { api = newApi; }

void Request::setMethod(const std::string& newMethod) { method = newMethod; }

void Request::setVersion(int newVersion) { version = newVersion; }

void Request::setTimeout(int newTimeout) { timeout = newTimeout; }

void Request::setEncryptRequired(bool newEncryptRequired) { encryptRequired = newEncryptRequired; }

void Request::setUploadFile(const UploadFileDescription& newUploadFile) {
  uploadFile = newUploadFile;
}

bool Request::isValid() const { return !api.empty() && !method.empty() && version >= 1; }

bool Request::isValidKey(const std::string& key) {
  const std::string_view name(key);
  return name != kApi && name != kMethod && name != kVersion;
}

bool Request::addParam(const std::string& key, const Json::Value& value) {
  if (!isValidKey(key) || !CanHoldMembers(params)) return false;
  params[key] = Json::Value(value);  // copied first: it may be part of what it replaces
  return true;
}

bool Request::addParam(const Json::Value& members) {
  Json::Value copies = members;  // they may be part of the parameters that change below
  for (auto copy = copies.begin(); copy != copies.end(); ++copy) {
    const std::string key = copy.key().asString();
    if (!isValidKey(key)) continue;
    if (!CanHoldMembers(params)) return false;
    params[key].swap(*copy);
  }
  return true;
}

void Request::setRequest(const Json::Value& request) {
  params = request;
  if (!params.isObject()) return;
  MoveText(params, kApi, api);
  MoveText(params, kMethod, method);
  MoveInt(params, kVersion, version);
}

Json::Value Request::toJson() const {
  Json::Value json = CanHoldMembers(params) ? params : Json::Value(Json::objectValue);
  json[kApi] = api;
  json[kMethod] = method;
  json[kVersion] = version;
  return json;
}

std::string Request::toStr() const { return api + "/" + method + "/" + std::to_string(version); }

void Request::clear() {
  version = kNoVersion;
  timeout = kDefaultTimeout;
  api.clear();
  method.clear();
  // Json::Value::clear() throws on a number or a text.
  if (!params.isObject() && !params.isArray()) params = Json::Value();
  params.clear();
  uploadFile = UploadFileDescription();
}

}  // namespace KeloDRCore
