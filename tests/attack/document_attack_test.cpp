#include <fcntl.h>
#include <pty.h>
#include <sys/file.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstring>

#include "attack/acl.h"
#include "attack/attack.h"
#include "kelodrcore/file.h"
#include "kelodrcore/json_value.h"
#include "support/test_cache.h"

namespace File = KeloDRCore::File;
using KeloDRCore::JsonValue::fromFile;
using KeloDRCore::JsonValue::toFile;

namespace {

constexpr char kPath[] = "/tmp/doc";
constexpr char kTemporary[] = "/tmp/.doc.kelodr-0";

void ExpectRefused(const std::string& path, int error) {
  errno = 0;
  EXPECT_FALSE(toFile("new", path)) << path;
  EXPECT_EQ(errno, error) << path;
}

void ExpectReplaced(const std::string& path) {
  EXPECT_TRUE(toFile("new", path)) << path << ": " << strerror(errno);
  EXPECT_EQ(ReadText(path), "\"new\"") << path;
}

// Whether the user can read the file, which he is not told by its mode alone.
void ExpectReadableByUser(const std::string& path, bool isReadable) {
  AsUser([&] { EXPECT_EQ(access(path.c_str(), R_OK) == 0, isReadable) << path; });
}

using DocumentAttackTest = AttackTest;

TEST_F(DocumentAttackTest, AStrangersLinkInAStickyDirectoryIsNotFollowed) {
  for (const char* target : {kSecret, "/tmp/safe/new"}) {
    Attack([&] {
      AsUser([&] { MakeLink(target, kPath); });
      ExpectRefused(kPath, EACCES);
      MakeLink(kPath, HomePath("first"));
      ExpectRefused(HomePath("first"), EACCES);
      EXPECT_TRUE(S_ISLNK(LookAt(kPath).st_mode));
    });
  }
}

TEST_F(DocumentAttackTest, LinksOfOnesOwnAndOfTheDirectorysOwnerAreFollowed) {
  Attack([] {
    WriteText(HomePath("target"), "old");
    MakeLink(HomePath("target"), kPath);
    ExpectReplaced(kPath);
    MakeDir("/tmp/sticky", 01777, kUser);
    AsUser([] { MakeLink(HomePath("target"), "/tmp/sticky/link"); });
    ExpectReplaced("/tmp/sticky/link");
    EXPECT_TRUE(S_ISLNK(LookAt(kPath).st_mode));
    EXPECT_TRUE(S_ISLNK(LookAt("/tmp/sticky/link").st_mode));
  });
}

TEST_F(DocumentAttackTest, LinksAreFollowedWhereADirectoryIsNotBothStickyAndOpenToAll) {
  for (const mode_t mode : {0777U, 01775U}) {
    Attack([&] {
      MakeDir("/tmp/dir", 0777);
      AsUser([] { MakeLink(HomePath("target"), "/tmp/dir/link"); });
      ASSERT_EQ(chmod("/tmp/dir", mode), 0);
      ExpectReplaced("/tmp/dir/link");
      EXPECT_EQ(NamesIn(kHome), Names{"target"});
    });
  }
}

TEST_F(DocumentAttackTest, ASwappedLinkIsNotFollowed) {
  Attack([] {
    const UserLoop user([] {
      symlink(kSecret, HomePath("link").c_str());
      rename(HomePath("link").c_str(), kPath);
      WriteText(HomePath("file"), "1");
      rename(HomePath("file").c_str(), kPath);
      unlink(kPath);
    });
    int written = 0;
    Race([&] {
      written += toFile("new", kPath);
      unlink(kPath);  // the user cannot: it is root's
    });
    EXPECT_GT(written, 0);
  });
}

TEST_F(DocumentAttackTest, AccessListAndAttributesStay) {
  Attack([] {
    const std::string path = HomePath("doc");
    WriteText(path, "old");
    SetAttribute(path, kAccess, AclForUser(kRead));
    SetAttribute(path, "user.note", 'u');
    SetAttribute(path, "security.label", 's');
    const std::string list = Attribute(path, kAccess);
    ASSERT_NE(list, "none");
    ExpectReplaced(path);
    EXPECT_EQ(Attribute(path, kAccess), list);
    EXPECT_EQ(Attribute(path, "user.note"), "u");
    EXPECT_EQ(Attribute(path, "security.label"), "s");
    ExpectFile(path, 0, 0640);
    ExpectReadableByUser(path, true);
  });
}

TEST_F(DocumentAttackTest, ADefaultAccessListDoesNotOpenAReplacedFile) {
  for (const mode_t mode : {0600U, 0640U, 0660U}) {
    Attack([&] {
      MakeDir("/tmp/dir", 0755);
      const std::string path = "/tmp/dir/doc";
      WriteText(path, "old");
      ASSERT_EQ(chmod(path.c_str(), mode), 0);
      SetAttribute("/tmp/dir", kDefault, AclForUser(kReadWrite));
      umask(0);
      ExpectReplaced(path);
      EXPECT_EQ(Attribute(path, kAccess), "none");
      ExpectFile(path, 0, mode);
      ExpectReadableByUser(path, false);
    });
  }
}

TEST_F(DocumentAttackTest, ANewFileGetsTheDefaultAccessList) {
  Attack([] {
    MakeDir("/tmp/dir", 0755);
    SetAttribute("/tmp/dir", kDefault, AclForUser(kReadWrite));
    WriteText("/tmp/dir/plain", "");
    ExpectReplaced("/tmp/dir/doc");
    EXPECT_EQ(Attribute("/tmp/dir/doc", kAccess), Attribute("/tmp/dir/plain", kAccess));
    ExpectFile("/tmp/dir/doc", 0, LookAt("/tmp/dir/plain").st_mode & 07777);
  });
}

TEST_F(DocumentAttackTest, AnAttributeThatCannotBeKeptIsAFailure) {
  Attack([] {
    const std::string path = HomePath("doc");
    AsUser([&] { WriteText(path, "old"); });
    SetAttribute(path, "security.label", 's');
    AsUser([&] {
      ExpectRefused(path, EPERM);
      EXPECT_EQ(ReadText(path), "old");
      EXPECT_EQ(NamesIn(kHome), Names{"doc"});
    });
  });
}

TEST_F(DocumentAttackTest, AClosedDocumentIsNeverOpenWhileItIsReplaced) {
  Attack([] {
    MakeDir("/tmp/dir", 0755);
    SetAttribute("/tmp/dir", kDefault, AclForUser(kReadWrite));
    const std::string path = "/tmp/dir/doc";
    WriteText(path, "old");
    ASSERT_EQ(removexattr(path.c_str(), kAccess), 0);
    ASSERT_EQ(chmod(path.c_str(), 0660), 0);
    umask(0);
    {
      const UserLoop user([] {
        for (const char* name : {"/tmp/dir/.doc.kelodr-0", "/tmp/dir/doc"}) {
          if (open(name, O_RDONLY) >= 0) WriteText(HomePath("opened"), name);
        }
      });
      Race([&] { EXPECT_TRUE(toFile(std::string(100000, 'x'), path)); });
    }
    EXPECT_EQ(ReadText(HomePath("opened")), "");
  });
}

TEST_F(DocumentAttackTest, APlantedTemporaryIsNoObstacle) {
  const std::function<void()> plants[] = {
      [] { WriteText(kTemporary, "planted"); },
      [] { MakeQueue(kTemporary); },
      [] { MakeLink(kSecret, kTemporary); },
      [] { MakeLink(SafePath("new"), kTemporary); },
      [] { MakeDir(kTemporary, 0777, kUser); },
      [] {
        MakeDir(kTemporary, 0700, kUser);
        WriteText(std::string(kTemporary) + "/file", "");
      },
  };
  for (const auto& plant : plants) {
    Attack([&] {
      for (int i = 0; i < 2; ++i) {
        AsUser(plant);
        ExpectReplaced(kPath);
        ExpectFile(kPath, 0, 0644);
        EXPECT_FALSE(IsThere(kTemporary));
      }
    });
  }
}

TEST_F(DocumentAttackTest, LocksOnAPlantedTemporaryAndOnTheDirectoryAreNoObstacle) {
  Attack([] {
    const UserLoop user([] {
      const int temporary = open(kTemporary, O_RDWR | O_CREAT, 0666);
      const int directory = open("/tmp", O_RDONLY);
      ASSERT_EQ(flock(temporary, LOCK_EX), 0);
      ASSERT_EQ(flock(directory, LOCK_EX), 0);
      WriteText(HomePath("locked"), "");
      pause();
    });
    while (!IsThere(HomePath("locked"))) usleep(1000);
    alarm(10);
    ExpectReplaced(kPath);
  });
}

TEST_F(DocumentAttackTest, TemporariesPlantedAgainAndAgainDoNoHarm) {
  Attack([] {
    {
      const UserLoop user([] {
        symlink(kSecret, kTemporary);
        unlink(kTemporary);
        mkdir(kTemporary, 0777);
        rmdir(kTemporary);
        WriteText(kTemporary, "planted");
        unlink(kTemporary);
      });
      Race([] {
        if (toFile("new", kPath)) {
          EXPECT_EQ(ReadText(kPath), "\"new\"");
        }
      });
    }
    ExpectReplaced(kPath);
    ExpectFile(kPath, 0, 0644);
  });
}

TEST_F(DocumentAttackTest, OnlyARegularFileIsReplaced) {
  Attack([] {
    AsUser([] { MakeQueue(kPath); });
    ExpectRefused(kPath, EINVAL);
    EXPECT_TRUE(S_ISFIFO(LookAt(kPath).st_mode));
  });
}

// All readers of files, of the path at which something was planted.
void ReadEverything(const std::string& path) {
  Json::Value value("untouched");
  EXPECT_FALSE(fromFile(value, path));
  EXPECT_FALSE(File::Read(path, value));
  EXPECT_EQ(value, "untouched");
  std::map<std::string, std::string> map;
  EXPECT_LE(File::Read(path, map), 0);
}

TEST_F(DocumentAttackTest, AQueueIsNotWaitedFor) {
  Attack([] {
    AsUser([] { MakeQueue(kPath); });
    ReadEverything(kPath);
  });
}

TEST_F(DocumentAttackTest, ATerminalIsNotTakenAsTheControllingOne) {
  Attack([] {
    int master = -1;
    int slave = -1;
    char name[64];
    ASSERT_EQ(openpty(&master, &slave, name, nullptr, nullptr), 0);
    ASSERT_EQ(chown(name, kUser, kUser), 0);
    AsUser([&] {
      MakeLink(name, kPath);
      MakeLink(name, "/tmp/default_dr_cache");
    });
    EXPECT_EQ(RunInChild([] {
                alarm(10);
                setsid();
                ReadEverything(kPath);
                TestCache("", "", 1000, true, 0).Read();
                toFile("new", kPath);
                EXPECT_EQ(open("/dev/tty", O_RDWR), -1);
                EXPECT_EQ(errno, ENXIO);
              }),
              0);
  });
}

}  // namespace
