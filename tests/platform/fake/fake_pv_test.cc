// The fake home screen: icon layout in, icon order out in buffers that must be released, and
// scripted termination assertions.
#include "platform/fake/fake_pv.h"

#include <gtest/gtest.h>

#include "runtime/plist/codec.h"

namespace appsync {
namespace {

TEST(FakePVHomeScreenTest, IconStateBuffersAreReleasedByTheReceiver) {
  FakePVHomeScreen pv;
  const PVPort port = pv.PVSPavilionBlockableServerPort();
  PVBuffer buffer;
  std::uint32_t length = 99;
  EXPECT_EQ(pv.PVGetFlattenedIconState(port, 1, &buffer, &length), 0);
  EXPECT_TRUE(buffer == nullptr);  // nothing configured: no buffer

  pv.setIconOrder({"b.app", "a.app"});
  ASSERT_EQ(pv.PVGetFlattenedIconState(port, 1, &buffer, &length), 0);
  ASSERT_TRUE(buffer != nullptr);
  EXPECT_EQ(pv.outstandingBuffers(), 1u);
  std::optional<plist::Value> order = plist::parse({buffer.get(), length});
  ASSERT_TRUE(order && order->array());
  EXPECT_EQ(*order, plist::Value(plist::Array{"b.app", "a.app"}));
  buffer.reset();
  EXPECT_EQ(pv.outstandingBuffers(), 0u);

  // A buffer may outlive the home screen that handed it out.
  {
    FakePVHomeScreen other;
    other.setFlattenedIconState(plist::Bytes{1, 2});
    ASSERT_EQ(
        other.PVGetFlattenedIconState(other.PVSPavilionBlockableServerPort(), 1, &buffer, &length),
        0);
    EXPECT_EQ(length, 2u);
  }
  buffer.reset();

  pv.failOperation("PVGetFlattenedIconState", makeError("PV", 5));
  EXPECT_EQ(pv.PVGetFlattenedIconState(port, 1, &buffer, &length), 5);
  EXPECT_TRUE(buffer == nullptr);
  EXPECT_EQ(pv.PVGetFlattenedIconState(port + 1, 1, &buffer, &length), 5);
  pv.succeedOperation("PVGetFlattenedIconState");
  EXPECT_EQ(pv.PVGetFlattenedIconState(port + 1, 1, &buffer, &length),
            FakePVHomeScreen::kStatusInvalidPort);
}

TEST(FakePVHomeScreenTest, SetIconStateKeepsTheLastLayout) {
  FakePVHomeScreen pv;
  const PVPort port = pv.PVSPavilionBlockableServerPort();
  const std::uint8_t first[] = {1, 2, 3};
  const std::uint8_t second[] = {9};
  EXPECT_EQ(pv.PVSetIconState(port, first, sizeof first), 0);
  EXPECT_EQ(pv.PVSetIconState(port, second, sizeof second), 0);
  EXPECT_EQ(pv.lastIconState(), plist::Bytes{9});
  EXPECT_EQ(pv.setIconStateCount(), 2u);
  pv.failOperation("PVSetIconState", nullptr, 1);
  EXPECT_EQ(pv.PVSetIconState(port, first, sizeof first), 1);
  EXPECT_EQ(pv.lastIconState(), plist::Bytes{9});
}

TEST(FakePVHomeScreenTest, ScriptedAssertionOutcomes) {
  FakePVHomeScreen pv;
  pv.scriptAssertionOutcomes("a.app", {kPVSAssertionDenied, kPVSAssertionApplicationNotFound, 7});
  const struct {
    std::int32_t outcome;
    bool assertion;
  } expected[] = {{kPVSAssertionDenied, false},
                  {kPVSAssertionApplicationNotFound, false},
                  {7, false},
                  {kPVSAssertionGranted, true}};
  std::vector<std::shared_ptr<PVSAssertion>> held;
  for (const auto& e : expected) {
    std::int32_t outcome = -1;
    auto assertion = pv.PVSApplicationTerminationAssertionCreateWithError("a.app", 0, &outcome);
    EXPECT_EQ(outcome, e.outcome);
    EXPECT_EQ(assertion != nullptr, e.assertion);
    if (assertion) {
      EXPECT_EQ(assertion->bundleID(), "a.app");
      held.push_back(assertion);
    }
  }
  std::int32_t outcome = -1;
  held.push_back(pv.PVSApplicationTerminationAssertionCreateWithError("b.app", 0, &outcome));
  EXPECT_EQ(outcome, kPVSAssertionGranted);
  EXPECT_EQ(pv.liveAssertions(), 2u);
  EXPECT_EQ(pv.assertionRequests("a.app"), 4u);
  EXPECT_EQ(pv.assertionRequests("b.app"), 1u);
  held.clear();
  EXPECT_EQ(pv.liveAssertions(), 0u);
}

}  // namespace
}  // namespace appsync
