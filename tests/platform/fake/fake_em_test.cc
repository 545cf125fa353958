// The fake low-level installer: caller-owned lookups and exact clearing.
#include "platform/fake/fake_em.h"

#include <gtest/gtest.h>

namespace appsync {
namespace {

TEST(FakeEMInstallerTest, LookupHandsOutACopyAndClearRemovesExactlyTheGivenIdentifiers) {
  FakeEMInstaller em;
  em.addUninstalled("a.app");
  em.addUninstalled("b.app");
  em.addUninstalled("c.app");
  em.addUninstalled("a.app");  // once only

  std::unique_ptr<plist::Dict> found = em.EmplaceLookupUninstalled(nullptr);
  ASSERT_TRUE(found);
  EXPECT_EQ(
      *found,
      (plist::Dict{{"a.app", plist::Dict()}, {"b.app", plist::Dict()}, {"c.app", plist::Dict()}}));
  found->erase("a.app");  // the caller's copy, not the installer's list
  EXPECT_EQ(em.uninstalled(), (std::vector<std::string>{"a.app", "b.app", "c.app"}));

  EXPECT_EQ(em.EmplaceClearUninstalled({"c.app", "a.app", "unknown.app"}, nullptr), 0);
  EXPECT_EQ(em.uninstalled(), std::vector<std::string>{"b.app"});
  EXPECT_EQ(em.clearCalls(),
            (std::vector<std::vector<std::string>>{{"c.app", "a.app", "unknown.app"}}));
}

TEST(FakeEMInstallerTest, ScriptedFailures) {
  FakeEMInstaller em;
  em.addUninstalled("a.app");
  em.failOperation("EmplaceLookupUninstalled", nullptr, 1);
  EXPECT_EQ(em.EmplaceLookupUninstalled(nullptr), nullptr);
  EXPECT_NE(em.EmplaceLookupUninstalled(nullptr), nullptr);
  EXPECT_EQ(em.callCount("EmplaceLookupUninstalled"), 2u);

  em.failOperation("EmplaceClearUninstalled", makeError(kEMInstallerErrorDomain, -17));
  EXPECT_EQ(em.EmplaceClearUninstalled({"a.app"}, nullptr), -17);
  em.failOperation("EmplaceClearUninstalled");
  EXPECT_EQ(em.EmplaceClearUninstalled({"a.app"}, nullptr), 1);
  EXPECT_EQ(em.uninstalled(), std::vector<std::string>{"a.app"});
  em.succeedOperation("EmplaceClearUninstalled");
  EXPECT_EQ(em.EmplaceClearUninstalled({"a.app"}, nullptr), 0);
  EXPECT_TRUE(em.uninstalled().empty());
}

}  // namespace
}  // namespace appsync
