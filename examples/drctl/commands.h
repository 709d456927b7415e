// What the subcommands do.

#ifndef DRCTL_COMMANDS_H_
#define DRCTL_COMMANDS_H_

#include <optional>
#include <string>

#include "registry.h"

namespace drctl {

// What the command line said, over all subcommands.
struct Options {
  std::string db;
  bool verbose = false;
  bool json = false;
  std::vector<std::string> words;  // of help
  std::string name;
  std::optional<std::string> address;
  std::optional<std::string> state;
  std::optional<int> port;
  Query query;
  bool cached = false;
  std::string cacheDir;
  long maxAge = 60;
  int repeat = 1;
  std::string file;
  std::string callFile;
  std::string stateDir;
  bool cgi = false;
};

// Each runs one subcommand and returns the program's exit status: 0, or 1 with a line on standard
// error.
int AddNode(const Options& options);
int SetNode(const Options& options);
int RemoveNode(const Options& options);
int ListNodes(const Options& options);
int CountNodes(const Options& options);
int ScanVolumes(const Options& options);
int ListVolumes(const Options& options);
int ShowSystem(const Options& options);

}  // namespace drctl

#endif  // DRCTL_COMMANDS_H_
