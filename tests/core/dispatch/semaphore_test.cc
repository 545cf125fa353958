// The counting semaphore: signals are counted, never lost, and waits end at their deadline.
#include "core/dispatch/semaphore.h"

#include <gtest/gtest.h>

#include <atomic>
#include <thread>

namespace appsync {
namespace {

using namespace std::chrono_literals;

TEST(SemaphoreTest, SignalsBeforeTheWaitAreCountedAndKept) {
  ManualClock clock;
  Semaphore semaphore;
  semaphore.signal();
  semaphore.signal();
  semaphore.wait();
  // A signal already there is taken even when the deadline has passed; no third one exists.
  EXPECT_TRUE(semaphore.waitUntil(clock, clock.now() - 1s));
  EXPECT_FALSE(semaphore.waitUntil(clock, clock.now()));

  Semaphore initial(1);
  EXPECT_TRUE(initial.waitUntil(clock, clock.now()));
}

TEST(SemaphoreTest, WaitEndsWithASignalOrAtTheDeadline) {
  ManualClock clock;
  Semaphore semaphore;
  std::atomic<int> first{-1};
  std::thread waiter([&] { first = semaphore.waitUntil(clock, clock.now() + 5s) ? 1 : 0; });
  clock.waitForWaiters(1);
  semaphore.signal();
  waiter.join();
  EXPECT_EQ(first.load(), 1);

  std::atomic<int> second{-1};
  std::thread late([&] { second = semaphore.waitUntil(clock, clock.now() + 5s) ? 1 : 0; });
  clock.waitForWaiters(1);
  clock.advance(5s);
  late.join();
  EXPECT_EQ(second.load(), 0);
}

}  // namespace
}  // namespace appsync
