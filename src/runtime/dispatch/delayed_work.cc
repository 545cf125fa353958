// The delayed-work queue: a timer thread on the injected clock hands due items to runners.
#include "runtime/dispatch/delayed_work.h"

#include <pthread.h>

namespace appsync {

DelayedWorkQueue::DelayedWorkQueue(std::string name, Clock& clock)
    : name_(std::move(name)), clock_(clock) {
  timer_ = std::thread([this] { timerLoop(); });
}

DelayedWorkQueue::~DelayedWorkQueue() { stop(); }

void DelayedWorkQueue::stop() {
  std::multimap<TimePoint, std::function<void()>> dropped;
  {
    std::lock_guard<std::mutex> guard(mutex_);
    stopping_ = true;
    dropped.swap(pending_);
  }
  cv_.notify_all();
  dueReady_.notify_all();
  if (timer_.joinable()) timer_.join();
  // Only the timer starts runners, so the vector no longer changes.
  for (std::thread& runner : runners_) {
    if (runner.joinable()) runner.join();
  }
  // `dropped` is destroyed here, outside the lock: what the items captured may do anything.
}

void DelayedWorkQueue::after(Duration delay, std::function<void()> work) {
  TimePoint when = clock_.now() + delay;
  {
    std::lock_guard<std::mutex> guard(mutex_);
    if (stopping_) return;
    pending_.emplace(when, std::move(work));
  }
  cv_.notify_all();
}

std::size_t DelayedWorkQueue::pendingCount() const {
  std::lock_guard<std::mutex> guard(mutex_);
  return pending_.size() + due_.size();
}

void DelayedWorkQueue::waitUntilIdle() {
  std::unique_lock<std::mutex> lock(mutex_);
  idle_.wait(lock, [&] {
    return running_ == 0 && due_.empty() &&
           (pending_.empty() || pending_.begin()->first > clock_.now());
  });
}

void DelayedWorkQueue::timerLoop() {
  // Thread names are limited to 15 characters; enough to tell the queues apart in a debugger.
  pthread_setname_np(pthread_self(), name_.substr(0, 15).c_str());
  std::unique_lock<std::mutex> lock(mutex_);
  while (!stopping_) {
    if (pending_.empty()) {
      cv_.wait(lock, [&] { return stopping_ || !pending_.empty(); });
      continue;
    }
    TimePoint earliest = pending_.begin()->first;
    TimePoint now = clock_.now();
    if (now < earliest) {
      // Re-evaluated when an earlier item arrives or the queue stops.
      clock_.waitUntil(lock, cv_, earliest, [&] {
        return stopping_ || (!pending_.empty() && pending_.begin()->first < earliest);
      });
      continue;
    }
    auto end = pending_.upper_bound(now);
    for (auto it = pending_.begin(); it != end; ++it) due_.push_back(std::move(it->second));
    pending_.erase(pending_.begin(), end);
    while (freeRunners_ < due_.size()) {
      ++freeRunners_;
      runners_.emplace_back([this] { runnerLoop(); });
    }
    dueReady_.notify_all();
  }
}

void DelayedWorkQueue::runnerLoop() {
  pthread_setname_np(pthread_self(), name_.substr(0, 15).c_str());
  std::unique_lock<std::mutex> lock(mutex_);
  for (;;) {
    dueReady_.wait(lock, [&] { return stopping_ || !due_.empty(); });
    if (due_.empty()) return;  // stopping, and every due item has been started
    std::function<void()> work = std::move(due_.front());
    due_.pop_front();
    --freeRunners_;
    ++running_;
    lock.unlock();
    work();
    work = nullptr;
    lock.lock();
    --running_;
    ++freeRunners_;
    idle_.notify_all();
  }
}

}  // namespace appsync
