#include "kelodrcore/response.h"

#include <cstring>

#include "kelodrcore/json_value.h"

namespace KeloDRCore {
namespace {

// Null pointers on either side find nothing, so that look-ups chain. JsonCpp throws when asked for
// a member of a text, a number or an array.
const Json::Value* FindMember(const Json::Value* object, const char* name) {
  if (object == nullptr || name == nullptr || !object->isObject()) return nullptr;
  return object->find(name, name + std::strlen(name));
}

const Json::Value* FindSuccess(const Json::Value& reply) { return FindMember(&reply, "success"); }

bool IsTrue(const Json::Value* member) { return member != nullptr && member->asBool(); }

const Json::Value* FindError(const Json::Value& reply) { return FindMember(&reply, "error"); }

const Json::Value* FindErrorField(const Json::Value& reply, const char* name) {
  return FindSuccess(reply) != nullptr ? FindMember(FindError(reply), name) : nullptr;
}

const Json::Value* FindData(const Json::Value& reply) {
  return IsTrue(FindSuccess(reply)) ? FindMember(&reply, "data") : nullptr;
}

// A null name is answered before "success" is converted, which may throw.
const Json::Value* FindDataField(const Json::Value& reply, const char* name) {
  return name != nullptr ? FindMember(FindData(reply), name) : nullptr;
}

}  // namespace

Response::Response() = default;

Response::Response(const Response& other) : resp(other.resp) {}

Response& Response::operator=(const Response& other) {
  resp = other.resp;
  return *this;
}

Response::Response(const std::string& text) { setResp(text); }

Response::Response(const char* text) { setResp(text); }

Response::Response(const Json::Value& document) : resp(document) {}

Response::~Response() = default;

bool Response::setResp(const std::string& text) { return JsonValue::fromString(resp, text); }

bool Response::setResp(const char* text) {
  if (text == nullptr) return false;
  return JsonValue::fromString(resp, text);
}

void Response::setResp(const Json::Value& document) { resp = document; }

void Response::clear() {
  // Json::Value::clear() throws on a number or a text.
  if (!resp.isObject() && !resp.isArray()) resp = Json::Value();
  resp.clear();
}

bool Response::isValid() const { return FindSuccess(resp) != nullptr; }

bool Response::isSuccess() const { return IsTrue(FindSuccess(resp)); }

int Response::getErrCode() const {
  if (isSuccess()) return 0;
  const Json::Value* code = FindErrorField(resp, "code");
  return code != nullptr && code->isInt() ? code->asInt() : -1;
}

Json::Value Response::getErrMsg() const { return orNull(FindErrorField(resp, "errors")); }

Json::Value Response::getErr() const { return orNull(FindError(resp)); }

bool Response::hasData() const { return FindData(resp) != nullptr; }

const Json::Value& Response::getData() const { return orNull(FindData(resp)); }

bool Response::hasDataField(const char* name) const { return FindDataField(resp, name) != nullptr; }

const Json::Value& Response::getDataField(const char* name) const {
  return orNull(FindDataField(resp, name));
}

std::string Response::getDataFieldtoStr(const char* name) const {
  const Json::Value* field = FindDataField(resp, name);
  return field != nullptr && field->isString() ? field->asString() : std::string();
}

bool Response::isPollFinish() const { return IsTrue(FindDataField(resp, "finish")); }

bool Response::isPollSuccess() const { return IsTrue(FindDataField(resp, "success")); }

std::string Response::getTaskId() const {
  const Json::Value* field = FindDataField(resp, "task_id");
  return field != nullptr ? field->asString() : std::string();
}

bool Response::hasAdditional() const { return hasDataField("additional"); }

const Json::Value& Response::getAdditional() const { return getDataField("additional"); }

bool Response::hasField(const char* name) const { return FindMember(&resp, name) != nullptr; }

const Json::Value& Response::getField(const char* name) const {
  return orNull(FindMember(&resp, name));
}

const Json::Value& Response::orNull(const Json::Value* member) const {
  return member != nullptr ? *member : nullValue;
}

}  // namespace KeloDRCore
