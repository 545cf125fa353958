// The registry's and install coordination's saved state: what a later process loads is the
// device it left, and a damaged file is refused with the path of the damaged field.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <functional>
#include <string>
#include <vector>

#include "platform/bundle_keys.h"
#include "platform/fake/fake_platform.h"
#include "runtime/fs/files.h"
#include "runtime/plist/codec.h"
#include "support/temp_dir.h"

namespace appsync {
namespace {

using Coordinator = std::shared_ptr<KCAppInstallCoordinator>;
constexpr std::uint64_t kSyncClient = kAppSyncCoordinationClient;

// The state as the device directory would hold it: written as XML and read back.
StateFields throughXml(const plist::Dict& state) {
  const std::string xml = plist::writeXml(state).value();  // throws when it cannot be written
  const auto bytes = std::span(reinterpret_cast<const std::uint8_t*>(xml.data()), xml.size());
  return StateFields(*plist::parse(bytes).value().dict());
}

// A bundle directory NAME.app under `dir` with the given identifier and version.
std::string makeBundle(const testing::TempDir& dir, const std::string& name, const std::string& id,
                       const std::string& version) {
  const std::string bundle = dir / (name + ".app");
  createDirectories(bundle);
  writePlistAtomically(bundle + "/Info.plist",
                       plist::Dict{{std::string(kBNBundleIdentifierKey), id},
                                   {std::string(kBNBundleVersionKey), version},
                                   {std::string(_kBNBundleDisplayNameKey), name}},
                       plist::Format::Xml);
  return bundle;
}

std::string proxyText(const std::shared_ptr<const ARApplicationProxy>& p) {
  return p->describe() + p->bundleURL.value_or("") + p->bundleVersion.value_or("") +
         (p->installProgressSync ? p->installProgressSync->describe() : "");
}

// The registry and coordination of one process over a device directory.
struct Process {
  explicit Process(const testing::TempDir& dir) : ar(dir.path()), kc(ar) {}
  // Saves both and loads them into `next`, as the simulator's next command does.
  void handOver(Process& next) {
    kc.drain();
    next.ar.loadState(throughXml(ar.saveState()));
    next.kc.loadState(throughXml(kc.saveState()));
    next.kc.drain();
  }
  FakeARWorkspace ar;
  FakeKCInstallCoordination kc;
};

// A coordinator of `id` with a configured placeholder and no icon: the service installs the
// placeholder at once.
Coordinator withPlaceholder(FakeKCInstallCoordination& kc, const std::string& id) {
  Coordinator c = kc.coordinatorForAppWithBundleID(KCCoordinatorKind::Initiating, id, kSyncClient,
                                                   true, nullptr, nullptr);
  auto placeholder = kc.initAppPlaceholder(id + " name", id, ARInstallTypeSync, kSyncClient);
  placeholder->setConfigurationCompleteWithError(nullptr);
  c->setPlaceholderPromise(placeholder, nullptr);
  return c;
}

// com.game with every promise kind (the user data shared with the SPR list), its icon to come;
// com.docs with its placeholder installed; another client's coordinator; coordination off.
void everyPromiseKind(Process& p, const testing::TempDir& dir) {
  FakeKCInstallCoordination& kc = p.kc;
  Coordinator c = kc.coordinatorForAppWithBundleID(KCCoordinatorKind::Restoring, "com.game",
                                                   kSyncClient, true, nullptr, nullptr);
  auto placeholder = kc.initAppPlaceholder("Game", "com.game", ARInstallTypeRestore, kSyncClient);
  KCPlaceholderAttributes attributes(plist::Dict{{"Gone", plist::Value::null()}});
  attributes.setBundleVersion("2.0");
  placeholder->setPlaceholderAttributes(attributes, nullptr);
  placeholder->setMetadata(std::make_shared<EMStoreMetadata>(plist::Dict{{"itemName", "G"}}),
                           nullptr);
  placeholder->setSinfData({1, 2, 3}, nullptr);
  auto icon = kc.initPromisedTransferToPath("icon", kSyncClient, std::nullopt, 10);
  icon->setPercentComplete(0.25);
  placeholder->setIconPromise(icon, nullptr);
  placeholder->setConfigurationCompleteWithError(nullptr);
  c->setPlaceholderPromise(placeholder, nullptr);
  c->setAppAssetPromise(kc.initPromisedTransferToPath("asset", kSyncClient, dir / "Game.app", 4096),
                        nullptr);
  auto data = kc.initPromisedOutOfBandTransfer("data", kSyncClient, 0);
  data->setComplete(true);
  c->setUserDataPromise(data, nullptr);
  auto spr = kc.initPromisedOutOfBandTransfer("spr", kSyncClient, 1);
  spr->cancelForReason(makeError("Test", 5, "gone"), kSyncClient, nullptr);
  c->setInitialSPRAssetPromises({spr, data}, nullptr);
  auto options = std::make_shared<EMInstallOptions>();
  options->setArInstallType(ARInstallTypeRestore);
  options->setCaravelMetadata(std::make_shared<EMStoreMetadata>(plist::Dict{{"k", 1}}));
  c->setInstallOptions(options, nullptr);
  c->setAppAssetPromiseResponsibleClient(KCClientBazaar, nullptr);
  withPlaceholder(kc, "com.docs");
  withPlaceholder(kc, "com.dropped")
      ->cancelForReason(makeError("Test", 7, "dropped"), KCClientBazaar, nullptr);
  kc.putCoordinator(KCCoordinatorKind::RestoringDemoted, "com.other", 9);
  kc.setCoordinationEnabled(false);
}

TEST(FakeStateTest, ALaterProcessLoadsTheDeviceItLeft) {
  const std::pair<const char*, std::function<void(Process&, const testing::TempDir&)>> cases[] = {
      {"installs, progress, history and records put by a test",
       [](Process& p, const testing::TempDir& dir) {
         ASSERT_TRUE(p.ar.installApplication(makeBundle(dir, "Game", "com.game", "2.0"),
                                             {{"PackageType", "Customer"},
                                              {"BNBundleIdentifier", "com.game"},
                                              {"ARInstallType", 4}},
                                             nullptr));
         // A placeholder's options may hold the null object (no SINF).
         ASSERT_TRUE(p.ar.installApplication(
             makeBundle(dir, "Notes", "com.notes", "1.1"),
             {{"PackageType", "Placeholder"}, {"ApplicationSINF", plist::Value::null()}}));
         auto loading = p.ar.installProgress("com.notes", ARInstallPhaseLoading);
         loading->setTotalUnitCount(-1);
         loading->cancel();
         p.ar.installPhaseFinishedForProgress(loading);
         p.ar.installProgress("com.notes", ARInstallPhaseInstalling)->setCompletedUnitCount(40);
         p.ar.uninstallApplication("com.gone", plist::Dict{{"UninstallPlaceholdersOnly", true}});
         p.ar.setInstallsInProgress({"com.notes"}, {"com.game", "com.unknown"});
         p.ar.putApplication({.identifier = "com.sys", .applicationType = "System"});
         p.ar.putApplication({.identifier = "com.plugin", .isApplication = false});
         p.ar.putApplication(
             {.identifier = "com.a", .staticDiskUsage = 9, .hasMIDBasedSINF = true});
       }},
      {"coordinators, every promise kind, coordination off", everyPromiseKind},
  };
  for (const auto& [name, build] : cases) {
    SCOPED_TRACE(name);
    testing::TempDir dir;
    Process saved(dir), loaded(dir);
    build(saved, dir);
    saved.handOver(loaded);
    EXPECT_EQ(loaded.ar.saveState(), saved.ar.saveState());
    EXPECT_EQ(loaded.kc.saveState(), saved.kc.saveState());
    EXPECT_TRUE(loaded.ar.applications() == saved.ar.applications());
    EXPECT_TRUE(loaded.ar.installCalls() == saved.ar.installCalls());
    EXPECT_TRUE(loaded.ar.uninstallCalls() == saved.ar.uninstallCalls());
    for (const auto& record : saved.ar.applications()) {
      if (!record.isApplication) continue;
      EXPECT_EQ(proxyText(loaded.ar.applicationProxyForIdentifier(record.identifier, true)),
                proxyText(saved.ar.applicationProxyForIdentifier(record.identifier, true)));
    }
    // The proxy and the registry share the current progress again.
    if (auto proxy = loaded.ar.applicationProxyForIdentifier("com.notes", true)) {
      EXPECT_EQ(proxy->installProgressSync, loaded.ar.installProgress("com.notes", 1));
    }
  }
}

class EventLog : public KCAppInstallObserverDelegate {
 public:
  void coordinatorDidCompleteSuccessfully(const Coordinator& c) override {
    events.push_back("complete " + c->bundleID());
  }
  void coordinator(const Coordinator& c, const ErrorRef&, std::uint64_t) override {
    events.push_back("cancel " + c->bundleID());
  }
  std::vector<std::string> events;  // written on the service's thread, read after drain()
};

TEST(FakeKCStateTest, ALaterProcessCarriesOnWithALoadedCoordinator) {
  testing::TempDir dir;
  EventLog recorder;
  Process first(dir), second(dir);
  Coordinator game = withPlaceholder(first.kc, "com.game");
  auto asset = first.kc.initPromisedTransferToPath("asset", kSyncClient,
                                                   makeBundle(dir, "Game", "com.game", "2.0"), 0);
  game->setAppAssetPromise(asset, nullptr);
  withPlaceholder(first.kc, "com.other");
  first.handOver(second);

  Coordinator loaded = second.kc.coordinatorForAppWithBundleID(
      KCCoordinatorKind::Any, "com.game", kSyncClient, false, nullptr, nullptr);
  ASSERT_TRUE(loaded);
  loaded->setObserver(&recorder);
  auto id = [](const auto& promise) {
    return FakeKCInstallCoordination::promiseIdentifier(*promise);
  };
  auto loadedAsset = loaded->appAssetPromiseWithError(nullptr);
  EXPECT_EQ(id(loadedAsset), id(asset));
  loadedAsset->setComplete(true);
  Coordinator other = second.kc.coordinator("com.other");
  other->setObserver(&recorder);
  other->cancelForReason(nullptr, kSyncClient, nullptr);
  second.kc.drain();

  EXPECT_EQ(recorder.events, (std::vector<std::string>{"complete com.game", "cancel com.other"}));
  EXPECT_TRUE(second.ar.applicationIsInstalled("com.game"));
  EXPECT_FALSE(second.ar.application("com.other")) << "the placeholder goes with its coordinator";
  EXPECT_EQ(id(second.kc.initPromisedOutOfBandTransfer("next", kSyncClient, 0)),
            id(first.kc.initPromisedOutOfBandTransfer("next", kSyncClient, 0)));
}

plist::Dict& game(plist::Dict& s) {
  return *s.find("coordinators")->dict()->find("com.game")->dict();
}
plist::Dict& finished(plist::Dict& s) {
  return *(*s.find("finishedCoordinators")->array())[0].dict();
}
plist::Dict& record(plist::Dict& s, std::size_t i) {
  return *(*s.find("applications")->array())[i].dict();
}

TEST(FakeStateTest, ADamagedStateIsRefusedByTheFieldAndChangesNothing) {
  struct Case {
    bool registry;
    std::function<void(plist::Dict&)> damage;
    std::string message;
  };
  const Case cases[] = {
      {true, [](plist::Dict& s) { record(s, 0).set("installType", "four"); },
       "applications[0].installType: expected an unsigned integer"},
      {true, [](plist::Dict& s) { record(s, 1).erase("identifier"); },
       "applications[1].identifier: missing"},
      {true, [](plist::Dict& s) { record(s, 0).set("currentProgressPhase", 7); },
       "applications[0].currentProgressPhase: no install progress of com.a for that phase"},
      {false,
       [](plist::Dict& s) {
         game(s).find("appAssetPromise")->dict()->set("percentComplete", "half");
       },
       "coordinators.com.game.appAssetPromise.percentComplete: expected a number"},
      {false, [](plist::Dict& s) { game(s).set("kind", "sideways"); },
       "coordinators.com.game.kind: expected one of any, initiating, updating, restoring, "
       "restoringDemoted"},
      {false, [](plist::Dict& s) { finished(s).erase("errorCode"); },
       "finishedCoordinators[0].errorCode: missing (an error has both a domain and a code)"},
  };
  testing::TempDir dir;
  Process built(dir), target(dir);
  built.ar.putApplication({.identifier = "com.a"});
  built.ar.installProgress("com.a", ARInstallPhaseLoading);
  built.ar.putApplication({.identifier = "com.b"});
  everyPromiseKind(built, dir);
  built.handOver(target);
  for (const Case& c : cases) {
    SCOPED_TRACE(c.message);
    plist::Dict state = c.registry ? built.ar.saveState() : built.kc.saveState();
    c.damage(state);
    EXPECT_THAT(
        [&] {
          c.registry ? target.ar.loadState(StateFields(state))
                     : target.kc.loadState(StateFields(state));
        },
        ::testing::ThrowsMessage<StateFormatError>(c.message));
    EXPECT_EQ(target.ar.saveState(), built.ar.saveState());
    EXPECT_EQ(target.kc.saveState(), built.kc.saveState());
  }
}

}  // namespace
}  // namespace appsync
