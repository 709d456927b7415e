// What one process sees of a refresh: the fetches, the written document, the failures.

#include <grp.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <climits>
#include <filesystem>

#include "kelodrcore/json_value.h"
#include "support/test_cache.h"
#include "support/test_clock.h"

namespace {

namespace JsonValue = KeloDRCore::JsonValue;

constexpr time_t kNow = 1000000;
constexpr uid_t kNobody = 65534;

class CacheUpdateTest : public CacheFixture {
 protected:
  Json::Value ReadFile() const {
    Json::Value document;
    EXPECT_TRUE(JsonValue::fromFile(document, path));
    return document;
  }

  // Every skipped sleep since the last look lasted from `low` to `high` ms; their number.
  static size_t SleepsWithin(unsigned int low, unsigned int high) {
    const std::vector<unsigned int> sleeps = TestClock::TakeSleeps();
    for (const unsigned int sleep : sleeps) {
      EXPECT_GE(sleep, low * 1000);
      EXPECT_LE(sleep, high * 1000);
    }
    return sleeps.size();
  }

  // A directory that is not empty: no file can take its place.
  void BlockPath(const std::string& blocked) {
    std::filesystem::create_directories(blocked + "/in the way");
  }
};

// --- UpdateWithData

TEST_F(CacheUpdateTest, WritesTheWholeDocument) {
  EXPECT_TRUE(MakeCache(true, 0, 77).UpdateWithData("data", 1000, 1007));
  EXPECT_EQ(JsonValue::toString(ReadFile()),
            R"({"begin_time_to_update":1000,"cached_data":"data","finish_time_to_update":1007,)"
            R"("info":{"name":"test"},"max_updated_time":7,"timeout":77,"updated_time":7.0})");
  ExpectLog({});
}

TEST_F(CacheUpdateTest, WritesUnknownTimesAs0) {
  const struct {
    long long begin, finish;
  } rows[] = {{0, 0}, {0, 9}, {9, 0}, {-1, 9}, {9, -1}, {LLONG_MIN, LLONG_MAX}};
  const TestCache cache = MakeCache();
  for (const auto& row : rows) {
    EXPECT_TRUE(cache.UpdateWithData(1, row.begin, row.finish));
    const Json::Value document = ReadFile();
    EXPECT_EQ(document["begin_time_to_update"], 0);
    EXPECT_EQ(document["finish_time_to_update"], 0);
    EXPECT_EQ(document["updated_time"], 0.0);
    EXPECT_EQ(document["max_updated_time"], 0);
  }
  EXPECT_TRUE(cache.UpdateWithData(1));
  EXPECT_EQ(ReadFile()["begin_time_to_update"], 0);
  EXPECT_EQ(ReadFile()["finish_time_to_update"], 0);
  EXPECT_TRUE(ReadFile()["updated_time"].isDouble());
}

TEST_F(CacheUpdateTest, KeepsTheLargestUpdateTime) {
  const struct {
    const char* before;
    long long begin, finish;
    int expected;
  } rows[] = {{"{\"max_updated_time\":5}", 10, 13, 5},
              {"{\"max_updated_time\":5}", 10, 17, 7},
              {"{\"max_updated_time\":\"50\"}", 10, 13, 3},
              {"[]", 10, 13, 3},
              {"{\"max_updated_time\":-9}", 13, 10, -3},
              {"{}", 13, 10, 0},
              {"{}", 1, LLONG_MAX, INT_MAX},
              {"{}", LLONG_MAX, 1, 0}};
  for (const auto& row : rows) {
    WriteCacheText(row.before);
    EXPECT_TRUE(MakeCache().UpdateWithData(1, row.begin, row.finish));
    EXPECT_EQ(ReadFile()["max_updated_time"], row.expected) << row.before << row.finish;
    EXPECT_EQ(ReadFile()["updated_time"].asDouble(), static_cast<double>(row.finish - row.begin));
  }
}

TEST_F(CacheUpdateTest, TheWrittenDataIsTheDocumentInMemory) {
  const TestCache cache = MakeCache();
  EXPECT_TRUE(cache.UpdateWithData("new"));
  struct stat status {};
  ASSERT_EQ(stat(path.c_str(), &status), 0);
  WriteCacheFile("\"other\"");
  SetMtime(status.st_mtime);
  EXPECT_EQ(cache.GetCachedData(), "new");
  ExpectLog({});
}

TEST_F(CacheUpdateTest, RefusesDataThatIsNotValid) {
  WriteCacheFile("1");
  TestCache cache = MakeCache();
  cache.isValid = [](const Json::Value& data) { return data.isInt(); };
  EXPECT_FALSE(cache.UpdateWithData(Json::Value("x"), 1, 2));
  ExpectLog({Debug("cache.cpp", "UpdateWithData",
                   R"(["x"] is not valid to update for cache [{"name":"test"}])")});
  EXPECT_FALSE(cache.UpdateWithData(Json::Value()));
  ExpectLog({Debug("cache.cpp", "UpdateWithData",
                   R"([null] is not valid to update for cache [{"name":"test"}])")});
  EXPECT_EQ(cache.GetCachedData(), 1);
}

TEST_F(CacheUpdateTest, TriesToWriteTwoMoreTimesThanTheRetryLimit) {
  BlockPath(path);
  TestClock::SkipSleeps();
  for (const int retryLimit : {0, 1, 4}) {
    EXPECT_FALSE(MakeCache(true, retryLimit).UpdateWithData(1));
    EXPECT_EQ(SleepsWithin(300, 1000), static_cast<size_t>(retryLimit + 1));
    ExpectLog({WriteFailed(retryLimit)});
  }
  for (const int retryLimit : {-1, -2, INT_MIN}) {
    EXPECT_FALSE(MakeCache(true, retryLimit).UpdateWithData(1));
    EXPECT_EQ(SleepsWithin(300, 1000), 0U);
    ExpectLog({WriteFailed(retryLimit)});
  }
  std::filesystem::remove_all(path);
}

TEST_F(CacheUpdateTest, SleepsFrom300To1000MsBetweenTwoWrites) {
  const CountingGenerator draws;
  BlockPath(path);
  TestClock::SkipSleeps();
  EXPECT_FALSE(MakeCache(true, kManySleeps - 1).UpdateWithData(1));
  ExpectManySleepsFrom(300, 1000);
  ExpectLog({WriteFailed(kManySleeps - 1)});
  std::filesystem::remove_all(path);
}

TEST_F(CacheUpdateTest, AWriteSucceedsAtALaterTry) {
  BlockPath(path);
  TestClock::SkipSleeps([this] { std::filesystem::remove_all(path); });
  EXPECT_TRUE(MakeCache(true, INT_MAX).UpdateWithData(9));
  EXPECT_EQ(SleepsWithin(300, 1000), 1U);
  EXPECT_EQ(ReadFile()["cached_data"], 9);
  ExpectLog({});
}

TEST_F(CacheUpdateTest, AFailedWriteKeepsTheDocumentInMemory) {
  WriteCacheFile("1");
  SetMtime(kNow);
  const TestCache cache = MakeCache(true, -1);
  EXPECT_EQ(cache.GetCachedData(), 1);
  ASSERT_EQ(cache.GetMaxUpdateTime(), 0);
  std::filesystem::remove(path);
  BlockPath(path);
  EXPECT_FALSE(cache.UpdateWithData(2));
  ExpectLog({WriteFailed(-1)});
  std::filesystem::remove_all(path);
  WriteCacheFile("3");
  SetMtime(kNow);
  EXPECT_EQ(cache.GetCachedData(), 1);
}

TEST_F(CacheUpdateTest, AFullDiskKeepsTheOldDocumentAndNoTemporary) {
  RunWithOwnTmp("64k", [] {
    TestClock::SkipSleeps();
    const TestCache cache("/tmp/d", "c", 1000, true, 0);
    ASSERT_TRUE(cache.UpdateWithData("old"));
    EXPECT_FALSE(cache.UpdateWithData(std::string(100000, 'x')));
    EXPECT_EQ(SleepsWithin(300, 1000), 1U);
    EXPECT_EQ(cache.GetCachedData(), "old");
    EXPECT_EQ(TestCache("/tmp/d", "c", 1000, true, 0).GetCachedData(), "old");
    EXPECT_EQ(NamesIn("/tmp/d"), std::vector<std::string>{"c.cached"});
    ExpectLog({Debug("cache.cpp", "UpdateWithData",
                     "Failed to write cache to file [/tmp/d/c.cached] and reach retry limit[0]")});
  });
}

// --- DoUpdate

TEST_F(CacheUpdateTest, FetchesTwoMoreTimesThanTheRetryLimit) {
  TestClock::SkipSleeps();
  for (const int retryLimit : {0, 1, 4, -1, -2, INT_MIN}) {
    TestCache cache = MakeCache(true, retryLimit);
    int fetches = 0;
    cache.fetch = [&](Json::Value&) { return ++fetches < 0; };
    EXPECT_FALSE(cache.DoUpdate());
    EXPECT_EQ(fetches, retryLimit < 0 ? 1 : retryLimit + 2);
    EXPECT_EQ(SleepsWithin(500, 1000), static_cast<size_t>(fetches - 1));
    ExpectLog({FetchFailed(retryLimit)});
  }
}

TEST_F(CacheUpdateTest, SleepsFrom500To1000MsBetweenTwoFetches) {
  const CountingGenerator draws;
  TestClock::SkipSleeps();
  EXPECT_FALSE(MakeCache(true, kManySleeps - 1).DoUpdate());
  ExpectManySleepsFrom(500, 1000);
  ExpectLog({FetchFailed(kManySleeps - 1)});
}

TEST_F(CacheUpdateTest, SleepsForRealBetweenTwoFetches) {
  timespec start{}, finish{};
  clock_gettime(CLOCK_MONOTONIC, &start);
  EXPECT_FALSE(MakeCache().DoUpdate());
  clock_gettime(CLOCK_MONOTONIC, &finish);
  EXPECT_GE((finish.tv_sec - start.tv_sec) * 1000 + (finish.tv_nsec - start.tv_nsec) / 1000000,
            500);
  ExpectLog({FetchFailed(0)});
}

TEST_F(CacheUpdateTest, EveryFetchStartsFromANullDocument) {
  TestClock::SkipSleeps();
  TestCache cache = MakeCache(true, INT_MAX);
  int fetches = 0;
  cache.fetch = [&](Json::Value& out) {
    EXPECT_TRUE(out.isNull());
    out["left behind"] = ++fetches;
    return fetches == 3;
  };
  EXPECT_TRUE(cache.DoUpdate());
  EXPECT_EQ(SleepsWithin(500, 1000), 2U);
  EXPECT_EQ(cache.GetCachedData()["left behind"], 3);
  ExpectLog({});
}

TEST_F(CacheUpdateTest, RecordsWhenTheFetchBeganAndEnded) {
  TestClock::SetTime(kNow);
  TestClock::SkipSleeps();
  TestCache cache = MakeCache();
  int fetches = 0;
  cache.fetch = [&](Json::Value& out) {
    TestClock::SetTime(kNow + 10 * ++fetches);
    out = 1;
    return fetches == 2;
  };
  EXPECT_TRUE(cache.DoUpdate());
  EXPECT_EQ(ReadFile()["begin_time_to_update"], Json::Int64{kNow});
  EXPECT_EQ(ReadFile()["finish_time_to_update"], Json::Int64{kNow + 20});
  EXPECT_EQ(ReadFile()["updated_time"], 20.0);
}

TEST_F(CacheUpdateTest, FetchedDataThatIsNotValidIsAFailureWithoutAnotherFetch) {
  TestCache cache = MakeCache(true, 5);
  cache.FetchGives(Json::Value());
  EXPECT_FALSE(cache.DoUpdate());
  ExpectLog({Debug("cache.cpp", "UpdateWithData",
                   R"([null] is not valid to update for cache [{"name":"test"}])")});
}

// --- Read

TEST_F(CacheUpdateTest, ReadGivesCurrentDataWithoutAFetch) {
  WriteCacheFile("1", 900);
  EXPECT_EQ(MakeCache().Read(), 1);
  ExpectLog({});
}

TEST_F(CacheUpdateTest, ReadRefreshesAStaleFile) {
  WriteCacheFile("1", 1100);
  TestCache cache = MakeCache();
  cache.FetchGives(2);
  EXPECT_EQ(cache.Read(), 2);
  ExpectLog({Starts(), Finishes()});
}

TEST_F(CacheUpdateTest, ReadRefreshesDataThatIsNotValid) {
  WriteCacheFile("null");
  TestCache cache = MakeCache(false);
  cache.FetchGives(2);
  EXPECT_EQ(cache.Read(), 2);
  ExpectLog({Starts(), Finishes()});
}

TEST_F(CacheUpdateTest, ReadRefreshesDataThatTheSubclassWantsRefreshed) {
  WriteCacheFile("1");
  TestCache cache = MakeCache();
  cache.isNeedUpdate = [](const Json::Value& data) { return data == 1; };
  cache.FetchGives(2);
  EXPECT_EQ(cache.Read(), 2);
  EXPECT_EQ(cache.Read(), 2);
  ExpectLog({Starts(), Finishes()});
}

TEST_F(CacheUpdateTest, ReadGivesOldDataWhenTheUpdateFails) {
  WriteCacheFile("1", 1100);
  EXPECT_EQ(MakeCache(true, -1).Read(), 1);
  ExpectLog({Starts(), FetchFailed(-1), Finishes(), ReadFailed()});
}

TEST_F(CacheUpdateTest, ReadGivesTheDefaultValueWhenThereIsNothingElse) {
  TestCache cache = MakeCache(true, -1);
  cache.defaultValue = "default";
  EXPECT_EQ(cache.Read(), "default");
  ExpectLog({NoData(), UsesDefault(), Starts(), FetchFailed(-1), Finishes(), ReadFailed()});
}

// --- Privileges

class CachePrivilegeTest : public CacheFixture {
 protected:
  void SetUp() override {
    CacheFixture::SetUp();
    ASSERT_EQ(chmod(dir.c_str(), 0755), 0);
  }

