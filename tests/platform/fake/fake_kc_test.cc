// The fake install-coordination service: coordinator lookup, placeholder and package installs
// into the fake registry, events on the service's thread, cancellation, uninstall, scripted
// failures, and holding events back.
#include "platform/fake/fake_kc.h"

#include <gtest/gtest.h>

#include <atomic>
#include <filesystem>
#include <fstream>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "platform/fake/fake_ar.h"
#include "support/temp_dir.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;

constexpr std::uint64_t kClient = kAppSyncCoordinationClient;

// Every event a delegate receives, with the thread it arrived on.
class Recorder : public KCAppInstallObserverDelegate {
 public:
  struct Event {
    std::string what;  // "placeholder", "complete", "prioritize", "cancel", "promise"
    std::string bundleID;
    ErrorRef error;            // the coordinator's error() when the event arrived
    ErrorRef reason;           // cancel only
    std::uint64_t number = 0;  // cancel: client; promise: identifier
    std::thread::id thread;
  };

  void coordinatorDidInstallPlaceholder(
      const std::shared_ptr<KCAppInstallCoordinator>& c) override {
    add("placeholder", c->bundleID(), c->error());
  }
  void coordinatorDidCompleteSuccessfully(
      const std::shared_ptr<KCAppInstallCoordinator>& c) override {
    add("complete", c->bundleID(), c->error());
  }
  void coordinatorShouldPrioritize(const std::shared_ptr<KCAppInstallCoordinator>& c) override {
    add("prioritize", c->bundleID(), c->error());
  }
  void coordinator(const std::shared_ptr<KCAppInstallCoordinator>& c, const ErrorRef& reason,
                   std::uint64_t client) override {
    add("cancel", c->bundleID(), c->error(), reason, client);
  }
  void promiseDidBeginFulfillmentWithIdentifier(std::uint64_t identifier) override {
    add("promise", "", nullptr, nullptr, identifier);
  }

  std::vector<Event> events() const {
    std::lock_guard lock(mutex_);
    return events_;
  }
  // "what bundleID" per event, in arrival order.
  std::vector<std::string> names() const {
    std::vector<std::string> out;
    for (const Event& e : events()) out.push_back(e.what + " " + e.bundleID);
    return out;
  }

 private:
  void add(std::string what, std::string bundleID, ErrorRef error, ErrorRef reason = nullptr,
           std::uint64_t number = 0) {
    std::lock_guard lock(mutex_);
    events_.push_back({std::move(what), std::move(bundleID), std::move(error), std::move(reason),
                       number, std::this_thread::get_id()});
  }
  mutable std::mutex mutex_;
  std::vector<Event> events_;
};

using Names = std::vector<std::string>;

class FakeKCTest : public ::testing::Test {
 protected:
  // A bundle directory NAME.app whose Info.plist (XML text) names `bundleID`.
  std::string makePackage(const std::string& bundleID, const std::string& name,
                          const std::string& version) {
    const fs::path bundle = root.path() / "packages" / (name + ".app");
    fs::create_directories(bundle);
    std::ofstream(bundle / "Info.plist")
        << "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">\n<dict>\n"
        << "  <key>BNBundleIdentifier</key><string>" << bundleID << "</string>\n"
        << "  <key>BNBundleVersion</key><string>" << version << "</string>\n"
        << "  <key>BNBundleDisplayName</key><string>" << name << "</string>\n"
        << "</dict>\n</plist>\n";
    return bundle.string();
  }

  std::string makeIcon(const std::string& bundleID) {
    const fs::path dir = root.path() / "icons" / bundleID;
    fs::create_directories(dir);
    std::ofstream(dir / "Icon.png") << "not really a png";
    return (dir / "Icon.png").string();
  }

  std::shared_ptr<KCPromisedTransferToPath> completeIconPromise(const std::string& bundleID) {
    auto icon = kc.initPromisedTransferToPath(bundleID + "-Icon", kClient, makeIcon(bundleID), 16);
    icon->setPercentComplete(1.0);
    icon->setComplete(true);
    return icon;
  }

