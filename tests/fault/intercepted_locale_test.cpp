// The first number of a process, for which the reader of documents takes the classic locale. Each
// test reads in a child of its own: a process has only one first time.

#include <sys/syscall.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <new>
#include <thread>

#include "kelodrcore/json_value.h"
#include "support/clean_test.h"
#include "support/interception.h"

namespace {

using Fault::Interception;
using KeloDRCore::JsonValue::fromString;

void ExpectRead() {
  Json::Value value;
  EXPECT_TRUE(fromString(value, "1.5"));
  EXPECT_EQ(value, Json::Value(1.5));
}

bool IsAsleep(int thread) {
  const std::string stat = ReadText("/proc/self/task/" + std::to_string(thread) + "/stat");
  return stat.find(") S ") != std::string::npos;
}

using InterceptedLocaleTest = CleanTest;

TEST_F(InterceptedLocaleTest, NoMemoryForItIsToldAndNotRemembered) {
  EXPECT_EQ(RunInChild([] {
              {
                const Interception noMemory("newlocale", 1, ENOMEM);
                Json::Value value("before");
                EXPECT_THROW((void)fromString(value, "1.5"), std::bad_alloc);
                EXPECT_EQ(value, Json::Value("before"));
                EXPECT_TRUE(noMemory.HasRun());
              }
              ExpectRead();
            }),
            0);
}

TEST_F(InterceptedLocaleTest, IsMadeOnceForTwoThreadsThatComeAtOnce) {
  EXPECT_EQ(RunInChild([] {
              std::thread second;
              const Interception first("newlocale", 1, [&second] {
                std::atomic<int> id{0};
                second = std::thread([&id] {
                  id = static_cast<int>(syscall(SYS_gettid));
                  ExpectRead();
                });
                // Nothing else than the first one's work is there to wait for.
                while (id == 0 || !IsAsleep(id)) std::this_thread::yield();
                return Fault::kGoOn;
              });
              const Interception again("newlocale", 2, ENOMEM);
              ExpectRead();
              second.join();
              EXPECT_TRUE(first.HasRun());
              EXPECT_FALSE(again.HasRun());
            }),
            0);
}

}  // namespace
