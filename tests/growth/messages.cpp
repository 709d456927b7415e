// Requests and responses.

#include "growth/operations.h"
#include "growth/texts.h"
#include "kelodrcore/json_value.h"
#include "kelodrcore/request.h"
#include "kelodrcore/response.h"

namespace {

using namespace KeloDRCore;

Work BuildRequest(size_t count) {
  return [params = Members(count)] {
    Request request("DR.Node", 1, "set", Json::objectValue);
    Require(request.addParam(params), "addParam");
    Require(!JsonValue::toString(request.toJson()).empty(), "toJson");
  };
}

Work AddParams(size_t count) {
  return [count] {
    Request request;
    for (size_t i = 0; i < count; ++i) request.addParam(Name(i, count), "a text");
  };
}

Work ReadRequest(size_t count) {
  const Request request("DR.Node", 1, "set", Members(count));
  return [text = JsonValue::toString(request.toJson())] {
    Json::Value json;
    Require(JsonValue::fromString(json, text) && Request(json).isValid(), "setRequest");
  };
}

Work ReadResponse(size_t count) {
  Json::Value reply;
  reply["success"] = true;
  reply["data"]["nodes"] = Members(count);
  return [text = JsonValue::toString(reply)] {
    const Response response(text);
    Require(response.isSuccess() && response.hasDataField("nodes"), "setResp");
  };
}

}  // namespace

void AddMessages(std::vector<Operation>& operations) {
  operations.push_back({"Request: built and printed", 128, BuildRequest});
  operations.push_back({"Request: parameters one by one", 128, AddParams});
  operations.push_back({"Request: parsed", 128, ReadRequest});
  operations.push_back({"Response: parsed and asked", 128, ReadResponse});
}
