#include <atomic>

#include "kelodrcore/json_value.h"
#include "storm/storm.h"

using KeloDRCore::JsonValue::fromFile;
using KeloDRCore::JsonValue::toFile;

namespace {

struct Shared {
  std::atomic<int> reads;
  std::atomic<int> changes;
  std::atomic<int> done;
  std::atomic<int> writes;
};

void ReadOn(const std::string& path, const Settings& settings, Shared& shared) {
  int last = 0;
  while (shared.reads++ < settings.count) {
    Json::Value value;
    const bool read = fromFile(value, path) && IsWhole(value);
    Expect(read, "a torn document");
    if (!read) break;
    Expect(value["first"].asInt() >= last, "an older document came back");
    shared.changes += value["first"].asInt() != last;
    last = value["first"].asInt();
  }
  ++shared.done;
}

}  // namespace

std::string Readers(const Settings& settings) {
  Shared& shared = MakeShared<Shared>();
  const std::string path = settings.dir + "/document";
  const int readers = settings.processes - 1;
  Expect(toFile(Numbered(0), path), "no first document");
  Workers workers(settings.processes, [&](int worker, int) {
    if (worker > 0) return ReadOn(path, settings, shared);
    while (shared.done < readers) Expect(toFile(Numbered(++shared.writes), path), "no write");
  });
  workers.Join(true);
  Expect(shared.reads >= settings.count, "too few reads");
  Expect(shared.changes > 0, "the readers saw no change");
  return std::to_string(settings.count) + " reads by " + std::to_string(readers) + " readers, " +
         std::to_string(shared.writes) + " documents written, " + std::to_string(shared.changes) +
         " changes seen, none torn";
}
