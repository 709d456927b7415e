/// @file
/// JSON documents and key=value text in files, directories made as root, and two small questions
/// about paths and descriptors. What is called deliberate here is frozen.

#ifndef KELODRCORE_FILE_H_
#define KELODRCORE_FILE_H_

#include <json/json.h>

#include <map>
#include <string>

#include "kelodrcore/export.h"

/// Free functions on files, without any state. None throws anything but `std::bad_alloc`; a failure
/// is the result plus one line in the system log, unless it says otherwise.
///
/// All may be called from any thread, except `CreateDir`: it raises the effective ids of the whole
/// process to 0 for a moment, so threads must take turns, and other threads and signal handlers see
/// the raised ids.
namespace KeloDRCore::File {

/// Reads the JSON document at `path` into `value`. The lines are joined without their newlines,
/// which matters only to a string that spans lines.
///
/// A missing file is deliberately a success that leaves `value` alone: callers treat it as the
/// absence of a document. False, with `value` unchanged, for an empty path, a file that cannot be
/// opened and, not logged, for what is not a regular file, a file that cannot be read to its end
/// and text that is not one JSON document. Documents nest up to 1,010 levels, as for
/// `JsonValue::fromFile`.
KELODR_EXPORT bool Read(const std::string& path, Json::Value& value);

/// Reads the JSON document from the current position of `fd` to its end into `value`. Closes `fd`,
/// whatever the result, unless it was not a descriptor open for reading.
///
/// Newlines are kept. A NUL byte deliberately hides the rest of its piece; a piece is at most one
/// line and 1023 bytes. A signal does not end the reading. Documents nest up to 1,010 levels.
/// False, with `value` unchanged, for a descriptor that cannot be read to its end and for text that
/// is not one JSON document.
KELODR_EXPORT bool Read(int fd, Json::Value& value);

/// Writes `value` as JSON text to `path`, created (with the permissions that the umask leaves) or
/// truncated, and waits until the data has reached the disk.
///
/// The file is written in place: a reader may meanwhile see a part of it, and a failure leaves what
/// was written. `JsonValue::toFile` replaces a file in one step. False for an empty path, and when
/// opening, writing, flushing or syncing fails.
KELODR_EXPORT bool Write(const std::string& path, const Json::Value& value);

/// Writes `value` as JSON text at the current position of `fd` and waits until the data has reached
/// the disk. Nothing is truncated. Closes `fd`, whatever the result, unless it was not a descriptor
/// open for writing. False when writing, flushing or syncing fails; a pipe or a socket cannot be
/// synced.
KELODR_EXPORT bool Write(int fd, const Json::Value& value);

/// Makes sure that `path` is a directory, with all its parents, as root: it runs
/// "/bin/mkdir -p PATH -m MODE" with the effective ids raised to 0 and restores them afterwards.
///
/// `mode` is the permission bits of a directory that is created, at most 0777; the umask does not
/// apply to them. A directory that is there keeps its own. Parents get those of the umask.
///
/// True also when the directory is there already, whatever `mode` is. False for an empty path (not
/// logged), a mode out of range, and when mkdir fails. Ids that cannot be raised or restored are
/// logged and change nothing: mkdir runs all the same.
KELODR_EXPORT bool CreateDir(const std::string& path, int mode);

/// Removes the directory `path` with everything in it ("/bin/rm -rf PATH"), with the effective ids
/// of the caller. True also when `path` is not a directory, which leaves it alone. False when rm
/// fails (not logged).
KELODR_EXPORT bool RemoveDir(const std::string& path);

/// What stands before the last "/" of `path`: "/a/b/" gives "/a/b", "/file" the empty string, and a
/// path without a slash is returned whole. Nothing is normalised.
[[nodiscard]] KELODR_EXPORT std::string GetParentDir(const std::string& path);

/// Whether `fd` is open on a regular file; false for a number that is not an open descriptor.
[[nodiscard]] KELODR_EXPORT bool IsRegularFile(int fd);

/// Reads a text file of key=value lines into `map`; `<std::string, std::string>`,
/// `<std::string, int>` and `<std::string, double>` exist.
///
/// A line is split at its first "="; a later line replaces an earlier one of the same key. Key and
/// value are the first word on their side, without the white space around it. A side that holds
/// only white space gives "" (0 for a number). A number is read as far as it is one ("12abc" is 12,
/// "abc" is 0) and one out of range becomes the nearest bound of its type. White space and numbers
/// are those of the classic locale. There are no comments. A line that is empty, has no "=", or has
/// nothing at all on one side of it is logged and skipped.
///
/// The result is the number of entries of `map`, which then holds exactly what was read; 0 for a
/// missing file (not logged) and for a directory, and -1 for an empty path, for a file that cannot
/// be opened or read to its end, and for anything else that is not a regular file, with `map`
/// unchanged.
template <typename K, typename V>
int Read(const std::string& path, std::map<K, V>& map);

/// Converts `text` to `out` as `stream >> out` does; `<std::string, std::string>` exists.
///
/// The first word of `text` goes to `out`; white space is that of the classic locale. False for an
/// empty `text`, with `out` set to `defaultValue`. True for any other, also when it is all white
/// space, which leaves `out` alone, as `>>` does.
template <typename K, typename V>
bool toType(const K& text, V& out, const V& defaultValue);

/// @cond
extern template KELODR_EXPORT int Read(const std::string&, std::map<std::string, std::string>&);
extern template KELODR_EXPORT int Read(const std::string&, std::map<std::string, int>&);
extern template KELODR_EXPORT int Read(const std::string&, std::map<std::string, double>&);
extern template KELODR_EXPORT bool toType(const std::string&, std::string&, const std::string&);
/// @endcond

}  // namespace KeloDRCore::File

#endif  // KELODRCORE_FILE_H_
