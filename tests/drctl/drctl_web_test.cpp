// The example as a CGI program of a real web server, asked over HTTP.

#include <arpa/inet.h>
#include <kelodrcore/err.h>
#include <kelodrcore/json_value.h>
#include <kelodrcore/response.h>
#include <netinet/in.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include "drctl/locks.h"
#include "drctl/program.h"

namespace {

using namespace KeloDRCore;

constexpr char kServer[] = "/usr/sbin/lighttpd";
constexpr char kClient[] = "/usr/bin/curl";

sockaddr_in Loopback(int port) {
  sockaddr_in address = {};
  address.sin_family = AF_INET;
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  address.sin_port = htons(static_cast<uint16_t>(port));
  return address;
}

// A port that is free now.
int FreePort() {
  const int fd = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
  sockaddr_in address = Loopback(0);
  socklen_t size = sizeof(address);
  const bool isBound = bind(fd, reinterpret_cast<sockaddr*>(&address), size) == 0 &&
                       getsockname(fd, reinterpret_cast<sockaddr*>(&address), &size) == 0;
  close(fd);
  return isBound ? ntohs(address.sin_port) : -1;
}

bool IsListening(int port) {
  const int fd = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
  const sockaddr_in address = Loopback(port);
  const bool isOpen =
      connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof(address)) == 0;
  close(fd);
  return isOpen;
}

class DrctlWebTest : public LocksTest {
 protected:
  void SetUp() override {
    LocksTest::SetUp();
    for (const char* const program : {kServer, kClient}) {
      if (access(program, X_OK) != 0) GTEST_SKIP() << program << " is not installed";
    }
    ASSERT_EQ(mkdir(Path("www").c_str(), 0755), 0);
    WriteText(Path("www/call.cgi"),
              "exec '" + std::string(DRCTL) + "' --db '" + Path("registry.db") + "' call --cgi\n");
    port = FreePort();
    WriteText(Path("server.conf"),
              "server.document-root = \"" + Path("www") + "\"\n" + "server.bind = \"127.0.0.1\"\n" +
                  "server.port = " + std::to_string(port) + "\n" +
                  "server.modules = (\"mod_cgi\")\n" + "server.upload-dirs = (\"" + dir + "\")\n" +
                  "server.errorlog = \"" + Path("server.log") + "\"\n" + "server.max-fds = 2048\n" +
                  "cgi.assign = (\".cgi\" => \"/bin/sh\")\n");
    StartServer();
  }

  void TearDown() override {
    if (server > 0) {
      kill(server, SIGTERM);
      EXPECT_EQ(waitpid(server, nullptr, 0), server);
    }
    LocksTest::TearDown();
  }

  void StartServer() {
    server = fork();
    if (server == 0) {
      execl(kServer, kServer, "-D", "-f", Path("server.conf").c_str(), nullptr);
      _exit(127);
    }
    for (int i = 0; i < 1000 && !IsListening(port); ++i) {
      ASSERT_EQ(waitpid(server, nullptr, WNOHANG), 0) << ReadText(Path("server.log"));
      usleep(10000);
    }
  }

  std::string Url() const { return "http://127.0.0.1:" + std::to_string(port) + "/call.cgi"; }

  Response Post(const std::string& body) {
    const Outcome outcome = RunProgram(dir,
                                       {kClient, "--silent", "--noproxy", "*", "--header",
                                        "Expect:", "--data-binary", "@-", Url()},
                                       body);
    EXPECT_EQ(outcome.status, 0) << outcome.err;
    const Response reply(outcome.out);
    EXPECT_TRUE(reply.isValid()) << outcome.out;
    return reply;
  }

  std::string Nodes() {
    return RunProgram(dir, {DRCTL, "--db", Path("registry.db"), "node", "list", "--json", "--order",
                            "name"})
        .out;
  }

  static std::string CreateCall(const std::string& name) {
    return R"({"api":"Node","method":"create","version":1,"name":")" + name +
           R"(","address":"a","port":80})";
  }

  int port = -1;
  pid_t server = -1;
};

