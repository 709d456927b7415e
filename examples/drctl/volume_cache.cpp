#include "volume_cache.h"

#include <sys/stat.h>

#include "mounts.h"
#include "paths.h"

namespace drctl {
namespace {

constexpr char kName[] = "volumes";
constexpr int kRetries = 1;

}  // namespace

const char* ToText(Source source) {
  switch (source) {
    case Source::kMemory:
      return "memory";
    case Source::kFile:
      return "the cache file";
    default:
      return "a fresh scan";
  }
}

VolumeCache::VolumeCache(const std::string& dir, long maxAge)
    : Cache(AbsolutePath(dir), kName, maxAge, true, kRetries),
      file(dir + "/" + kName + ".cached") {}

Json::Value VolumeCache::GetInfo() const { return kName; }

Json::Value VolumeCache::GetDefaultValue() const { return Json::arrayValue; }

Json::Value VolumeCache::Scan() const {
  isScanned = true;
  return ToJson(ScanMounts(), VolumeColumns());
}

bool VolumeCache::GetUpdatedData(Json::Value& out) const {
  // Between this process's look at the file and its claim another one may have come and gone.
  if (!IsTimeout()) {
    out = GetCachedData();
    if (IsValidData(out)) return true;
  }
  out = Scan();
  return IsValidData(out);
}

bool VolumeCache::IsValidData(const Json::Value& data) const {
  return data.isArray() && !data.empty();
}

long long VolumeCache::FileTime() const {
  struct stat status = {};
  return stat(file.c_str(), &status) == 0 ? static_cast<long long>(status.st_mtime) : -1;
}

Json::Value VolumeCache::ReadVolumes(Source& source) {
  isScanned = false;
  Json::Value volumes = Read();
  // Whoever loses the race for the claim is given what there was; the winner's data come, or have
  // come since.
  if (!isScanned && (IsTimeout() || !IsValidData(volumes))) volumes = Read();
  // A user who cannot take locks has no cache, but can still see the mounts.
  if (!IsValidData(volumes)) volumes = Scan();
  const long long fileTime = FileTime();
  if (isScanned) {
    source = Source::kScan;
  } else {
    source = fileTime == readTime ? Source::kMemory : Source::kFile;
  }
  readTime = fileTime;
  return volumes;
}

}  // namespace drctl
