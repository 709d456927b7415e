/// @file
/// JSON documents and key=value text in files, directories made as root, and two small path and
/// descriptor questions.

#ifndef KELODRCORE_FILE_H_
#define KELODRCORE_FILE_H_

#include <json/json.h>

#include <map>
#include <string>

#include "kelodrcore/export.h"

/// Free functions on files, without any state. None throws but `std::bad_alloc`; a failure is the
/// result plus one line in the system log. They may be called from any thread, CreateDir()
/// excepted.
namespace KeloDRCore::File {

/// Reads the JSON document at `path` into `value`.
///
/// A missing file is deliberately a success that leaves `value` alone: callers treat it as the
/// absence of a document. The lines are joined without their newlines, which matters only to a
/// string that spans lines.
/// @return false for an empty path, a file that cannot be opened or not be read to its end (the
///     latter not logged), and text that is not one JSON document; `value` is then unchanged.
KELODR_EXPORT bool Read(const std::string& path, Json::Value& value);

/// Reads the JSON document from the current position of `fd` to its end into `value`, and closes
/// `fd`, whatever the result, unless it was not a descriptor open for reading.
///
/// Newlines are kept. The text is taken in pieces of at most one line and 1023 bytes; a NUL byte
/// hides the rest of its piece. A signal does not end the reading.
/// @return false for a descriptor that cannot be read to its end, and for text that is not one JSON
///     document; `value` is then unchanged.
KELODR_EXPORT bool Read(int fd, Json::Value& value);

/// Writes `value` as JSON text to `path`, created (with the permissions that the umask leaves) or
/// truncated, and waits until the data has reached the disk.
///
/// The file is written in place: a reader may meanwhile see a part of it, and a failure leaves what
/// was written. `JsonValue::toFile` replaces a file in one step.
/// @return false for an empty path, and when opening, writing, flushing or syncing fails.
KELODR_EXPORT bool Write(const std::string& path, const Json::Value& value);

/// Writes `value` as JSON text at the current position of `fd`, waits until the data has reached
/// the disk, and closes `fd`, whatever the result, unless it was not a descriptor open for writing.
/// Nothing is truncated.
/// @return false when writing, flushing or syncing fails; a pipe or a socket cannot be synced.
KELODR_EXPORT bool Write(int fd, const Json::Value& value);

/// Makes sure that `path` is a directory, with all its parents, as root: it runs
/// "/bin/mkdir -p PATH -m MODE" with the effective ids raised to 0 and restores them afterwards.
/// The effective ids are those of the whole process, so threads must take turns.
/// @param path the directory; it may be relative.
/// @param mode permission bits of a directory that is created, at most 0777; the umask does not
///     apply to them. One that is there already keeps its own. Parents get those of the umask.
/// @return true also when the directory is there already, whatever `mode` is; false for an empty
///     path (without a log line), a mode out of range, and when mkdir fails. Ids that cannot be
///     raised or restored are logged and change nothing: mkdir runs all the same.
KELODR_EXPORT bool CreateDir(const std::string& path, int mode);

/// Removes the directory `path` with everything in it ("/bin/rm -rf PATH"), with the effective ids
/// of the caller.
/// @return true also when `path` is not a directory, which leaves it alone; false, without a log
///     line, when rm fails.
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
/// value are the first word on their side, white space around them dropped; a side of blanks only
/// is the empty string, or 0. A number is read as far as it is one ("12abc" is 12, "abc" is 0) and
/// one out of range becomes the nearest bound of its type. White space and numbers are those of the
/// classic locale. There are no comments. A line that is empty, has no "=", or has nothing at all
/// on one side of it is logged and skipped.
/// @return -1 for an empty path and for a file that cannot be opened or not be read to its end, 0
///     for a missing file (not logged); `map` is then unchanged. Otherwise `map` holds exactly what
///     was read, and the result is the number of its entries.
template <typename K, typename V>
int Read(const std::string& path, std::map<K, V>& map);

/// Converts `text` to `out` as `stream >> out` does; `<std::string, std::string>` exists.
///
/// The word goes to `out`: leading white space (of the classic locale) is skipped, and the next
/// white space ends it.
/// @return false for an empty `text`, with `out` set to `defaultValue`. True for any other, also
///     when it is all white space, which leaves `out` alone, as `>>` does.
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
