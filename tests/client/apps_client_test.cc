// The client object's lifecycle: construction steps, the start-up hand-shake inside and outside
// the host daemon, restrictions, the install-attempt counter and teardown.
#include "client/apps_client.h"

#include <gtest/gtest.h>

#include <atomic>
#include <functional>
#include <map>
#include <set>
#include <thread>
#include <vector>

#include "platform/ar_wrapper.h"
#include "platform/fake/fake_platform.h"
#include "platform/kc_wrapper.h"
#include "platform/system_wrapper.h"
#include "support/temp_dir.h"

namespace appsync {

struct AppsClientTestAccess {
  static void addOutstandingTransfer(AppsClient& client, std::string id) {
    client._outstandingPFTTransfers.with([&](auto& outstanding) { outstanding.insert(id); });
  }
  static void addRestoringPlaceholder(AppsClient& client, std::string id) {
    client._restoreQueue->sync([&] { client._placeholdersForRestoringApps.insert(id); });
  }
};

namespace {

FakePlatform::Options insideHostDaemon(bool coordination = true, bool host = true) {
  FakePlatform::Options options{.coordination = coordination};
  if (host) options.mainBundleIdentifier = "com.vantor.trc";
  return options;
}

// What a service sees of the client at the moment the client registers with it.
struct SeenAtRegistration {
  bool registered = false;
  bool useInstallCoordinator = false;
  bool finishedWaiting = false;
};

SeenAtRegistration look(void* observer) {
  auto* client = static_cast<AppsClient*>(observer);
  return {true, client->useInstallCoordinator(), client->finishedWaitingForPlaceHolderInstalls()};
}

class WatchedRegistry : public ARApplicationWorkspaceWrapper {
 public:
  using ARApplicationWorkspaceWrapper::ARApplicationWorkspaceWrapper;
  void addObserver(ARApplicationWorkspaceObserverProtocol* observer) override {
    seen = look(dynamic_cast<AppsClient*>(observer));
    ARApplicationWorkspaceWrapper::addObserver(observer);
  }
  SeenAtRegistration seen;
};

class WatchedSystem : public SystemServicesWrapper {
 public:
  using SystemServicesWrapper::SystemServicesWrapper;
  void addNotificationObserver(void* observer, NotificationCallback callback,
                               const std::string& name) override {
    seen = look(observer);
    SystemServicesWrapper::addNotificationObserver(observer, callback, name);
  }
  SeenAtRegistration seen;
};

// Construction registers with the services, initialises the transaction log and chooses the
// road; the services see a whole client when it registers, and teardown unregisters.
TEST(AppsClientTest, ServicesSeeAWholeClientWhenItRegisters) {
  for (bool coordination : {false, true}) {
    for (bool host : {false, true}) {
      SCOPED_TRACE(::testing::Message() << "coordination " << coordination << " host " << host);
      testing::TempDir root;
      FakePlatform device(root.path(), insideHostDaemon(coordination, host));
      WatchedRegistry registry(device.ar());
      WatchedSystem system(device.system());
      {
        AppsClient client(device.platform().with(registry).with(system));
        EXPECT_EQ(client.useInstallCoordinator(), coordination);
        EXPECT_FALSE(client.hasInstallCoordinatorObserver());  // not before the start-up
        EXPECT_EQ(device.ar().observerCount(), 1u);
        EXPECT_EQ(device.system().notificationObserverCount(), host ? 1u : 0u);
        auto logs = device.transactionLog().initializeCalls();
        ASSERT_EQ(logs.size(), 1u);
        EXPECT_EQ(logs[0]->subsystem, "com.vantor.appinstallation");
        EXPECT_EQ(logs[0]->category, "trc.appsync");
      }
      EXPECT_EQ(device.ar().observerCount(), 0u);
      EXPECT_EQ(device.system().notificationObserverCount(), 0u);
      EXPECT_TRUE(registry.seen.registered);
      EXPECT_EQ(registry.seen.useInstallCoordinator, coordination);
      EXPECT_EQ(registry.seen.finishedWaiting, host);
      EXPECT_EQ(system.seen.registered, host);
      EXPECT_EQ(system.seen.useInstallCoordinator, host && coordination);
    }
  }
}

// Asks the client about its observer from another thread, as a delivery on a service thread
// would, while the service is creating or dropping that observer.
bool askFromAnotherThread(AppsClient* client) {
  bool has = false;
  std::thread([&] { has = client->hasInstallCoordinatorObserver(); }).join();
  return has;
}

class ObserverThatAsksWhenDropped : public KCAppInstallObserver {
 public:
  ObserverThatAsksWhenDropped(std::shared_ptr<KCAppInstallObserver> inner, AppsClient* client)
      : inner_(std::move(inner)), client_(client) {}
  ~ObserverThatAsksWhenDropped() override { askFromAnotherThread(client_); }
  const std::string& machServiceName() const override { return inner_->machServiceName(); }
  const std::set<std::uint64_t>& clients() const override { return inner_->clients(); }

