// Writers of documents killed at every system call, and the order in which a document reaches the
// disk.

#include <sys/stat.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "kelodrcore/json_value.h"
#include "kill/recovery.h"
#include "support/clean_test.h"
#include "support/tracer.h"

namespace {

using KeloDRCore::JsonValue::fromFile;
using KeloDRCore::JsonValue::toFile;
using testing::Values;
using Tracer::Moment;

constexpr mode_t kMode = 04750;

std::string TemporaryOf(const std::string& name) {
  return "." + name + ".kelodr-" + std::to_string(geteuid());
}

enum class Before { kAbsent, kPresent, kLinked };

class KilledWriterTest : public CleanTest, public testing::WithParamInterface<Before> {
 protected:
  void Prepare() const {
    for (const std::string& name : NamesIn(dir)) unlink(Path(name).c_str());
    if (GetParam() == Before::kLinked) {
      ASSERT_EQ(symlink("file", Path("link").c_str()), 0);
    }
    if (GetParam() == Before::kAbsent) return;
    WriteText(Path("file"), "\"old\"");
    ASSERT_EQ(chmod(Path("file").c_str(), kMode), 0);
  }

  std::string Written() const { return Path(GetParam() == Before::kLinked ? "link" : "file"); }

  void ExpectOneOf(const std::vector<Json::Value>& documents, const Moment& moment) const {
    Json::Value value;
    if (!fromFile(value, Written())) {
      EXPECT_TRUE(GetParam() == Before::kAbsent && access(Written().c_str(), F_OK) != 0) << moment;
      return;
    }
    struct stat status = {};
    EXPECT_EQ(stat(Written().c_str(), &status), 0);
    EXPECT_TRUE(GetParam() == Before::kAbsent || (status.st_mode & 07777) == kMode) << moment;
    for (const Json::Value& document : documents) {
      if (value == document) return;
    }
    ADD_FAILURE() << value << " at " << moment;
  }

  // Whether a temporary is there; nothing else may be.
  bool HasLeftover(const Moment& moment) const {
    bool found = false;
    for (const std::string& name : NamesIn(dir)) {
      const bool isTemporary = name == TemporaryOf("file");
      EXPECT_TRUE(name == "file" || name == "link" || isTemporary) << name << " at " << moment;
      found = found || isTemporary;
    }
    return found;
  }

  // The next writer succeeds at once and takes away what the killed ones left.
  void ExpectNextWriterSucceeds(const Moment& moment) const {
    ExpectPrompt([this] { EXPECT_TRUE(toFile("next", Written())); });
    ExpectOneOf({"next"}, moment);
    EXPECT_FALSE(HasLeftover(moment)) << moment;
  }
};

INSTANTIATE_TEST_SUITE_P(OfAFile, KilledWriterTest,
                         Values(Before::kAbsent, Before::kPresent, Before::kLinked),
                         [](const auto& tested) {
                           return tested.param == Before::kAbsent    ? "ThatWasNotThere"
                                  : tested.param == Before::kPresent ? "ThatWasThere"
                                                                     : "BehindALink";
                         });

TEST_P(KilledWriterTest, LeavesAWholeDocumentAndOneTemporaryAtMost) {
  bool sawLeftover = false;
  const std::vector<int> kills =
      Tracer::Sweep([this] { Prepare(); }, [this] { toFile("new", Written()); },
                    [&](const Moment& moment) {
                      ExpectOneOf({"old", "new"}, moment);
                      sawLeftover = HasLeftover(moment) || sawLeftover;
                      ExpectNextWriterSucceeds(moment);
                    });
  ASSERT_EQ(kills.size(), 1U);
  EXPECT_GT(kills[0], 15);
  EXPECT_TRUE(sawLeftover);
  RecordProperty("kills", kills[0]);
}

TEST_P(KilledWriterTest, MayBeFollowedByAnotherKilledWriter) {
  const int kills = SweepPairs(
      {1, 1}, [this] { Prepare(); },
      {[this] { toFile("new", Written()); }, [this] { toFile("newer", Written()); }},
      [this](const Moment& second) {
        ExpectOneOf({"old", "new", "newer"}, second);
        HasLeftover(second);
        ExpectNextWriterSucceeds(second);
      });
  EXPECT_GT(kills, 50);
  RecordProperty("kills", kills);
}

class PowerLossTest : public CleanTest {
 protected:
  using Calls = std::vector<std::string>;

