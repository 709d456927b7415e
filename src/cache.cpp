#include "kelodrcore/cache.h"

#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstring>
#include <ctime>
#include <new>
#include <utility>

#include "kelocore.h"
#include "kelodrcore/file.h"
#include "kelodrcore/file_lock.h"
#include "kelodrcore/json_value.h"
#include "kelodrcore/utils.h"
#include "log.h"
#include "privilege.h"

namespace KeloDRCore {
namespace {

const char kFallbackPath[] = "/tmp/default_dr_cache";

// How long a lock is waited for, in seconds. Releasing a claim waits longer: a pid file that stays
// behind stops every update until its process ends.
constexpr unsigned int kLockTimeout = 5;
constexpr unsigned int kReleaseTimeout = 60;

constexpr int kRemoveAttempts = 3;

// Flags of KLIBCProcForkEx: nobody's zombie, in a session of its own, streams on /dev/null.
constexpr int kDetached = 1 | 64;

std::string GetCachedPath(const std::string& dir, const std::string& file) {
  if (dir.empty() || file.empty()) {
    KELODR_LOG(WARN, __func__, "Invalid dir[%s] and file[%s] to cache", dir.c_str(), file.c_str());
    return kFallbackPath;
  }
  if (!File::CreateDir(dir, 0755)) {
    KELODR_LOG(ERR, __func__, "Failed to create [%s]", dir.c_str());
    return kFallbackPath;
  }
  return dir + "/" + file + ".cached";
}

std::string PidFile(const std::string& path) { return path + ".pid"; }
std::string LockName(const std::string& path) { return path + ".lock"; }

// In seconds; -1 for a file that is missing or cannot be looked at.
time_t ModificationTime(const std::string& path) {
  struct stat status;
  if (access(path.c_str(), F_OK) != 0 || stat(path.c_str(), &status) != 0) return -1;
  return status.st_mtime;
}

// The modification time as it is remembered: its low 32 bits tell a change as well.
int ModificationStamp(const std::string& path) { return static_cast<int>(ModificationTime(path)); }

// The caller holds the lock, shared or exclusive.
bool IsClaimed(const std::string& pidFile) {
  const int pid = KLIBCReadPidFile(pidFile.c_str());
  return pid > 0 && KLIBCProcAlive(pid) == 1;
}

// True also when the lock cannot be had: somebody is claiming the update or releasing it. The lock
// is closed on return, so that no forked child inherits it.
bool IsBusy(const std::string& path) {
  const std::string pidFile = PidFile(path);
  FileLock lock(LockName(path));
  return !lock.lock(LOCK_SH | LOCK_NB, kLockTimeout) || IsClaimed(pidFile);
}

bool LockToRelease(FileLock& lock) {
  try {
    return lock.lock(LOCK_EX | LOCK_NB, kReleaseTimeout);
  } catch (const std::bad_alloc&) {
    return false;
  }
}

// What stays behind stops every update while this process lives: one failure is not the last word.
int RemovePidFile(const std::string& pidFile) {
  int ret = unlink(pidFile.c_str());
  for (int attempt = 1; ret != 0 && errno != ENOENT && attempt < kRemoveAttempts; ++attempt) {
    ret = unlink(pidFile.c_str());
  }
  return ret;
}

bool CreatePidFile(const std::string& path) {
  KELODR_PRIVILEGED();
  return KLIBCProcPidFileCreate(PidFile(path).c_str()) == 0;
}

bool WriteFile(const Json::Value& document, const std::string& path) {
  KELODR_PRIVILEGED();
  return JsonValue::toFile(document, path);
}

// Runs `step` until it succeeds, at most `limit` + 2 times (but once at least), with a sleep of
// `minSleep` to `maxSleep` milliseconds in between; false when it never did.
template <typename Step>
bool TryRepeatedly(int limit, unsigned int minSleep, unsigned int maxSleep, const Step& step) {
  for (long long attempt = 0; !step(); ++attempt) {
    if (limit < attempt) return false;
    RandomSleepInMSec(minSleep, maxSleep);
  }
  return true;
}

int ToInt(double seconds) {
  return static_cast<int>(std::clamp<double>(seconds, INT_MIN, INT_MAX));
}

}  // namespace

Cache::Cache(const std::string& dir, const std::string& file, long timeoutSeconds,
             bool isAlwaysRequired, int retries)
    : path(GetCachedPath(dir, file)),
      timeout(timeoutSeconds),
      alwaysRequired(isAlwaysRequired),
      retryLimit(retries),
      loadedMtime(-1) {}

Cache::~Cache() = default;

Json::Value Cache::GetDefaultValue() const { return {}; }

bool Cache::IsNeedUpdate(const Json::Value& /*data*/) const { return false; }

bool Cache::IsUpdatedDataRequired() const {
  return alwaysRequired || !IsValidData(GetCachedData());
}

Json::Value Cache::Read() const {
  Json::Value cached = GetCachedData();
  if (!IsTimeout() && IsValidData(cached) && !IsNeedUpdate(cached)) return cached;
  if (Update()) return GetCachedData();
  KELODR_LOG(DEBUG, __func__, "Failed to update cache [%s], use old cache data.",
             JsonValue::toString(GetInfo()).c_str());
  return cached;
}

Json::Value Cache::GetCachedData() const {
  const int modified = ModificationStamp(path);
  if (modified != -1 && modified == loadedMtime) return cachedData;
  if (!Load()) {
    cachedData = GetDefaultValue();
    // The document is not the file's any more: a file that comes back with its old modification
    // time has to be loaded again.
    loadedMtime = -1;
    KELODR_LOG(DEBUG, __func__, "Failed to load cache [%s], use default cache data", path.c_str());
  }
  return cachedData;
}

bool Cache::Load() const {
  if (KLIBCFileExist(path.c_str()) == 0) {
    KELODR_LOG(DEBUG, __func__, "no data is cached in [%s]", path.c_str());
    return false;
  }
  // Before the file is read: one that is replaced in between then counts as changed.
  const int modified = ModificationStamp(path);
  Json::Value document;
  if (!JsonValue::fromFile(document, path)) {
    KELODR_LOG(DEBUG, __func__, "Failed to read data from cache [%s]", path.c_str());
    return false;
  }
  if (document.isObject() && document.isMember("cached_data")) {
    cachedData = std::move(document["cached_data"]);
  }
  loadedMtime = modified;
  return true;
}

bool Cache::Update() const {
  const bool required = IsUpdatedDataRequired();
  if (IsBusy(path)) {
    if (required) WaitForUpdate();
    return true;
  }
  return required ? UpdateUnderClaim() : UpdateInBackground();
}

bool Cache::UpdateInBackground() const {
  const int pid = KLIBCProcForkEx(kDetached);
  if (pid < 0) {
    KELODR_LOG(WARN, "Update", "Failed to fork(). errno=[%d/%m]", errno);
    return false;
  }
  if (pid > 0) return true;
  // Nothing of the caller's goes on in the child: neither its frames nor its exit handlers nor what
  // it had in its stream buffers.
  try {
    UpdateUnderClaim();
  } catch (...) {
    // Nobody is there to be told.
  }
  _exit(0);
}

bool Cache::UpdateUnderClaim() const {
  // What releases the claim is made before it: the release must not fail for want of memory.
  const std::string pidFile = PidFile(path);
  FileLock lock(LockName(path));
  if (!SetUpdating()) return false;
  bool updated = false;
  try {
    updated = DoUpdate();
  } catch (...) {
    UnsetUpdating(pidFile, lock);
    throw;
  }
  UnsetUpdating(pidFile, lock);
  return updated;
}

void Cache::WaitForUpdate() const {
  KELODR_LOG(DEBUG, "Update", "start to block wait cache [%s] ", path.c_str());
  do {
    RandomSleepInMSec(300, 1000);
  } while (IsBusy(path) && IsTimeout());
  KELODR_LOG(DEBUG, "Update", "finish to block wait cache [%s] ", path.c_str());
}

bool Cache::SetUpdating() const {
  if (IsBusy(path)) return false;
  FileLock lock(LockName(path));
  if (!lock.lock(LOCK_EX | LOCK_NB, kLockTimeout)) {
    KELODR_LOG(DEBUG, __func__, "Failed to lock [%s]",
               FileLock::getLockFilePath(LockName(path)).c_str());
    return false;
  }
  // Another process may have claimed the update between the look above and the lock.
  if (IsClaimed(PidFile(path))) {
    KELODR_LOG(DEBUG, __func__, "there is other process to update cache [%s]", path.c_str());
    return false;
  }
  if (!CreatePidFile(path)) {
    KELODR_LOG(DEBUG, __func__, "Failed to set cache [%s] updating", path.c_str());
    return false;
  }
  KELODR_LOG(DEBUG, __func__, "---> Start to update cache [%s]", path.c_str());
  return true;
}

void Cache::UnsetUpdating(const std::string& pidFile, FileLock& lock) const {
  if (!LockToRelease(lock)) {
    KELODR_LOG(NOTICE, __func__, "Failed to lock to unset cache[%s]", path.c_str());
  }
  if (IsClaimed(pidFile)) {
    const int pid = KLIBCReadPidFile(pidFile.c_str());
    // A pid file that can no longer be read is removed: it would name this process while it lives.
    if (pid > 0 && pid != getpid()) {
      KELODR_LOG(DEBUG, __func__, "Failed to unset updating cache [%s] since different pid[%d]",
                 pidFile.c_str(), pid);
      return;
    }
  }
  {
    KELODR_PRIVILEGED();
    const int ret = RemovePidFile(pidFile);
    if (ret != 0) {
      KELODR_LOG(NOTICE, __func__, "Failed to unlink [%s] with ret[%d](%s)", pidFile.c_str(), ret,
                 strerror(errno));
    }
  }
  KELODR_LOG(DEBUG, __func__, "<--- Finish to update cache [%s]", path.c_str());
}

bool Cache::DoUpdate() const {
  const long long begin = time(nullptr);
  Json::Value data;
  const auto fetch = [this, &data] {
    data = Json::Value();
    return GetUpdatedData(data);
  };
  if (!TryRepeatedly(retryLimit, 500, 1000, fetch)) {
    KELODR_LOG(DEBUG, __func__, "Failed to get updated cache [%s] and reach the retry limit[%d]",
               JsonValue::toString(GetInfo()).c_str(), retryLimit);
    return false;
  }
  return UpdateWithData(data, begin, time(nullptr));
}

bool Cache::UpdateWithData(const Json::Value& data) const { return UpdateWithData(data, 0, 0); }

bool Cache::UpdateWithData(const Json::Value& data, long long begin, long long finish) const {
  if (!IsValidData(data)) {
    KELODR_LOG(DEBUG, __func__, "[%s] is not valid to update for cache [%s]",
               JsonValue::toString(data).c_str(), JsonValue::toString(GetInfo()).c_str());
    return false;
  }
  Json::Value document = MakeDocument(data, begin, finish);
  const auto write = [this, &document] { return WriteFile(document, path); };
  if (!TryRepeatedly(retryLimit, 300, 1000, write)) {
    KELODR_LOG(DEBUG, __func__, "Failed to write cache to file [%s] and reach retry limit[%d]",
               path.c_str(), retryLimit);
    return false;
  }
  cachedData.swap(document["cached_data"]);
  loadedMtime = ModificationStamp(path);
  return true;
}

Json::Value Cache::MakeDocument(const Json::Value& data, long long begin, long long finish) const {
  if (begin < 1 || finish < 1) begin = finish = 0;
  const double seconds = difftime(static_cast<time_t>(finish), static_cast<time_t>(begin));
  Json::Value document(Json::objectValue);
  document["timeout"] = Json::Int64{timeout};
  document["info"] = GetInfo();
  document["cached_data"] = data;
  document["begin_time_to_update"] = Json::Int64{begin};
  document["finish_time_to_update"] = Json::Int64{finish};
  document["updated_time"] = seconds;
  document["max_updated_time"] = std::max(GetMaxUpdateTime(), ToInt(seconds));
  return document;
}

bool Cache::IsTimeout() const {
  const time_t modified = ModificationTime(path);
  const time_t now = time(nullptr);
  if (modified == -1 || now == -1) return true;
  return difftime(now, modified) > static_cast<double>(timeout);
}

int Cache::GetMaxUpdateTime() const {
  Json::Value document;
  if (!JsonValue::fromFile(document, path) || !document.isObject()) return 0;
  const Json::Value& seconds = document["max_updated_time"];
  return seconds.isInt() ? seconds.asInt() : 0;
}

int Cache::Remove() { return unlink(path.c_str()); }

}  // namespace KeloDRCore
