// The coordinated sync install where the coordinated-install scenario does not reach: each way a
// preparation fails and what it cancels, and reports that keep coming while the service installs
// in the background.
#include <gtest/gtest.h>

#include "coordination/coordination_fixture.h"

namespace appsync::coordinated_install_tests {
namespace {

using testing::reasonText;
using testing::serviceError;
using testing::serviceErrorText;
using Messages = std::vector<std::string>;

const std::string kID = "com.example.app";
const plist::Bytes kIconFile = {0x89, 'P', 'N', 'G', 4, 5, 6, 7};
const plist::Dict kInfo{{"ARApplicationLaunchProhibited", true}, {"BNBundleVersion", "1.9"}};
const plist::Dict kStore{{"itemId", 42}, {"title", "Store"}};

struct InstallDevice : testing::CoordinationDevice {
  // An asset as the outstanding transfers hand it over: its Info.plist, store metadata and icon
  // in a folder of its own, version "2.0".
  std::shared_ptr<TRAsset> asset(const std::string& id) {
    const std::string dir = root / ("incoming-" + id);
    EXPECT_TRUE(createDirectories(dir));
    EXPECT_TRUE(writePlistAtomically(dir + "/Info.plist", kInfo, plist::Format::Xml));
    EXPECT_TRUE(writePlistAtomically(dir + "/Store.plist", kStore, plist::Format::Xml));
    EXPECT_TRUE(writeFileAtomically(dir + "/icon.png", kIconFile));
    auto a = TRAsset::downloadAssetWithIdentifier(id, "Application", "Pretty");
    a->setVariantOptions({{"Version", "2.0"}});
    a->setInfoPlist(dir + "/Info.plist");
    a->setStorePlist(dir + "/Store.plist");
    a->setIcon(dir + "/icon.png");
    return a;
  }
  // The package the host delivered for the asset, which becomes its path.
  void deliver(TRAsset& a) {
    const std::string package = root / ("packages/" + a.identifier() + ".app");
    EXPECT_TRUE(createDirectories(package));
    EXPECT_TRUE(writePlistAtomically(
        package + "/Info.plist",
        plist::Dict{{"BNBundleIdentifier", a.identifier()}, {"BNBundleVersion", "2.0"}},
        plist::Format::Xml));
    a.setPath(package);
  }
};

// The scenario shows refused install options: the coordinator alone is cancelled. Here is each
// other way a preparation ends, with the error its last line reports and what it cancels.
TEST(CoordinatedInstallTest, AFailedPreparationCancelsWhatItObtained) {
  const std::string e = "[error] Error " + serviceErrorText();
  const std::string notConfigured =
      makeKCError(kKCErrorPlaceholderNotConfigured,
                  "configuration of placeholder for com.example.app is not complete")
          ->describe();
  const std::string noPlaceholder =
      makeKCError(kKCErrorInvalidArgument, "no placeholder of this service for com.example.app")
          ->describe();
  auto handOverRefused = [](const std::string& error) {
    return "[error] Error " + error + " adding placeholder promise to coordinator for '" + kID +
           "'";
  };
  struct Case {
    const char* failing;     // scripted with serviceError(); none: another client's coordinator
    Messages errors;         // the error-level messages, in order
    std::string finalError;  // the last error the preparation's own calls got back
    bool coordinatorCancelled = true, placeholderCancelled = true;
  };
  const std::string scripted = serviceErrorText();
  // clang-format off
  const Case cases[] = {
      // The asset promise reports no error of its own.
      {"setAppAssetPromise:error:", {e + " adding app asset promise at (null) to '" + kID + "'",
                                     "[error] Cancelling asset promise for '" + kID + "'"}, "(null)", true, false},
      // A placeholder whose configuration broke off is still offered; this service refuses it.
      {"setMetadata:error:", {e + " setting store metadata on placeholder for '" + kID + "'",
                              handOverRefused(notConfigured)}, notConfigured},
      {"setPlaceholderPromise:error:", {handOverRefused(scripted)}, scripted},
      {"initAppPlaceholderWithBundleName:bundleID:installType:client:",
       {handOverRefused(noPlaceholder)}, noPlaceholder, true, false},
      {"coordinatorForAppWithBundleID:withClientID:createIfNotExisting:created:error:", {}, scripted, false, false},
      {nullptr, {}, "(null)", false, false},
  };
  // clang-format on
  for (const Case& c : cases) {
    SCOPED_TRACE(c.failing ? c.failing : "another client's coordinator");
    InstallDevice d;
    auto foreign =
        c.failing ? nullptr : d.device.kc().putCoordinator(KCCoordinatorKind::Initiating, kID, 7);
    if (c.failing) d.device.kc().failOperation(c.failing, serviceError());

    EXPECT_FALSE(d.client.prepareAppForInstallUsingCoordination(d.asset(kID), false));

    Messages errors, tail{
                         "processing app install for bundle com.example.app finished with "
                         "status 0 error " +
                         c.finalError};
    // The client hears of its own cancellation as an event; that line is not the preparation's.
    d.device.kc().drain();
    Messages logged;
    for (const auto& line : d.logged()) {
      if (!line.starts_with("Cancelling asset sync for ")) logged.push_back(line);
    }
    for (const auto& line : logged) {
      if (line.starts_with("[error] ")) errors.push_back(line);
    }
    EXPECT_EQ(errors, c.errors);
    if (c.placeholderCancelled)
      tail.push_back("Cancelling placeholder for appBundleIdentifier:" + kID);
    if (c.coordinatorCancelled)
      tail.push_back("Cancelling coordinator for appBundleIdentifier:" + kID);
    ASSERT_GE(logged.size(), tail.size());
    EXPECT_EQ(Messages(logged.end() - tail.size(), logged.end()), tail);

    EXPECT_EQ(d.kc.placeholders.size(), c.placeholderCancelled ? 1u : 0u);
    for (const auto& placeholder : d.kc.placeholders) {
      EXPECT_EQ(reasonText(placeholder->cancelReason()), "Error Domain=TRError Code=1");
    }
    EXPECT_EQ(d.device.kc().callCount("KCAppInstallCoordinator cancelForReason:client:error:"),
              c.coordinatorCancelled ? 1u : 0u);
    if (foreign) {
      EXPECT_EQ(foreign->state(), FakeKCAppInstallCoordinator::State::Active);
      EXPECT_EQ(foreign->observer(), nullptr);
      EXPECT_FALSE(foreign->hasInstallOptions());
    }
  }
}

TEST(CoordinatedTransferTest, ReportsKeepComingWhileTheServiceInstallsInTheBackground) {
  // Each preparation has the service install a placeholder on its own thread, and each
  // fulfilled promise a package, while this thread goes on reporting for the other apps.
  InstallDevice d;
  std::vector<std::shared_ptr<TRAsset>> assets;
  for (int i = 0; i < 6; ++i) {
    assets.push_back(d.asset("com.example.app" + std::to_string(i)));
    d.deliver(*assets.back());
    ASSERT_TRUE(d.client.prepareAppForInstallUsingCoordination(assets.back(), false));
  }
  for (int round = 1; round <= 4; ++round) {
    for (const auto& asset : assets) {
      asset->setDownloadProgress(round / 5.0f);
      EXPECT_TRUE(d.client.updateTransferProgressForApp(asset, false)) << asset->identifier();
    }
  }
  const ErrorRef broke = makeError(kPOSIXErrorDomain, 5, "transfer broke");
  for (std::size_t i = 0; i < assets.size(); ++i) {
    d.client.transferCompleteForApp(assets[i], i % 3 == 2 ? broke : nullptr, false);
    // A late report never reopens a finished transfer.
    EXPECT_FALSE(d.client.updateTransferProgressForApp(assets[i], false));
  }
  d.device.kc().drain();

  EXPECT_TRUE(d.device.kc().coordinators().empty());
  for (std::size_t i = 0; i < assets.size(); ++i) {
    SCOPED_TRACE(assets[i]->identifier());
    auto record = d.device.ar().application(assets[i]->identifier());
    ASSERT_EQ(record.has_value(), i % 3 != 2);
    if (record) {
      EXPECT_FALSE(record->isPlaceholder);
      EXPECT_EQ(record->version, "2.0");
    }
  }
  EXPECT_EQ(d.device.kc().callCount("KCAppInstallCoordinator cancelForReason:client:error:"), 2u);
}

}  // namespace
}  // namespace appsync::coordinated_install_tests
