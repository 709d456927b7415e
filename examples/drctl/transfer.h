// The registry as one JSON document in a file.

#ifndef DRCTL_TRANSFER_H_
#define DRCTL_TRANSFER_H_

#include <string>

#include "registry.h"

namespace drctl {

// Both return the program's exit status, having said on standard error what went wrong.

// Writes all nodes and volumes to `file`, which is the old one or the new one at any moment.
int Export(Registry& registry, const std::string& file);

// Replaces all nodes and volumes by those of `file`. Says of every entry that is not good why it is
// refused; one such entry, and nothing is changed.
int Import(Registry& registry, const std::string& file);

}  // namespace drctl

#endif  // DRCTL_TRANSFER_H_
