// What one process sees of a cache: its file and its memory.

#include "kelodrcore/cache.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <filesystem>
#include <functional>
#include <utility>

#include "kelodrcore/json_value.h"
#include "support/test_cache.h"
#include "support/test_clock.h"

namespace {

namespace JsonValue = KeloDRCore::JsonValue;

// Called when a modification time is about to be looked at.
std::function<void()> onAccess;

}  // namespace

// Stands before the C library's.
extern "C" int access(const char* path, int mode) noexcept {
  if (onAccess) onAccess();
  return static_cast<int>(syscall(SYS_faccessat, AT_FDCWD, path, mode));
}

namespace {

constexpr time_t kNow = 1000000;

class CacheTest : public CacheFixture {
 protected:
  void TearDown() override {
    onAccess = nullptr;
    CacheFixture::TearDown();
  }
};

// --- Construction

TEST_F(CacheTest, LivesInDirAndFileWithTheEndingCached) {
  EXPECT_TRUE(MakeCache().UpdateWithData(1));
  EXPECT_EQ(NamesIn(cacheDir), std::vector<std::string>{"c.cached"});
  ExpectLog({});
}

TEST_F(CacheTest, CreatesAMissingDirectoryWithMode0755) {
  cacheDir = Path("new/dirs");
  const mode_t oldMask = umask(0077);
  MakeCache();
  umask(oldMask);
  struct stat status {};
  ASSERT_EQ(stat(cacheDir.c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 07777U, 0755U);
  ExpectLog({});
}

TEST_F(CacheTest, KeepsTheModeOfADirectoryThatIsThere) {
  ASSERT_EQ(chmod(cacheDir.c_str(), 0700), 0);
  MakeCache();
  struct stat status {};
  ASSERT_EQ(stat(cacheDir.c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 07777U, 0700U);
}

TEST_F(CacheTest, WarnsOfAnEmptyDirOrFile) {
  const struct { std::string dir, file; } rows[] = {{"", "f"}, {"/d", ""}, {"", ""}};
  for (const auto& row : rows) {
    const TestCache cache(row.dir, row.file, 1, true, 0);
    ExpectLog({Warn("cache.cpp", "GetCachedPath",
                    "Invalid dir[" + row.dir + "] and file[" + row.file + "] to cache")});
  }
  EXPECT_FALSE(std::filesystem::exists("/d"));
}

TEST_F(CacheTest, FallsBackToADefaultFileWithoutDirOrFile) {
  RunWithOwnTmp("1m", [] {
    TestCache cache("", "f", 1000, true, 0);
    cache.fetch = [](Json::Value& out) {
      EXPECT_TRUE(std::filesystem::exists("/tmp/default_dr_cache.pid"));
      EXPECT_TRUE(std::filesystem::exists("/tmp/.kelodr_lock//tmp/default_dr_cache.lock"));
      out = 7;
      return true;
    };
    EXPECT_TRUE(cache.Update());
    EXPECT_EQ(NamesIn("/tmp"), (std::vector<std::string>{".kelodr_lock", "default_dr_cache"}));
  });
}

TEST_F(CacheTest, FallsBackToTheDefaultFileWhenTheDirectoryCannotBeCreated) {
  RunWithOwnTmp("1m", [] {
    WriteText("/tmp/file", "");
    const TestCache cache("/tmp/file/d", "f", 1000, true, 0);
    ExpectLog({Err("file.cpp", "CreateDir", "Failed to create dir [/tmp/file/d] with mode [755]"),
               Err("cache.cpp", "GetCachedPath", "Failed to create [/tmp/file/d]")});
    EXPECT_TRUE(cache.UpdateWithData(1));
    EXPECT_EQ(NamesIn("/tmp"), (std::vector<std::string>{"default_dr_cache", "file"}));
  });
}

// --- Load

TEST_F(CacheTest, LoadOfAMissingFileFailsAndKeepsTheDocument) {
  WriteCacheFile("5");
  TestCache cache = MakeCache();
  EXPECT_TRUE(cache.Load());
  EXPECT_EQ(cache.Remove(), 0);
  EXPECT_FALSE(cache.Load());
  ExpectLog({NoData()});
  WriteCacheText("{}");
  EXPECT_EQ(cache.GetCachedData(), 5);
}

TEST_F(CacheTest, LoadOfAFileThatIsNotJsonFailsAndKeepsTheDocument) {
  const TestCache cache = MakeCache();
  EXPECT_TRUE(cache.UpdateWithData(5));
  for (const char* text : {"", "{\"cached_data\":", "{\"cached_data\":1}x"}) {
    WriteCacheText(text);
    EXPECT_FALSE(cache.Load()) << text;
    ExpectLog({Debug("cache.cpp", "Load", "Failed to read data from cache [" + path + "]")});
  }
  WriteCacheText("{}");
  SetMtime(kNow);
  EXPECT_EQ(cache.GetCachedData(), 5);
}

TEST_F(CacheTest, LoadTakesDataOfAnyType) {
  const TestCache cache = MakeCache();
  for (const char* text : {"[1,2]", "\"text\"", "true", "1.5", "{\"a\":{}}", "null"}) {
    WriteCacheFile(text);
    EXPECT_TRUE(cache.Load());
    EXPECT_EQ(JsonValue::toString(cache.GetCachedData()), text);
  }
}

TEST_F(CacheTest, LoadOfADocumentWithoutDataSucceedsAndKeepsTheDocument) {
  const TestCache cache = MakeCache();
  for (const char* text : {"{}", "{\"other\":1}", "null", "[]", "[[\"cached_data\"]]", "7",
                           "\"cached_data\"", "true", "-1.5"}) {
    WriteCacheFile("5");
    EXPECT_TRUE(cache.Load());
    WriteCacheText(text);
    SetMtime(kNow);
    EXPECT_TRUE(cache.Load()) << text;
    EXPECT_EQ(cache.GetCachedData(), 5) << text;
    // The file counts as loaded: nothing of the same time is read.
    WriteCacheFile("6");
    SetMtime(kNow);
    EXPECT_EQ(cache.GetCachedData(), 5) << text;
  }
  ExpectLog({});
}

TEST_F(CacheTest, AFileReplacedWhileItIsLoadedIsNoticed) {
  WriteCacheFile("1");
  SetMtime(kNow);
  const TestCache cache = MakeCache();
  bool replaced = false;
  onAccess = [&] {
    if (std::exchange(replaced, true)) return;
    WriteCacheFile("2");
    SetMtime(kNow + 1);
  };
  EXPECT_TRUE(cache.Load());
  EXPECT_TRUE(replaced);
  EXPECT_EQ(cache.GetCachedData(), 2);
}

// --- GetCachedData

TEST_F(CacheTest, AnswersFromMemoryWhileTheModificationTimeIsTheSame) {
  WriteCacheFile("1");
  SetMtime(kNow);
  const TestCache cache = MakeCache();
  EXPECT_EQ(cache.GetCachedData(), 1);
  WriteCacheFile("2");
  SetMtime(kNow);
  EXPECT_EQ(cache.GetCachedData(), 1);
  SetMtime(kNow - 1);
  EXPECT_EQ(cache.GetCachedData(), 2);
}

TEST_F(CacheTest, GivesTheDefaultValueWhenNothingCanBeLoaded) {
  TestCache cache = MakeCache();
  EXPECT_EQ(cache.GetCachedData(), Json::Value());
  ExpectLog({NoData(), UsesDefault()});
  cache.defaultValue = "default";
  EXPECT_EQ(cache.GetCachedData(), "default");
  ExpectLog({NoData(), UsesDefault()});
  WriteCacheText("{");
  EXPECT_EQ(cache.GetCachedData(), "default");
  ExpectLog(
      {Debug("cache.cpp", "Load", "Failed to read data from cache [" + path + "]"), UsesDefault()});
}

TEST_F(CacheTest, TheDefaultValueReplacesTheDocumentInMemory) {
  TestCache cache = MakeCache();
  cache.defaultValue = "default";
  EXPECT_TRUE(cache.UpdateWithData(5));
  EXPECT_EQ(cache.Remove(), 0);
  EXPECT_EQ(cache.GetCachedData(), "default");
  WriteCacheText("{}");
  EXPECT_EQ(cache.GetCachedData(), "default");
  ExpectLog({NoData(), UsesDefault()});
}

TEST_F(CacheTest, LoadsAFileThatComesBackWithItsOldModificationTime) {
  WriteCacheFile("1");
  SetMtime(kNow);
  TestCache cache = MakeCache();
  EXPECT_EQ(cache.GetCachedData(), 1);
  EXPECT_EQ(cache.Remove(), 0);
  EXPECT_EQ(cache.GetCachedData(), Json::Value());
  WriteCacheFile("2");
  SetMtime(kNow);
  EXPECT_EQ(cache.GetCachedData(), 2);
  ExpectLog({NoData(), UsesDefault()});
}

TEST_F(CacheTest, GivesACopyOfTheDocument) {
  WriteCacheFile("[1]");
  const TestCache cache = MakeCache();
  Json::Value data = cache.GetCachedData();
  data.append(2);
  EXPECT_EQ(JsonValue::toString(cache.GetCachedData()), "[1]");
}

TEST_F(CacheTest, AModificationTimeBeyond32BitsIsOneLikeAnyOther) {
  WriteCacheFile("1");
  SetMtime((time_t{1} << 32) - 1);
  const TestCache cache = MakeCache();
  EXPECT_EQ(cache.GetCachedData(), 1);
  EXPECT_FALSE(cache.IsTimeout());
}

// -1 alone stands for a file that cannot be looked at.
TEST_F(CacheTest, AModificationTimeBefore1970IsOneLikeAnyOther) {
  const TestCache cache = MakeCache();
  const auto expectLoaded = [&](const char* data) {
    WriteCacheFile(data);
    SetMtime(-2);
    EXPECT_EQ(JsonValue::toString(cache.GetCachedData()), data);
  };
  expectLoaded("1");
  std::filesystem::remove(path);
  EXPECT_TRUE(cache.GetCachedData().isNull());
  expectLoaded("2");
  ExpectLog({NoData(), UsesDefault()});
}

// --- IsTimeout

TEST_F(CacheTest, AMissingFileIsStaleWhateverTheTimeout) {
  for (const long timeout : {0L, 1000L, -1L, LONG_MAX}) {
    EXPECT_TRUE(MakeCache(true, 0, timeout).IsTimeout());
  }
}

TEST_F(CacheTest, AFileIsStaleWhenItsAgeIsAboveTheTimeout) {
  WriteCacheFile("1");
  SetMtime(kNow);
  const struct {
    long timeout, age;
    bool stale;
  } rows[] = {{10, 9, false}, {10, 10, false}, {10, 11, true},   {0, 0, false},
              {0, 1, true},   {-1, 0, true},   {10, -50, false}, {LONG_MAX, 500000, false}};
  for (const auto& row : rows) {
    TestClock::SetTime(kNow + row.age);
    EXPECT_EQ(MakeCache(true, 0, row.timeout).IsTimeout(), row.stale)
        << row.age << " of " << row.timeout;
  }
}

TEST_F(CacheTest, EveryFileIsStaleWhenTheTimeIsNotKnown) {
  WriteCacheFile("1");
  TestClock::SetTime(-1);
  EXPECT_TRUE(MakeCache().IsTimeout());
}

// --- GetMaxUpdateTime

TEST_F(CacheTest, MaxUpdateTimeIsThatOfTheFileOr0) {
  const TestCache cache = MakeCache();
  EXPECT_EQ(cache.GetMaxUpdateTime(), 0);
  const struct {
    const char* text;
    int expected;
  } rows[] = {{"{\"max_updated_time\":5}", 5},
              {"{\"max_updated_time\":-5}", -5},
              {"{\"max_updated_time\":2147483647}", INT_MAX},
              {"{\"max_updated_time\":2147483648}", 0},
              {"{\"max_updated_time\":18446744073709551615}", 0},
              {"{\"max_updated_time\":1e300}", 0},
              {"{\"max_updated_time\":5.5}", 0},
              {"{\"max_updated_time\":\"5\"}", 0},
              {"{\"max_updated_time\":true}", 0},
              {"{\"max_updated_time\":null}", 0},
              {"{\"max_updated_time\":[5]}", 0},
              {"{}", 0},
              {"null", 0},
              {"[5]", 0},
              {"5", 0},
              {"\"max_updated_time\"", 0},
              {"{", 0},
              {"", 0}};
  for (const auto& row : rows) {
    WriteCacheText(row.text);
    EXPECT_EQ(cache.GetMaxUpdateTime(), row.expected) << row.text;
  }
  ExpectLog({});
}

// --- Documents that are not believed

// Whatever stands at the path: it is as good as missing, and the next write replaces it.
class UnbelievedCacheTest : public CacheTest {
 protected:
  void ExpectMissing() {
    const TestCache cache = MakeCache(false);
    EXPECT_TRUE(cache.IsTimeout());
    EXPECT_EQ(cache.GetMaxUpdateTime(), 0);
    EXPECT_EQ(cache.GetCachedData(), Json::Value());
    ExpectLog({Debug("cache.cpp", "Load", "Failed to read data from cache [" + path + "]"),
               UsesDefault()});
    EXPECT_TRUE(cache.UpdateWithData("own"));
    EXPECT_EQ(MakeCache().GetCachedData(), "own");
    struct stat status {};
    ASSERT_EQ(lstat(path.c_str(), &status), 0);
    EXPECT_TRUE(S_ISREG(status.st_mode));
    EXPECT_EQ(status.st_uid, geteuid());
  }

  static constexpr char kDocument[] = R"({"cached_data":"planted","max_updated_time":5})";
};

TEST_F(UnbelievedCacheTest, ALinkIsNotFollowed) {
  WriteText(Path("target"), kDocument);
  std::filesystem::create_symlink(Path("target"), path);
  ExpectMissing();
  EXPECT_EQ(ReadText(Path("target")), kDocument);
}

TEST_F(UnbelievedCacheTest, AQueueHoldsNobodyUp) {
  ASSERT_EQ(mkfifo(path.c_str(), 0666), 0);
  const TestCache cache = MakeCache();
  EXPECT_TRUE(cache.IsTimeout());
  EXPECT_FALSE(cache.Load());
  EXPECT_EQ(cache.GetMaxUpdateTime(), 0);
  ExpectLog({Debug("cache.cpp", "Load", "Failed to read data from cache [" + path + "]")});
  std::filesystem::remove(path);
}

TEST_F(UnbelievedCacheTest, AStrangersDocumentIsNotTaken) {
  if (geteuid() != 0) GTEST_SKIP() << "needs root to make a stranger's file";
  WriteCacheText(kDocument);
  ASSERT_EQ(chown(path.c_str(), 4711, 4711), 0);
  ExpectMissing();
}

TEST_F(UnbelievedCacheTest, TheDirectorysOwnerIsBelievedUnlessAllMayWriteThere) {
  if (geteuid() != 0) GTEST_SKIP() << "needs root to make a stranger's file";
  WriteCacheText(kDocument);
  ASSERT_EQ(chown(path.c_str(), 4711, 4711), 0);
  ASSERT_EQ(chown(cacheDir.c_str(), 4711, 4711), 0);
  EXPECT_EQ(MakeCache().GetCachedData(), "planted");
  ASSERT_EQ(chmod(cacheDir.c_str(), 01777), 0);
  ExpectMissing();
}

// --- The rest

TEST_F(CacheTest, FreshDataIsRequiredAlwaysOrWhenTheDataIsNotValid) {
  WriteCacheFile("1");
  EXPECT_TRUE(MakeCache(true).IsUpdatedDataRequired());
  EXPECT_FALSE(MakeCache(false).IsUpdatedDataRequired());
  WriteCacheFile("null");
  EXPECT_TRUE(MakeCache(false).IsUpdatedDataRequired());
  ExpectLog({});
}

TEST_F(CacheTest, RemoveUnlinksTheFile) {
  WriteCacheFile("1");
  TestCache cache = MakeCache();
  EXPECT_EQ(cache.Remove(), 0);
  EXPECT_EQ(NamesIn(cacheDir), std::vector<std::string>{});
  EXPECT_EQ(cache.Remove(), -1);
  EXPECT_EQ(errno, ENOENT);
  ExpectLog({});
}

}  // namespace
