// The counting semaphore: signals given before anyone waits are kept and counted.
#include "runtime/dispatch/semaphore.h"

#include <gtest/gtest.h>

namespace appsync {
namespace {

using namespace std::chrono_literals;

TEST(SemaphoreTest, SignalsBeforeTheWaitAreNotLost) {
  ManualClock clock;
  Semaphore semaphore;
  semaphore.signal();
  semaphore.signal();
  semaphore.wait();
  // A signal already there is taken even when the deadline has passed; there is no third.
  EXPECT_TRUE(semaphore.waitUntil(clock, clock.now() - 1s));
  EXPECT_FALSE(semaphore.waitUntil(clock, clock.now()));
}

}  // namespace
}  // namespace appsync
