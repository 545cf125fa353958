// A serial work queue: work items run one at a time, in submission order.
#pragma once

#include <functional>
#include <mutex>
#include <string>

namespace appsync {

class SerialQueue {
 public:
  explicit SerialQueue(std::string label);
  SerialQueue(const SerialQueue&) = delete;
  SerialQueue& operator=(const SerialQueue&) = delete;

  const std::string& label() const { return label_; }

  // Runs `work` on the calling thread, exclusively with every other item of this queue, and
  // returns when it has run. Submitting to a queue from one of its own items would deadlock;
  // it is a programming error and aborts with a message naming the queue.
  void sync(const std::function<void()>& work);

  // True when the calling thread is running an item of this queue.
  bool isCurrent() const;

 private:
  std::string label_;
  std::mutex mutex_;
};

}  // namespace appsync
