// The example's man page and bash completion name all that its own help names.

#include <algorithm>
#include <set>
#include <sstream>

#include "drctl/locks.h"
#include "drctl/program.h"

namespace {

using Words = std::vector<std::string>;

class DrctlManualTest : public LocksTest {
 protected:
  // The first words of the lines below a heading of a command's help: "add", or "--port".
  std::set<std::string> Names(const Words& command, const std::string& heading) {
    Words arguments = {DRCTL, "help"};
    arguments.insert(arguments.end(), command.begin(), command.end());
    std::istringstream lines(RunProgram(dir, arguments).out);
    std::set<std::string> names;
    bool isBelow = false;
    for (std::string line; std::getline(lines, line);) {
      if (line.substr(0, 2) != "  ") {
        isBelow = line == heading;
      } else if (isBelow && line[2] != ' ') {
        const std::string word = line.substr(2, line.find(' ', 2) - 2);
        names.insert(word == "-h,--help" ? "--help" : word);
      }
    }
    return names;
  }

  std::set<std::string> Commands(const Words& command) { return Names(command, "Subcommands:"); }
  std::set<std::string> Options(const Words& command) { return Names(command, "Options:"); }

  // The program itself, every command, and the commands of these.
  std::vector<Words> Tree() {
    std::vector<Words> tree = {{}};
    for (size_t i = 0; i < tree.size(); ++i) {
      for (const std::string& name : Commands(tree[i])) {
        tree.push_back(tree[i]);
        tree.back().push_back(name);
      }
    }
    return tree;
  }

  // What bash offers for `word` after the words of a command.
  std::set<std::string> Complete(const Words& command, const std::string& word) {
    Words arguments = {"/bin/bash",
                       "-c",
                       "source \"$1\"; shift; COMP_WORDS=(\"$@\"); COMP_CWORD=$(($# - 1)); _drctl; "
                       "printf '%s\\n' \"${COMPREPLY[@]}\"",
                       "bash",
                       DRCTL_SOURCES "/drctl.bash",
                       "drctl"};
    arguments.insert(arguments.end(), command.begin(), command.end());
    arguments.push_back(word);
    std::istringstream lines(RunProgram(dir, arguments).out);
    std::set<std::string> offered;
    for (std::string line; lines >> line;) offered.insert(line);
    return offered;
  }
};

TEST_F(DrctlManualTest, TheManPageNamesEveryCommandAndOption) {
  std::string page = ReadText(DRCTL_SOURCES "/drctl.1.in");
  page.erase(std::remove(page.begin(), page.end(), '\\'), page.end());
  const std::vector<Words> tree = Tree();
  EXPECT_GT(tree.size(), 12U);
  for (const Words& command : tree) {
    std::string name;
    for (const std::string& word : command) name += (name.empty() ? "" : " ") + word;
    EXPECT_NE(page.find(name), std::string::npos) << name;
    for (const std::string& option : Options(command)) {
      EXPECT_NE(page.find(option), std::string::npos) << option;
    }
  }
}

TEST_F(DrctlManualTest, TheCompletionOffersEveryCommandAndOption) {
  const std::set<std::string> everywhere = Options({});
  for (const Words& command : Tree()) {
    std::set<std::string> options = Options(command);
    options.insert(everywhere.begin(), everywhere.end());
    EXPECT_EQ(Complete(command, "--"), options) << testing::PrintToString(command);
    const std::set<std::string> commands = Commands(command);
    if (commands.empty()) continue;
    EXPECT_EQ(Complete(command, ""), commands) << testing::PrintToString(command);
  }
}

TEST_F(DrctlManualTest, TheCompletionSeesThroughOptionsAndHelp) {
  EXPECT_EQ(Complete({"--db", "node", "--json", "volume"}, "s"), std::set<std::string>{"scan"});
  EXPECT_EQ(Complete({"help", "node"}, "co"), std::set<std::string>{"count"});
  EXPECT_EQ(Complete({"node", "add", "a"}, "--po"), std::set<std::string>{"--port"});
  EXPECT_EQ(Complete({"node", "add", "a", "--port"}, ""), std::set<std::string>{});
  WriteText(Path("a.db"), "");
  EXPECT_EQ(Complete({"--db"}, dir + "/a"), std::set<std::string>{Path("a.db")});
}

}  // namespace
