// How the fakes call back, as the client relies on: completions on a thread of their own (a
// scripted failure included), and no callback once an observer's removal has returned.
#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <functional>
#include <future>
#include <mutex>
#include <set>
#include <thread>
#include <vector>

#include "platform/fake/fake_platform.h"
#include "runtime/plist/codec.h"
#include "support/temp_dir.h"

namespace appsync {
namespace {

using Done = std::function<void(ErrorRef)>;

TEST(FakeCallbacksTest, CompletionsArriveOnAnotherThread) {
  struct Case {
    const char* name;
    // Starts the operation; with `fail`, a failure is scripted for this one call.
    std::function<void(FakePlatform&, bool fail, Done)> start;
  };
  const Case cases[] = {
      {"receipt refresh",
       [](FakePlatform& d, bool fail, Done done) {
         if (fail) d.bz().failOperation("refreshReceiptsWithCompletionBlock:", nullptr, 1);
         d.bz().newSoftwareLibrary()->refreshReceiptsWithCompletionBlock(std::move(done));
       }},
      {"asset prioritisation",
       [](FakePlatform& d, bool fail, Done done) {
         if (fail)
           d.tr().deviceService().failOperation("prioritizeAsset:withCompletion:", nullptr, 1);
         d.tr().TRDeviceServiceSharedInstance()->prioritizeAsset(
             TRAsset::downloadAssetWithIdentifier("com.a", "Application", "A"), std::move(done));
       }},
      {"uninstall",
       [](FakePlatform& d, bool fail, Done done) {
         d.ar().putApplication({.identifier = "com.a"});
         if (fail) {
           d.kc().failOperation(
               "uninstallAppWithBundleID:requestUserConfirmation:completion:", nullptr, 1);
         }
         d.kc().uninstallAppWithBundleID("com.a", false, std::move(done));
       }},
  };
  for (const Case& c : cases) {
    for (bool fail : {false, true}) {
      SCOPED_TRACE(std::string(c.name) + (fail ? " failing" : ""));
      testing::TempDir root;
      FakePlatform device(root.path());
      std::promise<std::pair<ErrorRef, std::thread::id>> called;
      c.start(device, fail, [&](ErrorRef e) { called.set_value({e, std::this_thread::get_id()}); });
      const auto [error, thread] = called.get_future().get();
      EXPECT_EQ(error != nullptr, fail);
      EXPECT_NE(thread, std::this_thread::get_id());
    }
  }
}

// Counts callbacks; while `blocking`, the first one waits until the test lets it go.
class Observer : public ARApplicationWorkspaceObserverProtocol {
 public:
  void applicationInstallsArePrioritized(const ARProxyList&, const ARProxyList&) override {
    if (blocking) {
      entered.set_value();
      letGo.get_future().wait();
    }
    ++calls;
  }
  void applicationInstallsDidCancel(const ARProxyList&) override { ++calls; }
  void applicationsDidInstall(const ARProxyList&) override { ++calls; }
  void applicationsDidUninstall(const ARProxyList&) override { ++calls; }
  bool blocking = false;
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
  EXPECT_EQ(ar.observerCount(), 0u);
}

TEST(FakeCallbacksTest, NotificationHeldAtRemovalIsNeverDelivered) {
  testing::TempDir root;
  ManualClock clock;
  FakeSystemServices system(root.path(), clock);
  std::atomic<int> delivered{0};
  const auto count = [](void*, void* observer, const std::string&, const void*,
                        const plist::Dict*) { ++*static_cast<std::atomic<int>*>(observer); };
  const std::string name = "com.vantor.trc.TRStartupCompleteNotification";
  system.addNotificationObserver(&delivered, count, name);
  system.postNotification(name);
  EXPECT_EQ(delivered.load(), 1);  // delivered before postNotification returned

  system.callbackThread().hold();
  std::thread poster([&] { system.postNotification(name); });
  while (system.callbackThread().pendingCount() == 0) std::this_thread::yield();
  system.removeNotificationObserver(&delivered, name);
  system.callbackThread().release();
  poster.join();
  EXPECT_EQ(delivered.load(), 1);
  EXPECT_EQ(system.notificationObserverCount(), 0u);
}

TEST(CallbackThreadTest, RunsInOrderOnItsOwnThreadAndDeliversHeldWorkAtDestruction) {
  std::mutex mutex;
  std::vector<int> order;
  std::set<std::thread::id> threads;
  const auto record = [&](int i) {
    return [&, i] {
      std::lock_guard lock(mutex);
      order.push_back(i);
      threads.insert(std::this_thread::get_id());
    };
  };
  {
    CallbackThread thread("test");
    for (int i = 0; i < 20; ++i) thread.post(record(i));
    thread.post([&] { thread.post(record(20)); });  // a callback may post
    thread.drain();
    thread.hold();
    thread.post(record(21));
    thread.waitUntilIdle();  // nothing runs while held, so this must not wait for release
    EXPECT_EQ(thread.pendingCount(), 1u);
  }
  std::vector<int> expected(22);
  for (int i = 0; i < 22; ++i) expected[i] = i;
  EXPECT_EQ(order, expected);
  EXPECT_EQ(threads.size(), 1u);
  EXPECT_FALSE(threads.contains(std::this_thread::get_id()));
}

TEST(FakePVHomeScreenTest, IconOrderBufferBelongsToTheReceiver) {
  PVBuffer buffer;
  std::uint32_t length = 0;
  {
    FakePVHomeScreen pv;
    pv.setIconOrder({"b.app", "a.app"});
    ASSERT_EQ(pv.PVGetFlattenedIconState(pv.PVSPavilionBlockableServerPort(), 1, &buffer, &length),
              0);
    EXPECT_EQ(pv.outstandingBuffers(), 1u);
  }
  // The buffer outlives the home screen that handed it out.
  EXPECT_EQ(plist::parse({buffer.get(), length}), plist::Value(plist::Array{"b.app", "a.app"}));
}

}  // namespace
}  // namespace appsync
