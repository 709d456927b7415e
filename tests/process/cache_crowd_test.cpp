// What many processes at once do to a cache file.

#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <set>
#include <sstream>
#include <stdexcept>

#include "process/cache_process.h"

namespace {

// How the 64 processes of a test ended.
struct Outcome {
  int fresh = 0;
  int old = 0;
  int threw = 0;
  int refreshers = 0;
};

class CacheCrowdTest : public CacheProcessTest {
 protected:
  // 64 processes read at once. Every fetch is recorded, and gives what `fetch` gives.
  Outcome ReadBy64(bool alwaysRequired, const std::function<bool(Json::Value&)>& fetch) {
    int gate[2];
    EXPECT_EQ(pipe2(gate, O_CLOEXEC), 0);
    std::set<pid_t> readers;
    for (int i = 0; i < 64; ++i) {
      readers.insert(StartChild([&] {
        close(gate[1]);
        char byte = 0;
        EXPECT_EQ(read(gate[0], &byte, 1), 0);  // until the gate is closed
        return ReadOnce(alwaysRequired, fetch);
      }));
    }
    close(gate[0]);
    close(gate[1]);
    return Collect(readers);
  }

  int ReadOnce(bool alwaysRequired, const std::function<bool(Json::Value&)>& fetch) const {
    TestCache cache = MakeCache(alwaysRequired, -1);
    cache.defaultValue = "old";
    cache.fetch = [&](Json::Value& out) { return RecordedFetch(fetch, out); };
    try {
      const Json::Value data = cache.Read();
      return data == "new" ? 1 : data == "old" ? 2 : 9;
    } catch (const std::runtime_error&) {
      return 3;
    }
  }

  bool RecordedFetch(const std::function<bool(Json::Value&)>& fetch, Json::Value& out) const {
    Record("begin");
    const timespec cost{0, 20000000};
    nanosleep(&cost, nullptr);
    Record("end");
    return fetch(out);
  }

  void Record(const std::string& what) const {
    std::ofstream(Path("fetches"), std::ios::app) << what + " " + std::to_string(getpid()) + "\n";
  }

  static Outcome Collect(const std::set<pid_t>& readers) {
    Outcome outcome;
    int status = -1;
    for (pid_t pid; (pid = waitpid(-1, &status, 0)) > 0;) {
      EXPECT_TRUE(WIFEXITED(status));
      if (readers.count(pid) == 0) {
        EXPECT_EQ(status, 0);
        ++outcome.refreshers;
        continue;
      }
      const int result = WEXITSTATUS(status);
      EXPECT_TRUE(result >= 1 && result <= 3) << result;
      outcome.fresh += result == 1;
      outcome.old += result == 2;
      outcome.threw += result == 3;
    }
    return outcome;
  }

