// The coordinated restore of one application: which coordinator and placeholder the demotion
// status chooses, and what a restore that stops short or fails leaves at the service and in the
// count of placeholders the restore waits for.
#include <gtest/gtest.h>

#include <algorithm>

#include "coordination/coordination_fixture.h"

namespace appsync::coordinated_restore_tests {
namespace {

using testing::step;
using Kind = KCCoordinatorKind;
using Messages = std::vector<std::string>;

const std::string kApp = "com.example.app";
const plist::Bytes kMetadata =
    testing::binaryPlist(plist::Dict{{"title", "Restored"}, {"bundleVersion", "4.2"}});
const std::string kCounted =
    "DataMigrator will wait for IC to install placeholder for com.example.app, "
    "_restoringPlaceholderCount 1";

struct RestoreDevice : testing::CoordinationDevice {
  // The service is held: nothing it would do in the background changes the count meanwhile.
  RestoreDevice() { device.kc().hold(); }
  bool restore(std::uint64_t demotionStatus, const plist::Bytes& metadata = kMetadata) {
    return client.prepareAppForRestoreUsingCoordination(kApp, metadata, std::nullopt, std::nullopt,
                                                        demotionStatus);
  }
  bool logs(const std::string& line) {
    const Messages all = logged();
    return std::find(all.begin(), all.end(), line) != all.end();
  }
};

TEST(CoordinatedRestoreTest, TheDemotionStatusChoosesTheCoordinatorAndThePlaceholder) {
  struct Case {
    std::uint64_t status;
    Kind kind;
    std::uint64_t installType;
    std::uint64_t responsibleClient;  // for the package; 0: none named
    const char* step;
  };
  const Case cases[] = {
      {0, Kind::Restoring, 2, KCClientBazaar, "Restore app"},
      {1, Kind::RestoringDemoted, 8, 0, "Restore demoted app"},
      {2, Kind::RestoringDemoted, 7, 0, "Restore demoted app"},
      {5, Kind::RestoringDemoted, 2, 0, "Restore demoted app"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.status);
    RestoreDevice d;

    EXPECT_TRUE(d.restore(c.status));

    EXPECT_EQ(d.client.restoringPlaceholderCount(), 1);
    ASSERT_EQ(d.kc.lookups.size(), 1u);
    EXPECT_EQ(d.kc.lookups[0].kind, c.kind);
    EXPECT_EQ(d.kc.lookups[0].client, kAppSyncCoordinationClient);
    EXPECT_TRUE(d.kc.lookups[0].create);
    ASSERT_EQ(d.kc.placeholders.size(), 1u);
    EXPECT_EQ(d.kc.placeholders[0]->installType(), c.installType);
    EXPECT_FALSE(d.kc.placeholders[0]->isCancelled());
    auto coordinator = d.device.kc().coordinator(kApp);
    ASSERT_TRUE(coordinator);
    const auto state = coordinator->snapshot();
    EXPECT_EQ(state.observer, &d.client);
    EXPECT_EQ(state.placeholder, d.kc.placeholders[0]);
    ASSERT_TRUE(state.userDataPromise);
    EXPECT_TRUE(state.userDataPromise->isComplete());
    EXPECT_EQ(state.responsibleClient, c.responsibleClient);
    const Messages steps = d.steps();
    EXPECT_EQ(steps.front(), step(2, 1, true, kApp, c.step));
    EXPECT_EQ(steps.back(), step(2, 2, true, kApp, c.step));
  }
}

TEST(CoordinatedRestoreTest, WhatARestoreThatStopsShortLeavesBehind) {
  enum class Before { Nothing, StoreDaemonHasPackage, PlaceholderThere, UnparsableMetadata };
  struct Case {
    const char* name;
    std::uint64_t status;
    Before before;
    const char* failing;  // scripted with an error; null: none
    bool result;
    bool counted;                      // the app was counted for the wait at some point
    std::optional<std::int64_t> code;  // TRError code the coordinator was cancelled with
    bool placeholderCancelled;         // on its own, not with the coordinator
  };
  const Case cases[] = {
      {"store daemon", 0, Before::StoreDaemonHasPackage, nullptr, true, false, {}, false},
      {"demoted, placeholder there", 1, Before::PlaceholderThere, nullptr, true, false, {}, false},
      {"placeholder there", 0, Before::PlaceholderThere, nullptr, true, false, {}, false},
      {"responsible client refused", 0, Before::Nothing,
       "setAppAssetPromiseResponsibleClient:error:", false, true, 29, false},
      {"user data refused", 1, Before::Nothing, "setUserDataPromise:error:", false, false, 29,
       false},
      {"placeholder refused", 0, Before::Nothing, "setPlaceholderPromise:error:", false, true, 29,
       true},
      {"unparsable metadata", 0, Before::UnparsableMetadata, nullptr, false, false, {}, false},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    RestoreDevice d;
    const Kind kind = c.status == 0 ? Kind::Restoring : Kind::RestoringDemoted;
    std::shared_ptr<FakeKCAppInstallCoordinator> existing;
    const bool unparsable = c.before == Before::UnparsableMetadata;
    if (c.before != Before::Nothing && !unparsable)
      existing = d.device.kc().putCoordinator(kind, kApp, 1);
    if (c.before == Before::StoreDaemonHasPackage) {
      ASSERT_TRUE(existing->setAppAssetPromiseResponsibleClient(KCClientBazaar, nullptr));
    }
    if (c.before == Before::PlaceholderThere) {
      auto earlier = d.device.kc().initAppPlaceholder("Earlier", kApp, 2, 3);
      ASSERT_TRUE(earlier->setConfigurationCompleteWithError(nullptr));
      ASSERT_TRUE(existing->setPlaceholderPromise(earlier, nullptr));
    }
    if (c.failing) d.device.kc().failOperation(c.failing, testing::serviceError());

    EXPECT_EQ(d.restore(c.status, unparsable ? plist::Bytes{'n', 'o', 't'} : kMetadata), c.result);

    EXPECT_EQ(d.client.restoringPlaceholderCount(), 0);
    EXPECT_EQ(d.kc.lookups.empty(), unparsable);
    EXPECT_EQ(d.logs(kCounted), c.counted);
    EXPECT_EQ(d.logs("Cancelling placeholder for appBundleIdentifier:" + kApp),
              c.placeholderCancelled);
    if (c.placeholderCancelled) {
      ASSERT_EQ(d.kc.placeholders.size(), 1u);
      EXPECT_EQ(testing::reasonText(d.kc.placeholders[0]->cancelReason()),
                "Error Domain=TRError Code=29");
    }
    if (existing) {
      const KCAppInstallObserverDelegate* observer =
          c.before == Before::StoreDaemonHasPackage ? nullptr : &d.client;
      EXPECT_EQ(existing->observer(), observer);
    }
    if (c.before == Before::StoreDaemonHasPackage) {
      // Left entirely alone: no promise, no finishing message.
      EXPECT_FALSE(existing->hasUserDataPromise());
      EXPECT_EQ(d.logged(),
                (Messages{"processing app restore for non demoted bundle 'com.example.app' with "
                          "install coordination",
                          "App asset DRI for com.example.app is set to 1 - nothing more for trc "
                          "to do"}));
      EXPECT_EQ(d.steps(), (Messages{step(2, 1, true, kApp, "Restore app"),
                                     step(2, 2, true, kApp, "Restore app")}));
    }
    d.device.kc().release();
    d.device.kc().drain();
    const auto finished = d.device.kc().finishedCoordinator(kApp);
    ASSERT_EQ(finished.has_value(), c.code.has_value());
    if (finished) {
      EXPECT_EQ(finished->errorDomain, "TRError");
      EXPECT_EQ(finished->errorCode, c.code);
      EXPECT_EQ(finished->cancellingClient, kAppSyncCoordinationClient);
    }
  }
}

}  // namespace
}  // namespace appsync::coordinated_restore_tests
