#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <functional>

#include "fault/fault.h"
#include "kelodrcore/json_value.h"
#include "support/process.h"

namespace JsonValue = KeloDRCore::JsonValue;
using Fault::Outcome;

namespace {

constexpr char kOld[] = "{\"document\":\"old\"}";
constexpr char kNew[] = "{\"document\":\"new\",\"list\":[1,2.5,true,null]}";

Json::Value Document(const char* text) {
  Json::Value value;
  EXPECT_TRUE(JsonValue::fromString(value, text));
  return value;
}

class JsonFaultTest : public FaultTest {
 protected:
  void SetUp() override {
    FaultTest::SetUp();
    path = Path("document");
    temporary = Path(".document.kelodr-" + std::to_string(geteuid()));
  }

  Fault::Operation ToFile(const std::string& old);
  // Success means that everything was done: only the release of what the writer had open, and a
  // lock that was tried again, may have failed.
  static void ExpectAllDone(const Outcome& outcome);
  // The same over an old file, with something else that is there when it begins.
  Fault::Operation ToFileOver(const std::function<void()>& arrange);

  std::string path;
  std::string temporary;
  bool wasLeftReadable = false;
  const Json::Value newDocument = Document(kNew);
};

void JsonFaultTest::ExpectAllDone(const Outcome& outcome) {
  if (!outcome.succeeded || outcome.error == Fault::kNoMemory || outcome.error == EINTR) {
    return;
  }
  for (const std::string& call : outcome.failed) {
    EXPECT_TRUE(call == "close" || call == "flock") << call;
  }
}

// The document is the old or the new one. A temporary stays only where its removal failed, or where
// its lock could not be had for a minute, without which it may be another writer's; the next call
// takes it away.
Fault::Operation JsonFaultTest::ToFile(const std::string& old) {
  const auto prepare = [this, old] {
    for (const std::string& name : NamesIn(dir)) unlink(Path(name).c_str());
    if (!old.empty()) WriteText(path, old);
  };
  const auto run = [this] { return JsonValue::toFile(newDocument, path); };
  const auto check = [this, old](const Outcome& outcome) {
    const std::string text = ReadText(path);
    EXPECT_TRUE(text == kNew || (!outcome.succeeded && text == old)) << text;
    const size_t documents = text.empty() ? 0 : 1;
    const bool mayLeaveTemporary =
        outcome.Failed("unlinkat") || (outcome.Failed("flock") && outcome.error == EAGAIN);
    EXPECT_LE(NamesIn(dir).size(), documents + (mayLeaveTemporary ? 1 : 0));
    EXPECT_EQ(outcome.log, std::vector<LogLine>{});
    ExpectAllDone(outcome);
  };
  return {prepare, run, check};
}

// What is under the name of the temporary stays while it cannot be removed, and is never written
// to.
Fault::Operation JsonFaultTest::ToFileOver(const std::function<void()>& arrange) {
  const Fault::Operation toFile = ToFile(kOld);
  const auto prepare = [prepareFile = toFile.prepare, arrange] {
    prepareFile();
    arrange();
  };
  const auto check = [this](const Outcome& outcome) {
    const std::string text = ReadText(path);
    EXPECT_TRUE(text == kNew || (!outcome.succeeded && text == kOld)) << text;
    EXPECT_LE(NamesIn(dir).size(), outcome.succeeded ? 1U : 2U);
    EXPECT_EQ(outcome.log, std::vector<LogLine>{});
    ExpectAllDone(outcome);
  };
  return {prepare, toFile.run, check};
}

}  // namespace

TEST_F(JsonFaultTest, FromFileGivesTheWholeDocumentOrLeavesTheValue) {
  Json::Value value;
  const auto prepare = [&] {
    WriteText(path, kNew);
    value = "before";
  };
  const auto run = [&] { return JsonValue::fromFile(value, path); };
  const auto check = [&](const Outcome& outcome) {
    EXPECT_EQ(value, outcome.succeeded ? newDocument : Json::Value("before"));
    EXPECT_EQ(outcome.log, std::vector<LogLine>{});
  };
  SweepCalls({prepare, run, check});
  SweepMemory({prepare, run, check});
  SweepTransfers({prepare, run, check});
}

