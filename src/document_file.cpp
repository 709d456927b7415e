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
//
// A temporary is the writer's until it gets the owner of the document. Anything else at its name, a
// link, a queue, a directory or a stranger's file, was planted: its lock says nothing. It is
// removed under a lock of the directory, lest the second of two writers removes the temporary of
// the first. A stranger can hold that lock too, so a writer has patience for it, but not for ever.

#include "document_file.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <utility>

#include "json_text.h"
#include "posix/access.h"
#include "posix/descriptor.h"
#include "posix/file_io.h"
#include "posix/retry.h"
#include "posix/trust.h"

namespace KeloDRCore {
namespace {

constexpr int kMaxLinks = 40;                // as many as the kernel follows
constexpr int kMaxAttempts = 60000;          // a minute of pauses
constexpr int kPatience = 1000;              // a second of them
constexpr useconds_t kPause = 1000;          // microseconds
constexpr size_t kMaxNameInTemporary = 100;  // some file systems allow 143 bytes a name

using Posix::Descriptor;
using Posix::Fail;
using Posix::IsSameFile;
using Posix::MoveAway;
using Posix::OpenAt;
using Posix::Retry;
using Posix::StatAt;
using Posix::Sync;
using Posix::UnlinkAt;

bool StatFile(const Descriptor& file, struct stat& found) { return Posix::Stat(file.Get(), found); }

bool TryLock(const Descriptor& file) {
  return Retry([&] { return flock(file.Get(), LOCK_EX | LOCK_NB); }) == 0;
}

bool Unlock(const Descriptor& file) {
  return Retry([&] { return flock(file.Get(), LOCK_UN); }) == 0;
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

std::string TemporaryName(const std::string& name) {
  size_t length = name.size();
  if (length > kMaxNameInTemporary) {
    length = kMaxNameInTemporary;  // not within a UTF-8 character, which some file systems refuse
    while (length > 1 && (static_cast<unsigned char>(name[length]) & 0xC0) == 0x80) --length;
  }
  return "." + name.substr(0, length) + ".kelodr-" + std::to_string(geteuid());
}

// As fs.protected_symlinks has it, whatever that switch says.
bool IsStrangers(const struct stat& link, const struct stat& directory) {
  constexpr mode_t kShared = S_ISVTX | S_IWOTH;
  return (directory.st_mode & kShared) == kShared && link.st_uid != geteuid() &&
         link.st_uid != directory.st_uid;
}

// Where the link at `place` leads; nothing when no link is there. The link is open while it is
// looked at and read: nothing takes its place in between.
bool ReadLink(const Place& place, std::string& target) {
  target.clear();
  const Descriptor link = OpenAt(place.directory.Get(), place.name, O_PATH | O_NOFOLLOW);
  if (!link.IsOpen()) return errno == ENOENT;
  struct stat found = {};
  struct stat directory = {};
  if (!StatFile(link, found) || !StatFile(place.directory, directory)) return false;
  if (!S_ISLNK(found.st_mode)) return true;
  if (IsStrangers(found, directory)) return Fail(EACCES);
  char buffer[PATH_MAX];
  const ssize_t size = Retry([&] { return readlinkat(link.Get(), "", buffer, sizeof buffer); });
  if (size < 0) return false;
  target.assign(buffer, static_cast<size_t>(size));
  return true;
}

// A stranger's directory at the name of a believed document would stop every write.
bool ClearName(const Place& place) {
  struct stat found = {};
  const int directory = place.directory.Get();
  if (!StatAt(directory, place.name, AT_SYMLINK_NOFOLLOW, found)) return errno == ENOENT;
  return !S_ISDIR(found.st_mode) || Posix::IsOwnerBelieved(found, directory) ||
         MoveAway(directory, place.name);
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
    if (whose == Whose::kBelieved) return ClearName(place);
    if (!ReadLink(place, path)) return false;
    if (path.empty()) return true;
    base = place.directory.Get();
  }
  // Only links that became a loop just now: the kernel refused any other before.
  return Fail(ELOOP);
}

bool Counts(const struct stat& found, const Place& place, Whose whose) {
  if (whose == Whose::kBelieved) return Posix::IsBelieved(found, place.directory.Get());
  return S_ISREG(found.st_mode);
}

// Opens the file that the new one takes its access from; `old` comes in closed and stays so when
// there is none. False for what must not be replaced by a file.
bool OpenOld(const Place& place, Whose whose, Descriptor& old) {
  old = OpenAt(place.directory.Get(), place.name, O_PATH | O_NOFOLLOW);
  if (!old.IsOpen()) return errno == ENOENT;
  struct stat found = {};
  if (!StatFile(old, found)) return false;
  if (Counts(found, place, whose)) return true;
  old.Close();
  if (S_ISDIR(found.st_mode)) return Fail(EISDIR);
  if (whose == Whose::kAnybodys) return Fail(EINVAL);
  return true;
}

// The kernel looks first: it refuses what is not to be replaced before anything is touched, and
// links that it would not follow itself.
bool IsReplaceable(const std::string& path) {
  struct stat found = {};
  if (!StatAt(AT_FDCWD, path, 0, found)) return errno == ENOENT;
  if (S_ISREG(found.st_mode)) return true;
  return Fail(S_ISDIR(found.st_mode) ? EISDIR : EINVAL);
}

// The temporary of one writer: from Claim() to Publish() it is locked and under its name; if
// Publish() does not come, it is removed.
class Temporary {
 public:
  Temporary(const Place& where, uid_t ownerOfDocument)
      : place(where), name(TemporaryName(where.name)), owner(ownerOfDocument) {}
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
  Try RemoveFound(int attempt) const;
  bool IsPlanted(const struct stat& found) const;
  Try RemovePlanted(int attempt) const;
  Try RemoveLeftover() const;
  Try Find(struct stat& found) const;
  Try Lock(const Descriptor& opened) const;
  void Remove() const;
  int Directory() const { return place.directory.Get(); }

