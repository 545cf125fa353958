// A concurrent queue for delayed work: each item runs on a thread of the queue once the
// injected clock reaches its time. Items whose times have come may run at the same time.
#pragma once

#include <condition_variable>
#include <cstddef>
#include <functional>
#include <map>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "core/dispatch/clock.h"

namespace appsync {

class DelayedWorkQueue {
 public:
  DelayedWorkQueue(std::string name, Clock& clock);
  // Drops items whose time has not come, and waits for running items to finish.
  ~DelayedWorkQueue();
  DelayedWorkQueue(const DelayedWorkQueue&) = delete;
  DelayedWorkQueue& operator=(const DelayedWorkQueue&) = delete;

  // Runs `work` once `delay` has passed on the clock (measured from now).
  void after(Duration delay, std::function<void()> work);
  // Runs `work` as soon as possible on a thread of the queue.
  void async(std::function<void()> work) { after(Duration::zero(), std::move(work)); }

  // Items scheduled and not yet started.
  std::size_t pendingCount() const;
  // Blocks until nothing is running and nothing is due (items in the future may remain).
  void waitUntilIdle();

 private:
  void timerLoop();

  std::string name_;
  Clock& clock_;
  mutable std::mutex mutex_;
  std::condition_variable cv_;
  std::multimap<TimePoint, std::function<void()>> pending_;
  std::vector<std::thread> runners_;
  std::size_t running_ = 0;
  bool stopping_ = false;
  std::thread timer_;
};

}  // namespace appsync
