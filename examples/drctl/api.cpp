#include "api.h"

#include <kelodrcore/err.h>
#include <kelodrcore/file.h>
#include <kelodrcore/json_value.h>

#include <map>

#include "common/reply.h"
#include "mounts.h"
#include "volume_cache.h"

namespace drctl {

using namespace KeloDRCore;

namespace {

constexpr int kApiVersion = 1;

// A member of the parameters when it has the right type: then `out` takes it. A missing one is
// fine.
bool TakeText(const Json::Value& params, const char* name, std::string& out) {
  if (!params.isMember(name)) return true;
  if (!params[name].isString()) return false;
  out = params[name].asString();
  return true;
}

bool TakeTexts(const Json::Value& params, const char* name, std::vector<std::string>& out) {
  if (!params.isMember(name)) return true;
  if (!params[name].isArray()) return false;
  for (const Json::Value& text : params[name]) {
    if (!text.isString()) return false;
    out.push_back(text.asString());
  }
  return true;
}

bool TakeNumber(const Json::Value& params, const char* name, int& out) {
  if (!params.isMember(name)) return true;
  if (!params[name].isInt() || params[name].asInt() < 0) return false;
  out = params[name].asInt();
  return true;
}

bool TakeBool(const Json::Value& params, const char* name, bool& out) {
  if (!params.isMember(name)) return true;
  if (!params[name].isBool()) return false;
  out = params[name].asBool();
  return true;
}

bool TakeQuery(const Json::Value& params, Query& query) {
  return TakeTexts(params, "filters", query.filters) && TakeTexts(params, "order", query.order) &&
         TakeBool(params, "ascending", query.ascending) &&
         TakeNumber(params, "offset", query.offset) && TakeNumber(params, "limit", query.limit);
}

// A statement ends at a NUL byte, so it never becomes part of one.
bool TakeName(const Json::Value& params, std::string& name) {
  return TakeText(params, "name", name) && !name.empty() && name.find('\0') == std::string::npos;
}

}  // namespace

const Api::Entry Api::kEntries[] = {
    {"Node", "create", &Api::CreateNode},  {"Node", "get", &Api::GetNode},
    {"Node", "list", &Api::ListNodes},     {"Node", "set", &Api::SetNode},
    {"Node", "delete", &Api::DeleteNode},  {"Volume", "list", &Api::ListVolumes},
    {"Volume", "scan", &Api::ScanVolumes}, {"Volume", "poll", &Api::PollVolumes},
    {"System", "info", &Api::SystemInfo},
};

Api::Api(const std::string& db, const std::string& cacheDir, const std::string& stateDir,
         long maxAge)
    : registry(db), tasks(stateDir), volumeCacheDir(cacheDir), volumeMaxAge(maxAge) {}

Json::Value Api::Answer(const std::string& text) {
  Json::Value document;
  if (!JsonValue::fromString(document, text)) {
    return Refuse(ERR::BAD_PARAMETER, "the call is not a JSON document");
  }
  const Request request(document);
  if (!document.isObject() || !request.isValid()) {
    return Refuse(ERR::BAD_PARAMETER, "the call needs the texts api and method and a version");
  }
  return Dispatch(request);
}

Json::Value Api::Dispatch(const Request& request) {
  for (const Entry& entry : kEntries) {
    if (request.getAPI() == entry.api && request.getMethod() == entry.method &&
        request.getVersion() == kApiVersion) {
      return (this->*entry.run)(request.getParams());
    }
  }
  return Refuse(ERR::ERR_NO_SUCH_API, request.toStr());
}

// The reply tells what the registry's recorder holds.
Json::Value Api::Fail() const {
  const Json::Value err = registry.GetErr();
  return reply::Failure(err["err_code"].asInt(), err);
}

Json::Value Api::Refuse(int code, const std::string& why) {
  registry.Fail(code, why);
  return Fail();
}

Json::Value Api::CreateNode(const Json::Value& params) {
  SqliteValueList node;
  node.AddValue("state", "unknown");
  const std::string complaint = FromJson(params, NodeColumns(), node);
  if (!complaint.empty()) return Refuse(ERR::BAD_PARAMETER, complaint);
  return registry.AddNode(node) ? reply::Success(Json::objectValue) : Fail();
}

Json::Value Api::GetNode(const Json::Value& params) {
  std::string name;
  if (!TakeName(params, name)) return Refuse(ERR::BAD_PARAMETER, "name must be a text");
  SqliteValueList node;
  return registry.GetNode(name, node) ? reply::Success(ToJson(node, NodeColumns())) : Fail();
}

Json::Value Api::ListNodes(const Json::Value& params) {
  Query query;
  if (!TakeQuery(params, query)) return Refuse(ERR::BAD_PARAMETER, "a parameter has a wrong type");
  Json::Value data;
  if (!registry.ReadNodes(query, data["nodes"])) return Fail();
  return reply::Success(data);
}

Json::Value Api::SetNode(const Json::Value& params) {
  std::string name;
  if (!TakeName(params, name)) return Refuse(ERR::BAD_PARAMETER, "name must be a text");
  Json::Value changed = params;
  changed.removeMember("name");
  SqliteValueList changes;
  const std::string complaint = FromJson(changed, NodeColumns(), changes);
  if (!complaint.empty()) return Refuse(ERR::BAD_PARAMETER, complaint);
  return registry.SetNode(name, changes) ? reply::Success(Json::objectValue) : Fail();
}

Json::Value Api::DeleteNode(const Json::Value& params) {
  std::string name;
  if (!TakeName(params, name)) return Refuse(ERR::BAD_PARAMETER, "name must be a text");
  return registry.RemoveNode(name) ? reply::Success(Json::objectValue) : Fail();
}

Json::Value Api::ListVolumes(const Json::Value& /*params*/) {
  Source source = Source::kFile;
  Json::Value data;
  data["volumes"] = VolumeCache(volumeCacheDir, volumeMaxAge).ReadVolumes(source);
  data["additional"]["source"] = ToText(source);
  return reply::Success(data);
}

// The registry is opened by its first statement, so none of its connection crosses the fork.
Json::Value Api::ScanVolumes(const Json::Value& /*params*/) {
  const Started task = tasks.Start([this] {
    const Rows volumes = ScanMounts();
    return !volumes.empty() && registry.ReplaceVolumes(volumes);
  });
  if (task.id.empty()) return Refuse(task.code, "the scan is not started: " + task.reason);
  Json::Value data;
  data["task_id"] = task.id;
  return reply::Success(data);
}

Json::Value Api::PollVolumes(const Json::Value& params) {
  std::string id;
  const bool isText = TakeText(params, "task_id", id);
  const TaskState state = isText ? tasks.Poll(id) : TaskState::kUnknown;
  if (state == TaskState::kUnknown) return Refuse(ERR::BAD_PARAMETER, "there is no such task");
  Json::Value data;
  data["task_id"] = id;
  data["finish"] = state != TaskState::kRunning;
  data["success"] = state == TaskState::kSucceeded;
  return reply::Success(data);
}

Json::Value Api::SystemInfo(const Json::Value& /*params*/) {
  std::map<std::string, std::string> settings;
  if (File::Read("/etc/os-release", settings) <= 0) {
    return Refuse(ERR::ERR_UNKNOWN, "the system does not tell");
  }
  Json::Value data(Json::objectValue);
  for (const auto& [key, value] : settings) data[key] = value;
  return reply::Success(data);
}

}  // namespace drctl
