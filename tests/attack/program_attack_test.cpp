#include <fcntl.h>
#include <gmock/gmock.h>
#include <unistd.h>

#include <cstdlib>

#include "attack/attack.h"
#include "kelodrcore/file.h"
#include "kelodrcore/utils.h"

namespace File = KeloDRCore::File;

namespace {

// A program that an ordinary user has started and that got root's rights from its file's mode.
void BecomeSetIdProgram() {
  ASSERT_EQ(setresgid(kUser, 0, 0), 0);
  ASSERT_EQ(setresuid(kUser, 0, 0), 0);
}

class ProgramAttackTest : public AttackTest {
 protected:
  // Runs `start` in a hostile environment with a script in place of the program; the environment
  // that the script was given.
  static std::string EnvironmentOf(const char* program, const std::function<void()>& start) {
    const std::string script = HomePath("program");
    const std::string seen = HomePath("environment");
    WriteText(script, "#!/bin/sh\ntr '\\0' '\\n' </proc/$$/environ >" + seen + "\necho x\n");
    EXPECT_EQ(chmod(script.c_str(), 0755), 0);
    EXPECT_TRUE(RunWithProgram(program, script, [&] {
      for (const char* name : {"POSIXLY_CORRECT", "LC_ALL", "LD_PRELOAD", "PATH", "ENV", "IFS"}) {
        setenv(name, "evil", 1);
      }
      start();
    }));
    return ReadText(seen);
  }
};

TEST_F(ProgramAttackTest, TheEnvironmentDoesNotReachMkdir) {
  Attack([] {
    MakeDir("work", 0755, kUser);
    ASSERT_EQ(chdir("work"), 0);
    setenv("POSIXLY_CORRECT", "1", 1);
    EXPECT_EQ(RunInChild([] {
                BecomeSetIdProgram();
                EXPECT_TRUE(File::CreateDir("/tmp/closed", 0700));
              }),
              0);
    EXPECT_EQ(LookAt("/tmp/closed").st_mode, S_IFDIR | 0700U);
    EXPECT_EQ(NamesIn("."), Names{});
  });
}

TEST_F(ProgramAttackTest, FilesOfTheWorkingDirectoryDoNotReachMkdir) {
  Attack([] {
    MakeDir("work", 0755, kUser);
    ASSERT_EQ(chdir("work"), 0);
    AsUser([] {
      WriteText("-m", "");
      WriteText("700", "");
    });
    setenv("POSIXLY_CORRECT", "1", 1);
    EXPECT_TRUE(File::CreateDir("/tmp/closed", 0700));
    EXPECT_EQ(LookAt("/tmp/closed").st_mode, S_IFDIR | 0700U);
    EXPECT_EQ(NamesIn("."), (Names{"-m", "700"}));
  });
}

TEST_F(ProgramAttackTest, ProgramsGetAFixedEnvironment) {
  Attack([] {
    const std::string expected = "(PATH=/[a-z/:]+\nLC_ALL=C|LC_ALL=C\nPATH=/[a-z/:]+)\n";
    EXPECT_THAT(EnvironmentOf("/bin/mkdir", [] { File::CreateDir("/tmp/new", 0755); }),
                testing::MatchesRegex(expected));
    EXPECT_THAT(EnvironmentOf("/bin/rm", [] { File::RemoveDir(kHome); }),
                testing::MatchesRegex(expected));
    EXPECT_THAT(EnvironmentOf("/usr/bin/uuidgen", [] { KeloDRCore::GenerateUUID(); }),
                testing::MatchesRegex(expected));
  });
}

TEST_F(ProgramAttackTest, ANameLikeAnOptionIsAName) {
  Attack([] {
    MakeDir("work", 0755);
    ASSERT_EQ(chdir("work"), 0);
    for (const char* name : {"-v", "--help", "-m", "-", "--"}) {
      EXPECT_TRUE(File::CreateDir(name, 0750)) << name;
      EXPECT_EQ(NamesIn("."), Names{name});
      EXPECT_EQ(LookAt(name).st_mode, S_IFDIR | 0750U) << name;
      EXPECT_TRUE(File::RemoveDir(name)) << name;
      EXPECT_EQ(NamesIn("."), Names{}) << name;
    }
  });
}

TEST_F(ProgramAttackTest, WhatAProgramSaysDoesNotReachTheCallersFiles) {
  Attack([] {
    WriteText("data", "data");
    EXPECT_EQ(RunInChild([] {
                for (const int stream : {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO}) {
                  close(stream);
                  EXPECT_EQ(open("data", O_RDWR | O_APPEND), stream);
                }
                EXPECT_FALSE(File::CreateDir("/tmp/data/below", 0755));
                EXPECT_FALSE(File::RemoveDir("/proc/self/fd"));
              }),
              0);
    EXPECT_EQ(ReadText("data"), "data");
  });
}

}  // namespace
