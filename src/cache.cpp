// Who holds which lock when.
//
//   look     the lock shared, for 5 s at most: is there a claim?
//   claim    the lock exclusive, for 5 s at most: look once more and create the pid file.
//   fetch    no lock. The pid file names this process: that is the claim.
//   write    no lock. Only the holder of the claim replaces the document, in one step.
//   release  the lock exclusive, for 60 s at most: remove the pid file, unless it is another's.
//
// A claim counts while the process in the pid file lives and the file is believed (posix/trust.h).
// A pid file of this very process counts only between claim and release (`Claim`); it is left over
// otherwise, and the next look removes it. Somebody who holds the lock is claiming or releasing; a
// lock that cannot be opened tells of nobody, and nobody waits for it.

#include "kelodrcore/cache.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <csignal>
#include <cstring>
#include <ctime>
#include <new>
#include <utility>

#include "document_file.h"
#include "kelocore.h"
#include "kelodrcore/file.h"
#include "kelodrcore/file_lock.h"
#include "kelodrcore/json_value.h"
#include "kelodrcore/utils.h"
#include "lock_fork.h"
#include "log.h"
#include "own_claim.h"
#include "posix/directory_walk.h"
#include "posix/trust.h"
#include "privilege.h"

namespace KeloDRCore {

// The lock of a cache.
class CacheLock {
 public:
  using Outcome = FileLock::Outcome;

  explicit CacheLock(const std::string& path) : name(path + ".lock"), lock(name) {}
  Outcome Take(int type, unsigned int timeout) { return lock.attempt(type | LOCK_NB, timeout); }
  std::string Path() const { return FileLock::getLockFilePath(name); }

 private:
  const std::string name;
  FileLock lock;
};

namespace {

const char kFallbackPath[] = "/tmp/default_dr_cache";

// How long a lock is waited for, in seconds. Releasing a claim waits longer: a pid file that stays
// behind stops every update until this process looks again, or ends.
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

// In seconds; -1 for a file that is missing or not believed.
time_t ModificationTime(const std::string& path) {
  struct stat status = {};
  if (access(path.c_str(), F_OK) != 0 || !Posix::StatBelieved(path, status)) return -1;
  return status.st_mtime;
}

// The modification time as it is remembered: its low 32 bits tell a change as well.
int ModificationStamp(const std::string& path) { return static_cast<int>(ModificationTime(path)); }

// The claim of an update, which its destructor releases.
class Claim {
 public:
  explicit Claim(const std::string& cachePath);
  ~Claim();
  Claim(const Claim&) = delete;
  Claim& operator=(const Claim&) = delete;

  // Claims the update; false when somebody else is updating, or when that cannot be done.
  bool SetUpdating();

 private:
  void UnsetUpdating();
  bool Lock();

