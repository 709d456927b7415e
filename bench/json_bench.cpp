// JsonValue::fromString and toString, beside JsonCpp's own reader and writer on a buffer.

#include <map>

#include "kelodrcore/json_value.h"
#include "support.h"

namespace bench {
namespace {

// One document, its text and its value.
struct Document {
  explicit Document(size_t size) : text(NodesDocument(size)) {
    Require(ParseWithJsonCpp(text, value), "JsonCpp refuses the document");
    Json::Value parsed;
    Require(KeloDRCore::JsonValue::fromString(parsed, text) && parsed == value,
            "the values differ");
    Require(KeloDRCore::JsonValue::toString(value) == WriteWithJsonCpp(value), "the texts differ");
  }
  std::string text;
  Json::Value value;
};

// Made when the first benchmark asks for it, and the same for all: how fast a value is read depends
// on where in memory its parts are.
const Document& DocumentOf(size_t size) {
  static std::map<size_t, Document> documents;
  return documents.try_emplace(size, size).first->second;
}

template <typename Run>
void Measure(const char* operation, size_t size, const Contestant& contestant, const Run& run) {
  Register(operation, SizeName(size), contestant, [=](benchmark::State& state) {
    const Document& document = DocumentOf(size);
    for (auto _ : state) run(document);
    state.SetBytesProcessed(static_cast<int64_t>(state.iterations()) *
                            static_cast<int64_t>(document.text.size()));
  });
}

const Benchmarks registered([] {
  for (const size_t size : {size_t{1} << 10, size_t{100} << 10, size_t{10} << 20}) {
    Measure("fromString", size, kLibrary, [](const Document& document) {
      Json::Value value;
      Require(KeloDRCore::JsonValue::fromString(value, document.text), "fromString");
    });
    Measure("fromString", size, Baseline(1.1), [](const Document& document) {
      Json::Value value;
      Require(ParseWithJsonCpp(document.text, value), "parse");
    });
    Measure("toString", size, kLibrary, [](const Document& document) {
      benchmark::DoNotOptimize(KeloDRCore::JsonValue::toString(document.value));
    });
    Measure("toString", size, Baseline(1.1), [](const Document& document) {
      benchmark::DoNotOptimize(WriteWithJsonCpp(document.value));
    });
    Measure("toString", size, {"FastWriter"}, [](const Document& document) {
      benchmark::DoNotOptimize(WriteFastWithJsonCpp(document.value));
    });
  }
});

}  // namespace
}  // namespace bench
