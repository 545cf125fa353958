// The client object's lifecycle: construction steps, the start-up hand-shake inside and outside
// the host daemon, restrictions, the install-attempt counter and teardown.
#include "client/apps_client.h"

#include <gtest/gtest.h>

#include <thread>
#include <vector>

#include "platform/fake/fake_platform.h"
#include "support/temp_dir.h"

namespace appsync {
namespace {

FakePlatform::Options insideHostDaemon(bool coordination = true) {
  FakePlatform::Options options;
  options.mainBundleIdentifier = "com.vantor.trc";
  options.coordination = coordination;
  return options;
}

TEST(AppsClientTest, ConstructionRegistersInitialisesAndChoosesTheRoad) {
  for (bool coordination : {false, true}) {
    SCOPED_TRACE(coordination);
    testing::TempDir root;
    FakePlatform::Options options;
    options.coordination = coordination;
    FakePlatform device(root.path(), options);
    {
      AppsClient client(device.platform());
      EXPECT_EQ(client.useInstallCoordinator(), coordination);
      EXPECT_EQ(device.ar().observerCount(), 1u);
      auto logs = device.transactionLog().initializeCalls();
      ASSERT_EQ(logs.size(), 1u);
      EXPECT_EQ(logs[0]->subsystem, "com.vantor.appinstallation");
      EXPECT_EQ(logs[0]->category, "trc.appsync");
      EXPECT_EQ(client.supportedDataclasses(), std::vector<std::string>{"Application"});
    }
    EXPECT_EQ(device.ar().observerCount(), 0u);
  }
}

TEST(AppsClientTest, OutsideTheHostDaemonNoStartupHandshakeHappens) {
  testing::TempDir root;
  FakePlatform device(root.path());
  AppsClient client(device.platform());
  EXPECT_FALSE(client.finishedWaitingForPlaceHolderInstalls());
  EXPECT_EQ(device.system().notificationObserverCount(), 0u);
  device.system().postNotification("com.vantor.trc.TRStartupCompleteNotification");
  EXPECT_FALSE(client.hasInstallCoordinatorObserver());
  EXPECT_EQ(device.kc().callCount("initWithMachServiceName:forClients:delegate:"), 0u);
}

TEST(AppsClientTest, InsideTheHostDaemonStartupCreatesTheObserverOnce) {
  testing::TempDir root;
  FakePlatform device(root.path(), insideHostDaemon());
  {
    AppsClient client(device.platform());
    EXPECT_TRUE(client.finishedWaitingForPlaceHolderInstalls());
    EXPECT_EQ(device.system().notificationObserverCount(), 1u);
    EXPECT_FALSE(client.hasInstallCoordinatorObserver());

    device.system().postNotification("com.vantor.trc.TRStartupCompleteNotification");
    EXPECT_TRUE(client.hasInstallCoordinatorObserver());
    device.system().postNotification("com.vantor.trc.TRStartupCompleteNotification");
    EXPECT_EQ(device.kc().callCount("initWithMachServiceName:forClients:delegate:"), 1u);

    // Other notifications are not the start-up notification.
    device.system().postNotification("com.vantor.trc.SomethingElse");
    EXPECT_EQ(device.kc().callCount("initWithMachServiceName:forClients:delegate:"), 1u);
  }
  EXPECT_EQ(device.system().notificationObserverCount(), 0u);
}

TEST(AppsClientTest, StartupCallbackWithoutObserverDoesNothing) {
  testing::TempDir root;
  FakePlatform device(root.path(), insideHostDaemon());
  AppsClient client(device.platform());
  AppsClient::_handleTRCStartupCompletedNotification(nullptr, nullptr,
                                                     "com.vantor.trc.TRStartupCompleteNotification",
                                                     nullptr, nullptr);
  EXPECT_FALSE(client.hasInstallCoordinatorObserver());
  AppsClient::_handleTRCStartupCompletedNotification(nullptr, &client, "", nullptr, nullptr);
  EXPECT_TRUE(client.hasInstallCoordinatorObserver());
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
  client._countAppInstallAttempt();
  client._countAppInstallAttempt();
  EXPECT_EQ(client._getAndResetNumAppInstallsAttempted(), 2u);
  EXPECT_EQ(client._getAndResetNumAppInstallsAttempted(), 0u);

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

TEST(AppsClientDeathTest, UnimplementedOptionalOperationsAbortWithTheirName) {
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  testing::TempDir root;
  FakePlatform device(root.path());
  AppsClient client(device.platform());
  EXPECT_FALSE(client.respondsTo(TRClientOperation::backupEnded));
  EXPECT_FALSE(client.respondsTo(TRClientOperation::cancelSyncOperations));
  EXPECT_DEATH(client.backupEnded(), "backupEnded is not implemented by this client");
}

}  // namespace
}  // namespace appsync