// JsonCpp reads numbers with a fraction from a stream, which takes such a failure for a wrong text.
TEST_F(JsonFaultTest, ATextWithoutFractionsIsNotRefusedForWantOfMemory) {
  Json::Value value;
  const auto prepare = [] {};
  const auto run = [&] { return JsonValue::fromString(value, R"({"name": ["text", 1]})"); };
  const auto check = [](const Outcome& outcome) { EXPECT_NE(outcome.succeeded, outcome.threw); };
  SweepMemory({prepare, run, check});
}

TEST_F(JsonFaultTest, ToFileMakesANewFileWholeOrNotAtAll) {
  SweepCalls(ToFile(""));
  SweepMemory(ToFile(""));
  SweepTransfers(ToFile(""));
}

TEST_F(JsonFaultTest, ToFileReplacesAFileWholeOrNotAtAll) {
  SweepCalls(ToFile(kOld));
  SweepMemory(ToFile(kOld));
  SweepTransfers(ToFile(kOld));
}

TEST_F(JsonFaultTest, ToFileReplacesTheFileBehindALinkWholeOrNotAtAll) {
  Fault::Operation operation = ToFile(kOld);
  operation.prepare = [this, prepareFile = operation.prepare] {
    prepareFile();
    EXPECT_EQ(symlink("document", Path("link").c_str()), 0);
  };
  operation.run = [this] { return JsonValue::toFile(newDocument, Path("link")); };
  operation.check = [this](const Outcome& outcome) {
    const std::string text = ReadText(path);
    EXPECT_TRUE(text == kNew || (!outcome.succeeded && text == kOld)) << text;
    EXPECT_TRUE(std::filesystem::is_symlink(Path("link")));
    ExpectAllDone(outcome);
  };
  SweepCalls(operation);
  SweepMemory(operation);
}

TEST_F(JsonFaultTest, ToFileTakesALeftTemporaryAwayOrFails) {
  const auto leave = [this] { WriteText(temporary, "half"); };
  SweepCalls(ToFileOver(leave));
  SweepMemory(ToFileOver(leave));
}

TEST_F(JsonFaultTest, ToFileTakesAPlantedLinkAwayOrFails) {
  const auto plant = [this] { EXPECT_EQ(symlink("nowhere", temporary.c_str()), 0); };
  SweepCalls(ToFileOver(plant));
  SweepMemory(ToFileOver(plant));
}

TEST_F(JsonFaultTest, InterruptionsWithoutEndAreAFailureToWrite) {
  WriteText(path, kOld);
  Fault::Arm({EINTR, 1, Fault::kForGood});
  EXPECT_FALSE(JsonValue::toFile("new", path));
  const int error = errno;
  EXPECT_GT(Fault::Disarm(), 1000);
  EXPECT_EQ(error, EINTR);
  EXPECT_EQ(ReadText(path), kOld);
}

// The bit that lets its owner read it is taken away last.
TEST_F(JsonFaultTest, ToFileKeepsAFileFromItsOwnerOrFails) {
  constexpr mode_t kMode = 0020;
  Fault::Operation operation = ToFileOver([this] { chmod(path.c_str(), kMode); });
  operation.check = [this, checkFile = operation.check](const Outcome& outcome) {
    checkFile(outcome);
    struct stat status = {};
    EXPECT_EQ(stat(path.c_str(), &status), 0);
    const bool mayBeRead = outcome.Failed("fchmod") || wasLeftReadable;
    wasLeftReadable = (status.st_mode & S_IRUSR) != 0;
    EXPECT_TRUE(mayBeRead || !wasLeftReadable);
    EXPECT_EQ(status.st_mode & ~mode_t{S_IRUSR}, mode_t{S_IFREG | kMode});
  };
  if (!RunAsRoot([&] {
        SweepCalls(operation);
        SweepMemory(operation);
      })) {
    GTEST_SKIP() << "needs root to read what its owner may not";
  }
}
