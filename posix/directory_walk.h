// The way to a directory at a path where others may write, one step at a time.

#ifndef KELODRCORE_POSIX_DIRECTORY_WALK_H_
#define KELODRCORE_POSIX_DIRECTORY_WALK_H_

#include <functional>
#include <string>

#include "posix/descriptor.h"

namespace KeloDRCore::Posix {

// Makes the directory at a path, or tells that it cannot be made: false.
using MakeDirectory = std::function<bool(const std::string& path)>;

// Opens the directory `path`, which begins with `start`. `start` itself may be a link, no step
// below it may. A step that is missing is made with mode 0755; where that fails, it is left to
// `make`.
//
// Nobody with fewer rights may decide what is found on the way. As root, a step is made root's and
// writable by nobody else, and what a stranger put in the place of one is removed; the first step
// is root's whoever put a file there. To an ordinary user a step must be root's or its own. Behind
// a step "..", which leads away from `start`, only links are refused.
//
// A closed descriptor when the directory cannot be had. `make` has been called, too, where
// something else stands in the place of a step.
Descriptor OpenStepwise(const std::string& start, const std::string& path,
                        const MakeDirectory& make);

// As root: takes away what another user has put at a name in the open directory. A directory, which
// may hold anything, only gets another name.
bool ClearPlanted(int directory, const std::string& name);

}  // namespace KeloDRCore::Posix

#endif  // KELODRCORE_POSIX_DIRECTORY_WALK_H_
