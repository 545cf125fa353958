// The operation queue: the concurrency limit, FIFO start order, and draining on destruction.
#include "core/dispatch/operation_queue.h"

#include <gtest/gtest.h>

#include <atomic>
#include <condition_variable>
#include <mutex>
#include <vector>

namespace appsync {
namespace {

// Operations block on the gate until the test opens it; the test can wait for a number of
// them to have started.
class Gate {
 public:
  void pass() {
    std::unique_lock<std::mutex> lock(mutex_);
    ++started_;
    changed_.notify_all();
    changed_.wait(lock, [&] { return open_; });
  }
  void waitForStarted(int n) {
    std::unique_lock<std::mutex> lock(mutex_);
    changed_.wait(lock, [&] { return started_ >= n; });
  }
  int started() {
    std::lock_guard<std::mutex> guard(mutex_);
    return started_;
  }
  void open() {
    std::lock_guard<std::mutex> guard(mutex_);
    open_ = true;
    changed_.notify_all();
  }

 private:
  std::mutex mutex_;
  std::condition_variable changed_;
  int started_ = 0;
  bool open_ = false;
};

TEST(OperationQueueTest, NeverRunsMoreThanTheLimit) {
  OperationQueue queue("limited", 10);
  Gate gate;
  std::atomic<int> finished{0};
  for (int i = 0; i < 50; ++i) {
    queue.addOperation([&] {
      gate.pass();
      ++finished;
    });
  }
  gate.waitForStarted(10);
  EXPECT_EQ(queue.runningCount(), 10u);
  EXPECT_EQ(gate.started(), 10);
  gate.open();
  queue.waitUntilAllOperationsAreFinished();
  EXPECT_EQ(finished.load(), 50);
  EXPECT_EQ(queue.runningCount(), 0u);
  EXPECT_EQ(queue.peakRunningCount(), 10u);
}

TEST(OperationQueueTest, RaisingTheLimitStartsWaitingOperations) {
  OperationQueue queue("raised");
  Gate gate;
  for (int i = 0; i < 5; ++i) queue.addOperation([&] { gate.pass(); });
  gate.waitForStarted(1);
  EXPECT_EQ(queue.runningCount(), 1u);
  queue.setMaxConcurrentOperationCount(3);
  EXPECT_EQ(queue.maxConcurrentOperationCount(), 3u);
  gate.waitForStarted(3);
  EXPECT_EQ(queue.runningCount(), 3u);
  gate.open();
  queue.waitUntilAllOperationsAreFinished();
  EXPECT_EQ(queue.peakRunningCount(), 3u);
}

TEST(OperationQueueTest, StartsInOrderAndDrainsOnDestruction) {
  std::vector<int> order;
  Gate gate;
  {
    OperationQueue queue("serial");
    queue.addOperation([&] { gate.pass(); });
    for (int i = 0; i < 20; ++i) queue.addOperation([&order, i] { order.push_back(i); });
    gate.waitForStarted(1);
    gate.open();
    // The destructor runs the queued operations before returning.
  }
  std::vector<int> expected;
  for (int i = 0; i < 20; ++i) expected.push_back(i);
  EXPECT_EQ(order, expected);
}

}  // namespace
}  // namespace appsync
