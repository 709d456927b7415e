#include "privilege.h"

#include <linux/capability.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <functional>
#include <stdexcept>
#include <string>
#include <vector>

#include "support/clean_test.h"
#include "unit/root_ids/root_ids.h"

namespace {

using KeloDRCore::PrivilegeBracket;

constexpr uid_t kKeep = static_cast<uid_t>(-1);
constexpr uid_t kUser = 65534;
constexpr uid_t kOther = 12345;

// Real, effective and saved ids.
struct Ids {
  uid_t real;
  uid_t effective;
  uid_t saved;
};
constexpr Ids kRoot = {0, 0, 0};
constexpr Ids kEffective = {0, kUser, 0};
constexpr Ids kAll = {kUser, kUser, kUser};

void SetIds(const Ids& uid, const Ids& gid) {
  ASSERT_EQ(setresgid(gid.real, gid.effective, gid.saved), 0);
  ASSERT_EQ(setresuid(uid.real, uid.effective, uid.saved), 0);
}

LogLine Raised(const std::string& word) {
  return Auth(LOG_AUTH | LOG_DEBUG, "some.cpp WARNING: set" + word + "(-1, 0, -1)");
}

LogLine Refused(const std::string& word, uid_t id) {
  return Auth(LOG_AUTH | LOG_ERR, "some.cpp ERROR: set" + word + "(-1, " + std::to_string(id) +
                                      ", -1) [Operation not permitted]");
}

LogLine Failed(const std::string& step) {
  return Auth(LOG_AUTH | LOG_ERR, "some.cpp ERROR: " + step + "CriticalSection");
}

// What one bracket did.
struct Step {
  std::vector<LogLine> log;
  int error = -1;
  uid_t uid = kKeep;
  gid_t gid = kKeep;
};

class PrivilegeTest : public CleanTest {
 protected:
  // Runs `test` in a child, whose ids nobody needs afterwards.
  static void Isolated(const std::function<void()>& test) { EXPECT_EQ(RunInChild(test), 0); }

  // Mirrors the log to Path("log"), which every user can write.
  void MirrorForEveryone() const {
    WriteText(Path("log"), "");
    ASSERT_EQ(chmod(dir.c_str(), 0755), 0);
    ASSERT_EQ(chmod(Path("log").c_str(), 0666), 0);
    LogCapture::MirrorTo(Path("log"));
  }

  static void ExpectStep(const char* name, const std::vector<LogLine>& log, int error, uid_t uid,
                         gid_t gid) {
    const int seen = errno;
    EXPECT_EQ(seen, error) << name;
    EXPECT_EQ(geteuid(), uid) << name;
    EXPECT_EQ(getegid(), gid) << name;
    EXPECT_EQ(LogCapture::Take(), log) << name;
  }

