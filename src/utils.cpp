#include "kelodrcore/utils.h"

#include <stdio.h>
#include <unistd.h>

#include <cstdlib>
#include <memory>

#include "kelocore.h"
#include "kelorandom.h"
#include "log.h"

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
  char* line = nullptr;
  size_t capacity = 0;
  const bool isRead = getline(&line, &capacity, output.get()) != -1;
  const std::unique_ptr<char, void (*)(void*)> owner(line, free);
  if (!isRead) return "";
  KLIBCStrTrim(line, nullptr, nullptr);
  return line;
}

}  // namespace KeloDRCore
