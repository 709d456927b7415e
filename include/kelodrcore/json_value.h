/// @file
/// JSON documents as text and as files.

#ifndef KELODRCORE_JSON_VALUE_H_
#define KELODRCORE_JSON_VALUE_H_

#include <json/json.h>

#include <string>

#include "kelodrcore/export.h"

/// The text and file forms of a `Json::Value`. JsonCpp reads and writes the text. No function logs,
/// keeps state, depends on the locale of the process or throws anything but `std::bad_alloc`. All
/// may be called from any thread that has 1 MiB of stack, which is enough for 1,000 levels.
namespace KeloDRCore::JsonValue {

/// The document as compact JSON: one line, members in the order of their names, no comments, no
/// newline at the end. Texts are written as the bytes that they hold, UTF-8 or not; only the quote,
/// the backslash and bytes below 0x20 are escaped. Doubles have up to 17 significant digits and
/// read back as the same number. NaN is written as `null` and the infinities as `1e+9999` and
/// `-1e+9999`, because JSON has no such numbers.
[[nodiscard]] KELODR_EXPORT std::string toString(const Json::Value& value);

/// Parses `text` into `value`. Comments and one byte order mark at the start are accepted and
/// dropped. False, with `value` unchanged, for an empty text, a syntax error, a NUL byte anywhere,
/// anything but white space and comments after the document, and more than 1,000 nested levels. It
/// is as lenient as JsonCpp inside the document: `[1,]` is an array of one, and the last of equal
/// member names counts. A number beyond a double's range is refused or infinite, as the version of
/// JsonCpp has it.
KELODR_EXPORT bool fromString(Json::Value& value, const std::string& text);

/// Parses the whole file at `path` into `value`, as `fromString` does, but up to 1,010 levels: a
/// document that was parsed can be put into another one, written and read back. False, with `value`
/// unchanged, when the file is missing, is not a regular file, cannot be read or does not parse. A
/// FIFO is not waited for.
KELODR_EXPORT bool fromFile(Json::Value& value, const std::string& path);

/// Replaces the file at `path` by the text of `value` in one step: a reader sees the old document
/// or the new one, whole, even when the writer is killed or the disk is full.
///
/// The new document goes to a temporary beside the file, which is synced, renamed over the file and
/// made durable with a sync of the directory. A new file gets its mode from the umask. A file that
/// was there keeps its mode, set-id bits included, its owner, its POSIX ACL and its attributes
/// `user.*` and `security.*`.
///
/// A symbolic link is followed: the file that it names is replaced, or created, and the link stays.
/// In a directory like /tmp, which is sticky and writable by all, only a link of the effective user
/// or of the directory's owner is followed (`EACCES`).
///
/// Writers of one file wait for each other, a minute at most (`EBUSY`); each leaves its whole
/// document. Killed writers of one user leave at most one temporary (".NAME.kelodr-UID", a long
/// NAME cut; UID is the writer's effective user id), which that user's next write removes. What
/// another user put at its name is removed; a directory is moved away, to a longer name.
///
/// True once the document is on the disk. False with `errno` telling why, and with the old document
/// in place: no such directory, a path that names something other than a regular file, an owner or
/// attribute that this process may not set, any failed call. There is one exception: when only a
/// step after the rename fails (the sync of the directory), the new document is in place and the
/// result is false all the same.
KELODR_EXPORT bool toFile(const Json::Value& value, const std::string& path);

}  // namespace KeloDRCore::JsonValue

#endif  // KELODRCORE_JSON_VALUE_H_
