#include "usage.h"

#include <algorithm>
#include <numeric>

namespace drctl {
namespace {

// How many letters have to be added, left out or changed to make one word of the other.
size_t Distance(const std::string& from, const std::string& to) {
  std::vector<size_t> row(to.size() + 1);
  std::iota(row.begin(), row.end(), size_t{0});
  for (size_t i = 0; i < from.size(); ++i) {
    size_t diagonal = row[0];
    row[0] = i + 1;
    for (size_t j = 0; j < to.size(); ++j) {
      const size_t changed = diagonal + (from[i] != to[j] ? 1 : 0);
      diagonal = row[j + 1];
      row[j + 1] = std::min({changed, row[j] + 1, row[j + 1] + 1});
    }
  }
  return row.back();
}

std::vector<std::string> Commands(const CLI::App& app) {
  std::vector<std::string> names;
  for (const CLI::App* const command : app.get_subcommands({})) {
    names.push_back(command->get_name());
  }
  return names;
}

// The options of a command, with those that it takes for the commands above it.
std::vector<std::string> LongOptions(const CLI::App* app) {
  std::vector<std::string> names;
  for (; app != nullptr; app = app->get_parent()) {
    for (const CLI::Option* const option : app->get_options()) {
      for (const std::string& name : option->get_lnames()) names.push_back("--" + name);
    }
  }
  return names;
}

// A word is near when at least half of its letters are right.
std::string Hint(const std::string& word, const std::vector<std::string>& known) {
  if (known.empty()) return "";
  const std::string& nearest = *std::min_element(
      known.begin(), known.end(), [&](const std::string& left, const std::string& right) {
        return Distance(word, left) < Distance(word, right);
      });
  if (2 * Distance(word, nearest) <= std::max(word.size(), nearest.size())) {
    return "; did you mean '" + nearest + "'?";
  }
  return "; there are " + CLI::detail::join(known, ", ");
}

std::string UnknownWord(const CLI::App& app, const std::string& word) {
  if (word.front() == '-') {
    const std::string name = word.substr(0, word.find('='));
    return "there is no option '" + name + "'" + Hint(name, LongOptions(&app));
  }
  const std::vector<std::string> commands = Commands(app);
  if (commands.empty()) return "the word '" + word + "' is one too many";
  return "there is no command '" + word + "'" + Hint(word, commands);
}

}  // namespace

std::string Complaint(const CLI::App& app, const CLI::ParseError& error) {
  const CLI::App* last = &app;  // the last command that was understood
  while (!last->get_subcommands().empty()) last = last->get_subcommands().back();
  for (const std::string& word : app.remaining(true)) {
    if (!word.empty()) return UnknownWord(*last, word);
  }
  const std::vector<std::string> commands = Commands(*last);
  if (commands.empty()) return error.what();
  return "a command is missing; there are " + CLI::detail::join(commands, ", ");
}

bool FindHelp(const CLI::App& app, const std::vector<std::string>& words, std::string& text) {
  const CLI::App* command = &app;
  std::string path = app.get_name();
  for (const std::string& word : words) {
    const auto found = command->get_subcommands(
        [&](const CLI::App* candidate) { return candidate->get_name() == word; });
    if (found.empty()) {
      text = word.empty() ? "a command has a name" : UnknownWord(*command, word);
      return false;
    }
    command = found.front();
    path += " " + word;
  }
  text = command->get_formatter()->make_help(command, path, CLI::AppFormatMode::Normal);
  return true;
}

}  // namespace drctl
