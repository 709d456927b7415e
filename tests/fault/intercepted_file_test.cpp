// Calls that fail where nothing else does while a file is read.

#include <unistd.h>

#include <cerrno>
#include <set>

#include "fault/interception.h"
#include "kelodrcore/file.h"
#include "support/clean_test.h"

namespace {

using InterceptedFileTest = CleanTest;

// The number 0 is a descriptor like another.
TEST_F(InterceptedFileTest, NoDescriptorIsLeftWhereThereIsNoStreamForIt) {
  WriteText(Path("file"), "1");
  EXPECT_EQ(RunInChild([this] {
              close(STDIN_FILENO);
              const std::set<int> before = OpenDescriptors();
              const Fault::Interception noStream("fdopen", 1, ENOMEM);
              Json::Value value("before");
              EXPECT_FALSE(KeloDRCore::File::Read(Path("file"), value));
              EXPECT_TRUE(noStream.HasRun());
              EXPECT_EQ(value, Json::Value("before"));
              EXPECT_EQ(OpenDescriptors(), before);
              LogCapture::Clear();
            }),
            0);
}

}  // namespace
