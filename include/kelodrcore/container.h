/// @file
/// Vectors to JSON arrays and to joined text.
///
/// Deliberate, and frozen because callers rely on it: a number contributes one raw character to a
/// text, not its digits.

#ifndef KELODRCORE_CONTAINER_H_
#define KELODRCORE_CONTAINER_H_

#include <json/json.h>

#include <string>
#include <vector>

#include "kelodrcore/export.h"

/// Conversions of vectors, for the element types `std::string`, `int`, `bool` and `double`; other
/// types do not link.
namespace KeloDRCore::Container {

/// The elements in order as a JSON array of strings, ints, booleans or reals; an empty vector gives
/// an empty array, not null.
template <typename T>
[[nodiscard]] KELODR_EXPORT Json::Value ToJsonArray(const std::vector<T>& values);

/// The elements in order as one text. The separator is written before an element only when the
/// text so far is not empty: empty texts at the start leave no separators behind.
///
/// A `std::string` contributes itself. A number contributes one raw character: an `int` its low
/// eight bits, a `bool` the byte 1 or 0, a `double` its integral part modulo 256 (the byte 0 for
/// NaN and infinities).
template <typename T>
[[nodiscard]] KELODR_EXPORT std::string ToString(const std::vector<T>& values,
                                                 const std::string& separator);

}  // namespace KeloDRCore::Container

#endif  // KELODRCORE_CONTAINER_H_
