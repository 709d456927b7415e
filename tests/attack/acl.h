// Access control lists and attributes of files.

#ifndef KELODRCORE_TESTS_ATTACK_ACL_H_
#define KELODRCORE_TESTS_ATTACK_ACL_H_

#include <sys/types.h>
#include <sys/xattr.h>

#include <cstdint>
#include <string>

#include "attack/attack.h"

inline constexpr char kAccess[] = "system.posix_acl_access";
inline constexpr char kDefault[] = "system.posix_acl_default";

// An access control list as the kernel takes it.
struct AclEntry {
  uint16_t tag;
  uint16_t permissions;
  uint32_t id;
};
struct Acl {
  uint32_t version = 2;
  AclEntry entries[5];
};
inline constexpr uint32_t kNobody = UINT32_MAX;
inline constexpr uint16_t kRead = 4;
inline constexpr uint16_t kReadWrite = 6;

// The owner reads and writes, and the user may do what `permissions` say; nobody else anything.
inline Acl AclForUser(uint16_t permissions) {
  return {2,
          {{0x01, kReadWrite, kNobody},
           {0x02, permissions, kUser},
           {0x04, 0, kNobody},
           {0x10, permissions, kNobody},
           {0x20, 0, kNobody}}};
}

inline std::string Attribute(const std::string& path, const char* name) {
  char value[256];
  const ssize_t size = getxattr(path.c_str(), name, value, sizeof value);
  return size < 0 ? "none" : std::string(value, static_cast<size_t>(size));
}

template <typename T>
void SetAttribute(const std::string& path, const char* name, const T& value) {
  ASSERT_EQ(setxattr(path.c_str(), name, &value, sizeof value, 0), 0) << name;
}

#endif  // KELODRCORE_TESTS_ATTACK_ACL_H_
