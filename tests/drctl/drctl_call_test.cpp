// The example's web API handler: every call document gets one reply document.

#include <fcntl.h>
#include <kelodrcore/err.h>
#include <kelodrcore/json_value.h>
#include <kelodrcore/request.h>
#include <kelodrcore/response.h>
#include <sys/stat.h>

#include "drctl/locks.h"
#include "drctl/program.h"

namespace {

using namespace KeloDRCore;

class DrctlCallTest : public LocksTest {
 protected:
  std::vector<std::string> Program() { return {DRCTL, "--db", Path("registry.db"), "call"}; }

  // The reply to the text of a call; the exit status says whether it succeeded.
  Response Call(const std::string& text) {
    const Outcome outcome = RunProgram(dir, Program(), text);
    const Response reply(outcome.out);
    EXPECT_TRUE(reply.isValid()) << outcome.out << outcome.err;
    EXPECT_EQ(outcome.status, reply.isSuccess() ? 0 : 1);
    return reply;
  }

  Response Call(const std::string& api, const std::string& method,
                const std::string& params = "{}") {
    Json::Value parameters;
    EXPECT_TRUE(JsonValue::fromString(parameters, params));
    return Call(JsonValue::toString(Request(api, 1, method, parameters).toJson()));
  }

  // Expects an error reply with this code, under its name, and details.
  void ExpectError(const Response& reply, int code) {
    EXPECT_FALSE(reply.isSuccess());
    EXPECT_EQ(reply.getErrCode(), code);
    EXPECT_EQ(reply.getErrMsg()["err_code_str"], ERR::ToString(code));
    EXPECT_NE(reply.getErrMsg()["err_msg"], Json::Value());
    EXPECT_FALSE(reply.hasData());
  }

  void CreateNode(const std::string& name) {
    ASSERT_TRUE(Call("Node", "create", "{\"name\":\"" + name + "\",\"address\":\"a\",\"port\":80}")
                    .isSuccess());
  }
};

TEST_F(DrctlCallTest, ANodeLivesThroughAllMethods) {
  CreateNode("a");
  const Json::Value created = Call("Node", "get", R"({"name":"a"})").getData();
  EXPECT_EQ(created["address"], "a");
  EXPECT_EQ(created["port"], 80);
  EXPECT_EQ(created["state"], "unknown");
  EXPECT_TRUE(Call("Node", "set", R"({"name":"a","port":81,"state":"on"})").isSuccess());
  const Response listed = Call("Node", "list");
  ASSERT_EQ(listed.getDataField("nodes").size(), 1U);
  EXPECT_EQ(listed.getDataField("nodes")[0]["port"], 81);
  EXPECT_EQ(listed.getDataField("nodes")[0]["address"], "a");
  EXPECT_TRUE(Call("Node", "delete", R"({"name":"a"})").isSuccess());
  EXPECT_EQ(Call("Node", "list").getDataField("nodes").size(), 0U);
}

TEST_F(DrctlCallTest, ListTakesFiltersOrderAndLimit) {
  CreateNode("a");
  CreateNode("b");
  CreateNode("c");
  const Response reply = Call("Node", "list",
                              R"({"filters":["name!=b"],"order":["name"],"ascending":false,
                                  "limit":1,"offset":1})");
  ASSERT_EQ(reply.getDataField("nodes").size(), 1U);
  EXPECT_EQ(reply.getDataField("nodes")[0]["name"], "a");
}

TEST_F(DrctlCallTest, ASecondNodeOfTheNameExists) {
  CreateNode("a");
  ExpectError(Call("Node", "create", R"({"name":"a","address":"b","port":1})"),
              ERR::ERR_NODE_EXIST);
}

TEST_F(DrctlCallTest, AnUnknownNodeDoesNotExist) {
  for (const char* const method : {"get", "set", "delete"}) {
    ExpectError(Call("Node", method, R"({"name":"a"})"), ERR::ERR_NODE_NOT_EXIST);
    EXPECT_EQ(NamesIn(dir), std::vector<std::string>{});
  }
}

TEST_F(DrctlCallTest, UnknownApisMethodsAndVersionsAreNoSuchApi) {
  ExpectError(Call("Nodes", "list"), ERR::ERR_NO_SUCH_API);
  ExpectError(Call("Node", "zap"), ERR::ERR_NO_SUCH_API);
  ExpectError(Call("node", "list"), ERR::ERR_NO_SUCH_API);
  ExpectError(Call(R"({"api":"Node","method":"list","version":2})"), ERR::ERR_NO_SUCH_API);
}

TEST_F(DrctlCallTest, MalformedCallsAreBadParameters) {
  for (const char* const text :
       {"", "x", "[]", "null", "7", "{", "{}", R"({"api":"Node"})",
        R"({"api":"Node","method":"list"})", R"({"api":"Node","method":"list","version":0})",
        R"({"api":"Node","method":"list","version":"1"})", R"({"api":1,"method":2,"version":1})",
        R"({"api":"Node","method":"list","version":1} {})"}) {
    ExpectError(Call(text), ERR::BAD_PARAMETER);
  }
  ExpectError(Call(std::string(5000, '[')), ERR::BAD_PARAMETER);
}

