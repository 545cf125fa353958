// The coordinated sync install: preparing a coordinator before the transfer, progress and
// completion of the transfer, cancellation at the end of an unsuccessful asset sync, and
// uninstall through the service.
#include <gtest/gtest.h>

#include <algorithm>
#include <filesystem>
#include <functional>

#include "coordination/coordination_fixture.h"

namespace appsync::coordinated_install_tests {
namespace {

using testing::reasonText;
using testing::serviceError;
using testing::serviceErrorText;
using testing::step;
using Messages = std::vector<std::string>;
using Kind = KCCoordinatorKind;
using State = FakeKCAppInstallCoordinator::State;

const std::string kID = "com.example.app";
const plist::Bytes kIconFile = {0x89, 'P', 'N', 'G', 4, 5, 6, 7};
const plist::Dict kInfo{{"ARApplicationLaunchProhibited", true}, {"BNBundleVersion", "1.9"}};
const plist::Dict kStore{{"itemId", 42}, {"title", "Store"}};
const std::string kCancelledForSync = "Error Domain=TRError Code=1";

struct InstallDevice : testing::CoordinationDevice {
  // An asset as the outstanding transfers hand it over: its Info.plist, store metadata and icon
  // in a folder of its own, version "2.0".
  std::shared_ptr<TRAsset> asset(const std::string& id,
                                 std::optional<std::string> pretty = "Pretty",
                                 bool withIcon = true) {
    const std::string dir = root / ("incoming-" + id);
    EXPECT_TRUE(createDirectories(dir));
    EXPECT_TRUE(writePlistAtomically(dir + "/Info.plist", kInfo, plist::Format::Xml));
    EXPECT_TRUE(writePlistAtomically(dir + "/Store.plist", kStore, plist::Format::Xml));
    EXPECT_TRUE(writeFileAtomically(dir + "/icon.png", kIconFile));
    auto a = TRAsset::downloadAssetWithIdentifier(id, "Application", std::move(pretty));
    a->setVariantOptions({{"Version", "2.0"}});
    a->setInfoPlist(dir + "/Info.plist");
    a->setStorePlist(dir + "/Store.plist");
    if (withIcon) a->setIcon(dir + "/icon.png");
    return a;
  }
  // The package the host delivered for the asset, which becomes its path.
  std::string deliver(TRAsset& a) {
    const std::string package = root / ("packages/" + a.identifier() + ".app");
    EXPECT_TRUE(createDirectories(package));
    EXPECT_TRUE(writePlistAtomically(
        package + "/Info.plist",
        plist::Dict{{"BNBundleIdentifier", a.identifier()}, {"BNBundleVersion", "2.0"}},
        plist::Format::Xml));
    a.setPath(package);
    return package;
  }
  // Forgets what setting up wrote, so that a test sees only the operation under test.
  void forgetSetup() {
    device.kc().drain();
    device.log().clear();
    device.transactionLog().clear();
    kc.lookups.clear();
    kc.made.clear();
  }
};

// The coordinator message of a lookup that found or made the client's own coordinator.
std::string createdLine(bool existingApp, bool create = true) {
  return std::string("Created ") + (existingApp ? "updating" : "initiating") + " coordinator <" +
         (existingApp ? "KCUpdating" : "KCInitiating") +
         "AppInstallCoordinator bundleID=com.example.app creator=3> (createIfNotExisting:" +
         (create ? "1" : "0") + ", existingApp:" + (existingApp ? "1" : "0") +
         ") for com.example.app with error (null)";
}

std::string finishedLine(bool status, const std::string& error) {
  return std::string("processing app install for bundle com.example.app finished with status ") +
         (status ? "1" : "0") + " error " + error;
}

TEST(CoordinatedInstallTest, PreparationReadiesCoordinatorPromisesAndPlaceholder) {
  for (bool existingApp : {false, true}) {
    SCOPED_TRACE(existingApp);
    InstallDevice d;
    auto asset = d.asset(kID);
    const std::string dir = d.placeholderDir(kID), target = dir + "/Icon.png";

    EXPECT_TRUE(d.client.prepareAppForInstallUsingCoordination(asset, existingApp));

    EXPECT_EQ(d.logged(14),
              Messages{"processing app install for bundle 'com.example.app', title "
                       "Pretty assetplist " +
                       plist::Value(kInfo).describe() + ", version 2.0 with install coordination"});
    KCPlaceholderAttributes attributes(kInfo);
    attributes.setLaunchProhibited(true);
    attributes.setBundleVersion("2.0");
    EXPECT_EQ(
        d.logged(),
        (Messages{createdLine(existingApp),
                  "set install options on coordinator for com.example.app",
                  "set SPR asset promise to install coordinator for com.example.app",
                  "Added app asset promise to coordinator for 'com.example.app'",
                  "Created app directory for 'com.example.app' at " + dir + " with err=(null)",
                  "icon for com.example.app at " + target + " has a size of 8",
                  "Copied icon from " + *asset->icon() + " to " + target +
                      " with error (null) for 'com.example.app', sizeOnDisk:8",
                  "Created placeholder <KCPlaceholder bundleID=com.example.app "
                  "name=\"Pretty\" installType=4 client=3> for 'com.example.app' of type 4",
                  "Added icon promise to placeholder for 'com.example.app'",
                  "set " + attributes.describe() + " attributes on placeholder for " + kID,
                  "set store metadata on placeholder for com.example.app",
                  "set placeholder configuration as complete for com.example.app",
                  "added placeholder promise to coordinator for com.example.app",
                  finishedLine(true, "(null)")}));
    EXPECT_EQ(
        d.steps(),
        (Messages{step(1, 1, true, kID, existingApp ? "Update app" : "Install App"),
                  step(3, 1, true, kID, "Create coordinator"),
                  step(3, 2, true, kID, "Finished creating coordinator"),
                  step(5, 1, true, kID, "Copying icon"), step(5, 2, true, kID, "Copying icon"),
                  step(4, 1, true, kID, "Create placeholder"),
                  step(4, 2, true, kID, "Finished creating placeholder"),
                  step(1, 2, true, kID, "Install app")}));

    ASSERT_EQ(d.kc.obtained.size(), 1u);
    auto s = d.kc.obtained[0]->snapshot();
    EXPECT_EQ(d.kc.obtained[0]->kind(), existingApp ? Kind::Updating : Kind::Initiating);
    EXPECT_EQ(s.observer, static_cast<KCAppInstallObserverDelegate*>(&d.client));
    ASSERT_TRUE(s.installOptions && s.installOptions->caravelMetadata());
    EXPECT_EQ(s.installOptions->arInstallType(), 4u);
    EXPECT_EQ(s.installOptions->installTargetType(), 1u);
    EXPECT_EQ(s.installOptions->caravelMetadata()->dictionary(), kStore);
    EXPECT_TRUE(s.hasSPRPromises);
    EXPECT_TRUE(s.sprPromises.empty());
    ASSERT_TRUE(s.appAssetPromise);
    EXPECT_EQ(s.appAssetPromise->name(), "com.example.app-Asset");
    EXPECT_EQ(s.appAssetPromise->transferPath(), std::nullopt);
    EXPECT_FALSE(s.appAssetPromise->isComplete());
    ASSERT_EQ(d.kc.placeholders.size(), 1u);
    auto placeholder = d.kc.placeholders[0];
    EXPECT_EQ(s.placeholder, placeholder);
    EXPECT_TRUE(placeholder->isConfigurationComplete());
    ASSERT_TRUE(placeholder->attributes() && placeholder->metadata());
    EXPECT_EQ(placeholder->attributes()->infoPlist(), kInfo);
    EXPECT_TRUE(placeholder->attributes()->launchProhibited());
    EXPECT_EQ(placeholder->attributes()->bundleVersion(), "2.0");
    EXPECT_EQ(placeholder->metadata()->dictionary(), kStore);
    ASSERT_TRUE(placeholder->iconPromise());
    EXPECT_EQ(placeholder->iconPromise()->transferPath(), "file://" + target);
    EXPECT_EQ(placeholder->iconPromise()->diskSpaceNeeded(), kIconFile.size());
    EXPECT_EQ(readFile(target), kIconFile);
    EXPECT_EQ(d.device.system().ownership(target)->owner, "mobile");

    // With everything promised, the service puts the placeholder into the registry.
    d.device.kc().drain();
    auto record = d.device.ar().application(kID);
    ASSERT_TRUE(record);
    EXPECT_TRUE(record->isPlaceholder);
    EXPECT_EQ(record->installType, 4u);
    EXPECT_EQ(record->name, "Pretty");
    EXPECT_EQ(record->version, "2.0");
    EXPECT_EQ(record->iconPath, target);
  }
}

TEST(CoordinatedInstallTest, PreparationAddsOnlyWhatTheCoordinatorLacks) {
  for (bool hasEverything : {true, false}) {
    SCOPED_TRACE(hasEverything);
    InstallDevice d;
    FakeKCInstallCoordination& kc = d.device.kc();
    auto coordinator = d.put(Kind::Initiating, kID);
    auto options = std::make_shared<EMInstallOptions>();
    ASSERT_TRUE(coordinator->setInstallOptions(options, nullptr));
    if (hasEverything) {
      ASSERT_TRUE(coordinator->setInitialSPRAssetPromises({}, nullptr));
      ASSERT_TRUE(coordinator->setAppAssetPromise(
          kc.initPromisedTransferToPath(kID + "-Asset", 3, std::nullopt, 0), nullptr));
      auto placeholder = kc.initAppPlaceholder("Old", kID, 4, 3);
      ASSERT_TRUE(placeholder->setConfigurationCompleteWithError(nullptr));
      ASSERT_TRUE(coordinator->setPlaceholderPromise(placeholder, nullptr));
    }

    EXPECT_TRUE(d.client.prepareAppForInstallUsingCoordination(d.asset(kID), false));

    EXPECT_EQ(coordinator->snapshot().installOptions, options);
    EXPECT_EQ(kc.callCount("setInstallOptions:error:"), 1u);
    const Messages logged = d.logged();
    ASSERT_GE(logged.size(), 2u);
    EXPECT_EQ(logged[1], "coordinator for com.example.app has install options");
    if (hasEverything) {
      EXPECT_EQ(logged,
                (Messages{createdLine(false), "coordinator for com.example.app has install options",
                          "coordinator for com.example.app has an SPR app asset promise",
                          "coordinator for com.example.app has an app asset promise",
                          "coordinator for com.example.app has a placeholder promise",
                          finishedLine(true, "(null)")}));
      EXPECT_TRUE(d.kc.made.empty());
      EXPECT_TRUE(d.kc.placeholders.empty());
      EXPECT_EQ(d.steps(), (Messages{step(1, 1, true, kID, "Install App"),
                                     step(3, 1, true, kID, "Create coordinator"),
                                     step(3, 2, true, kID, "Finished creating coordinator"),
                                     step(1, 2, true, kID, "Install app")}));
    } else {
      // No store-metadata object is built, so the placeholder gets none.
      ASSERT_EQ(d.kc.placeholders.size(), 1u);
      EXPECT_EQ(coordinator->snapshot().placeholder, d.kc.placeholders[0]);
      EXPECT_EQ(d.kc.placeholders[0]->metadata(), nullptr);
      EXPECT_EQ(kc.callCount("setMetadata:error:"), 1u);
      EXPECT_EQ(logged.back(), finishedLine(true, "(null)"));
    }
  }
}

TEST(CoordinatedInstallTest, PlaceholderIsMadeWhateverBecomesOfTheIcon) {
  enum Icon { kNoIconPath, kCopyFails, kNoDirectory };
  for (Icon icon : {kNoIconPath, kCopyFails, kNoDirectory}) {
    SCOPED_TRACE(icon);
    InstallDevice d;
    auto asset = d.asset(kID, "Pretty", icon != kNoIconPath);
    if (icon == kCopyFails) std::filesystem::remove(*asset->icon());
    if (icon == kNoDirectory) ASSERT_TRUE(writeFileAtomically(d.appsDir(), plist::Bytes{'x'}));

    EXPECT_TRUE(d.client.prepareAppForInstallUsingCoordination(asset, false));

    ASSERT_EQ(d.kc.placeholders.size(), 1u);
    EXPECT_EQ(d.kc.placeholders[0]->iconPromise(), nullptr);
    EXPECT_EQ(d.kc.placeholders[0]->bundleName(), "Pretty");
    EXPECT_EQ(d.kc.obtained[0]->snapshot().placeholder, d.kc.placeholders[0]);
    ASSERT_EQ(d.kc.made.size(), 1u);  // the asset promise only
    Messages copies;
    for (const auto& line : d.logged()) {
      if (line.starts_with("Copied icon") || line.starts_with("icon for")) copies.push_back(line);
    }
    const Messages steps = d.steps();
    const bool copyStep =
        std::find(steps.begin(), steps.end(), step(5, 2, true, kID, "Copying icon")) != steps.end();
    EXPECT_EQ(copyStep, icon == kCopyFails);
    if (icon != kCopyFails) {
      EXPECT_TRUE(copies.empty());
      continue;
    }
    ASSERT_EQ(copies.size(), 1u);
    const std::string target = d.placeholderDir(kID) + "/Icon.png";
    EXPECT_TRUE(copies[0].starts_with("Copied icon from " + *asset->icon() + " to " + target +
                                      " with error Error Domain="))
        << copies[0];
    EXPECT_TRUE(copies[0].ends_with(" for 'com.example.app', sizeOnDisk:0")) << copies[0];
    EXPECT_TRUE(std::find(steps.begin(), steps.end(), step(5, 1, true, kID, "Copying icon")) !=
                steps.end());
  }
}

TEST(CoordinatedInstallTest, AFailedPreparationCancelsWhatItObtained) {
  const std::string e = "[error] Error " + serviceErrorText();
  const std::string notConfigured =
      makeKCError(kKCErrorPlaceholderNotConfigured,
                  "configuration of placeholder for com.example.app is not complete")
          ->describe();
  const std::string refusedHandOver = "[error] Error " + notConfigured +
                                      " adding placeholder promise to coordinator for '" + kID +
                                      "'";
  const std::string noPlaceholder =
      makeKCError(kKCErrorInvalidArgument, "no placeholder of this service for com.example.app")
          ->describe();
  struct Case {
    const char* name;
    const char* failing;  // scripted with serviceError()
    Messages errors;      // the error-level messages, in order
    std::string finalError;
    bool coordinatorCancelled = true, placeholderCancelled = true;
    std::uint64_t foreignCreator = 0;
  };
  const Case cases[] = {
      {"install options refused",
       "setInstallOptions:error:",
       {e + " setting install options on coordinator for 'com.example.app'"},
       serviceErrorText(),
       true,
       false},
      {"SPR promises refused",
       "setInitialSPRAssetPromises:error:",
       {e + " setting SPR asset promise for 'com.example.app'"},
       serviceErrorText(),
       true,
       false},
      {"asset promise refused",
       "setAppAssetPromise:error:",
       {e + " adding app asset promise at (null) to 'com.example.app'",
        "[error] Cancelling asset promise for 'com.example.app'"},
       serviceErrorText(),
       true,
       false},
      {"asset promise cannot be made",
       "KCPromisedTransferToPath initWithName:client:diskSpaceNeeded:",
       {"[error] Error creating asset promise for 'com.example.app'"},
       "(null)",
       true,
       false},
      {"icon promise refused",
       "setIconPromise:error:",
       {e + " adding icon promise to placeholder for 'com.example.app'", refusedHandOver},
       notConfigured},
      {"attributes refused",
       "setPlaceholderAttributes:error:",
       {e + " setting attributes on placeholder for 'com.example.app'", refusedHandOver},
       notConfigured},
      {"metadata refused",
       "setMetadata:error:",
       {e + " setting store metadata on placeholder for 'com.example.app'", refusedHandOver},
       notConfigured},
      {"configuration refused",
       "setConfigurationCompleteWithError:",
       {e + " setting placeholder configuration as complete for 'com.example.app'",
        refusedHandOver},
       notConfigured},
      {"placeholder promise refused",
       "setPlaceholderPromise:error:",
       {e + " adding placeholder promise to coordinator for 'com.example.app'"},
       serviceErrorText()},
      {"placeholder cannot be made",
       "initAppPlaceholderWithBundleName:bundleID:installType:client:",
       {"[error] Error " + noPlaceholder + " adding placeholder promise to coordinator for '" +
        kID + "'"},
       noPlaceholder,
       true,
       false},
      {"coordinator lookup fails",
       "coordinatorForAppWithBundleID:withClientID:createIfNotExisting:created:error:",
       {},
       serviceErrorText(),
       false,
       false},
      {"another client's coordinator", nullptr, {}, "(null)", false, false, 7},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    InstallDevice d;
    auto foreign = c.foreignCreator ? d.put(Kind::Initiating, kID, c.foreignCreator) : nullptr;
    if (c.failing) d.device.kc().failOperation(c.failing, serviceError());

    EXPECT_FALSE(d.client.prepareAppForInstallUsingCoordination(d.asset(kID), false));

    Messages errors, tail{finishedLine(false, c.finalError)};
    for (const auto& line : d.logged()) {
      if (line.starts_with("[error] ")) errors.push_back(line);
    }
    EXPECT_EQ(errors, c.errors);
    if (c.placeholderCancelled)
      tail.push_back("Cancelling placeholder for appBundleIdentifier:" + kID);
    if (c.coordinatorCancelled)
      tail.push_back("Cancelling coordinator for appBundleIdentifier:" + kID);
    const Messages logged = d.logged();
    ASSERT_GE(logged.size(), tail.size());
    EXPECT_EQ(Messages(logged.end() - tail.size(), logged.end()), tail);
    const Messages steps = d.steps();
    EXPECT_EQ(steps.front(), step(1, 1, true, kID, "Install App"));
    EXPECT_EQ(steps.back(), step(1, 2, false, kID, "Install app"));

    EXPECT_EQ(d.kc.placeholders.size(), c.placeholderCancelled ? 1u : 0u);
    for (const auto& placeholder : d.kc.placeholders) {
      EXPECT_EQ(reasonText(placeholder->cancelReason()), kCancelledForSync);
    }
    EXPECT_EQ(d.device.kc().callCount("KCAppInstallCoordinator cancelForReason:client:error:"),
              c.coordinatorCancelled ? 1u : 0u);
    if (c.coordinatorCancelled) {
      ASSERT_EQ(d.kc.obtained.size(), 1u);
      EXPECT_EQ(reasonText(d.kc.obtained[0]->error()), kCancelledForSync);
      d.device.kc().drain();
      EXPECT_EQ(d.cancellations.seen(), Messages{kID + " " + kCancelledForSync + " by client 3"});
    }
    if (foreign) {
      EXPECT_EQ(foreign->state(), State::Active);
      EXPECT_EQ(foreign->observer(), nullptr);
      EXPECT_FALSE(foreign->hasInstallOptions());
    }
  }
}

TEST(CoordinatedInstallTest, NoNameAndNoIdentifierAsksNothingOfTheService) {
  InstallDevice d;
  EXPECT_FALSE(d.client.prepareAppForInstallUsingCoordination(d.asset("", ""), true));
  EXPECT_TRUE(d.kc.lookups.empty());
  EXPECT_EQ(d.logged(), Messages{"processing app install for bundle  finished with status 0 error "
                                 "(null)"});
  EXPECT_EQ(d.steps(),
            (Messages{step(1, 1, true, "", "Update app"), step(1, 2, false, "", "Install app")}));
}

// How the asset's coordinator stands when the host reports on its transfer.
enum class Start { kNone, kPrepared, kWithoutPromise, kPromiseComplete, kAbandoned, kForeign };

std::shared_ptr<FakeKCAppInstallCoordinator> arrange(InstallDevice& d, Start start,
                                                     const std::shared_ptr<TRAsset>& asset) {
  FakeKCInstallCoordination& kc = d.device.kc();
  std::shared_ptr<FakeKCAppInstallCoordinator> c;
  switch (start) {
    case Start::kNone:
      break;
    case Start::kPrepared:
    case Start::kAbandoned:
      EXPECT_TRUE(d.client.prepareAppForInstallUsingCoordination(asset, false));
      c = d.kc.obtained.back();
      if (start == Start::kAbandoned) {  // cancelled, yet a lookup still answers it
        EXPECT_TRUE(c->cancelForReason(nullptr, 0, nullptr));
        d.kc.staleAnswer = c;
      }
      break;
    case Start::kWithoutPromise:
      c = d.put(Kind::Initiating, kID);
      break;
    case Start::kPromiseComplete:
    case Start::kForeign: {
      c = d.put(Kind::Initiating, kID, start == Start::kForeign ? 7 : 3);
      auto promise = kc.initPromisedTransferToPath(kID + "-Asset", 3, std::nullopt, 0);
      if (start == Start::kPromiseComplete) promise->setComplete(true);
      EXPECT_TRUE(c->setAppAssetPromise(promise, nullptr));
      break;
    }
  }
  d.forgetSetup();
  return c;
}

const std::string kForeignLine =
    "IC returned initiating coordinator <KCInitiatingAppInstallCoordinator "
    "bundleID=com.example.app creator=7> (createIfNotExisting:0, existingApp:0, "
    "creatorIdentifier=7) for com.example.app with error (null) - Will not perform install/update "
    "for this bundle";

TEST(CoordinatedTransferTest, ProgressMovesTheAssetPromiseOfAUsableCoordinator) {
  const std::string found = createdLine(false, false);
  const std::string progress =
      "Updating download progress: 0.250000 install progress:0.500000 for com.example.app";
  struct Case {
    const char* name;
    Start start;
    const char* failing;
    bool result;
    Messages messages;
    double percent;  // of the coordinator's asset promise afterwards; -1: none
  };
  const Case cases[] = {
      {"prepared", Start::kPrepared, nullptr, true, {found, progress}, 0.25},
      {"no promise yet",
       Start::kWithoutPromise,
       nullptr,
       true,
       {found, "Added app asset promise to coordinator for 'com.example.app'", progress},
       0.25},
      {"no promise can be made",
       Start::kWithoutPromise,
       "KCPromisedTransferToPath initWithName:client:transferPath:diskSpaceNeeded:",
       true,
       {found, "[error] Error creating asset promise for 'com.example.app'", progress},
       -1},
      {"promise already complete",
       Start::kPromiseComplete,
       nullptr,
       false,
       {found, "Asset promise is already satisfied for com.example.app"},
       0},
      {"no coordinator", Start::kNone, nullptr, false, {}, -1},
      {"coordinator with an error", Start::kAbandoned, nullptr, false, {found}, 0},
      {"another client's coordinator", Start::kForeign, nullptr, false, {kForeignLine}, 0},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    InstallDevice d;
    auto asset = d.asset(kID);
    const std::string package = d.deliver(*asset);
    asset->setDownloadProgress(0.25f);
    asset->setInstallProgress(0.5f);
    auto coordinator = arrange(d, c.start, asset);
    if (c.failing) d.device.kc().failOperation(c.failing);

    EXPECT_EQ(d.client.updateTransferProgressForApp(asset, false), c.result);

    EXPECT_EQ(d.logged(), c.messages);
    ASSERT_EQ(d.kc.lookups.size(), 1u);
    EXPECT_EQ(d.kc.lookups[0].kind, Kind::Initiating);
    EXPECT_FALSE(d.kc.lookups[0].create);
    auto promise = coordinator ? coordinator->snapshot().appAssetPromise : nullptr;
    EXPECT_EQ(promise ? promise->percentComplete() : -1.0, c.percent);
    if (promise && c.start == Start::kWithoutPromise) {
      EXPECT_EQ(promise->transferPath(), "file://" + package);
      EXPECT_FALSE(promise->isComplete());
    }
  }
}

TEST(CoordinatedTransferTest, CompletionFulfilsThePromiseOrCancelsWithAPresentableError) {
  const std::string found = createdLine(false, false);
  const std::string satisfying = "Satisfying asset promise for com.example.app";
  enum Outcome { kSatisfied, kCancelled, kUntouched };
  struct Case {
    const char* name;
    Start start;
    bool transferFailed;
    Messages messages;
    Outcome outcome;
  };
  const Case cases[] = {
      {"delivered", Start::kPrepared, false, {found, satisfying}, kSatisfied},
      {"delivered without a promise",
       Start::kWithoutPromise,
       false,
       {found, "Added app asset promise to coordinator for 'com.example.app'", satisfying},
       kSatisfied},
      {"promise already complete",
       Start::kPromiseComplete,
       false,
       {found, "Asset promise is already satisfied for com.example.app"},
       kUntouched},
      {"transfer failed", Start::kPrepared, true, {found}, kCancelled},
      {"transfer failed without a coordinator", Start::kNone, true, {}, kUntouched},
      {"coordinator with an error", Start::kAbandoned, true, {found}, kUntouched},
      {"another client's coordinator", Start::kForeign, true, {kForeignLine}, kUntouched},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    InstallDevice d;
    auto asset = d.asset(kID);
    const std::string package = d.deliver(*asset);
    auto coordinator = arrange(d, c.start, asset);
    const ErrorRef transferError = makeError(kPOSIXErrorDomain, 5, "transfer broke");
    const State before = coordinator ? coordinator->state() : State::Active;

    d.client.transferCompleteForApp(asset, c.transferFailed ? transferError : nullptr, false);

    EXPECT_EQ(d.logged(), c.messages);
    EXPECT_EQ(d.kc.presentableErrors.size(), c.outcome == kCancelled ? 1u : 0u);
    auto promise = coordinator ? coordinator->snapshot().appAssetPromise : nullptr;
    d.device.kc().drain();
    if (c.outcome == kSatisfied) {
      ASSERT_TRUE(promise);
      EXPECT_EQ(promise->transferPath(), "file://" + package);
      EXPECT_EQ(promise->percentComplete(), 1.0);
      EXPECT_TRUE(promise->isComplete());
    }
    if (c.outcome == kSatisfied && c.start == Start::kPrepared) {  // the service installs it
      EXPECT_EQ(coordinator->state(), State::Completed);
      auto record = d.device.ar().application(kID);
      ASSERT_TRUE(record);
      EXPECT_FALSE(record->isPlaceholder);
      EXPECT_EQ(d.device.ar().installCalls().back().path, package);
    }
    if (c.outcome == kCancelled) {
      const auto& presentable = d.kc.presentableErrors[0];
      EXPECT_EQ(presentable.code, 1);
      EXPECT_EQ(presentable.detail, 0);
      EXPECT_EQ(presentable.underlying, transferError);
      ASSERT_TRUE(coordinator->error());
      EXPECT_EQ(coordinator->error()->underlying, transferError);
      EXPECT_EQ(d.cancellations.seen(),
                Messages{kID + " " + coordinator->error()->describe() + " by client 3"});
      EXPECT_FALSE(d.device.ar().application(kID));  // its placeholder is gone again
    }
    if (c.outcome == kUntouched && coordinator) {
      EXPECT_EQ(coordinator->state(), before);
      if (promise) EXPECT_EQ(promise->transferPath(), std::nullopt);
    }
  }
}

TEST(CoordinatedTransferTest, AnUnsuccessfulAssetSyncCancelsEveryOutstandingCoordinator) {
  for (bool success : {false, true}) {
    SCOPED_TRACE(success);
    InstallDevice d;
    auto own = d.put(Kind::Initiating, "com.a");
    auto foreign = d.put(Kind::Updating, "com.c", 7);

    d.client.assetSyncFinishedWithStatus(success, {"com.a", "com.b", "com.c"});

    const State expected = success ? State::Active : State::Cancelled;
    EXPECT_EQ(own->state(), expected);
    EXPECT_EQ(foreign->state(), expected);
    if (success) {
      EXPECT_TRUE(d.logged().empty());
      EXPECT_TRUE(d.kc.lookups.empty());
      continue;
    }
    const std::string reason = "Error Domain=TRError Code=30";
    EXPECT_EQ(d.logged(), (Messages{"Cancelling coordinator with error " + reason + " for com.a",
                                    "Cancelling coordinator with error " + reason + " for com.c"}));
    ASSERT_EQ(d.kc.lookups.size(), 3u);
    for (const auto& lookup : d.kc.lookups) {
      EXPECT_EQ(lookup.kind, Kind::Any);
      EXPECT_EQ(lookup.client, 3u);
      EXPECT_FALSE(lookup.create);
    }
    d.device.kc().drain();
    EXPECT_EQ(d.cancellations.seen(),
              (Messages{"com.a " + reason + " by client 3", "com.c " + reason + " by client 3"}));
  }
}

TEST(CoordinatedTransferTest, UninstallReportsOnTheServicesThread) {
  for (bool known : {true, false}) {
    SCOPED_TRACE(known);
    InstallDevice d;
    if (known) d.device.ar().putApplication({.identifier = kID});
    d.device.kc().hold();

    d.client.uninstallAppUsingCoordination(kID);

    // Back before the service has answered.
    EXPECT_EQ(d.steps(), Messages{step(7, 1, true, kID, "Uninstall app")});
    EXPECT_TRUE(d.logged().empty());
    d.device.kc().release();
    d.device.kc().drain();
    const std::string error =
        known ? "(null)"
              : makeKCError(kKCErrorUnknownApplication, "no application " + kID)->describe();
    EXPECT_EQ(d.logged(), Messages{"Uninstall of com.example.app with install coordinator "
                                   "succeeded wiht error " +
                                   error + "."});
    EXPECT_EQ(d.steps(), (Messages{step(7, 1, true, kID, "Uninstall app"),
                                   step(7, 2, known, kID, "Uninstall app")}));
    EXPECT_EQ(d.kc.uninstallConfirmations, std::vector<bool>{false});
    EXPECT_FALSE(d.device.ar().application(kID));
  }
}

TEST(CoordinatedTransferTest, ReportsKeepComingWhileTheServiceInstallsInTheBackground) {
  // Each preparation lets the service install a placeholder on its own thread, and each
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
    if (i % 3 == 2) {
      EXPECT_FALSE(record);
    } else {
      ASSERT_TRUE(record);
      EXPECT_FALSE(record->isPlaceholder);
      EXPECT_EQ(record->version, "2.0");
    }
  }
  EXPECT_EQ(d.cancellations.seen().size(), 2u);
}

}  // namespace
}  // namespace appsync::coordinated_install_tests
