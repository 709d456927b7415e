// drctl: a registry of the replication nodes and of this machine's volumes.

#include <syslog.h>

#include <CLI/CLI.hpp>
#include <iostream>
#include <memory>
#include <optional>
#include <string>

#include "mounts.h"
#include "output.h"
#include "registry.h"

namespace drctl {
namespace {

using KeloDRCore::SqliteValueList;

constexpr int kUsageError = 2;

// What the command line said, over all subcommands.
struct Options {
  std::string db;
  bool verbose = false;
  bool json = false;
  std::string name;
  std::optional<std::string> address;
  std::optional<std::string> state;
  std::optional<int> port;
  Query query;
};

SqliteValueList GivenFields(const Options& options) {
  SqliteValueList fields;
  if (options.address) fields.AddValue("address", *options.address);
  if (options.port) fields.AddValue("port", *options.port);
  if (options.state) fields.AddValue("state", *options.state);
  return fields;
}

int AddNode(Registry& registry, const Options& options) {
  SqliteValueList node = GivenFields(options);
  node.AddValue("name", options.name);
  if (!options.state) node.AddValue("state", "unknown");
  if (registry.AddNode(node)) return 0;
  return Complain("cannot add node '" + options.name + "'", registry.GetErr());
}

int SetNode(Registry& registry, const Options& options) {
  if (registry.SetNode(options.name, GivenFields(options))) return 0;
  return Complain("cannot change node '" + options.name + "'", registry.GetErr());
}

int RemoveNode(Registry& registry, const Options& options) {
  if (registry.RemoveNode(options.name)) return 0;
  return Complain("cannot remove node '" + options.name + "'", registry.GetErr());
}

int ListNodes(Registry& registry, const Options& options) {
  Rows rows;
  if (!registry.ListNodes(options.query, rows)) {
    return Complain("cannot list the nodes", registry.GetErr());
  }
  Print(rows, NodeColumns(), options.json);
  return 0;
}

int CountNodes(Registry& registry, const Options& /*options*/) {
  int count = 0;
  if (!registry.CountNodes(count)) return Complain("cannot count the nodes", registry.GetErr());
  std::cout << count << '\n';
  return 0;
}

int ScanVolumes(Registry& registry, const Options& /*options*/) {
  const Rows volumes = ScanMounts();
  if (volumes.empty()) {
    std::cerr << "drctl: cannot read the mounts from /proc/self/mountinfo\n";
    return 1;
  }
  if (!registry.ReplaceVolumes(volumes)) {
    return Complain("cannot store the volumes", registry.GetErr());
  }
  std::cout << volumes.size() << " mount points stored\n";
  return 0;
}

int ListVolumes(Registry& registry, const Options& options) {
  Rows rows;
  if (!registry.ListVolumes(options.query, rows)) {
    return Complain("cannot list the volumes", registry.GetErr());
  }
  Print(rows, VolumeColumns(), options.json);
  return 0;
}

// The command line: a tree of subcommands, of which the leaf that was named runs.
class CommandLine {
 public:
  CommandLine() {
    app.require_subcommand(1);
    app.add_option("--db", options.db, "The registry's SQLite file")->required();
    app.add_flag("--verbose", options.verbose, "Show the library's log lines on standard error");
    AddNodeCommands();
    AddVolumeCommands();
  }

  int Run(int argc, char** argv) {
    try {
      app.parse(argc, argv);
    } catch (const CLI::ParseError& error) {
      return app.exit(error) == 0 ? 0 : kUsageError;
    }
    openlog("drctl", LOG_PID | (options.verbose ? LOG_PERROR : 0), LOG_USER);
    Registry registry(options.db);
    return run(registry, options);
  }

 private:
  using Action = int (*)(Registry&, const Options&);

  CLI::App* AddCommand(CLI::App* parent, const std::string& name, const std::string& description,
                       Action action) {
    CLI::App* const command = parent->add_subcommand(name, description);
    command->callback([this, action] { run = action; });
    return command;
  }

  CLI::Option* AddName(CLI::App* command) {
    return command->add_option("name", options.name, "The node's name")->required();
  }

  void AddNodeFields(CLI::App* command, bool isRequired) {
    command->add_option("--address", options.address, "Host name or address")->required(isRequired);
    command->add_option("--port", options.port, "Port")
        ->check(CLI::Range(1, 65535))
        ->required(isRequired);
    command->add_option("--state", options.state, "State, \"unknown\" for a new node");
  }

  void AddListOptions(CLI::App* command) {
    command->add_flag("--json", options.json, "Print one line of JSON instead of a table");
    command->add_option("--filter", options.query.filters,
                        "Only rows with FIELD=VALUE or FIELD!=VALUE; may be repeated");
    command->add_option("--order", options.query.order, "Sort by FIELD; may be repeated");
    command->add_flag("!--desc", options.query.ascending, "Sort descending");
    command->add_option("--limit", options.query.limit, "At most that many rows")
        ->check(CLI::PositiveNumber);
    command->add_option("--offset", options.query.offset, "Skip that many rows")
        ->check(CLI::NonNegativeNumber);
  }

  void AddNodeCommands() {
    CLI::App* const node = app.add_subcommand("node", "The replication nodes");
    node->require_subcommand(1);
    CLI::App* const add = AddCommand(node, "add", "Adds a node", AddNode);
    AddName(add);
    AddNodeFields(add, true);
    CLI::App* const set = AddCommand(node, "set", "Changes a node", SetNode);
    AddName(set);
    AddNodeFields(set, false);
    AddName(AddCommand(node, "remove", "Removes a node", RemoveNode));
    AddListOptions(AddCommand(node, "list", "Lists the nodes", ListNodes));
    AddCommand(node, "count", "Counts the nodes", CountNodes);
  }

  void AddVolumeCommands() {
    CLI::App* const volume = app.add_subcommand("volume", "This machine's volumes");
    volume->require_subcommand(1);
    AddCommand(volume, "scan", "Stores the mounted volumes", ScanVolumes);
    AddListOptions(AddCommand(volume, "list", "Lists the stored volumes", ListVolumes));
  }

  CLI::App app{"A registry of replication nodes and of this machine's volumes", "drctl"};
  Options options;
  Action run = nullptr;
};

}  // namespace
}  // namespace drctl

int main(int argc, char** argv) { return drctl::CommandLine().Run(argc, argv); }
