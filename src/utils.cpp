#include "kelodrcore/utils.h"

#include <stdio.h>
#include <unistd.h>

#include <memory>

#include "kelocore.h"
#include "kelorandom.h"
#include "log.h"
#include "posix/file_io.h"

namespace KeloDRCore {

bool RandomSleepInMSec(unsigned int min, unsigned int max) {
  if (min == 0 || min >= max) {
    KELODR_LOG(ERR, __func__, "Invalid period [%u - %u] to sleep", min, max);
    return false;
  }
  const unsigned int milliseconds = KELO::RANDOM::KELORandom().urandom(min, max);
  usleep(milliseconds * 1000U);
  return true;
}

std::string GenerateUUID() {
  static const char* const kCommand = "/usr/bin/uuidgen";
  const std::unique_ptr<FILE, int (*)(FILE*)> output(KLIBCPopen(kCommand, "r", nullptr),
                                                     KLIBCPclose);
  if (output == nullptr) {
    KELODR_LOG(ERR, __func__, "Failed to exec the command [%s].", kCommand);
    return "";
  }
  constexpr size_t kLongest = 65536;  // a tool that prints for ever ends there
  std::string line;
  if (!Posix::ReadAll(fileno(output.get()), line, kLongest))
    return "";  // the start of a UUID is none
  line = line.substr(0, line.find('\n'));
  KLIBCStrTrim(line.data(), nullptr, nullptr);
  return line.c_str();  // which the trimming has shortened
}

}  // namespace KeloDRCore
