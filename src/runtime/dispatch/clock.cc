// The system clock and the manual clock that tests drive by hand.
#include "runtime/dispatch/clock.h"

#include <vector>

namespace appsync {

TimePoint SystemClock::now() const {
  return std::chrono::time_point_cast<Duration>(std::chrono::steady_clock::now());
}

bool SystemClock::waitUntil(std::unique_lock<std::mutex>& lock, std::condition_variable& cv,
                            TimePoint deadline, const std::function<bool()>& ready) {
  return cv.wait_until(lock, deadline, ready);
}

ManualClock::ManualClock() : now_(TimePoint{}) {}

TimePoint ManualClock::now() const {
  std::lock_guard<std::mutex> guard(mutex_);
  return now_;
}

bool ManualClock::waitUntil(std::unique_lock<std::mutex>& lock, std::condition_variable& cv,
                            TimePoint deadline, const std::function<bool()>& ready) {
  if (ready()) return true;
  std::list<Waiter>::iterator self;
  {
    std::lock_guard<std::mutex> guard(mutex_);
    if (now_ >= deadline) return false;
    // Registered while `lock` is held: an advance that happens from here on has to take that
    // lock to notify us, which it only gets once we are inside cv.wait().
    self = waiters_.insert(waiters_.end(), Waiter{lock.mutex(), &cv, deadline});
    changed_.notify_all();
  }
  while (!ready() && now() < deadline) cv.wait(lock);
  removeWaiter(self, lock);
  return ready();
}

void ManualClock::removeWaiter(std::list<Waiter>::iterator waiter,
                               std::unique_lock<std::mutex>& userLock) {
  std::unique_lock<std::mutex> guard(mutex_);
  if (waiter->notifying == 0) {
    waiters_.erase(waiter);
    changed_.notify_all();
    return;
  }
  // An advance is about to lock our mutex and notify our condition variable. Let it finish
  // before the caller may destroy either; it needs our mutex, so release it meanwhile.
  waiter->leaving = true;
  changed_.notify_all();
  guard.unlock();
  userLock.unlock();
  guard.lock();
  changed_.wait(guard, [&] { return waiter->notifying == 0; });
  waiters_.erase(waiter);
  changed_.notify_all();
  guard.unlock();
  userLock.lock();
}

void ManualClock::advance(Duration by) {
  std::vector<Waiter*> toWake;
  {
    std::lock_guard<std::mutex> guard(mutex_);
    now_ += by;
    for (Waiter& w : waiters_) {
      if (w.leaving) continue;
      ++w.notifying;
      toWake.push_back(&w);
    }
  }
  // Taking each waiter's mutex before notifying closes the gap between its deadline check and
  // its wait. The clock's own mutex is not held here: a waiter calls now() under its mutex.
  for (Waiter* w : toWake) {
    std::lock_guard<std::mutex> waiterGuard(*w->mutex);
    w->cv->notify_all();
  }
  std::lock_guard<std::mutex> guard(mutex_);
  for (Waiter* w : toWake) --w->notifying;
  changed_.notify_all();
}

void ManualClock::waitForWaiters(std::size_t n) const {
  std::unique_lock<std::mutex> guard(mutex_);
  changed_.wait(guard, [&] {
    std::size_t count = 0;
    for (const Waiter& w : waiters_) count += w.leaving ? 0 : 1;
    return count >= n;
  });
}

std::size_t ManualClock::waiterCount() const {
  std::lock_guard<std::mutex> guard(mutex_);
  std::size_t count = 0;
  for (const Waiter& w : waiters_) count += w.leaving ? 0 : 1;
  return count;
}

std::optional<TimePoint> ManualClock::earliestDeadline() const {
  std::lock_guard<std::mutex> guard(mutex_);
  std::optional<TimePoint> earliest;
  for (const Waiter& w : waiters_) {
    if (!w.leaving && (!earliest || w.deadline < *earliest)) earliest = w.deadline;
  }
  return earliest;
}

void ManualClock::waitForDueWaiters() const {
  std::unique_lock<std::mutex> guard(mutex_);
  // A record stays until its thread has left waitUntil; removeWaiter notifies changed_.
  changed_.wait(guard, [&] {
    for (const Waiter& w : waiters_) {
      if (w.deadline <= now_) return false;
    }
    return true;
  });
}

}  // namespace appsync
