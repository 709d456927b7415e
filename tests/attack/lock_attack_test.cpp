#include <sys/file.h>
#include <sys/mount.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>

#include "attack/attack.h"
#include "kelodrcore/file_lock.h"
#include "support/test_cache.h"

using KeloDRCore::FileLock;

namespace {

constexpr char kTop[] = "/tmp/.kelodr_lock";
constexpr int kExclusive = LOCK_EX | LOCK_NB;

std::string InTop(const std::string& name) { return std::string(kTop) + "/" + name; }

void ExpectRootsDirectory(const std::string& path) {
  const struct stat found = LookAt(path);
  EXPECT_EQ(found.st_mode, S_IFDIR | 0755U) << path;
  EXPECT_EQ(found.st_uid, 0U) << path;
}

void ExpectLocks(const std::string& name) { EXPECT_TRUE(FileLock(name).lock(kExclusive, 0)); }

// Expects that the lock cannot be had, and the lines that say that its directory cannot.
void ExpectNoDirectory(const std::string& name) {
  const std::string path = FileLock::getLockFilePath(name);
  const std::string dir = path.substr(0, path.rfind('/'));
  LogCapture::Clear();
  EXPECT_FALSE(FileLock(name).lock(kExclusive, 0));
  const std::vector<LogLine> expected = {
      Err("file_lock.cpp", "checkLockDir", "Failed to create lock dir [" + dir + "] in local host"),
      Err("file_lock.cpp", "openLockedFile",
          "Failed to check lock dir of lock file [" + path + "]."),
      Err("file_lock.cpp", "lock", "Bad fd [-1] to lock [" + path + "]")};
  std::vector<LogLine> lines = LogCapture::Take();
  // What raised the rights in vain says so first, and last, on its own account.
  lines.erase(std::remove_if(lines.begin(), lines.end(),
                             [](const LogLine& line) { return line.function.empty(); }),
              lines.end());
  EXPECT_EQ(lines, expected);
}

using LockAttackTest = AttackTest;

TEST_F(LockAttackTest, WhatStandsInPlaceOfTheLockDirectoryIsRemoved) {
  const std::function<void()> plants[] = {
      [] { MakeLink(kSafeDir, kTop); },
      [] { MakeLink(kHome, kTop); },
      [] { MakeLink(SafePath("missing"), kTop); },
      [] { MakeQueue(kTop); },
      [] { WriteText(kTop, ""); },
  };
  for (const auto& plant : plants) {
    Attack([&] {
      AsUser(plant);
      ExpectLocks("sub/name");
      ExpectRootsDirectory(kTop);
      ExpectRootsDirectory(InTop("sub"));
      EXPECT_EQ(NamesIn(kHome), Names{});
    });
  }
}

TEST_F(LockAttackTest, AStrangersDirectoryBecomesRoots) {
  for (const mode_t mode : {0755U, 0777U, 0700U}) {
    Attack([&] {
      AsUser([&] { MakeDir(kTop, mode, kUser); });
      ExpectLocks("name");
      ExpectRootsDirectory(kTop);
      AsUser([] { EXPECT_NE(unlink(InTop("name").c_str()), 0); });
    });
  }
}

TEST_F(LockAttackTest, ADirectoryThatOthersMayWriteIsClosedToThem) {
  Attack([] {
    MakeDir(kTop, 0777);
    ExpectLocks("name");
    ExpectRootsDirectory(kTop);
  });
}

TEST_F(LockAttackTest, ADirectoryThatOthersCannotWriteKeepsItsMode) {
  Attack([] {
    MakeDir(kTop, 0711);
    ExpectLocks("name");
    struct stat status = {};
    ASSERT_EQ(stat(kTop, &status), 0);
    EXPECT_EQ(status.st_mode & 07777, 0711U);
  });
}

TEST_F(LockAttackTest, AStrangersDirectoryBelowIsNotHisToChange) {
  Attack([] {
    AsUser([] {
      MakeDir(kTop, 0755, kUser);
      MakeDir(InTop("sub"), 0755, kUser);
    });
    FileLock lock("sub/name");
    ASSERT_TRUE(lock.lock(kExclusive, 0));
    AsUser([] { EXPECT_NE(unlink(InTop("sub/name").c_str()), 0); });
  });
}

TEST_F(LockAttackTest, WhatIsPlantedOnTheWayIsReplaced) {
  Attack([] {
    AsUser([] {
      MakeDir(kTop, 0755, kUser);
      MakeLink(kSafeDir, InTop("link"));
      MakeQueue(InTop("queue"));
      MakeDir(InTop("dir"), 0755, kUser);
      MakeLink(kSafeDir, InTop("dir/link"));
    });
    for (const char* step : {"link", "queue", "dir/link"}) {
      ExpectLocks(std::string(step) + "/sub/name");
      ExpectRootsDirectory(InTop(step));
    }
  });
}

TEST_F(LockAttackTest, ALinkOnTheWayIsNotFollowed) {
  Attack([] {
    MakeDir(kTop, 0755);
    MakeLink(kSafeDir, InTop("link"));
    ExpectNoDirectory("link/name");
    ExpectNoDirectory("link/sub/name");
  });
}

TEST_F(LockAttackTest, WhatIsPlantedAtALocksNameIsReplaced) {
  Attack([] {
    AsUser([] {
      MakeDir(kTop, 0755, kUser);
      MakeLink(kSecret, InTop("link"));
      MakeLink(SafePath("missing"), InTop("dangling"));
      MakeQueue(InTop("queue"));
      MakeDir(InTop("dir"), 0755, kUser);
    });
    for (const char* name : {"link", "dangling", "queue", "dir"}) {
      ExpectLocks(name);
      EXPECT_TRUE(S_ISREG(LookAt(InTop(name)).st_mode)) << name;
    }
  });
}

TEST_F(LockAttackTest, OnlyARegularFileIsALockFile) {
  Attack([] {
    MakeDir(kTop, 0755);
    MakeLink(kSecret, InTop("link"));
    MakeQueue(InTop("queue"));
    MakeDir(InTop("dir"), 0755);
    for (const char* name : {"link", "queue", "dir"}) {
      EXPECT_FALSE(FileLock(name).lock(kExclusive, 0)) << name;
    }
  });
}

TEST_F(LockAttackTest, TheUmaskDoesNotReachTheLockDirectory) {
  for (const mode_t mask : {0U, 077U, 0777U}) {
    Attack([&] {
      umask(mask);
      ExpectLocks("a/b/name");
      for (const char* path : {"", "a", "a/b"}) ExpectRootsDirectory(InTop(path));
    });
  }
}

// Everything in the root directory but /tmp, seen in `root` too.
void CopyRoot(const std::string& root) {
  MakeDir(root, 0755);
  for (const std::string& name : NamesIn("/")) {
    const std::string path = "/" + name;
    if (path == "/tmp") continue;
    if (std::filesystem::is_symlink(path)) {
      std::filesystem::copy_symlink(path, root + path);
    } else if (std::filesystem::is_directory(path)) {
      MakeDir(root + path, 0755);
      ASSERT_EQ(mount(path.c_str(), (root + path).c_str(), nullptr, MS_BIND, nullptr), 0) << path;
    }
  }
}

TEST_F(LockAttackTest, TmpItselfMayBeALink) {
  Attack([] {
    CopyRoot("/tmp/root");
    MakeDir("/tmp/root/real", 01777);
    MakeLink("/real", "/tmp/root/tmp");
    EXPECT_EQ(RunInChild([] {
                ASSERT_EQ(chroot("/tmp/root"), 0);
                ExpectLocks("sub/name");
              }),
              0);
    ExpectRootsDirectory("/tmp/root/real/.kelodr_lock/sub");
  });
}

TEST_F(LockAttackTest, AnOrdinaryUserLocksInADirectoryOfRootOrHisOwn) {
  Attack([] {
    AsUser([] {
      ExpectLocks("name");
      ExpectLocks("name");  // his own file denies him reading
    });
    EXPECT_EQ(LookAt(kTop).st_uid, kUser);
    std::filesystem::remove_all(kTop);
    MakeDir(kTop, 0755);
    WriteText(InTop("name"), "");
    AsUser([] { ExpectLocks("name"); });
  });
}

TEST_F(LockAttackTest, AnOrdinaryUserTakesNothingAwayThatIsNoLockFile) {
  Attack([] {
    AsUser([] {
      MakeDir(kTop, 0755, kUser);
      MakeQueue(InTop("queue"));
      EXPECT_FALSE(FileLock("queue").lock(kExclusive, 0));
    });
    EXPECT_TRUE(S_ISFIFO(LookAt(InTop("queue")).st_mode));
  });
}

TEST_F(LockAttackTest, AnOrdinaryUserDoesNotLockInAStrangersDirectory) {
  Attack([] {
    MakeDir(kTop, 0777, kUser + 1);
    AsUser([] { ExpectNoDirectory("name"); });
    EXPECT_EQ(NamesIn(kTop), Names{});
  });
}

TEST_F(LockAttackTest, AnOrdinaryUserDoesNotFollowALinkToTheLockDirectory) {
  Attack([] {
    MakeLink(kHome, kTop);
    AsUser([] { ExpectNoDirectory("name"); });
    EXPECT_EQ(NamesIn(kHome), Names{});
  });
}

TEST_F(LockAttackTest, SwappingTheLockDirectoryLeadsRootNowhere) {
  Attack([] {
    {
      const UserLoop user([] {
        symlink(kSafeDir, kTop);
        unlink(kTop);
        symlink(kHome, kTop);
        unlink(kTop);
        mkdir(kTop, 0777);
        symlink(kSafeDir, InTop("sub").c_str());
        symlink(kSecret, InTop("name").c_str());
        unlink(InTop("sub").c_str());
        unlink(InTop("name").c_str());
        rmdir(kTop);
        WriteText(kTop, "");
        unlink(kTop);
      });
      int locked = 0;
      Race([&] {
        locked += FileLock("name").lock(kExclusive, 0);
        locked += FileLock("sub/name").lock(kExclusive, 0);
        LogCapture::Clear();
        std::error_code error;
        std::filesystem::remove_all(kTop, error);
      });
      EXPECT_GT(locked, 0);
    }
    EXPECT_EQ(NamesIn(kHome), Names{});
    ExpectLocks("name");
    ExpectRootsDirectory(kTop);
  });
}

TEST_F(LockAttackTest, ALockThatCannotBeOpenedDoesNotHoldUpACache) {
  Attack([] {
    MakeDir(kTop, 0755);
    MakeDir(InTop("tmp"), 0755);
    MakeQueue(InTop("tmp/default_dr_cache.lock"));
    TestCache cache("", "", 1000, true, 0);
    cache.FetchGives("fresh");
    alarm(10);
    EXPECT_FALSE(cache.Update());
    EXPECT_EQ(cache.Read(), Json::Value());
  });
}

}  // namespace
