// Cache::Read while the file is fresh: the answer comes from memory.

#include "contenders.h"
#include "kelodrcore/cache.h"
#include "support.h"

namespace bench {
namespace {

void Measure(size_t size) {
  Json::Value data;
  Require(ParseWithJsonCpp(NodesDocument(size), data), "JsonCpp refuses the document");
  const std::string name = "document" + std::to_string(size);
  const std::string work = "fresh, " + (size < 1024 ? "100 B" : SizeName(size));
  Register("Cache::Read", work, kLibrary, [=](benchmark::State& state) {
    const DocumentCache cache(ScratchPath("cache"), name);
    Require(cache.UpdateWithData(data) && cache.Read() == data, "the documents differ");
    for (auto _ : state) benchmark::DoNotOptimize(cache.Read());
  });
  Register("Cache::Read", work, Baseline(1.3), [=](benchmark::State& state) {
    const std::string path = ScratchPath(name + ".by_hand");
    WriteWhole(path, WriteWithJsonCpp(data));
    const CacheByHand cache(path, data);
    Require(cache.Read() == data, "the documents differ");
    for (auto _ : state) benchmark::DoNotOptimize(cache.Read());
  });
}

const Benchmarks registered([] {
  Measure(100);
  Measure(100 << 10);
});

}  // namespace
}  // namespace bench
