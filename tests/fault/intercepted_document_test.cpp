// Another process that comes between two calls of a document's reader or writer.

#include <fcntl.h>
#include <sys/file.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>

#include "fault/interception.h"
#include "kelodrcore/json_value.h"
#include "posix/file_io.h"
#include "support/clean_test.h"

namespace {

using Fault::Interception;
using Fault::kGoOn;
using KeloDRCore::JsonValue::fromFile;
using KeloDRCore::JsonValue::toFile;
using KeloDRCore::JsonValue::toString;

class InterceptedDocumentTest : public CleanTest {
 protected:
  using Names = std::vector<std::string>;

  void SetUp() override {
    CleanTest::SetUp();
    path = Path("document");
    temporary = Path(".document.kelodr-" + std::to_string(geteuid()));
    umaskBefore = umask(022);
  }
  void TearDown() override {
    umask(umaskBefore);
    CleanTest::TearDown();
  }

  void ExpectWritten() {
    EXPECT_TRUE(toFile("new", path));
    EXPECT_EQ(ReadText(path), "\"new\"");
    EXPECT_EQ(NamesIn(dir), Names{"document"});
  }

  // Before the temporary is locked, it becomes another writer's.
  void ExpectWrittenAlthoughReplaced() {
    const Interception other("flock", 1, [&] {
      EXPECT_EQ(unlink(temporary.c_str()), 0);
      WriteText(temporary, "half");
      return kGoOn;
    });
    ExpectWritten();
    EXPECT_TRUE(other.HasRun());
  }

  void ExpectNotWritten(int error) {
    errno = 0;
    EXPECT_FALSE(toFile("new", path));
    EXPECT_EQ(errno, error);
  }

  static ino_t InodeOf(const std::string& file) {
    struct stat status = {};
    EXPECT_EQ(stat(file.c_str(), &status), 0) << file;
    return status.st_ino;
  }

  std::string path;
  std::string temporary;

