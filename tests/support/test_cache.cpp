#include "support/test_cache.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <ctime>
#include <filesystem>
#include <set>
#include <vector>

#include "support/test_clock.h"

void CacheFixture::SetUp() {
  CleanTest::SetUp();
  if (!CanLock()) GTEST_SKIP() << "the lock directory is another user's";
  cacheDir = Path("cache");
  std::filesystem::create_directory(cacheDir);
  path = cacheDir + "/c.cached";
  pidFile = path + ".pid";
  lockName = path + ".lock";
}

void CacheFixture::TearDown() {
  TestClock::Reset();
  for (const std::string& name : NamesIn(cacheDir)) EXPECT_EQ(name, "c.cached") << "left behind";
  std::error_code error;
  std::filesystem::remove_all("/tmp/.kelodr_lock" + dir, error);
  CleanTest::TearDown();
}

void CacheFixture::WriteCacheFile(const std::string& data, int age) const {
  WriteText(path, R"({"cached_data":)" + data + "}");
  if (age != 0) SetMtime(time(nullptr) - age);
}

void CacheFixture::SetMtime(time_t seconds) const {
  const timespec times[2] = {{seconds, 0}, {seconds, 0}};
  ASSERT_EQ(utimensat(AT_FDCWD, path.c_str(), times, 0), 0);
}

void CacheFixture::ExpectManySleepsFrom(unsigned int low, unsigned int high) {
  const std::vector<unsigned int> sleeps = TestClock::TakeSleeps();
  ASSERT_EQ(sleeps.size(), size_t{kManySleeps});
  std::set<unsigned int> expected;
  for (unsigned int length = low; length <= high; ++length) expected.insert(length * 1000);
  EXPECT_EQ(std::set<unsigned int>(sleeps.begin(), sleeps.end()), expected);
}
