#include "progress.h"

#include <unistd.h>

#include <iostream>
#include <string>

namespace drctl {

Progress::Progress(size_t steps) : total(steps), isOnTerminal(isatty(STDERR_FILENO) == 1) {}

Progress::~Progress() {
  if (shown > 0) std::cerr << "\r\033[K";
}

void Progress::Add(size_t steps) {
  done += steps;
  const size_t percent = total > 0 ? done * 100 / total : 0;
  if (!isOnTerminal || percent == shown) return;
  shown = percent;
  const size_t full = shown / 2;
  std::cerr << "\r[" << std::string(full, '#') << std::string(50 - full, '.') << "] " << shown
            << " %" << std::flush;
}

}  // namespace drctl
