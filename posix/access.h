// Who may do what with a file.

#ifndef KELODRCORE_POSIX_ACCESS_H_
#define KELODRCORE_POSIX_ACCESS_H_

#include <sys/stat.h>

namespace KeloDRCore::Posix {

// The bits that chmod sets.
constexpr mode_t kModeBits = 07777;

// Gives the file `to` what the file `from` has: owner, group, POSIX ACL, the attributes `user.*`
// and `security.*`, and the mode with `added` bits. `from` may be open with O_PATH. False with
// errno set.
bool CopyAccess(int from, int to, mode_t added);

}  // namespace KeloDRCore::Posix

#endif  // KELODRCORE_POSIX_ACCESS_H_
