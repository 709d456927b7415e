// Any document as a call, with parameters added and merged.

#include <kelodrcore/json_value.h>
#include <kelodrcore/request.h>

#include <algorithm>
#include <string>
#include <vector>

#include "fuzz.h"

namespace {

using KeloDRCore::Request;
namespace JsonValue = KeloDRCore::JsonValue;

// Whether there is a member to merge.
bool HasParameter(const Json::Value& members) {
  if (!members.isObject()) return members.isArray() && !members.empty();
  const std::vector<std::string> names = members.getMemberNames();
  return std::any_of(names.begin(), names.end(), Request::isValidKey);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  FuzzedDataProvider input(data, size);
  const std::string key = input.ConsumeRandomLengthString();
  const std::string merged = input.ConsumeRandomLengthString();
  Json::Value document;
  Json::Value members;
  if (!JsonValue::fromString(document, input.ConsumeRemainingBytesAsString())) return 0;
  JsonValue::fromString(members, merged);

  Request request(document);
  const Json::Value once = request.toJson();
  Require(once.isObject(), "a call is an object");
  if (request.isValid()) Require(Request(once).toJson() == once, "a call survives the round trip");
  const bool hasRoom = request.getParams().isNull() || request.getParams().isObject();
  const bool isAdded = request.addParam(key, members);
  Require(isAdded == (hasRoom && Request::isValidKey(key)), "a good key is added");
  if (isAdded) Require(request.getParams()[key] == members, "with its value");
  const bool isMerged = hasRoom || !HasParameter(members);
  Require(request.addParam(members) == isMerged, "members are merged into an object");
  Require(request.toJson().isObject(), "a call stays an object");
  request.clear();
  Require(!request.isValid(), "a cleared call is not valid");
  return 0;
}
