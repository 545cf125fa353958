// The operation queue: a bounded set of worker threads running operations in FIFO start order.
#include "runtime/dispatch/operation_queue.h"

#include <pthread.h>

#include <algorithm>

namespace appsync {

OperationQueue::OperationQueue(std::string name, std::size_t maxConcurrentOperations)
    : name_(std::move(name)), maxConcurrent_(std::max<std::size_t>(1, maxConcurrentOperations)) {}

OperationQueue::~OperationQueue() {
  {
    std::lock_guard<std::mutex> guard(mutex_);
    stopping_ = true;
    // Operations still queued need a worker each to drain at the current limit.
    addWorkersLocked();
  }
  workAvailable_.notify_all();
  // No worker is added once stopping_ is set, so the vector is stable here.
  for (std::thread& worker : workers_) worker.join();
}

void OperationQueue::setMaxConcurrentOperationCount(std::size_t n) {
  {
    std::lock_guard<std::mutex> guard(mutex_);
    maxConcurrent_ = std::max<std::size_t>(1, n);
    if (!stopping_) addWorkersLocked();
  }
  workAvailable_.notify_all();
}

std::size_t OperationQueue::maxConcurrentOperationCount() const {
  std::lock_guard<std::mutex> guard(mutex_);
  return maxConcurrent_;
}

void OperationQueue::addOperation(std::function<void()> operation) {
  {
    std::lock_guard<std::mutex> guard(mutex_);
    queue_.push_back(std::move(operation));
    if (!stopping_) addWorkersLocked();
  }
  workAvailable_.notify_one();
}

void OperationQueue::addWorkersLocked() {
  std::size_t wanted = std::min(maxConcurrent_, running_ + queue_.size());
  while (workers_.size() < wanted) workers_.emplace_back([this] { workerLoop(); });
}

void OperationQueue::waitUntilAllOperationsAreFinished() {
  std::unique_lock<std::mutex> lock(mutex_);
  idle_.wait(lock, [&] { return queue_.empty() && running_ == 0; });
}

std::size_t OperationQueue::unfinishedCount() const {
  std::lock_guard<std::mutex> guard(mutex_);
  return queue_.size() + running_;
}

std::size_t OperationQueue::runningCount() const {
  std::lock_guard<std::mutex> guard(mutex_);
  return running_;
}

std::size_t OperationQueue::peakRunningCount() const {
  std::lock_guard<std::mutex> guard(mutex_);
  return peak_;
}

void OperationQueue::workerLoop() {
  // Thread names are limited to 15 characters; enough to tell the queues apart in a debugger.
  pthread_setname_np(pthread_self(), name_.substr(0, 15).c_str());
  std::unique_lock<std::mutex> lock(mutex_);
  for (;;) {
    workAvailable_.wait(lock, [&] {
      return (!queue_.empty() && running_ < maxConcurrent_) || (stopping_ && queue_.empty());
    });
    if (queue_.empty()) return;  // stopping, and everything has been started
    std::function<void()> operation = std::move(queue_.front());
    queue_.pop_front();
    ++running_;
    peak_ = std::max(peak_, running_);
    lock.unlock();
    operation();
    operation = nullptr;  // whatever it captured goes before the next operation starts
    lock.lock();
    --running_;
    if (queue_.empty() && running_ == 0) idle_.notify_all();
    // A slot is free: a worker that was held back by the limit may start.
    if (!queue_.empty()) workAvailable_.notify_one();
    if (stopping_ && queue_.empty()) workAvailable_.notify_all();
  }
}

}  // namespace appsync
