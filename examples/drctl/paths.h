// Where drctl's files are.

#ifndef DRCTL_PATHS_H_
#define DRCTL_PATHS_H_

#include <string>

namespace drctl {

// The one absolute name of a file, from whatever directory it is asked for: a lock is found by its
// name, so two names of one file would be two locks.
std::string AbsolutePath(const std::string& path);

// The registry's file when --db does not name one: that of the environment variable DRCTL_DB, else
// /var/lib/drctl/registry.db for root, else drctl/registry.db in the user's XDG_STATE_HOME or
// ~/.local/state. Empty when the environment does not tell the user's directory.
std::string DefaultDb();

// Makes the directory of the registry where this process's user keeps it by default, readable by
// that user only. Other places are the caller's own: nothing is made there.
void MakeDefaultDir(const std::string& db);

}  // namespace drctl

#endif  // DRCTL_PATHS_H_
