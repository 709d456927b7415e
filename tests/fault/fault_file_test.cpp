#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <map>
#include <memory>

#include "fault/fault.h"
#include "kelodrcore/file.h"
#include "kelodrcore/json_value.h"
#include "support/process.h"

namespace File = KeloDRCore::File;
using Fault::Outcome;

namespace {

constexpr char kOld[] = "\"old\"";
constexpr char kDocument[] = "12345";  // what is left of it when it is cut off is a document too

LogLine Failure(const std::string& function, const std::string& message) {
  return Err("file.cpp", function, message);
}

class FileFaultTest : public FaultTest {
 protected:
  void SetUp() override {
    FaultTest::SetUp();
    path = Path("file");
  }

  // The outcome of a read that gave `value`, which held "before".
  void CheckRead(const Outcome& outcome) const;
  void CheckWritten(const Outcome& outcome, const std::string& writeFailure,
                    const std::string& flushFailure, const std::string& syncFailure) const;

  // Runs `action` on a descriptor of the file; afterwards `keptOpen` tells whether that is open.
  template <typename Action>
  bool WithDescriptor(int flags, const Action& action);

  std::string path;
  Json::Value value;
  bool keptOpen = false;
};

template <typename Action>
bool FileFaultTest::WithDescriptor(int flags, const Action& action) {
  const auto closeAtEnd = [this](const int* fd) {
    const Fault::Suspension suspension;
    keptOpen = fcntl(*fd, F_GETFD) != -1 && close(*fd) == 0;
  };
  int fd = -1;
  {
    const Fault::Suspension suspension;
    fd = open(path.c_str(), flags | O_CLOEXEC);
  }
  const std::unique_ptr<int, decltype(closeAtEnd)> owner(&fd, closeAtEnd);
  return action(fd);
}

void FileFaultTest::CheckRead(const Outcome& outcome) const {
  const bool tookAsMissing = outcome.Failed("access");
  EXPECT_EQ(value,
            outcome.succeeded && !tookAsMissing ? Json::Value(12345) : Json::Value("before"));
}

void FileFaultTest::CheckWritten(const Outcome& outcome, const std::string& writeFailure,
                                 const std::string& flushFailure,
                                 const std::string& syncFailure) const {
  std::vector<LogLine> expected;
  const std::string first = outcome.failed.empty() ? "" : outcome.failed.front();
  if (first == "vfprintf") expected = {Failure("Write", writeFailure)};
  if (first == "fflush") expected = {Failure("Write", flushFailure)};
  if (first == "fsync" && outcome.error != EINTR) expected = {Failure("Write", syncFailure)};
  EXPECT_EQ(outcome.log, expected);
  EXPECT_EQ(outcome.succeeded, expected.empty() && !outcome.threw);
  if (outcome.succeeded) {
    EXPECT_EQ(ReadText(path), kDocument);
  }
}

}  // namespace

TEST_F(FileFaultTest, ReadGivesTheWholeDocumentOrLeavesTheValue) {
  const auto prepare = [&] {
    WriteText(path, kDocument);
    value = "before";
  };
  const auto run = [&] { return File::Read(path, value); };
  const auto check = [&](const Outcome& outcome) {
    CheckRead(outcome);
    std::vector<LogLine> expected;
    if (outcome.Failed("access")) {
      expected = {Debug("file.cpp", "Read", "file[" + path + "] is not existed")};
    } else if (outcome.FailedForGood("openat")) {
      expected = {Failure("Read", "File[" + path + "] is not opened.")};
    }
    if (outcome.error != Fault::kNoMemory) {
      EXPECT_EQ(outcome.log, expected);
    }
  };
  SweepCalls({prepare, run, check});
  SweepMemory({prepare, run, check});
  SweepTransfers({prepare, run, check});
}

TEST_F(FileFaultTest, ReadOfADescriptorGivesTheWholeDocumentOrLeavesTheValue) {
  const auto prepare = [&] {
    WriteText(path, kDocument);
    value = "before";
  };
  const auto run = [&] {
    return WithDescriptor(O_RDONLY, [&](int fd) { return File::Read(fd, value); });
  };
  const auto check = [&](const Outcome& outcome) {
    CheckRead(outcome);
    EXPECT_EQ(outcome.log.size(), keptOpen ? 1U : 0U);  // "Failed to open file descriptor"
    if (outcome.Failed("fdopen")) {
      EXPECT_TRUE(keptOpen);
    }
  };
  SweepCalls({prepare, run, check});
  SweepMemory({prepare, run, check});
}

