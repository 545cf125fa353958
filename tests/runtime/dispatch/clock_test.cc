// The clocks: deadlines under the system clock, and manual-clock waiters that come and go
// while another thread advances time.
#include "runtime/dispatch/clock.h"

#include <gtest/gtest.h>

#include <atomic>
#include <memory>
#include <thread>
#include <vector>

namespace appsync {
namespace {

using namespace std::chrono_literals;

TEST(SystemClockTest, WaitEndsAtDeadlineOrWhenReady) {
  SystemClock clock;
  std::mutex mutex;
  std::condition_variable cv;
  std::unique_lock<std::mutex> lock(mutex);
  TimePoint start = clock.now();
  EXPECT_FALSE(clock.waitUntil(lock, cv, start + 2ms, [] { return false; }));
  EXPECT_GE(clock.now(), start + 2ms);
  EXPECT_TRUE(clock.waitUntil(lock, cv, start + 1h, [] { return true; }));
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

}  // namespace
}  // namespace appsync
