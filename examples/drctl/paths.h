// Paths as the names of locks want them.

#ifndef DRCTL_PATHS_H_
#define DRCTL_PATHS_H_

#include <string>

namespace drctl {

// The one absolute name of a file, from whatever directory it is asked for: a lock is found by its
// name, so two names of one file would be two locks.
std::string AbsolutePath(const std::string& path);

}  // namespace drctl

#endif  // DRCTL_PATHS_H_
