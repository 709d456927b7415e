// What a command line is told that is wrong, or that asks for help.

#ifndef DRCTL_USAGE_H_
#define DRCTL_USAGE_H_

#include <CLI/CLI.hpp>
#include <string>
#include <vector>

namespace drctl {

// Why the command line that `app` has just refused with `error` is wrong. A word that nobody knows
// is named, with the known one that is nearest to it.
std::string Complaint(const CLI::App& app, const CLI::ParseError& error);

// Finds the help of the command that the words name; without a word that of the whole program.
// False, with the complaint in `text`, when there is no such command.
bool FindHelp(const CLI::App& app, const std::vector<std::string>& words, std::string& text);

}  // namespace drctl

#endif  // DRCTL_USAGE_H_
