// This machine's mounts, as the kernel tells them.

#ifndef DRCTL_MOUNTS_H_
#define DRCTL_MOUNTS_H_

#include "rows.h"

namespace drctl {

// One row a mount point, with the columns of a volume. Where mounts are stacked on one mount point,
// the last one counts. Empty when /proc/self/mountinfo cannot be read.
Rows ScanMounts();

}  // namespace drctl

#endif  // DRCTL_MOUNTS_H_
