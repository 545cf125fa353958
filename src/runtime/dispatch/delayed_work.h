// A concurrent queue for delayed work: each item runs on a thread of the queue once the
// injected clock reaches its time. Items whose times have come may run at the same time.
#pragma once

#include <condition_variable>
#include <cstddef>
#include <deque>
#include <functional>
#include <map>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "runtime/dispatch/clock.h"

namespace appsync {

class DelayedWorkQueue {
 public:
  DelayedWorkQueue(std::string name, Clock& clock);
  // Stops the queue (below).
  ~DelayedWorkQueue();
  DelayedWorkQueue(const DelayedWorkQueue&) = delete;
  DelayedWorkQueue& operator=(const DelayedWorkQueue&) = delete;

  // Runs `work` once `delay` has passed on the clock (measured from now). Items with the same
  // time start in the order they were added. Ignored (and `work` destroyed) once stopped.
  void after(Duration delay, std::function<void()> work);
  // Drops items whose time has not come (destroying them unrun); items already due still run.
  // Waits for running items to finish and joins every thread of the queue. Later items are
  // ignored. Call it from outside the queue's own items; calling it again does nothing.
  void stop();
  // Runs `work` as soon as possible on a thread of the queue.
  void async(std::function<void()> work) { after(Duration::zero(), std::move(work)); }

  // Items scheduled and not yet started.
  std::size_t pendingCount() const;
  // Blocks until nothing is running and nothing is due (items in the future may remain).
  void waitUntilIdle();

 private:
  // Moves items whose time has come from pending_ to due_, starting runners as needed.
  void timerLoop();
  // Runs due items; runners stay for the queue's lifetime and are reused.
  void runnerLoop();

  std::string name_;
  Clock& clock_;
  mutable std::mutex mutex_;
  std::condition_variable cv_;        // the timer: an item was added, or stopping
  std::condition_variable dueReady_;  // the runners: an item is due, or stopping
  std::condition_variable idle_;      // waitUntilIdle
  std::multimap<TimePoint, std::function<void()>> pending_;
  std::deque<std::function<void()>> due_;
  std::vector<std::thread> runners_;
  std::size_t freeRunners_ = 0;  // runners not running an item
  std::size_t running_ = 0;
  bool stopping_ = false;
  std::thread timer_;
};

}  // namespace appsync
