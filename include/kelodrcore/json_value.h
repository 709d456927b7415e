/// @file
/// JSON documents as text and as files.

#ifndef KELODRCORE_JSON_VALUE_H_
#define KELODRCORE_JSON_VALUE_H_

#include <json/json.h>

#include <string>

#include "kelodrcore/export.h"

/// The text and file forms of a `Json::Value`. No function of this namespace logs, keeps state or
/// lets out an exception other than `std::bad_alloc`; none depends on the locale of the process.
/// Arguments may alias: a text or path may be part of the value that is replaced.
namespace KeloDRCore::JsonValue {

/// The document as compact JSON: one line, members in the order of their names, no comments, no
/// newline at the end. Text is written as the bytes that it holds, UTF-8 or not; only the quote,
/// the backslash and bytes below 0x20 are escaped. Doubles have up to 17 significant digits and
/// read back as the same number; NaN is written as `null` and the infinities as `1e+9999` and
/// `-1e+9999`, as JsonCpp does, because JSON has no such numbers.
[[nodiscard]] KELODR_EXPORT std::string toString(const Json::Value& value);

/// Parses `text` into `value`. Comments are accepted and dropped. False, with `value` unchanged,
/// for an empty text, a syntax error, anything but white space and comments after the document (a
/// NUL byte too) and documents nested deeper than 1,000 levels. Inside the document it is as
/// lenient as JsonCpp: `[1,]` is an array of one, and the last of equal member names counts.
KELODR_EXPORT bool fromString(Json::Value& value, const std::string& text);

/// Parses the whole file at `path` into `value`, as `fromString` does. False, with `value`
/// unchanged, when the file is missing, is not a regular file, cannot be read or does not parse.
KELODR_EXPORT bool fromFile(Json::Value& value, const std::string& path);

}  // namespace KeloDRCore::JsonValue

#endif  // KELODRCORE_JSON_VALUE_H_
