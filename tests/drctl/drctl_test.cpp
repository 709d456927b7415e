// The example program, run as a user runs it.

#include <fcntl.h>
#include <kelodrcore/version.h>
#include <sys/stat.h>
#include <unistd.h>

#include <set>
#include <sstream>

#include "drctl/registry.h"

namespace {

TEST_F(DrctlTest, WithoutASubcommandItIsAUsageError) {
  const Outcome outcome = Run({});
  EXPECT_EQ(outcome.status, 2);
  EXPECT_EQ(outcome.out, "");
  EXPECT_EQ(outcome.err,
            "drctl: a command is missing; there are node, volume, system, export, import, call, "
            "help\nRun 'drctl help' for the commands.\n");
}

TEST_F(DrctlTest, HelpGoesToStandardOutputAndSucceeds) {
  for (const std::vector<std::string>& arguments :
       {std::vector<std::string>{"--help"}, {"node", "--help"}, {"node", "add", "--help"}}) {
    const Outcome outcome = Run(arguments);
    EXPECT_EQ(outcome.status, 0);
    EXPECT_NE(outcome.out.find("Usage: drctl"), std::string::npos);
    EXPECT_EQ(outcome.err, "");
  }
}

TEST_F(DrctlTest, VersionIsThatOfTheProject) {
  EXPECT_EQ(Run({"--version"}).out, "drctl " KELODRCORE_VERSION "\n");
  EXPECT_EQ(Run({"node", "list", "--version"}).status, 0);
}

TEST_F(DrctlTest, HelpShowsACommandAsItsOptionDoes) {
  EXPECT_EQ(Run({"help"}).out, Run({"--help"}).out);
  EXPECT_EQ(Run({"help", "node"}).out, Run({"node", "--help"}).out);
  EXPECT_EQ(Run({"help", "node", "add"}).out, Run({"node", "add", "--help"}).out);
  const Outcome unknown = Run({"help", "node", "ad"});
  EXPECT_EQ(unknown.status, 2);
  EXPECT_EQ(unknown.err,
            "drctl: there is no command 'ad'; did you mean 'add'?\n"
            "Run 'drctl help' for the commands.\n");
}

TEST_F(DrctlTest, AnUnknownWordIsNamedWithTheNearestKnownOne) {
  const std::pair<std::vector<std::string>, std::string> cases[] = {
      {{"nod", "list"}, "there is no command 'nod'; did you mean 'node'?"},
      {{"node", "lst"}, "there is no command 'lst'; did you mean 'list'?"},
      {{"node", "list", "--filtr=x"}, "there is no option '--filtr'; did you mean '--filter'?"},
      {{"node", "add", "a", "--prot", "1"}, "there is no option '--prot'; did you mean '--port'?"},
      {{"node", "list", "--jsno"}, "there is no option '--jsno'; did you mean '--json'?"},
      {{"node", "zzzzzzzz"},
       "there is no command 'zzzzzzzz'; there are add, set, remove, list, count"},
      {{"node", "list", "a"}, "the word 'a' is one too many"}};
  for (const auto& [arguments, complaint] : cases) {
    const Outcome outcome = Run(arguments);
    EXPECT_EQ(outcome.status, 2);
    EXPECT_EQ(outcome.out, "");
    EXPECT_EQ(outcome.err, "drctl: " + complaint + "\nRun 'drctl help' for the commands.\n");
  }
}

TEST_F(DrctlTest, AUsageErrorIsJsonWhereJsonIsWanted) {
  const Outcome outcome = Run({"nod", "--json"});
  EXPECT_EQ(outcome.status, 2);
  EXPECT_EQ(outcome.err,
            "{\"err_code\":401,\"err_code_str\":\"BAD_PARAMETER\","
            "\"err_msg\":\"there is no command 'nod'; did you mean 'node'?\"}\n");
}

TEST_F(DrctlTest, TheRegistryCanBeNamedAnywhereOnTheLine) {
  AddNode("a");
  const std::string db = Path("registry.db");
  const std::string listed = Run({"node", "list"}).out;
  EXPECT_EQ(RunProgram(dir, {DRCTL, "node", "--db", db, "list"}).out, listed);
  EXPECT_EQ(RunProgram(dir, {DRCTL, "node", "list", "--db", db}).out, listed);
  EXPECT_EQ(RunProgram(dir, {DRCTL, "node", "list"}, "", {"DRCTL_DB=" + db}).out, listed);
  EXPECT_EQ(RunProgram(dir, {DRCTL, "node", "list", "--db", db}, "", {"DRCTL_DB=/none"}).out,
            listed);
  EXPECT_EQ(RunProgram(dir, {DRCTL, "node", "list", "--db", ""}).status, 2);
}

TEST_F(DrctlTest, RootHasItsRegistryInVarLib) {
  if (geteuid() != 0) GTEST_SKIP() << "needs root";
  const Outcome help = RunProgram(dir, {DRCTL, "--help"}, "", {"DRCTL_DB=", "HOME=" + dir});
  EXPECT_NE(help.out.find("/var/lib/drctl/registry.db"), std::string::npos) << help.out;
}

TEST_F(DrctlTest, AnOrdinaryUserHasItsRegistryInItsOwnDirectory) {
  if (geteuid() == 0) GTEST_SKIP() << "needs an ordinary user";
  const std::vector<std::string> add = {DRCTL, "node", "add", "a", "--address", "b", "--port", "1"};
  ASSERT_EQ(RunProgram(dir, add, "", {"DRCTL_DB=", "XDG_STATE_HOME=", "HOME=" + dir}).status, 0);
  struct stat made = {};
  ASSERT_EQ(stat(Path(".local/state/drctl").c_str(), &made), 0);
  EXPECT_EQ(made.st_mode & 07777, 0700U);
  EXPECT_EQ(NamesIn(Path(".local/state/drctl")), std::vector<std::string>{"registry.db"});
  ASSERT_EQ(RunProgram(dir, add, "", {"DRCTL_DB=", "XDG_STATE_HOME=" + Path("state")}).status, 0);
  EXPECT_EQ(NamesIn(Path("state/drctl")), std::vector<std::string>{"registry.db"});
  const std::vector<std::string> nowhere = {"DRCTL_DB=", "XDG_STATE_HOME=relative", "HOME="};
  EXPECT_EQ(RunProgram(dir, {DRCTL, "node", "list"}, "", nowhere).status, 2);
  EXPECT_EQ(RunProgram(dir, {DRCTL, "system", "info"}, "", nowhere).status, 0);
}

TEST_F(DrctlTest, BadPortsAreUsageErrors) {
  for (const char* const port : {"0", "65536", "-1", "x", "80x", ""}) {
    EXPECT_EQ(Run({"node", "add", "a", "--address", "b", "--port", port}).status, 2) << port;
  }
  EXPECT_EQ(NamesIn(dir), std::vector<std::string>{});
}

TEST_F(DrctlTest, AnAddedNodeIsListed) {
  ASSERT_EQ(Run({"node", "add", "o'brien \"x\"", "--address", "192.0.2.1", "--port", "80"}).status,
            0);
  const Json::Value nodes = List("node");
  ASSERT_EQ(nodes.size(), 1U);
  EXPECT_EQ(nodes[0]["name"], "o'brien \"x\"");
  EXPECT_EQ(nodes[0]["address"], "192.0.2.1");
  EXPECT_EQ(nodes[0]["port"], 80);
  EXPECT_EQ(nodes[0]["state"], "unknown");
}

TEST_F(DrctlTest, AFailureIsASentenceOrTheErrorDocument) {
  AddNode("a");
  const std::vector<std::string> again = {"node", "add", "a", "--address", "x", "--port", "1"};
  const Outcome outcome = Run(again);
  EXPECT_EQ(outcome.status, 1);
  EXPECT_EQ(outcome.out, "");
  EXPECT_EQ(outcome.err,
            "drctl: cannot add node 'a': there is a node of that name (ERR_NODE_EXIST)\n");
  std::vector<std::string> asJson = again;
  asJson.emplace_back("--json");
  EXPECT_EQ(Run(asJson).status, 1);
  EXPECT_EQ(Run(asJson).err,
            "{\"err_code\":508,\"err_code_str\":\"ERR_NODE_EXIST\","
            "\"err_msg\":\"there is a node of that name\"}\n");
  EXPECT_EQ(List("node")[0]["address"], "a.example");
}

TEST_F(DrctlTest, SetChangesOnlyWhatIsGiven) {
  AddNode("a", "80");
  ASSERT_EQ(Run({"node", "set", "a", "--state", "syncing"}).status, 0);
  const Json::Value node = List("node")[0];
  EXPECT_EQ(node["state"], "syncing");
  EXPECT_EQ(node["port"], 80);
}

TEST_F(DrctlTest, SetWithoutAChangeFails) {
  AddNode("a");
  const Outcome outcome = Run({"node", "set", "a"});
  EXPECT_EQ(outcome.status, 1);
  EXPECT_NE(outcome.err.find("BAD_PARAMETER"), std::string::npos) << outcome.err;
}

TEST_F(DrctlTest, UnknownNodesCannotBeChangedOrRemoved) {
  for (const bool isFileThere : {false, true}) {
    if (isFileThere) AddNode("a");
    for (const std::vector<std::string>& arguments :
         {std::vector<std::string>{"node", "set", "b", "--state", "x"}, {"node", "remove", "b"}}) {
      const Outcome outcome = Run(arguments);
      EXPECT_EQ(outcome.status, 1);
      EXPECT_NE(outcome.err.find("ERR_NODE_NOT_EXIST"), std::string::npos) << outcome.err;
    }
  }
  EXPECT_EQ(Names(), "a ");
}

TEST_F(DrctlTest, AMissingRegistryIsNamedAndNotMade) {
  const std::string reason =
      "there is no registry at '" + Path("registry.db") + "' (ERR_DATABASE_OPERATION)\n";
  const Outcome listed = Run({"node", "list"});
  EXPECT_EQ(listed.status, 1);
  EXPECT_EQ(listed.out, "");
  EXPECT_EQ(listed.err, "drctl: cannot list the nodes: " + reason);
  EXPECT_EQ(Run({"volume", "list"}).err, "drctl: cannot list the volumes: " + reason);
  EXPECT_EQ(Run({"node", "count"}).err, "drctl: cannot count the nodes: " + reason);
  EXPECT_EQ(Run({"export", "-"}).err, "drctl: cannot export: " + reason);
  EXPECT_EQ(NamesIn(dir), std::vector<std::string>{});
}

TEST_F(DrctlTest, RemoveAndCount) {
  AddNode("a");
  AddNode("b");
  EXPECT_EQ(Run({"node", "count"}).out, "2\n");
  EXPECT_EQ(Run({"node", "remove", "a"}).status, 0);
  EXPECT_EQ(Run({"node", "count"}).out, "1\n");
  EXPECT_EQ(Names(), "b ");
}

TEST_F(DrctlTest, ListFiltersOrdersAndLimits) {
  AddNode("a", "3");
  AddNode("b", "2", "offline");
  AddNode("c", "1");
  EXPECT_EQ(Names({"--order", "port"}), "c b a ");
  EXPECT_EQ(Names({"--order", "name", "--desc"}), "c b a ");
  EXPECT_EQ(Names({"--filter", "state=online", "--order", "name"}), "a c ");
  EXPECT_EQ(Names({"--filter", "state!=online"}), "b ");
  EXPECT_EQ(Names({"--filter", "port=3", "--filter", "state=online"}), "a ");
  EXPECT_EQ(Names({"--order", "name", "--limit", "1", "--offset", "1"}), "b ");
  EXPECT_EQ(Names({"--filter", "name=' OR 1=1 --"}), "");
}

TEST_F(DrctlTest, BadFiltersAndOrdersAreRefused) {
  AddNode("a");
  for (const std::vector<std::string>& option : {std::vector<std::string>{"--filter", "bogus=1"},
                                                 {"--filter", "name"},
                                                 {"--filter", "=1"},
                                                 {"--filter", "port=x"},
                                                 {"--order", "name; DROP TABLE node"}}) {
    std::vector<std::string> arguments = {"node", "list"};
    arguments.insert(arguments.end(), option.begin(), option.end());
    const Outcome outcome = Run(arguments);
    EXPECT_EQ(outcome.status, 1) << option[1];
    EXPECT_NE(outcome.err.find("name, address, port, state"), std::string::npos) << outcome.err;
    EXPECT_NE(outcome.err.find("BAD_PARAMETER"), std::string::npos) << outcome.err;
  }
}

TEST_F(DrctlTest, TheTableHasHeadingsAndAlignedColumns) {
  AddNode("a", "80");
  AddNode("longer", "5566");
  EXPECT_EQ(Run({"node", "list", "--order", "name"}).out,
            "name                  address                port  state\n"
            "a                     a.example                80  online\n"
            "longer                longer.example         5566  online\n");
}

TEST_F(DrctlTest, NoControlCharacterReachesTheTerminal) {
  AddNode("a\033[2J\xc2\x9b\x7f\xc3\xa9");
  EXPECT_NE(Run({"node", "list"}).out.find("a?[2J??\xc3\xa9 "), std::string::npos);
  EXPECT_EQ(Run({"node", "remove", "\033"}).err,
            "drctl: cannot remove node '?': there is no node of that name (ERR_NODE_NOT_EXIST)\n");
}

TEST_F(DrctlTest, AnUnusableRegistryIsNamed) {
  const Outcome outcome = RunProgram(dir, {DRCTL, "--db", Path("no/such/dir.db"), "node", "add",
                                           "a", "--address", "b", "--port", "1"});
  EXPECT_EQ(outcome.status, 1);
  EXPECT_EQ(outcome.err, "drctl: cannot add node 'a': '" + Path("no/such/dir.db") +
                             "' cannot be opened (ERR_DATABASE_OPERATION)\n");
}

TEST_F(DrctlTest, VerboseShowsTheLogLines) {
  const Outcome outcome = Run({"--verbose", "node", "add", "a", "--address", "b", "--port", "1"});
  EXPECT_NE(outcome.err.find("(Exec)[INFO]"), std::string::npos) << outcome.err;
  EXPECT_EQ(Run({"node", "count"}).err, "");
}

// The mount points of this machine, but for those with a character that the kernel escapes.
std::set<std::string> MountPoints() {
  std::set<std::string> points;
  std::istringstream lines(ReadText("/proc/self/mountinfo"));
  for (std::string line; std::getline(lines, line);) {
    std::istringstream words(line);
    std::string word;
    for (int i = 0; i < 5; ++i) words >> word;
    if (word.find('\\') == std::string::npos) points.insert(word);
  }
  return points;
}

TEST_F(DrctlTest, ScannedVolumesAreTheMachinesMounts) {
  const std::set<std::string> points = MountPoints();
  if (points.empty()) GTEST_SKIP() << "needs a mounted /proc";
  ASSERT_EQ(Run({"volume", "scan"}).status, 0);
  const Json::Value volumes = List("volume");
  std::set<std::string> listed;
  for (const Json::Value& volume : volumes) {
    const std::string point = volume["mount_point"].asString();
    if (point.find_first_of("\\ \t\n") == std::string::npos) listed.insert(point);
  }
  EXPECT_EQ(listed, points);
  // A second scan replaces, it does not add.
  ASSERT_EQ(Run({"volume", "scan"}).status, 0);
  EXPECT_EQ(List("volume").size(), volumes.size());
}

TEST_F(DrctlTest, ATimeIsForPeopleInATableAndANumberInJson) {
  WriteText(Path("one.json"), R"({"format":"drctl registry","version":1,"nodes":[],"volumes":[
      {"mount_point":"/v","device":"d","fs_type":"f","size_mib":2,"free_mib":1,
       "scanned_at":1700000000}]})");
  ASSERT_EQ(Run({"import", Path("one.json")}).status, 0);
  EXPECT_NE(Run({"volume", "list"}).out.find(" 2023-11-14T22:13:20Z\n"), std::string::npos);
  EXPECT_EQ(List("volume")[0]["scanned_at"], 1700000000);
}

