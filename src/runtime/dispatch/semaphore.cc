// The counting semaphore.
#include "runtime/dispatch/semaphore.h"

namespace appsync {

void Semaphore::signal() {
  std::lock_guard<std::mutex> guard(mutex_);
  ++count_;
  // Every waiter re-checks: one woken by this signal may be giving up at its deadline, and the
  // signal must then reach another.
  cv_.notify_all();
}

void Semaphore::wait() {
  std::unique_lock<std::mutex> lock(mutex_);
  cv_.wait(lock, [&] { return count_ > 0; });
  --count_;
}

bool Semaphore::waitUntil(Clock& clock, TimePoint deadline) {
  std::unique_lock<std::mutex> lock(mutex_);
  if (!clock.waitUntil(lock, cv_, deadline, [&] { return count_ > 0; })) return false;
  --count_;
  return true;
}

}  // namespace appsync
