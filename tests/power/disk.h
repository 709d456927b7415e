// A disk that loses power: an ext4 file system in memory that can be shut down at once.

#ifndef KELODRCORE_TESTS_POWER_DISK_H_
#define KELODRCORE_TESTS_POWER_DISK_H_

#include <string>

// Where the file system is seen, by this process and its children only.
inline constexpr char kDiskDir[] = "/tmp";

// Nothing of it outlives the process: the image has no name, and the kernel takes down the mount
// and the loop device with their last user.
class Disk {
 public:
  // Whether this machine can have one; otherwise Reason() says what is missing.
  bool Make();
  const std::string& Reason() const { return reason; }

  // What was synced before the last cut is there, after the recovery of the file system.
  bool Mount();
  bool Unmount();

  // From now on nothing reaches the disk, not even what the file system has in its journal's
  // memory. Called by any process, once Mount() has succeeded.
  static bool CutPower();

 private:
  bool Fail(const std::string& what);

  int image = -1;
  std::string reason;
};

#endif  // KELODRCORE_TESTS_POWER_DISK_H_
