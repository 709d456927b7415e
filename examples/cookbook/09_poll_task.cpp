#include <kelodrcore/json_value.h>
#include <kelodrcore/request.h>
#include <kelodrcore/response.h>
#include <kelodrcore/utils.h>

#include <iostream>

using namespace KeloDRCore;

// In place of HTTP, which is the program's own business: the server's answer to a call's text. Its
// task ends when it has been asked for the third time.
std::string Send(const std::string& text) {
  Json::Value call;
  JsonValue::fromString(call, text);
  const Request request(call);
  if (request.getMethod() == "start") return R"({"success": true, "data": {"task_id": "T1"}})";
  static int polls = 0;
  if (++polls < 3) return R"({"success": true, "data": {"finish": false, "progress": "half"}})";
  return R"({"success": true, "data": {"finish": true, "success": true,
             "additional": {"copied": 12}}})";
}

Response Call(const std::string& method, const Json::Value& params) {
  return Send(JsonValue::toString(Request("Copy", 1, method, params).toJson()));
}

int main() {
  constexpr int kMaxPolls = 100;
  const Response started = Call("start", Json::Value());
  if (!started.isSuccess()) {
    std::cout << "not started, error " << started.getErrCode() << '\n';
    return 1;
  }
  Json::Value params;
  params["task_id"] = started.getTaskId();
  std::cout << "started " << started.getTaskId() << '\n';

  for (int poll = 0; poll < kMaxPolls; ++poll) {
    const Response reply = Call("poll", params);
    if (!reply.isSuccess()) {  // the call failed, which says nothing of the task
      std::cout << "error " << reply.getErrCode() << '\n';
      return 1;
    }
    if (reply.isPollFinish()) {
      std::cout << (reply.isPollSuccess() ? "done, copied " : "failed ")
                << reply.getAdditional()["copied"] << '\n';
      return reply.isPollSuccess() ? 0 : 1;
    }
    std::cout << reply.getDataFieldtoStr("progress") << '\n';
    RandomSleepInMSec(50, 100);
  }
  std::cout << "still running after " << kMaxPolls << " polls\n";
  return 1;
}
