// The dispatch primitives under several threads and the manual clock: serial queue, group,
// delayed work, and manual-clock waiters. The install queue tests hold the operation queue to
// its ten, and the in-progress query tests keep a semaphore's signal that came before the wait.
#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "runtime/dispatch/clock.h"
#include "runtime/dispatch/delayed_work.h"
#include "runtime/dispatch/group.h"
#include "runtime/dispatch/semaphore.h"
#include "runtime/dispatch/serial_queue.h"

namespace appsync {
namespace {

using namespace std::chrono_literals;

TEST(SerialQueueTest, ItemsRunOneAtATimeAndDifferentQueuesNest) {
  SerialQueue outer("outer"), inner("inner");
  int counter = 0;  // unguarded on purpose: the queue is what serialises the increments
  std::vector<std::thread> threads;
  for (int t = 0; t < 4; ++t) {
    threads.emplace_back([&] {
      for (int i = 0; i < 500; ++i) outer.sync([&] { ++counter; });
    });
  }
  for (std::thread& t : threads) t.join();
  EXPECT_EQ(counter, 2000);

  std::vector<std::string> seen;
  EXPECT_FALSE(outer.isCurrent());
  outer.sync([&] {
    seen.push_back(outer.isCurrent() ? "in outer" : "not in outer");
    inner.sync(
        [&] { seen.push_back(outer.isCurrent() && inner.isCurrent() ? "in both" : "lost outer"); });
    seen.push_back(inner.isCurrent() ? "still in inner" : "left inner");
  });
  EXPECT_EQ(seen, (std::vector<std::string>{"in outer", "in both", "left inner"}));
}

TEST(SerialQueueDeathTest, SyncFromInsideTheSameQueueAborts) {
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  SerialQueue queue("com.example.state"), other("other");
  EXPECT_DEATH(queue.sync([&] { other.sync([&] { queue.sync([] {}); }); }),
               "SerialQueue 'com.example.state': sync\\(\\) called from inside the queue "
               "\\(deadlock\\)");
}

TEST(GroupTest, WaitEndsAtTheDeadlineOrEarlyWhenTheGroupEmpties) {
  ManualClock clock;
  Group group;
  group.enter();
  std::atomic<int> result{-1};
  std::thread waiter([&] { result = group.waitUntil(clock, clock.now() + 5s) ? 1 : 0; });
  clock.waitForWaiters(1);
  clock.advance(4s);
  EXPECT_EQ(result.load(), -1);
  clock.advance(1s);
  waiter.join();
  EXPECT_EQ(result.load(), 0);

  group.enter();  // two in flight now
  result = -1;
  waiter = std::thread([&] { result = group.waitUntil(clock, clock.now() + 1h) ? 1 : 0; });
  std::thread plainWaiter([&] { group.wait(); });
  clock.waitForWaiters(1);
  std::thread([&] { group.leave(); }).join();
  EXPECT_EQ(result.load(), -1);
  group.leave();
  waiter.join();
  plainWaiter.join();
  EXPECT_EQ(result.load(), 1);
  EXPECT_EQ(group.count(), 0);
}

TEST(GroupDeathTest, LeavingMoreThanEnteredAborts) {
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  Group group;
  EXPECT_DEATH(group.leave(), "leave\\(\\) without a matching enter\\(\\)");
}

TEST(DelayedWorkQueueTest, RunsOnItsThreadOnceTheClockPassesItsTimeEarliestFirst) {
  ManualClock clock;
  DelayedWorkQueue queue("retry", clock);
  std::mutex mutex;
  std::vector<std::string> ran;
  std::thread::id ranOn;
  const auto record = [&](std::string what) {
    return [&, what] {
      std::lock_guard<std::mutex> guard(mutex);
      ran.push_back(what);
      ranOn = std::this_thread::get_id();
    };
  };
  queue.after(1h, record("hour"));
  clock.waitForWaiters(1);
  queue.after(30s, record("thirty seconds"));
  queue.async(record("now"));
  clock.advance(29s);
  queue.waitUntilIdle();
  EXPECT_EQ(queue.pendingCount(), 2u);
  clock.advance(1s);
  queue.waitUntilIdle();
  std::lock_guard<std::mutex> guard(mutex);
  EXPECT_EQ(ran, (std::vector<std::string>{"now", "thirty seconds"}));
  EXPECT_NE(ranOn, std::this_thread::get_id());
  EXPECT_EQ(queue.pendingCount(), 1u);
}

// Each wait's mutex and condition variable die with it, while advances run flat out: an
// advance must never touch a waiter that has gone.
TEST(ManualClockTest, ShortLivedWaitersSurviveConcurrentAdvances) {
  ManualClock clock;
  std::atomic<bool> done{false};
  std::thread advancer([&] {
    while (!done) clock.advance(1ms);
  });
  std::vector<std::thread> waiters;
  for (int t = 0; t < 4; ++t) {
    waiters.emplace_back([&] {
      for (int i = 0; i < 200; ++i) {
        auto mutex = std::make_unique<std::mutex>();
        auto cv = std::make_unique<std::condition_variable>();
        std::unique_lock<std::mutex> lock(*mutex);
        EXPECT_FALSE(clock.waitUntil(lock, *cv, clock.now() + 2ms, [] { return false; }));
      }
    });
  }
  for (std::thread& w : waiters) w.join();
  done = true;
  advancer.join();
  EXPECT_EQ(clock.waiterCount(), 0u);
}

// A driver moving time deadline by deadline: it learns the next deadline, and after moving the
// clock there it knows the thread that was due has left its wait before it looks again.
TEST(ManualClockTest, ReportsTheEarliestDeadlineAndWaitsForDueWaitersToLeave) {
  ManualClock clock;
  EXPECT_EQ(clock.earliestDeadline(), std::nullopt);
  const TimePoint start = clock.now();
  Semaphore never(0);
  std::atomic<int> timedOut{0};
  std::vector<std::thread> waiters;
  for (auto delay : {20s, 10s}) {
    waiters.emplace_back([&, delay] {
      if (!never.waitUntil(clock, start + delay)) ++timedOut;
    });
  }
  clock.waitForWaiters(2);
  EXPECT_EQ(clock.earliestDeadline(), start + 10s);
  clock.advance(10s);
  clock.waitForDueWaiters();
  EXPECT_EQ(clock.waiterCount(), 1u);
  EXPECT_EQ(clock.earliestDeadline(), start + 20s);
  clock.advance(15s);
  clock.waitForDueWaiters();
  EXPECT_EQ(clock.earliestDeadline(), std::nullopt);
  for (std::thread& w : waiters) w.join();
  EXPECT_EQ(timedOut.load(), 2);
}

}  // namespace
}  // namespace appsync
