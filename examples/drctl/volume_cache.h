// The machine's mounts behind a cache file that all processes share.

#ifndef DRCTL_VOLUME_CACHE_H_
#define DRCTL_VOLUME_CACHE_H_

#include <kelodrcore/cache.h>

#include <string>

namespace drctl {

// Where an answer came from.
enum class Source { kMemory, kFile, kScan };

const char* ToText(Source source);

class VolumeCache : public KeloDRCore::Cache {
 public:
  // Every reader waits for data that is at most `maxAge` seconds old.
  VolumeCache(const std::string& dir, long maxAge);

  Json::Value GetInfo() const override;
  Json::Value GetDefaultValue() const override;
  bool GetUpdatedData(Json::Value& out) const override;
  bool IsValidData(const Json::Value& data) const override;

  // The volumes as an array of objects, and where they came from.
  Json::Value ReadVolumes(Source& source);

 private:
  Json::Value Scan() const;

  // The modification time of the cache file; -1 while there is none.
  long long FileTime() const;

  std::string file;
  long long readTime = -1;
  mutable bool isScanned = false;
};

}  // namespace drctl

#endif  // DRCTL_VOLUME_CACHE_H_