TEST_F(FileFaultTest, WriteSaysWhichStepFailed) {
  const auto prepare = [&] { WriteText(path, kOld); };
  const auto run = [&] { return File::Write(path, 12345); };
  const auto check = [&](const Outcome& outcome) {
    const LogLine notOpened = Failure("Write", "Failed to open file [" + path + "]");
    if (outcome.FailedForGood("fopen") || outcome.log == std::vector<LogLine>{notOpened}) {
      EXPECT_FALSE(outcome.succeeded);
      EXPECT_EQ(outcome.log, std::vector<LogLine>{notOpened});
      EXPECT_EQ(ReadText(path), kOld);
    } else {
      CheckWritten(outcome, "Failed to write [12345] to [" + path + "].",
                   "Failed to flush file[" + path + "]", "Failed to sync file [" + path + "]");
    }
  };
  SweepCalls({prepare, run, check});
  SweepMemory({prepare, run, check});
}

TEST_F(FileFaultTest, WriteToADescriptorSaysWhichStepFailed) {
  const auto prepare = [&] { WriteText(path, ""); };
  const auto run = [&] {
    return WithDescriptor(O_WRONLY, [&](int fd) { return File::Write(fd, 12345); });
  };
  const auto check = [&](const Outcome& outcome) {
    if (outcome.Failed("fdopen")) {
      EXPECT_TRUE(keptOpen);
    }
    if (keptOpen) {
      EXPECT_FALSE(outcome.succeeded);
      ASSERT_EQ(outcome.log.size(), 1U);
      EXPECT_EQ(outcome.log[0].message.find("Failed to open file descriptor ["), 0U);
    } else {
      std::string place;
      if (outcome.Failed("vfprintf") && outcome.log.size() == 1) {
        const std::string& message = outcome.log[0].message;
        place = message.substr(message.rfind(" to fd["));
      }
      CheckWritten(outcome, "Failed to write [12345]" + place, "Failed to flush file",
                   "Failed to sync file");
    }
  };
  SweepCalls({prepare, run, check});
  SweepMemory({prepare, run, check});
}

TEST_F(FileFaultTest, KeysAndValuesComeWholeOrNotAtAll) {
  const std::map<std::string, int> before = {{"before", 1}};
  const std::map<std::string, int> whole = {{"a", 1}, {"b", 2}};
  std::map<std::string, int> map;
  int count = -2;
  const auto prepare = [&] {
    WriteText(path, "a=1\nb=2\n");
    map = before;
  };
  const auto run = [&] {
    count = -1;
    count = File::Read(path, map);
    return count >= 0;
  };
  const auto check = [&](const Outcome& outcome) {
    const bool tookAsMissing = outcome.Failed("access");
    EXPECT_EQ(map, outcome.succeeded && !tookAsMissing ? whole : before);
    EXPECT_EQ(count, !outcome.succeeded ? -1 : tookAsMissing ? 0 : 2);
    std::vector<LogLine> expected;
    if (!outcome.succeeded && !outcome.threw) {
      expected = {Warn("file.cpp", "Read", "File[" + path + "] is not opened.")};
    }
    EXPECT_EQ(outcome.log, expected);
  };
  SweepCalls({prepare, run, check});
  SweepMemory({prepare, run, check});
  SweepTransfers({prepare, run, check});
}

TEST_F(FileFaultTest, ADirectoryIsCreatedOrItsFailureTold) {
  const std::string made = Path("a/b");
  const auto prepare = [&] { std::filesystem::remove_all(Path("a")); };
  const auto run = [&] { return File::CreateDir(made, 0750); };
  const auto check = [&](const Outcome& outcome) {
    struct stat status = {};
    if (outcome.succeeded) {
      EXPECT_EQ(stat(made.c_str(), &status), 0);
      EXPECT_EQ(status.st_mode, mode_t{S_IFDIR | 0750});
      EXPECT_EQ(outcome.log, std::vector<LogLine>{});
    } else if (!outcome.threw) {
      EXPECT_EQ(outcome.log,
                std::vector<LogLine>{
                    Failure("CreateDir", "Failed to create dir [" + made + "] with mode [750]")});
    }
  };
  if (!RunAsRoot([&] {
        SweepCalls({prepare, run, check});
        SweepMemory({prepare, run, check});
      })) {
    GTEST_SKIP() << "needs root: directories are made as root";
  }
}

TEST_F(FileFaultTest, ADirectoryIsRemovedOrTheResultIsFalse) {
  const std::string removed = Path("a");
  const auto prepare = [&] { std::filesystem::create_directories(Path("a/b")); };
  const auto run = [&] {
    {
      const Fault::Suspension suspension;
      std::filesystem::create_directories(Path("a/b"));
    }
    return File::RemoveDir(removed);
  };
  const auto check = [&](const Outcome& outcome) {
    // What cannot be looked at does not count as a directory.
    const bool tookAsMissing = !outcome.failed.empty() && outcome.failed[0].find("stat") < 3;
    if (outcome.succeeded && !tookAsMissing) {
      EXPECT_NE(access(removed.c_str(), F_OK), 0);
    }
    EXPECT_EQ(outcome.log, std::vector<LogLine>{});
  };
  SweepCalls({prepare, run, check});
  SweepMemory({prepare, run, check});
}
