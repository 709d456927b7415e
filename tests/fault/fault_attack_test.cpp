// What an ordinary user has put in root's way, while root's calls fail: the result is a described
// one, and nothing of his is followed or believed.

#include <sys/file.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <deque>
#include <filesystem>

#include "attack/acl.h"
#include "attack/attack.h"
#include "fault/fault.h"
#include "fault/interception.h"
#include "kelodrcore/file_lock.h"
#include "kelodrcore/json_value.h"
#include "support/test_cache.h"

using Fault::Outcome;
using KeloDRCore::FileLock;
using KeloDRCore::JsonValue::toFile;

namespace {

const Json::Value kNew = "new";

using Plant = std::function<void()>;

constexpr char kDocument[] = "/tmp/doc";
constexpr char kTemporary[] = "/tmp/.doc.kelodr-0";
constexpr char kFallback[] = "/tmp/default_dr_cache";
constexpr char kLockDir[] = "/tmp/.kelodr_lock";

void Own(const std::string& path, uid_t owner) {
  ASSERT_EQ(lchown(path.c_str(), owner, owner), 0) << path;
}

Plant File(const std::string& path, const std::string& text) {
  return [=] {
    WriteText(path, text);
    Own(path, kUser);
  };
}

Plant Link(const std::string& path, const std::string& target) {
  return [=] {
    MakeLink(target, path);
    Own(path, kUser);
  };
}

Plant Queue(const std::string& path) {
  return [=] {
    MakeQueue(path);
    Own(path, kUser);
  };
}

Plant Directory(const std::string& path) {
  return [=] {
    MakeDir(path, 0777, kUser);
    WriteText(path + "/file", "");
  };
}

class FaultAttackTest : public FaultTest {
 protected:
  struct Scene : AttackTest {
    using AttackTest::Attack;
  };

  // Sweeps `operation` once for each of the plants, each time in a /tmp of its own.
  void SweepPlants(const std::vector<Plant>& plants, const Fault::Operation& operation);

