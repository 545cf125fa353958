// The restore road: placeholder directories built from store metadata, and each way it fails.
#include <gtest/gtest.h>

#include <functional>

#include "restore/placeholder_fixture.h"

namespace appsync {
namespace {

using testing::expectOneLine;
using testing::PlaceholderDevice;
using testing::pluginLine;

const std::string kID = "com.example.app";
const plist::Bytes kIcon = {0x89, 'P', 'N', 'G', 1, 2, 3};
const plist::Bytes kSinf = {5, 4, 3};

TEST(RestorePlaceholderTest, BuildsAndInstallsThePlaceholder) {
  struct Case {
    const char* name;
    plist::Dict metadata;  // bundleVersion "1" is added
    std::string expectedName;
    bool gazette = false, launchProhibited = false, withIcon = true, withSinf = true;
  };
  const Case cases[] = {
      {"title wins over itemName", {{"title", "Sample"}, {"itemName", "Other"}}, "Sample"},
      {"itemName without title", {{"itemName", "Item"}}, "Item"},
      {"first launch key present wins",
       {{"title", "T"}, {"ARApplicationLaunchProhibited", false}, {"launchProhibited", true}},
       "T"},
      {"second launch key", {{"title", "T"}, {"launchProhibited", "YES"}}, "T", false, true},
      {"gazette as stored", {{"title", "T"}, {"UIGazetteApp", true}}, "T", true},
      {"no icon", {{"title", "T"}}, "T", false, false, false},
      {"no SINF", {{"title", "T"}}, "T", false, false, true, false},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    PlaceholderDevice d;
    plist::Dict metadata = c.metadata;
    metadata.set("bundleVersion", "1");
    const plist::Bytes metadataBytes = testing::binaryPlist(metadata);
    const std::string dir = d.placeholderDir(kID), icon = dir + "/Icon.png";

    EXPECT_TRUE(d.client._processCaravelRestoreInfoForApp(
        kID, metadataBytes, c.withSinf ? std::optional(kSinf) : std::nullopt,
        c.withIcon ? std::optional(kIcon) : std::nullopt));

    const plist::Dict info{{"BNBundleIdentifier", kID},
                           {"BNBundleVersion", "1"},
                           {"BNBundleExecutable", c.expectedName},
                           {"BNBundleDisplayName", c.expectedName},
                           {"BNBundleIconFile", "Icon.png"},
                           {"UIGazetteApp", c.gazette},
                           {"ARApplicationLaunchProhibited", c.launchProhibited}};
    EXPECT_EQ(testing::readDict(dir + "/Info.plist"), info);
    EXPECT_EQ(readFile(icon), c.withIcon ? std::optional(kIcon) : std::nullopt);
    auto calls = d.device.ar().installCalls();
    ASSERT_EQ(calls.size(), 1u);
    EXPECT_EQ(calls[0].path, dir);
    EXPECT_EQ(calls[0].options,
              (plist::Dict{{"PackageType", "Placeholder"},
                           {"BNBundleIdentifier", kID},
                           {"ARInstallType", 2u},
                           {std::string(ARCaravelMetadataKey), metadataBytes},
                           {std::string(ARApplicationSINFKey),
                            c.withSinf ? plist::Value(kSinf) : plist::Value::null()}}));
    EXPECT_EQ(d.scenarios(), std::vector<std::string>{
                                 "Caravel App Restore yes com.example.app: Installed placeholder"});
    // Owner and group: the directory, the parent it made, the icon.
    for (const std::string& path : {dir, d.appsDir()}) {
      auto owner = d.device.system().ownership(path);
      ASSERT_TRUE(owner) << path;
      EXPECT_EQ(owner->owner + ":" + owner->group, "mobile:mobile");
    }
    EXPECT_EQ(d.device.system().ownership(icon).has_value(), c.withIcon);

    const MemoryLogSink& log = d.device.log();
    EXPECT_TRUE(log.contains(pluginLine("processing app restore info for 'com.example.app'")));
    EXPECT_TRUE(log.contains(pluginLine("creating placeholder for 'com.example.app'. info.plist=" +
                                        plist::Value(info).describe())));
    expectOneLine(log,
                  pluginLine("Installed Placeholder app from path " + dir + ": " + c.expectedName +
                             " [com.example.app 1] [isGazette: " + (c.gazette ? "1" : "0") + "]"),
                  LogLevel::Default);
    if (c.withIcon) {
      expectOneLine(log,
                    pluginLine("icon data for 'com.example.app' was writen to " + icon +
                               " with status:1 fileSize:7"),
                    LogLevel::Default);
    } else {
      expectOneLine(log, pluginLine("no icon data for 'com.example.app'"), LogLevel::Error);
    }
    EXPECT_TRUE(testing::linesStartingWith(log, pluginLine("failed")).empty());
  }
}

TEST(RestorePlaceholderTest, FailuresStopWhereTheyHappen) {
  const plist::Value complete(plist::Dict{{"title", "T"}, {"bundleVersion", "1"}});
  const std::string noDirectory = "Failed to create app directory";
  enum Left { kNothing, kDirectoryAndIcon, kAll };
  struct Case {
    const char* name;
    std::optional<plist::Value> metadata;  // absent: bytes that are no property list
    std::string id;
    std::function<void(PlaceholderDevice&)> setup;
    // The transaction-log entry; the directory operation and its caller each log theirs.
    std::string scenario;
    // Prefixes of the messages, all of one level; "DIR" stands for the placeholder directory.
    std::vector<std::string> messages;
    LogLevel level = LogLevel::Default;
    bool finalMessage = true;
    Left left = kNothing;
  };
  const auto notADirectory = [](PlaceholderDevice& d) {
    ASSERT_TRUE(writeFileAtomically(d.appsDir(), plist::Bytes{'x'}));
  };
  const auto refusingRegistry = [](PlaceholderDevice& d) {
    d.device.ar().failOperation("installApplication:withOptions:");
  };
  // With the base directory present, "../x.app" would land beside it.
  const auto baseDirectory = [](PlaceholderDevice& d) {
    ASSERT_TRUE(createDirectories(d.appsDir()));
  };
  const std::string noInfo = "Failed to create placeholder info",
                    infoFailed = "failed to create placeholder info at DIR/Info.plist with info {";
  const plist::Value noVersion(plist::Dict{{"title", "T"}}),
      noName(plist::Dict{{"bundleVersion", "1"}});
  const std::string parse = "Failed to parse caravel metadata",
                    parseFailed = "failed to parse caravel metadata for 'com.example.app'. err=";
  // clang-format off
  const Case cases[] = {
      {"not a property list", std::nullopt, kID, nullptr, parse,
       {parseFailed + "Error Domain=PropertyListError Code=1"}, LogLevel::Default, false},
      {"not a dictionary", plist::Value(plist::Array{"a"}), kID, nullptr, parse, {parseFailed},
       LogLevel::Default, false},
      {"no bundleVersion", noVersion, kID, nullptr, noInfo, {infoFailed}, LogLevel::Default, true,
       kDirectoryAndIcon},
      {"no name", noName, kID, nullptr, noInfo, {infoFailed}, LogLevel::Default, true,
       kDirectoryAndIcon},
      {"directory cannot be made", complete, kID, notADirectory, noDirectory,
       {"Created app directory for 'com.example.app' at DIR with err=Error Domain=POSIX Code=20",
        "failed to create app directory for 'com.example.app'. err=(null)"}},
      {"identifier that would escape", complete, "../x", baseDirectory, noDirectory,
       {"Created app directory for '../x' at (null) with err=Error Domain=POSIX Code=22",
        "failed to create app directory for '../x'. err=(null)"}},
      {"registry refuses", complete, kID, refusingRegistry, "Failed to install placeholder",
       {"Placeholder app install failed from path DIR: T [com.example.app 1] [isGazette: 0]"},
       LogLevel::Error, true, kAll},
  };
  // clang-format on
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    PlaceholderDevice d;
    if (c.setup) c.setup(d);
    const std::string dir = d.placeholderDir(c.id);
    const plist::Bytes bytes =
        c.metadata ? testing::binaryPlist(*c.metadata) : plist::Bytes{'n', 'o', 't'};

    EXPECT_FALSE(d.client._processCaravelRestoreInfoForApp(c.id, bytes, kSinf, kIcon));

    const std::string entry = "Caravel App Restore no " + c.id + ": " + c.scenario;
    EXPECT_EQ(d.scenarios(), std::vector<std::string>(c.scenario == noDirectory ? 2 : 1, entry));
    for (std::string prefix : c.messages) {
      if (auto at = prefix.find("DIR"); at != std::string::npos) prefix.replace(at, 3, dir);
      expectOneLine(d.device.log(), pluginLine(prefix), c.level);
    }
    const std::string finalPrefix =
        pluginLine("failed to process app restore info for '" + c.id + "'. ");
    if (c.finalMessage) {
      expectOneLine(d.device.log(),
                    finalPrefix + "caravelMetadataDictionary=" + c.metadata->describe(),
                    LogLevel::Default);
    } else {
      EXPECT_TRUE(testing::linesStartingWith(d.device.log(), finalPrefix).empty());
    }
    EXPECT_EQ(directoryExists(dir), c.left != kNothing);
    EXPECT_EQ(fileExists(dir + "/Icon.png"), c.left != kNothing);
    EXPECT_EQ(fileExists(dir + "/Info.plist"), c.left == kAll);
    EXPECT_EQ(d.device.ar().installCalls().size(), c.left == kAll ? 1u : 0u);
    EXPECT_FALSE(d.device.ar().application(c.id));
    EXPECT_TRUE(testing::linesStartingWith(d.device.log(), pluginLine("Installed")).empty());
  }
}

TEST(RestorePlaceholderTest, SecondAttemptRewritesInPlace) {
  PlaceholderDevice d;
  const auto metadata = [](const char* version) {
    return testing::binaryPlist(plist::Dict{{"title", "T"}, {"bundleVersion", version}});
  };
  ASSERT_TRUE(d.client._processCaravelRestoreInfoForApp(kID, metadata("1"), kSinf, kIcon));
  ASSERT_TRUE(
      d.client._processCaravelRestoreInfoForApp(kID, metadata("2"), kSinf, plist::Bytes{9, 9}));
  const std::string dir = d.placeholderDir(kID);
  EXPECT_EQ(readFile(dir + "/Icon.png"), (plist::Bytes{9, 9}));
  EXPECT_EQ(*testing::readDict(dir + "/Info.plist")->find("BNBundleVersion"), plist::Value("2"));
  EXPECT_EQ(d.device.ar().application(kID)->version, "2");
}

}  // namespace
}  // namespace appsync
