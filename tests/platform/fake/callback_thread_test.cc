// The fakes' callback thread: order, its own thread, drain, hold and release.
#include "platform/fake/callback_thread.h"

#include <gtest/gtest.h>

#include <atomic>
#include <mutex>
#include <thread>
#include <vector>

namespace appsync {
namespace {

TEST(CallbackThreadTest, RunsInPostingOrderOnItsOwnThread) {
  CallbackThread thread("test-callbacks");
  std::mutex mutex;
  std::vector<int> order;
  std::vector<std::thread::id> threads;
  for (int i = 0; i < 50; ++i) {
    thread.post([&, i] {
      std::lock_guard lock(mutex);
      order.push_back(i);
      threads.push_back(std::this_thread::get_id());
    });
  }
  thread.drain();
  std::lock_guard lock(mutex);
  ASSERT_EQ(order.size(), 50u);
  for (int i = 0; i < 50; ++i) EXPECT_EQ(order[i], i);
  for (const auto& id : threads) {
    EXPECT_NE(id, std::this_thread::get_id());
    EXPECT_EQ(id, threads.front());
  }
  EXPECT_EQ(thread.pendingCount(), 0u);
}

TEST(CallbackThreadTest, HoldQueuesUntilRelease) {
  CallbackThread thread("test-hold");
  std::atomic<int> ran{0};
  thread.hold();
  thread.post([&] { ++ran; });
  thread.post([&] { ++ran; });
  thread.waitUntilIdle();  // nothing runs while held, so this must not wait for release
  EXPECT_EQ(ran.load(), 0);
  EXPECT_EQ(thread.pendingCount(), 2u);
  EXPECT_TRUE(thread.isHeld());
  thread.release();
  thread.drain();
  EXPECT_EQ(ran.load(), 2);
}

TEST(CallbackThreadTest, CallbacksMayPostAndDestructionRunsWhatIsQueued) {
  std::atomic<int> ran{0};
  {
    CallbackThread thread("test-nested");
    thread.post([&] {
      EXPECT_TRUE(thread.isCurrent());
      thread.post([&] { ++ran; });
      ++ran;
    });
    thread.hold();
    thread.post([&] { ++ran; });
    EXPECT_FALSE(thread.isCurrent());
  }
  EXPECT_EQ(ran.load(), 3);
}

}  // namespace
}  // namespace appsync
