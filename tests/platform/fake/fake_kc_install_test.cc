// What a coordinated install leaves in the fake registry (metadata, SINF, the package's version
// and size), and what the coordination fake remembers of coordinators once they finished.
#include <gtest/gtest.h>

#include <functional>
#include <string>
#include <vector>

#include "platform/bundle_keys.h"
#include "platform/fake/fake_platform.h"
#include "runtime/fs/files.h"
#include "runtime/plist/codec.h"
#include "support/temp_dir.h"
#include "support/zip_archive.h"

namespace appsync {
namespace {

using Coordinator = std::shared_ptr<KCAppInstallCoordinator>;
using State = FakeKCAppInstallCoordinator::State;
constexpr std::uint64_t kOurClient = kAppSyncCoordinationClient;

std::string packageInfo(const std::string& id, const std::string& version) {
  return *plist::writeXml(plist::Dict{{std::string(kBNBundleIdentifierKey), id},
                                      {std::string(kBNBundleVersionKey), version}});
}

class FakeKCInstallTest : public ::testing::Test {
 protected:
  // A coordinator of `id` whose placeholder carries `placeholderMetadata` and `sinf`, without
  // install options, and whose asset promise, not yet complete, names `package`.
  Coordinator coordinator(const std::string& id, const std::string& package,
                          const std::optional<plist::Dict>& placeholderMetadata = std::nullopt,
                          const std::optional<plist::Bytes>& sinf = std::nullopt) {
    Coordinator c = kc.coordinatorForAppWithBundleID(KCCoordinatorKind::Initiating, id, kOurClient,
                                                     true, nullptr, nullptr);
    auto placeholder = kc.initAppPlaceholder("Game", id, ARInstallTypeSync, kOurClient);
    KCPlaceholderAttributes attributes;
    attributes.setBundleVersion("1.0");
    placeholder->setPlaceholderAttributes(attributes, nullptr);
    if (placeholderMetadata) {
      placeholder->setMetadata(std::make_shared<EMStoreMetadata>(*placeholderMetadata), nullptr);
    }
    if (sinf) placeholder->setSinfData(*sinf, nullptr);
    placeholder->setConfigurationCompleteWithError(nullptr);
    c->setPlaceholderPromise(placeholder, nullptr);
    c->setAppAssetPromise(kc.initPromisedTransferToPath("asset", kOurClient, package, 0), nullptr);
    return c;
  }

