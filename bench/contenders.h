// The cache and the lock, of the library and by hand, for one process and for many.

#ifndef KELODRCORE_BENCH_CONTENDERS_H_
#define KELODRCORE_BENCH_CONTENDERS_H_

#include <json/json.h>
#include <sys/types.h>

#include <string>

#include "kelodrcore/cache.h"

namespace bench {

// A cache whose document never gets old.
class DocumentCache : public KeloDRCore::Cache {
 public:
  DocumentCache(const std::string& dir, const std::string& name)
      : Cache(dir, name, 1000000, false, 0) {}

  Json::Value GetInfo() const override { return "bench"; }
  bool GetUpdatedData(Json::Value& /*out*/) const override { return false; }
  bool IsValidData(const Json::Value& data) const override { return data.isArray(); }
};

// The system calls of a fresh read (is the file there, and believed, and how old?), and one copy of
// the document, which the file is taken to hold.
class CacheByHand {
 public:
  CacheByHand(const std::string& path, const Json::Value& document);

  Json::Value Read() const;

 private:
  bool Look(time_t& modified) const;

  std::string path;
  Json::Value data;
  time_t loaded;
};

// The system calls that a privileged lock on a named file takes: the ids are looked at on both
// sides of either step, the file before it is locked and again behind that.
class LockByHand {
 public:
  explicit LockByHand(const std::string& dir);
  ~LockByHand();
  LockByHand(const LockByHand&) = delete;
  LockByHand& operator=(const LockByHand&) = delete;

  // 20 tries a second for `timeout` seconds, 50 ms apart.
  bool Lock(int type, unsigned int timeout);
  void Unlock();

 private:
  bool IsAtPath() const;

  std::string path;
  int fd;
  uid_t uid;
  gid_t gid;
};

}  // namespace bench

#endif  // KELODRCORE_BENCH_CONTENDERS_H_
