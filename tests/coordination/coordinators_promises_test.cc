// Coordinators, placeholders and promises as the client makes them where no scenario reaches:
// the coordinators it may not use, the cancellation of a refused promise, and the placeholder of
// an app being restored, its configuration order and what a failing step cancels.
#include <gtest/gtest.h>

#include "coordination/coordination_fixture.h"

namespace appsync::coordinator_tests {
namespace {

using testing::CoordinationDevice;
using testing::promiseState;
using testing::reasonText;
using testing::serviceError;
using testing::step;
using Messages = std::vector<std::string>;
using Kind = KCCoordinatorKind;

const std::string kApp = "com.example.app";
const plist::Bytes kIconBytes = {0x89, 'P', 'N', 'G', 1, 2, 3};
const plist::Bytes kSinfBytes = {9, 8, 7};
const std::string kErr = "[error] Error " + testing::serviceErrorText();

// A placeholder as the fake describes it, whether it is configured, and why it was cancelled.
std::string placeholderState(const std::shared_ptr<FakeKCPlaceholder>& placeholder) {
  return placeholder->describe() +
         (placeholder->isConfigurationComplete() ? " configured " : " unconfigured ") +
         reasonText(placeholder->cancelReason());
}

// The client's own coordinator of the asked kind is shown by the scenarios; these are the ones
// it may not use.
TEST(CoordinatorLookupTest, AnotherClientsOrAnotherKindOfCoordinatorIsNotUsed) {
  struct Case {
    const char* name;
    Kind existing;
    std::uint64_t creator;  // of the existing coordinator
    bool existingApp, create;
    std::int64_t errorCode;  // of the error out-parameter; -1: none passed
  };
  const Case cases[] = {
      {"another client's", Kind::Initiating, 7, false, true, 0},
      {"another client's updating, no error wanted", Kind::Updating, 1, true, false, -1},
      {"one of another kind", Kind::Updating, 3, false, true, kKCErrorCoordinatorKindMismatch},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    CoordinationDevice d;
    auto existing = d.device.kc().putCoordinator(c.existing, kApp, c.creator);
    ErrorRef error = makeError("Untouched", 1);

    EXPECT_FALSE(d.client._initiatingOrUpdatingAppInstallCoordinatorForBundleIdentifier(
        kApp, c.existingApp, c.create, c.errorCode < 0 ? nullptr : &error));

    EXPECT_EQ(existing->state(), FakeKCAppInstallCoordinator::State::Active);
    EXPECT_EQ(d.device.kc().coordinator(kApp), existing);
    ASSERT_EQ(d.kc.lookups.size(), 1u);
    EXPECT_EQ(d.kc.lookups[0].kind, c.existingApp ? Kind::Updating : Kind::Initiating);
    EXPECT_EQ(d.kc.lookups[0].client, 3u);
    EXPECT_EQ(d.kc.lookups[0].create, c.create);
    if (c.errorCode >= 0) {
      EXPECT_EQ(error ? error->code : 0, c.errorCode) << reasonText(error);
    }
    const std::string kind = c.existingApp ? "updating" : "initiating";
    const std::string foreign =
        "IC returned " + kind + " coordinator <" + (c.existingApp ? "KCUpdating" : "KCInitiating") +
        "AppInstallCoordinator bundleID=com.example.app creator=" + std::to_string(c.creator) +
        "> (createIfNotExisting:" + std::to_string(c.create) +
        ", existingApp:" + std::to_string(c.existingApp) +
        ", creatorIdentifier=" + std::to_string(c.creator) +
        ") for com.example.app with error (null) - Will not perform install/update for this bundle";
    EXPECT_EQ(d.logged(), c.creator == 3 ? Messages{} : Messages{foreign});
    EXPECT_EQ(d.steps(), (Messages{step(3, 1, true, kApp, "Create coordinator"),
                                   step(3, 2, false, kApp, "Finished creating coordinator")}));
  }
}

// A promise that its placeholder or coordinator refuses is cancelled for its road: 30 on the
// app-install road, 29 on restore.
TEST(CoordinatorPromiseTest, ARefusedPromiseIsCancelledForItsRoad) {
  const std::string path = "/packages/Sample.app";
  auto icon = [](const std::string& reason) {
    return testing::filePromise("Icon", 4096, "1", true, "file:///icons/Icon.png", reason);
  };
  const std::string iconRefused = kErr + " adding icon promise to placeholder for '" + kApp + "'";
  struct Case {
    bool asset;  // an asset promise, else an icon promise
    const char* failing;
    bool forAppInstall;
    Messages messages;
    std::string promise;  // the promise made, though not returned
  };
  // clang-format off
  const Case cases[] = {
      {false, "setIconPromise:error:", true, {iconRefused}, icon("Error Domain=TRError Code=30")},
      {false, "setIconPromise:error:", false, {iconRefused}, icon("Error Domain=TRError Code=29")},
      {true, "setAppAssetPromise:error:", true,
       {kErr + " adding app asset promise at " + path + " to '" + kApp + "'",
        "[error] Cancelling asset promise for '" + kApp + "'"},
       testing::filePromise("Asset", 0, "0", false, "file://" + path, "Error Domain=TRError Code=30")},
  };
  // clang-format on
  for (const Case& c : cases) {
    SCOPED_TRACE(c.promise);
    CoordinationDevice d;
    auto coordinator = c.asset ? d.device.kc().putCoordinator(Kind::Initiating, kApp, 3) : nullptr;
    auto placeholder = c.asset ? nullptr
                               : std::dynamic_pointer_cast<FakeKCPlaceholder>(
                                     d.device.kc().initAppPlaceholder("N", kApp, 4, 3));
    d.device.kc().failOperation(c.failing, serviceError());

    auto promise = c.asset
                       ? d.client._createAppAssetPromiseForBundleIdentifier(kApp, path, coordinator)
                       : d.client._createIconPromiseForBundleIdentifier(
                             kApp, "/icons/Icon.png", 4096, placeholder, c.forAppInstall);

    EXPECT_FALSE(promise);
    EXPECT_EQ(d.logged(), c.messages);
    ASSERT_EQ(d.kc.made.size(), 1u);
    EXPECT_EQ(promiseState(d.kc.made[0]), c.promise);
    if (coordinator) {
      EXPECT_FALSE(coordinator->snapshot().appAssetPromise);
    }
    if (placeholder) {
      EXPECT_FALSE(placeholder->iconPromise());
    }
  }
}

std::string placeholderLine(const std::string& name, int type) {
  return "Created placeholder <KCPlaceholder bundleID=com.example.app name=\"" + name +
         "\" installType=" + std::to_string(type) + " client=3> for 'com.example.app' of type " +
         std::to_string(type);
}

std::string attributesLine(bool launchProhibited) {
  KCPlaceholderAttributes attributes;
  attributes.setLaunchProhibited(launchProhibited);
  attributes.setBundleVersion("3.1");
  return "set " + attributes.describe() + " placeholder attributes for com.example.app";
}

// The messages of the placeholder directory and the icon written into it.
Messages directoryLines(const std::string& dir, bool icon) {
  return {"Created app directory for 'com.example.app' at " + dir + " with err=(null)",
          icon ? "icon data for 'com.example.app' was writen to " + dir +
                     "/Icon.png with status:1 fileSize:7"
               : "[error] no icon data for 'com.example.app'"};
}

TEST(RestorePlaceholderOperationTest, ConfiguresInOrderFromTheStoreMetadata) {
  struct Case {
    std::uint64_t demotion;
    int installType;
    std::string displayName;
    bool launchProhibited, iconAndSinf;
    plist::Dict metadata;  // "bundleVersion" 3.1 is added
  };
  // clang-format off
  const Case cases[] = {
      {0, 2, "Title", false, true, {{"title", "Title"}, {"itemName", "Item"}}},
      {1, 8, "Item", true, true, {{"itemName", "Item"}, {"ARApplicationLaunchProhibited", true}}},
      {2, 7, kApp, true, false, {{"launchProhibited", true}}},
      {0, 2, "T", false, true, {{"title", "T"}, {"ARApplicationLaunchProhibited", false}, {"launchProhibited", true}}},
  };
  // clang-format on
  for (const Case& c : cases) {
    SCOPED_TRACE(c.displayName);
    CoordinationDevice d;
    plist::Dict metadata = c.metadata;
    metadata.set("bundleVersion", "3.1");
    const std::string dir = d.placeholderDir(kApp), icon = dir + "/Icon.png";
    const bool extras = c.iconAndSinf;

    auto result = d.client._placeHolderForBundleIdentifier(
        kApp, metadata, extras ? std::optional(kSinfBytes) : std::nullopt,
        extras ? std::optional(kIconBytes) : std::nullopt, c.demotion);

    ASSERT_EQ(d.kc.placeholders.size(), 1u);
    auto placeholder = d.kc.placeholders[0];
    EXPECT_EQ(result, placeholder);
    EXPECT_EQ(placeholderState(placeholder), "<KCPlaceholder bundleID=com.example.app name=\"" +
                                                 c.displayName +
                                                 "\" installType=" + std::to_string(c.installType) +
                                                 " client=3> configured (not cancelled)");
    ASSERT_TRUE(placeholder->attributes() && placeholder->metadata());
    EXPECT_EQ(
        "set " + placeholder->attributes()->describe() + " placeholder attributes for " + kApp,
        attributesLine(c.launchProhibited));
    EXPECT_EQ(placeholder->metadata()->dictionary(), metadata);
    EXPECT_EQ(placeholder->sinfData(), extras ? std::optional(kSinfBytes) : std::nullopt);
    EXPECT_EQ(promiseState(placeholder->iconPromise()),
              extras ? testing::filePromise("Icon", 7, "1", true, "file://" + icon) : "(none)");
    EXPECT_EQ(d.kc.made.size(), extras ? 1u : 0u);
    for (const std::string& path : {dir, icon}) {
      auto owner = d.device.system().ownership(path);
      EXPECT_EQ(owner ? owner->owner + ":" + owner->group : "",
                extras || path == dir ? "mobile:mobile" : "");
    }

    Messages expected = directoryLines(dir, extras);
    expected.push_back(placeholderLine(c.displayName, c.installType));
    if (extras) expected.push_back("Added icon promise to placeholder for '" + kApp + "'");
    expected.push_back(attributesLine(c.launchProhibited));
    expected.push_back("set store metadata on placeholder for com.example.app");
    if (extras) expected.push_back("set SINF data on placeholder for com.example.app");
    expected.push_back("set placeholder configuration complete for com.example.app");
    EXPECT_EQ(d.logged(), expected);
    EXPECT_EQ(d.steps(), (Messages{step(4, 1, true, kApp, "Create placeholder"),
                                   step(4, 2, true, kApp, "Finished creating placeholder")}));
  }
}

TEST(RestorePlaceholderOperationTest, AFailingStepCancelsWith29AndKeepsTheFiles) {
  const std::string made = placeholderLine("T", 2);
  const std::string iconAdded = "Added icon promise to placeholder for '" + kApp + "'";
  const std::string attributesSet = attributesLine(false);
  const std::string metadataSet = "set store metadata on placeholder for com.example.app";
  struct Case {
    const char* failing;
    Messages tail;  // after the directory and icon messages
  };
  const Case cases[] = {
      {"initAppPlaceholderWithBundleName:bundleID:installType:client:",
       {"Created placeholder (null) for 'com.example.app' of type 2"}},
      {"KCPromisedTransferToPath initWithName:client:transferPath:diskSpaceNeeded:", {made}},
      {"setIconPromise:error:",
       {made, kErr + " adding icon promise to placeholder for 'com.example.app'"}},
      {"setPlaceholderAttributes:error:",
       {made, iconAdded, kErr + " setting placeholder attributes for 'com.example.app'"}},
      {"setMetadata:error:",
       {made, iconAdded, attributesSet, kErr + " setting store metadata for 'com.example.app'"}},
      {"setSinfData:error:",
       {made, iconAdded, attributesSet, metadataSet,
        kErr + " setting SINF data for 'com.example.app'"}},
      {"setConfigurationCompleteWithError:",
       {made, iconAdded, attributesSet, metadataSet,
        "set SINF data on placeholder for com.example.app",
        kErr + " setting placeholder configuration as complete for 'com.example.app'"}},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.failing);
    CoordinationDevice d;
    d.device.kc().failOperation(c.failing, serviceError());
    const std::string dir = d.placeholderDir(kApp);
    const plist::Dict metadata{{"title", "T"}, {"bundleVersion", "3.1"}};

    EXPECT_FALSE(
        d.client._placeHolderForBundleIdentifier(kApp, metadata, kSinfBytes, kIconBytes, 0));

    Messages expected = directoryLines(dir, true);
    expected.insert(expected.end(), c.tail.begin(), c.tail.end());
    EXPECT_EQ(d.logged(), expected);
    const std::string reason = "Error Domain=TRError Code=29";
    EXPECT_EQ(d.device.kc().callCount("KCPlaceholder cancelForReason:client:error:"),
              d.kc.placeholders.size());
    for (const auto& placeholder : d.kc.placeholders) {
      EXPECT_EQ(reasonText(placeholder->cancelReason()), reason);
    }
    for (const auto& promise : d.kc.made) {
      if (promise) {
        EXPECT_EQ(reasonText(dynamic_cast<FakeKCPromiseBase&>(*promise).cancelReason()), reason);
      }
    }
    EXPECT_EQ(readFile(dir + "/Icon.png"), kIconBytes);
  }
}

TEST(RestorePlaceholderOperationTest, NoDirectoryMeansNothingAtTheService) {
  CoordinationDevice d;
  ASSERT_TRUE(writeFileAtomically(d.root / "tmp/com.vantor.trc.Apps", plist::Bytes{'x'}));
  EXPECT_FALSE(
      d.client._placeHolderForBundleIdentifier(kApp, {{"title", "T"}}, kSinfBytes, kIconBytes, 0));
  EXPECT_EQ(
      d.device.kc().callCount("initAppPlaceholderWithBundleName:bundleID:installType:client:"), 0u);
  EXPECT_TRUE(d.kc.made.empty());
  EXPECT_TRUE(d.steps().empty());
  const Messages logged = d.logged();
  ASSERT_EQ(logged.size(), 1u);
  EXPECT_TRUE(logged[0].starts_with("Created app directory for 'com.example.app' at " +
                                    d.placeholderDir(kApp) +
                                    " with err=Error Domain=POSIX Code=20"))
      << logged[0];
}

}  // namespace
}  // namespace appsync::coordinator_tests