  // Enters and leaves under the ids given, with `inside` in between.
  static void Expect(const Step& enter, const std::function<void()>& inside, const Step& leave) {
    errno = ENOENT;
    {
      const PrivilegeBracket bracket("some.cpp", 7);
      ExpectStep("enter", enter.log, enter.error, enter.uid, enter.gid);
      inside();
      errno = ENOENT;
    }
    ExpectStep("leave", leave.log, leave.error, leave.uid, leave.gid);
  }
};

void Nothing() {}

TEST_F(PrivilegeTest, RootSwitchesNothing) { Expect({{}, 0, 0, 0}, Nothing, {{}, 0, 0, 0}); }

TEST_F(PrivilegeTest, AnotherEffectiveUidIsRaisedAndRestored) {
  Isolated([] {
    SetIds(kEffective, kRoot);
    Expect({{Raised("resuid")}, 0, 0, 0}, Nothing, {{Raised("resuid")}, 0, kUser, 0});
  });
}

TEST_F(PrivilegeTest, AnotherEffectiveGidIsRaisedAndRestored) {
  Isolated([] {
    SetIds(kRoot, kEffective);
    Expect({{Raised("resgid")}, 0, 0, 0}, Nothing, {{}, 0, 0, kUser});
  });
}

TEST_F(PrivilegeTest, BothEffectiveIdsAreRaisedAndRestored) {
  Isolated([] {
    SetIds(kEffective, kEffective);
    Expect({{Raised("resgid"), Raised("resuid")}, 0, 0, 0}, Nothing,
           {{Raised("resuid")}, 0, kUser, kUser});
  });
}

TEST_F(PrivilegeTest, RealAndSavedIdsAreLeftAlone) {
  Isolated([] {
    SetIds({kOther, kUser, 0}, {kOther, kUser, 0});
    {
      const PrivilegeBracket bracket("some.cpp", 7);
      uid_t uid[3];
      gid_t gid[3];
      ASSERT_EQ(getresuid(&uid[0], &uid[1], &uid[2]), 0);
      ASSERT_EQ(getresgid(&gid[0], &gid[1], &gid[2]), 0);
      EXPECT_EQ(std::vector<uid_t>(uid, uid + 3), (std::vector<uid_t>{kOther, 0, 0}));
      EXPECT_EQ(std::vector<gid_t>(gid, gid + 3), (std::vector<gid_t>{kOther, 0, 0}));
    }
    LogCapture::Clear();
  });
}

TEST_F(PrivilegeTest, ARefusedGidStopsTheEnterBeforeTheUid) {
  Isolated([] {
    SetIds(kEffective, kAll);
    Expect({{Refused("resgid", 0), Failed("ENTER")}, EPERM, kUser, kUser}, Nothing,
           {{}, 0, kUser, kUser});
  });
}

TEST_F(PrivilegeTest, NothingIsRaisedWithoutAnyRootId) {
  Isolated([] {
    SetIds(kAll, kAll);
    Expect({{Refused("resgid", 0), Failed("ENTER")}, EPERM, kUser, kUser}, Nothing,
           {{}, 0, kUser, kUser});
  });
}

TEST_F(PrivilegeTest, ARefusedUidFailsTheEnter) {
  Isolated([] {
    SetIds(kAll, kRoot);
    Expect({{Refused("resuid", 0), Failed("ENTER")}, EPERM, kUser, 0}, Nothing, {{}, 0, kUser, 0});
  });
}

TEST_F(PrivilegeTest, AGidRaisedBeforeARefusedUidIsRestored) {
  Isolated([] {
    SetIds(kAll, {0, kUser, kUser});
    Expect({{Raised("resgid"), Refused("resuid", 0), Failed("ENTER")}, EPERM, kUser, 0}, Nothing,
           {{}, 0, kUser, kUser});
  });
}

TEST_F(PrivilegeTest, AGidThatCannotBeRestoredUnderAnUnchangedUidFailsTheLeave) {
  Isolated([] {
    SetIds(kAll, kEffective);
    Expect({{Raised("resgid"), Refused("resuid", 0), Failed("ENTER")}, EPERM, kUser, 0}, Nothing,
           {{Refused("resgid", kUser), Failed("LEAVE")}, EPERM, kUser, 0});
  });
}

TEST_F(PrivilegeTest, ALeaveThatCannotBecomeRootStopsAtOnce) {
  Isolated([] {
    SetIds(kEffective, kEffective);
    Expect({{Raised("resgid"), Raised("resuid")}, 0, 0, 0},
           [] { ASSERT_EQ(setresuid(kOther, kOther, kOther), 0); },
           {{Refused("resuid", 0), Failed("LEAVE")}, EPERM, kOther, 0});
  });
}

TEST_F(PrivilegeTest, ALeaveThatCannotRestoreTheGidKeepsTheUid) {
  Isolated([] {
    SetIds(kEffective, kEffective);
    Expect({{Raised("resgid"), Raised("resuid")}, 0, 0, 0},
           [] { RootIds::DropCapability(CAP_SETGID); },
           {{Raised("resuid"), Refused("resgid", kUser), Failed("LEAVE")}, EPERM, 0, 0});
  });
}

TEST_F(PrivilegeTest, ALeaveThatCannotRestoreTheUidHasRestoredTheGid) {
  Isolated([] {
    SetIds(kEffective, kEffective);
    Expect({{Raised("resgid"), Raised("resuid")}, 0, 0, 0},
           [] { RootIds::DropCapability(CAP_SETUID); },
           {{Raised("resuid"), Refused("resuid", kUser), Failed("LEAVE")}, EPERM, 0, kUser});
  });
}

TEST_F(PrivilegeTest, ASavedGidOfRootIsRestoredWithALine) {
  Isolated([] {
    Expect({{}, 0, 0, 0}, [] { ASSERT_EQ(setresgid(kKeep, kUser, kKeep), 0); },
           {{Raised("resgid")}, 0, 0, 0});
  });
}

TEST_F(PrivilegeTest, ASavedUidOfRootIsRestoredWithALineForEachSwitch) {
  Isolated([] {
    Expect({{}, 0, 0, 0}, [] { ASSERT_EQ(setresuid(kKeep, kUser, kKeep), 0); },
           {{Raised("resuid"), Raised("resuid")}, 0, 0, 0});
  });
}

TEST_F(PrivilegeTest, BothSavedIdsOfRootAreRestoredUidFirstAndLast) {
  Isolated([] {
    Expect({{}, 0, 0, 0},
           [] {
             ASSERT_EQ(setresgid(kKeep, kUser, kKeep), 0);
             ASSERT_EQ(setresuid(kKeep, kUser, kKeep), 0);
           },
           {{Raised("resuid"), Raised("resgid"), Raised("resuid")}, 0, 0, 0});
  });
}

TEST_F(PrivilegeTest, AnExceptionLeavesTheBracket) {
  Isolated([] {
    SetIds(kEffective, kEffective);
    try {
      const PrivilegeBracket bracket("some.cpp", 7);
      throw std::runtime_error("out");
    } catch (const std::runtime_error&) {
      EXPECT_EQ(geteuid(), kUser);
      EXPECT_EQ(getegid(), kUser);
    }
    ExpectLog({Raised("resgid"), Raised("resuid"), Raised("resuid")});
  });
}

TEST_F(PrivilegeTest, ABracketInsideABracketSwitchesNothing) {
  Isolated([] {
    SetIds(kEffective, kEffective);
    Expect({{Raised("resgid"), Raised("resuid")}, 0, 0, 0},
           [] {
             Expect({{}, 0, 0, 0}, Nothing, {{}, 0, 0, 0});
           },
           {{Raised("resuid")}, 0, kUser, kUser});
  });
}

// The whole texts that were sent, source lines included.
std::vector<std::string> Texts(const std::string& mirror) {
  std::vector<std::string> texts;
  const std::string all = ReadText(mirror);
  for (size_t begin = 0, end; (end = all.find('\x1e', begin)) != std::string::npos;
       begin = end + 1) {
    const size_t text = all.rfind('\x1f', end) + 1;
    texts.push_back(all.substr(text, end - text));
  }
  return texts;
}

TEST_F(PrivilegeTest, TheMacroNamesItsFileAndLineInBothSteps) {
  MirrorForEveryone();
  Isolated([this] {
    SetIds(kEffective, kRoot);
    std::string line;
    {
      line = std::to_string(__LINE__ + 1);
      KELODR_PRIVILEGED();
    }
    const std::string text = "privilege_test.cpp:" + line + " WARNING: setresuid(-1, 0, -1)";
    EXPECT_EQ(Texts(Path("log")), (std::vector<std::string>{text, text}));
  });
}

TEST_F(PrivilegeTest, AnErrorLineIsExactlyPlaceIdsAndReason) {
  MirrorForEveryone();
  Isolated([this] {
    SetIds(kAll, kRoot);
    { const PrivilegeBracket bracket("some.cpp", 7); }
    EXPECT_EQ(Texts(Path("log")),
              (std::vector<std::string>{
                  "some.cpp:7 ERROR: setresuid(-1, 0, -1) [Operation not permitted]",
                  "some.cpp:7 ERROR: ENTERCriticalSection"}));
  });
}

}  // namespace
