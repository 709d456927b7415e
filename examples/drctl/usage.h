// The answers to a wrong command line, and to one that asks for help.

#ifndef DRCTL_USAGE_H_
#define DRCTL_USAGE_H_

#include <CLI/CLI.hpp>
#include <string>
#include <vector>

namespace drctl {

// Why `app` has just refused its command line with `error`. An unknown word is named, with the
// nearest known one.
std::string Complaint(const CLI::App& app, const CLI::ParseError& error);

// Puts the help of the command that the words name into `text`; no words name the whole program.
// False, with the complaint in `text`, when there is no such command.
bool FindHelp(const CLI::App& app, const std::vector<std::string>& words, std::string& text);

}  // namespace drctl

#endif  // DRCTL_USAGE_H_
