// How the fakes call back, as the client relies on: on a thread of their own, and never once an
// observer's removal has returned.
#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <future>
#include <thread>

#include "platform/fake/fake_platform.h"
#include "support/temp_dir.h"

namespace appsync {
namespace {

// Counts callbacks; while `blocking`, the first one waits until the test lets it go.
class Observer : public ARApplicationWorkspaceObserverProtocol {
 public:
  void applicationInstallsArePrioritized(const ARProxyList&, const ARProxyList&) override {
    if (std::this_thread::get_id() == caller) onCallerThread = true;
    if (blocking) {
      entered.set_value();
      letGo.get_future().wait();
    }
    ++calls;
  }
  void applicationInstallsDidCancel(const ARProxyList&) override { ++calls; }
  const std::thread::id caller = std::this_thread::get_id();
  std::atomic<bool> blocking{false}, onCallerThread{false};
  std::promise<void> entered, letGo;
  std::atomic<int> calls{0};
};

TEST(FakeCallbacksTest, RegistryObserverRemovalDropsHeldEventsAndWaitsForARunningOne) {
  testing::TempDir root;
  FakeARWorkspace ar(root.path());
  ar.putApplication({.identifier = "a.app"});
  Observer held;
  ar.callbackThread().hold();
  ar.addObserver(&held);
  ar.notifyInstallsDidCancel({"a.app"});
  ar.removeObserver(&held);  // must not wait for the held events
  ar.callbackThread().release();
  ar.drain();
  EXPECT_EQ(held.calls.load(), 0);

  Observer running;
  running.blocking = true;
  ar.addObserver(&running);  // the initial observation blocks on the registry's thread
  running.entered.get_future().wait();
  auto remover = std::async(std::launch::async, [&] {
    ar.removeObserver(&running);
    return running.calls.load();
  });
  EXPECT_EQ(remover.wait_for(std::chrono::milliseconds(5)), std::future_status::timeout);
  running.letGo.set_value();
  EXPECT_EQ(remover.get(), 1);
  EXPECT_FALSE(running.onCallerThread);
  EXPECT_EQ(ar.observerCount(), 0u);
}

TEST(FakeCallbacksTest, NotificationHeldAtRemovalIsNeverDelivered) {
  testing::TempDir root;
  ManualClock clock;
  FakeSystemServices system(root.path(), clock);
  struct Delivery {
    std::atomic<int> count{0};
    std::thread::id thread;  // of the last delivery
  } delivered;
  const auto count = [](void*, void* observer, const std::string&, const void*,
                        const plist::Dict*) {
    auto* d = static_cast<Delivery*>(observer);
    d->thread = std::this_thread::get_id();
    ++d->count;
  };
  const std::string name = "com.vantor.trc.TRStartupCompleteNotification";
  system.addNotificationObserver(&delivered, count, name);
  system.postNotification(name);
  EXPECT_EQ(delivered.count.load(), 1);  // delivered before postNotification returned
  EXPECT_NE(delivered.thread, std::this_thread::get_id());

  system.callbackThread().hold();
  std::thread poster([&] { system.postNotification(name); });
  while (system.callbackThread().pendingCount() == 0) std::this_thread::yield();
  system.removeNotificationObserver(&delivered, name);
  system.callbackThread().release();
  poster.join();
  EXPECT_EQ(delivered.count.load(), 1);
  EXPECT_EQ(system.notificationObserverCount(), 0u);
}

}  // namespace
}  // namespace appsync
