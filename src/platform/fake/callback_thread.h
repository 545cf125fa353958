// A serial thread on which a fake service delivers its callbacks, as the platform would: in the
// order they were posted, on a thread that is not the caller's.
#pragma once

#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <mutex>
#include <string>
#include <thread>

namespace appsync {

class CallbackThread {
 public:
  // Starts the thread. `name` shows in debuggers (the first 15 characters).
  explicit CallbackThread(std::string name);
  // Lets held callbacks go, runs everything still queued, and joins the thread. Must not run on
  // the thread itself.
  ~CallbackThread();
  CallbackThread(const CallbackThread&) = delete;
  CallbackThread& operator=(const CallbackThread&) = delete;

  const std::string& name() const { return name_; }

  // Queues `callback` to run after everything posted before it. Safe from any thread, including
  // from a callback.
  void post(std::function<void()> callback);

  // Blocks until every callback posted before this call has run. While the thread is held this
  // waits for release(). Calling it from the thread itself is a programming error and aborts.
  void drain();

  // Blocks until the callback running at this moment, if any, has finished (queued ones may
  // remain, and may be running by then). Returns at once when called from the thread itself. Used to guarantee that a callback that has already
  // started has also finished.
  void waitUntilIdle();

  // While held, posted callbacks are queued but none starts (one already running finishes).
  // Lets a test delay an event and observe the state in between.
  void hold();
  void release();
  bool isHeld() const;

  // Callbacks posted and not yet finished (held ones included).
  std::size_t pendingCount() const;

  // True when the calling thread is this callback thread.
  bool isCurrent() const;

 private:
  void run();

  const std::string name_;
  mutable std::mutex mutex_;
  std::condition_variable changed_;
  std::deque<std::function<void()>> queue_;
  std::uint64_t posted_ = 0;
  std::uint64_t finished_ = 0;
  bool running_ = false;
  bool held_ = false;
  bool stopping_ = false;
  std::thread::id threadId_;  // set by the thread itself, read under mutex_
  std::thread thread_;        // last: starts after everything above is initialised
};

}  // namespace appsync