TEST_F(DrctlWebTest, CallsAreAnswered) {
  EXPECT_TRUE(Post(CreateCall("a")).isSuccess());
  EXPECT_EQ(Post(CreateCall("a")).getErrCode(), ERR::ERR_NODE_EXIST);
  const Response reply = Post(R"({"api":"Node","method":"list","version":1})");
  EXPECT_EQ(reply.getDataField("nodes").size(), 1U);
}

// The server waits for the end of a handler's output; a task must not hold that up.
TEST_F(DrctlWebTest, AScanIsStartedAndPolled) {
  if (!CanMakeLocks()) GTEST_SKIP() << kNeedsLocks;
  const std::string id = Post(R"({"api":"Volume","method":"scan","version":1})").getTaskId();
  ASSERT_EQ(id.size(), 36U);
  Response reply;
  do {
    reply = Post(R"({"api":"Volume","method":"poll","version":1,"task_id":")" + id + "\"}");
    ASSERT_TRUE(reply.isSuccess());
  } while (!reply.isPollFinish());
  EXPECT_TRUE(reply.isPollSuccess());
}

TEST_F(DrctlWebTest, TwoHundredCallsAtOnceLoseNothing) {
  constexpr int kCalls = 200;
  std::string config;
  for (int i = 0; i < kCalls; ++i) {
    const std::string number = std::to_string(i);
    WriteText(Path("body-" + number), CreateCall("node" + number));
    if (i > 0) config += "next\n";
    config += "url = " + Url() + "\nnoproxy = *\ndata-binary = @" + Path("body-" + number) +
              "\noutput = " + Path("reply-" + number) + "\n";
  }
  WriteText(Path("calls"), config);
  const Outcome outcome =
      RunProgram(dir, {kClient, "--silent", "--parallel", "--parallel-immediate", "--parallel-max",
                       std::to_string(kCalls), "--config", Path("calls")});
  EXPECT_EQ(outcome.status, 0) << outcome.err;
  for (int i = 0; i < kCalls; ++i) {
    const Response reply(ReadText(Path("reply-" + std::to_string(i))));
    EXPECT_TRUE(reply.isSuccess()) << i << ReadText(Path("reply-" + std::to_string(i)));
  }
  Json::Value nodes;
  ASSERT_TRUE(JsonValue::fromString(nodes, Nodes()));
  EXPECT_EQ(nodes.size(), unsigned{kCalls});
}

TEST_F(DrctlWebTest, HostileBodiesGetAnErrorAndChangeNothing) {
  ASSERT_TRUE(Post(CreateCall("a")).isSuccess());
  const std::string before = Nodes();
  const std::string bodies[] = {
      "",
      "not JSON",
      "[]",
      "\xff\xfe",
      std::string("{}\0", 3),
      std::string(100000, '['),
      std::string(50 << 20, 'x'),
      CreateCall(std::string(50 << 20, 'n')),
      R"({"api":"Node","method":"create","version":1,"name":[],"address":{},"port":"80"})",
      R"({"api":{},"method":[],"version":null})",
      R"({"api":"Node","method":"delete","version":1,"name":"' OR '1'='1"})",
      R"({"api":"Node","method":"set","version":1,"name":"'; DROP TABLE node; --","port":1})",
      R"({"api":"Node","method":"list","version":1,"order":["name; DROP TABLE node"]})",
      R"({"api":"Node","method":"list","version":1,"filters":["name=a' UNION SELECT 1","x=1"]})",
  };
  for (const std::string& body : bodies) {
    const Response reply = Post(body);
    EXPECT_FALSE(reply.isSuccess()) << body.substr(0, 80);
    EXPECT_GT(reply.getErrCode(), ERR::ERR_DR_MIN) << body.substr(0, 80);
    EXPECT_EQ(Nodes(), before) << body.substr(0, 80);
  }
}

}  // namespace
