// The serial queue: exclusive execution, nesting of different queues, and re-entry aborting.
#include "runtime/dispatch/serial_queue.h"

#include <gtest/gtest.h>

#include <thread>
#include <vector>

namespace appsync {
namespace {

TEST(SerialQueueTest, ItemsRunOneAtATimeAndDifferentQueuesNest) {
  SerialQueue outer("outer");
  SerialQueue inner("inner");
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
  EXPECT_FALSE(outer.isCurrent());
}

TEST(SerialQueueDeathTest, SyncFromInsideTheSameQueueAborts) {
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  SerialQueue queue("com.example.state");
  SerialQueue other("other");
  EXPECT_DEATH(queue.sync([&] { other.sync([&] { queue.sync([] {}); }); }),
               "SerialQueue 'com.example.state': sync\\(\\) called from inside the queue "
               "\\(deadlock\\)");
}

}  // namespace
}  // namespace appsync
