#include "kelodrcore/utils.h"

namespace KeloDRCore::Validator {

bool IsVolPath(const std::string& path) { return path.compare(0, 7, "/volume") == 0; }

}  // namespace KeloDRCore::Validator