  // How many fetches there were; no two at a time.
  int CheckedFetches() const {
    std::istringstream lines(ReadText(Path("fetches")));
    std::string begin, end, first, second;
    int count = 0;
    for (; lines >> begin >> first >> end >> second; ++count) {
      EXPECT_EQ(begin, "begin");
      EXPECT_EQ(end, "end");
      EXPECT_EQ(first, second) << "two fetches at a time";
    }
    return count;
  }
};

bool GiveNew(Json::Value& out) {
  out = "new";
  return true;
}

TEST_F(CacheCrowdTest, OfManyThatNeedFreshDataOneFetchesAtATime) {
  WriteCacheFile("\"old\"", kStale);
  const Outcome outcome = ReadBy64(true, GiveNew);
  EXPECT_EQ(outcome.fresh + outcome.old, 64);
  EXPECT_GE(CheckedFetches(), 1);
  EXPECT_EQ(outcome.refreshers, 0);
  // Who loses the race for the claim goes on with the old data, and says so. Nothing is said by who
  // loads the old document just before it is replaced and looks at its age just after.
  EXPECT_LE(CountInMirror(ReadFailed()), static_cast<size_t>(outcome.old));
  EXPECT_EQ(MakeCache().Read(), "new");
}

TEST_F(CacheCrowdTest, OfManyThatNeedNoFreshDataNobodyWaits) {
  WriteCacheFile("\"old\"", kStale);
  const Outcome outcome = ReadBy64(false, GiveNew);
  EXPECT_EQ(outcome.fresh + outcome.old, 64);
  EXPECT_GE(outcome.refreshers, 1);
  EXPECT_GE(CheckedFetches(), 1);
  EXPECT_EQ(CountInMirror(StartsWaiting()), 0U);
  EXPECT_EQ(CountInMirror(ReadFailed()), 0U);
  EXPECT_EQ(MakeCache().Read(), "new");
}

TEST_F(CacheCrowdTest, AFailingFetchLeavesManyWithTheDefaultValue) {
  const Outcome outcome = ReadBy64(true, [](Json::Value&) { return false; });
  EXPECT_EQ(outcome.old, 64);
  EXPECT_GE(CheckedFetches(), 1);
  EXPECT_EQ(CountInMirror(FetchFailed(-1)), static_cast<size_t>(CheckedFetches()));
}

TEST_F(CacheCrowdTest, AThrowingFetchHangsNobody) {
  WriteCacheFile("\"old\"", kStale);
  const Outcome outcome =
      ReadBy64(true, [](Json::Value&) -> bool { throw std::runtime_error("fetch"); });
  EXPECT_EQ(outcome.old + outcome.threw, 64);
  EXPECT_EQ(outcome.threw, CheckedFetches());
  EXPECT_GE(outcome.threw, 1);
}

TEST_F(CacheCrowdTest, ManyWaitersGoOnWhenTheUpdaterIsKilledEvenAsAZombie) {
  constexpr size_t kWaiters = 63;
  WriteCacheFile("\"old\"", kStale);
  const Event finish;
  const pid_t updater = StartUpdater(finish);
  std::vector<pid_t> waiters;
  for (size_t i = 0; i < kWaiters; ++i) waiters.push_back(StartWaiter("old"));
  EXPECT_TRUE(WaitForLines(StartsWaiting(), kWaiters));
  EXPECT_EQ(CountInMirror(FinishesWaiting()), 0U);
  kill(updater, SIGKILL);
  for (const pid_t waiter : waiters) EXPECT_EQ(JoinChild(waiter), 0);
  EXPECT_EQ(CountInMirror(FinishesWaiting()), kWaiters);

  TestCache next = MakeCache();
  next.FetchGives("next");
  EXPECT_EQ(next.Read(), "next");
  ExpectLog({Starts(), Finishes()});
  EXPECT_TRUE(WIFSIGNALED(JoinChild(updater)));
}

TEST_F(CacheCrowdTest, ReadersSeeWholeDocumentsThrough5000Rewrites) {
  constexpr int kRewrites = 5000;
  const auto document = [](int number) {
    Json::Value data(Json::objectValue);
    data["first"] = number;
    data["filler"] = std::string(static_cast<size_t>(number % 7) * 3000, 'x');
    data["last"] = number;
    return data;
  };
  ASSERT_TRUE(MakeCache().UpdateWithData(document(0)));
  const std::string done = Path("done");
  // Newcomers load the file each time; their numbers never go back.
  const pid_t newcomers = StartChild([&] {
    int last = 0;
    while (!std::filesystem::exists(done)) {
      const Json::Value data = MakeCache(false).Read();
      if (data != document(data["first"].asInt()) || data["first"].asInt() < last) return 1;
      last = data["first"].asInt();
    }
    return last > 0 ? 0 : 2;
  });
  // A resident answers from memory in between.
  const pid_t resident = StartChild([&] {
    const TestCache cache = MakeCache(false);
    while (!std::filesystem::exists(done)) {
      const Json::Value data = cache.Read();
      if (data != document(data["first"].asInt())) return 1;
    }
    return 0;
  });
  const TestCache writer = MakeCache();
  for (int i = 1; i <= kRewrites; ++i) EXPECT_TRUE(writer.UpdateWithData(document(i)));
  WriteText(done, "");
  EXPECT_EQ(JoinChild(newcomers), 0);
  EXPECT_EQ(JoinChild(resident), 0);
  EXPECT_EQ(LogCapture::ReadMirror(mirror), std::vector<LogLine>{});
}

}  // namespace