  const Place& place;
  const std::string name;
  const uid_t owner;
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

bool Temporary::IsPlanted(const struct stat& found) const {
  return !S_ISREG(found.st_mode) || (found.st_uid != geteuid() && found.st_uid != owner);
}

Temporary::Try Temporary::RemoveFound(int attempt) const {
  struct stat found = {};
  const Try result = Find(found);
  if (result != Try::kDone) return result;
  return IsPlanted(found) ? RemovePlanted(attempt) : RemoveLeftover();
}

Temporary::Try Temporary::RemoveLeftover() const {
  // Whatever takes its place before it is opened must neither be followed nor waited for.
  const Descriptor opened = OpenAt(Directory(), name, O_RDONLY | O_NOFOLLOW | Posix::kHarmless);
  if (!opened.IsOpen()) return errno == ENOENT ? Try::kAgain : Try::kFailed;
  const Try locked = Lock(opened);
  if (locked != Try::kDone) return locked;
  return UnlinkAt(Directory(), name) ? Try::kAgain : Try::kFailed;
}

Temporary::Try Temporary::RemovePlanted(int attempt) const {
  const bool locked = TryLock(place.directory);
  if (!locked && errno != EWOULDBLOCK) return Try::kFailed;
  if (!locked && attempt < kPatience) return Try::kBusy;
  struct stat found = {};
  Try result = Find(found);
  if (result == Try::kDone && IsPlanted(found)) {
    const bool isGone =
        S_ISDIR(found.st_mode) ? MoveAway(Directory(), name) : UnlinkAt(Directory(), name);
    if (!isGone) result = Try::kFailed;
  }
  if (result == Try::kDone) result = Try::kAgain;
  return !locked || Unlock(place.directory) ? result : Try::kFailed;
}

bool Temporary::Claim(mode_t mode) {
  for (int attempt = 0; attempt < kMaxAttempts; ++attempt) {
    Try result = Create(mode);
    if (result == Try::kDone) return true;
    if (result == Try::kAgain) result = RemoveFound(attempt);
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

// The owner's read bit stays set until the file is published: another writer of the same user must
// be able to open the temporary.
constexpr mode_t kReadByOwner = S_IRUSR;

bool RemoveReadBit(const Descriptor& file, mode_t mode) {
  return (mode & kReadByOwner) != 0 ||
         (Posix::SetMode(file.Get(), mode & Posix::kModeBits) && Sync(file.Get()));
}

// A new file gets its mode from the kernel (umask, default ACL). What replaces a file is nobody
// else's until it gets the access of that file.
bool Replace(const Place& place, Whose whose, const std::string& text) {
  Descriptor before;
  struct stat state = {};
  state.st_uid = geteuid();
  state.st_mode = 0666;
  if (!OpenOld(place, whose, before) || (before.IsOpen() && !StatFile(before, state))) return false;
  Temporary temporary(place, state.st_uid);
  if (!temporary.Claim(before.IsOpen() ? 0600 : 0666)) return false;
  // While this writer waited for another, the file may have come into being, or changed.
  Descriptor old;
  if (!OpenOld(place, whose, old)) return false;
  if (!old.IsOpen()) old = std::move(before);
  const Descriptor& file = temporary.File();
  if (!Posix::WriteAll(file.Get(), text)) return false;
  if (old.IsOpen() &&
      !(StatFile(old, state) && Posix::CopyAccess(old.Get(), file.Get(), kReadByOwner))) {
    return false;
  }
  return Sync(file.Get()) && temporary.Publish() && RemoveReadBit(file, state.st_mode) &&
         Sync(place.directory.Get());
}

Descriptor OpenDocument(const std::string& path, Whose whose) {
  if (whose == Whose::kBelieved) return Posix::OpenBelieved(path);
  Descriptor file = Posix::Open(path, O_RDONLY | Posix::kHarmless);
  struct stat found = {};
  if (!file.IsOpen() || !StatFile(file, found)) return {};
  if (S_ISREG(found.st_mode)) return file;
  errno = EINVAL;
  return {};
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
  if (!Locate(path, whose, place)) return false;
  return Replace(place, whose, WriteJson(value));
}

}  // namespace KeloDRCore
