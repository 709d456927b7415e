// Any document as a call, with parameters added and merged.

#include <kelodrcore/json_value.h>
#include <kelodrcore/request.h>

#include "fuzz.h"

using KeloDRCore::Request;
namespace JsonValue = KeloDRCore::JsonValue;

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  Input input(data, size);
  const std::string key = input.Text();
  const std::string merged = input.Text();
  Json::Value document;
  Json::Value members;
  if (!JsonValue::fromString(document, input.Rest())) return 0;
  JsonValue::fromString(members, merged);

  Request request(document);
  const Json::Value once = request.toJson();
  Require(once.isObject(), "a call is an object");
  if (request.isValid()) Require(Request(once).toJson() == once, "a call survives the round trip");
  const bool hasRoom = request.getParams().isNull() || request.getParams().isObject();
  const bool isAdded = request.addParam(key, members);
  Require(isAdded == (hasRoom && Request::isValidKey(key)), "a good key is added");
  if (isAdded) Require(request.getParams()[key] == members, "with its value");
  Require(request.addParam(members) == hasRoom, "members are merged into an object");
  Require(request.toJson().isObject(), "a call stays an object");
  request.clear();
  Require(!request.isValid(), "a cleared call is not valid");
  return 0;
}
