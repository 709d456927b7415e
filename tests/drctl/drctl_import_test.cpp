// A registry that is exported and imported.

#include <pty.h>
#include <sys/wait.h>
#include <unistd.h>

#include "drctl/registry.h"

namespace {

TEST_F(DrctlTest, AnExportedRegistryComesBack) {
  AddNode("a", "80");
  AddNode("o'brien", "81");
  ASSERT_EQ(Run({"volume", "scan"}).status, 0);
  const Json::Value nodes = List("node", {"--order", "name"});
  const Json::Value volumes = List("volume", {"--order", "mount_point"});
  ASSERT_EQ(Run({"export", Path("registry.json")}).status, 0);
  ASSERT_EQ(Run({"node", "remove", "a"}).status, 0);
  AddNode("c");
  ASSERT_EQ(Run({"import", Path("registry.json")}).status, 0);
  EXPECT_EQ(List("node", {"--order", "name"}), nodes);
  EXPECT_EQ(List("volume", {"--order", "mount_point"}), volumes);
}

TEST_F(DrctlTest, ExportAndImportTakeTheStandardStreams) {
  AddNode("a");
  const Outcome exported = Run({"export", "-"});
  EXPECT_EQ(exported.err, "");
  ASSERT_EQ(Run({"node", "remove", "a"}).status, 0);
  const Outcome imported = Run({"import", "-", "--json"}, exported.out);
  EXPECT_EQ(imported.out, "{\"nodes\":1,\"volumes\":0}\n");
  EXPECT_EQ(imported.err, "");
  EXPECT_EQ(Names(), "a ");
  EXPECT_EQ(Run({"import", "-"}, "{").err,
            "drctl: cannot import '-': it is not a JSON document (BAD_PARAMETER)\n");
}

TEST_F(DrctlTest, AHundredThousandRowsAreImportedAndListed) {
  std::string text = R"({"format":"drctl registry","version":1,"volumes":[],"nodes":[)";
  for (int i = 0; i < 100000; ++i) {
    text += (i > 0 ? "," : "") + std::string(R"({"name":"n)") + std::to_string(i) +
            R"(","address":"a","port":1,"state":"s"})";
  }
  EXPECT_EQ(Run({"import", "-"}, text + "]}").out, "100000 nodes and 0 volumes imported\n");
  EXPECT_EQ(List("node").size(), 100000U);
}

TEST_F(DrctlTest, ABadImportTellsEveryReasonAndChangesNothing) {
  AddNode("a");
  WriteText(Path("bad.json"), R"({"format":"drctl registry","version":1,"volumes":[],"nodes":[
      {"name":"b","address":"x","port":1,"state":"s"},
      {"name":"b","address":"x","port":1,"state":"s"},
      {"name":"c","address":"x","port":70000,"state":"s"},
      {"name":"d","address":5,"port":1,"state":"s"}, 7]})");
  const Outcome outcome = Run({"import", Path("bad.json")});
  EXPECT_EQ(outcome.status, 1);
  EXPECT_EQ(outcome.err,
            "drctl: refused: nodes[1]: there is another name b\n"
            "drctl: refused: nodes[2]: port must be a number from 1 to 65535\n"
            "drctl: refused: nodes[3]: address must be a text\n"
            "drctl: refused: nodes[4]: not an object\n"
            "drctl: cannot import '" +
                Path("bad.json") + "': nothing was changed (BAD_PARAMETER)\n");
  EXPECT_EQ(Run({"import", "--json", Path("bad.json")}).err,
            "{\"err_code\":401,\"err_code_str\":\"BAD_PARAMETER\",\"err_msg\":["
            "\"nodes[1]: there is another name b\","
            "\"nodes[2]: port must be a number from 1 to 65535\","
            "\"nodes[3]: address must be a text\",\"nodes[4]: not an object\"]}\n");
  EXPECT_EQ(Names(), "a ");
}

TEST_F(DrctlTest, WhatIsNoExportIsNotImported) {
  AddNode("a");
  for (const char* const text : {"", "[]", "{}", "{\"format\":\"drctl registry\",\"version\":2}",
                                 "{\"format\":\"drctl registry\",\"version\":1}", "not JSON"}) {
    WriteText(Path("bad.json"), text);
    EXPECT_EQ(Run({"import", Path("bad.json")}).status, 1) << text;
  }
  EXPECT_EQ(Run({"import", Path("none.json")}).status, 1);
  EXPECT_EQ(Names(), "a ");
}

// What the program writes to a terminal.
std::string RunOnTerminal(const std::vector<std::string>& arguments) {
  int terminal = -1;
  const pid_t child = forkpty(&terminal, nullptr, nullptr, nullptr);
  if (child == 0) {
    std::vector<char*> argv;
    for (const std::string& argument : arguments) {
      argv.push_back(const_cast<char*>(argument.c_str()));
    }
    argv.push_back(nullptr);
    execv(argv[0], argv.data());
    _exit(127);
  }
  std::string text;
  char part[512];
  ssize_t size = 0;
  // The end is an error: the terminal is gone with the program.
  while ((size = read(terminal, part, sizeof(part))) > 0)
    text.append(part, static_cast<size_t>(size));
  close(terminal);
  EXPECT_EQ(waitpid(child, nullptr, 0), child);
  return text;
}

TEST_F(DrctlTest, AnImportShowsItsProgressOnATerminalOnly) {
  AddNode("a");
  AddNode("b");
  ASSERT_EQ(Run({"export", Path("two.json")}).status, 0);
  EXPECT_EQ(
      RunOnTerminal({DRCTL, "--db", Path("registry.db"), "import", Path("two.json")}),
      "\r[" + std::string(50, '#') + "] 100 %\r\033[K" + "2 nodes and 0 volumes imported\r\n");
  EXPECT_EQ(Run({"import", Path("two.json")}).err, "");
}

}  // namespace
