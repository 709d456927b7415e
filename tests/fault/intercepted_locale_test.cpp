// The first document that a process writes, for which the writer takes the classic locale. Each
// test writes in a child of its own: a process has only one first time.

#include <sys/syscall.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <new>
#include <thread>

#include "fault/interception.h"
#include "kelodrcore/json_value.h"
#include "support/clean_test.h"

namespace {

using Fault::Interception;
using KeloDRCore::JsonValue::toString;

void ExpectWritten() { EXPECT_EQ(toString(1.5), "1.5"); }

bool IsAsleep(int thread) {
  const std::string stat = ReadText("/proc/self/task/" + std::to_string(thread) + "/stat");
  return stat.find(") S ") != std::string::npos;
}

using InterceptedLocaleTest = CleanTest;

TEST_F(InterceptedLocaleTest, NoMemoryForItIsToldAndNotRemembered) {
  EXPECT_EQ(RunInChild([] {
              {
                const Interception noMemory("newlocale", 1, ENOMEM);
                EXPECT_THROW((void)toString(1.5), std::bad_alloc);
                EXPECT_TRUE(noMemory.HasRun());
              }
              ExpectWritten();
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
                  ExpectWritten();
                });
                // Nothing else than the first one's work is there to wait for.
                while (id == 0 || !IsAsleep(id)) std::this_thread::yield();
                return Fault::kGoOn;
              });
              const Interception again("newlocale", 2, ENOMEM);
              ExpectWritten();
              second.join();
              EXPECT_TRUE(first.HasRun());
              EXPECT_FALSE(again.HasRun());
            }),
            0);
}

}  // namespace
