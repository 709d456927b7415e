// The directory of lock files, where everybody can write beside it.

#include <fcntl.h>
#include <grp.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <functional>
#include <string>

#include "kelodrcore/file_lock.h"
#include "support/lock_test.h"
#include "support/process.h"
#include "support/special_files.h"

namespace {

using KeloDRCore::FileLock;

constexpr char kTop[] = "/tmp/.kelodr_lock";
constexpr uid_t kStranger = 4711;
constexpr int kExclusive = LOCK_EX | LOCK_NB;

struct stat StateOf(const std::string& path) {
  struct stat state = {};
  EXPECT_EQ(lstat(path.c_str(), &state), 0) << path;
  return state;
}

mode_t ModeOf(const std::string& path) { return StateOf(path).st_mode; }

// The root directory of each test is its own, and so is /tmp, where everybody may write.
class LockDirectoryTest : public LockTest {
 protected:
  void RunWithOwnRoot(const std::function<void()>& body) const {
    std::filesystem::remove_all(Path("tmp"));
    ASSERT_EQ(chmod(dir.c_str(), 0755), 0);
    ASSERT_EQ(mkdir(Path("tmp").c_str(), 0755), 0);
    ASSERT_EQ(chmod(Path("tmp").c_str(), 01777), 0);
    const bool isAllowed = RunAsRoot([&] {
      ASSERT_EQ(chroot(dir.c_str()), 0);
      ASSERT_EQ(chdir("/"), 0);
      body();
    });
    if (!isAllowed) GTEST_SKIP() << "needs root, or a user namespace";
  }

  // Runs `body` as root, where `stranger` has planted something before.
  void Attack(const std::function<void()>& stranger, const std::function<void()>& body) const {
    if (!IsRoot()) GTEST_SKIP() << "needs root, and another user who attacks";
    RunWithOwnRoot([&] {
      EXPECT_EQ(RunInChild([&] {
                  BecomeUser(kStranger);
                  stranger();
                }),
                0);
      body();
    });
  }

  static void BecomeUser(uid_t id) {
    ASSERT_EQ(setgroups(0, nullptr), 0);
    ASSERT_EQ(setresgid(id, id, id), 0);
    ASSERT_EQ(setresuid(id, id, id), 0);
  }

  static void ExpectLocks(const std::string& name) {
    FileLock lock(name);
    FileLock other(name);
    EXPECT_TRUE(lock.lock(kExclusive, 0));
    EXPECT_FALSE(other.lock(kExclusive, 0));
    struct stat named = StateOf(std::string(kTop) + "/" + name);
    EXPECT_TRUE(S_ISREG(named.st_mode));
    ExpectLog({});
  }

