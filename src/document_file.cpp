// How a file is replaced.
//
// The new document is written to a temporary beside the file, synced, and renamed over it. The
// temporary has one fixed name per file and user, so that a killed writer leaves at most one, and
// the next writer finds it. Whether its writer lives is told by a lock on it (flock), which ends
// with its process:
//
//   - A writer creates the temporary (never opening what is there), locks it, and looks whether the
//     name still means the file that it locked. If not, it starts again.
//   - A writer that finds a temporary tries its lock. If it is held, it pauses and starts again. If
//     it is free and the name still means that file, its writer is dead: it is removed.
//
// So only the holder of the lock renames or removes the name, and nothing is ever written into a
// file that was found. Nobody waits in flock: anybody who may read the temporary could lock it.
// A link, queue or the like at the name was planted; it cannot be locked, so the directory is
// locked while it is removed, lest the second of two writers removes the temporary of the first.

#include "document_file.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <optional>
#include <utility>

#include "json_text.h"
#include "posix/descriptor.h"
#include "posix/file_io.h"
#include "posix/retry.h"
#include "posix/trust.h"

namespace KeloDRCore {
namespace {

constexpr int kMaxLinks = 40;                // as many as the kernel follows
constexpr int kMaxAttempts = 60000;          // a minute of pauses
constexpr useconds_t kPause = 1000;          // microseconds
constexpr size_t kMaxNameInTemporary = 100;  // some file systems allow 143 bytes a name
constexpr mode_t kPermissionBits = 07777;

using Posix::Descriptor;
using Posix::Fail;
using Posix::IsSameFile;
using Posix::OpenAt;
using Posix::Retry;
using Posix::StatAt;

bool StatFile(const Descriptor& file, struct stat& found) { return Posix::Stat(file.Get(), found); }

bool UnlinkAt(int directory, const std::string& name) {
  return Retry([&] { return unlinkat(directory, name.c_str(), 0); }) == 0 || errno == ENOENT;
}

bool Sync(const Descriptor& file) {
  return Retry([&] { return fsync(file.Get()); }) == 0;
}

bool TryLock(const Descriptor& file) {
  return Retry([&] { return flock(file.Get(), LOCK_EX | LOCK_NB); }) == 0;
}

bool Unlock(const Descriptor& file) {
  return Retry([&] { return flock(file.Get(), LOCK_UN); }) == 0;
}

bool SetMode(const Descriptor& file, mode_t mode) {
  return Retry([&] { return fchmod(file.Get(), mode); }) == 0;
}

bool SetOwner(const Descriptor& file, uid_t uid, gid_t gid) {
  return Retry([&] { return fchown(file.Get(), uid, gid); }) == 0;
}

// C strings end at the first NUL byte: such a path would name another file.
bool IsPath(const std::string& path) {
  return !path.empty() && path.find('\0') == std::string::npos;
}

// Where a document's file is: an open directory and the name in it, links followed.
struct Place {
  Descriptor directory;
  std::string name;
};

bool ReadLink(const Place& place, std::string& target) {
  char buffer[PATH_MAX];
  const ssize_t size = Retry(
      [&] { return readlinkat(place.directory.Get(), place.name.c_str(), buffer, sizeof buffer); });
  if (size < 0) return false;
  target.assign(buffer, static_cast<size_t>(size));
  return true;
}

// The place at the end of the links that begin with `path`, or of `path` itself.
bool Locate(std::string path, Whose whose, Place& place) {
  int base = AT_FDCWD;
  for (int link = 0; link <= kMaxLinks; ++link) {
    Descriptor directory = OpenAt(base, Posix::DirectoryOf(path), O_RDONLY | O_DIRECTORY);
    if (!directory.IsOpen()) return false;
    place.directory = std::move(directory);
    place.name = path.substr(path.rfind('/') + 1);
    if (place.name.empty()) return Fail(EISDIR);
    if (whose == Whose::kBelieved) return true;
    if (!ReadLink(place, path)) return errno == EINVAL || errno == ENOENT;
    base = place.directory.Get();
  }
  // Only links that became a loop just now: the kernel refused any other before.
  return Fail(ELOOP);
}

// The state of the file that the new one takes its owner and mode from; `state` comes in empty and
// stays so when there is none. False for what must not be replaced by a file.
using State = std::optional<struct stat>;
bool LookAt(const Place& place, Whose whose, State& state) {
  struct stat found = {};
  const int directory = place.directory.Get();
  if (!StatAt(directory, place.name, AT_SYMLINK_NOFOLLOW, found)) return errno == ENOENT;
  if (S_ISDIR(found.st_mode)) return Fail(EISDIR);
  if (whose == Whose::kBelieved && !Posix::IsBelieved(found, directory)) return true;
  if (!S_ISREG(found.st_mode)) return Fail(EINVAL);
  state = found;
  return true;
}

// The kernel looks first: it refuses what is not to be replaced before anything is touched, and
// links that it would not follow itself.
bool IsReplaceable(const std::string& path) {
  struct stat found = {};
  if (!StatAt(AT_FDCWD, path, 0, found)) return errno == ENOENT;
  return S_ISREG(found.st_mode) || Fail(S_ISDIR(found.st_mode) ? EISDIR : EINVAL);
}

std::string TemporaryName(const std::string& name) {
  size_t length = name.size();
  if (length > kMaxNameInTemporary) {
    length = kMaxNameInTemporary;  // not within a UTF-8 character, which some file systems refuse
    while (length > 1 && (static_cast<unsigned char>(name[length]) & 0xC0) == 0x80) --length;
  }
  return "." + name.substr(0, length) + ".kelodr-" + std::to_string(geteuid());
}

// The temporary of one writer: from Claim() to Publish() it is locked and under its name; if
// Publish() does not come, it is removed.
class Temporary {
 public:
  explicit Temporary(const Place& where) : place(where), name(TemporaryName(where.name)) {}
  Temporary(const Temporary&) = delete;
  Temporary& operator=(const Temporary&) = delete;
  ~Temporary() {
    if (file.IsOpen() && !published) Remove();
  }

