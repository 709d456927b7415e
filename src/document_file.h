// Whole documents in files: read at once, replaced in one step.

#ifndef KELODRCORE_SRC_DOCUMENT_FILE_H_
#define KELODRCORE_SRC_DOCUMENT_FILE_H_

#include <string>

namespace KeloDRCore {

// Reads the regular file at `path` to its end. False with errno set; `text` is then unspecified.
bool ReadDocumentFile(const std::string& path, std::string& text);

// Makes `text` the content of the file at `path`, as JsonValue::toFile describes. False with errno
// set.
bool ReplaceDocumentFile(const std::string& path, const std::string& text);

}  // namespace KeloDRCore

#endif  // KELODRCORE_SRC_DOCUMENT_FILE_H_