TEST_F(DrctlCallTest, WrongTypesInAnyParameterAreBadParameters) {
  CreateNode("a");
  const std::string whole = R"({"name":"b","address":"x","port":1,"state":"s"})";
  for (const char* const name : {"name", "address", "port", "state"}) {
    for (const char* const wrong :
         {"null", "true", "[]", "{}", "1.5", "-1", "\"\"", "\"\\u0000\"", "99999999999999999999"}) {
      Json::Value params;
      ASSERT_TRUE(JsonValue::fromString(params, whole));
      ASSERT_TRUE(JsonValue::fromString(params[name], wrong));
      ExpectError(Call("Node", "create", JsonValue::toString(params)), ERR::BAD_PARAMETER);
    }
  }
  for (const char* const params :
       {R"({"limit":"x"})", R"({"offset":-1})", R"({"order":"name"})", R"({"filters":[1]})",
        R"({"ascending":1})", R"({"order":["bogus"]})", R"({"filters":["a=b=c"]})",
        R"({"filters":["name=a\u0000"]})"}) {
    ExpectError(Call("Node", "list", params), ERR::BAD_PARAMETER);
  }
  ExpectError(Call("Node", "set", R"({"name":"a","bogus":1})"), ERR::BAD_PARAMETER);
  EXPECT_EQ(Call("Node", "list").getDataField("nodes").size(), 1U);
}

TEST_F(DrctlCallTest, SqlInEveryTextIsOnlyText) {
  const std::string sql = "'; DROP TABLE node; --";
  ASSERT_TRUE(Call("Node", "create",
                   "{\"name\":\"" + sql + "\",\"address\":\"" + sql + "\",\"port\":1,\"state\":\"" +
                       sql + "\"}")
                  .isSuccess());
  const Json::Value node = Call("Node", "get", "{\"name\":\"" + sql + "\"}").getData();
  EXPECT_EQ(node["name"], sql);
  EXPECT_EQ(node["address"], sql);
  EXPECT_EQ(node["state"], sql);
}

TEST_F(DrctlCallTest, VolumesComeThroughTheCache) {
  if (!CanMakeLocks()) GTEST_SKIP() << kNeedsLocks;
  const Response first = Call("Volume", "list");
  EXPECT_GT(first.getDataField("volumes").size(), 0U);
  EXPECT_EQ(first.getAdditional()["source"], "a fresh scan");
  const Response second = Call("Volume", "list");
  EXPECT_EQ(second.getAdditional()["source"], "the cache file");
  EXPECT_EQ(second.getDataField("volumes"), first.getDataField("volumes"));
}

TEST_F(DrctlCallTest, AScanIsPolledUntilItHasSucceeded) {
  if (!CanMakeLocks()) GTEST_SKIP() << kNeedsLocks;
  const std::string id = Call("Volume", "scan").getTaskId();
  ASSERT_EQ(id.size(), 36U);
  Response reply;
  do {
    reply = Call("Volume", "poll", "{\"task_id\":\"" + id + "\"}");
    ASSERT_TRUE(reply.isSuccess());
    EXPECT_EQ(reply.getTaskId(), id);
  } while (!reply.isPollFinish());
  EXPECT_TRUE(reply.isPollSuccess());
  const Outcome listed =
      RunProgram(dir, {DRCTL, "--db", Path("registry.db"), "volume", "list", "--json"});
  EXPECT_NE(listed.out.find("\"mount_point\":"), std::string::npos);
}

TEST_F(DrctlCallTest, ATaskWhoseProcessDiedHasFailed) {
  if (!CanMakeLocks()) GTEST_SKIP() << kNeedsLocks;
  const std::string id = "00000000-0000-4000-8000-000000000000";
  ASSERT_EQ(mkdir(Path("registry.db.tasks").c_str(), 0700), 0);
  WriteText(Path("registry.db.tasks/" + id + ".json"), R"({"finish":false,"success":false})");
  const Response reply = Call("Volume", "poll", "{\"task_id\":\"" + id + "\"}");
  EXPECT_TRUE(reply.isPollFinish());
  EXPECT_FALSE(reply.isPollSuccess());
}

TEST_F(DrctlCallTest, TasksOfYesterdayAreForgotten) {
  if (!CanMakeLocks()) GTEST_SKIP() << kNeedsLocks;
  const std::string old = Call("Volume", "scan").getTaskId();
  const std::string file = Path("registry.db.tasks/" + old + ".json");
  while (!Call("Volume", "poll", "{\"task_id\":\"" + old + "\"}").isPollFinish()) {
  }
  const timespec longAgo[2] = {{1000, 0}, {1000, 0}};
  ASSERT_EQ(utimensat(AT_FDCWD, file.c_str(), longAgo, 0), 0);
  const std::string fresh = Call("Volume", "scan").getTaskId();
  ExpectError(Call("Volume", "poll", "{\"task_id\":\"" + old + "\"}"), ERR::BAD_PARAMETER);
  while (!Call("Volume", "poll", "{\"task_id\":\"" + fresh + "\"}").isPollFinish()) {
  }
}

