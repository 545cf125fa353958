// A value and the lock that guards it: every access to the value holds the lock.
#pragma once

#include <mutex>
#include <utility>

namespace appsync {

template <class T>
class Guarded {
 public:
  Guarded() = default;
  explicit Guarded(T value) : value_(std::move(value)) {}
  Guarded(const Guarded&) = delete;
  Guarded& operator=(const Guarded&) = delete;

  // A copy of the value.
  T get() const {
    std::lock_guard lock(mutex_);
    return value_;
  }

  void set(T value) {
    std::lock_guard lock(mutex_);
    value_ = std::move(value);
  }

  // Runs `f` on the value with the lock held and returns a copy of its result, so nothing
  // that refers into the value escapes the lock. `f` must not use this object again.
  template <class F>
  auto with(F&& f) {
    std::lock_guard lock(mutex_);
    return std::forward<F>(f)(value_);
  }
  template <class F>
  auto with(F&& f) const {
    std::lock_guard lock(mutex_);
    return std::forward<F>(f)(std::as_const(value_));
  }

 private:
  mutable std::mutex mutex_;
  T value_{};
};

}  // namespace appsync
