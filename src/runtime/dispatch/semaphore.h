// A counting semaphore whose waits can end at a deadline of an injected clock.
#pragma once

#include <condition_variable>
#include <cstdint>
#include <mutex>

#include "runtime/dispatch/clock.h"

namespace appsync {

class Semaphore {
 public:
  explicit Semaphore(std::int64_t initial = 0) : count_(initial) {}
  Semaphore(const Semaphore&) = delete;
  Semaphore& operator=(const Semaphore&) = delete;

  void signal();
  // Blocks until a signal is available and takes it. No time limit.
  void wait();
  // As wait(), but gives up when `clock` reaches `deadline`. True when a signal was taken.
  bool waitUntil(Clock& clock, TimePoint deadline);

 private:
  std::mutex mutex_;
  std::condition_variable cv_;
  std::int64_t count_;
};

}  // namespace appsync
