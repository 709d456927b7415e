#include "kelodrcore/request.h"

#include <string_view>
#include <utility>
#include <vector>

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

Request::Request(const std::string& apiName, int apiVersion, const std::string& methodName,
                 const Json::Value& parameters)
    : version(apiVersion), api(apiName), method(methodName), params(parameters) {}

Request::Request(const Json::Value& request) { setRequest(request); }

Request::Request(Json::Value&& request) : params(std::move(request)) { takeEnvelope(); }

Request::~Request() = default;

void Request::setAPI(const std::string& value) { api = value; }

void Request::setMethod(const std::string& value) { method = value; }

void Request::setVersion(int value) { version = value; }

void Request::setTimeout(int seconds) { timeout = seconds; }

void Request::setEncryptRequired(bool required) { encryptRequired = required; }

void Request::setUploadFile(const UploadFileDescription& file) { uploadFile = file; }

bool Request::isValid() const { return !api.empty() && !method.empty() && version >= 1; }

bool Request::isValidKey(const std::string& key) {
  const std::string_view name(key);
  return name != kApi && name != kMethod && name != kVersion;
}

bool Request::addParam(const std::string& key, const Json::Value& value) {
  // Copied before the look-up adds the member: `value` may be params itself.
  return addParam(key, Json::Value(value));
}

bool Request::addParam(const std::string& key, Json::Value&& value) {
  if (!isValidKey(key) || !CanHoldMembers(params)) return false;
  Json::Value& param = params[key];
  param = Json::Value(std::move(value));  // a plain move assignment would swap
  return true;
}

bool Request::addParam(const Json::Value& members) {
  if (!CanHoldMembers(params)) return false;
  if (!members.isObject()) return true;
  // `members` may lie inside a member that it replaces, so what may hold it outlives the walk.
  std::vector<Json::Value> replaced;
  const auto end = members.end();
  for (auto member = members.begin(); member != end; ++member) {
    const std::string key = member.name();
    if (!isValidKey(key)) continue;
    Json::Value value(*member);
    params[key].swap(value);
    if (value.isObject() || value.isArray()) replaced.push_back(std::move(value));
  }
  return true;
}

void Request::setRequest(const Json::Value& request) {
  params = request;
  takeEnvelope();
}

void Request::takeEnvelope() {
  if (!params.isObject()) return;
  MoveText(params, kApi, api);
  MoveText(params, kMethod, method);
  MoveInt(params, kVersion, version);
}

Json::Value Request::makeJson(Json::Value members) const {
  Json::Value json = CanHoldMembers(members) ? std::move(members) : Json::Value(Json::objectValue);
  json[kApi] = api;
  json[kMethod] = method;
  json[kVersion] = version;
  return json;
}

Json::Value Request::toJson() const { return makeJson(params); }

Json::Value Request::takeJson() { return makeJson(std::move(params)); }

std::string Request::toStr() const { return api + "/" + method + "/" + std::to_string(version); }

void Request::clear() {
  version = kNoVersion;
  timeout = kDefaultTimeout;
  api.clear();
  method.clear();
  // Json::Value::clear() throws on a number or a text.
  if (!params.isObject()) params = Json::Value();
  params.clear();
  uploadFile = UploadFileDescription();
}

}  // namespace KeloDRCore