 private:
  std::shared_ptr<KCAppInstallObserver> inner_;
  AppsClient* client_;
};

class CoordinationThatAsks : public KCInstallCoordinationWrapper {
 public:
  using KCInstallCoordinationWrapper::KCInstallCoordinationWrapper;
  std::shared_ptr<KCAppInstallObserver> initAppInstallObserver(
      const std::string& machServiceName, const std::set<std::uint64_t>& clients,
      KCAppInstallObserverDelegate* delegate) override {
    serviceName = machServiceName;
    clientNumbers = clients;
    auto observer =
        KCInstallCoordinationWrapper::initAppInstallObserver(machServiceName, clients, delegate);
    askedDuringCreation = askFromAnotherThread(client);
    return std::make_shared<ObserverThatAsksWhenDropped>(observer, client);
  }
  AppsClient* client = nullptr;
  std::string serviceName;
  std::set<std::uint64_t> clientNumbers;
  bool askedDuringCreation = true;
};

TEST(AppsClientTest, TheObserverIsCreatedAndDroppedWithoutHoldingTheClient) {
  testing::TempDir root;
  FakePlatform device(root.path(), insideHostDaemon());
  CoordinationThatAsks coordination(device.kc());
  {
    AppsClient client(device.platform().with(coordination));
    coordination.client = &client;
    AppsClient::_handleTRCStartupCompletedNotification(nullptr, nullptr, "", nullptr, nullptr);
    device.system().postNotification("com.vantor.trc.SomethingElse");
    EXPECT_FALSE(client.hasInstallCoordinatorObserver());
    for (int post = 0; post < 2; ++post) {
      device.system().postNotification("com.vantor.trc.TRStartupCompleteNotification");
    }
    EXPECT_FALSE(coordination.askedDuringCreation);
    EXPECT_TRUE(client.hasInstallCoordinatorObserver());
    EXPECT_EQ(device.kc().callCount("initWithMachServiceName:forClients:delegate:"), 1u);
  }  // dropping the observer asks again
  EXPECT_EQ(coordination.serviceName, "com.vantor.trc.zpc.icappobserverdelegate");
  EXPECT_EQ(coordination.clientNumbers, std::set<std::uint64_t>{3});
}

TEST(AppsClientTest, TeardownWaitsForCallbacksInFlight) {
  // Start-up notifications and coordinator events keep arriving on the services' threads while
  // the client goes away; none may reach it afterwards (AddressSanitizer would see the freed
  // client) and none may deadlock with the teardown.
  for (int round = 0; round < 20; ++round) {
    testing::TempDir root;
    FakePlatform device(root.path(), insideHostDaemon());
    device.kc().putCoordinator(KCCoordinatorKind::Initiating, "com.a", kAppSyncCoordinationClient);
    auto client = std::make_unique<AppsClient>(device.platform());
    std::atomic<bool> stop{false};
    std::thread notifications([&] {
      while (!stop)
        device.system().postNotification("com.vantor.trc.TRStartupCompleteNotification");
    });
    std::thread events([&] {
      while (!stop) device.kc().requestPrioritize("com.a");
    });
    while (!client->hasInstallCoordinatorObserver()) std::this_thread::yield();
    client.reset();
    stop = true;
    notifications.join();
    events.join();
    device.kc().drain();
    device.system().drain();
  }
}

TEST(AppsClientTest, TeardownReportsUnfinishedWorkAtErrorLevel) {
  testing::TempDir root;
  FakePlatform device(root.path());
  std::string name;
  {
    AppsClient client(device.platform());
    name = client.describe();
    AppsClientTestAccess::addOutstandingTransfer(client, "com.a");
    AppsClientTestAccess::addOutstandingTransfer(client, "com.b");
    AppsClientTestAccess::addRestoringPlaceholder(client, "com.c");
  }
  auto lines = device.log().lines();
  ASSERT_EQ(lines.size(), 2u);
  EXPECT_EQ(lines[0].message, "com.vantor.trc.AppSync|" + name +
                                  " getting dealloc'd with 2 outstanding PFT transfers!");
  EXPECT_EQ(lines[1].message, "com.vantor.trc.AppSync|" + name +
                                  " getting dealloc'd with (com.c)pending placeholder install "
                                  "complete notifications");
  for (const auto& line : lines) {
    EXPECT_EQ(line.level, LogLevel::Error);
    EXPECT_EQ(line.category, 8);
  }

  // Without unfinished work, nothing is said.
  device.log().clear();
  { AppsClient client(device.platform()); }
  EXPECT_TRUE(device.log().lines().empty());
}

TEST(AppsClientTest, RestrictionsAllowUnlessExplicitlyForbidden) {
  testing::TempDir root;
  FakePlatform device(root.path());
  AppsClient client(device.platform());
  for (int value : {0, 1, 2, 7}) {
    SCOPED_TRACE(value);
    device.rs().setValue(RSFeatureAppInstallationAllowed, value);
    device.rs().setValue(RSFeatureAppRemovalAllowed, value == 2 ? 0 : 2);
    EXPECT_EQ(client._appInstallationAllowed(), value != 2);
    EXPECT_EQ(client._appRemovalAllowed(), value == 2);
  }
}

TEST(AppsClientTest, InstallAttemptCounterLosesNoIncrement) {
  testing::TempDir root;
  FakePlatform device(root.path());
  AppsClient client(device.platform());
  constexpr int kThreads = 4, kPerThread = 20000;
  std::atomic<bool> done{false};
  std::uint64_t collected = 0;
  std::thread reader([&] {
    while (!done.load()) collected += client._getAndResetNumAppInstallsAttempted();
  });
  std::vector<std::thread> writers;
  for (int t = 0; t < kThreads; ++t) {
    writers.emplace_back([&] {
      for (int i = 0; i < kPerThread; ++i) client._countAppInstallAttempt();
    });
  }
  for (auto& w : writers) w.join();
  done = true;
  reader.join();
  collected += client._getAndResetNumAppInstallsAttempted();
  EXPECT_EQ(collected, static_cast<std::uint64_t>(kThreads * kPerThread));
}

TEST(AppsClientDeathTest, TheOperationsItDoesNotClaimAbortWithTheirName) {
  // The scenarios call every operation the client claims. One it does not claim must abort
  // when called anyway: implementing an operation without claiming it fails here.
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  testing::TempDir root;
  FakePlatform device(root.path());
  AppsClient client(device.platform());
  using Op = TRClientOperation;
  auto asset = TRAsset::downloadAssetWithIdentifier("com.a", "Application", "A");
  std::vector<std::string> paths;
  const std::map<Op, std::function<void(AppsClient&)>> unclaimed = {
      {Op::prepareForSyncWithHostAnchorHostAuthIdentifierHostVersion,
       [](AppsClient& c) { c.prepareForSyncWithHostAnchor("a", 1, "v", nullptr, nullptr); }},
      {Op::reconcileRestoreWithError, [](AppsClient& c) { c.reconcileRestoreWithError(nullptr); }},
      {Op::restoreEndedWithError, [](AppsClient& c) { c.restoreEndedWithError(nullptr); }},
      {Op::cancelSyncOperations, [](AppsClient& c) { c.cancelSyncOperations(); }},
      {Op::registerMessageHandlersWithLink,
       [](AppsClient& c) { c.registerMessageHandlersWithLink(nullptr); }},
      {Op::outstandingAssetTransfersWithDownloadManager,
       [](AppsClient& c) { c.outstandingAssetTransfersWithDownloadManager(nullptr); }},
      {Op::metadataUpdate, [&](AppsClient& c) { c.metadataUpdate({}, asset, "a"); }},
      {Op::prioritizeAsset, [&](AppsClient& c) { c.prioritizeAsset(asset); }},
      {Op::initiateAssetDownloadsWithCompletion,
       [](AppsClient& c) { c.initiateAssetDownloadsWithCompletion(nullptr); }},
      {Op::backupEnded, [](AppsClient& c) { c.backupEnded(); }},
      {Op::pathsToBackup, [&](AppsClient& c) { c.pathsToBackup(&paths, &paths); }},
      {Op::shouldRestoreFile, [](AppsClient& c) { c.shouldRestoreFile("/x", nullptr); }},
      {Op::shouldBackgroundRestorePath,
       [](AppsClient& c) { c.shouldBackgroundRestorePath("/x", nullptr); }},
      {Op::shouldBackgroundRestoreFile,
       [](AppsClient& c) { c.shouldBackgroundRestoreFile("/x", nullptr); }},
  };
  for (int i = 0; i <= static_cast<int>(Op::shouldBackgroundRestoreFile); ++i) {
    const auto operation = static_cast<Op>(i);
    SCOPED_TRACE(operationName(operation));
    const auto call = unclaimed.find(operation);
    EXPECT_EQ(call == unclaimed.end(), client.respondsTo(operation));
    if (call == unclaimed.end()) continue;
    EXPECT_DEATH(call->second(client),
                 std::string(operationName(operation)) + " is not implemented by this client");
  }
}

}  // namespace
}  // namespace appsync