TEST_F(DrctlTest, SystemInfoReadsKeysAndValues) {
  WriteText(Path("settings"), "NAME=nas\nSIZE = 5\nno separator\n");
  const Outcome outcome = Run({"system", "info", "--file", Path("settings")});
  EXPECT_EQ(outcome.status, 0);
  EXPECT_EQ(outcome.out, "NAME=nas\nSIZE=5\n");
  EXPECT_EQ(Run({"system", "info", "--json", "--file", Path("settings")}).out,
            "{\"NAME\":\"nas\",\"SIZE\":\"5\"}\n");
  EXPECT_EQ(Run({"system", "info", "--file", Path("none")}).status, 1);
}

class DrctlCacheTest : public DrctlTest {
 protected:
  void SetUp() override {
    DrctlTest::SetUp();
    if (!CanMakeLocks()) GTEST_SKIP() << kNeedsLocks;
  }

  Outcome ListCached(const std::vector<std::string>& options = {}) {
    std::vector<std::string> arguments = {DRCTL,    "--verbose", "volume",      "list",
                                          "--json", "--cached",  "--cache-dir", Path("cache")};
    arguments.insert(arguments.end(), options.begin(), options.end());
    return RunProgram(dir, arguments);
  }

  static int CountOf(const std::string& text, const std::string& part) {
    int count = 0;
    for (size_t at = text.find(part); at != std::string::npos; at = text.find(part, at + 1))
      ++count;
    return count;
  }
};

