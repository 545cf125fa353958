// `expect: coordinator` in replay scripts: the current coordinator, or what became of the last
// one that finished, with its error's domain and code.
#include <gtest/gtest.h>

#include <memory>
#include <optional>
#include <string>

#include "device_session.h"
#include "input_error.h"
#include "platform/fake/fake_kc_objects.h"
#include "replay/expectations.h"
#include "support/temp_dir.h"
#include "yaml_input.h"

namespace appsync::host::replay {
namespace {

class CoordinatorExpectationTest : public ::testing::Test {
 protected:
  void SetUp() override {
    session_ = DeviceSession::create(dir_.path() / "device", {.coordination = true});
    FakeKCInstallCoordination& kc = session_->device().kc();
    kc.putCoordinator(KCCoordinatorKind::Restoring, "com.active", 3);
    kc.putCoordinator(KCCoordinatorKind::Initiating, "com.dropped", 3)
        ->cancelForReason(makeError("Test", 5, "no"), 1, nullptr);
    // Cancelled once, and again active under a newer coordinator.
    kc.putCoordinator(KCCoordinatorKind::Initiating, "com.again", 3)
        ->cancelForReason(nullptr, 3, nullptr);
    kc.putCoordinator(KCCoordinatorKind::Updating, "com.again", 3);
    session_->settle();
  }

  // What differs for the one expectation `yaml` is (a flow mapping), after checking it.
  std::optional<std::string> evaluate(const std::string& yaml) {
    YamlField script = YamlField::loadText("steps:\n  - " + yaml + "\n", "script.yaml");
    YamlField step = script["steps"].items().at(0);
    checkExpectation(step);
    return evaluateExpectation(*session_, step, {});
  }

  testing::TempDir dir_;
  std::unique_ptr<DeviceSession> session_;
};

TEST_F(CoordinatorExpectationTest, CurrentAndFinishedCoordinatorsAreCompared) {
  const struct {
    const char* expectation;
    std::optional<std::string> difference;
  } cases[] = {
      // Current and finished coordinators that match are shown by the coordinated-install scenario.
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