  static void CheckNothingOfRootsIsTouched() {
    EXPECT_EQ(ReadText(kSecret), "secret");
    EXPECT_EQ(NamesIn(kSafeDir), Names{"secret"});
    EXPECT_EQ(NamesIn(kHome), Names{});
  }
};

void FaultAttackTest::SweepPlants(const std::vector<Plant>& plants,
                                  const Fault::Operation& operation) {
  for (const Plant& plant : plants) {
    const auto prepare = [&] {
      for (const std::string& name : NamesIn("/tmp")) {
        const std::string path = "/tmp/" + name;
        if (path != kHome && path != kSafeDir) std::filesystem::remove_all(path);
      }
      plant();
      operation.prepare();
    };
    const auto check = [&](const Outcome& outcome) {
      operation.check(outcome);
      CheckNothingOfRootsIsTouched();
    };
    Scene::Attack([&] {
      SweepCalls({prepare, operation.run, check});
      SweepMemory({prepare, operation.run, check});
    });
    if (HasFailure() || IsSkipped()) return;
    interruptedStride = 0;  // whatever was planted, signals without end are the same failure
  }
}

TEST_F(FaultAttackTest, APlantedTemporaryIsTakenAwayOrTheWriteFails) {
  const auto prepare = [] { WriteText(kDocument, "\"old\""); };
  const auto run = [] { return toFile(kNew, kDocument); };
  const auto check = [](const Outcome& outcome) {
    EXPECT_TRUE(ReadText(kDocument) == "\"new\"" ||
                (!outcome.succeeded && ReadText(kDocument) == "\"old\""));
    ExpectFile(kDocument, 0, 0644);
    if (outcome.succeeded) {
      EXPECT_FALSE(IsThere(kTemporary));
    }
    EXPECT_TRUE(outcome.log.empty());
  };
  SweepPlants({Link(kTemporary, kSecret), Link(kTemporary, "nowhere"), Queue(kTemporary),
               Directory(kTemporary), File(kTemporary, "evil")},
              {prepare, run, check});
}

// That it is refused is the success here.
TEST_F(FaultAttackTest, AStrangersLinkInAStickyDirectoryIsNeverFollowed) {
  const auto run = [] { return !toFile(kNew, kDocument); };
  const auto check = [](const Outcome& outcome) {
    EXPECT_TRUE(outcome.succeeded || outcome.threw);
    EXPECT_TRUE(S_ISLNK(LookAt(kDocument).st_mode));
    EXPECT_FALSE(IsThere(kTemporary));
  };
  SweepPlants({Link(kDocument, kSecret), Link(kDocument, SafePath("new"))}, {[] {}, run, check});
}

// Whatever comes of the write: the user reads what he could read, and nobody else anything more.
TEST_F(FaultAttackTest, ADocumentKeepsItsAccessWhateverFails) {
  constexpr char kDir[] = "/tmp/dir";
  constexpr char kPath[] = "/tmp/dir/doc";
  std::string list;
  const auto prepare = [&] {
    MakeDir(kDir, 0755);
    WriteText(kPath, "\"old\"");
    Own(kPath, kUser);
    SetAttribute(kPath, kAccess, AclForUser(kRead));
    SetAttribute(kPath, "user.note", 'u');
    SetAttribute(kPath, "security.label", 's');
    SetAttribute(kDir, kDefault, AclForUser(kReadWrite));
    list = Attribute(kPath, kAccess);
  };
  const auto run = [&] { return toFile(kNew, kPath); };
  const auto check = [&](const Outcome& outcome) {
    EXPECT_TRUE(ReadText(kPath) == "\"new\"" ||
                (!outcome.succeeded && ReadText(kPath) == "\"old\""));
    EXPECT_EQ(Attribute(kPath, kAccess), list);
    EXPECT_EQ(Attribute(kPath, "user.note"), "u");
    EXPECT_EQ(Attribute(kPath, "security.label"), "s");
    ExpectFile(kPath, kUser, 0640);
    const bool mayStay = outcome.Failed("unlinkat") || outcome.Failed("flock");
    EXPECT_TRUE(NamesIn(kDir) == Names{"doc"} || mayStay);
  };
  SweepPlants({[] {}}, {prepare, run, check});
}

// Without a directory of its own a cache is where everybody may write.
TEST_F(FaultAttackTest, ACacheBelievesNothingOfAStrangersAndWaitsForNobody) {
  const std::string pidFile = kFallback + std::string(".pid");
  const std::string evil = R"({"cached_data":"evil","max_updated_time":77})";
  const std::string liveProcess = std::to_string(getpid()) + "\n";
  Json::Value data;
  const auto run = [&] {
    data = Json::Value();
    TestCache cache("", "", 1000, true, 0);
    cache.fetch = [](Json::Value& out) {
      const Fault::Suspension suspension;
      out = kNew;
      return true;
    };
    data = cache.Read();
    return data == kNew;
  };
  const auto check = [&](const Outcome& outcome) {
    EXPECT_TRUE(data == kNew || data.isNull()) << data;
    if (outcome.succeeded) {
      ExpectFile(kFallback, 0, 0644);
    }
    const bool waited = std::any_of(
        outcome.log.begin(), outcome.log.end(),
        [](const LogLine& line) { return line.message.find("start to block wait cache") == 0; });
    EXPECT_TRUE(!waited || outcome.error == EAGAIN) << "only a lock that is held is waited for";
  };
  mayThrowJsonError = true;
  heldForGood = 1500;  // its holder is waited for
  interruptedStride = 47;
  SweepPlants(
      {File(kFallback, evil), Link(kFallback, kSecret), Queue(kFallback), Directory(kFallback),
       File(pidFile, liveProcess), Link(pidFile, kSecret), Queue(pidFile), Directory(pidFile)},
      {[] {}, run, check});
}

// Its release finds a stranger's pid file, and no memory to look whose directory that is in.
TEST_F(FaultAttackTest, AClaimIsReleasedWhateverStandsAtItsName) {
  const std::string cacheDir = "/tmp/a directory with a long name";
  const std::string pidFile = cacheDir + "/c.cached.pid";
  const std::string liveProcess = std::to_string(getpid()) + "\n";
  const auto prepare = [&] {
    std::filesystem::remove_all(cacheDir);
    MakeDir(cacheDir, 01777);
  };
  const auto run = [&] {
    TestCache cache(cacheDir, "c", 1000, true, 0);
    cache.fetch = [&](Json::Value& out) {
      const Fault::Suspension suspension;
      EXPECT_EQ(unlink(pidFile.c_str()), 0);
      File(pidFile, liveProcess)();
      out = kNew;
      return true;
    };
    return cache.Update();
  };
  const auto check = [&](const Outcome& outcome) {
    EXPECT_TRUE(outcome.succeeded || outcome.threw || !outcome.log.empty());
  };
  mayThrowJsonError = true;
  Scene::Attack([&] { SweepMemory({prepare, run, check}); });
}

TEST_F(FaultAttackTest, ALockLeadsNowhereAndIsHeldOrNotGot) {
  const std::string sub = std::string(kLockDir) + "/sub";
  const std::string name = sub + "/name";
  const auto below = [&](const Plant& plant) {
    return [=] {
      MakeDir(kLockDir, 0755, kUser);
      MakeDir(sub, 0777, kUser);
      plant();
    };
  };
  const auto checkTaken = [&] {
    for (const std::string& step : {std::string(kLockDir), sub}) {
      EXPECT_EQ(LookAt(step).st_mode, S_IFDIR | 0755U);
      EXPECT_EQ(LookAt(step).st_uid, 0U);
    }
    EXPECT_TRUE(S_ISREG(LookAt(name).st_mode));
    EXPECT_FALSE(FileLock("sub/name").lock(LOCK_EX | LOCK_NB, 0));
  };
  const auto run = [&] {
    FileLock lock("sub/name");
    const bool isTaken = lock.lock(LOCK_EX | LOCK_NB, 0);
    const Fault::Suspension suspension;
    if (isTaken) checkTaken();
    return isTaken;
  };
  SweepPlants({Directory(kLockDir), Link(kLockDir, kSafeDir), Link(kLockDir, kHome),
               Queue(kLockDir), below(Link(name, kSecret)), below(Link(name, SafePath("new"))),
               below(Queue(name)), below(Directory(name))},
              {[] {}, run, [](const Outcome&) {}});
}

// Some kernels call a link one, others say that it is no directory. It may be gone meanwhile.
TEST_F(FaultAttackTest, ALinkInPlaceOfTheLockDirectoryIsTakenAwayByWhateverNameAndHand) {
  for (const bool isGone : {false, true}) {
    Scene::Attack([isGone] {
      Link(kLockDir, kHome)();
      const Fault::Interception isLink("openat", 2, ELOOP);
      const Fault::Interception stranger("unlinkat", 1, [isGone] {
        if (isGone) unlink(kLockDir);
        return Fault::kGoOn;
      });
      EXPECT_TRUE(FileLock("name").lock(LOCK_EX | LOCK_NB, 0));
      EXPECT_TRUE(isLink.HasRun() && stranger.HasRun());
    });
  }
}

// Before each look whether it is still the one that was made safe, another takes its place.
TEST_F(FaultAttackTest, ALockDirectoryThatIsSwappedAgainAndAgainIsGivenUp) {
  Scene::Attack([] {
    MakeDir(kLockDir, 0755, kUser);
    int swaps = 0;
    const auto swap = [&swaps] {
      const std::string aside = HomePath(std::to_string(++swaps));
      EXPECT_EQ(rename(kLockDir, aside.c_str()), 0);
      MakeDir(kLockDir, 0755, kUser);
      return Fault::kGoOn;
    };
    std::deque<Fault::Interception> looks;
    for (int look = 1; look <= 10; ++look) looks.emplace_back("fstatat", look, swap);
    EXPECT_FALSE(FileLock("name").lock(LOCK_EX | LOCK_NB, 0));
    EXPECT_EQ(swaps, 10);
    LogCapture::Clear();
  });
}

}  // namespace