  static uid_t OwnerOf(const std::string& file) {
    struct stat status {};
    return stat(file.c_str(), &status) == 0 ? status.st_uid : kNobody;
  }
};

TEST_F(CachePrivilegeTest, FilesAreWrittenAndRemovedAsRootWhateverTheEffectiveIds) {
  if (geteuid() != 0) GTEST_SKIP() << "needs root";
  EXPECT_EQ(
      RunInChild([this] {
        TestCache cache = MakeCache();
        WriteText(pidFile, std::to_string(getpid()));  // left over, and removed first
        ASSERT_EQ(setegid(kNobody), 0);
        ASSERT_EQ(seteuid(kNobody), 0);
        cache.fetch = [this](Json::Value& out) {
          EXPECT_EQ(OwnerOf(pidFile), 0U);
          EXPECT_EQ(geteuid(), kNobody);
          EXPECT_EQ(getegid(), kNobody);
          out = 1;
          return true;
        };
        EXPECT_TRUE(cache.Update());
        EXPECT_EQ(OwnerOf(path), 0U);
        EXPECT_EQ(NamesIn(cacheDir), std::vector<std::string>{"c.cached"});
        EXPECT_EQ(geteuid(), kNobody);
        EXPECT_EQ(getegid(), kNobody);

        std::vector<LogLine> lines = LogCapture::Take();
        lines.erase(std::remove_if(lines.begin(), lines.end(),
                                   [](const LogLine& line) {
                                     return line.message.rfind("file_lock.cpp ", 0) == 0;
                                   }),
                    lines.end());
        const LogLine gid = Auth(LOG_AUTH | LOG_DEBUG, "cache.cpp WARNING: setresgid(-1, 0, -1)");
        const LogLine uid = Auth(LOG_AUTH | LOG_DEBUG, "cache.cpp WARNING: setresuid(-1, 0, -1)");
        EXPECT_EQ(lines, (std::vector<LogLine>{gid, uid, uid, gid, uid, uid, Starts(), gid, uid,
                                               uid, gid, uid, uid, Finishes()}));
      }),
      0);
}

TEST_F(CachePrivilegeTest, AnUnwritableDirectoryKeepsTheOldDocumentAndNoTemporary) {
  const bool isRoot = geteuid() == 0;
  ASSERT_TRUE(MakeCache().UpdateWithData("old"));
  ASSERT_EQ(chmod(cacheDir.c_str(), 0555), 0);
  EXPECT_EQ(RunInChild([this, isRoot] {
              std::vector<LogLine> lines = {
                  Debug("cache.cpp", "UpdateWithData",
                        "Failed to write cache to file [" + path + "] and reach retry limit[-1]")};
              if (isRoot) {
                ASSERT_EQ(setgroups(0, nullptr), 0);
                ASSERT_EQ(setresgid(kNobody, kNobody, kNobody), 0);
                ASSERT_EQ(setresuid(kNobody, kNobody, kNobody), 0);
                lines.insert(
                    lines.begin(),
                    {Auth(LOG_AUTH | LOG_ERR,
                          "cache.cpp ERROR: setresgid(-1, 0, -1) [Operation not permitted]"),
                     Auth(LOG_AUTH | LOG_ERR, "cache.cpp ERROR: ENTERCriticalSection")});
              }
              const TestCache cache = MakeCache(true, -1);
              EXPECT_FALSE(cache.UpdateWithData("new"));
              ExpectLog(lines);
              EXPECT_EQ(cache.GetCachedData(), "old");
            }),
            0);
  ASSERT_EQ(chmod(cacheDir.c_str(), 0755), 0);
  EXPECT_EQ(MakeCache().Read(), "old");
  EXPECT_EQ(NamesIn(cacheDir), std::vector<std::string>{"c.cached"});
}

}  // namespace
