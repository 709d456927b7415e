// The privilege bracket: raises the effective uid and gid to 0 and restores them.
//
// It logs in a format of its own, at LOG_AUTH, without the prefix of log.h. It changes the
// effective ids of the whole process and is guarded by no lock.

#ifndef KELODRCORE_SRC_PRIVILEGE_H_
#define KELODRCORE_SRC_PRIVILEGE_H_

#include <sys/types.h>

#include "log.h"

namespace KeloDRCore {

// Enters on construction and leaves on destruction, an exception's way out included. A failed step
// is logged and sets errno to EPERM; a successful one sets errno to 0. Neither stops the caller.
class PrivilegeBracket {
 public:
  // `file` and `line` name the place in the log lines of both steps.
  PrivilegeBracket(const char* file, int line) noexcept;
  ~PrivilegeBracket();

  PrivilegeBracket(const PrivilegeBracket&) = delete;
  PrivilegeBracket& operator=(const PrivilegeBracket&) = delete;

 private:
  bool Enter() const noexcept;
  bool Leave() const noexcept;
  bool SetUid(uid_t id) const noexcept;
  bool SetGid(gid_t id) const noexcept;
  // Logs the outcome of a switch to `id`; passes `succeeded` on.
  bool Report(bool succeeded, const char* word, unsigned int id) const noexcept;
  // Logs a failed step and sets errno.
  void Finish(bool succeeded, const char* step) const noexcept;

  const char* file;
  int line;
  uid_t savedUid;
  gid_t savedGid;
};

}  // namespace KeloDRCore

// Opens a bracket that lasts to the end of the enclosing scope.
#define KELODR_PRIVILEGED() \
  const ::KeloDRCore::PrivilegeBracket privilegeBracket(KELODR_FILE_NAME, __LINE__)

#endif  // KELODRCORE_SRC_PRIVILEGE_H_
