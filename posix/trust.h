// Whose files a process may believe that runs with more rights than others have, at paths where
// others may write.

#ifndef KELODRCORE_POSIX_TRUST_H_
#define KELODRCORE_POSIX_TRUST_H_

#include <sys/stat.h>

#include <string>

#include "posix/descriptor.h"

namespace KeloDRCore::Posix {

// Whether `file` is a regular file of root, of the effective user, or of the owner of its
// directory, the last not in a directory that all may write. The directory (of `path`, or the open
// one) is looked at only when the first two do not decide.
bool IsBelieved(const struct stat& file, const std::string& path);
bool IsBelieved(const struct stat& file, int directory);

// The same question about the owner of what need not be a regular file.
bool IsOwnerBelieved(const struct stat& file, int directory);

// The state of the believed file at `path`. False with errno set when it is missing (ENOENT), a
// link or anything else that is not a regular file (EINVAL), or a stranger's (EACCES).
bool StatBelieved(const std::string& path, struct stat& found);

// Opens the believed file at `path` for reading, and decides on what is open: nothing can take its
// place after the look. A closed descriptor with errno set, as above; ELOOP for a link.
Descriptor OpenBelieved(const std::string& path);

}  // namespace KeloDRCore::Posix

#endif  // KELODRCORE_POSIX_TRUST_H_
