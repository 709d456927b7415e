// The registry as one JSON document in a file.

#ifndef DRCTL_TRANSFER_H_
#define DRCTL_TRANSFER_H_

#include "commands.h"

namespace drctl {

// Both return the program's exit status, having said on standard error what went wrong. The file
// "-" is standard output, or standard input.

// Writes all nodes and volumes to options.file, which is the old one or the new one at any moment.
int ExportRegistry(const Options& options);

// Replaces all nodes and volumes by those of options.file. Says of every entry that is not good why
// it is refused; one such entry, and nothing is changed.
int ImportRegistry(const Options& options);

}  // namespace drctl

#endif  // DRCTL_TRANSFER_H_
