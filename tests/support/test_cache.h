// A cache whose subclass operations a test sets, and the fixture of the tests that use it.

#ifndef KELODRCORE_TESTS_SUPPORT_TEST_CACHE_H_
#define KELODRCORE_TESTS_SUPPORT_TEST_CACHE_H_

#include <json/json.h>

#include <functional>
#include <string>

#include "kelodrcore/cache.h"
#include "support/clean_test.h"

// Any data but null is valid; what a test does not set behaves as the base class does.
class TestCache : public KeloDRCore::Cache {
 public:
  using Cache::Cache;

  Json::Value GetInfo() const override {
    Json::Value info;
    info["name"] = "test";
    return info;
  }
  Json::Value GetDefaultValue() const override {
    return defaultValue.isNull() ? Cache::GetDefaultValue() : defaultValue;
  }
  bool GetUpdatedData(Json::Value& out) const override { return fetch(out); }
  bool IsValidData(const Json::Value& data) const override { return isValid(data); }
  bool IsNeedUpdate(const Json::Value& data) const override {
    return isNeedUpdate ? isNeedUpdate(data) : Cache::IsNeedUpdate(data);
  }

  // Lets the fetches succeed with this document.
  void FetchGives(const Json::Value& data) {
    fetch = [data](Json::Value& out) {
      out = data;
      return true;
    };
  }

  Json::Value defaultValue;
  std::function<bool(Json::Value&)> fetch = [](Json::Value&) { return false; };
  std::function<bool(const Json::Value&)> isValid = [](const Json::Value& data) {
    return !data.isNull();
  };
  std::function<bool(const Json::Value&)> isNeedUpdate;
};

// Each test has a directory for its caches. Teardown fails when anything but cache files is left in
// it, and removes the lock files. Skipped where no lock can be made.
class CacheFixture : public CleanTest {
 protected:
  void SetUp() override;
  void TearDown() override;

  // The cache in the file at `path`: with these settings, it is stale only when it is missing.
  TestCache MakeCache(bool alwaysRequired = true, int retryLimit = 0, long timeout = 1000) const {
    return {cacheDir, "c", timeout, alwaysRequired, retryLimit};
  }

  // Writes a cache file that holds `data`, last modified `age` seconds ago.
  void WriteCacheFile(const std::string& data, int age = 0) const;

  // Writes any text as the cache file.
  void WriteCacheText(const std::string& text) const { WriteText(path, text); }

  // Sets the modification time of the cache file in seconds since the epoch.
  void SetMtime(time_t seconds) const;

  // So many sleeps that a CountingGenerator gives each length of their range.
  static constexpr int kManySleeps = 800;

  // Expects that the sleeps skipped since the last look are kManySleeps, of each length of that
  // range, in milliseconds.
  static void ExpectManySleepsFrom(unsigned int low, unsigned int high);

  // The lines of a cache's course, for the cache of MakeCache().
  LogLine NoData() const {
    return Debug("cache.cpp", "Load", "no data is cached in [" + path + "]");
  }
  LogLine UsesDefault() const {
    return Debug("cache.cpp", "GetCachedData",
                 "Failed to load cache [" + path + "], use default cache data");
  }
  LogLine Starts() const {
    return Debug("cache.cpp", "SetUpdating", "---> Start to update cache [" + path + "]");
  }
  LogLine Finishes() const {
    return Debug("cache.cpp", "UnsetUpdating", "<--- Finish to update cache [" + path + "]");
  }
  static LogLine FetchFailed(int retryLimit) {
    return Debug("cache.cpp", "DoUpdate",
                 R"(Failed to get updated cache [{"name":"test"}] and reach the retry limit[)" +
                     std::to_string(retryLimit) + "]");
  }
  LogLine WriteFailed(int retryLimit) const {
    return Debug("cache.cpp", "UpdateWithData",
                 "Failed to write cache to file [" + path + "] and reach retry limit[" +
                     std::to_string(retryLimit) + "]");
  }
  static LogLine ReadFailed() {
    return Debug("cache.cpp", "Read",
                 R"(Failed to update cache [{"name":"test"}], use old cache data.)");
  }

  std::string cacheDir;
  std::string path;
  std::string pidFile;
  std::string lockName;
};

#endif  // KELODRCORE_TESTS_SUPPORT_TEST_CACHE_H_
