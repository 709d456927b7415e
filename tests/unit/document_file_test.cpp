// The documents of believed files. What they are made of is hidden in the library: a copy is
// tested.

#include "document_file.h"

#include <fcntl.h>
#include <sys/file.h>

#include "unit/json_file.h"

namespace {

using KeloDRCore::ReadDocument;
using KeloDRCore::ReplaceDocument;
using KeloDRCore::Whose;

class DocumentFileTest : public JsonValueFileTest {
 protected:
  void SetUp() override {
    JsonValueFileTest::SetUp();
    ASSERT_EQ(chmod(dir.c_str(), 01777), 0);
  }
  void Plant(const std::string& name) {
    WriteText(Path(name), "\"theirs\"");
    ASSERT_EQ(chmod(Path(name).c_str(), 0666), 0);
    ASSERT_EQ(lchown(Path(name).c_str(), kOther, kOther), 0);
  }
  void ExpectNotBelieved(const std::string& name) {
    Json::Value value("untouched");
    EXPECT_FALSE(ReadDocument(value, Path(name), Whose::kBelieved));
    EXPECT_EQ(value, Json::Value("untouched"));
  }
  // By a file of the writer's own, with the mode that the umask leaves.
  void ExpectReplaced(const std::string& name) {
    EXPECT_TRUE(ReplaceDocument(Document("new"), Path(name), Whose::kBelieved)) << strerror(errno);
    EXPECT_TRUE(S_ISREG(StatOf(Path(name)).st_mode));
    EXPECT_EQ(StatOf(Path(name)).st_uid, geteuid());
    EXPECT_EQ(ModeOf(Path(name)), 0644U);
    Json::Value value;
    EXPECT_TRUE(ReadDocument(value, Path(name), Whose::kBelieved));
    EXPECT_EQ(value, Document("new"));
  }
};

TEST_F(DocumentFileTest, ABelievedFileIsReadAndKeepsItsMode) {
  WriteText(Path("a"), "1");
  ASSERT_EQ(chmod(Path("a").c_str(), 0600), 0);
  EXPECT_TRUE(ReplaceDocument(Document("new"), Path("a"), Whose::kBelieved));
  EXPECT_EQ(ModeOf(Path("a")), 0600U);
  Json::Value value;
  EXPECT_TRUE(ReadDocument(value, Path("a"), Whose::kBelieved));
  EXPECT_EQ(value, Document("new"));
}

TEST_F(DocumentFileTest, AFileOfTheDirectorysOwnerKeepsItsOwner) {
  if (geteuid() != 0) GTEST_SKIP() << "needs root to give files away";
  Plant("a");
  ASSERT_EQ(chown(dir.c_str(), kOther, kOther), 0);
  ASSERT_EQ(chmod(dir.c_str(), 0755), 0);
  Json::Value value;
  EXPECT_TRUE(ReadDocument(value, Path("a"), Whose::kBelieved));
  EXPECT_TRUE(ReplaceDocument(Document("new"), Path("a"), Whose::kBelieved));
  EXPECT_EQ(StatOf(Path("a")).st_uid, kOther);
  EXPECT_EQ(ModeOf(Path("a")), 0666U);
}

TEST_F(DocumentFileTest, ALinkIsReplacedAndNotFollowed) {
  WriteText(Path("secret"), "1");
  ASSERT_EQ(symlink("secret", Path("a").c_str()), 0);
  ExpectNotBelieved("a");
  ExpectReplaced("a");
  EXPECT_EQ(ReadText(Path("secret")), "1");
}

TEST_F(DocumentFileTest, AQueueIsReplacedAndNotWaitedFor) {
  ASSERT_EQ(mkfifo(Path("a").c_str(), 0600), 0);
  ExpectNotBelieved("a");
  ExpectReplaced("a");
}

TEST_F(DocumentFileTest, AStrangersFileIsReplacedByAFreshOne) {
  if (geteuid() != 0) GTEST_SKIP() << "needs root to give files away";
  Plant("a");
  ExpectNotBelieved("a");
  ExpectReplaced("a");
}

TEST_F(DocumentFileTest, AStrangersDirectoryIsMovedAwayAndAnotherIsAFailure) {
  if (geteuid() != 0) GTEST_SKIP() << "needs root to give files away";
  ASSERT_EQ(mkdir(Path("a").c_str(), 0755), 0);
  WriteText(Path("a/file"), "theirs");
  errno = 0;
  EXPECT_FALSE(ReplaceDocument(Document("new"), Path("a"), Whose::kBelieved));
  EXPECT_EQ(errno, EISDIR);
  ASSERT_EQ(chown(Path("a").c_str(), kOther, kOther), 0);
  ExpectReplaced("a");
  EXPECT_EQ(NamesIn(dir).size(), 2U);
}

TEST_F(DocumentFileTest, ATemporaryOfTheOwnerOfWhatIsNotBelievedIsPlanted) {
  if (geteuid() != 0) GTEST_SKIP() << "needs root to give files away";
  Plant("a");
  Plant(TemporaryOf("a"));
  const int held = open(Path(TemporaryOf("a")).c_str(), O_RDONLY | O_CLOEXEC);
  ASSERT_EQ(flock(held, LOCK_EX), 0);
  TestClock::SkipSleeps();
  ExpectReplaced("a");
  EXPECT_EQ(TestClock::TakeSleeps(), std::vector<unsigned int>{});
  close(held);
}

}  // namespace
