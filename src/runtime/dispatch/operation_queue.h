// An operation queue: runs submitted operations on worker threads of its own, never more than
// its concurrency limit at once, in submission order of starting.
#pragma once

#include <condition_variable>
#include <cstddef>
#include <deque>
#include <functional>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

namespace appsync {

class OperationQueue {
 public:
  explicit OperationQueue(std::string name, std::size_t maxConcurrentOperations = 1);
  // Runs every operation already added (queued ones included) before returning.
  ~OperationQueue();
  OperationQueue(const OperationQueue&) = delete;
  OperationQueue& operator=(const OperationQueue&) = delete;

  // Applies to operations that start from now on; running ones are not interrupted. Zero is
  // taken as one.
  void setMaxConcurrentOperationCount(std::size_t n);
  std::size_t maxConcurrentOperationCount() const;

  // Returns at once; `operation` runs later on one of the queue's threads.
  void addOperation(std::function<void()> operation);

  // Blocks until no operation is queued or running.
  void waitUntilAllOperationsAreFinished();

  // How many operations are queued or running right now.
  std::size_t unfinishedCount() const;
  // How many operations are running right now, and the most that ever ran at once.
  std::size_t runningCount() const;
  std::size_t peakRunningCount() const;

 private:
  void workerLoop();
  // Starts workers, up to the limit, until there is one for every queued or running operation.
  void addWorkersLocked();

  std::string name_;
  mutable std::mutex mutex_;
  std::condition_variable workAvailable_;
  std::condition_variable idle_;
  std::deque<std::function<void()>> queue_;
  std::vector<std::thread> workers_;
  std::size_t maxConcurrent_;
  std::size_t running_ = 0;
  std::size_t peak_ = 0;
  bool stopping_ = false;
};

}  // namespace appsync
