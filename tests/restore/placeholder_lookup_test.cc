// Placeholder lookup: one application's, all of them with a callback, and system placeholders.
#include <gtest/gtest.h>

#include "platform/ar_wrapper.h"
#include "restore/placeholder_fixture.h"

namespace appsync {
namespace {

using testing::PlaceholderDevice;
using testing::pluginLine;
using AppRecord = FakeARWorkspace::AppRecord;

// The device's registry, except that enumeration hands out a fixed list of bundles (which may
// repeat an identifier, as no real registry record can) and counts the bundles it visits.
class ListedBundles final : public ARApplicationWorkspaceWrapper {
 public:
  ListedBundles(ARApplicationWorkspace& target,
                std::vector<std::shared_ptr<const ARBundleProxy>> list)
      : ARApplicationWorkspaceWrapper(target), list_(std::move(list)) {}

  void enumerateBundlesOfType(int type, const BundleBlock& block) override {
    types.push_back(type);
    bool stop = false;
    for (const auto& proxy : list_) {
      ++visited;
      block(proxy, &stop);
      if (stop) break;
    }
  }

  std::vector<int> types;
  int visited = 0;

 private:
  std::vector<std::shared_ptr<const ARBundleProxy>> list_;
};

std::shared_ptr<const ARBundleProxy> application(const std::string& id, bool placeholder) {
  auto proxy = std::make_shared<ARApplicationProxy>();
  proxy->bundleIdentifier = id;
  proxy->appState.isPlaceholder = placeholder;
  return proxy;
}

TEST(PlaceholderLookupTest, ExistsStopsAtTheFirstMatchAndComparesExactly) {
  testing::TempDir root;
  FakePlatform device(root.path());
  ListedBundles bundles(
      device.ar(), {application("other", true), application("com.Example.App", true),
                    application("com.example.app", false), application("com.example.app", true),
                    application("last", true)});
  AppsClient client(device.platform().with(bundles));

  // Any application with the identifier counts, placeholder or not; the walk ends there.
  EXPECT_TRUE(client._placeholderExistsForApplication("com.example.app"));
  EXPECT_EQ(bundles.visited, 3);
  EXPECT_EQ(bundles.types, std::vector<int>{ARBundleTypeApplications});
  EXPECT_EQ(device.log().count(pluginLine("Found placeholder for bundle com.example.app")), 1u);

  bundles.visited = 0;
  EXPECT_FALSE(client._placeholderExistsForApplication("com.example.APP"));
  EXPECT_EQ(bundles.visited, 5);
  EXPECT_TRUE(testing::linesStartingWith(device.log(),
                                         pluginLine("Found placeholder for bundle com.example.APP"))
                  .empty());
}

TEST(PlaceholderLookupTest, CoordinatedRoadAnswersNoWithoutAsking) {
  testing::TempDir root;
  FakePlatform device(root.path(), FakePlatform::Options{.coordination = true});
  device.ar().putApplication({.identifier = "a", .isPlaceholder = true});
  AppsClient client(device.platform());
  EXPECT_FALSE(client._placeholderExistsForApplication("a"));
  EXPECT_EQ(device.ar().callCount("enumerateBundlesOfType:block:"), 0u);
  EXPECT_TRUE(testing::linesStartingWith(device.log(), pluginLine("Found")).empty());
}

// The scenarios skip a system placeholder; here is what else the registry holds.
TEST(PlaceholderLookupTest, EnumerationVisitsOnlyApplicationPlaceholders) {
  PlaceholderDevice d;
  EXPECT_TRUE(d.client._getSystemAppPlaceholders().empty());
  EXPECT_EQ(d.device.log().count(pluginLine("SystemAppPlaceholders ()")), 1u);
  FakeARWorkspace& ar = d.device.ar();
  ar.putApplication({.identifier = "bundle", .isPlaceholder = true, .isApplication = false});
  ar.putApplication({.identifier = "installed"});
  ar.putApplication({.identifier = "installed.sys", .applicationType = "System"});
  ar.putApplication({.identifier = "a.sys", .applicationType = "System", .isPlaceholder = true});
  ar.putApplication({.identifier = "p1", .isPlaceholder = true});
  ar.putApplication({.identifier = "z.sys", .applicationType = "System", .isPlaceholder = true});

  std::vector<std::string> seen;
  d.client._enumeratePlaceholdersWithBlock([&](const auto& proxy, bool*) {
    ASSERT_TRUE(proxy);
    seen.push_back(proxy->applicationIdentifier);
  });
  EXPECT_EQ(seen, (std::vector<std::string>{"a.sys", "p1", "z.sys"}));

  seen.clear();
  d.client._enumeratePlaceholdersWithBlock([&](const auto& proxy, bool* stop) {
    seen.push_back(proxy->bundleIdentifier);
    *stop = true;
  });
  EXPECT_EQ(seen, std::vector<std::string>{"a.sys"});

  EXPECT_EQ(d.client._getSystemAppPlaceholders(), (std::set<std::string>{"a.sys", "z.sys"}));
  EXPECT_EQ(d.device.log().count(pluginLine("SystemAppPlaceholders (a.sys, z.sys)")), 1u);
}

}  // namespace
}  // namespace appsync