  static void ExpectRootsDirectory(const std::string& path) {
    const struct stat state = StateOf(path);
    EXPECT_EQ(state.st_uid, 0U) << path;
    EXPECT_EQ(state.st_gid, 0U) << path;
    EXPECT_EQ(state.st_mode, mode_t(S_IFDIR | 0755)) << path;
  }
};

TEST_F(LockDirectoryTest, IsMadeWithMode0755WhateverTheUmask) {
  for (const mode_t mask : {0U, 022U, 077U, 0777U}) {
    RunWithOwnRoot([mask] {
      const mode_t before = umask(mask);
      FileLock lock("a/b/c");
      EXPECT_TRUE(lock.checkLockDir());
      umask(before);
      for (const char* step : {"", "/a", "/a/b"}) {
        EXPECT_EQ(ModeOf(kTop + std::string(step)), mode_t(S_IFDIR | 0755)) << step << mask;
      }
    });
  }
}

TEST_F(LockDirectoryTest, IsFoundWhereTmpIsALink) {
  RunWithOwnRoot([] {
    ASSERT_EQ(rename("/tmp", "/other"), 0);
    ASSERT_EQ(symlink("other", "/tmp"), 0);
    ExpectLocks("a/lock");
    ExpectRootsDirectory("/other/.kelodr_lock");
  });
}

TEST_F(LockDirectoryTest, OfAnotherUserBecomesRoots) {
  Attack([] { ASSERT_EQ(mkdir(kTop, 0777), 0); },
         [] {
           ExpectLocks("lock");
           ExpectRootsDirectory(kTop);
         });
}

TEST_F(LockDirectoryTest, ThatOthersMayWriteToIsClosedToThem) {
  RunWithOwnRoot([] {
    ASSERT_EQ(mkdir(kTop, 0755), 0);
    ASSERT_EQ(chmod(kTop, 0777), 0);
    ExpectLocks("lock");
    ExpectRootsDirectory(kTop);
  });
}

TEST_F(LockDirectoryTest, IsPutInThePlaceOfAFileALinkOrAQueue) {
  const std::function<void()> plants[] = {
      [] { WriteText(kTop, ""); }, [] { ASSERT_EQ(symlink("/tmp/elsewhere", kTop), 0); },
      [] {
        ASSERT_EQ(mkdir("/tmp/elsewhere", 0777), 0);
        ASSERT_EQ(symlink("/tmp/elsewhere", kTop), 0);
      },
      [] { ASSERT_EQ(mkfifo(kTop, 0666), 0); }, [] { MakeSocket(kTop); }};
  for (const auto& plant : plants) {
    Attack(plant, [] {
      ExpectLocks("a/lock");
      ExpectRootsDirectory(kTop);
      EXPECT_EQ(NamesIn("/tmp/elsewhere"), std::vector<std::string>{});
    });
  }
}

TEST_F(LockDirectoryTest, HasNoStepThatAStrangerPlanted) {
  Attack(
      [] {
        ASSERT_EQ(mkdir(kTop, 0777), 0);
        ASSERT_EQ(mkdir("/tmp/elsewhere", 0777), 0);
        ASSERT_EQ(symlink("/tmp/elsewhere", (kTop + std::string("/link")).c_str()), 0);
        WriteText(kTop + std::string("/file"), "");
        ASSERT_EQ(mkdir((kTop + std::string("/dir")).c_str(), 0777), 0);
      },
      [] {
        for (const std::string step : {"link", "file", "dir"}) {
          ExpectLocks(step + "/lock");
          ExpectRootsDirectory(kTop + ("/" + step));
        }
        EXPECT_EQ(NamesIn("/tmp/elsewhere"), std::vector<std::string>{});
      });
}

TEST_F(LockDirectoryTest, OfRootsKeepsRootsLinksAndFilesAndFails) {
  RunWithOwnRoot([] {
    ASSERT_EQ(mkdir(kTop, 0755), 0);
    ASSERT_EQ(symlink("/tmp", (kTop + std::string("/link")).c_str()), 0);
    FileLock lock("link/lock");
    EXPECT_FALSE(lock.lock(kExclusive, 0));
    const std::string parent = kTop + std::string("/link");
    ExpectLog({Err("file_lock.cpp", "checkLockDir",
                   "Failed to create lock dir [" + parent + "] in local host"),
               Err("file_lock.cpp", "openLockedFile",
                   "Failed to check lock dir of lock file [" + parent + "/lock]."),
               Err("file_lock.cpp", "lock", "Bad fd [-1] to lock [" + parent + "/lock]")});
    EXPECT_EQ(ModeOf(parent), mode_t(S_IFLNK | 0777));
  });
}

TEST_F(LockDirectoryTest, LeavesDirectoriesOutsideAlone) {
  Attack([] { ASSERT_EQ(mkdir("/tmp/strange", 0777), 0); },
         [] {
           ExpectLocks("../strange/lock");
           EXPECT_EQ(StateOf("/tmp/strange").st_uid, kStranger);
           EXPECT_EQ(ModeOf("/tmp"), mode_t(S_IFDIR | 01777));
         });
}

TEST_F(LockDirectoryTest, ServesItsOrdinaryOwnerAgainAndAgain) {
  Attack(
      [] {
        for (int i = 0; i < 2; ++i) {
          FileLock lock("lock");
          EXPECT_TRUE(lock.lock(kExclusive, 0));
          EXPECT_FALSE(FileLock("lock").lock(kExclusive, 0));
        }
        LogCapture::Clear();  // the bracket's
      },
      [] { ExpectLocks("lock"); });
}

TEST_F(LockDirectoryTest, OfAnotherOrdinaryUserIsNotAccepted) {
  Attack([] { ASSERT_EQ(mkdir(kTop, 0777), 0); },
         [] {
           EXPECT_EQ(RunInChild([] {
                       BecomeUser(kStranger + 1);
                       const FileLock lock("lock");
                       EXPECT_FALSE(lock.checkLockDir());
                       ExpectLog({Err(
                           "file_lock.cpp", "checkLockDir",
                           std::string("Failed to create lock dir [") + kTop + "] in local host")});
                       EXPECT_EQ(NamesIn(kTop), std::vector<std::string>{});
                     }),
                     0);
         });
}

// --- what stands at a lock's name

TEST_F(LockDirectoryTest, ALockFileThatAStrangerPlantedIsReplaced) {
  const std::string at = std::string(kTop) + "/";
  Attack(
      [&] {
        ASSERT_EQ(mkdir(kTop, 0777), 0);
        std::filesystem::create_directories(at + "dir/full");
        std::filesystem::create_directory(at + "empty");
        std::filesystem::create_symlink("/tmp/elsewhere", at + "link");
        ASSERT_EQ(mkfifo((at + "queue").c_str(), 0666), 0);
        MakeSocket(at + "socket");
      },
      [&] {
        for (const char* planted : {"dir", "empty", "link", "queue", "socket"})
          ExpectLocks(planted);
        EXPECT_FALSE(std::filesystem::exists("/tmp/elsewhere"));
      });
}

// Its lock goes on.
TEST_F(LockDirectoryTest, ALockFileOfAnotherUserIsShared) {
  Attack([] { FileLock("lock").openLockedFile(); },
         [] {
           const ino_t before = StateOf(kTop + std::string("/lock")).st_ino;
           ExpectLocks("lock");
           EXPECT_EQ(StateOf(kTop + std::string("/lock")).st_ino, before);
         });
}

TEST_F(LockDirectoryTest, ALockFileThatIsAQueueOrASocketIsRefusedAtOnce) {
  RunWithOwnRoot([] {
    ASSERT_EQ(mkdir(kTop, 0755), 0);
    const std::string queue = kTop + std::string("/queue");
    ASSERT_EQ(mkfifo(queue.c_str(), 0666), 0);
    EXPECT_FALSE(FileLock("queue").lock(kExclusive, 5));
    ExpectLog(CannotOpen(queue, "Invalid argument"));
    const std::string socket = kTop + std::string("/socket");
    MakeSocket(socket);
    EXPECT_FALSE(FileLock("socket").lock(kExclusive, 5));
    ExpectLog(CannotOpen(socket, "No such device or address"));
  });
}

}  // namespace
