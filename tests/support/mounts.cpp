#include "support/mounts.h"

#include <linux/capability.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <fstream>

namespace {

constexpr char kLockDir[] = "/tmp/.kelodr_lock";

// An ordinary user again, after EnterOwnMounts().
bool DropCapabilities() {
  __user_cap_header_struct header = {_LINUX_CAPABILITY_VERSION_3, 0};
  __user_cap_data_struct none[2] = {};
  return syscall(SYS_capset, &header, none) == 0;
}

// Puts a directory of this process's own in the place of the lock directory of another user.
bool HideLockDir() {
  return EnterOwnMounts() && mount("tmpfs", kLockDir, "tmpfs", 0, "mode=0755,size=8m") == 0 &&
         DropCapabilities();
}

}  // namespace

bool EnterOwnMounts() {
  const uid_t uid = geteuid();
  const gid_t gid = getegid();
  if (uid == 0) {
    if (unshare(CLONE_NEWNS) != 0) return false;
  } else {
    if (unshare(CLONE_NEWUSER | CLONE_NEWNS) != 0) return false;
    std::ofstream("/proc/self/setgroups") << "deny";
    std::ofstream("/proc/self/uid_map") << uid << " " << uid << " 1";
    std::ofstream("/proc/self/gid_map") << gid << " " << gid << " 1";
  }
  return mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr) == 0;
}

bool CanLock() {
  static const bool can = access(kLockDir, W_OK) == 0 || errno == ENOENT || HideLockDir();
  return can;
}
