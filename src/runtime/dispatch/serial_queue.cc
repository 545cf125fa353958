// The serial queue: exclusive, in-order execution of work on the caller's thread.
#include "runtime/dispatch/serial_queue.h"

#include <cstdio>
#include <cstdlib>

namespace appsync {

namespace {

// The queues whose items the current thread is running: a chain of frames on the stacks of the
// sync() calls, innermost first. A plain pointer has nothing to destroy, so the chain stays
// usable on a thread that is ending and during static destruction (a client destroyed then).
struct Frame {
  const SerialQueue* queue;
  const Frame* outer;
};
thread_local const Frame* tInnermost = nullptr;

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
  const Frame frame{this, tInnermost};
  tInnermost = &frame;
  struct Pop {
    const Frame& frame;
    ~Pop() { tInnermost = frame.outer; }
  } pop{frame};
  work();
}

bool SerialQueue::isCurrent() const {
  for (const Frame* frame = tInnermost; frame; frame = frame->outer) {
    if (frame->queue == this) return true;
  }
  return false;
}

}  // namespace appsync
