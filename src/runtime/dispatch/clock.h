// Time, injected: the system clock in production, a manual clock in tests, so that a 30-second
// retry or an N x 5-second wait runs in milliseconds.
#pragma once

#include <chrono>
#include <condition_variable>
#include <functional>
#include <list>
#include <mutex>
#include <optional>

namespace appsync {

using Duration = std::chrono::nanoseconds;
using TimePoint = std::chrono::time_point<std::chrono::steady_clock, Duration>;

class Clock {
 public:
  virtual ~Clock() = default;
  virtual TimePoint now() const = 0;

  // Blocks until `ready()` is true or the clock has reached `deadline`, whichever is first.
  // `lock` must hold the mutex that guards what `ready` reads; whoever makes `ready` true must
  // notify `cv` while holding (or after releasing) that mutex. Returns ready().
  virtual bool waitUntil(std::unique_lock<std::mutex>& lock, std::condition_variable& cv,
                         TimePoint deadline, const std::function<bool()>& ready) = 0;
};

// The steady system clock.
class SystemClock final : public Clock {
 public:
  TimePoint now() const override;
  bool waitUntil(std::unique_lock<std::mutex>& lock, std::condition_variable& cv,
                 TimePoint deadline, const std::function<bool()>& ready) override;
};

// A clock that stands still until a test advances it. Waits with a deadline end when an
// advance reaches the deadline; waits whose condition becomes true end as usual.
class ManualClock final : public Clock {
 public:
  ManualClock();
  TimePoint now() const override;
  bool waitUntil(std::unique_lock<std::mutex>& lock, std::condition_variable& cv,
                 TimePoint deadline, const std::function<bool()>& ready) override;

  // Moves time forward and wakes every waiter so that it re-checks its deadline.
  void advance(Duration by);
  // Blocks until at least `n` threads are waiting on this clock with a deadline; lets a test
  // advance time only once the code under test has started to wait.
  void waitForWaiters(std::size_t n) const;
  std::size_t waiterCount() const;

  // The earliest deadline of the threads waiting now; absent when none waits with a deadline.
  // With waitForDueWaiters it lets a driver move time from one deadline to the next, so that
  // timers fire in order however far it moves.
  std::optional<TimePoint> earliestDeadline() const;
  // Blocks until every thread whose deadline the clock has reached has left its wait (it may
  // have started another, with a later deadline).
  void waitForDueWaiters() const;

 private:
  // A thread blocked in waitUntil, identified by the mutex and condition variable it waits on.
  // advance() notifies waiters without holding mutex_ (a waiter calls now() while holding its
  // own mutex), so a waiter that is being notified must not leave before the notification is
  // done: `notifying` counts advances still holding a reference to this record.
  struct Waiter {
    std::mutex* mutex;
    std::condition_variable* cv;
    TimePoint deadline;
    int notifying = 0;
    bool leaving = false;
  };
  void removeWaiter(std::list<Waiter>::iterator waiter, std::unique_lock<std::mutex>& userLock);

  mutable std::mutex mutex_;
  mutable std::condition_variable changed_;
  TimePoint now_;
  std::list<Waiter> waiters_;  // list: records keep their address while others come and go
};

}  // namespace appsync
