// The sync road: a placeholder for an announced asset, from its name, version, info and icon.
// The outstanding-transfers scenarios show the registry's record and the icon; here are the
// info keys, the options, the messages and what stops it.
#include <gtest/gtest.h>

#include "restore/placeholder_fixture.h"

namespace appsync {
namespace {

using testing::PlaceholderDevice;
using testing::pluginLine;

const plist::Bytes kIcon = {0x89, 'P', 'N', 'G', 7};

struct SyncDevice : PlaceholderDevice {
  // An asset with its own info property list and icon inside a package folder.
  std::shared_ptr<TRAsset> asset(const std::string& id, std::optional<std::string> name,
                                 std::optional<plist::Value> version, const plist::Dict& info) {
    const std::string package = root / ("package-" + std::to_string(++packages));
    EXPECT_TRUE(createDirectories(package));
    EXPECT_TRUE(writePlistAtomically(package + "/Info.plist", info, plist::Format::Xml));
    EXPECT_TRUE(writeFileAtomically(package + "/icon.png", kIcon));
    auto a = TRAsset::downloadAssetWithIdentifier(id, "Application", std::move(name));
    if (version) a->setVariantOptions(plist::Dict{{"Version", *version}});
    a->setInfoPlist(package + "/Info.plist");
    a->setIcon(package + "/icon.png");
    return a;
  }
  int packages = 0;
};

TEST(SyncPlaceholderTest, InstallsWithTheThreeSyncOptions) {
  SyncDevice d;
  const std::string dir = d.placeholderDir("com.example.sync");
  auto asset = d.asset("com.example.sync", "Synced", plist::Value("4.5"),
                       {{"UIGazetteApp", true}, {"ARApplicationLaunchProhibited", "1"}});
  d.client._createPlaceHolderApplication(asset);

  auto info = testing::readDict(dir + "/Info.plist");
  ASSERT_TRUE(info);
  EXPECT_EQ(*info, (plist::Dict{{"BNBundleIdentifier", "com.example.sync"},
                                {"BNBundleVersion", "4.5"},
                                {"BNBundleExecutable", "Synced"},
                                {"BNBundleDisplayName", "Synced"},
                                {"BNBundleIconFile", "Icon.png"},
                                {"UIGazetteApp", true},
                                {"ARApplicationLaunchProhibited", true}}));
  auto calls = d.device.ar().installCalls();
  ASSERT_EQ(calls.size(), 1u);
  EXPECT_EQ(calls[0].options, (plist::Dict{{"PackageType", "Placeholder"},
                                           {"BNBundleIdentifier", "com.example.sync"},
                                           {"ARInstallType", 4u}}));
  EXPECT_EQ(d.scenarios(), std::vector<std::string>{
                               "Install placeholder yes com.example.sync: Installed placeholder"});
  const MemoryLogSink& log = d.device.log();
  EXPECT_TRUE(log.contains(pluginLine("creating placeholder for 'com.example.sync'. info.plist=" +
                                      plist::Value(*info).describe())));
  EXPECT_TRUE(log.contains(pluginLine("Installed Placeholder app from path " + dir +
                                      ": Synced [com.example.sync 4.5] [isGazette: 1]")));
  EXPECT_EQ(d.device.system().ownership(dir)->owner, "mobile");
}

TEST(SyncPlaceholderTest, SecondAttemptLogsTheCopyFailureAndStillInstalls) {
  SyncDevice d;
  const std::string dir = d.placeholderDir("a");
  d.client._createPlaceHolderApplication(d.asset("a", "A", plist::Value("1"), {}));
  auto again = d.asset("a", "A", plist::Value("2"), {});
  d.client._createPlaceHolderApplication(again);

  testing::expectOneLine(d.device.log(),
                         pluginLine("Copying icon from " + *again->icon() + " to " + dir +
                                    "/Icon.png failed: Error Domain=POSIX Code=17 "),
                         LogLevel::Error);
  EXPECT_EQ(*testing::readDict(dir + "/Info.plist")->find("BNBundleVersion"), plist::Value("2"));
  EXPECT_EQ(readFile(dir + "/Icon.png"), kIcon);
  EXPECT_EQ(d.device.ar().installCalls().size(), 2u);
  EXPECT_EQ(d.device.ar().application("a")->version, "2");
  EXPECT_EQ(d.scenarios().size(), 2u);
}

TEST(SyncPlaceholderTest, StopsBeforeTheRegistry) {
  struct Case {
    const char* name;
    std::string id;
    std::optional<std::string> prettyName;
    std::optional<plist::Value> version;
    bool directoryMade;
  };
  const Case cases[] = {
      {"no name", "a", std::nullopt, plist::Value("1"), false},
      {"empty name", "a", "", plist::Value("1"), false},
      {"empty identifier", "", "A", plist::Value("1"), false},
      // Outside the design: handled as the restore road handles metadata without a version.
      {"no version", "a", "A", std::nullopt, true},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    SyncDevice d;
    auto asset = d.asset(c.id, c.prettyName, c.version, {});
    d.client._createPlaceHolderApplication(asset);
    EXPECT_TRUE(d.device.log().contains(pluginLine("plist " + *asset->infoPlist())));
    EXPECT_EQ(directoryExists(d.appsDir()), c.directoryMade);
    EXPECT_FALSE(fileExists(d.placeholderDir("a") + "/Info.plist"));
    EXPECT_TRUE(d.device.ar().installCalls().empty());
    EXPECT_TRUE(d.scenarios().empty());
    EXPECT_TRUE(testing::linesStartingWith(d.device.log(), pluginLine("creating")).empty());
  }
}

TEST(SyncPlaceholderTest, DirectoryFailureAndRegistryRefusal) {
  for (bool registryRefuses : {false, true}) {
    SCOPED_TRACE(registryRefuses ? "registry refuses" : "directory cannot be made");
    SyncDevice d;
    if (registryRefuses) {
      d.device.ar().failOperation("installApplication:withOptions:");
    } else {
      ASSERT_TRUE(writeFileAtomically(d.appsDir(), plist::Bytes{'x'}));
    }
    d.client._createPlaceHolderApplication(d.asset("a", "A", plist::Value("1"), {}));
    // The directory failure has only the directory operation's entry: this road adds none.
    EXPECT_EQ(d.scenarios(),
              std::vector<std::string>{
                  registryRefuses ? "Install placeholder no a: Failed to install placeholder"
                                  : "Caravel App Restore no a: Failed to create app directory"});
    EXPECT_EQ(d.device.ar().installCalls().size(), registryRefuses ? 1u : 0u);
    EXPECT_FALSE(d.device.ar().application("a"));
    const std::string failed = pluginLine("Placeholder app install failed from path " +
                                          d.placeholderDir("a") + ": A [a 1] [isGazette: 0]");
    if (registryRefuses) {
      testing::expectOneLine(d.device.log(), failed, LogLevel::Error);
    } else {
      EXPECT_TRUE(testing::linesStartingWith(d.device.log(), failed).empty());
    }
  }
}

}  // namespace
}  // namespace appsync
