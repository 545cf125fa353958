// The group: a count of work in flight that waiters can block on.
#include "runtime/dispatch/group.h"

#include <cstdio>
#include <cstdlib>

namespace appsync {

void Group::enter() {
  std::lock_guard<std::mutex> guard(mutex_);
  ++count_;
}

void Group::leave() {
  std::lock_guard<std::mutex> guard(mutex_);
  if (count_ == 0) {
    std::fprintf(stderr, "Group: leave() without a matching enter()\n");
    std::fflush(stderr);
    std::abort();
  }
  if (--count_ == 0) cv_.notify_all();
}

std::int64_t Group::count() const {
  std::lock_guard<std::mutex> guard(mutex_);
  return count_;
}

void Group::wait() {
  std::unique_lock<std::mutex> lock(mutex_);
  cv_.wait(lock, [&] { return count_ == 0; });
}

bool Group::waitUntil(Clock& clock, TimePoint deadline) {
  std::unique_lock<std::mutex> lock(mutex_);
  return clock.waitUntil(lock, cv_, deadline, [&] { return count_ == 0; });
}

}  // namespace appsync
