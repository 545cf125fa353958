// The operation queue: the concurrency limit, FIFO start order, and draining on destruction.
#include "runtime/dispatch/operation_queue.h"

#include <gtest/gtest.h>

#include <atomic>
#include <condition_variable>
#include <future>
#include <mutex>
#include <vector>

namespace appsync {
namespace {

TEST(OperationQueueTest, NeverRunsMoreThanTheLimit) {
  OperationQueue queue("limited", 10);
  std::mutex mutex;
  std::condition_variable changed;
  int started = 0;
  bool open = false;
  std::atomic<int> finished{0};
  for (int i = 0; i < 50; ++i) {
    queue.addOperation([&] {
      std::unique_lock<std::mutex> lock(mutex);
      ++started;
      changed.notify_all();
      changed.wait(lock, [&] { return open; });
      ++finished;
    });
  }
  {
    std::unique_lock<std::mutex> lock(mutex);
    changed.wait(lock, [&] { return started == 10; });
    EXPECT_EQ(queue.runningCount(), 10u);
    open = true;
    changed.notify_all();
  }
  queue.waitUntilAllOperationsAreFinished();
  EXPECT_EQ(finished.load(), 50);
  EXPECT_EQ(queue.peakRunningCount(), 10u);
}

TEST(OperationQueueTest, StartsInOrderAndDrainsOnDestruction) {
  std::vector<int> order;
  std::promise<void> go;
  {
    OperationQueue queue("serial");
    queue.addOperation([ready = go.get_future().share()] { ready.wait(); });
    for (int i = 0; i < 20; ++i) queue.addOperation([&order, i] { order.push_back(i); });
    go.set_value();  // the others are still queued when the destructor starts
  }
  std::vector<int> expected;
  for (int i = 0; i < 20; ++i) expected.push_back(i);
  EXPECT_EQ(order, expected);
}

}  // namespace
}  // namespace appsync
