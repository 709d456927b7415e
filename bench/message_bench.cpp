// Request and Response: building a call as text, reading a call, asking a reply; beside the same
// with JsonCpp alone. Both keep the parameters that they write and the document that they read.

#include <map>

#include "kelodrcore/json_value.h"
#include "kelodrcore/request.h"
#include "kelodrcore/response.h"
#include "support.h"

namespace bench {
namespace {

constexpr char kApi[] = "DR.Node";

struct Call {
  explicit Call(size_t size) {
    Require(ParseWithJsonCpp(NodesDocument(size), nodes), "JsonCpp refuses the document");
    text = KeloDRCore::JsonValue::toString(KeloDRCore::Request(kApi, 1, "set", Params()).toJson());
    Json::Value document(Json::objectValue);
    document["success"] = true;
    document["data"]["task_id"] = "task_7";
    document["data"]["finish"] = true;
    document["data"]["nodes"] = nodes;
    reply = KeloDRCore::JsonValue::toString(document);
  }

  Json::Value Params() const {
    Json::Value params(Json::objectValue);
    params["id"] = 7;
    params["nodes"] = nodes;
    return params;
  }

  Json::Value nodes;
  std::string text;
  std::string reply;
};

KeloDRCore::Request BuildRequest(const Call& call) {
  KeloDRCore::Request request;
  request.setAPI(kApi);
  request.setMethod("set");
  request.setVersion(1);
  request.addParam("id", 7);
  request.addParam("nodes", call.nodes);
  return request;
}

std::string BuildWithLibrary(const Call& call) {
  return KeloDRCore::JsonValue::toString(BuildRequest(call).toJson());
}

std::string BuildByHand(const Call& call) {
  Json::Value params(Json::objectValue);
  params["id"] = 7;
  params["nodes"] = call.nodes;
  Json::Value json = params;
  json["api"] = kApi;
  json["method"] = "set";
  json["version"] = 1;
  return WriteWithJsonCpp(json);
}

size_t QueryRequest(const KeloDRCore::Request& request) {
  Require(request.isValid() && request.getAPI() == kApi && request.getVersion() == 1, "request");
  return request.getParams()["nodes"].size();
}

size_t ParseWithLibrary(const Call& call) {
  Json::Value json;
  Require(KeloDRCore::JsonValue::fromString(json, call.text), "fromString");
  return QueryRequest(json);
}

size_t ParseByHand(const Call& call) {
  Json::Value json;
  Require(ParseWithJsonCpp(call.text, json), "parse");
  const Json::Value params = json;
  const std::string api = params["api"].asString();
  const std::string method = params["method"].asString();
  const int version = params["version"].asInt();
  Require(api == kApi && !method.empty() && version == 1, "request");
  return params["nodes"].size();
}

size_t AskWithLibrary(const Call& call) {
  const KeloDRCore::Response response(call.reply);
  Require(response.isSuccess() && response.getErrCode() == 0 && response.isPollFinish(), "reply");
  return response.getTaskId().size() + response.getDataField("nodes").size();
}

size_t AskByHand(const Call& call) {
  Json::Value reply;
  Require(ParseWithJsonCpp(call.reply, reply), "parse");
  const Json::Value& answer = reply;
  const bool succeeded = answer.isMember("success") && answer["success"].asBool();
  const int code = succeeded ? 0 : answer["error"]["code"].asInt();
  Require(succeeded && code == 0, "reply");
  const Json::Value& data = answer["data"];
  Require(data.isMember("finish") && data["finish"].asBool(), "reply");
  return data["task_id"].asString().size() + data["nodes"].size();
}

// The same for all contestants.
const Call& CallOf(size_t size) {
  static std::map<size_t, Call> calls;
  return calls.try_emplace(size, size).first->second;
}

template <typename Run>
void Measure(const char* operation, const char* step, size_t size, const Contestant& contestant,
             const Run& run) {
  Register(operation, std::string(step) + ", " + SizeName(size), contestant,
           [=](benchmark::State& state) {
             const Call& call = CallOf(size);
             for (auto _ : state) benchmark::DoNotOptimize(run(call));
           });
}

const Benchmarks registered([] {
  for (const size_t size : {size_t{1} << 10, size_t{1} << 20}) {
    Measure("Request", "build to text", size, kLibrary, BuildWithLibrary);
    Measure("Request", "build to text", size, Baseline(1.1), BuildByHand);
    Measure("Request", "parse and query", size, kLibrary, ParseWithLibrary);
    Measure("Request", "parse and query", size, Baseline(1.1), ParseByHand);
    Measure("Response", "parse and query", size, kLibrary, AskWithLibrary);
    Measure("Response", "parse and query", size, Baseline(1.1), AskByHand);
  }
});

}  // namespace
}  // namespace bench
