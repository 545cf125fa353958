// Coordinators, placeholders and promises as the client makes them: kinds and creators, names,
// sizes, transfer paths and completion, configuration order, and what a failing step cancels.
#include <gtest/gtest.h>

#include <functional>

#include "coordination/coordination_fixture.h"

namespace appsync::coordinator_tests {
namespace {

using testing::CoordinationDevice;
using testing::reasonText;
using testing::serviceError;
using testing::serviceErrorText;
using testing::step;
using Messages = std::vector<std::string>;
using Kind = KCCoordinatorKind;

const std::string kApp = "com.example.app";
const plist::Bytes kIconBytes = {0x89, 'P', 'N', 'G', 1, 2, 3};
const plist::Bytes kSinfBytes = {9, 8, 7};
const std::string kTRErrorCode29 = "Error Domain=TRError Code=29";
const std::string kTRErrorCode30 = "Error Domain=TRError Code=30";

TEST(CoordinatorLookupTest, OnlyItsOwnCoordinatorOfTheAskedKindIsUsed) {
  enum Outcome { kCreated, kFound, kForeign, kNothing };
  struct Case {
    const char* name;
    std::optional<std::pair<Kind, std::uint64_t>> existing;  // kind and creator
    bool existingApp, create;
    Outcome outcome;
    Messages messages;
    std::int64_t errorCode = 0;  // of the error out-parameter; 0: none
    bool scriptFailure = false, passError = true;
  };
  const std::string own = "<KCInitiatingAppInstallCoordinator bundleID=com.example.app creator=3>";
  const std::string ownUpdating =
      "<KCUpdatingAppInstallCoordinator bundleID=com.example.app creator=3>";
  const Case cases[] = {
      {"new initiating",
       {},
       false,
       true,
       kCreated,
       {"Created initiating coordinator " + own +
        " (createIfNotExisting:1, existingApp:0) for com.example.app with error (null)"}},
      {"new updating",
       {},
       true,
       true,
       kCreated,
       {"Created updating coordinator " + ownUpdating +
        " (createIfNotExisting:1, existingApp:1) for com.example.app with error (null)"}},
      {"existing one, not creating",
       std::pair(Kind::Initiating, 3u),
       false,
       false,
       kFound,
       {"Created initiating coordinator " + own +
        " (createIfNotExisting:0, existingApp:0) for com.example.app with error (null)"}},
      {"existing updating one, creating",
       std::pair(Kind::Updating, 3u),
       true,
       true,
       kFound,
       {"Created updating coordinator " + ownUpdating +
        " (createIfNotExisting:1, existingApp:1) for com.example.app with error (null)"}},
      {"another client's",
       std::pair(Kind::Initiating, 7u),
       false,
       true,
       kForeign,
       {"IC returned initiating coordinator <KCInitiatingAppInstallCoordinator "
        "bundleID=com.example.app creator=7> (createIfNotExisting:1, existingApp:0, "
        "creatorIdentifier=7) for com.example.app with error (null) - Will not perform "
        "install/update for this bundle"}},
      {"another client's updating one, no error asked",
       std::pair(Kind::Updating, 1u),
       true,
       false,
       kForeign,
       {"IC returned updating coordinator <KCUpdatingAppInstallCoordinator "
        "bundleID=com.example.app creator=1> (createIfNotExisting:0, existingApp:1, "
        "creatorIdentifier=1) for com.example.app with error (null) - Will not perform "
        "install/update for this bundle"},
       0,
       false,
       false},
      {"one of another kind",
       std::pair(Kind::Updating, 3u),
       false,
       true,
       kNothing,
       {},
       kKCErrorCoordinatorKindMismatch},
      {"none and not creating", {}, false, false, kNothing, {}},
      {"service fails", {}, true, true, kNothing, {}, 77, true},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    CoordinationDevice d;
    std::shared_ptr<FakeKCAppInstallCoordinator> existing;
    if (c.existing) existing = d.put(c.existing->first, kApp, c.existing->second);
    if (c.scriptFailure) {
      d.device.kc().failOperation(
          "coordinatorForAppWithBundleID:withClientID:createIfNotExisting:created:error:",
          serviceError());
    }
    ErrorRef error = makeError("Untouched", 1);

    auto result = d.client._initiatingOrUpdatingAppInstallCoordinatorForBundleIdentifier(
        kApp, c.existingApp, c.create, c.passError ? &error : nullptr);

    const bool returned = c.outcome == kCreated || c.outcome == kFound;
    EXPECT_EQ(result != nullptr, returned);
    const Kind asked = c.existingApp ? Kind::Updating : Kind::Initiating;
    if (returned) {
      EXPECT_EQ(result->kind(), asked);
      EXPECT_EQ(result->creatorIdentifier(), 3u);
      EXPECT_EQ(result, d.device.kc().coordinator(kApp));
    }
    if (c.outcome == kFound) EXPECT_EQ(result, existing);
    ASSERT_EQ(d.kc.lookups.size(), 1u);
    EXPECT_EQ(d.kc.lookups[0].kind, asked);
    EXPECT_EQ(d.kc.lookups[0].client, 3u);
    EXPECT_EQ(d.kc.lookups[0].create, c.create);
    if (c.passError) {
      EXPECT_EQ(error ? error->code : 0, c.errorCode) << reasonText(error);
    }
    if (existing && c.outcome != kFound) {  // left as it was, still the service's
      EXPECT_EQ(existing->state(), FakeKCAppInstallCoordinator::State::Active);
      EXPECT_EQ(existing->observer(), nullptr);
      EXPECT_EQ(d.device.kc().coordinator(kApp), existing);
    }
    if (c.outcome == kNothing && !existing) EXPECT_FALSE(d.device.kc().coordinator(kApp));
    EXPECT_EQ(d.logged(), c.messages);
    EXPECT_EQ(d.steps(), (Messages{step(3, 1, true, kApp, "Create coordinator"),
                                   step(3, 2, returned, kApp, "Finished creating coordinator")}));
  }
}

TEST(CoordinatorPlaceholderTest, CreatesUnderClient3AndLogsEvenWhenRefused) {
  for (bool refused : {false, true}) {
    SCOPED_TRACE(refused);
    CoordinationDevice d;
    if (refused) {
      d.device.kc().failOperation("initAppPlaceholderWithBundleName:bundleID:installType:client:");
    }
    auto placeholder = d.client._placeHolderForBundleIdentifier(kApp, "Name", 8);
    EXPECT_EQ(placeholder != nullptr, !refused);
    if (placeholder) {
      auto fake = std::dynamic_pointer_cast<FakeKCPlaceholder>(placeholder);
      EXPECT_EQ(fake->bundleName(), "Name");
      EXPECT_EQ(fake->installType(), 8u);
      EXPECT_EQ(fake->client(), 3u);
      EXPECT_FALSE(fake->isConfigurationComplete());
    }
    const std::string shown =
        refused ? "(null)"
                : "<KCPlaceholder bundleID=com.example.app name=\"Name\" installType=8 client=3>";
    EXPECT_EQ(d.logged(),
              Messages{"Created placeholder " + shown + " for 'com.example.app' of type 8"});
    EXPECT_EQ(d.steps(), (Messages{step(4, 1, true, kApp, "Create placeholder"),
                                   step(4, 2, !refused, kApp, "Finished creating placeholder")}));
  }
}

TEST(CoordinatorPromiseTest, IconPromiseIsCompleteAndCancelledForTheRoadWhenRefused) {
  struct Case {
    const char* name;
    bool placeholder = true;
    const char* failing = nullptr;
    bool forAppInstall = true;
    bool returned = false;
    Messages messages;
    std::string cancelReason = "(not cancelled)";
  };
  const Case cases[] = {
      {"attached",
       true,
       nullptr,
       true,
       true,
       {"Added icon promise to placeholder for 'com.example.app'"}},
      {"no placeholder",
       false,
       nullptr,
       true,
       false,
       {"[error] Placeholder to add icon promise is nil for 'com.example.app'"}},
      {"promise cannot be made",
       true,
       "KCPromisedTransferToPath initWithName:client:transferPath:diskSpaceNeeded:",
       true,
       false,
       {}},
      {"refused for an app install",
       true,
       "setIconPromise:error:",
       true,
       false,
       {"[error] Error " + serviceErrorText() +
        " adding icon promise to placeholder for 'com.example.app'"},
       kTRErrorCode30},
      {"refused for a restore",
       true,
       "setIconPromise:error:",
       false,
       false,
       {"[error] Error " + serviceErrorText() +
        " adding icon promise to placeholder for 'com.example.app'"},
       kTRErrorCode29},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    CoordinationDevice d;
    std::shared_ptr<FakeKCPlaceholder> placeholder;
    if (c.placeholder) {
      placeholder = std::dynamic_pointer_cast<FakeKCPlaceholder>(
          d.device.kc().initAppPlaceholder("Name", kApp, 4, 3));
    }
    if (c.failing) d.device.kc().failOperation(c.failing, serviceError());
    const std::string icon = d.root / "Icon.png";

    auto promise = d.client._createIconPromiseForBundleIdentifier(kApp, icon, 4096, placeholder,
                                                                  c.forAppInstall);

    EXPECT_EQ(promise != nullptr, c.returned);
    EXPECT_EQ(d.logged(), c.messages);
    ASSERT_EQ(d.kc.made.size(), c.placeholder ? 1u : 0u);
    if (!c.placeholder) continue;
    const auto& made = d.kc.made[0];
    EXPECT_EQ(made.name, "com.example.app-Icon");
    EXPECT_EQ(made.client, 3u);
    EXPECT_EQ(made.transferPath, "file://" + icon);
    EXPECT_EQ(made.diskSpaceNeeded, 4096u);
    EXPECT_EQ(placeholder->iconPromise(), promise);
    if (!made.promise) continue;
    EXPECT_EQ(made.promise->percentComplete(), 1.0);
    EXPECT_TRUE(made.promise->isComplete());
    EXPECT_EQ(reasonText(dynamic_cast<FakeKCPromiseBase&>(*made.promise).cancelReason()),
              c.cancelReason);
  }
}

TEST(CoordinatorPromiseTest, AssetPromiseWaitsForThePackageAndIsCancelledWhenRefused) {
  struct Case {
    const char* name;
    std::optional<std::string> path;  // "PKG" stands for the package path
    bool coordinator = true;
    const char* failing = nullptr;
    Messages messages;
    bool attached = false;
  };
  const std::string refused =
      "[error] Error " + serviceErrorText() + " adding app asset promise at ";
  const Case cases[] = {
      {"with a path",
       "PKG",
       true,
       nullptr,
       {"Added app asset promise to coordinator for 'com.example.app'"},
       true},
      {"without a path",
       std::nullopt,
       true,
       nullptr,
       {"Added app asset promise to coordinator for 'com.example.app'"},
       true},
      {"no coordinator", "PKG", false, nullptr, {}},
      {"promise cannot be made",
       std::nullopt,
       true,
       "KCPromisedTransferToPath initWithName:client:diskSpaceNeeded:",
       {"[error] Error creating asset promise for 'com.example.app'"}},
      {"refused with a path",
       "PKG",
       true,
       "setAppAssetPromise:error:",
       {refused + "PKG to 'com.example.app'",
        "[error] Cancelling asset promise for 'com.example.app'"}},
      {"refused without a path",
       std::nullopt,
       true,
       "setAppAssetPromise:error:",
       {refused + "(null) to 'com.example.app'",
        "[error] Cancelling asset promise for 'com.example.app'"}},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    CoordinationDevice d;
    const std::string package = d.root / "Sample.app";
    auto coordinator = c.coordinator ? d.put(Kind::Initiating, kApp) : nullptr;
    if (c.failing) d.device.kc().failOperation(c.failing, serviceError());
    const std::optional<std::string> path = c.path ? std::optional(package) : std::nullopt;

    auto promise = d.client._createAppAssetPromiseForBundleIdentifier(kApp, path, coordinator);

    EXPECT_EQ(promise != nullptr, c.attached);
    Messages expected = c.messages;
    for (auto& m : expected) {
      if (auto at = m.find("PKG"); at != std::string::npos) m.replace(at, 3, package);
    }
    EXPECT_EQ(d.logged(), expected);
    if (!c.coordinator) {
      EXPECT_TRUE(d.kc.made.empty());
      continue;
    }
    ASSERT_EQ(d.kc.made.size(), 1u);
    const auto& made = d.kc.made[0];
    EXPECT_EQ(made.name, "com.example.app-Asset");
    EXPECT_EQ(made.client, 3u);
    EXPECT_EQ(made.transferPath, path ? std::optional("file://" + package) : std::nullopt);
    EXPECT_EQ(made.diskSpaceNeeded, 0u);
    EXPECT_EQ(coordinator->snapshot().appAssetPromise, promise);
    if (!made.promise) continue;
    EXPECT_FALSE(made.promise->isComplete());
    EXPECT_EQ(made.promise->percentComplete(), 0.0);
    EXPECT_EQ(reasonText(dynamic_cast<FakeKCPromiseBase&>(*made.promise).cancelReason()),
              c.attached ? "(not cancelled)" : kTRErrorCode30);
  }
}

TEST(CoordinatorPromiseTest, UserDataPromiseIsCompleteAtOnce) {
  for (bool refused : {false, true}) {
    SCOPED_TRACE(refused);
    CoordinationDevice d;
    if (refused) {
      d.device.kc().failOperation(
          "KCPromisedOutOfBandTransfer initWithName:client:diskSpaceNeeded:");
    }
    auto promise = d.client._userDataPromiseForBundleIdentifier(kApp);
    ASSERT_EQ(promise != nullptr, !refused);
    ASSERT_EQ(d.kc.made.size(), 1u);
    EXPECT_EQ(d.kc.made[0].name, "com.example.app-UserData");
    EXPECT_EQ(d.kc.made[0].client, 3u);
    EXPECT_EQ(d.kc.made[0].diskSpaceNeeded, 0u);
    if (promise) {
      EXPECT_EQ(promise->percentComplete(), 1.0);
      EXPECT_TRUE(promise->isComplete());
    }
    EXPECT_TRUE(d.logged().empty());
  }
}

std::string placeholderText(const std::string& name, int type) {
  return "Created placeholder <KCPlaceholder bundleID=com.example.app name=\"" + name +
         "\" installType=" + std::to_string(type) + " client=3> for 'com.example.app' of type " +
         std::to_string(type);
}

std::string attributesText(bool launchProhibited) {
  KCPlaceholderAttributes attributes;
  attributes.setLaunchProhibited(launchProhibited);
  attributes.setBundleVersion("3.1");
  return "set " + attributes.describe() + " placeholder attributes for com.example.app";
}

TEST(RestorePlaceholderOperationTest, ConfiguresInOrderFromTheStoreMetadata) {
  struct Case {
    const char* name;
    plist::Dict metadata;  // "bundleVersion" 3.1 is added
    std::uint64_t demotion;
    std::string displayName;
    int installType;
    bool launchProhibited = false, icon = true, sinf = true;
  };
  const Case cases[] = {
      {"title, not demoted", {{"title", "Title"}, {"itemName", "Item"}}, 0, "Title", 2},
      {"itemName, intentionally demoted",
       {{"itemName", "Item"}, {"ARApplicationLaunchProhibited", true}},
       1,
       "Item",
       8,
       true},
      {"identifier, automatically demoted", {{"launchProhibited", true}}, 2, kApp, 7, true},
      {"the first launch key wins",
       {{"title", "T"}, {"ARApplicationLaunchProhibited", false}, {"launchProhibited", true}},
       0,
       "T",
       2},
      {"no icon", {{"title", "T"}}, 0, "T", 2, false, false},
      {"no SINF", {{"title", "T"}}, 0, "T", 2, false, true, false},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    CoordinationDevice d;
    plist::Dict metadata = c.metadata;
    metadata.set("bundleVersion", "3.1");
    const std::string dir = d.placeholderDir(kApp), icon = dir + "/Icon.png";

    auto result = d.client._placeHolderForBundleIdentifier(
        kApp, metadata, c.sinf ? std::optional(kSinfBytes) : std::nullopt,
        c.icon ? std::optional(kIconBytes) : std::nullopt, c.demotion);

    ASSERT_EQ(d.kc.placeholders.size(), 1u);
    auto placeholder = d.kc.placeholders[0];
    EXPECT_EQ(result, placeholder);
    EXPECT_EQ(placeholder->bundleName(), c.displayName);
    EXPECT_EQ(placeholder->installType(), std::uint64_t(c.installType));
    EXPECT_EQ(placeholder->client(), 3u);
    EXPECT_TRUE(placeholder->isConfigurationComplete());
    EXPECT_FALSE(placeholder->isCancelled());
    ASSERT_TRUE(placeholder->attributes());
    EXPECT_EQ(placeholder->attributes()->launchProhibited(), c.launchProhibited);
    EXPECT_EQ(placeholder->attributes()->bundleVersion(), "3.1");
    EXPECT_TRUE(placeholder->attributes()->infoPlist().empty());
    ASSERT_TRUE(placeholder->metadata());
    EXPECT_EQ(placeholder->metadata()->dictionary(), metadata);
    EXPECT_EQ(placeholder->sinfData(), c.sinf ? std::optional(kSinfBytes) : std::nullopt);
    auto iconPromise = placeholder->iconPromise();
    EXPECT_EQ(iconPromise != nullptr, c.icon);
    EXPECT_EQ(d.kc.made.size(), c.icon ? 1u : 0u);
    if (iconPromise) {
      EXPECT_EQ(iconPromise->name(), "com.example.app-Icon");
      EXPECT_EQ(iconPromise->transferPath(), "file://" + icon);
      EXPECT_EQ(iconPromise->diskSpaceNeeded(), kIconBytes.size());
      EXPECT_TRUE(iconPromise->isComplete());
    }
    EXPECT_EQ(readFile(icon), c.icon ? std::optional(kIconBytes) : std::nullopt);
    EXPECT_EQ(d.device.system().ownership(dir)->owner, "mobile");
    EXPECT_EQ(d.device.system().ownership(dir)->group, "mobile");
    if (c.icon) EXPECT_EQ(d.device.system().ownership(icon)->group, "mobile");

    Messages expected{"Created app directory for 'com.example.app' at " + dir + " with err=(null)"};
    expected.push_back(c.icon ? "icon data for 'com.example.app' was writen to " + icon +
                                    " with status:1 fileSize:7"
                              : "[error] no icon data for 'com.example.app'");
    expected.push_back(placeholderText(c.displayName, c.installType));
    if (c.icon) expected.push_back("Added icon promise to placeholder for 'com.example.app'");
    expected.push_back(attributesText(c.launchProhibited));
    expected.push_back("set store metadata on placeholder for com.example.app");
    if (c.sinf) expected.push_back("set SINF data on placeholder for com.example.app");
    expected.push_back("set placeholder configuration complete for com.example.app");
    EXPECT_EQ(d.logged(), expected);
    EXPECT_EQ(d.steps(), (Messages{step(4, 1, true, kApp, "Create placeholder"),
                                   step(4, 2, true, kApp, "Finished creating placeholder")}));
  }
}

TEST(RestorePlaceholderOperationTest, AFailingStepCancelsWith29AndKeepsTheFiles) {
  const std::string error = "[error] Error " + serviceErrorText();
  const std::string iconAdded = "Added icon promise to placeholder for 'com.example.app'";
  const std::string attributesSet = attributesText(false);
  const std::string metadataSet = "set store metadata on placeholder for com.example.app";
  struct Case {
    const char* name;
    const char* failing;
    Messages tail;  // after the directory and icon messages
    bool placeholderMade = true;
  };
  const Case cases[] = {
      {"placeholder cannot be made",
       "initAppPlaceholderWithBundleName:bundleID:installType:client:",
       {"Created placeholder (null) for 'com.example.app' of type 2"},
       false},
      {"icon promise cannot be made",
       "KCPromisedTransferToPath initWithName:client:transferPath:diskSpaceNeeded:",
       {placeholderText("T", 2)}},
      {"icon promise refused",
       "setIconPromise:error:",
       {placeholderText("T", 2),
        error + " adding icon promise to placeholder for 'com.example.app'"}},
      {"attributes refused",
       "setPlaceholderAttributes:error:",
       {placeholderText("T", 2), iconAdded,
        error + " setting placeholder attributes for 'com.example.app'"}},
      {"metadata refused",
       "setMetadata:error:",
       {placeholderText("T", 2), iconAdded, attributesSet,
        error + " setting store metadata for 'com.example.app'"}},
      {"SINF refused",
       "setSinfData:error:",
       {placeholderText("T", 2), iconAdded, attributesSet, metadataSet,
        error + " setting SINF data for 'com.example.app'"}},
      {"configuration refused",
       "setConfigurationCompleteWithError:",
       {placeholderText("T", 2), iconAdded, attributesSet, metadataSet,
        "set SINF data on placeholder for com.example.app",
        error + " setting placeholder configuration as complete for 'com.example.app'"}},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    CoordinationDevice d;
    d.device.kc().failOperation(c.failing, serviceError());
    const std::string dir = d.placeholderDir(kApp);
    const plist::Dict metadata{{"title", "T"}, {"bundleVersion", "3.1"}};

    EXPECT_FALSE(
        d.client._placeHolderForBundleIdentifier(kApp, metadata, kSinfBytes, kIconBytes, 0));

    Messages expected{"Created app directory for 'com.example.app' at " + dir + " with err=(null)",
                      "icon data for 'com.example.app' was writen to " + dir +
                          "/Icon.png with status:1 fileSize:7"};
    expected.insert(expected.end(), c.tail.begin(), c.tail.end());
    EXPECT_EQ(d.logged(), expected);
    EXPECT_EQ(d.device.kc().callCount("KCPlaceholder cancelForReason:client:error:"),
              c.placeholderMade ? 1u : 0u);
    ASSERT_EQ(d.kc.placeholders.size(), c.placeholderMade ? 1u : 0u);
    if (c.placeholderMade) {
      EXPECT_EQ(reasonText(d.kc.placeholders[0]->cancelReason()), kTRErrorCode29);
      EXPECT_FALSE(d.kc.placeholders[0]->isConfigurationComplete());
    }
    for (const auto& made : d.kc.made) {
      if (made.promise) EXPECT_TRUE(made.promise->isCancelled());
    }
    EXPECT_TRUE(directoryExists(dir));
    EXPECT_EQ(readFile(dir + "/Icon.png"), kIconBytes);
  }
}

TEST(RestorePlaceholderOperationTest, NoDirectoryMeansNothingAtTheService) {
  CoordinationDevice d;
  ASSERT_TRUE(writeFileAtomically(d.appsDir(), plist::Bytes{'x'}));
  EXPECT_FALSE(
      d.client._placeHolderForBundleIdentifier(kApp, {{"title", "T"}}, kSinfBytes, kIconBytes, 0));
  EXPECT_EQ(
      d.device.kc().callCount("initAppPlaceholderWithBundleName:bundleID:installType:client:"), 0u);
  EXPECT_TRUE(d.kc.made.empty());
  EXPECT_TRUE(d.steps().empty());
  EXPECT_FALSE(fileExists(d.placeholderDir(kApp) + "/Icon.png"));
  const Messages logged = d.logged();
  ASSERT_FALSE(logged.empty());
  EXPECT_TRUE(logged[0].starts_with("Created app directory for 'com.example.app' at " +
                                    d.placeholderDir(kApp) +
                                    " with err=Error Domain=POSIX Code=20"))
      << logged[0];
  for (const auto& line : logged) EXPECT_FALSE(line.starts_with("Created placeholder")) << line;
}

}  // namespace
}  // namespace appsync::coordinator_tests