  Calls CallsOfWriting(const std::string& name) const {
    return Tracer::FileCalls(dir, [&] { EXPECT_TRUE(toFile("new", Path(name))); });
  }
};

// A name must never reach the disk before the text that it stands for, and a write that has
// succeeded must be on the disk: text, its sync, the name, its sync.

TEST_F(PowerLossTest, ANewDocumentIsSyncedBeforeItsNameAndItsNameBeforeSuccess) {
  const std::string temporary = TemporaryOf("a");
  EXPECT_EQ(CallsOfWriting("a"),
            (Calls{"create " + temporary, "write " + temporary, "sync " + temporary,
                   "rename " + temporary + " a", "sync ."}));
}

TEST_F(PowerLossTest, AReplacedDocumentIsSyncedWithItsModeBeforeItsName) {
  const std::string temporary = TemporaryOf("a");
  WriteText(Path("a"), "\"old\"");
  EXPECT_EQ(CallsOfWriting("a"),
            (Calls{"create " + temporary, "write " + temporary, "mode " + temporary,
                   "sync " + temporary, "rename " + temporary + " a", "sync ."}));
}

TEST_F(PowerLossTest, AnOwnerIsTakenOverBeforeTheModeAndBothBeforeTheSync) {
  if (geteuid() != 0) GTEST_SKIP() << "needs root to give files away";
  const std::string temporary = TemporaryOf("a");
  WriteText(Path("a"), "\"old\"");
  ASSERT_EQ(chown(Path("a").c_str(), 1234, 5678), 0);
  EXPECT_EQ(
      CallsOfWriting("a"),
      (Calls{"create " + temporary, "write " + temporary, "owner " + temporary, "mode " + temporary,
             "sync " + temporary, "rename " + temporary + " a", "sync ."}));
}

// Its temporary has to stay readable until it is published.
TEST_F(PowerLossTest, AModeWithoutTheOwnersReadBitIsSyncedAsWell) {
  const std::string temporary = TemporaryOf("a");
  WriteText(Path("a"), "\"old\"");
  ASSERT_EQ(chmod(Path("a").c_str(), 0040), 0);
  EXPECT_EQ(
      CallsOfWriting("a"),
      (Calls{"create " + temporary, "write " + temporary, "mode " + temporary, "sync " + temporary,
             "rename " + temporary + " a", "mode a", "sync a", "sync ."}));
}

TEST_F(PowerLossTest, ALinkedDocumentIsSyncedInTheDirectoryOfTheFile) {
  ASSERT_EQ(mkdir(Path("sub").c_str(), 0755), 0);
  ASSERT_EQ(symlink("sub/a", Path("link").c_str()), 0);
  const std::string temporary = "sub/" + TemporaryOf("a");
  EXPECT_EQ(CallsOfWriting("link"),
            (Calls{"create " + temporary, "write " + temporary, "sync " + temporary,
                   "rename " + temporary + " sub/a", "sync sub"}));
}

TEST_F(PowerLossTest, ALeftTemporaryIsRemovedBeforeItsNameIsTakenAgain) {
  const std::string temporary = TemporaryOf("a");
  WriteText(Path(temporary), "left");
  EXPECT_EQ(
      CallsOfWriting("a"),
      (Calls{"create " + temporary, "remove " + temporary, "create " + temporary,
             "write " + temporary, "sync " + temporary, "rename " + temporary + " a", "sync ."}));
}

}  // namespace