TEST_F(DrctlCacheTest, AnswersFromAScanThenTheFileThenMemory) {
  const Outcome first = ListCached();
  EXPECT_EQ(first.status, 0);
  EXPECT_EQ(CountOf(first.err, "answered from a fresh scan"), 1) << first.err;
  const Outcome second = ListCached({"--repeat", "3"});
  EXPECT_EQ(CountOf(second.err, "answered from the cache file"), 1) << second.err;
  EXPECT_EQ(CountOf(second.err, "answered from memory"), 2) << second.err;
  EXPECT_EQ(first.out, second.out);
}

TEST_F(DrctlCacheTest, AStaleFileIsScannedAgain) {
  ASSERT_EQ(ListCached().status, 0);
  const timespec old[2] = {{1000, 0}, {1000, 0}};
  ASSERT_EQ(utimensat(AT_FDCWD, Path("cache/volumes.cached").c_str(), old, 0), 0);
  EXPECT_EQ(CountOf(ListCached().err, "answered from a fresh scan"), 1);
}

// What the demo shows: many ask at once, and one of them scans.
TEST_F(DrctlCacheTest, OfTwentyProcessesAtOnceOneScans) {
  std::vector<pid_t> children;
  for (int i = 0; i < 20; ++i) {
    children.push_back(StartChild([&] {
      const Outcome outcome = ListCached();
      WriteText(Path("answer-" + std::to_string(i)), outcome.err);
      return outcome.status;
    }));
  }
  std::string answers;
  for (size_t i = 0; i < children.size(); ++i) {
    EXPECT_EQ(JoinChild(children[i]), 0);
    answers += ReadText(Path("answer-" + std::to_string(i)));
  }
  EXPECT_EQ(CountOf(answers, "answered from a fresh scan"), 1) << answers;
  EXPECT_EQ(CountOf(answers, "answered from the cache file"), 19) << answers;
}

}  // namespace
