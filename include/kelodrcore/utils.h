/// @file
/// Small helpers: a random pause, UUIDs, and the test for paths on a data volume. What is called
/// deliberate here is frozen.

#ifndef KELODRCORE_UTILS_H_
#define KELODRCORE_UTILS_H_

#include <string>

#include "kelodrcore/export.h"

namespace KeloDRCore {

/// Sleeps for a random number of milliseconds, drawn uniformly from the closed range [min, max].
/// Blocks the calling thread; a signal may end the sleep early. The period is kept to 32 bits of
/// microseconds: one above 4,294,967 ms (71 minutes) begins again at 0.
///
/// False, at once and with a line at ERR, unless 0 < min < max: equal bounds and a period that
/// starts at 0 are deliberately refused.
KELODR_EXPORT bool RandomSleepInMSec(unsigned int min, unsigned int max);

/// A new UUID: the first line that "/usr/bin/uuidgen" prints, without surrounding white space. The
/// tool's first 64 KiB count. Empty when the tool cannot be started (a line at ERR), prints nothing
/// or cannot be read (no line).
KELODR_EXPORT std::string GenerateUUID();

/// Tests of texts.
namespace Validator {

/// True when `path` begins with "/volume". The path is neither normalised nor looked up.
[[nodiscard]] KELODR_EXPORT bool IsVolPath(const std::string& path);

}  // namespace Validator
}  // namespace KeloDRCore

#endif  // KELODRCORE_UTILS_H_
