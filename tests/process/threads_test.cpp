// Different threads use different objects at once. ThreadSanitizer judges it: scripts/test.sh tsan.

#include <sys/file.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <filesystem>
#include <functional>
#include <map>
#include <thread>

#include "kelodrcore/cache.h"
#include "kelodrcore/container.h"
#include "kelodrcore/err.h"
#include "kelodrcore/file.h"
#include "kelodrcore/file_lock.h"
#include "kelodrcore/json_value.h"
#include "kelodrcore/request.h"
#include "kelodrcore/response.h"
#include "kelodrcore/sqlite_db.h"
#include "kelodrcore/utils.h"
#include "support/clean_test.h"
#include "support/process.h"

namespace {

namespace File = KeloDRCore::File;
namespace JsonValue = KeloDRCore::JsonValue;
using KeloDRCore::Cache;
using KeloDRCore::FileLock;
using KeloDRCore::InsertCommand;
using KeloDRCore::Request;
using KeloDRCore::Response;
using KeloDRCore::SelectCommand;
using KeloDRCore::SqliteAnd;
using KeloDRCore::SqliteDB;
using KeloDRCore::SqliteEqual;
using KeloDRCore::SqliteIsNull;
using KeloDRCore::SqliteTableHandler;
using KeloDRCore::SqliteValueList;

constexpr int kThreads = 8;
constexpr int kRounds = 10;

class ThreadCache : public Cache {
 public:
  using Cache::Cache;
  Json::Value GetInfo() const override { return "thread"; }
  bool IsValidData(const Json::Value& data) const override { return !data.isNull(); }
  bool GetUpdatedData(Json::Value& out) const override {
    out = 1;
    return true;
  }
};

// Threads change no effective id as long as it is root's; the privilege bracket is the process's.
class ThreadsTest : public CleanTest {
 protected:
  using Work = std::function<void(int thread)>;

  void SetUp() override {
    CleanTest::SetUp();
    if (!CanLock()) GTEST_SKIP() << "the lock directory is another user's";
  }

  void TearDown() override {
    std::error_code error;
    std::filesystem::remove_all("/tmp/.kelodr_lock" + dir, error);
    LogCapture::Clear();
    CleanTest::TearDown();
  }

  // Each thread does each work in each round; all start together.
  static void RunInThreads(const std::vector<Work>& works) {
    std::atomic<int> ready{0};
    std::vector<std::thread> threads;
    for (int number = 0; number < kThreads; ++number) {
      threads.emplace_back([&works, &ready, number] {
        for (++ready; ready < kThreads;) std::this_thread::yield();
        for (int round = 0; round < kRounds; ++round) {
          for (const Work& work : works) work(number);
        }
      });
    }
    for (std::thread& thread : threads) thread.join();
  }

  std::string Own(const std::string& name, int thread) const {
    return Path(name + std::to_string(thread));
  }

  void UseJson(int thread) const {
    Json::Value document;
    document["text"] = std::string(100, 'x');
    document["number"] = thread;
    Json::Value copy;
    EXPECT_TRUE(JsonValue::fromString(copy, JsonValue::toString(document)));
    EXPECT_EQ(copy, document);
    EXPECT_TRUE(JsonValue::toFile(document, Own("json", thread)));
    EXPECT_TRUE(JsonValue::fromFile(copy, Own("json", thread)));
    EXPECT_TRUE(JsonValue::toFile(document, Path("json")));  // everybody's
    EXPECT_TRUE(JsonValue::fromFile(copy, Path("json")));
    EXPECT_EQ(copy["text"], document["text"]);
  }

  void UseFiles(int thread) const {
    Json::Value document;
    EXPECT_TRUE(File::Write(Own("file", thread), thread));
    EXPECT_TRUE(File::Read(Own("file", thread), document));
    EXPECT_EQ(document, thread);
    WriteText(Own("map", thread), "a=1\nb=2\nnoise\n");
    std::map<std::string, int> map;
    EXPECT_EQ(File::Read(Own("map", thread), map), 2);
  }

  void UseDirectories(int thread) const {
    EXPECT_TRUE(File::CreateDir(Own("dir", thread) + "/below", 0700));
    EXPECT_TRUE(File::RemoveDir(Own("dir", thread)));
  }

  void UseLock(const std::string& name) const {
    FileLock lock(Path(name));
    EXPECT_TRUE(lock.lock(LOCK_EX, 5));
    lock.unlock();
  }

