#include "unit/root_ids/root_ids.h"

#include <gtest/gtest.h>
#include <linux/capability.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <iterator>

#include "support/next.h"

namespace {

// Real, effective and saved.
using Ids = unsigned int[3];
Ids uids = {0, 0, 0};
Ids gids = {0, 0, 0};
constexpr unsigned int kKeep = static_cast<unsigned int>(-1);

// Effective while the effective uid is 0.
unsigned int permitted = 1U << CAP_SETUID | 1U << CAP_SETGID;

bool Has(const Ids& ids, unsigned int id) {
  return std::find(std::begin(ids), std::end(ids), id) != std::end(ids);
}

int Set(Ids& ids, const Ids& wanted, unsigned int capability) {
  const bool mayTakeAny = uids[1] == 0 && (permitted & 1U << capability) != 0;
  for (const unsigned int id : wanted) {
    if (mayTakeAny || id == kKeep || Has(ids, id)) continue;
    errno = EPERM;
    return -1;
  }
  for (size_t i = 0; i < std::size(ids); ++i) {
    if (wanted[i] != kKeep) ids[i] = wanted[i];
  }
  if (!Has(uids, 0)) permitted = 0;
  return 0;
}

int Get(const Ids& ids, unsigned int* real, unsigned int* effective, unsigned int* saved) {
  *real = ids[0];
  *effective = ids[1];
  *saved = ids[2];
  return 0;
}

void DropRealCapability(unsigned int capability) {
  __user_cap_header_struct header = {_LINUX_CAPABILITY_VERSION_3, 0};
  __user_cap_data_struct data[2] = {};
  ASSERT_EQ(syscall(SYS_capget, &header, data), 0);
  data[0].effective &= ~(1U << capability);
  data[0].permitted &= ~(1U << capability);
  ASSERT_EQ(syscall(SYS_capset, &header, data), 0);
}

}  // namespace

extern "C" {

uid_t geteuid() noexcept { return RootIds::AreReal() ? Next<uid_t()>("geteuid")() : uids[1]; }
gid_t getegid() noexcept { return RootIds::AreReal() ? Next<gid_t()>("getegid")() : gids[1]; }

int getresuid(uid_t* real, uid_t* effective, uid_t* saved) noexcept {
  if (!RootIds::AreReal()) return Get(uids, real, effective, saved);
  return Next<int(uid_t*, uid_t*, uid_t*)>("getresuid")(real, effective, saved);
}

int getresgid(gid_t* real, gid_t* effective, gid_t* saved) noexcept {
  if (!RootIds::AreReal()) return Get(gids, real, effective, saved);
  return Next<int(gid_t*, gid_t*, gid_t*)>("getresgid")(real, effective, saved);
}

int setresuid(uid_t real, uid_t effective, uid_t saved) noexcept {
  if (!RootIds::AreReal()) return Set(uids, {real, effective, saved}, CAP_SETUID);
  return Next<int(uid_t, uid_t, uid_t)>("setresuid")(real, effective, saved);
}

int setresgid(gid_t real, gid_t effective, gid_t saved) noexcept {
  if (!RootIds::AreReal()) return Set(gids, {real, effective, saved}, CAP_SETGID);
  return Next<int(gid_t, gid_t, gid_t)>("setresgid")(real, effective, saved);
}

}  // extern "C"

namespace RootIds {

bool AreReal() {
  static const bool real = Next<uid_t()>("geteuid")() == 0;
  return real;
}

void DropCapability(unsigned int capability) {
  if (AreReal()) {
    DropRealCapability(capability);
  } else {
    permitted &= ~(1U << capability);
  }
}

}  // namespace RootIds
