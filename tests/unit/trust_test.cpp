// Whose files are believed at paths where others may write.

#include "posix/trust.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "support/clean_test.h"

namespace {

using KeloDRCore::Posix::Descriptor;
using KeloDRCore::Posix::IsBelieved;
using KeloDRCore::Posix::OpenBelieved;
using KeloDRCore::Posix::StatBelieved;

class TrustTest : public CleanTest {
 protected:
  static struct stat FileOf(uid_t owner) {
    struct stat file = {};
    file.st_mode = S_IFREG | 0644;
    file.st_uid = owner;
    return file;
  }
  bool Believes(uid_t owner) const {
    const Descriptor directory(open(dir.c_str(), O_PATH | O_CLOEXEC));
    const bool believed = IsBelieved(FileOf(owner), Path("file"));
    EXPECT_EQ(IsBelieved(FileOf(owner), directory.Get()), believed);
    return believed;
  }
  void ExpectRefused(const std::string& path, int statError, int openError) {
    struct stat found = {};
    errno = 0;
    EXPECT_FALSE(StatBelieved(path, found));
    EXPECT_EQ(errno, statError);
    errno = 0;
    EXPECT_FALSE(OpenBelieved(path).IsOpen());
    EXPECT_EQ(errno, openError);
  }
  void Chown(const std::string& path, uid_t owner) {
    ASSERT_EQ(lchown(path.c_str(), owner, owner), 0) << path;
  }

  const uid_t stranger = geteuid() + 4321;
};

TEST_F(TrustTest, RootAndTheEffectiveUserAreBelieved) {
  EXPECT_TRUE(Believes(0));
  EXPECT_TRUE(Believes(geteuid()));
  EXPECT_FALSE(Believes(stranger));
}

TEST_F(TrustTest, OnlyARegularFileIsBelieved) {
  for (const mode_t type :
       std::vector<mode_t>{S_IFDIR, S_IFLNK, S_IFIFO, S_IFSOCK, S_IFCHR, S_IFBLK}) {
    struct stat file = FileOf(0);
    file.st_mode = type | 0644;
    EXPECT_FALSE(IsBelieved(file, Path("file"))) << std::oct << type;
  }
}

TEST_F(TrustTest, TheOwnerOfTheDirectoryIsBelievedUnlessAllMayWriteInIt) {
  if (geteuid() != 0) GTEST_SKIP() << "only root can give a directory away";
  Chown(dir, stranger);
  for (const mode_t mode : {0700U, 0755U, 0775U}) {
    ASSERT_EQ(chmod(dir.c_str(), mode), 0);
    EXPECT_TRUE(Believes(stranger)) << std::oct << mode;
    EXPECT_FALSE(Believes(stranger + 1)) << std::oct << mode;
  }
  for (const mode_t mode : {0777U, 01777U, 0702U}) {
    ASSERT_EQ(chmod(dir.c_str(), mode), 0);
    EXPECT_FALSE(Believes(stranger)) << std::oct << mode;
    EXPECT_TRUE(Believes(0)) << std::oct << mode;
  }
}

TEST_F(TrustTest, ABelievedFileIsOpenedAndLookedAt) {
  WriteText(Path("file"), "text");
  struct stat found = {};
  EXPECT_TRUE(StatBelieved(Path("file"), found));
  EXPECT_EQ(found.st_size, 4);
  const Descriptor file = OpenBelieved(Path("file"));
  ASSERT_TRUE(file.IsOpen());
  EXPECT_EQ(fcntl(file.Get(), F_GETFD), FD_CLOEXEC);
  EXPECT_EQ(fcntl(file.Get(), F_GETFL) & O_ACCMODE, O_RDONLY);
}

TEST_F(TrustTest, NothingElseIsOpenedOrWaitedFor) {
  WriteText(Path("file"), "text");
  ASSERT_EQ(symlink("file", Path("link").c_str()), 0);
  ASSERT_EQ(mkfifo(Path("fifo").c_str(), 0600), 0);
  ExpectRefused(Path("missing"), ENOENT, ENOENT);
  ExpectRefused(Path("link"), EINVAL, ELOOP);
  ExpectRefused(Path("fifo"), EINVAL, EINVAL);
  ExpectRefused(dir, EINVAL, EINVAL);
}

TEST_F(TrustTest, AStrangersFileIsRefused) {
  if (geteuid() != 0) GTEST_SKIP() << "only root can give a file away";
  WriteText(Path("file"), "text");
  Chown(Path("file"), stranger);
  ExpectRefused(Path("file"), EACCES, EACCES);
}

TEST_F(TrustTest, APathWithoutADirectoryIsOfTheWorkingDirectory) {
  if (geteuid() != 0) GTEST_SKIP() << "only root can give a directory away";
  Chown(dir, stranger);
  EXPECT_EQ(RunInChild([&] {
              ASSERT_EQ(chdir(dir.c_str()), 0);
              EXPECT_TRUE(IsBelieved(FileOf(stranger), "file"));
              EXPECT_FALSE(IsBelieved(FileOf(stranger), "/file"));
            }),
            0);
}

}  // namespace
