// Locks, and caches that are fresh.

#include <sys/file.h>

#include <cstdio>
#include <memory>

#include "growth/operations.h"
#include "growth/texts.h"
#include "kelodrcore/cache.h"
#include "kelodrcore/file_lock.h"

namespace {

using KeloDRCore::FileLock;

class GrowthCache : public KeloDRCore::Cache {
 public:
  explicit GrowthCache(const std::string& dir) : Cache(dir, "c", 1000000, false, 0) {}

  Json::Value GetInfo() const override { return "growth"; }
  bool GetUpdatedData(Json::Value& /*out*/) const override { return false; }
  bool IsValidData(const Json::Value& data) const override { return data.isObject(); }
};

std::shared_ptr<FileLock> NewLock() { return std::make_shared<FileLock>(Path("lock")); }

Work Lock(size_t count) {
  return [lock = NewLock(), count] {
    for (size_t i = 0; i < count; ++i) {
      Require(lock->lock(LOCK_EX | LOCK_NB, 0), "lock");
      lock->unlock();
    }
  };
}

std::shared_ptr<GrowthCache> CacheOf(size_t members) {
  const auto cache = std::make_shared<GrowthCache>(Path("cache"));
  Require(cache->UpdateWithData(Members(members)), "UpdateWithData");
  Require(!cache->Read().isNull(), "Read");
  return cache;
}

Work ReadOften(size_t count) {
  return [cache = CacheOf(4), count] {
    for (size_t i = 0; i < count; ++i) Require(cache->Read().isObject(), "Read");
  };
}

Work ReadLarge(size_t members) {
  return [cache = CacheOf(members)] { Require(cache->Read().isObject(), "Read"); };
}

}  // namespace

void AddLocksAndCaches(std::vector<Operation>& operations) {
  if (!NewLock()->lock(LOCK_EX | LOCK_NB, 0)) {
    printf("No lock can be made here: locks and caches are left out\n");
    return;
  }
  operations.push_back({"FileLock, again and again", 32, Lock, Growth::kConstant});
  operations.push_back({"Cache::Read, again and again", 32, ReadOften, Growth::kConstant});
  operations.push_back({"Cache::Read of a large document", 128, ReadLarge});
}
