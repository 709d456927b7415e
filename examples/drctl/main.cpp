// drctl: a registry of the replication nodes and of this machine's volumes.

#include <kelodrcore/err.h>
#include <kelodrcore/version.h>
#include <syslog.h>

#include <CLI/CLI.hpp>
#include <algorithm>
#include <iostream>
#include <limits>
#include <string>

#include "call.h"
#include "commands.h"
#include "output.h"
#include "paths.h"
#include "transfer.h"
#include "usage.h"

namespace drctl {
namespace {

constexpr int kFailure = 1;
constexpr int kUsageError = 2;

const CLI::Validator kNotEmpty([](std::string& text) { return text.empty() ? "it is empty" : ""; },
                               "");

// The command line: a tree of subcommands, of which the leaf that was named runs.
class CommandLine {
 public:
  CommandLine() {
    app.require_subcommand(1);
    app.fallthrough();
    app.set_version_flag("--version", "drctl " KELODRCORE_VERSION, "Show the version and end");
    app.footer(
        "Every command takes --db, --json and --verbose.\n"
        "Exit status: 0 done, 1 failed, 2 wrong usage.");
    options.db = DefaultDb();
    app.add_option("--db", options.db, "The registry's SQLite file; DRCTL_DB sets the default")
        ->capture_default_str()
        ->check(kNotEmpty);
    app.add_flag("--json", options.json, "Print one line of JSON, a failure's reason too");
    app.add_flag("--verbose", options.verbose, "Show the library's log lines on standard error");
    AddNodeCommands();
    AddVolumeCommands();
    AddSystemCommands();
    AddTransferCommands();
    AddCallCommand();
    AddHelpCommand();
  }

  int Run(int argc, char** argv) {
    try {
      app.parse(argc, argv);
    } catch (const CLI::Success& wish) {  // --help or --version
      return app.exit(wish);
    } catch (const CLI::ParseError& error) {
      options.json = std::find(argv, argv + argc, std::string("--json")) != argv + argc;
      return Refuse(Complaint(app, error));
    }
    if (help->parsed()) return PrintHelp();
    if (needsDb && !options.cached && options.db.empty()) {
      return Refuse("HOME tells no place for the registry: give --db or set DRCTL_DB");
    }
    openlog("drctl", LOG_PID | (options.verbose ? LOG_PERROR : 0), LOG_USER);
    return FlushOutput(run(options));
  }

 private:
  using Action = int (*)(const Options&);

  int Refuse(const std::string& complaint) const {
    if (options.json) {
      Complain("", MakeErr(KeloDRCore::ERR::BAD_PARAMETER, complaint), true);
    } else {
      std::cerr << "drctl: " << Printable(complaint) << "\nRun 'drctl help' for the commands.\n";
    }
    return kUsageError;
  }

  int PrintHelp() const {
    std::string text;
    if (!FindHelp(app, options.words, text)) return Refuse(text);
    std::cout << text;
    return FlushOutput(0);
  }

  static int FlushOutput(int status) {
    if (std::cout.flush()) return status;
    std::cerr << "drctl: cannot write to standard output\n";
    return kFailure;
  }

  CLI::App* AddCommand(CLI::App* parent, const std::string& name, const std::string& description,
                       Action action, bool isOnDb = true) {
    CLI::App* const command = parent->add_subcommand(name, description);
    command->callback([this, action, isOnDb] {
      run = action;
      needsDb = isOnDb;
    });
    return command;
  }

  void AddName(CLI::App* command) {
    command->add_option("name", options.name, "The node's name")->required();
  }

  void AddNodeFields(CLI::App* command, bool isRequired) {
    command->add_option("--address", options.address, "Host name or address")->required(isRequired);
    command->add_option("--port", options.port, "Port")
        ->check(CLI::Range(1, 65535))
        ->required(isRequired);
    command->add_option("--state", options.state, "State, \"unknown\" for a new node");
  }