  // A placeholder configured the way the client configures one; `icon` may be null.
  std::shared_ptr<KCPlaceholder> configuredPlaceholder(
      const std::string& bundleID, const std::string& name, std::uint64_t installType,
      const std::shared_ptr<KCPromisedTransferToPath>& icon) {
    auto placeholder = kc.initAppPlaceholder(name, bundleID, installType, kClient);
    EXPECT_TRUE(placeholder);
    ErrorRef error;
    if (icon) {
      EXPECT_TRUE(placeholder->setIconPromise(icon, &error));
    }
    KCPlaceholderAttributes attributes({{"BNBundleVersion", "0.9"}});
    attributes.setBundleVersion("1.0");
    EXPECT_TRUE(placeholder->setPlaceholderAttributes(attributes, &error));
    EXPECT_TRUE(placeholder->setMetadata(
        std::make_shared<EMStoreMetadata>(plist::Dict{{"itemName", name}}), &error));
    EXPECT_TRUE(placeholder->setConfigurationCompleteWithError(&error));
    return placeholder;
  }

  // A new coordinator of `kind` by this client, observed by `observer`.
  std::shared_ptr<KCAppInstallCoordinator> newCoordinator(KCCoordinatorKind kind,
                                                          const std::string& bundleID) {
    bool created = false;
    ErrorRef error;
    auto c = kc.coordinatorForAppWithBundleID(kind, bundleID, kClient, true, &created, &error);
    EXPECT_TRUE(c && created && !error);
    if (c) c->setObserver(&observer);
    return c;
  }