  bool Claim(mode_t mode);
  bool Publish();
  const Descriptor& File() const { return file; }

 private:
  enum class Try { kDone, kAgain, kBusy, kFailed };

  Try Create(mode_t mode);
  Try RemoveFound() const;
  Try RemovePlanted() const;
  Try RemoveLeftover() const;
  Try Find(struct stat& found) const;
  Try Lock(const Descriptor& opened) const;
  void Remove() const;
  int Directory() const { return place.directory.Get(); }

  const Place& place;
  const std::string name;
  Descriptor file;
  bool published = false;
};

void Temporary::Remove() const {
  const int saved = errno;
  UnlinkAt(Directory(), name);
  errno = saved;
}

Temporary::Try Temporary::Find(struct stat& found) const {
  if (StatAt(Directory(), name, AT_SYMLINK_NOFOLLOW, found)) return Try::kDone;
  return errno == ENOENT ? Try::kAgain : Try::kFailed;
}

// kDone with the lock held on the file that has the name.
Temporary::Try Temporary::Lock(const Descriptor& opened) const {
  struct stat locked = {};
  struct stat named = {};
  if (!TryLock(opened)) return errno == EWOULDBLOCK ? Try::kBusy : Try::kFailed;
  if (!StatFile(opened, locked)) return Try::kFailed;
  const Try found = Find(named);
  if (found != Try::kDone) return found;
  return IsSameFile(locked, named) ? Try::kDone : Try::kAgain;
}

Temporary::Try Temporary::Create(mode_t mode) {
  Descriptor created = OpenAt(Directory(), name, O_WRONLY | O_CREAT | O_EXCL, mode);
  if (!created.IsOpen()) return errno == EEXIST ? Try::kAgain : Try::kFailed;
  const Try locked = Lock(created);
  if (locked == Try::kFailed) Remove();
  if (locked == Try::kDone) file = std::move(created);
  return locked;
}

Temporary::Try Temporary::RemoveFound() const {
  struct stat found = {};
  const Try result = Find(found);
  if (result != Try::kDone) return result;
  return S_ISREG(found.st_mode) ? RemoveLeftover() : RemovePlanted();
}

Temporary::Try Temporary::RemoveLeftover() const {
  // Whatever takes its place before it is opened must neither be followed nor waited for.
  const Descriptor opened = OpenAt(Directory(), name, O_RDONLY | O_NOFOLLOW | O_NONBLOCK);
  if (!opened.IsOpen()) return errno == ENOENT ? Try::kAgain : Try::kFailed;
  const Try locked = Lock(opened);
  if (locked != Try::kDone) return locked;
  return UnlinkAt(Directory(), name) ? Try::kAgain : Try::kFailed;
}

Temporary::Try Temporary::RemovePlanted() const {
  if (!TryLock(place.directory)) return errno == EWOULDBLOCK ? Try::kBusy : Try::kFailed;
  struct stat found = {};
  Try result = Find(found);
  if (result == Try::kDone) {
    result = S_ISREG(found.st_mode) || UnlinkAt(Directory(), name) ? Try::kAgain : Try::kFailed;
  }
  return Unlock(place.directory) ? result : Try::kFailed;
}

bool Temporary::Claim(mode_t mode) {
  for (int attempt = 0; attempt < kMaxAttempts; ++attempt) {
    Try result = Create(mode);
    if (result == Try::kDone) return true;
    if (result == Try::kAgain) result = RemoveFound();
    if (result == Try::kFailed) return false;
    if (result == Try::kBusy) usleep(kPause);
  }
  return Fail(EBUSY);
}

bool Temporary::Publish() {
  const int directory = Directory();
  const auto rename = [&] {
    return renameat(directory, name.c_str(), directory, place.name.c_str());
  };
  published = Retry(rename) == 0;
  return published;
}

// A write clears the set-id bits, and so does a change of owner: the mode comes last. The owner's
// read bit stays set until the file is published, because another writer of the same user must be
// able to open the temporary.
bool TakeOver(const Descriptor& file, const struct stat& old) {
  struct stat created = {};
  if (!StatFile(file, created)) return false;
  const bool sameOwner = created.st_uid == old.st_uid && created.st_gid == old.st_gid;
  if (!sameOwner && !SetOwner(file, old.st_uid, old.st_gid)) return false;
  return SetMode(file, (old.st_mode & kPermissionBits) | S_IRUSR);
}

bool TakeReadBit(const Descriptor& file, const State& old) {
  if (!old || (old->st_mode & S_IRUSR) != 0) return true;
  return SetMode(file, old->st_mode & kPermissionBits) && Sync(file);
}

// A new file gets its mode from the kernel (umask, default ACL); the new text of a file that was
// there is nobody else's until its mode is taken over.
mode_t ModeOfTemporary(const State& old) { return old ? 0600 : 0666; }

bool Replace(const Place& place, Whose whose, const std::string& text) {
  State before;
  State old;
  if (!LookAt(place, whose, before)) return false;
  Temporary temporary(place);
  if (!temporary.Claim(ModeOfTemporary(before))) return false;
  // While this writer waited for another, the file may have come into being, or changed.
  if (!LookAt(place, whose, old)) return false;
  if (!old) old = before;
  if (!Posix::WriteAll(temporary.File().Get(), text)) return false;
  if (old && !TakeOver(temporary.File(), *old)) return false;
  if (!Sync(temporary.File()) || !temporary.Publish()) return false;
  return TakeReadBit(temporary.File(), old) && Sync(place.directory);
}

Descriptor OpenDocument(const std::string& path, Whose whose) {
  if (whose == Whose::kBelieved) return Posix::OpenBelieved(path);
  Descriptor file = Posix::Open(path, O_RDONLY | Posix::kHarmless);
  struct stat found = {};
  const bool isDocument =
      file.IsOpen() && StatFile(file, found) && (S_ISREG(found.st_mode) || Fail(EINVAL));
  if (!isDocument) file.Close();
  return file;
}

}  // namespace

bool ReadDocument(Json::Value& value, const std::string& path, Whose whose) {
  if (!IsPath(path)) return Fail(EINVAL);
  const Descriptor file = OpenDocument(path, whose);
  std::string text;
  return file.IsOpen() && Posix::ReadAll(file.Get(), text) && ParseJson(value, text, Origin::kFile);
}

bool ReplaceDocument(const Json::Value& value, const std::string& path, Whose whose) {
  if (!IsPath(path)) return Fail(EINVAL);
  if (whose == Whose::kAnybodys && !IsReplaceable(path)) return false;
  Place place;
  return Locate(path, whose, place) && Replace(place, whose, WriteJson(value));
}

}  // namespace KeloDRCore
