#include <fcntl.h>
#include <unistd.h>

#include "kelodrcore/json_value.h"
#include "support/fault.h"

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
  }

  Fault::Operation ToFile(const std::string& old);

  std::string path;
  const Json::Value newDocument = Document(kNew);
};

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
  };
  return {prepare, run, check};
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
}

TEST_F(JsonFaultTest, ToFileMakesANewFileWholeOrNotAtAll) {
  SweepCalls(ToFile(""));
  SweepMemory(ToFile(""));
}

TEST_F(JsonFaultTest, ToFileReplacesAFileWholeOrNotAtAll) {
  SweepCalls(ToFile(kOld));
  SweepMemory(ToFile(kOld));
}
