#include <sys/stat.h>
#include <unistd.h>

#include "attack/attack.h"
#include "support/test_cache.h"

namespace {

constexpr char kFallback[] = "/tmp/default_dr_cache";
constexpr char kFallbackPid[] = "/tmp/default_dr_cache.pid";
constexpr char kEvil[] = R"({"cached_data":"evil","max_updated_time":77})";

// Without a directory: the file is kFallback.
TestCache MakeCache(const std::string& dir = "") {
  TestCache cache(dir, "c", 1000, true, 0);
  cache.FetchGives("fresh");
  return cache;
}

void ExpectRefreshed(TestCache& cache, const std::string& path, mode_t mode = 0644) {
  EXPECT_EQ(cache.Read(), "fresh");
  ExpectFile(path, 0, mode);
  EXPECT_FALSE(IsThere(path + ".pid"));
}

void ExpectNotBelieved(TestCache& cache, const std::string& path) {
  EXPECT_TRUE(cache.IsTimeout());
  EXPECT_EQ(cache.GetMaxUpdateTime(), 0);
  LogCapture::Clear();
  EXPECT_FALSE(cache.Load());
  EXPECT_EQ(LogCapture::Take(),
            std::vector<LogLine>{
                Debug("cache.cpp", "Load", "Failed to read data from cache [" + path + "]")});
  EXPECT_EQ(cache.GetCachedData(), Json::Value());
}

using CacheAttackTest = AttackTest;

TEST_F(CacheAttackTest, ALinkIsReplacedAndItsTargetStays) {
  for (const char* target : {kSecret, "/tmp/safe/ld.so.preload"}) {
    Attack([&] {
      AsUser([&] {
        MakeLink(target, kFallback);
        MakeLink(target, HomePath("c.cached"));
      });
      TestCache fallback = MakeCache();
      ExpectRefreshed(fallback, kFallback);
      TestCache own = MakeCache(kHome);
      ExpectRefreshed(own, HomePath("c.cached"));
    });
  }
}

TEST_F(CacheAttackTest, AnotherNameOfAFileIsReplacedAndTheFileStays) {
  Attack([] {
    // Made by root, as the user may where fs.protected_hardlinks is off.
    ASSERT_EQ(link(kSecret, kFallback), 0);
    TestCache cache = MakeCache();
    ExpectRefreshed(cache, kFallback, 0600);
    EXPECT_EQ(LookAt(kSecret).st_nlink, 1U);
  });
}

TEST_F(CacheAttackTest, AStrangersDocumentIsNotBelievedButReplaced) {
  Attack([] {
    AsUser([] { WriteText(kFallback, kEvil); });
    TestCache cache = MakeCache();
    ExpectNotBelieved(cache, kFallback);
    umask(027);
    ExpectRefreshed(cache, kFallback, 0640);
  });
}

TEST_F(CacheAttackTest, TheOwnerOfADirectoryIsNotBelievedWhereAllMayWrite) {
  Attack([] {
    AsUser([] {
      WriteText(HomePath("c.cached"), kEvil);
      ASSERT_EQ(chmod(kHome, 01777), 0);
    });
    TestCache cache = MakeCache(kHome);
    ExpectNotBelieved(cache, HomePath("c.cached"));
    ExpectRefreshed(cache, HomePath("c.cached"));
  });
}

TEST_F(CacheAttackTest, TheOwnerOfADirectoryIsBelievedAndKeepsHisFile) {
  Attack([] {
    const std::string path = HomePath("c.cached");
    AsUser([&] {
      WriteText(path, kEvil);
      ASSERT_EQ(chmod(path.c_str(), 0640), 0);
    });
    const TestCache cache = MakeCache(kHome);
    EXPECT_EQ(cache.Read(), "evil");
    EXPECT_TRUE(cache.UpdateWithData("new"));
    ExpectFile(path, kUser, 0640);
  });
}

TEST_F(CacheAttackTest, TheEffectiveUserAndRootAreBelievedAnywhere) {
  Attack([] {
    AsUser([] {
      WriteText(kFallback, kEvil);
      EXPECT_EQ(MakeCache().Read(), "evil");
    });
    ASSERT_EQ(unlink(kFallback), 0);
    WriteText(kFallback, R"({"cached_data":"root's"})");
    EXPECT_EQ(MakeCache().Read(), "root's");
    AsUser([] { EXPECT_EQ(MakeCache().Read(), "root's"); });
  });
}

TEST_F(CacheAttackTest, AStrangersPidFileIsNoClaim) {
  const std::string text = std::to_string(getpid()) + "\n";  // lives until the end of the test
  const std::function<void()> plants[] = {
      [&] { WriteText(kFallbackPid, text); },
      [&] {
        WriteText(HomePath("pid"), text);
        MakeLink(HomePath("pid"), kFallbackPid);
      },
      [] { MakeLink(kSecret, kFallbackPid); },
      [] { MakeQueue(kFallbackPid); },
  };
  for (const auto& plant : plants) {
    Attack([&] {
      AsUser(plant);
      TestCache cache = MakeCache();
      ExpectRefreshed(cache, kFallback);
    });
  }
}

TEST_F(CacheAttackTest, ALinkToAClaimOfRootsIsNoClaim) {
  Attack([] {
    WriteText(HomePath("pid"), std::to_string(getppid()) + "\n");
    AsUser([] { MakeLink(HomePath("pid"), kFallbackPid); });
    TestCache cache = MakeCache();
    ExpectRefreshed(cache, kFallback);
  });
}

TEST_F(CacheAttackTest, ADirectoryAtANameOfTheCacheIsNoLastingObstacle) {
  for (const char* name : {kFallback, kFallbackPid}) {
    Attack([&] {
      AsUser([&] {
        MakeDir(name, 0777, kUser);
        WriteText(std::string(name) + "/file", "");
        // What can be guessed of the name that it could get is taken as well.
        const std::string aside = name + (".planted-" + std::to_string(LookAt(name).st_ino));
        MakeDir(aside, 0777, kUser);
        WriteText(aside + "/file", "");
      });
      TestCache cache = MakeCache();
      ExpectRefreshed(cache, kFallback);
    });
  }
}

TEST_F(CacheAttackTest, AQueueAtTheDocumentsNameIsReplaced) {
  Attack([] {
    AsUser([] { MakeQueue(kFallback); });
    TestCache cache = MakeCache();
    ExpectNotBelieved(cache, kFallback);
    ExpectRefreshed(cache, kFallback);
  });
}

TEST_F(CacheAttackTest, WhatIsSwappedInTheFallbackIsNeitherFollowedNorBelieved) {
  Attack([] {
    const UserLoop user([] {
      unlink(kFallback);
      symlink(kSecret, kFallback);
      symlink(kSecret, kFallbackPid);
      symlink(kSecret, "/tmp/.default_dr_cache.kelodr-0");
      unlink(kFallback);
      WriteText(HomePath("evil"), kEvil);
      rename(HomePath("evil").c_str(), kFallback);
    });
    int refreshed = 0;
    Race([&] {
      TestCache cache = MakeCache();
      const Json::Value data = cache.Read();
      EXPECT_TRUE(data.isNull() || data == "fresh") << data;
      refreshed += data == "fresh";
      cache.Remove();
      LogCapture::Clear();
    });
    EXPECT_GT(refreshed, 0);
  });
}

TEST_F(CacheAttackTest, WhatIsSwappedInADirectoryOfTheUsersIsNotFollowed) {
  Attack([] {
    const UserLoop user([] {
      const std::string path = HomePath("c.cached");
      for (const std::string& name : {path, path + ".pid", HomePath(".c.cached.kelodr-0")}) {
        unlink(name.c_str());
        symlink(kSecret, name.c_str());
      }
      unlink(path.c_str());
      WriteText(path, "{}");
    });
    Race([] {
      EXPECT_NE(MakeCache(kHome).Read(), "secret");
      LogCapture::Clear();
    });
  });
}

}  // namespace
