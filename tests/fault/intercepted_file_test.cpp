// What other processes see of a file while it is read, and how it is closed.

#include <fcntl.h>

#include <cerrno>
#include <functional>
#include <map>
#include <string>

#include "fault/interception.h"
#include "kelodrcore/file.h"
#include "posix/descriptor.h"
#include "support/clean_test.h"

namespace {

namespace File = KeloDRCore::File;

class InterceptedFileTest : public CleanTest {
 protected:
  // Whatever `read` has open while it reads Path("file") is closed on exec.
  void ExpectCloseOnExec(const std::function<void(const std::string& path)>& read) {
    const std::set<int> before = OpenDescriptors();
    const Fault::Interception look("read", 1, [&] {
      const std::set<int> now = OpenDescriptors();
      EXPECT_EQ(now.size(), before.size() + 1);
      for (const int fd : now) {
        EXPECT_TRUE(before.count(fd) > 0 || fcntl(fd, F_GETFD) == FD_CLOEXEC) << fd;
      }
      return Fault::kGoOn;
    });
    read(Path("file"));
    EXPECT_TRUE(look.HasRun());
  }
};

TEST_F(InterceptedFileTest, ADocumentIsOpenedCloseOnExec) {
  WriteText(Path("file"), "7");
  Json::Value value;
  ExpectCloseOnExec([&](const std::string& path) { EXPECT_TRUE(File::Read(path, value)); });
  EXPECT_EQ(value, Json::Value(7));
}

TEST_F(InterceptedFileTest, KeyValueTextIsOpenedCloseOnExec) {
  WriteText(Path("file"), "a=1");
  std::map<std::string, int> map;
  ExpectCloseOnExec([&](const std::string& path) { EXPECT_EQ(File::Read(path, map), 1); });
  EXPECT_EQ(map["a"], 1);
}

TEST_F(InterceptedFileTest, AnInterruptedOpenIsMadeAgain) {
  const Fault::Interception interrupted("fopen", 1, EINTR);
  EXPECT_TRUE(File::Write(Path("file"), 7));
  EXPECT_TRUE(interrupted.HasRun());
}

// Its number is free, and may be another thread's file by now.
TEST_F(InterceptedFileTest, AnInterruptedCloseIsNotMadeAgain) {
  KeloDRCore::Posix::Descriptor file(open(dir.c_str(), O_RDONLY | O_CLOEXEC));
  const Fault::Interception interrupted("close", 1, EINTR);
  const Fault::Interception again("close", 2, EIO);
  file.Close();
  EXPECT_TRUE(interrupted.HasRun());
  EXPECT_FALSE(again.HasRun());
  EXPECT_EQ(file.Get(), -1);
  EXPECT_EQ(KeloDRCore::Posix::Descriptor().Get(), -1);
}

}  // namespace
