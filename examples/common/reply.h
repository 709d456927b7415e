// The replies of a web API handler, in the form that KeloDRCore::Response reads.

#ifndef EXAMPLES_COMMON_REPLY_H_
#define EXAMPLES_COMMON_REPLY_H_

#include <json/json.h>

namespace reply {

inline Json::Value Success(const Json::Value& data) {
  Json::Value reply;
  reply["success"] = true;
  reply["data"] = data;
  return reply;
}

// `errors` is the detail that the caller shows: a sentence, or the document of `SqliteDB::GetErr`.
inline Json::Value Failure(int code, const Json::Value& errors) {
  Json::Value reply;
  reply["success"] = false;
  reply["error"]["code"] = code;
  reply["error"]["errors"] = errors;
  return reply;
}

}  // namespace reply

#endif  // EXAMPLES_COMMON_REPLY_H_
