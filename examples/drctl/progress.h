// A bar that shows the progress of a long operation.

#ifndef DRCTL_PROGRESS_H_
#define DRCTL_PROGRESS_H_

#include <cstddef>

namespace drctl {

// Draws on standard error, and only when that is a terminal.
class Progress {
 public:
  explicit Progress(size_t steps);
  ~Progress();  // takes the bar away

  Progress(const Progress&) = delete;
  Progress& operator=(const Progress&) = delete;

  // Counts further steps as done.
  void Add(size_t steps);

 private:
  size_t total;
  size_t done = 0;
  size_t shown = 0;  // percent
  bool isOnTerminal;
};

}  // namespace drctl

#endif  // DRCTL_PROGRESS_H_
