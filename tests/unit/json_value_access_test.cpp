// Who may read and write a document: what a stranger puts beside it, and whom it was open to.

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <string>
#include <vector>

#include "unit/json_file.h"

namespace {

constexpr char kAcl[] = "system.posix_acl_access";
constexpr char kDefaultAcl[] = "system.posix_acl_default";

// An ACL as the kernel takes it: version 2, then tag, permissions and id of each entry.
class Acl {
 public:
  Acl() { Add32(2); }
  Acl& Entry(uint16_t tag, uint16_t permissions, uint32_t id = UINT32_MAX) {
    Add16(tag);
    Add16(permissions);
    Add32(id);
    return *this;
  }
  const std::string& Text() const { return text; }

 private:
  void Add16(uint16_t number) {
    text += static_cast<char>(number & 0xFF);
    text += static_cast<char>(number >> 8);
  }
  void Add32(uint32_t number) {
    Add16(static_cast<uint16_t>(number & 0xFFFF));
    Add16(static_cast<uint16_t>(number >> 16));
  }
  std::string text;
};

// The owner may do all, one user may read, the group and others nothing.
std::string AclForOneReader(uid_t reader = kOther) {
  return Acl().Entry(1, 6).Entry(2, 4, reader).Entry(4, 0).Entry(16, 4).Entry(32, 0).Text();
}

// "" for none.
std::string AttributeOf(const std::string& path, const char* name) {
  char value[1024];
  const ssize_t size = lgetxattr(path.c_str(), name, value, sizeof value);
  return size < 0 ? "" : std::string(value, static_cast<size_t>(size));
}

bool SetAttribute(const std::string& path, const char* name, const std::string& value) {
  return lsetxattr(path.c_str(), name, value.data(), value.size(), 0) == 0;
}

class JsonValueAccessTest : public JsonValueFileTest {
 protected:
  void SetUp() override {
    JsonValueFileTest::SetUp();
    WriteText(Path("a"), "1");
  }
  void Share(uid_t owner) {
    ASSERT_EQ(chown(dir.c_str(), owner, owner), 0);
    ASSERT_EQ(chmod(dir.c_str(), 01777), 0);
  }
  void ExpectWritten() {
    TestClock::SkipSleeps();
    EXPECT_TRUE(toFile(Document("new"), Path("a"))) << strerror(errno);
    ExpectDocument(Path("a"), Document("new"));
  }
  void ExpectWrittenAtOnce() {
    ExpectWritten();
    EXPECT_EQ(TestClock::TakeSleeps(), std::vector<unsigned int>{});
  }
  const std::string temporary = TemporaryOf("a");
};

TEST_F(JsonValueAccessTest, AStrangersLinkInASharedDirectoryIsNotFollowed) {
  if (geteuid() != 0) GTEST_SKIP() << "needs root to give links away";
  Share(0);
  ASSERT_EQ(symlink("a", Path("link").c_str()), 0);
  ASSERT_EQ(lchown(Path("link").c_str(), kOther, kOther), 0);
  ExpectNotWritten(Path("link"), EACCES);
  EXPECT_EQ(ReadText(Path("a")), "1");
  Share(kOther);  // now it is a link of the directory's owner
  EXPECT_TRUE(toFile(Document("x"), Path("link")));
  ExpectDocument(Path("a"), Document("x"));
}

TEST_F(JsonValueAccessTest, OnesOwnLinkInASharedDirectoryIsFollowed) {
  ASSERT_EQ(chmod(dir.c_str(), 01777), 0);
  ASSERT_EQ(symlink("a", Path("link").c_str()), 0);
  EXPECT_TRUE(toFile(Document("x"), Path("link")));
  ExpectDocument(Path("a"), Document("x"));
}

TEST_F(JsonValueAccessTest, AStrangersLinkElsewhereIsFollowed) {
  if (geteuid() != 0) GTEST_SKIP() << "needs root to give links away";
  ASSERT_EQ(symlink("a", Path("link").c_str()), 0);
  ASSERT_EQ(lchown(Path("link").c_str(), kOther, kOther), 0);
  for (const mode_t mode : {0755U, 0777U, 01755U}) {
    ASSERT_EQ(chmod(dir.c_str(), mode), 0);
    EXPECT_TRUE(toFile(Document("x"), Path("link"))) << std::oct << mode;
  }
}

TEST_F(JsonValueAccessTest, AStrangersTemporaryIsNotWaitedFor) {
  if (geteuid() != 0) GTEST_SKIP() << "needs root to give files away";
  Share(0);
  WriteText(Path(temporary), "planted");
  ASSERT_EQ(chown(Path(temporary).c_str(), kOther, kOther), 0);
  const int held = open(Path(temporary).c_str(), O_RDONLY | O_CLOEXEC);
  ASSERT_EQ(flock(held, LOCK_EX), 0);
  ExpectWrittenAtOnce();
  EXPECT_EQ(NamesIn(dir), Names{"a"});
  close(held);
}

TEST_F(JsonValueAccessTest, ATemporaryThatHasTheDocumentsOwnerIsALivingWriters) {
  if (geteuid() != 0) GTEST_SKIP() << "needs root to give files away";
  ASSERT_EQ(chown(Path("a").c_str(), kOther, kOther), 0);
  WriteText(Path(temporary), "half");
  ASSERT_EQ(chown(Path(temporary).c_str(), kOther, kOther), 0);
  const int held = open(Path(temporary).c_str(), O_RDONLY | O_CLOEXEC);
  ASSERT_EQ(flock(held, LOCK_EX), 0);
  TestClock::SkipSleeps([&] { EXPECT_EQ(flock(held, LOCK_UN), 0); });
  EXPECT_TRUE(toFile(Document("x"), Path("a")));
  EXPECT_EQ(TestClock::TakeSleeps(), std::vector<unsigned int>{1000});
  EXPECT_EQ(StatOf(Path("a")).st_uid, kOther);
  close(held);
}

TEST_F(JsonValueAccessTest, APlantedDirectoryIsMovedAway) {
  ASSERT_EQ(mkdir(Path(temporary).c_str(), 0755), 0);
  WriteText(Path(temporary + "/mine"), "theirs");
  ExpectWrittenAtOnce();
  const Names names = NamesIn(dir);
  ASSERT_EQ(names.size(), 2U);
  EXPECT_EQ(ReadText(Path(names[0]) + "/mine"), "theirs");
  ExpectWrittenAtOnce();
  EXPECT_EQ(NamesIn(dir), names);
}

// Anybody who may read the directory can lock it.
TEST_F(JsonValueAccessTest, ALockOfTheDirectoryDelaysTheRemovalButDoesNotStopIt) {
  ASSERT_EQ(symlink("nowhere", Path(temporary).c_str()), 0);
  const int held = open(dir.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  ASSERT_EQ(flock(held, LOCK_EX), 0);
  ExpectWritten();
  EXPECT_EQ(TestClock::TakeSleeps().size(), 1000U);
  EXPECT_EQ(NamesIn(dir), Names{"a"});
  close(held);
}

TEST_F(JsonValueAccessTest, AnAclStays) {
  if (!SetAttribute(Path("a"), kAcl, AclForOneReader())) GTEST_SKIP() << "no ACLs here";
  const mode_t mode = ModeOf(Path("a"));
  for (const uid_t inDirectory : {kOther, kOther + 1}) {
    ASSERT_TRUE(SetAttribute(dir, kDefaultAcl, AclForOneReader(inDirectory)));
    ExpectWritten();
    EXPECT_EQ(AttributeOf(Path("a"), kAcl), AclForOneReader());
    EXPECT_EQ(ModeOf(Path("a")), mode);
  }
}

TEST_F(JsonValueAccessTest, AnAclOfTheDirectoryOpensNothingThatWasClosed) {
  ASSERT_EQ(chmod(Path("a").c_str(), 0660), 0);
  if (!SetAttribute(dir, kDefaultAcl, AclForOneReader())) GTEST_SKIP() << "no ACLs here";
  ExpectWritten();
  EXPECT_EQ(AttributeOf(Path("a"), kAcl), "");
  EXPECT_EQ(ModeOf(Path("a")), 0660U);
  ASSERT_TRUE(toFile(Document("x"), Path("new")));
  EXPECT_NE(AttributeOf(Path("new"), kAcl), "");
}

TEST_F(JsonValueAccessTest, AttributesStay) {
  if (!SetAttribute(Path("a"), "user.empty", "")) GTEST_SKIP() << "no attributes here";
  ASSERT_TRUE(SetAttribute(Path("a"), "user.name", std::string("value\0", 6)));
  const bool isSecured = SetAttribute(Path("a"), "security.kelodr", "label");
  ExpectWritten();
  EXPECT_EQ(lgetxattr(Path("a").c_str(), "user.empty", nullptr, 0), 0);
  EXPECT_EQ(AttributeOf(Path("a"), "user.name"), std::string("value\0", 6));
  EXPECT_EQ(AttributeOf(Path("a"), "security.kelodr"), isSecured ? "label" : "");
}

// A change of the owner takes them away.
TEST_F(JsonValueAccessTest, CapabilitiesOfAnothersFileStay) {
  const std::string capabilities = std::string("\1\0\0\2\0\4", 6) + std::string(14, '\0');
  const bool isSet = chown(Path("a").c_str(), kOther, kOther) == 0 &&
                     SetAttribute(Path("a"), "security.capability", capabilities);
  ExpectWritten();
  EXPECT_EQ(AttributeOf(Path("a"), "security.capability"), isSet ? capabilities : "");
}

TEST_F(JsonValueAccessTest, AttributesThatCannotBeKeptAreAFailure) {
  if (geteuid() != 0) GTEST_SKIP() << "needs root to set what another user may not";
  if (!SetAttribute(Path("a"), "security.kelodr", "label")) GTEST_SKIP() << "no attributes here";
  ASSERT_EQ(chown(dir.c_str(), kOther, kOther), 0);
  ASSERT_EQ(chown(Path("a").c_str(), kOther, kOther), 0);
  EXPECT_EQ(RunInChild([&] {
              ASSERT_EQ(setresgid(kOther, kOther, kOther), 0);
              ASSERT_EQ(setresuid(kOther, kOther, kOther), 0);
              ExpectNotWritten(Path("a"), EPERM);
            }),
            0);
  EXPECT_EQ(ReadText(Path("a")), "1");
  EXPECT_EQ(NamesIn(dir), Names{"a"});
}

}  // namespace