  // What the release needs is made before the claim: it must not fail for want of memory.
  const std::string& path;
  const std::string pidFile;
  CacheLock lock;
  OwnClaim own;
};

std::string PidFile(const std::string& path) { return path + ".pid"; }

// What stays behind stops every update while this process lives and does not look: one failure is
// not the last word.
int RemovePidFile(const std::string& pidFile) {
  int ret = unlink(pidFile.c_str());
  for (int attempt = 1; ret != 0 && errno != ENOENT && attempt < kRemoveAttempts; ++attempt) {
    ret = unlink(pidFile.c_str());
  }
  return ret;
}

// Everything but a directory is replaced by the call itself.
bool CreatePidFile(const std::string& pidFile) {
  KELODR_PRIVILEGED();
  return KLIBCProcPidFileCreate(pidFile.c_str()) == 0 ||
         (errno == EISDIR && Posix::ClearPlanted(AT_FDCWD, pidFile) &&
          KLIBCProcPidFileCreate(pidFile.c_str()) == 0);
}

// The live process in a believed pid file, or 0.
int ClaimantOf(const std::string& pidFile) {
  struct stat status = {};
  if (!Posix::StatBelieved(pidFile, status)) return 0;
  const int pid = KLIBCReadPidFile(pidFile.c_str());
  return pid > 0 && KLIBCProcAlive(pid) == 1 ? pid : 0;
}

// The caller holds the lock, shared or exclusive. Only this process looks twice at a pid file that
// names it, so that a shared lock is enough to remove one that is left over.
bool IsClaimed(const std::string& path) {
  const std::string pidFile = PidFile(path);
  const int pid = ClaimantOf(pidFile);
  if (pid != getpid() || OwnClaim::IsMade(OwnClaim::By::kAnyThread, path)) return pid > 0;
  KELODR_PRIVILEGED();
  RemovePidFile(pidFile);
  return false;
}

enum class Updater { kNone, kSomebody, kUnknown };

// The lock is closed on return, so that no forked child inherits it.
Updater LookForUpdater(const std::string& path) {
  CacheLock lock(path);
  switch (lock.Take(LOCK_SH, kLockTimeout)) {
    case CacheLock::Outcome::kTaken:
      return IsClaimed(path) ? Updater::kSomebody : Updater::kNone;
    case CacheLock::Outcome::kBusy:
      return Updater::kSomebody;
    default:
      return Updater::kUnknown;
  }
}

Claim::Claim(const std::string& cachePath)
    : path(cachePath), pidFile(PidFile(path)), lock(path), own(path) {}

Claim::~Claim() {
  if (!own.IsListed()) return;
  try {
    UnsetUpdating();
  } catch (const std::bad_alloc&) {
    // A stranger's pid file that there is no memory to judge: it may stay, it claims nothing.
  }
}

bool Claim::SetUpdating() {
  if (LookForUpdater(path) != Updater::kNone) return false;
  CacheLock claiming(path);
  if (claiming.Take(LOCK_EX, kLockTimeout) != CacheLock::Outcome::kTaken) {
    KELODR_LOG(DEBUG, __func__, "Failed to lock [%s]", claiming.Path().c_str());
    return false;
  }
  // Another process may have claimed the update between the look above and the lock.
  if (IsClaimed(path)) {
    KELODR_LOG(DEBUG, __func__, "there is other process to update cache [%s]", path.c_str());
    return false;
  }
  if (!CreatePidFile(pidFile)) {
    KELODR_LOG(DEBUG, __func__, "Failed to set cache [%s] updating", path.c_str());
    return false;
  }
  own.Enlist();
  KELODR_LOG(DEBUG, __func__, "---> Start to update cache [%s]", path.c_str());
  return true;
}

bool Claim::Lock() {
  try {
    return lock.Take(LOCK_EX, kReleaseTimeout) == CacheLock::Outcome::kTaken;
  } catch (const std::bad_alloc&) {
    return false;
  }
}

void Claim::UnsetUpdating() {
  if (!Lock()) {
    KELODR_LOG(NOTICE, __func__, "Failed to lock to unset cache[%s]", path.c_str());
  }
  // Nobody's only when two looks agree: one may fail, and the file may be another's.
  if (ClaimantOf(pidFile) > 0 || ClaimantOf(pidFile) > 0) {
    // What cannot be read now may be another's, and one's own is found by the next look.
    const int claimant = KLIBCReadPidFile(pidFile.c_str());
    if (claimant != getpid()) {
      KELODR_LOG(DEBUG, __func__, "Failed to unset updating cache [%s] since different pid[%d]",
                 pidFile.c_str(), claimant);
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

// For a forked child. If another thread was inside syslog at the fork, the locks of the log and of
// the time zone are taken for ever here: then SIGALRM ends the child, before it claims anything.
void ShowThatLogWorks() {
  constexpr unsigned int kSeconds = 5;
  struct sigaction byDefault = {};
  struct sigaction handler = {};
  sigset_t signals;
  sigset_t mask;
  byDefault.sa_handler = SIG_DFL;
  sigemptyset(&signals);
  sigaddset(&signals, SIGALRM);
  sigaction(SIGALRM, &byDefault, &handler);
  pthread_sigmask(SIG_UNBLOCK, &signals, &mask);
  alarm(kSeconds);
  setlogmask(setlogmask(0));
  tzset();
  alarm(0);
  pthread_sigmask(SIG_SETMASK, &mask, nullptr);
  sigaction(SIGALRM, &handler, nullptr);
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
  if (!ReadDocument(document, path, Whose::kBelieved)) {
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
  // A fetch reads its own cache.
  if (OwnClaim::IsMade(OwnClaim::By::kThisThread, path)) return true;
  switch (LookForUpdater(path)) {
    case Updater::kNone:
      return required ? UpdateUnderClaim() : UpdateInBackground();
    case Updater::kSomebody:
      return !required || WaitForUpdate();
    default:
      return false;
  }
}

bool Cache::UpdateInBackground() const {
  const int pid = ForkWithoutLocks(kDetached);
  if (pid < 0) {
    KELODR_LOG(WARN, "Update", "Failed to fork(). errno=[%d/%m]", errno);
    return false;
  }
  if (pid > 0) return true;
  // Nothing of the caller's goes on in the child: neither its frames nor its exit handlers nor what
  // it had in its stream buffers.
  try {
    ShowThatLogWorks();
    UpdateUnderClaim();
  } catch (...) {
    // Nobody is there to be told.
  }
  _exit(0);
}

bool Cache::UpdateUnderClaim() const {
  Claim claim(path);
  return claim.SetUpdating() && DoUpdate();
}

bool Cache::WaitForUpdate() const {
  KELODR_LOG(DEBUG, "Update", "start to block wait cache [%s] ", path.c_str());
  Updater updater = Updater::kSomebody;
  do {
    RandomSleepInMSec(300, 1000);
    updater = LookForUpdater(path);
  } while (updater == Updater::kSomebody && IsTimeout());
  KELODR_LOG(DEBUG, "Update", "finish to block wait cache [%s] ", path.c_str());
  return updater != Updater::kUnknown;
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
  const auto write = [this, &document] {
    KELODR_PRIVILEGED();
    return ReplaceDocument(document, path, Whose::kBelieved);
  };
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
  const int wholeSeconds = static_cast<int>(std::clamp<double>(seconds, INT_MIN, INT_MAX));
  document["max_updated_time"] = std::max(GetMaxUpdateTime(), wholeSeconds);
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
  if (!ReadDocument(document, path, Whose::kBelieved) || !document.isObject()) return 0;
  const Json::Value& seconds = document["max_updated_time"];
  return seconds.isInt() ? seconds.asInt() : 0;
}

int Cache::Remove() { return unlink(path.c_str()); }

}  // namespace KeloDRCore
