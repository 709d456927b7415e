/// @file
/// A JSON document that is expensive to compute, kept in a file that all processes share.

#ifndef KELODRCORE_CACHE_H_
#define KELODRCORE_CACHE_H_

#include <json/json.h>

#include <string>

#include "kelodrcore/export.h"

namespace KeloDRCore {

/// A cached JSON document: read by every process, refreshed by one at a time.
///
/// A subclass tells how fresh data is fetched and judged. This class keeps the file, answers from
/// memory while the file is unchanged, and lets only one process fetch: it claims the update with a
/// pid file (the cache file's path + ".pid") under a `FileLock` (named that path + ".lock"). The
/// lock is held only while the pid file is looked at or changed, never during the fetch. A claim
/// whose process has died is no claim. A claim of this process that its release left behind is
/// given up at the next use.
///
/// The file holds one JSON object: "timeout", "info" (`GetInfo()`), "cached_data",
/// "begin_time_to_update" and "finish_time_to_update" (seconds since the epoch, both 0 when
/// unknown), "updated_time" (the seconds between the two) and "max_updated_time" (the largest of
/// these so far, a whole number). It is replaced in one step, as root. Only "cached_data" and
/// "max_updated_time" are read back. The file's age is that of its modification time, and a change
/// of the file is noticed by that time too, in whole seconds, deliberately.
///
/// Both files count only when they are regular files of root, of the effective user, or of the
/// owner of their directory, the last not in a directory that all may write. Any other document
/// counts as missing, any other pid file as no claim, and the next write replaces it.
///
/// Messages of the cache's course are logged at DEBUG, and at NOTICE when the lock to release a
/// claim cannot be had or the pid file cannot be removed. What the subclass throws reaches the
/// caller, with the claim released. Throws `Json::RuntimeError` where JsonCpp throws it instead of
/// `std::bad_alloc`.
///
/// An object is used by one thread at a time, its const operations too. A fetch may read its own
/// cache, through any object, in the thread in which it runs: it gets the data that is there. A
/// signal ends a pause between two tries or looks early. What is called deliberate here is frozen.
class KELODR_EXPORT Cache {
 public:
  /// The cache file is `dir` + "/" + `file` + ".cached"; a missing `dir` is created with mode 0755.
  /// When one of the two is empty (a line at WARN) or the directory cannot be created (a line at
  /// ERR), the file is "/tmp/default_dr_cache".
  ///
  /// `timeoutSeconds` is the age in seconds beyond which the file is stale. With `isAlwaysRequired`
  /// every reader waits for fresh data instead of going on with stale data. A fetch, and the
  /// writing of the file, is tried at most `retries` + 2 times, but at least once; that count is
  /// deliberate.
  Cache(const std::string& dir, const std::string& file, long timeoutSeconds, bool isAlwaysRequired,
        int retries);

  virtual ~Cache();

  /// A document that names the cache: written as "info" and quoted in log lines.
  [[nodiscard]] virtual Json::Value GetInfo() const = 0;

  /// The document to use when none can be loaded; null by default.
  [[nodiscard]] virtual Json::Value GetDefaultValue() const;

  /// Computes fresh data into `out`, which is null at the call; false when that failed. Runs in the
  /// calling process or in a forked one. The forked one has its standard streams on /dev/null,
  /// holds no `FileLock` of its caller, and must not use a `SqliteDB` that its caller has open: a
  /// fetch opens its own.
  virtual bool GetUpdatedData(Json::Value& out) const = 0;

  /// True when the data is usable. Data that is not is neither written nor taken for current.
  [[nodiscard]] virtual bool IsValidData(const Json::Value& data) const = 0;

  /// True when the data has to be refreshed although the file is not stale; false by default.
  [[nodiscard]] virtual bool IsNeedUpdate(const Json::Value& data) const;

  /// True when a caller of `Update` waits for fresh data, false when a background process may
  /// refresh it. By default true with `isAlwaysRequired`, or when `GetCachedData()` is not valid.
  [[nodiscard]] virtual bool IsUpdatedDataRequired() const;

  /// The current data, after an `Update` when the file is stale or its data is not valid or needs
  /// one. After a failed update (a line at DEBUG) the old data, or the default value.
  Json::Value Read() const;

  /// The document in memory, loaded anew when the file has changed. When it cannot be loaded, the
  /// default value, which also replaces the document in memory.
  Json::Value GetCachedData() const;

  /// Loads the document from the file. False, and the document in memory is unchanged, when the
  /// file is missing or is not JSON. A file without "cached_data" counts as loaded and leaves the
  /// document as it was.
  bool Load() const;

  /// Refreshes the data, in one process at a time.
  ///
  /// When no process is refreshing, and fresh data is required (`IsUpdatedDataRequired`), the
  /// calling process refreshes; the result is that of `DoUpdate`, or false when another process was
  /// quicker to claim the update. When it is not required, a detached child refreshes, which is not
  /// waited for, and the result is true; false when the fork failed (a line at WARN). A child that
  /// cannot log, because another thread was logging at the fork, claims nothing and ends.
  ///
  /// When another process is refreshing, the result is true: at once, or, when fresh data is
  /// required, once the file is no longer stale or no process is refreshing any more. That wait has
  /// no bound of its own. Inside a fetch of the same cache the result is true at once.
  ///
  /// False at once when the lock cannot be opened; the lines of `FileLock` say why.
  bool Update() const;

  /// Fetches and writes the data without claiming the update; sleeps 500 to 1000 ms between two
  /// fetches. False when the fetch or the write failed for good.
  bool DoUpdate() const;

  /// @{
  /// Writes valid data to the file, and takes it as the document in memory.
  /// `begin` and `finish` are the seconds since the epoch at which the fetch began and ended; when
  /// one of them is below 1, or without them, both are written as unknown. Sleeps 300 to 1000 ms
  /// between two tries. False for data that is not valid, or when the file could not be written;
  /// the old file and the document in memory are then as they were.
  bool UpdateWithData(const Json::Value& data, long long begin, long long finish) const;
  bool UpdateWithData(const Json::Value& data) const;
  /// @}

  /// True when the file is missing or older than the time-out. A modification time in the future is
  /// not stale.
  [[nodiscard]] bool IsTimeout() const;

  /// "max_updated_time" of the file in seconds; 0 when the file or that member is missing or is not
  /// what it should be.
  [[nodiscard]] int GetMaxUpdateTime() const;

  /// Removes the file; the result of POSIX `unlink`.
  int Remove();

 private:
  KELODR_LOCAL bool UpdateInBackground() const;
  KELODR_LOCAL bool UpdateUnderClaim() const;
  KELODR_LOCAL bool WaitForUpdate() const;
  KELODR_LOCAL Json::Value MakeDocument(const Json::Value& data, long long begin,
                                        long long finish) const;

  std::string path;
  long timeout;
  bool alwaysRequired;
  int retryLimit;
  mutable Json::Value cachedData;
  mutable int loadedMtime;
};

}  // namespace KeloDRCore

#endif  // KELODRCORE_CACHE_H_
