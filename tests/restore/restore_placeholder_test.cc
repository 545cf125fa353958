// The restore road: placeholder directories built from store metadata, and each way it fails.
#include <gtest/gtest.h>

#include <functional>

#include "restore/placeholder_fixture.h"

namespace appsync {
namespace {

using testing::PlaceholderDevice;
using testing::pluginLine;

const std::string kID = "com.example.app";
const plist::Bytes kIcon = {0x89, 'P', 'N', 'G', 1, 2, 3};
const plist::Bytes kSinf = {5, 4, 3};

// The one line whose message starts with `prefix` (category 8), with its level checked.
void expectOneLine(const MemoryLogSink& log, const std::string& prefix, LogLevel level) {
  std::size_t seen = 0;
  for (const auto& line : log.lines()) {
    if (line.category != 8 || !std::string_view(line.message).starts_with(prefix)) continue;
    ++seen;
    EXPECT_EQ(line.level, level) << line.message;
  }
  EXPECT_EQ(seen, 1u) << prefix;
}

struct SuccessCase {
  const char* name;
  plist::Dict metadata;
  std::string expectedName;
  bool withIcon = true;
  bool withSinf = true;
  plist::Value expectedGazette = false;
  bool expectedLaunchProhibited = false;
};

TEST(RestorePlaceholderTest, BuildsAndInstallsThePlaceholder) {
  const SuccessCase cases[] = {
      {.name = "title wins over itemName",
       .metadata = {{"title", "Sample"}, {"itemName", "Other"}, {"bundleVersion", "1.2"}},
       .expectedName = "Sample"},
      {.name = "itemName without title",
       .metadata = {{"itemName", "Item"}, {"bundleVersion", "3"}},
       .expectedName = "Item"},
      {.name = "first launch key present wins",
       .metadata = {{"title", "T"},
                    {"bundleVersion", "1"},
                    {"ARApplicationLaunchProhibited", false},
                    {"launchProhibited", true}},
       .expectedName = "T"},
      {.name = "second launch key when the first is absent",
       .metadata = {{"title", "T"}, {"bundleVersion", "1"}, {"launchProhibited", "YES"}},
       .expectedName = "T",
       .expectedLaunchProhibited = true},
      {.name = "gazette as stored",
       .metadata = {{"title", "T"}, {"bundleVersion", "1"}, {"UIGazetteApp", true}},
       .expectedName = "T",
       .expectedGazette = true},
      {.name = "no icon",
       .metadata = {{"title", "T"}, {"bundleVersion", "1"}},
       .expectedName = "T",
       .withIcon = false},
      {.name = "no SINF",
       .metadata = {{"title", "T"}, {"bundleVersion", "1"}},
       .expectedName = "T",
       .withSinf = false},
  };
  for (const SuccessCase& c : cases) {
    SCOPED_TRACE(c.name);
    PlaceholderDevice d;
    const plist::Bytes metadataBytes = testing::binaryPlist(c.metadata);
    const std::string dir = d.placeholderDir(kID);
    const std::string icon = dir + "/Icon.png";
    const std::string version = *plist::stringAt(c.metadata, "bundleVersion");

    EXPECT_TRUE(d.client._processCaravelRestoreInfoForApp(
        kID, metadataBytes, c.withSinf ? std::optional(kSinf) : std::nullopt,
        c.withIcon ? std::optional(kIcon) : std::nullopt));

    // Info.plist, key by key.
    auto info = testing::readDict(dir + "/Info.plist");
    ASSERT_TRUE(info);
    EXPECT_EQ(info->size(), 7u);
    EXPECT_EQ(*info->find("BNBundleIdentifier"), plist::Value(kID));
    EXPECT_EQ(*info->find("BNBundleVersion"), plist::Value(version));
    EXPECT_EQ(*info->find("BNBundleExecutable"), plist::Value(c.expectedName));
    EXPECT_EQ(*info->find("BNBundleDisplayName"), plist::Value(c.expectedName));
    EXPECT_EQ(*info->find("BNBundleIconFile"), plist::Value("Icon.png"));
    EXPECT_EQ(*info->find("UIGazetteApp"), c.expectedGazette);
    EXPECT_EQ(*info->find("ARApplicationLaunchProhibited"),
              plist::Value(c.expectedLaunchProhibited));

    EXPECT_EQ(readFile(icon), c.withIcon ? std::optional(kIcon) : std::nullopt);

    // The five options, as the registry received them.
    auto calls = d.device.ar().installCalls();
    ASSERT_EQ(calls.size(), 1u);
    EXPECT_EQ(calls[0].path, dir);
    EXPECT_TRUE(calls[0].placeholder);
    const plist::Dict& options = calls[0].options;
    EXPECT_EQ(options.size(), 5u);
    EXPECT_EQ(*options.find(ARPackageTypeKey), plist::Value(ARPackageTypePlaceholder));
    EXPECT_EQ(*options.find("BNBundleIdentifier"), plist::Value(kID));
    EXPECT_EQ(options.find("ARInstallType")->uint64(), 2u);
    EXPECT_EQ(*options.find(ARCaravelMetadataKey), plist::Value(metadataBytes));
    if (c.withSinf) {
      EXPECT_EQ(*options.find(ARApplicationSINFKey), plist::Value(kSinf));
    } else {
      EXPECT_EQ(options.find(ARApplicationSINFKey)->type(), plist::Type::Null);
    }

    // The registry really lists it.
    auto record = d.device.ar().application(kID);
    ASSERT_TRUE(record);
    EXPECT_TRUE(record->isPlaceholder);
    EXPECT_EQ(record->installType, 2u);
    EXPECT_EQ(record->name, c.expectedName);
    EXPECT_EQ(record->version, version);
    EXPECT_EQ(record->iconPath, c.withIcon ? std::optional(icon) : std::nullopt);

    EXPECT_EQ(d.scenarios(), std::vector<std::string>{
                                 "Caravel App Restore yes com.example.app: Installed placeholder"});

    // Owner and group: the directory, the parent it made, the icon.
    for (const std::string& path : {dir, d.appsDir()}) {
      auto owner = d.device.system().ownership(path);
      ASSERT_TRUE(owner) << path;
      EXPECT_EQ(owner->owner, "mobile");
      EXPECT_EQ(owner->group, "mobile");
    }
    EXPECT_EQ(d.device.system().ownership(icon).has_value(), c.withIcon);

    const MemoryLogSink& log = d.device.log();
    const std::string gazette =
        c.expectedGazette.boolean() && *c.expectedGazette.boolean() ? "1" : "0";
    EXPECT_TRUE(log.contains(pluginLine("processing app restore info for 'com.example.app'")));
    EXPECT_TRUE(log.contains(pluginLine("creating placeholder for 'com.example.app'. info.plist=" +
                                        plist::Value(*info).describe())));
    expectOneLine(log,
                  pluginLine("Installed Placeholder app from path " + dir + ": " + c.expectedName +
                             " [com.example.app " + version + "] [isGazette: " + gazette + "]"),
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

struct FailureCase {
  const char* name;
  std::optional<plist::Value> metadata;  // absent: bytes that are no property list
  std::vector<std::string> scenarios;
  std::vector<std::pair<std::string, LogLevel>> messages;  // prefixes; "DIR": the directory
  std::string id = kID;
  std::function<void(PlaceholderDevice&)> setup = nullptr;
  bool finalMessage = true;
  bool directoryLeft = false, iconLeft = false, infoLeft = false;
  std::size_t installCalls = 0;
};

TEST(RestorePlaceholderTest, FailuresStopWhereTheyHappen) {
  const plist::Dict complete{{"title", "T"}, {"bundleVersion", "1"}};
  const auto entry = [](const std::string& id, const char* what) {
    return "Caravel App Restore no " + id + ": " + what;
  };
  const FailureCase cases[] = {
      {.name = "not a property list",
       .metadata = std::nullopt,
       .scenarios = {entry(kID, "Failed to parse caravel metadata")},
       .messages = {{"failed to parse caravel metadata for 'com.example.app'. err=Error "
                     "Domain=PropertyListError Code=1",
                     LogLevel::Default}},
       .finalMessage = false},
      {.name = "not a dictionary",
       .metadata = plist::Value(plist::Array{"a"}),
       .scenarios = {entry(kID, "Failed to parse caravel metadata")},
       .messages = {{"failed to parse caravel metadata for 'com.example.app'. err=",
                     LogLevel::Default}},
       .finalMessage = false},
      {.name = "no bundleVersion",
       .metadata = plist::Value(plist::Dict{{"title", "T"}}),
       .scenarios = {entry(kID, "Failed to create placeholder info")},
       .messages = {{"failed to create placeholder info at DIR/Info.plist with info {",
                     LogLevel::Default}},
       .directoryLeft = true,
       .iconLeft = true},
      {.name = "no name",
       .metadata = plist::Value(plist::Dict{{"bundleVersion", "1"}}),
       .scenarios = {entry(kID, "Failed to create placeholder info")},
       .messages = {{"failed to create placeholder info at DIR/Info.plist with info {",
                     LogLevel::Default}},
       .directoryLeft = true,
       .iconLeft = true},
      {.name = "directory cannot be made",
       .metadata = plist::Value(complete),
       .scenarios = {entry(kID, "Failed to create app directory"),
                     entry(kID, "Failed to create app directory")},
       .messages = {{"Created app directory for 'com.example.app' at DIR with err=Error "
                     "Domain=POSIX Code=20",
                     LogLevel::Default},
                    {"failed to create app directory for 'com.example.app'. err=(null)",
                     LogLevel::Default}},
       .setup =
           [](PlaceholderDevice& d) {
             ASSERT_TRUE(writeFileAtomically(d.appsDir(), plist::Bytes{'x'}));
           }},
      {.name = "identifier that would escape",
       .metadata = plist::Value(complete),
       .scenarios = {entry("../x", "Failed to create app directory"),
                     entry("../x", "Failed to create app directory")},
       .messages = {{"Created app directory for '../x' at (null) with err=Error Domain=POSIX "
                     "Code=22",
                     LogLevel::Default},
                    {"failed to create app directory for '../x'. err=(null)", LogLevel::Default}},
       .id = "../x",
       // With the base directory present, "../x.app" would land beside it.
       .setup = [](PlaceholderDevice& d) { ASSERT_TRUE(createDirectories(d.appsDir())); }},
      {.name = "registry refuses",
       .metadata = plist::Value(complete),
       .scenarios = {entry(kID, "Failed to install placeholder")},
       .messages = {{"Placeholder app install failed from path DIR: T [com.example.app 1] "
                     "[isGazette: 0]",
                     LogLevel::Error}},
       .setup =
           [](PlaceholderDevice& d) {
             d.device.ar().failOperation("installApplication:withOptions:");
           },
       .directoryLeft = true,
       .iconLeft = true,
       .infoLeft = true,
       .installCalls = 1},
  };
  for (const FailureCase& c : cases) {
    SCOPED_TRACE(c.name);
    PlaceholderDevice d;
    if (c.setup) c.setup(d);
    const std::string dir = d.placeholderDir(c.id);
    const plist::Bytes bytes = c.metadata ? testing::binaryPlist(*c.metadata)
                                          : plist::Bytes{'n', 'o', 't', ' ', 'a', ' ', 'p'};

    EXPECT_FALSE(d.client._processCaravelRestoreInfoForApp(c.id, bytes, kSinf, kIcon));

    EXPECT_EQ(d.scenarios(), c.scenarios);
    for (const auto& [message, level] : c.messages) {
      std::string prefix = message;
      if (auto at = prefix.find("DIR"); at != std::string::npos) prefix.replace(at, 3, dir);
      expectOneLine(d.device.log(), pluginLine(prefix), level);
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
    EXPECT_EQ(directoryExists(dir), c.directoryLeft);
    EXPECT_EQ(fileExists(dir + "/Icon.png"), c.iconLeft);
    EXPECT_EQ(fileExists(dir + "/Info.plist"), c.infoLeft);
    EXPECT_EQ(d.device.ar().installCalls().size(), c.installCalls);
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
  const plist::Bytes newIcon = {9, 9};
  ASSERT_TRUE(d.client._processCaravelRestoreInfoForApp(kID, metadata("2"), kSinf, newIcon));
  const std::string dir = d.placeholderDir(kID);
  EXPECT_EQ(readFile(dir + "/Icon.png"), newIcon);
  EXPECT_EQ(*testing::readDict(dir + "/Info.plist")->find("BNBundleVersion"), plist::Value("2"));
  EXPECT_EQ(d.device.ar().application(kID)->version, "2");
}

}  // namespace
}  // namespace appsync
