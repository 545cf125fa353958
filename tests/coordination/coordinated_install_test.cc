// The coordinated sync install: preparing a coordinator before the transfer, progress and
// completion of the transfer, cancellation at the end of an unsuccessful asset sync, and
// uninstall through the service.
#include <gtest/gtest.h>

#include "coordination/coordination_fixture.h"

namespace appsync::coordinated_install_tests {
namespace {

using testing::coordinatorLine;
using testing::filePromise;
using testing::placeholderState;
using testing::promiseState;
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
  std::shared_ptr<TRAsset> asset(const std::string& id, std::string pretty = "Pretty") {
    const std::string dir = root / ("incoming-" + id);
    EXPECT_TRUE(createDirectories(dir));
    EXPECT_TRUE(writePlistAtomically(dir + "/Info.plist", kInfo, plist::Format::Xml));
    EXPECT_TRUE(writePlistAtomically(dir + "/Store.plist", kStore, plist::Format::Xml));
    EXPECT_TRUE(writeFileAtomically(dir + "/icon.png", kIconFile));
    auto a = TRAsset::downloadAssetWithIdentifier(id, "Application", std::move(pretty));
    a->setVariantOptions({{"Version", "2.0"}});
    a->setInfoPlist(dir + "/Info.plist");
    a->setStorePlist(dir + "/Store.plist");
    a->setIcon(dir + "/icon.png");
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

std::string finishedLine(bool status, const std::string& error) {
  return std::string("processing app install for bundle com.example.app finished with status ") +
         (status ? "1" : "0") + " error " + error;
}

// The updating road and the category-14 announcement are shown by the coordinated-install
// scenario; this is what it cannot see: the messages in between and the objects handed over.
TEST(CoordinatedInstallTest, PreparationReadiesCoordinatorPromisesAndPlaceholder) {
  InstallDevice d;
  auto asset = d.asset(kID);
  const std::string dir = d.placeholderDir(kID), target = dir + "/Icon.png";

  EXPECT_TRUE(d.client.prepareAppForInstallUsingCoordination(asset, false));

  KCPlaceholderAttributes attributes(kInfo);
  attributes.setLaunchProhibited(true);
  attributes.setBundleVersion("2.0");
  const std::string placeholder =
      "<KCPlaceholder bundleID=com.example.app name=\"Pretty\" installType=4 client=3>";
  EXPECT_EQ(d.logged(),
            (Messages{coordinatorLine(false, true),
                      "set install options on coordinator for com.example.app",
                      "set SPR asset promise to install coordinator for com.example.app",
                      "Added app asset promise to coordinator for 'com.example.app'",
                      "Created app directory for 'com.example.app' at " + dir + " with err=(null)",
                      "icon for com.example.app at " + target + " has a size of 8",
                      "Copied icon from " + *asset->icon() + " to " + target +
                          " with error (null) for 'com.example.app', sizeOnDisk:8",
                      "Created placeholder " + placeholder + " for 'com.example.app' of type 4",
                      "Added icon promise to placeholder for 'com.example.app'",
                      "set " + attributes.describe() + " attributes on placeholder for " + kID,
                      "set store metadata on placeholder for com.example.app",
                      "set placeholder configuration as complete for com.example.app",
                      "added placeholder promise to coordinator for com.example.app",
                      finishedLine(true, "(null)")}));
  EXPECT_EQ(
      d.steps(),
      (Messages{step(1, 1, true, kID, "Install App"), step(3, 1, true, kID, "Create coordinator"),
                step(3, 2, true, kID, "Finished creating coordinator"),
                step(5, 1, true, kID, "Copying icon"), step(5, 2, true, kID, "Copying icon"),
                step(4, 1, true, kID, "Create placeholder"),
                step(4, 2, true, kID, "Finished creating placeholder"),
                step(1, 2, true, kID, "Install app")}));

  auto coordinator = d.device.kc().coordinator(kID);
  ASSERT_TRUE(coordinator);
  ASSERT_EQ(d.kc.placeholders.size(), 1u);
  auto s = coordinator->snapshot();
  EXPECT_EQ(s.observer, static_cast<KCAppInstallObserverDelegate*>(&d.client));
  ASSERT_TRUE(s.installOptions);
  EXPECT_EQ(s.installOptions->describe(),
            "<EMInstallOptions arInstallType=4 installTargetType=1 caravelMetadata=" +
                EMStoreMetadata(kStore).describe() + ">");
  EXPECT_TRUE(s.hasSPRPromises && s.sprPromises.empty());
  EXPECT_EQ(promiseState(s.appAssetPromise), filePromise("Asset", 0, "0", false, "(null)"));
  EXPECT_EQ(s.placeholder, d.kc.placeholders[0]);
  EXPECT_EQ(placeholderState(d.kc.placeholders[0]), placeholder + " configured (not cancelled)");
  ASSERT_TRUE(d.kc.placeholders[0]->metadata());
  EXPECT_EQ(d.kc.placeholders[0]->metadata()->dictionary(), kStore);
  EXPECT_EQ(promiseState(d.kc.placeholders[0]->iconPromise()),
            filePromise("Icon", 8, "1", true, "file://" + target));
  EXPECT_EQ(readFile(target), kIconFile);
  EXPECT_EQ(d.device.system().ownership(dir).value_or(FakeSystemServices::Ownership{}).owner,
            "mobile");
}

TEST(CoordinatedInstallTest, PreparationOfACoordinatorThatHasEverythingSetsNothing) {
  InstallDevice d;
  FakeKCInstallCoordination& kc = d.device.kc();
  auto coordinator = d.put(Kind::Initiating, kID);
  ASSERT_TRUE(coordinator->setInstallOptions(std::make_shared<EMInstallOptions>(), nullptr));
  ASSERT_TRUE(coordinator->setInitialSPRAssetPromises({}, nullptr));
  ASSERT_TRUE(coordinator->setAppAssetPromise(
      kc.initPromisedTransferToPath(kID + "-Asset", 3, std::nullopt, 0), nullptr));
  auto placeholder = kc.initAppPlaceholder("Old", kID, 4, 3);
  ASSERT_TRUE(placeholder->setConfigurationCompleteWithError(nullptr));
  ASSERT_TRUE(coordinator->setPlaceholderPromise(placeholder, nullptr));

  EXPECT_TRUE(d.client.prepareAppForInstallUsingCoordination(d.asset(kID), false));

  const std::string has = "coordinator for com.example.app has ";
  EXPECT_EQ(d.logged(), (Messages{coordinatorLine(false, true), has + "install options",
                                  has + "an SPR app asset promise", has + "an app asset promise",
                                  has + "a placeholder promise", finishedLine(true, "(null)")}));
  EXPECT_TRUE(d.kc.made.empty());
  EXPECT_TRUE(d.kc.placeholders.empty());
  EXPECT_EQ(kc.callCount("setInstallOptions:error:"), 1u);
  EXPECT_EQ(kc.callCount("setInitialSPRAssetPromises:error:"), 1u);
  EXPECT_EQ(d.steps(), (Messages{step(1, 1, true, kID, "Install App"),
                                 step(3, 1, true, kID, "Create coordinator"),
                                 step(3, 2, true, kID, "Finished creating coordinator"),
                                 step(1, 2, true, kID, "Install app")}));
}

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
    const char* failing;     // scripted with serviceError()
    Messages errors;         // the error-level messages, in order
    std::string finalError;  // the last error the preparation's own calls got back
    bool coordinatorCancelled = true, placeholderCancelled = true;
  };
  const std::string scripted = serviceErrorText();
  // clang-format off
  const Case cases[] = {
      {"setInstallOptions:error:", {e + " setting install options on coordinator for '" + kID + "'"}, scripted, true, false},
      {"setInitialSPRAssetPromises:error:", {e + " setting SPR asset promise for '" + kID + "'"}, scripted, true, false},
      {"setAppAssetPromise:error:", {e + " adding app asset promise at (null) to '" + kID + "'",
                                     "[error] Cancelling asset promise for '" + kID + "'"}, "(null)", true, false},
      {"KCPromisedTransferToPath initWithName:client:diskSpaceNeeded:",
       {"[error] Error creating asset promise for '" + kID + "'"}, "(null)", true, false},
      // A placeholder whose configuration broke off is still offered; this service refuses it.
      {"setIconPromise:error:", {e + " adding icon promise to placeholder for '" + kID + "'",
                                 handOverRefused(notConfigured)}, notConfigured},
      {"setPlaceholderAttributes:error:", {e + " setting attributes on placeholder for '" + kID + "'",
                                           handOverRefused(notConfigured)}, notConfigured},
      {"setMetadata:error:", {e + " setting store metadata on placeholder for '" + kID + "'",
                              handOverRefused(notConfigured)}, notConfigured},
      {"setConfigurationCompleteWithError:",
       {e + " setting placeholder configuration as complete for '" + kID + "'",
        handOverRefused(notConfigured)}, notConfigured},
      {"setPlaceholderPromise:error:", {handOverRefused(scripted)}, scripted},
      {"initAppPlaceholderWithBundleName:bundleID:installType:client:",
       {handOverRefused(noPlaceholder)}, noPlaceholder, true, false},
      {"coordinatorForAppWithBundleID:withClientID:createIfNotExisting:created:error:", {}, scripted, false, false},
      {nullptr, {}, "(null)", false, false},  // another client's coordinator
  };
  // clang-format on
  for (const Case& c : cases) {
    SCOPED_TRACE(c.failing ? c.failing : "another client's coordinator");
    InstallDevice d;
    auto foreign = c.failing ? nullptr : d.put(Kind::Initiating, kID, 7);
    if (c.failing) d.device.kc().failOperation(c.failing, serviceError());

    EXPECT_FALSE(d.client.prepareAppForInstallUsingCoordination(d.asset(kID), false));

    Messages errors, tail{finishedLine(false, c.finalError)};
    const Messages logged = d.logged();
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
    EXPECT_EQ(d.steps().front(), step(1, 1, true, kID, "Install App"));
    EXPECT_EQ(d.steps().back(), step(1, 2, false, kID, "Install app"));

    EXPECT_EQ(d.kc.placeholders.size(), c.placeholderCancelled ? 1u : 0u);
    for (const auto& placeholder : d.kc.placeholders) {
      EXPECT_EQ(reasonText(placeholder->cancelReason()), kCancelledForSync);
    }
    EXPECT_EQ(d.device.kc().callCount("KCAppInstallCoordinator cancelForReason:client:error:"),
              c.coordinatorCancelled ? 1u : 0u);
    d.device.kc().drain();
    EXPECT_EQ(d.cancellations.seen(), c.coordinatorCancelled
                                          ? Messages{kID + " " + kCancelledForSync + " by client 3"}
                                          : Messages{});
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
  EXPECT_EQ(d.logged(),
            Messages{"processing app install for bundle  finished with status 0 error (null)"});
  EXPECT_EQ(d.steps(),
            (Messages{step(1, 1, true, "", "Update app"), step(1, 2, false, "", "Install app")}));
}

// How the asset's coordinator stands when the host reports on its transfer.
enum class Start { kNone, kPrepared, kWithoutPromise, kPromiseComplete, kAbandoned, kForeign };

std::shared_ptr<FakeKCAppInstallCoordinator> arrange(InstallDevice& d, Start start,
                                                     const std::shared_ptr<TRAsset>& asset) {
  std::shared_ptr<FakeKCAppInstallCoordinator> c;
  if (start == Start::kPrepared || start == Start::kAbandoned) {
    EXPECT_TRUE(d.client.prepareAppForInstallUsingCoordination(asset, false));
    c = d.device.kc().coordinator(kID);
  } else if (start != Start::kNone) {
    c = d.put(Kind::Initiating, kID, start == Start::kForeign ? 7 : 3);
  }
  if (start == Start::kAbandoned) {  // cancelled, yet a lookup still answers it
    EXPECT_TRUE(c->cancelForReason(makeError("Test", 9), 0, nullptr));
    d.kc.staleAnswer = c;
  }
  if (start == Start::kPromiseComplete || start == Start::kForeign) {
    auto promise = d.device.kc().initPromisedTransferToPath(kID + "-Asset", 3, std::nullopt, 0);
    promise->setComplete(start == Start::kPromiseComplete);
    EXPECT_TRUE(c->setAppAssetPromise(promise, nullptr));
  }
  d.forgetSetup();
  return c;
}

const std::string kFound = coordinatorLine(false, false);

TEST(CoordinatedTransferTest, ProgressMovesTheAssetPromiseOfAUsableCoordinator) {
  const std::string progress =
      "Updating download progress: 0.250000 install progress:0.500000 for com.example.app";
  const std::string added = "Added app asset promise to coordinator for 'com.example.app'";
  struct Case {
    const char* name;
    Start start;
    bool promiseNotMade, result;
    Messages messages;
    std::string promise;  // "PKG" stands for the package path
  };
  auto asset = [](const char* percent, bool complete, const std::string& path = "(null)",
                  const std::string& reason = "(not cancelled)") {
    return filePromise("Asset", 0, percent, complete, path, reason);
  };
  // clang-format off
  const Case cases[] = {
      {"no promise yet", Start::kWithoutPromise, false, true, {kFound, added, progress},
       asset("0.25", false, "file://PKG")},
      {"no promise can be made", Start::kWithoutPromise, true, true,
       {kFound, "[error] Error creating asset promise for 'com.example.app'", progress}, "(none)"},
      {"promise complete", Start::kPromiseComplete, false, false,
       {kFound, "Asset promise is already satisfied for com.example.app"}, asset("0", true)},
      {"no coordinator", Start::kNone, false, false, {}, "(none)"},
      {"coordinator with an error", Start::kAbandoned, false, false, {kFound},
       asset("0", false, "(null)", "Error Domain=Test Code=9")},
  };
  // clang-format on
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    InstallDevice d;
    auto asset = d.asset(kID);
    const std::string package = d.deliver(*asset);
    asset->setDownloadProgress(0.25f);
    asset->setInstallProgress(0.5f);
    auto coordinator = arrange(d, c.start, asset);
    if (c.promiseNotMade) {
      d.device.kc().failOperation(
          "KCPromisedTransferToPath initWithName:client:transferPath:diskSpaceNeeded:");
    }

    EXPECT_EQ(d.client.updateTransferProgressForApp(asset, false), c.result);

    EXPECT_EQ(d.logged(), c.messages);
    ASSERT_EQ(d.kc.lookups.size(), 1u);
    EXPECT_EQ(d.kc.lookups[0].kind, Kind::Initiating);
    EXPECT_FALSE(d.kc.lookups[0].create);
    std::string expected = c.promise;
    if (auto at = expected.find("PKG"); at != std::string::npos) expected.replace(at, 3, package);
    EXPECT_EQ(promiseState(coordinator ? coordinator->snapshot().appAssetPromise : nullptr),
              expected);
  }
}

TEST(CoordinatedTransferTest, CompletionFulfilsThePromiseOrCancelsWithAPresentableError) {
  const std::string satisfying = "Satisfying asset promise for com.example.app";
  enum Outcome { kFulfilled, kCancelled, kUntouched };
  struct Case {
    const char* name;
    Start start;
    bool transferFailed;
    Messages messages;
    Outcome outcome;
  };
  // clang-format off
  const Case cases[] = {
      {"delivered without a promise", Start::kWithoutPromise, false,
       {kFound, "Added app asset promise to coordinator for 'com.example.app'", satisfying}, kFulfilled},
      {"promise already complete", Start::kPromiseComplete, false,
       {kFound, "Asset promise is already satisfied for com.example.app"}, kUntouched},
      {"transfer failed", Start::kPrepared, true, {kFound}, kCancelled},
      {"transfer failed, no coordinator", Start::kNone, true, {}, kUntouched},
      {"coordinator with an error", Start::kAbandoned, true, {kFound}, kUntouched},
      {"another client's coordinator", Start::kForeign, true, {coordinatorLine(false, false, 7)}, kUntouched},
  };
  // clang-format on
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    InstallDevice d;
    auto asset = d.asset(kID);
    const std::string package = d.deliver(*asset);
    auto coordinator = arrange(d, c.start, asset);
    auto before = coordinator ? promiseState(coordinator->snapshot().appAssetPromise) : "";
    const ErrorRef transferError = makeError(kPOSIXErrorDomain, 5, "transfer broke");

    d.client.transferCompleteForApp(asset, c.transferFailed ? transferError : nullptr, false);

    EXPECT_EQ(d.logged(), c.messages);
    EXPECT_EQ(d.device.kc().callCount("KCCreateUserPresentableError"),
              c.outcome == kCancelled ? 1u : 0u);
    const auto promise = coordinator ? coordinator->snapshot().appAssetPromise : nullptr;
    d.device.kc().drain();
    if (c.outcome == kFulfilled) {
      EXPECT_EQ(promiseState(promise), filePromise("Asset", 0, "1", true, "file://" + package));
    } else if (coordinator && c.outcome == kUntouched) {
      EXPECT_EQ(promiseState(promise), before);
    }
    if (c.outcome == kCancelled) {
      // The service's presentable error: code 1, detail 0, the transfer's error beneath.
      const ErrorRef reason = coordinator->error();
      ASSERT_TRUE(reason);
      EXPECT_EQ(reason->domain + " " + std::to_string(reason->code), "KCErrorDomain 1");
      EXPECT_EQ(*reason->userInfo.find("detail"), plist::Value(0));
      EXPECT_EQ(reason->underlying, transferError);
      EXPECT_EQ(d.cancellations.seen(),
                Messages{kID + " " + coordinator->error()->describe() + " by client 3"});
      EXPECT_FALSE(d.device.ar().application(kID));  // its placeholder is gone again
    }
    if (c.outcome == kUntouched && coordinator) {
      EXPECT_EQ(coordinator->state(),
                c.start == Start::kAbandoned ? State::Cancelled : State::Active);
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

// The scenario shows a successful uninstall; this is one the service refuses.
TEST(CoordinatedTransferTest, UninstallReportsOnTheServicesThread) {
  InstallDevice d;
  d.device.kc().hold();

  d.client.uninstallAppUsingCoordination(kID);

  // Back before the service has answered.
  EXPECT_EQ(d.steps(), Messages{step(7, 1, true, kID, "Uninstall app")});
  EXPECT_TRUE(d.logged().empty());
  d.device.kc().release();
  d.device.kc().drain();
  const std::string error =
      makeKCError(kKCErrorUnknownApplication, "no application " + kID)->describe();
  EXPECT_EQ(d.logged(), Messages{"Uninstall of com.example.app with install coordinator "
                                 "succeeded wiht error " +
                                 error + "."});
  EXPECT_EQ(d.steps(), (Messages{step(7, 1, true, kID, "Uninstall app"),
                                 step(7, 2, false, kID, "Uninstall app")}));
  EXPECT_EQ(d.kc.uninstallConfirmations, std::vector<bool>{false});
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
  EXPECT_EQ(d.cancellations.seen().size(), 2u);
}

}  // namespace
}  // namespace appsync::coordinated_install_tests
