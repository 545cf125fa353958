// The serial queue: exclusive, in-order execution of work on the caller's thread.
#include "runtime/dispatch/serial_queue.h"

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <vector>

namespace appsync {

namespace {

// The queues whose items the current thread is running, innermost last.
thread_local std::vector<const SerialQueue*> tCurrentQueues;

}  // namespace

SerialQueue::SerialQueue(std::string label) : label_(std::move(label)) {}

void SerialQueue::sync(const std::function<void()>& work) {
  if (isCurrent()) {
    std::fprintf(stderr, "SerialQueue '%s': sync() called from inside the queue (deadlock)\n",
                 label_.c_str());
    std::fflush(stderr);
    std::abort();
  }
  std::lock_guard<std::mutex> guard(mutex_);
  tCurrentQueues.push_back(this);
  struct Pop {
    ~Pop() { tCurrentQueues.pop_back(); }
  } pop;
  work();
}

bool SerialQueue::isCurrent() const {
  return std::find(tCurrentQueues.begin(), tCurrentQueues.end(), this) != tCurrentQueues.end();
}

}  // namespace appsync
