// The actions of replay scripts, run through runAction on a device in a temporary directory, and
// the coordinator expectation, which compares the current coordinator or the last finished one.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>
#include <memory>
#include <string>
#include <vector>

#include "client/apps_client.h"
#include "device_session.h"
#include "input_error.h"
#include "platform/fake/fake_kc_objects.h"
#include "platform/tr_client.h"
#include "replay/expectations.h"
#include "replay/step_context.h"
#include "support/temp_dir.h"
#include "yaml_input.h"

namespace appsync::host::replay {
namespace {

namespace fs = std::filesystem;
using ::testing::AllOf;
using ::testing::HasSubstr;
using ::testing::StartsWith;
using ::testing::ThrowsMessage;

class ReplayActionsTest : public ::testing::Test {
 protected:
  void SetUp() override { session_ = DeviceSession::create(dir_.path() / "device", {}); }

  // Runs the one step that `yaml` is (a flow mapping such as "{stage: todo, list: []}") as the
  // engine does: read from a script, selector and value picked out of the step.
  ActionResult run(const std::string& yaml) {
    YamlField script = YamlField::loadText("steps:\n  - " + yaml + "\n", "script.yaml");
    YamlField step = script["steps"].items().at(0);
    std::string selector;
    for (const auto& [key, value] : step.entries()) {
      for (std::string_view known : kActionSelectors) selector = key == known ? key : selector;
    }
    YamlField value = step[selector];
    StepContext context{*session_, step, selector, value, dir_.path()};
    return runAction(context);
  }

  // What differs for the one expectation `yaml` is (a flow mapping), after checking it.
  std::optional<std::string> evaluate(const std::string& yaml) {
    YamlField script = YamlField::loadText("steps:\n  - " + yaml + "\n", "script.yaml");
    YamlField step = script["steps"].items().at(0);
    checkExpectation(step);
    return evaluateExpectation(*session_, step, {});
  }

  const fs::path& root() const { return session_->root(); }

