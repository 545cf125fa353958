// Which delegates hear a coordinator's events from the install-coordination fake, on its thread,
// also while registrations come and go.
#include <gtest/gtest.h>

#include <atomic>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "platform/fake/fake_platform.h"
#include "support/temp_dir.h"

namespace appsync {
namespace {

using Events = std::vector<std::string>;
using Coordinator = std::shared_ptr<KCAppInstallCoordinator>;
constexpr std::uint64_t kClient = kAppSyncCoordinationClient;

// Each event as "what bundleID"; an event on the thread that made the recorder is marked.
class Recorder : public KCAppInstallObserverDelegate {
 public:
  void coordinatorDidInstallPlaceholder(const Coordinator& c) override { add("placeholder", c); }
  void coordinatorDidCompleteSuccessfully(const Coordinator& c) override { add("complete", c); }
  void coordinatorShouldPrioritize(const Coordinator& c) override { add("prioritize", c); }
  void coordinator(const Coordinator& c, const ErrorRef&, std::uint64_t) override {
    add("cancel", c);
  }
  void promiseDidBeginFulfillmentWithIdentifier(std::uint64_t) override { add("promise", nullptr); }
  Events events() const {
    std::lock_guard lock(mutex_);
    return events_;
  }

 private:
  void add(const std::string& what, const Coordinator& c) {
    std::lock_guard lock(mutex_);
    events_.push_back(what + " " + (c ? c->bundleID() : "") +
                      (std::this_thread::get_id() == caller_ ? " on the caller's thread" : ""));
  }
  const std::thread::id caller_ = std::this_thread::get_id();
  mutable std::mutex mutex_;
  Events events_;
};

class FakeKCTest : public ::testing::Test {
 protected:
  // Declared before the service so that they outlive it.
  Recorder observer, registered, otherClient;
  testing::TempDir root;
  FakeARWorkspace registry{root.path()};
  FakeKCInstallCoordination kc{registry};
  std::shared_ptr<KCAppInstallObserver> registration =
      kc.initAppInstallObserver("com.vantor.trc.zpc.icappobserverdelegate", {kClient}, &registered);
  std::shared_ptr<KCAppInstallObserver> otherRegistration =
      kc.initAppInstallObserver("other.service", {9}, &otherClient);
};

TEST_F(FakeKCTest, EventsReachTheCreatorsRegistrationsOnlyWhileTheyLive) {
  kc.putCoordinator(KCCoordinatorKind::Initiating, "com.foreign", 9)->setObserver(&observer);
  kc.putCoordinator(KCCoordinatorKind::Initiating, "com.ours", kClient);
  ASSERT_TRUE(kc.requestPrioritize("com.foreign"));
  ASSERT_TRUE(kc.requestPrioritize("com.ours"));
  kc.drain();
  EXPECT_EQ(observer.events(), Events{"prioritize com.foreign"});
  EXPECT_EQ(otherClient.events(), Events{"prioritize com.foreign"});
  EXPECT_EQ(registered.events(), Events{"prioritize com.ours"});

  registration.reset();
  kc.removeObserver(&observer);
  kc.requestPrioritize("com.foreign");
  kc.requestPrioritize("com.ours");
  kc.drain();
  EXPECT_EQ(observer.events().size(), 1u);
  EXPECT_EQ(registered.events().size(), 1u);
  EXPECT_EQ(otherClient.events().size(), 2u);
}

// Under ThreadSanitizer: once a registration is dropped, no event reaches its delegate, even
// while events flow from another thread.
TEST_F(FakeKCTest, DroppingARegistrationWhileEventsFlow) {
  kc.putCoordinator(KCCoordinatorKind::Initiating, "com.busy", kClient);
  std::atomic<bool> done{false};
  std::thread producer([&] {
    for (int i = 0; i < 5000 && !done; ++i) kc.requestPrioritize("com.busy");
  });
  for (int i = 0; i < 20; ++i) {
    Recorder transient;
    auto r = kc.initAppInstallObserver("transient", {kClient}, &transient);
    std::this_thread::yield();
    r.reset();
    const std::size_t seen = transient.events().size();
    kc.requestPrioritize("com.busy");
    std::this_thread::yield();
    EXPECT_EQ(transient.events().size(), seen);
  }
  done = true;
  producer.join();
  kc.drain();
}

}  // namespace
}  // namespace appsync