  // A sync-style coordinator up to an installed placeholder; the asset promise has no path.
  std::shared_ptr<KCPromisedTransferToPath> prepareSyncInstall(const std::string& bundleID) {
    auto c = newCoordinator(KCCoordinatorKind::Initiating, bundleID);
    auto options = std::make_shared<EMInstallOptions>();
    options->setArInstallType(ARInstallTypeSync);
    options->setInstallTargetType(1);
    ErrorRef error;
    EXPECT_TRUE(c->setInstallOptions(options, &error));
    EXPECT_TRUE(c->setInitialSPRAssetPromises({}, &error));
    auto asset = kc.initPromisedTransferToPath(bundleID + "-Asset", kClient, std::nullopt, 0);
    EXPECT_TRUE(c->setAppAssetPromise(asset, &error));
    auto placeholder = configuredPlaceholder(bundleID, "Example", ARInstallTypeSync,
                                             completeIconPromise(bundleID));
    EXPECT_TRUE(c->setPlaceholderPromise(placeholder, &error)) << (error ? error->describe() : "");
    return asset;
  }

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

TEST_F(FakeKCTest, SyncInstallPutsPlaceholderThenInstallsPackage) {
  const std::string id = "com.example.sync";
  auto asset = prepareSyncInstall(id);
  kc.drain();

  auto record = registry.application(id);
  ASSERT_TRUE(record);
  EXPECT_TRUE(record->isPlaceholder);
  EXPECT_EQ(record->name, "Example");
  EXPECT_EQ(record->version, "1.0");
  EXPECT_EQ(record->installType, ARInstallTypeSync);
  EXPECT_EQ(record->iconPath, (root.path() / "icons" / id / "Icon.png").string());
  EXPECT_EQ(observer.names(), Names{"placeholder " + id});
  EXPECT_EQ(registered.names(), Names{"placeholder " + id});
  EXPECT_TRUE(otherClient.names().empty());
  EXPECT_NE(observer.events()[0].thread, std::this_thread::get_id());

  // Progress alone installs nothing; completion with the package path does.
  asset->setPercentComplete(0.5);
  kc.drain();
  EXPECT_TRUE(registry.application(id)->isPlaceholder);
  asset->setTransferPath("file://" + makePackage(id, "Example", "1.0"));
  asset->setPercentComplete(1.0);
  asset->setComplete(true);
  kc.drain();

  record = registry.application(id);
  ASSERT_TRUE(record);
  EXPECT_FALSE(record->isPlaceholder);
  EXPECT_EQ(record->installType, ARInstallTypeSync);
  ASSERT_TRUE(record->bundleDirectory);
  EXPECT_TRUE(fs::exists(fs::path(*record->bundleDirectory) / "Info.plist"));
  EXPECT_EQ(*plist::stringAt(record->lastInstallOptions, "PackageType"), "Customer");
  EXPECT_EQ(*plist::stringAt(record->lastInstallOptions, "BNBundleIdentifier"), id);
  EXPECT_EQ(observer.names(), (Names{"placeholder " + id, "complete " + id}));
  EXPECT_EQ(registered.names(), (Names{"placeholder " + id, "complete " + id}));
  EXPECT_FALSE(observer.events()[1].error);
  EXPECT_FALSE(kc.coordinator(id));
}

TEST_F(FakeKCTest, RestoreInstallsFromStoreDownload) {
  const std::string id = "com.example.restore";
  auto c = newCoordinator(KCCoordinatorKind::Restoring, id);
  auto userData = kc.initPromisedOutOfBandTransfer(id + "-UserData", kClient, 0);
  userData->setPercentComplete(1.0);
  userData->setComplete(true);
  ErrorRef error;
  ASSERT_TRUE(c->setUserDataPromise(userData, &error));
  ASSERT_TRUE(c->setPlaceholderPromise(
      configuredPlaceholder(id, "Restored", ARInstallTypeRestore, nullptr), &error));
  EXPECT_EQ(c->appAssetPromiseResponsibleClientWithError(&error), 0u);
  // Not the store's business yet.
  EXPECT_FALSE(kc.completeStoreDownload(id, makePackage(id, "Restored", "2.0")));
  ASSERT_TRUE(c->setAppAssetPromiseResponsibleClient(KCClientBazaar, &error));
  EXPECT_EQ(c->appAssetPromiseResponsibleClientWithError(&error), KCClientBazaar);
  kc.drain();
  ASSERT_TRUE(registry.application(id));
  EXPECT_TRUE(registry.application(id)->isPlaceholder);
  EXPECT_EQ(registry.application(id)->installType, ARInstallTypeRestore);
  EXPECT_FALSE(registry.application(id)->iconPath);

  ASSERT_TRUE(kc.completeStoreDownload(id, makePackage(id, "Restored", "2.0")));
  kc.drain();
  auto record = registry.application(id);
  ASSERT_TRUE(record);
  EXPECT_FALSE(record->isPlaceholder);
  EXPECT_EQ(record->version, "2.0");
  EXPECT_EQ(record->installType, ARInstallTypeRestore);  // no install options: the placeholder's
  EXPECT_EQ(registered.names(), (Names{"placeholder " + id, "complete " + id}));
  EXPECT_FALSE(kc.coordinator(id));
  EXPECT_FALSE(kc.completeStoreDownload(id, "/nowhere"));
}

TEST_F(FakeKCTest, CoordinatorLookup) {
  kc.putCoordinator(KCCoordinatorKind::Restoring, "com.foreign", 7);
  struct Case {
    KCCoordinatorKind kind;
    std::string bundleID;
    bool create;
    bool found;
    bool created;
    std::uint64_t creator;
    std::int64_t errorCode;  // 0: none
  };
  const Case cases[] = {
      {KCCoordinatorKind::Initiating, "com.foreign", true, false, false, 0,
       kKCErrorCoordinatorKindMismatch},
      {KCCoordinatorKind::Restoring, "com.foreign", true, true, false, 7, 0},
      {KCCoordinatorKind::Any, "com.foreign", false, true, false, 7, 0},
      {KCCoordinatorKind::Any, "com.new", true, false, false, 0, 0},
      {KCCoordinatorKind::Updating, "com.new", false, false, false, 0, 0},
      {KCCoordinatorKind::Updating, "com.new", true, true, true, kClient, 0},
      {KCCoordinatorKind::Updating, "com.new", false, true, false, kClient, 0},
      {KCCoordinatorKind::Initiating, "com.new", true, false, false, 0,
       kKCErrorCoordinatorKindMismatch},
  };
  for (const Case& k : cases) {
    SCOPED_TRACE(std::string(coordinatorClassName(k.kind)) + " " + k.bundleID);
    bool created = !k.created;
    ErrorRef error = makeKCError(99, "stale");
    auto c =
        kc.coordinatorForAppWithBundleID(k.kind, k.bundleID, kClient, k.create, &created, &error);
    EXPECT_EQ(c != nullptr, k.found);
    EXPECT_EQ(created, k.created);
    if (c) {
      EXPECT_EQ(c->creatorIdentifier(), k.creator);
    }
    EXPECT_EQ(error ? error->code : 0, k.errorCode);
    if (error) {
      EXPECT_EQ(error->domain, "KCErrorDomain");
    }
  }
  ASSERT_EQ(kc.coordinators().size(), 2u);
  EXPECT_EQ(kc.coordinators()[0]->bundleID(), "com.foreign");
}

TEST_F(FakeKCTest, CancellationReachesObserversAndCancelsEverything) {
  const std::string id = "com.example.cancel";
  auto asset = prepareSyncInstall(id);
  auto c = kc.coordinator(id);
  auto userData = kc.initPromisedOutOfBandTransfer(id + "-UserData", kClient, 0);
  ASSERT_TRUE(c->setUserDataPromise(userData, nullptr));
  kc.drain();
  ASSERT_TRUE(registry.application(id));

  const ErrorRef reason = makeError(kTRErrorDomain, 30);
  ErrorRef error;
  ASSERT_TRUE(c->cancelForReason(reason, kClient, &error));
  EXPECT_EQ(c->error(), reason);
  EXPECT_FALSE(kc.coordinator(id));  // forgotten at once
  EXPECT_TRUE(asset->isCancelled());
  EXPECT_TRUE(userData->isCancelled());
  auto placeholder = std::dynamic_pointer_cast<FakeKCPlaceholder>(c->snapshot().placeholder);
  ASSERT_TRUE(placeholder);
  EXPECT_TRUE(placeholder->isCancelled());
  EXPECT_TRUE(placeholder->iconPromise()->isCancelled());
  kc.drain();

  for (const Recorder* r : {&observer, &registered}) {
    auto events = r->events();
    ASSERT_EQ(events.size(), 2u);
    EXPECT_EQ(events[1].what, "cancel");
    EXPECT_EQ(events[1].reason, reason);
    EXPECT_EQ(events[1].error, reason);
    EXPECT_EQ(events[1].number, kClient);
  }
  EXPECT_TRUE(otherClient.names().empty());
  EXPECT_FALSE(registry.application(id));  // the placeholder the service put is gone again

  // A finished coordinator cannot be cancelled or changed; a new one can be made.
  EXPECT_FALSE(c->cancelForReason(reason, kClient, &error));
  EXPECT_EQ(error->code, kKCErrorInvalidState);
  EXPECT_FALSE(c->setAppAssetPromiseResponsibleClient(KCClientBazaar, &error));
  EXPECT_EQ(error->code, kKCErrorInvalidState);
  EXPECT_TRUE(kc.coordinatorForAppWithBundleID(KCCoordinatorKind::Initiating, id, kClient, true,
                                               nullptr, nullptr));
}

TEST_F(FakeKCTest, ForeignCoordinatorsReachOnlyTheirClientsDelegates) {
  auto foreign = kc.putCoordinator(KCCoordinatorKind::Initiating, "com.foreign", 9);
  foreign->setObserver(&observer);
  ASSERT_TRUE(kc.requestPrioritize("com.foreign"));
  EXPECT_FALSE(kc.requestPrioritize("com.none"));
  kc.drain();
  EXPECT_EQ(observer.names(), Names{"prioritize com.foreign"});
  EXPECT_EQ(otherClient.names(), Names{"prioritize com.foreign"});
  EXPECT_TRUE(registered.names().empty());
}

TEST_F(FakeKCTest, DroppedRegistrationsAndRemovedObserversGetNothing) {
  newCoordinator(KCCoordinatorKind::Initiating, "com.example.drop");
  registration.reset();
  kc.requestPrioritize("com.example.drop");
  kc.drain();
  EXPECT_EQ(observer.names(), Names{"prioritize com.example.drop"});
  EXPECT_TRUE(registered.names().empty());

  kc.removeObserver(&observer);
  kc.requestPrioritize("com.example.drop");
  kc.drain();
  EXPECT_EQ(observer.names().size(), 1u);
  EXPECT_EQ(kc.coordinator("com.example.drop")->observer(), nullptr);
}

// Under ThreadSanitizer: registrations come and go while events are delivered; after the drop
// returns no event reaches the dropped delegate.
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

TEST_F(FakeKCTest, UninstallCompletesOnTheServiceThread) {
  registry.putApplication({.identifier = "com.example.installed", .version = "1.0"});
  kc.failOperation("uninstallAppWithBundleID:requestUserConfirmation:completion:",
                   makeKCError(42, "scripted"), 1);
  struct Case {
    std::string bundleID;
    std::int64_t code;  // 0: success
  };
  const Case cases[] = {{"com.example.installed", 42},
                        {"com.example.installed", 0},
                        {"com.example.installed", kKCErrorUnknownApplication},
                        {"com.example.unknown", kKCErrorUnknownApplication}};
  for (const Case& k : cases) {
    std::mutex mutex;
    std::vector<std::pair<ErrorRef, std::thread::id>> calls;
    kc.uninstallAppWithBundleID(k.bundleID, false, [&](ErrorRef error) {
      std::lock_guard lock(mutex);
      calls.emplace_back(error, std::this_thread::get_id());
    });
    kc.drain();
    std::lock_guard lock(mutex);
    ASSERT_EQ(calls.size(), 1u);
    EXPECT_EQ(calls[0].first ? calls[0].first->code : 0, k.code);
    EXPECT_NE(calls[0].second, std::this_thread::get_id());
  }
  EXPECT_FALSE(registry.application("com.example.installed"));
}

TEST_F(FakeKCTest, ScriptedFailures) {
  const ErrorRef scripted = makeKCError(77, "scripted");
  kc.failOperation("initAppPlaceholderWithBundleName:bundleID:installType:client:", nullptr, 1);
  EXPECT_FALSE(kc.initAppPlaceholder("A", "com.a", 4, kClient));
  EXPECT_TRUE(kc.initAppPlaceholder("A", "com.a", 4, kClient));

  kc.failOperation("KCPromisedTransferToPath initWithName:client:diskSpaceNeeded:");
  EXPECT_FALSE(kc.initPromisedTransferToPath("com.a-Asset", kClient, std::nullopt, 0));
  EXPECT_TRUE(kc.initPromisedTransferToPath("com.a-Icon", kClient, "/icon", 1));

  kc.failOperation(
      "coordinatorForAppWithBundleID:withClientID:createIfNotExisting:created:error:", scripted, 1);
  ErrorRef error;
  EXPECT_FALSE(kc.coordinatorForAppWithBundleID(KCCoordinatorKind::Initiating, "com.a", kClient,
                                                true, nullptr, &error));
  EXPECT_EQ(error, scripted);

  auto c = newCoordinator(KCCoordinatorKind::Initiating, "com.a");
  for (const char* op : {"setPlaceholderPromise:error:", "setConfigurationCompleteWithError:",
                         "setAppAssetPromiseResponsibleClient:error:"}) {
    kc.failOperation(op, scripted);
  }
  auto placeholder = kc.initAppPlaceholder("A", "com.a", 4, kClient);
  error = nullptr;
  EXPECT_FALSE(placeholder->setConfigurationCompleteWithError(&error));
  EXPECT_EQ(error, scripted);
  EXPECT_FALSE(c->setAppAssetPromiseResponsibleClient(KCClientBazaar, &error));
  EXPECT_EQ(c->appAssetPromiseResponsibleClientWithError(nullptr), 0u);
  kc.succeedOperation("setConfigurationCompleteWithError:");
  ASSERT_TRUE(placeholder->setConfigurationCompleteWithError(&error));
  error = nullptr;
  EXPECT_FALSE(c->setPlaceholderPromise(placeholder, &error));
  EXPECT_EQ(error, scripted);
  EXPECT_FALSE(c->hasPlaceholderPromise());
  EXPECT_EQ(kc.callCount("setPlaceholderPromise:error:"), 1u);
}

TEST_F(FakeKCTest, FailedInstallsAreReported) {
  // The service's own steps fail: the placeholder install cancels the coordinator (client 0);
  // the package install completes it with the error.
  const ErrorRef scripted = makeKCError(77, "scripted");
  kc.failOperation("installPlaceholder", scripted, 1);
  prepareSyncInstall("com.a");
  kc.drain();
  EXPECT_FALSE(registry.application("com.a"));
  ASSERT_EQ(observer.names(), Names{"cancel com.a"});
  EXPECT_EQ(observer.events()[0].reason, scripted);
  EXPECT_EQ(observer.events()[0].number, 0u);

  // A package the registry refuses.
  auto asset = prepareSyncInstall("com.b");
  asset->setTransferPath(makePackage("com.other", "Other", "1.0"));
  asset->setComplete(true);
  kc.drain();
  auto events = observer.events();
  ASSERT_EQ(events.size(), 3u);
  EXPECT_EQ(events[2].what, "complete");
  ASSERT_TRUE(events[2].error);
  EXPECT_EQ(events[2].error->code, kKCErrorInstallFailed);
  ASSERT_TRUE(events[2].error->underlying);
  EXPECT_EQ(events[2].error->underlying->domain, kAppRegistryErrorDomain);
  EXPECT_TRUE(registry.application("com.b")->isPlaceholder);
  EXPECT_FALSE(kc.coordinator("com.b"));
}

TEST_F(FakeKCTest, PlaceholderConfigurationRules) {
  auto c = newCoordinator(KCCoordinatorKind::Initiating, "com.a");
  ErrorRef error;
  auto unconfigured = kc.initAppPlaceholder("A", "com.a", 4, kClient);
  EXPECT_FALSE(c->setPlaceholderPromise(unconfigured, &error));
  EXPECT_EQ(error->code, kKCErrorPlaceholderNotConfigured);
  EXPECT_FALSE(c->setPlaceholderPromise(nullptr, &error));
  EXPECT_EQ(error->code, kKCErrorInvalidArgument);

  // The icon promise must be complete before the placeholder is installed.
  auto icon = kc.initPromisedTransferToPath("com.a-Icon", kClient, makeIcon("com.a"), 16);
  auto placeholder = configuredPlaceholder("com.a", "A", 4, icon);
  for (bool ok : {placeholder->setSinfData({1, 2}, &error),
                  placeholder->setPlaceholderAttributes(KCPlaceholderAttributes(), &error),
                  placeholder->setConfigurationCompleteWithError(&error)}) {
    EXPECT_FALSE(ok);
    EXPECT_EQ(error->code, kKCErrorInvalidState);
  }
  ASSERT_TRUE(c->setPlaceholderPromise(placeholder, &error));
  EXPECT_FALSE(c->setPlaceholderPromise(placeholder, &error));
  EXPECT_EQ(error->code, kKCErrorAlreadySet);
  kc.drain();
  EXPECT_FALSE(registry.application("com.a"));
  icon->setComplete(true);
  kc.drain();
  EXPECT_TRUE(registry.application("com.a"));

  auto cancelled = kc.initAppPlaceholder("B", "com.b", 4, kClient);
  ASSERT_TRUE(cancelled->cancelForReason(makeError(kTRErrorDomain, 29), kClient, &error));
  EXPECT_FALSE(cancelled->cancelForReason(makeError(kTRErrorDomain, 29), kClient, &error));
  EXPECT_FALSE(cancelled->setSinfData({}, &error));
  EXPECT_EQ(error->code, kKCErrorInvalidState);
}

TEST_F(FakeKCTest, HeldEventsWaitForRelease) {
  kc.hold();
  prepareSyncInstall("com.a");
  kc.drain();  // held: returns without running anything
  EXPECT_FALSE(registry.application("com.a"));
  EXPECT_TRUE(observer.names().empty());
  kc.release();
  kc.drain();
  EXPECT_TRUE(registry.application("com.a"));
  EXPECT_EQ(observer.names(), Names{"placeholder com.a"});
}

TEST_F(FakeKCTest, PromiseFulfillmentNotice) {
  auto asset = prepareSyncInstall("com.a");
  const std::optional<std::uint64_t> id = FakeKCInstallCoordination::promiseIdentifier(*asset);
  ASSERT_TRUE(id);
  EXPECT_TRUE(kc.notifyPromiseDidBeginFulfillment(*id));
  EXPECT_FALSE(kc.notifyPromiseDidBeginFulfillment(*id + 1000));
  kc.drain();
  auto events = registered.events();
  ASSERT_EQ(events.size(), 2u);
  EXPECT_EQ(events[1].what, "promise");
  EXPECT_EQ(events[1].number, *id);
}

// Under ThreadSanitizer: installs of several applications prepared and fulfilled at once.
TEST_F(FakeKCTest, ConcurrentInstalls) {
  std::vector<std::thread> threads;
  for (int i = 0; i < 6; ++i) {
    const std::string id = "com.example.app" + std::to_string(i);
    const std::string package = makePackage(id, "App" + std::to_string(i), "1.0");
    threads.emplace_back([this, id, package] {
      auto asset = prepareSyncInstall(id);
      asset->setTransferPath(package);
      asset->setComplete(true);
    });
  }
  for (auto& t : threads) t.join();
  kc.drain();
  EXPECT_TRUE(kc.coordinators().empty());
  for (int i = 0; i < 6; ++i) {
    auto record = registry.application("com.example.app" + std::to_string(i));
    ASSERT_TRUE(record);
    EXPECT_FALSE(record->isPlaceholder);
  }
  EXPECT_EQ(observer.events().size(), 12u);
}

TEST_F(FakeKCTest, ErrorsAndDescriptions) {
  const ErrorRef underlying = makeError(kTRErrorDomain, 5, "transfer failed");
  ErrorRef e = kc.KCCreateUserPresentableError(1, 0, underlying);
  EXPECT_EQ(e->domain, "KCErrorDomain");
  EXPECT_EQ(e->code, 1);
  EXPECT_EQ(e->underlying, underlying);
  EXPECT_EQ(e->userInfo.find("detail")->int64(), 0);
  EXPECT_EQ(*plist::stringAt(e->userInfo, "description"),
            "The app could not be installed: transfer failed");

  auto c = kc.putCoordinator(KCCoordinatorKind::RestoringDemoted, "com.a", 3);
  EXPECT_EQ(c->describe(), "<KCRestoringDemotedAppInstallCoordinator bundleID=com.a creator=3>");
  EXPECT_EQ(kc.initAppPlaceholder("Two\nLines", "com.a", 8, 3)->describe(),
            "<KCPlaceholder bundleID=com.a name=\"Two\\nLines\" installType=8 client=3>");
  auto promise = kc.initPromisedTransferToPath("com.a-Asset", 3, std::nullopt, 0);
  promise->setPercentComplete(0.25);
  EXPECT_EQ(promise->describe(),
            "<KCPromisedTransferToPath name=com.a-Asset client=3 diskSpaceNeeded=0 "
            "percentComplete=0.25 complete=NO cancelled=NO transferPath=(null)>");
  EXPECT_EQ(kc.initPromisedOutOfBandTransfer("com.a-UserData", 3, 0)->describe(),
            "<KCPromisedOutOfBandTransfer name=com.a-UserData client=3 diskSpaceNeeded=0 "
            "percentComplete=0 complete=NO cancelled=NO>");
  auto observerRegistration = std::dynamic_pointer_cast<FakeKCAppInstallObserver>(registration);
  ASSERT_TRUE(observerRegistration);
  EXPECT_EQ(observerRegistration->describe(),
            "<KCAppInstallObserver machServiceName=com.vantor.trc.zpc.icappobserverdelegate "
            "clients={3}>");
}

}  // namespace
}  // namespace appsync