  testing::TempDir root, packages;
  FakeARWorkspace registry{root.path()};
  FakeKCInstallCoordination kc{registry};
};

TEST_F(FakeKCInstallTest, TheInstallCarriesMetadataAndSINFIntoTheRegistry) {
  const plist::Dict placeholderMetadata{{"itemName", "From the placeholder"}};
  struct Case {
    const char* name;
    std::optional<plist::Dict> placeholderMetadata;
    std::optional<plist::Bytes> sinf;
    std::optional<plist::Dict> expectedMetadata;
    bool marked;
  };
  // The options' metadata, written beside the app, is shown by the coordinated-install scenario.
  const Case cases[] = {
      {"the placeholder's metadata and SINF", placeholderMetadata, plist::Bytes{1, 2},
       placeholderMetadata, true},
      {"no metadata at all, empty SINF", std::nullopt, plist::Bytes{}, std::nullopt, false},
  };
  const std::string info = packageInfo("com.game", "3.1");
  const std::string data(1234, 'd');
  testing::writeZip(packages / "Game.zip", {{"Game.app/Info.plist", info}, {"Game.app/d", data}});
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    Coordinator game =
        coordinator("com.game", "file://" + (packages / "Game.zip"), c.placeholderMetadata, c.sinf);
    kc.drain();
    auto placeholder = registry.application("com.game");
    ASSERT_TRUE(placeholder && placeholder->isPlaceholder);
    EXPECT_EQ(placeholder->hasMIDBasedSINF, c.marked);

    game->appAssetPromiseWithError(nullptr)->setComplete(true);
    kc.drain();
    auto installed = registry.application("com.game");
    ASSERT_TRUE(installed && !installed->isPlaceholder);
    EXPECT_EQ(installed->hasMIDBasedSINF, c.marked);
    EXPECT_EQ(installed->version, "3.1") << "the package's, not the placeholder's";
    EXPECT_EQ(installed->staticDiskUsage, info.size() + data.size());

    const plist::Dict options = registry.installCalls().back().options;
    const plist::Value* sent = options.find(ARApplicationSINFKey);
    EXPECT_EQ(sent ? std::optional(*sent->data()) : std::nullopt, c.sinf);
    const std::string file = *installed->containerDirectory + "/CaravelMetadata.plist";
    std::optional<plist::Value> written;
    if (auto bytes = readFile(file)) written = plist::parse(*bytes);
    EXPECT_EQ(written ? std::optional(*written->dict()) : std::nullopt, c.expectedMetadata);
    registry.uninstallApplication("com.game", std::nullopt);
  }
}

TEST_F(FakeKCInstallTest, AFinishedCoordinatorsOutcomeIsKept) {
  testing::writeZip(packages / "Game.zip", {{"Game.app/Info.plist", packageInfo("com.game", "1")}});
  const std::string good = packages / "Game.zip", missing = packages / "Missing.zip";
  const std::string domain(kKCErrorDomain);
  struct Case {
    const char* name;
    std::function<void()> finish;
    FinishedCoordinator expected;
  };
  // An installed one and one a client cancelled are shown by the coordinated-install scenario.
  const Case cases[] = {
      {"the install failed",
       [&] {
         coordinator("com.game", missing)->appAssetPromiseWithError(nullptr)->setComplete(true);
       },
       {"com.game", KCCoordinatorKind::Initiating, State::Completed, domain,
        kKCErrorInstallFailed}},
      {"cancelled without a reason",
       [&] { coordinator("com.game", good)->cancelForReason(nullptr, kOurClient, nullptr); },
       {"com.game", KCCoordinatorKind::Initiating, State::Cancelled, domain, kKCErrorCanceled,
        kOurClient}},
      {"cancelled by the service: its placeholder could not be installed",
       [&] {
         kc.failOperation("installPlaceholder", makeError("Test", 6, "full"), 1);
         coordinator("com.game", good);
       },
       {"com.game", KCCoordinatorKind::Initiating, State::Cancelled, "Test", 6, 0}},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    c.finish();
    kc.drain();
    EXPECT_FALSE(kc.coordinator("com.game"));
    EXPECT_EQ(kc.finishedCoordinator("com.game"), c.expected);
    registry.uninstallApplication("com.game", std::nullopt);
  }
}

TEST_F(FakeKCInstallTest, TheOldestOutcomesAreDroppedBeyondTheBound) {
  const std::size_t bound = CoordinatorHistory::kCapacity;
  auto cancel = [&](std::size_t i) {
    kc.putCoordinator(KCCoordinatorKind::Initiating, "com.app" + std::to_string(i), kOurClient)
        ->cancelForReason(nullptr, kOurClient, nullptr);
  };
  for (std::size_t i = 0; i <= bound; ++i) cancel(i);
  cancel(1);  // finishes again: the newest now
  cancel(bound + 1);
  kc.drain();
  const std::vector<FinishedCoordinator> kept = kc.finishedCoordinators();
  ASSERT_EQ(kept.size(), bound);
  EXPECT_FALSE(kc.finishedCoordinator("com.app0"));
  EXPECT_FALSE(kc.finishedCoordinator("com.app2"));
  EXPECT_EQ(kept.front().bundleID, "com.app3");
  EXPECT_EQ(kept[kept.size() - 2].bundleID, "com.app1");
  EXPECT_EQ(kept.back().bundleID, "com.app" + std::to_string(bound + 1));
}

}  // namespace
}  // namespace appsync
