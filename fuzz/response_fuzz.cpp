// Any text as a reply, and every question asked of it.

#include <kelodrcore/json_value.h>
#include <kelodrcore/response.h>

#include "fuzz.h"

namespace {

using KeloDRCore::Response;
namespace JsonValue = KeloDRCore::JsonValue;

// The conversions whose type is not tested first may throw the JSON library's own error.
template <typename Query>
void Ask(const Query& query) {
  try {
    query();
  } catch (const Json::LogicError&) {
  }
}

void AskEverything(const Response& reply) {
  Ask([&] { return reply.isValid(); });
  Ask([&] { return reply.isSuccess(); });
  Ask([&] { return reply.getErrCode(); });
  Ask([&] { return reply.getErrMsg(); });
  Ask([&] { return reply.getErr(); });
  Ask([&] { return reply.hasData(); });
  Ask([&] { return reply.getData().isNull(); });
  Ask([&] { return reply.isPollFinish(); });
  Ask([&] { return reply.isPollSuccess(); });
  Ask([&] { return reply.getTaskId(); });
  Ask([&] { return reply.hasAdditional(); });
  Ask([&] { return reply.getAdditional().isNull(); });
  for (const char* const name : {"a", "data", "", "success", static_cast<const char*>(nullptr)}) {
    Ask([&] { return reply.hasDataField(name); });
    Ask([&] { return reply.getDataField(name).isNull(); });
    Ask([&] { return reply.getDataFieldtoStr(name); });
    Ask([&] { return reply.hasField(name); });
    Ask([&] { return reply.getField(name).isNull(); });
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  const std::string text = FuzzedDataProvider(data, size).ConsumeRemainingBytesAsString();
  Json::Value document = "untouched";
  if (!JsonValue::fromString(document, text)) {
    Require(document == "untouched", "a text that does not parse changes nothing");
    return 0;
  }
  Response reply(text);
  AskEverything(reply);
  Json::Value again;
  const std::string written = JsonValue::toString(document);
  Require(JsonValue::fromString(again, written), "what is written can be read");
  Require(JsonValue::toString(again) == written, "and is written the same again");
  reply.clear();
  AskEverything(reply);
  return 0;
}
