#include "power/disk.h"

#include <fcntl.h>
#include <linux/loop.h>
#include <sched.h>
#include <sys/ioctl.h>
#include <sys/mman.h>
#include <sys/mount.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>

namespace {

// Of the kernel's ext4.h, which is not installed.
constexpr unsigned long kShutdown = _IOR('X', 125, __u32);
constexpr __u32 kWithoutFlush = 2;

constexpr off_t kSize = 128 << 20;

// Without it, a rename over a file writes the data of the new one, as if it had been synced.
constexpr char kOptions[] = "noauto_da_alloc";

// An open loop device over `image`, or -1. The kernel frees it when it is closed and not mounted.
int OpenLoop(int image, std::string& name) {
  const int control = open("/dev/loop-control", O_RDWR | O_CLOEXEC);
  const int number = control < 0 ? -1 : ioctl(control, LOOP_CTL_GET_FREE);
  if (control >= 0) close(control);
  if (number < 0) return -1;
  name = "/dev/loop" + std::to_string(number);
  const int device = open(name.c_str(), O_RDWR | O_CLOEXEC);
  loop_config config = {};
  config.fd = static_cast<__u32>(image);
  config.info.lo_flags = LO_FLAGS_AUTOCLEAR;
  if (device < 0 || ioctl(device, LOOP_CONFIGURE, &config) == 0) return device;
  const int saved = errno;
  close(device);
  errno = saved;
  return -1;
}

}  // namespace

bool Disk::Fail(const std::string& what) {
  reason = what + ": " + strerror(errno);
  return false;
}

bool Disk::Make() {
  if (unshare(CLONE_NEWNS) != 0 ||
      mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr) != 0) {
    return Fail("no mounts of its own");
  }
  image = memfd_create("disk", MFD_CLOEXEC);
  if (image < 0 || ftruncate(image, kSize) != 0) return Fail("no memory for an image");
  const std::string path = "/proc/" + std::to_string(getpid()) + "/fd/" + std::to_string(image);
  if (system(("PATH=$PATH:/usr/sbin:/sbin mkfs.ext4 -q -F " + path + " >/dev/null 2>&1").c_str()) !=
      0) {
    return Fail("mkfs.ext4 does not run");
  }
  return Mount() && Unmount();
}

bool Disk::Mount() {
  // A free device may be another's by the time it is configured.
  std::string name;
  int device = -1;
  for (int i = 0; i < 50 && device < 0; ++i) {
    device = OpenLoop(image, name);
    if (device < 0 && errno != EBUSY) break;
  }
  if (device < 0) return Fail("no loop device");
  const int result = mount(name.c_str(), kDiskDir, "ext4", MS_NOATIME, kOptions);
  if (result != 0) Fail("no mount");
  close(device);
  return result == 0;
}

bool Disk::Unmount() { return umount2(kDiskDir, 0) == 0 || Fail("not unmounted"); }

bool Disk::CutPower() {
  const int root = open(kDiskDir, O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  const int result = ioctl(root, kShutdown, &kWithoutFlush);
  close(root);
  return result == 0;
}
