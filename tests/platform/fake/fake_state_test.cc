// The registry's and install coordination's saved state: what a later process loads is the
// device it left, and a damaged file is refused with the path of the damaged field.
#include <gtest/gtest.h>

#include <functional>
#include <string>
#include <vector>

#include "platform/bundle_keys.h"
#include "platform/fake/fake_platform.h"
#include "runtime/fs/files.h"
#include "runtime/plist/codec.h"
#include "support/temp_dir.h"

namespace appsync {
namespace {

using Coordinator = std::shared_ptr<KCAppInstallCoordinator>;

// The state as the device directory would hold it: written as XML and read back.
StateFields throughXml(const plist::Dict& state) {
  std::optional<std::string> xml = plist::writeXml(state);
  EXPECT_TRUE(xml.has_value()) << "saved state cannot be written";
  std::optional<plist::Value> back =
      plist::parse(std::span(reinterpret_cast<const std::uint8_t*>(xml->data()), xml->size()));
  return StateFields(*back->dict());
}

// A bundle directory NAME.app under `dir` with the given identifier and version.
std::string makeBundle(const testing::TempDir& dir, const std::string& name, const std::string& id,
                       const std::string& version) {
  const std::string bundle = dir / (name + ".app");
  createDirectories(bundle);
  writePlistAtomically(bundle + "/Info.plist",
                       plist::Dict{{std::string(kBNBundleIdentifierKey), id},
                                   {std::string(kBNBundleVersionKey), version},
                                   {std::string(_kBNBundleDisplayNameKey), name}},
                       plist::Format::Xml);
  return bundle;
}

std::string proxyFields(const std::shared_ptr<const ARApplicationProxy>& p) {
  if (!p) return "none";
  std::string text =
      p->describe() + " " + p->bundleURL.value_or("-") + " " + p->bundleContainerURL.value_or("-") +
      " " + p->bundleVersion.value_or("-") + " " + p->localizedName.value_or("-") + " " +
      std::to_string(p->diskUsage.staticUsage.value_or(0)) + (p->hasMIDBasedSINF ? " sinf" : "");
  return text + " " + (p->installProgressSync ? p->installProgressSync->describe() : "-");
}

struct ARCase {
  const char* name;
  std::function<void(FakeARWorkspace&, const testing::TempDir&)> build;
};

TEST(FakeARStateTest, ALoadedRegistryIsTheOneSaved) {
  const ARCase cases[] = {
      {"empty", [](FakeARWorkspace&, const testing::TempDir&) {}},
      {"installs, progress and history",
       [](FakeARWorkspace& ar, const testing::TempDir& dir) {
         ErrorRef error;
         ASSERT_TRUE(ar.installApplication(makeBundle(dir, "Game", "com.game", "2.0"),
                                           {{"PackageType", "Customer"},
                                            {"BNBundleIdentifier", "com.game"},
                                            {"ARInstallType", 4}},
                                           &error));
         // A placeholder's options may hold the null object (no SINF).
         ASSERT_TRUE(ar.installApplication(
             makeBundle(dir, "Notes", "com.notes", "1.1"),
             {{"PackageType", "Placeholder"}, {"ApplicationSINF", plist::Value::null()}}));
         auto loading = ar.installProgress("com.notes", ARInstallPhaseLoading);
         loading->setTotalUnitCount(-1);
         loading->setCompletedUnitCount(40);
         loading->cancel();
         ar.installPhaseFinishedForProgress(loading);
         ar.installProgress("com.notes", ARInstallPhaseInstalling)->setInstallState(2);
         ar.uninstallApplication("com.gone", plist::Dict{{"UninstallPlaceholdersOnly", true}});
         ar.setInstallsInProgress({"com.notes"}, {"com.game", "com.unknown"});
       }},
      {"records put by a test",
       [](FakeARWorkspace& ar, const testing::TempDir&) {
         ar.putApplication({.identifier = "com.sys",
                            .applicationType = "System",
                            .staticDiskUsage = 9000,
                            .hasMIDBasedSINF = true});
         ar.putApplication({.identifier = "com.plugin", .isApplication = false});
         ar.putApplication({.identifier = "com.a", .version = "3", .iconPath = "/i.png"});
       }},
  };
  for (const ARCase& c : cases) {
    SCOPED_TRACE(c.name);
    testing::TempDir dir;
    FakeARWorkspace saved(dir.path()), loaded(dir.path());
    c.build(saved, dir);
    const plist::Dict state = saved.saveState();
    loaded.loadState(throughXml(state));
    EXPECT_EQ(loaded.saveState(), state);
    EXPECT_TRUE(loaded.applications() == saved.applications());
    EXPECT_TRUE(loaded.installCalls() == saved.installCalls());
    EXPECT_TRUE(loaded.uninstallCalls() == saved.uninstallCalls());
    for (const auto& record : saved.applications()) {
      EXPECT_EQ(proxyFields(loaded.applicationProxyForIdentifier(record.identifier, true)),
                proxyFields(saved.applicationProxyForIdentifier(record.identifier, true)));
    }
  }
}

TEST(FakeARStateTest, ALoadedProgressIsTheOneTheRegistryHandsOut) {
  testing::TempDir dir;
  FakeARWorkspace saved(dir.path()), loaded(dir.path());
  saved.putApplication({.identifier = "com.a"});
  saved.installProgress("com.a", ARInstallPhaseInstalling)->setCompletedUnitCount(7);
  loaded.loadState(throughXml(saved.saveState()));
  auto proxy = loaded.applicationProxyForIdentifier("com.a", false);
  auto progress = loaded.installProgressForApplication(*proxy, ARInstallPhaseInstalling);
  EXPECT_EQ(proxy->installProgressSync, progress);
  EXPECT_EQ(progress->completedUnitCount(), 7);
}

}  // namespace
}  // namespace appsync
