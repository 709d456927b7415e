#include "privilege.h"

#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

namespace KeloDRCore {
namespace {

// What setresuid and setresgid take for "leave this id alone".
constexpr uid_t kKeepUid = static_cast<uid_t>(-1);
constexpr gid_t kKeepGid = static_cast<gid_t>(-1);

}  // namespace

PrivilegeBracket::PrivilegeBracket(const char* fileName, int lineNumber) noexcept
    : file(fileName), line(lineNumber), savedUid(geteuid()), savedGid(getegid()) {
  Finish(Enter(), "ENTER");
}

PrivilegeBracket::~PrivilegeBracket() { Finish(Leave(), "LEAVE"); }

bool PrivilegeBracket::Enter() const noexcept {
  // The gid first: only a process that may still become root can change it.
  return (savedGid == 0 || SetGid(0)) && (savedUid == 0 || SetUid(0));
}

bool PrivilegeBracket::Leave() const noexcept {
  const bool uidDiffers = geteuid() != savedUid;
  const bool gidDiffers = getegid() != savedGid;
  // Root again before the gid, so that the gid may be changed; the saved uid comes last.
  if (uidDiffers && !SetUid(0)) return false;
  if (gidDiffers && !SetGid(savedGid)) return false;
  return !uidDiffers || SetUid(savedUid);
}

bool PrivilegeBracket::SetUid(uid_t id) const noexcept {
  return Report(setresuid(kKeepUid, id, kKeepUid) == 0, "resuid", id);
}

bool PrivilegeBracket::SetGid(gid_t id) const noexcept {
  return Report(setresgid(kKeepGid, id, kKeepGid) == 0, "resgid", id);
}

bool PrivilegeBracket::Report(bool succeeded, const char* word, unsigned int id) const noexcept {
  if (!succeeded) {
    char buffer[1024] = {};
    const char* reason = strerror_r(errno, buffer, sizeof(buffer));
    syslog(LOG_AUTH | LOG_ERR, "%s:%d ERROR: set%s(%d, %d, %d) [%s]", file, line, word, -1,
           static_cast<int>(id), -1, reason);
  } else if (id == 0) {
    // Only power gained is worth a line, not power given up.
    syslog(LOG_AUTH | LOG_DEBUG, "%s:%d WARNING: set%s(%d, %d, %d)", file, line, word, -1, 0, -1);
  }
  return succeeded;
}

void PrivilegeBracket::Finish(bool succeeded, const char* step) const noexcept {
  if (!succeeded) {
    syslog(LOG_AUTH | LOG_ERR, "%s:%d ERROR: %sCriticalSection", file, line, step);
  }
  errno = succeeded ? 0 : EPERM;
}

}  // namespace KeloDRCore
