// The APIs that a call can name, and what they answer.

#ifndef DRCTL_API_H_
#define DRCTL_API_H_

#include <json/json.h>
#include <kelodrcore/request.h>

#include <string>

#include "registry.h"
#include "tasks.h"

namespace drctl {

class Api {
 public:
  Api(const std::string& db, const std::string& cacheDir, const std::string& stateDir, long maxAge);

  // The reply to the text of a call, whatever that text is.
  Json::Value Answer(const std::string& text);

  // The reply that refuses a call.
  Json::Value Refuse(int code, const std::string& why);

 private:
  using Method = Json::Value (Api::*)(const Json::Value& params);
  struct Entry {
    const char* api;
    const char* method;
    Method run;
  };
  static const Entry kEntries[];

  Json::Value Dispatch(const KeloDRCore::Request& request);
  Json::Value Fail() const;

  Json::Value CreateNode(const Json::Value& params);
  Json::Value GetNode(const Json::Value& params);
  Json::Value ListNodes(const Json::Value& params);
  Json::Value SetNode(const Json::Value& params);
  Json::Value DeleteNode(const Json::Value& params);
  Json::Value ListVolumes(const Json::Value& params);
  Json::Value ScanVolumes(const Json::Value& params);
  Json::Value PollVolumes(const Json::Value& params);
  Json::Value SystemInfo(const Json::Value& params);

  Registry registry;
  Tasks tasks;
  std::string volumeCacheDir;
  long volumeMaxAge;
};

}  // namespace drctl

#endif  // DRCTL_API_H_