 private:
  mode_t umaskBefore = 0;
};

TEST_F(InterceptedDocumentTest, AFileThatGrowsWhileItIsReadIsReadToItsEnd) {
  const std::string more(10000, ' ');
  WriteText(path, "[1,");
  const Interception writer("read", 1, [&] {
    WriteText(path, "[1," + more + "2,");
    return kGoOn;
  });
  const Interception later("read", 3, [&] {
    WriteText(path, "[1," + more + "2," + more + "3]");
    return kGoOn;
  });
  Json::Value value;
  EXPECT_TRUE(fromFile(value, path));
  EXPECT_EQ(toString(value), "[1,2,3]");
  EXPECT_TRUE(writer.HasRun());
  EXPECT_TRUE(later.HasRun());
}

// No file system should do so; one that did must not be asked for ever.
TEST_F(InterceptedDocumentTest, AWriteThatMovesNothingIsAFailure) {
  WriteText(path, "\"old\"");
  const Interception full("write", 1, Fault::kMoveNothing);
  ExpectNotWritten(EIO);
  EXPECT_TRUE(full.HasRun());
  EXPECT_EQ(ReadText(path), "\"old\"");
  EXPECT_EQ(NamesIn(dir), Names{"document"});
}

// The old file says to whom; until its mode is taken over, that is its owner alone.
TEST_F(InterceptedDocumentTest, ANewTextIsNobodyElsesWhileItIsWritten) {
  umask(0);
  WriteText(path, "\"old\"");
  struct stat status = {};
  const Interception write("write", 1, [&] {
    EXPECT_EQ(stat(temporary.c_str(), &status), 0);
    return kGoOn;
  });
  ExpectWritten();
  EXPECT_EQ(status.st_mode, mode_t{S_IFREG | 0600});
}

TEST_F(InterceptedDocumentTest, LinksThatBecomeALoopAreRefused) {
  WriteText(Path("file"), "\"old\"");
  ASSERT_EQ(symlink("file", path.c_str()), 0);
  const Interception other("openat", 1, [&] {
    EXPECT_EQ(unlink(path.c_str()), 0);
    EXPECT_EQ(symlink("document", path.c_str()), 0);
    return kGoOn;
  });
  ExpectNotWritten(ELOOP);
  EXPECT_TRUE(other.HasRun());
  EXPECT_EQ(NamesIn(dir), (Names{"document", "file"}));
  EXPECT_EQ(ReadText(Path("file")), "\"old\"");
}

TEST_F(InterceptedDocumentTest, ALinkThatCannotBeReadIsNotReplaced) {
  ASSERT_EQ(symlink("target", path.c_str()), 0);
  {
    const Interception failure("readlinkat", 1, EIO);
    ExpectNotWritten(EIO);
  }
  EXPECT_EQ(NamesIn(dir), Names{"document"});
  EXPECT_TRUE(toFile("new", path));
  EXPECT_EQ(ReadText(Path("target")), "\"new\"");
}

TEST_F(InterceptedDocumentTest, ADirectoryThatComesIntoBeingIsNotReplaced) {
  const std::string made = path;
  path += "/";
  const Interception other("openat", 1, [&] {
    EXPECT_EQ(mkdir(made.c_str(), 0755), 0);
    return kGoOn;
  });
  ExpectNotWritten(EISDIR);
  EXPECT_TRUE(other.HasRun());
  EXPECT_EQ(NamesIn(made), Names{});
}

// Between a look at it and the next call to it.
TEST_F(InterceptedDocumentTest, ALeftTemporaryMayBeRemovedBySomebodyElse) {
  for (const char* const call : {"openat", "unlinkat"}) {
    WriteText(temporary, "half");
    // The directory is opened first, then twice what may stand at the document's name; then the
    // temporary is to be made, then opened.
    const Interception other(call, std::string(call) == "openat" ? 5 : 1, [&] {
      EXPECT_EQ(unlink(temporary.c_str()), 0);
      return kGoOn;
    });
    ExpectWritten();
    EXPECT_TRUE(other.HasRun()) << call;
  }
}

TEST_F(InterceptedDocumentTest, AFileSystemWithoutAttributesHasNoneToCopy) {
  WriteText(path, "\"old\"");
  for (const char* const call : {"listxattr", "getxattr"}) {
    const Interception none(call, 1, ENOTSUP);
    ExpectWritten();
    EXPECT_TRUE(none.HasRun()) << call;
  }
}

TEST_F(InterceptedDocumentTest, APlantedDirectoryMayBeRemovedBySomebodyElse) {
  ASSERT_EQ(mkdir(temporary.c_str(), 0755), 0);
  const Interception other("renameat", 1, [&] {
    EXPECT_EQ(rmdir(temporary.c_str()), 0);
    return kGoOn;
  });
  ExpectWritten();
  EXPECT_TRUE(other.HasRun());
}

// Nobody can guess and take the name that a planted directory gets.
TEST_F(InterceptedDocumentTest, WithoutARandomNameAPlantedDirectoryStays) {
  ASSERT_EQ(mkdir(temporary.c_str(), 0755), 0);
  const Interception missing("getrandom", 1, ENOSYS);
  ExpectNotWritten(ENOSYS);
  EXPECT_TRUE(missing.HasRun());
}

TEST_F(InterceptedDocumentTest, APlantedLinkMayBeRemovedBySomebodyElse) {
  ASSERT_EQ(symlink("nowhere", temporary.c_str()), 0);
  const Interception other("flock", 1, [&] {
    EXPECT_EQ(unlink(temporary.c_str()), 0);
    return kGoOn;
  });
  ExpectWritten();
  EXPECT_TRUE(other.HasRun());
}

// That other writer is dead when its temporary is found.
TEST_F(InterceptedDocumentTest, APlantedLinkMayHaveBecomeTheTemporaryOfAnotherWriter) {
  ASSERT_EQ(symlink("nowhere", temporary.c_str()), 0);
  // Only a leftover is opened for reading alone, and closed again.
  ExpectWrittenAlthoughReplaced();
}

TEST_F(InterceptedDocumentTest, APlantedLinkMayHaveBecomeTheTemporaryOfALiveWriter) {
  ASSERT_EQ(symlink("nowhere", temporary.c_str()), 0);
  KeloDRCore::Posix::Descriptor live;
  const Interception other("flock", 1, [&] {
    EXPECT_EQ(unlink(temporary.c_str()), 0);
    WriteText(temporary, "half");
    live = KeloDRCore::Posix::Open(temporary, O_RDONLY);
    EXPECT_EQ(flock(live.Get(), LOCK_EX), 0);
    return kGoOn;
  });
  ExpectNotWritten(EBUSY);
  EXPECT_EQ(ReadText(temporary), "half");
}

// Between its creation and its lock, when it looks like a dead writer's.
TEST_F(InterceptedDocumentTest, AnotherFileUnderItsNameIsNotTheTemporary) {
  ExpectWrittenAlthoughReplaced();
}

// What is mounted over the temporary has its inode number: file systems of this kind count from 1.
TEST_F(InterceptedDocumentTest, AFileOfAnotherFileSystemIsNotTheTemporary) {
  const auto mountAt = [](const std::string& where) {
    ASSERT_EQ(mount("tmpfs", where.c_str(), "tmpfs", 0, "size=64k"), 0);
  };
  const auto makeTwin = [this] {
    const std::string twin = Path("other/twin");
    for (int made = 0; made < 100; ++made) {
      WriteText(twin, "mine");
      if (InodeOf(twin) == InodeOf(temporary)) break;
      EXPECT_EQ(rename(twin.c_str(), Path("other/" + std::to_string(made)).c_str()), 0);
    }
    EXPECT_EQ(mount(twin.c_str(), temporary.c_str(), nullptr, MS_BIND, nullptr), 0);
    return kGoOn;
  };
  if (!RunWithOwnMounts([&] {
        mountAt(dir);
        WriteText(path, "\"old\"");
        ASSERT_EQ(mkdir(Path("other").c_str(), 0755), 0);
        mountAt(Path("other"));
        const Interception other("flock", 1, makeTwin);
        ExpectNotWritten(EBUSY);
        EXPECT_TRUE(other.HasRun());
        EXPECT_EQ(ReadText(path), "\"old\"");
        EXPECT_EQ(ReadText(temporary), "mine");
        ASSERT_EQ(umount(temporary.c_str()), 0);
        EXPECT_EQ(ReadText(temporary), "");
      })) {
    GTEST_SKIP() << "needs the right to mount a file system";
  }
}

// Whoever finds a temporary has to open it to learn whether its writer lives.
TEST_F(InterceptedDocumentTest, TheTemporaryOfAnUnreadableFileCanBeOpenedByItsUser) {
  const uid_t user = geteuid() == 0 ? 65534 : geteuid();
  const gid_t group = geteuid() == 0 ? 65534 : getegid();
  WriteText(path, "\"old\"");
  ASSERT_EQ(chown(path.c_str(), user, group), 0);
  ASSERT_EQ(chmod(path.c_str(), 0), 0);
  ASSERT_EQ(chmod(dir.c_str(), 0777), 0);
  EXPECT_EQ(RunInChild([this, user, group] {
              ASSERT_EQ(setresgid(group, group, group), 0);
              ASSERT_EQ(setresuid(user, user, user), 0);
              temporary = Path(".document.kelodr-" + std::to_string(user));
              const Interception look("renameat", 1, [this] {
                const int fd = open(temporary.c_str(), O_RDONLY | O_CLOEXEC);
                EXPECT_GE(fd, 0);
                close(fd);
                return kGoOn;
              });
              EXPECT_TRUE(toFile("new", path));
              EXPECT_TRUE(look.HasRun());
            }),
            0);
  struct stat status = {};
  ASSERT_EQ(stat(path.c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 07777U, 0U);
  ASSERT_EQ(chmod(path.c_str(), 0400), 0);
  EXPECT_EQ(ReadText(path), "\"new\"");
}

// The power may fail at any time: the text is on the disk before it gets its name, whatever its
// length, and the name is before the writer says so.
TEST_F(InterceptedDocumentTest, TheWholeTextIsSyncedBeforeItIsPublished) {
  for (const size_t length : {size_t{10}, size_t{3} << 20, size_t{9} << 20}) {
    off_t synced = 0;
    const Interception text("fsync", 1, [&] {
      struct stat status = {};
      EXPECT_EQ(stat(temporary.c_str(), &status), 0);
      synced = status.st_size;
      return kGoOn;
    });
    const Interception publish("renameat", 1, [&] {
      EXPECT_EQ(synced, static_cast<off_t>(length + 2)) << "not on the disk yet";
      return kGoOn;
    });
    const Interception name("fsync", 2, [&] {
      EXPECT_TRUE(publish.HasRun());
      EXPECT_EQ(access(temporary.c_str(), F_OK), -1);
      return kGoOn;
    });
    EXPECT_TRUE(toFile(std::string(length, 'x'), path));
    EXPECT_TRUE(name.HasRun()) << length;
    unlink(path.c_str());
  }
}

// Another writer takes a temporary that is not locked for one of a dead writer.
TEST_F(InterceptedDocumentTest, TheTemporaryIsLockedUntilItIsPublished) {
  const Interception publish("renameat", 1, [&] {
    const int file = open(temporary.c_str(), O_RDONLY | O_CLOEXEC);
    EXPECT_EQ(flock(file, LOCK_EX | LOCK_NB), -1);
    EXPECT_EQ(errno, EWOULDBLOCK);
    close(file);
    return kGoOn;
  });
  ExpectWritten();
  EXPECT_TRUE(publish.HasRun());
}

// The kernel has followed the link of the directory's owner when a stranger's takes its place.
TEST_F(InterceptedDocumentTest, ALinkThatAStrangerSwapsInIsNotFollowed) {
  if (geteuid() != 0) GTEST_SKIP() << "needs root to give links away";
  constexpr uid_t kStranger = 4321;
  ASSERT_EQ(chmod(dir.c_str(), 01777), 0);
  WriteText(Path("secret"), "\"old\"");
  const auto swap = [&] {
    EXPECT_EQ(unlink(path.c_str()), 0);
    EXPECT_EQ(symlink("secret", path.c_str()), 0);
    EXPECT_EQ(lchown(path.c_str(), kStranger, kStranger), 0);
    return kGoOn;
  };
  for (int call = 1; call <= 2; ++call) {
    WriteText(path, "\"old\"");
    const Interception stranger("openat", call, swap);
    ExpectNotWritten(EACCES);
    EXPECT_TRUE(stranger.HasRun());
    EXPECT_EQ(ReadText(Path("secret")), "\"old\"");
    unlink(path.c_str());
  }
}

}  // namespace