  static void UseDatabase(const std::string& path, int thread) {
    SqliteDB db(path, 100, "thread");
    const SqliteTableHandler table("t" + std::to_string(thread), "n INTEGER, text TEXT");
    InsertCommand insert;
    insert.SetTable(table);
    insert.AddFieldValue("n", thread);
    insert.AddFieldValue("text", "it's");
    EXPECT_TRUE(db.InsertRecord(insert)) << db.GetErr();
    SelectCommand select;
    select.SetTable(table);
    select.SelectAll();
    select.SetCondition(SqliteAnd(SqliteEqual("n", thread), SqliteIsNull("NULL")));
    std::vector<SqliteValueList> rows;
    EXPECT_TRUE(db.SelectRecords(select, rows)) << db.GetErr();
    EXPECT_FALSE(rows.empty());
    EXPECT_FALSE(db.Exec("nonsense"));
  }

  void UseCache(int thread) const {
    const ThreadCache cache(Path("cache"), std::to_string(thread), 1000, true, 0);
    EXPECT_TRUE(cache.Update());
    EXPECT_EQ(cache.Read(), 1);
  }

  static void UseMessages(int thread) {
    Request request("api", thread + 1, "get", Json::Value());
    EXPECT_TRUE(request.addParam("id", thread));
    Response response(R"({"success":true,"data":{"task_id":")" + request.toStr() + "\"}}");
    EXPECT_EQ(response.getTaskId(), request.toStr());
    EXPECT_TRUE(response.getField("none").isNull());
  }

  static void UseUtilities(int thread) {
    KeloDRCore::RandomSleepInMSec(0, 1);
    EXPECT_EQ(KeloDRCore::ERR::ToString(KeloDRCore::ERR::BAD_PARAMETER), "BAD_PARAMETER");
    EXPECT_EQ(KeloDRCore::Container::ToJsonArray(std::vector<int>{thread})[0], thread);
    EXPECT_TRUE(KeloDRCore::Validator::IsVolPath("/volume1"));
  }
};

TEST_F(ThreadsTest, MayUseDocumentsAtOnce) {
  RunInThreads({[this](int thread) { UseJson(thread); }});
}

TEST_F(ThreadsTest, MayUseFilesAtOnce) {
  RunInThreads({[this](int thread) { UseFiles(thread); }});
}

TEST_F(ThreadsTest, MayRunProgramsAtOnce) {
  RunInThreads({[this](int thread) { UseDirectories(thread); },
                [](int) { EXPECT_EQ(KeloDRCore::GenerateUUID().size(), 36U); }});
}

TEST_F(ThreadsTest, MayUseDifferentLocksAtOnce) {
  RunInThreads({[this](int thread) { UseLock("lock" + std::to_string(thread)); }});
}

TEST_F(ThreadsTest, MayWaitForOneLockThroughDifferentObjects) {
  RunInThreads({[this](int) { UseLock("lock"); }});
}

TEST_F(ThreadsTest, MayUseDifferentDatabasesAtOnce) {
  RunInThreads({[this](int thread) { UseDatabase(Own("base", thread), thread); }});
}

TEST_F(ThreadsTest, MayUseOneDatabaseThroughDifferentHandles) {
  RunInThreads({[this](int thread) { UseDatabase(Path("base"), thread); }});
}

TEST_F(ThreadsTest, MayUseDifferentCachesAtOnce) {
  RunInThreads({[this](int thread) { UseCache(thread); }});
}

TEST_F(ThreadsTest, MayUseMessagesAndUtilitiesAtOnce) { RunInThreads({UseMessages, UseUtilities}); }

TEST_F(ThreadsTest, MayUseEverythingAtOnce) {
  RunInThreads({[this](int thread) { UseJson(thread); }, [this](int thread) { UseFiles(thread); },
                [this](int thread) { UseLock("lock" + std::to_string(thread)); },
                [this](int thread) { UseDatabase(Own("base", thread), thread); },
                [this](int thread) { UseCache(thread); }, UseMessages, UseUtilities});
}

// A program with threads may fork, and its child has none of them to wait for.
TEST_F(ThreadsTest, AChildThatIsForkedBesideThreadsOpensItsLocks) {
  if (!kMayForkBesideThreads) GTEST_SKIP() << "AddressSanitizer does not survive such a fork";
  constexpr int kChildren = 50;
  constexpr unsigned int kLongest = 20;  // seconds, where a child needs milliseconds
  std::atomic<bool> done{false};
  std::vector<std::thread> threads;
  for (int number = 0; number < 2; ++number) {
    threads.emplace_back([this, &done, number] {
      while (!done) FileLock(Path("lock" + std::to_string(number))).openLockedFile();
    });
  }
  int status = 0;
  for (int child = 0; child < kChildren && status == 0; ++child) {
    const pid_t pid = fork();
    if (pid == 0) {
      alarm(kLongest);
      _exit(FileLock(Path("child")).openLockedFile() ? 0 : 1);
    }
    EXPECT_EQ(waitpid(pid, &status, 0), pid);
  }
  EXPECT_EQ(status, 0);
  done = true;
  for (std::thread& thread : threads) thread.join();
}

}  // namespace
