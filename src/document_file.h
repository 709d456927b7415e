// JSON documents in files: read at once, replaced in one step.

#ifndef KELODRCORE_SRC_DOCUMENT_FILE_H_
#define KELODRCORE_SRC_DOCUMENT_FILE_H_

#include <json/forwards.h>

#include <string>

namespace KeloDRCore {

// Whose file counts at the name of a document.
enum class Whose {
  kAnybodys,  // as JsonValue::fromFile and toFile describe; links are followed
  kBelieved,  // only a believed one (posix/trust.h); what else stands at the name counts as none
};

// Parses the document of the file at `path` into `value`. False with `value` unchanged.
bool ReadDocument(Json::Value& value, const std::string& path, Whose whose);

// Makes `value` the document of the file at `path`. A file that counts keeps its owner and mode.
// `kBelieved` replaces what stands at the name, a link included, by a new file of the writer's.
// False with errno set.
bool ReplaceDocument(const Json::Value& value, const std::string& path, Whose whose);

}  // namespace KeloDRCore

#endif  // KELODRCORE_SRC_DOCUMENT_FILE_H_