  testing::TempDir dir_;
  std::unique_ptr<DeviceSession> session_;
};

// Paths that leave the device root or cross a link are refused with the rest: nothing is
// written outside.
TEST_F(ReplayActionsTest, BadArgumentsAreInputErrorsNamingTheField) {
  const fs::path outside = dir_.path() / "outside";
  fs::create_directories(outside);
  fs::create_directories(root() / "var/mobile");
  fs::create_directory_symlink(outside, root() / "var/mobile/Media");
  fs::create_directory_symlink(outside, root() / "linked");
  struct Case {
    std::string step;
    std::string field;         // the field the error names
    std::string message = "";  // part of the message
  };
  const std::vector<Case> cases = {
      {"{call: frobnicate}", "steps[0].call",
       "reconcileSync:withNewAnchor:progressCallback:error:"},
      {"{call: 'reconcileSync:withNewAnchor:progressCallback:error:', syncType: 4294967296, "
       "newAnchor: a}",
       "steps[0].syncType", "4294967295"},
      {"{call: 'assetInstallFailed:withError:', asset: {identifier: a}, error: {domain: D}}",
       "steps[0].error", "code"},
      {"{platform: fail, service: registry, operation: 'nope:'}", "steps[0].operation",
       "installApplication:withOptions:error:"},
      {"{platform: fail, service: registry, operation: 'addObserver:'}", "steps[0].operation",
       "can fail"},
      {"{platform: fail, service: registry, operation: 'applicationIsInstalled:', times: 0}",
       "steps[0].times", "from 1"},
      {"{stage: package, identifier: com.a, name: A, file: A}", "steps[0].file", "NAME.zip"},
      {"{stage: package, identifier: com.a, name: A, as: zip, file: A.app}", "steps[0].file",
       "zip"},
      {"{stage: file, path: a.txt}", "steps[0].stage", "`plist` or its `text`"},
      {"{stage: file, path: a.txt, plist: 1, text: x}", "steps[0].text", "not both"},
      {"{stage: file, path: ../escape.txt, text: x}", "steps[0].path"},
      {"{stage: file, path: /etc/escape.txt, text: x}", "steps[0].path"},
      {"{stage: file, path: linked/escape.txt, text: x}", "steps[0].path"},
      {"{stage: package, identifier: com.a, name: A}", "steps[0].stage"},
      {"{stage: restore-list, content: {a: 1}}", "steps[0].stage"},
      {"{stage: app, identifier: ../../Escape, name: A}", "steps[0].identifier"},
      {"{event: store-download, app: com.a, package: ../A.zip}", "steps[0].package"},
  };
  for (const Case& c : cases) {
    EXPECT_THAT([&] { run(c.step); },
                ThrowsMessage<InputError>(
                    AllOf(StartsWith("script.yaml:2: " + c.field + ": "), HasSubstr(c.message))))
        << c.step;
  }
  EXPECT_TRUE(fs::is_empty(outside));
  EXPECT_FALSE(fs::exists(dir_.path() / "escape.txt"));
}

// An operation the client does not implement answers "not implemented" instead of being called
// (which would abort this test); each such operation has the arguments it needs here.
TEST_F(ReplayActionsTest, HostOperationsTheClientLacksAnswerNotImplemented) {
  const std::string asset =
      "asset: {identifier: com.a, path: var/mobile/Media/PublicStaging/A.zip}";
  const std::vector<std::pair<TRClientOperation, std::string>> arguments = {
      {TRClientOperation::prepareForSyncWithHostAnchor, "hostAnchor: h"},
      {TRClientOperation::prepareForSyncWithHostAnchorHostAuthIdentifierHostVersion,
       "hostAnchor: h, hostAuthIdentifier: 7, hostVersion: '12.1'"},
      {TRClientOperation::reconcileRestoreOfType, "restoreType: 2"},
      {TRClientOperation::restoreEndedWithError, "error: {domain: TRError, code: 30}"},
      {TRClientOperation::metadataUpdate, asset + ", metadata: {k: v}, newAnchor: n"},
      {TRClientOperation::prioritizeAsset, asset},
      {TRClientOperation::shouldRestoreFile, "path: var/mobile/Library/x"},
      {TRClientOperation::shouldBackgroundRestorePath, "path: var/mobile/Library/x"},
      {TRClientOperation::shouldBackgroundRestoreFile, "path: var/mobile/Library/x"},
  };
  int checked = 0;
  for (int i = 0; i <= static_cast<int>(TRClientOperation::shouldBackgroundRestoreFile); ++i) {
    const auto operation = static_cast<TRClientOperation>(i);
    if (session_->client().respondsTo(operation)) continue;  // implemented: nothing to show here
    std::string fields;
    for (const auto& [op, text] : arguments) fields = op == operation ? ", " + text : fields;
    SCOPED_TRACE(operationName(operation));
    const ActionResult result =
        run(std::string("{call: '") + operationName(operation) + "'" + fields + "}");
    EXPECT_EQ(result, plist::Value("not implemented"));
    ++checked;
  }
  EXPECT_GT(checked, 0);
}

// Installing through a step and assertion denials are shown by the scenarios.
TEST_F(ReplayActionsTest, PlatformChangesReachTheFakes) {
  FakePlatform& device = session_->device();
  device.ar().putApplication({.identifier = "com.a"});
  run("{platform: remove-app, app: com.a}");
  EXPECT_FALSE(device.ar().application("com.a"));
  EXPECT_EQ(device.em().uninstalled(), std::vector<std::string>{"com.a"});
  EXPECT_THROW(run("{platform: remove-app, app: com.a}"), StepFailed);
  run("{platform: backup-data, app: com.b, size: 4096}");
  std::uint64_t size = 0;
  EXPECT_TRUE(
      device.sw().newManager()->restoreDataExistsForApplicationWithBundleID("com.b", &size));
  EXPECT_EQ(size, 4096u);
}

TEST_F(ReplayActionsTest, CoordinatorEventsActOnTheCoordinationService) {
  FakeKCInstallCoordination& kc = session_->device().kc();
  auto coordinator = kc.putCoordinator(KCCoordinatorKind::Initiating, "com.c", KCClientBazaar);
  coordinator->setAppAssetPromiseResponsibleClient(KCClientBazaar, nullptr);
  run("{stage: package, identifier: com.c, name: C}");
  run("{event: store-download, app: com.c, package: var/mobile/Media/PublicStaging/C.app}");
  auto promise = coordinator->appAssetPromiseWithError(nullptr);
  ASSERT_TRUE(promise);
  EXPECT_TRUE(promise->isComplete());
  EXPECT_EQ(promise->transferPath(), (root() / "var/mobile/Media/PublicStaging/C.app").string());

  run("{event: promise-began, app: com.c, promise: asset}");
  EXPECT_THROW(run("{event: promise-began, app: com.c, promise: user-data}"), StepFailed);
  run("{event: coordinator-cancelled, app: com.c, client: 1, "
      "reason: {domain: KCErrorDomain, code: 10, description: user}}");
  EXPECT_EQ(coordinator->state(), FakeKCAppInstallCoordinator::State::Cancelled);
  ASSERT_TRUE(coordinator->error());
  EXPECT_EQ(coordinator->error()->code, 10);
  EXPECT_THROW(run("{event: coordinator-prioritize, app: com.c}"), StepFailed);  // forgotten
}

// Matching current and finished coordinators are shown by the coordinated-install scenario.
TEST_F(ReplayActionsTest, CoordinatorExpectationsCompareTheCurrentOneElseTheLastFinished) {
  FakeKCInstallCoordination& kc = session_->device().kc();
  kc.putCoordinator(KCCoordinatorKind::Restoring, "com.active", 3);
  kc.putCoordinator(KCCoordinatorKind::Initiating, "com.dropped", 3)
      ->cancelForReason(makeError("Test", 5, "no"), 1, nullptr);
  // Cancelled once, and again active under a newer coordinator.
  kc.putCoordinator(KCCoordinatorKind::Initiating, "com.again", 3)
      ->cancelForReason(nullptr, 3, nullptr);
  kc.putCoordinator(KCCoordinatorKind::Updating, "com.again", 3);
  session_->settle();
  const struct {
    const char* expectation;
    std::optional<std::string> difference;
  } cases[] = {
      {"{app: com.active, errorCode: 4}", "com.active: errorCode: expected 4, found none"},
      {"{app: com.dropped, absent: true}", std::nullopt},
      {"{app: com.dropped, state: Completed}",
       "com.dropped: state: expected Completed, found Cancelled"},
      {"{app: com.dropped, state: Cancelled, errorCode: 6}",
       "com.dropped: errorCode: expected 6, found 5"},
      {"{app: com.dropped, state: Active}", "expected a coordinator for com.dropped, found none"},
      {"{app: com.dropped, state: Cancelled, placeholderInstalled: false}",
       "expected a current coordinator for com.dropped, found only a finished one (Cancelled)"},
      {"{app: com.never, state: Completed}",
       "expected a coordinator for com.never (Completed), found none, current or finished"},
      // A current coordinator is what is compared while there is one.
      {"{app: com.again, state: Cancelled}", "com.again: state: expected Cancelled, found Active"},
      {"{app: com.again, kind: Updating, state: Active}", std::nullopt},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(evaluate(std::string("{expect: coordinator, ") + (c.expectation + 1)), c.difference)
        << c.expectation;
  }
  EXPECT_THROW(evaluate("{expect: coordinator, app: com.dropped, absent: true, errorCode: 5}"),
               InputError);
  EXPECT_THROW(evaluate("{expect: coordinator, app: com.dropped, errorCode: five}"), InputError);
}

}  // namespace
}  // namespace appsync::host::replay