TEST_F(DrctlCallTest, AScanThatCannotStartTellsTheReason) {
  WriteText(Path("registry.db.tasks"), "a file where the directory should be");
  const Response reply = Call("Volume", "scan");
  ExpectError(reply, ERR::ERR_UNKNOWN);
  EXPECT_EQ(reply.getErrMsg()["err_msg"], "the scan is not started: the directory " +
                                              Path("registry.db.tasks") + " cannot be made");
}

TEST_F(DrctlCallTest, UnknownTasksAreBadParameters) {
  for (const char* const id :
       {R"("")", R"("../registry")", R"("00000000-0000-4000-8000-000000000001")", "7", "null"}) {
    ExpectError(Call("Volume", "poll", std::string("{\"task_id\":") + id + "}"),
                ERR::BAD_PARAMETER);
  }
}

TEST_F(DrctlCallTest, SystemInfoTellsTheSystem) {
  EXPECT_NE(Call("System", "info").getDataFieldtoStr("NAME"), "");
}

TEST_F(DrctlCallTest, ACallCanComeFromAFile) {
  WriteText(Path("call.json"), R"({"api":"Node","method":"list","version":1})");
  std::vector<std::string> arguments = Program();
  arguments.insert(arguments.end(), {"--file", Path("call.json")});
  EXPECT_TRUE(Response(RunProgram(dir, arguments).out).isSuccess());
  arguments.back() = Path("none.json");
  ExpectError(Response(RunProgram(dir, arguments).out), ERR::BAD_PARAMETER);
}

class DrctlCgiTest : public DrctlCallTest {
 protected:
  // Splits what the CGI program printed into its status line and the reply.
  std::string RunCgi(const std::string& body, const std::vector<std::string>& environment) {
    std::vector<std::string> arguments = Program();
    arguments.emplace_back("--cgi");
    const Outcome outcome = RunProgram(dir, arguments, body, environment);
    EXPECT_EQ(outcome.status, 0);
    const size_t end = outcome.out.find("\r\n\r\n");
    EXPECT_NE(end, std::string::npos) << outcome.out;
    head = outcome.out.substr(0, end);
    const std::string text = outcome.out.substr(end + 4);
    EXPECT_NE(head.find("Content-Type: application/json"), std::string::npos) << head;
    EXPECT_NE(head.find("Content-Length: " + std::to_string(text.size())), std::string::npos);
    reply.setResp(text);
    EXPECT_TRUE(reply.isValid()) << text;
    return head.substr(0, head.find("\r\n"));
  }

  std::string head;
  Response reply;
};

TEST_F(DrctlCgiTest, APostIsAnswered) {
  const std::string body = R"({"api":"Node","method":"list","version":1})";
  const std::string length = "CONTENT_LENGTH=" + std::to_string(body.size());
  EXPECT_EQ(RunCgi(body, {"REQUEST_METHOD=POST", length}), "Status: 200 OK");
  EXPECT_TRUE(reply.isSuccess());
  // No byte beyond the announced length is looked at.
  EXPECT_EQ(RunCgi(body + "trailing", {"REQUEST_METHOD=POST", length}), "Status: 200 OK");
  EXPECT_TRUE(reply.isSuccess());
}

TEST_F(DrctlCgiTest, AnythingButAPostIsRefused) {
  EXPECT_EQ(RunCgi("", {"REQUEST_METHOD=GET"}), "Status: 405 Method Not Allowed");
  EXPECT_NE(head.find("\r\nAllow: POST\r\n"), std::string::npos) << head;
  ExpectError(reply, ERR::BAD_PARAMETER);
}

TEST_F(DrctlCgiTest, TheLengthMustBeANumberWithinBounds) {
  for (const char* const length : {"CONTENT_LENGTH=", "CONTENT_LENGTH=x", "CONTENT_LENGTH=-1",
                                   "CONTENT_LENGTH=99999999999999999999999"}) {
    EXPECT_EQ(RunCgi("{}", {"REQUEST_METHOD=POST", length}), "Status: 411 Length Required");
    ExpectError(reply, ERR::BAD_PARAMETER);
  }
  EXPECT_EQ(RunCgi("{}", {"REQUEST_METHOD=POST", "CONTENT_LENGTH=1048577"}),
            "Status: 413 Payload Too Large");
  ExpectError(reply, ERR::BAD_PARAMETER);
}

TEST_F(DrctlCgiTest, ABodyThatIsCutShortIsRefused) {
  EXPECT_EQ(RunCgi("{}", {"REQUEST_METHOD=POST", "CONTENT_LENGTH=3"}), "Status: 400 Bad Request");
  ExpectError(reply, ERR::BAD_PARAMETER);
}

}  // namespace
