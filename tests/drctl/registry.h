// The fixture of tests that each have a registry of their own.

#ifndef KELODRCORE_TESTS_DRCTL_REGISTRY_H_
#define KELODRCORE_TESTS_DRCTL_REGISTRY_H_

#include <kelodrcore/json_value.h>

#include <string>
#include <vector>

#include "drctl/locks.h"
#include "drctl/program.h"

class DrctlTest : public LocksTest {
 protected:
  // Runs "drctl --db FILE ARGUMENT..." on this test's own registry.
  Outcome Run(std::vector<std::string> arguments, const std::string& input = "") {
    arguments.insert(arguments.begin(), {DRCTL, "--db", Path("registry.db")});
    return RunProgram(dir, arguments, input);
  }

  void AddNode(const std::string& name, const std::string& port = "5566",
               const std::string& state = "online") {
    const Outcome outcome = Run(
        {"node", "add", name, "--address", name + ".example", "--port", port, "--state", state});
    ASSERT_EQ(outcome.status, 0) << outcome.err;
  }

  Json::Value List(const std::string& what, std::vector<std::string> options = {}) {
    options.insert(options.begin(), {what, "list", "--json"});
    const Outcome outcome = Run(options);
    EXPECT_EQ(outcome.status, 0) << outcome.err;
    Json::Value rows;
    EXPECT_TRUE(KeloDRCore::JsonValue::fromString(rows, outcome.out)) << outcome.out;
    return rows;
  }

  // The names of the listed nodes, joined.
  std::string Names(const std::vector<std::string>& options = {}) {
    std::string names;
    for (const Json::Value& node : List("node", options)) names += node["name"].asString() + " ";
    return names;
  }
};

#endif  // KELODRCORE_TESTS_DRCTL_REGISTRY_H_