  void AddListOptions(CLI::App* command, const std::vector<Column>& columns) {
    command->add_option("--filter", options.query.filters,
                        "Only rows with FIELD=VALUE or FIELD!=VALUE; may be repeated. FIELD is "
                        "one of " +
                            Names(columns));
    command->add_option("--order", options.query.order, "Sort by FIELD; may be repeated");
    command->add_flag_callback(
        "--desc", [this] { options.query.ascending = false; }, "Sort descending");
    command->add_option("--limit", options.query.limit, "At most that many rows")
        ->check(CLI::PositiveNumber);
    command->add_option("--offset", options.query.offset, "Skip that many rows")
        ->check(CLI::NonNegativeNumber);
  }

  CLI::Option* AddMaxAge(CLI::App* command) {
    return command->add_option("--max-age", options.maxAge, "Seconds until the cache file is stale")
        ->capture_default_str()
        ->check(CLI::Range(0L, std::numeric_limits<long>::max()));
  }

  void AddCacheOptions(CLI::App* command) {
    CLI::Option* const cached = command->add_flag(
        "--cached", options.cached, "Ask the mounts themselves, through a cache file");
    CLI::Option* const dir =
        command->add_option("--cache-dir", options.cacheDir, "The directory of the cache file");
    cached->needs(dir);
    for (const char* const name : {"--filter", "--order", "--desc", "--limit", "--offset"}) {
      cached->excludes(command->get_option(name));
    }
    AddMaxAge(command)->needs(cached);
    command->add_option("--repeat", options.repeat, "Ask that many times")
        ->needs(cached)
        ->check(CLI::PositiveNumber);
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
    AddListOptions(AddCommand(node, "list", "Lists the nodes", ListNodes), NodeColumns());
    AddCommand(node, "count", "Counts the nodes", CountNodes);
  }

  void AddVolumeCommands() {
    CLI::App* const volume = app.add_subcommand("volume", "This machine's volumes");
    volume->require_subcommand(1);
    AddCommand(volume, "scan", "Stores the mounted volumes", ScanVolumes);
    CLI::App* const list = AddCommand(volume, "list", "Lists the stored volumes", ListVolumes);
    AddListOptions(list, VolumeColumns());
    AddCacheOptions(list);
  }

  void AddSystemCommands() {
    CLI::App* const system = app.add_subcommand("system", "This machine's system");
    system->require_subcommand(1);
    CLI::App* const info =
        AddCommand(system, "info", "Shows a file of key=value lines", ShowSystem, false);
    options.file = "/etc/os-release";
    info->add_option("--file", options.file, "The file")->capture_default_str();
  }

  void AddTransferCommands() {
    AddCommand(&app, "export", "Writes the registry to a JSON file", ExportRegistry)
        ->add_option("file", options.file, "The JSON file, or - for standard output")
        ->required();
    AddCommand(&app, "import", "Replaces the registry by that of a JSON file", ImportRegistry)
        ->add_option("file", options.file, "The JSON file, or - for standard input")
        ->required();
  }

  void AddCallCommand() {
    CLI::App* const call = AddCommand(&app, "call", "Answers one call of the web API", Call);
    CLI::Option* const file = call->add_option("--file", options.callFile,
                                               "Read the call from a file, not standard input");
    call->add_flag("--cgi", options.cgi, "Be a CGI program: the call is the body of a POST")
        ->excludes(file);
    call->add_option("--cache-dir", options.cacheDir, "Directory of the volume cache [DB.cache]");
    call->add_option("--state-dir", options.stateDir, "Directory of the tasks' states [DB.tasks]");
    AddMaxAge(call);
  }

  void AddHelpCommand() {
    help = app.add_subcommand("help", "Shows the help of a command");
    help->add_option("command", options.words, "The command's words; none: all commands");
  }

  CLI::App app{"A registry of replication nodes and of this machine's volumes", "drctl"};
  CLI::App* help = nullptr;
  Options options;
  Action run = nullptr;
  bool needsDb = true;
};

}  // namespace
}  // namespace drctl

int main(int argc, char** argv) { return drctl::CommandLine().Run(argc, argv); }
