// The delayed-work queue: items run on the queue's threads once the clock reaches their time.
#include "runtime/dispatch/delayed_work.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

namespace appsync {
namespace {

using namespace std::chrono_literals;

TEST(DelayedWorkQueueTest, RunsOnlyOnceTheClockPassesItsTime) {
  ManualClock clock;
  DelayedWorkQueue queue("retry", clock);
  std::atomic<bool> ran{false};
  std::thread::id ranOn;
  queue.after(30s, [&] {
    ranOn = std::this_thread::get_id();
    ran = true;
  });
  clock.waitForWaiters(1);
  clock.advance(29s);
  queue.waitUntilIdle();
  EXPECT_FALSE(ran.load());
  EXPECT_EQ(queue.pendingCount(), 1u);
  clock.advance(1s);
  queue.waitUntilIdle();
  EXPECT_TRUE(ran.load());
  EXPECT_EQ(queue.pendingCount(), 0u);
  EXPECT_NE(ranOn, std::this_thread::get_id());
}

TEST(DelayedWorkQueueTest, AnEarlierItemAddedLaterRunsFirst) {
  ManualClock clock;
  DelayedWorkQueue queue("order", clock);
  std::mutex mutex;
  std::vector<std::string> ran;
  auto record = [&](std::string what) {
    return [&, what] {
      std::lock_guard<std::mutex> guard(mutex);
      ran.push_back(what);
    };
  };
  queue.after(1h, record("hour"));
  clock.waitForWaiters(1);
  queue.after(5s, record("five seconds"));
  queue.async(record("now"));
  clock.advance(5s);
  queue.waitUntilIdle();
  {
    std::lock_guard<std::mutex> guard(mutex);
    std::sort(ran.begin(), ran.end());
    EXPECT_EQ(ran, (std::vector<std::string>{"five seconds", "now"}));
  }
  EXPECT_EQ(queue.pendingCount(), 1u);
}

// Under the system clock: a destructor that waited for the hour would hang the test.
TEST(DelayedWorkQueueTest, DestructionDropsFutureWorkPromptly) {
  SystemClock clock;
  std::atomic<bool> futureRan{false};
  std::atomic<bool> asyncRan{false};
  {
    DelayedWorkQueue queue("shutdown", clock);
    queue.async([&] { asyncRan = true; });
    queue.waitUntilIdle();
    queue.after(1h, [&] { futureRan = true; });
    EXPECT_EQ(queue.pendingCount(), 1u);
  }
  EXPECT_TRUE(asyncRan.load());
  EXPECT_FALSE(futureRan.load());
}

}  // namespace
}  // namespace appsync
