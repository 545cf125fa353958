// The fakes' callback thread: a queue drained by one thread, with hold and release.
#include "platform/fake/callback_thread.h"

#include <pthread.h>

#include <cstdio>
#include <cstdlib>
#include <utility>

namespace appsync {

CallbackThread::CallbackThread(std::string name)
    : name_(std::move(name)), thread_([this] { run(); }) {}

CallbackThread::~CallbackThread() {
  {
    std::lock_guard lock(mutex_);
    stopping_ = true;
    held_ = false;
  }
  changed_.notify_all();
  thread_.join();
}

void CallbackThread::post(std::function<void()> callback) {
  {
    std::lock_guard lock(mutex_);
    queue_.push_back(std::move(callback));
    ++posted_;
  }
  changed_.notify_all();
}

void CallbackThread::drain() {
  if (isCurrent()) {
    std::fprintf(stderr, "CallbackThread %s: drain() called from the thread itself\n",
                 name_.c_str());
    std::abort();
  }
  std::unique_lock lock(mutex_);
  const std::uint64_t target = posted_;
  changed_.wait(lock, [&] { return finished_ >= target; });
}

void CallbackThread::waitUntilIdle() {
  if (isCurrent()) return;
  std::unique_lock lock(mutex_);
  // Waits for the callback running now only: under a steady stream of callbacks the thread may
  // never be seen idle again.
  if (!running_) return;
  const std::uint64_t target = finished_ + 1;
  changed_.wait(lock, [&] { return finished_ >= target; });
}

void CallbackThread::hold() {
  std::lock_guard lock(mutex_);
  held_ = true;
}

void CallbackThread::release() {
  {
    std::lock_guard lock(mutex_);
    held_ = false;
  }
  changed_.notify_all();
}

bool CallbackThread::isHeld() const {
  std::lock_guard lock(mutex_);
  return held_;
}

std::size_t CallbackThread::pendingCount() const {
  std::lock_guard lock(mutex_);
  return static_cast<std::size_t>(posted_ - finished_);
}

bool CallbackThread::isCurrent() const {
  std::lock_guard lock(mutex_);
  return std::this_thread::get_id() == threadId_;
}

void CallbackThread::run() {
  // Linux limits thread names to 15 characters.
  pthread_setname_np(pthread_self(), name_.substr(0, 15).c_str());
  std::unique_lock lock(mutex_);
  threadId_ = std::this_thread::get_id();
  for (;;) {
    changed_.wait(lock,
                  [&] { return (!held_ && !queue_.empty()) || (stopping_ && queue_.empty()); });
    if (queue_.empty()) return;  // stopping, and everything has run
    std::function<void()> callback = std::move(queue_.front());
    queue_.pop_front();
    running_ = true;
    lock.unlock();
    callback();
    callback = nullptr;  // whatever it captured goes before the next one starts
    lock.lock();
    running_ = false;
    ++finished_;
    changed_.notify_all();
  }
}

}  // namespace appsync
