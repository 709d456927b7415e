// Documents in files: whole, replaced in one step, whoever writes and whatever fails.

#include <sched.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>

#include "unit/json_file.h"

namespace {

TEST_F(JsonValueFileTest, AWrittenDocumentIsTheTextWithoutANewline) {
  ASSERT_TRUE(toFile(Document("x"), Path("a")));
  EXPECT_EQ(ReadText(Path("a")), "{\"text\":\"x\"}");
  ExpectDocument(Path("a"), Document("x"));
  EXPECT_EQ(NamesIn(dir), Names{"a"});
}

TEST_F(JsonValueFileTest, ALargeDocumentComesBackWhole) {
  const Json::Value large = Document(std::string(9000001, 'x'));
  ASSERT_TRUE(toFile(large, Path("a")));
  ExpectDocument(Path("a"), large);
}

TEST_F(JsonValueFileTest, AFileWithoutASizeIsReadToItsEnd) {
  const std::string path = "/proc/sys/kernel/pid_max";
  ExpectDocument(path, std::stoi(ReadText(path)));
}

TEST_F(JsonValueFileTest, WhatCannotBeReadLeavesTheValue) {
  ASSERT_EQ(mkfifo(Path("queue").c_str(), 0600), 0);
  ASSERT_EQ(symlink("loop", Path("loop").c_str()), 0);
  ExpectNotRead("", EINVAL);
  ExpectNotRead(Path("missing"), ENOENT);
  ExpectNotRead(dir, EINVAL);
  ExpectNotRead(Path("queue"), EINVAL);
  ExpectNotRead(Path("loop"), ELOOP);
  ExpectNotRead("/dev/null", EINVAL);
  WriteText(Path("text"), "{\"a\":1} x");
  Json::Value value("untouched");
  EXPECT_FALSE(fromFile(value, Path("text")));
  EXPECT_EQ(value, Json::Value("untouched"));
}

// A file of zeros that take no room, on a file system that has no limit of its own.
TEST_F(JsonValueFileTest, AFileLongerThanATextCanBeIsNotRead) {
  if (!RunWithOwnMounts([this] {
        ASSERT_EQ(mount("tmpfs", dir.c_str(), "tmpfs", 0, "size=64k"), 0);
        WriteText(Path("a"), "");
        ASSERT_EQ(truncate(Path("a").c_str(), static_cast<off_t>(std::string().max_size())), 0);
        ExpectNotRead(Path("a"), EFBIG);
      })) {
    GTEST_SKIP() << "needs the right to mount a file system";
  }
}

TEST_F(JsonValueFileTest, APathWithANulByteNamesNoFile) {
  WriteText(Path("a"), "1");
  const std::string path = Path("a") + std::string("\0b", 2);
  ExpectNotRead(path, EINVAL);
  ExpectNotWritten(path, EINVAL);
  EXPECT_EQ(ReadText(Path("a")), "1");
}

TEST_F(JsonValueFileTest, ANameWithoutASlashIsInTheWorkingDirectory) {
  EXPECT_EQ(RunInChild([this] {
              ASSERT_EQ(chdir(dir.c_str()), 0);
              EXPECT_TRUE(toFile(Document("x"), "a"));
              ExpectDocument("a", Document("x"));
              EXPECT_TRUE(toFile(Document("y"), "./a"));
              ExpectDocument("a", Document("y"));
            }),
            0);
  EXPECT_EQ(NamesIn(dir), Names{"a"});
}

TEST_F(JsonValueFileTest, ANameOfTheGreatestLengthIsWritten) {
  const std::string name = "x" + std::string(254 / 2 * 2, 'n');
  std::string utf8;
  while (utf8.size() < 254) utf8 += "\xC3\xA9";
  const std::string odd = "x" + utf8;  // whose hundredth byte begins a character
  ASSERT_EQ(name.size(), 255U);
  ASSERT_EQ(odd.size(), 255U);
  for (const std::string& longest : {name, utf8, odd}) {
    WriteText(Path(TemporaryOf(longest.substr(0, longest == odd ? 99 : 100))), "left");
    EXPECT_TRUE(toFile(Document("x"), Path(longest)));
    ExpectDocument(Path(longest), Document("x"));
  }
  EXPECT_EQ(NamesIn(dir), (Names{name, odd, utf8}));
  ExpectNotWritten(Path(name + "n"), ENAMETOOLONG);
}

TEST_F(JsonValueFileTest, ANewFileGetsItsModeFromTheUmask) {
  umask(027);
  ASSERT_TRUE(toFile(Document("x"), Path("a")));
  EXPECT_EQ(ModeOf(Path("a")), 0640U);
  umask(0);
  ASSERT_TRUE(toFile(Document("x"), Path("b")));
  EXPECT_EQ(ModeOf(Path("b")), 0666U);
}

TEST_F(JsonValueFileTest, AFileKeepsItsMode) {
  for (const mode_t mode :
       {0600U, 0666U, 0444U, 0640U, 0040U, 0U, 04755U, 02755U, 06711U, 01777U}) {
    WriteText(Path("a"), "1");
    ASSERT_EQ(chmod(Path("a").c_str(), mode), 0);
    ASSERT_TRUE(toFile(Document("x"), Path("a")));
    EXPECT_EQ(ModeOf(Path("a")), mode);
    unlink(Path("a").c_str());
  }
}

TEST_F(JsonValueFileTest, AFileKeepsItsOwnerAndTheSetIdBits) {
  if (geteuid() != 0) GTEST_SKIP() << "needs root to give files away";
  WriteText(Path("a"), "1");
  for (const uid_t uid : {0U, 1234U}) {
    for (const gid_t gid : {0U, 5678U}) {
      ASSERT_EQ(chown(Path("a").c_str(), uid, gid), 0);
      ASSERT_EQ(chmod(Path("a").c_str(), 06755), 0);
      ASSERT_TRUE(toFile(Document("x"), Path("a")));
      EXPECT_EQ(StatOf(Path("a")).st_uid, uid);
      EXPECT_EQ(StatOf(Path("a")).st_gid, gid);
      EXPECT_EQ(ModeOf(Path("a")), 06755U);
      ExpectDocument(Path("a"), Document("x"));
    }
  }
}

TEST_F(JsonValueFileTest, AnOwnerThatCannotBeKeptIsAFailure) {
  ExpectNotWrittenByAnother(0777, EPERM);
}

TEST_F(JsonValueFileTest, AnUnwritableDirectoryIsAFailure) {
  if (geteuid() == 0) return ExpectNotWrittenByAnother(0755, EACCES);
  WriteText(Path("a"), "1");
  ASSERT_EQ(chmod(dir.c_str(), 0555), 0);
  ExpectNotWritten(Path("a"), EACCES);
  ASSERT_EQ(chmod(dir.c_str(), 0755), 0);
  EXPECT_EQ(ReadText(Path("a")), "1");
  EXPECT_EQ(NamesIn(dir), Names{"a"});
}

TEST_F(JsonValueFileTest, TheFileBehindALinkIsReplacedAndTheLinkStays) {
  ASSERT_EQ(mkdir(Path("sub").c_str(), 0755), 0);
  WriteText(Path("sub/file"), "1");
  ASSERT_EQ(symlink("file", Path("sub/second").c_str()), 0);
  ASSERT_EQ(symlink("sub/second", Path("relative").c_str()), 0);
  ASSERT_EQ(symlink(Path("sub/second").c_str(), Path("absolute").c_str()), 0);
  for (const char* link : {"relative", "absolute"}) {
    ASSERT_TRUE(toFile(Document(link), Path(link)));
    EXPECT_TRUE(S_ISLNK(StatOf(Path(link)).st_mode));
    EXPECT_TRUE(S_ISREG(StatOf(Path("sub/file")).st_mode));
    ExpectDocument(Path("sub/file"), Document(link));
  }
  EXPECT_EQ(NamesIn(Path("sub")), (Names{"file", "second"}));
}

TEST_F(JsonValueFileTest, ALinkToNothingMakesTheFileThatItNames) {
  ASSERT_EQ(symlink("target", Path("link").c_str()), 0);
  ASSERT_TRUE(toFile(Document("x"), Path("link")));
  EXPECT_TRUE(S_ISLNK(StatOf(Path("link")).st_mode));
  ExpectDocument(Path("target"), Document("x"));
}

TEST_F(JsonValueFileTest, AsManyLinksAreFollowedAsTheKernelFollows) {
  std::string path = Path("file");
  for (int link = 1; link <= 40; ++link) {
    const std::string next = Path("link" + std::to_string(link));
    ASSERT_EQ(symlink(path.c_str(), next.c_str()), 0);
    path = next;
  }
  ASSERT_TRUE(toFile(Document("x"), path));
  ExpectDocument(Path("file"), Document("x"));
  ASSERT_EQ(symlink(path.c_str(), Path("one more").c_str()), 0);
  ExpectNotWritten(Path("one more"), ELOOP);
}

TEST_F(JsonValueFileTest, ALoopOfLinksIsAFailure) {
  ASSERT_EQ(symlink("two", Path("one").c_str()), 0);
  ASSERT_EQ(symlink("one", Path("two").c_str()), 0);
  ExpectNotWritten(Path("one"), ELOOP);
  EXPECT_EQ(NamesIn(dir), (Names{"one", "two"}));
}

TEST_F(JsonValueFileTest, OnlyARegularFileIsReplaced) {
  ASSERT_EQ(mkfifo(Path("queue").c_str(), 0600), 0);
  ASSERT_EQ(mkdir(Path("sub").c_str(), 0755), 0);
  ExpectNotWritten("", EINVAL);
  ExpectNotWritten(Path("queue"), EINVAL);
  ExpectNotWritten(Path("sub"), EISDIR);
  ExpectNotWritten(Path("sub/"), EISDIR);
  ExpectNotWritten(Path("new/"), ENOENT);
  ExpectNotWritten(Path("missing/file"), ENOENT);
  ExpectNotWritten("/dev/null", EINVAL);
  EXPECT_TRUE(S_ISFIFO(StatOf(Path("queue")).st_mode));
  EXPECT_TRUE(S_ISCHR(StatOf("/dev/null").st_mode));
  EXPECT_EQ(NamesIn(dir), (Names{"queue", "sub"}));
}

TEST_F(JsonValueFileTest, AnotherNameOfTheFileKeepsTheOldDocument) {
  WriteText(Path("a"), "1");
  ASSERT_EQ(link(Path("a").c_str(), Path("b").c_str()), 0);
  ASSERT_TRUE(toFile(Document("x"), Path("a")));
  EXPECT_EQ(ReadText(Path("b")), "1");
}

std::string Nested(size_t levels) { return std::string(levels, '[') + std::string(levels, ']'); }

TEST_F(JsonValueFileTest, WhatParsesCanBeWrappedWrittenAndReadBack) {
  Json::Value document;
  ASSERT_TRUE(KeloDRCore::JsonValue::fromString(document["a"]["b"], Nested(1000)));
  ASSERT_TRUE(toFile(document, Path("document")));
  Json::Value back;
  EXPECT_TRUE(fromFile(back, Path("document")));
  EXPECT_EQ(back, document);
}

TEST_F(JsonValueFileTest, RefusesMoreThanATextsLevelsAndTen) {
  Json::Value value("untouched");
  WriteText(Path("deeper"), Nested(1011));
  EXPECT_FALSE(fromFile(value, Path("deeper")));
  EXPECT_EQ(value, Json::Value("untouched"));
  WriteText(Path("deep"), Nested(1010));
  EXPECT_TRUE(fromFile(value, Path("deep")));
}

}  // namespace
