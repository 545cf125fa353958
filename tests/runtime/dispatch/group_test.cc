// The group: waits that end at their deadline or when the group empties.
#include "runtime/dispatch/group.h"

#include <gtest/gtest.h>

#include <atomic>
#include <thread>

namespace appsync {
namespace {

using namespace std::chrono_literals;

TEST(GroupTest, WaitEndsAtDeadlineWhenWorkIsStillInFlight) {
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
  EXPECT_EQ(group.count(), 1);
  group.leave();
}

TEST(GroupTest, WaitEndsEarlyWhenTheGroupEmpties) {
  ManualClock clock;
  Group group;
  group.enter();
  group.enter();
  std::atomic<int> result{-1};
  std::thread waiter([&] { result = group.waitUntil(clock, clock.now() + 1h) ? 1 : 0; });
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

}  // namespace
}  // namespace appsync
