#include "paths.h"

#include <kelodrcore/file.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>

namespace drctl {
namespace {

// Empty for a variable that is not set, or not to be believed in a set-id program.
std::string Variable(const char* name) {
  const char* const value = secure_getenv(name);
  return value != nullptr ? value : "";
}

// Root does not look into HOME: `sudo` may have left the caller's one there.
std::string DefaultDir() {
  if (geteuid() == 0) return "/var/lib/drctl";
  const std::string state = Variable("XDG_STATE_HOME");
  if (!state.empty() && state.front() == '/') return state + "/drctl";
  const std::string home = Variable("HOME");
  return !home.empty() && home.front() == '/' ? home + "/.local/state/drctl" : "";
}

}  // namespace

std::string AbsolutePath(const std::string& path) {
  std::error_code error;
  std::filesystem::path result = std::filesystem::absolute(path, error);
  if (!error) result = std::filesystem::weakly_canonical(result, error);
  return error ? path : result.string();
}

std::string DefaultDb() {
  const std::string db = Variable("DRCTL_DB");
  if (!db.empty()) return db;
  const std::string dir = DefaultDir();
  return dir.empty() ? "" : dir + "/registry.db";
}

void MakeDefaultDir(const std::string& db) {
  const std::string dir = DefaultDir();
  // The statement that follows tells what is wrong when there is no directory.
  if (!dir.empty() && db == dir + "/registry.db") KeloDRCore::File::CreateDir(dir, 0700);
}

}  // namespace drctl
