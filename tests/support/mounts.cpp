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

// A user namespace with one user, who is called `uid` there, and whatever else `flags` say.
bool EnterUserNamespace(int flags, uid_t uid, gid_t gid) {
  const uid_t outerUid = getuid();
  const gid_t outerGid = getgid();
  if (unshare(CLONE_NEWUSER | flags) != 0) return false;
  std::ofstream("/proc/self/setgroups") << "deny";
  std::ofstream("/proc/self/uid_map") << uid << " " << outerUid << " 1";
  std::ofstream("/proc/self/gid_map") << gid << " " << outerGid << " 1";
  return getuid() == uid;
}

}  // namespace

bool EnterOwnMounts() {
  const bool isAllowed = getuid() == 0 ? unshare(CLONE_NEWNS) == 0
                                       : EnterUserNamespace(CLONE_NEWNS, getuid(), getgid());
  return isAllowed && mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr) == 0;
}

bool BecomeRoot() { return getuid() == 0 || EnterUserNamespace(0, 0, 0); }

bool CanLock() {
  static const bool can = access(kLockDir, W_OK) == 0 || errno == ENOENT || HideLockDir();
  return can;
}
