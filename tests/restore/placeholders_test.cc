// The placeholder directory path, the directory operation and the icon writer.
#include <gtest/gtest.h>

#include <filesystem>

#include "restore/placeholder_fixture.h"

namespace appsync {
namespace {

using testing::PlaceholderDevice;
using testing::pluginLine;

TEST(PlaceholderPathTest, KeepsDottedNamesAndRefusesEscapes) {
  PlaceholderDevice d;
  EXPECT_EQ(d.client.placeholderAppPathForBundleIdentifier("com.example.app"),
            d.root / "tmp/com.vantor.trc.Apps/com.example.app.app");
  EXPECT_EQ(d.client.placeholderAppPathForBundleIdentifier("a..b"),
            d.root / "tmp/com.vantor.trc.Apps/a..b.app");
  for (const char* hostile : {"..", "../x", "a/../../b", "/etc", ""}) {
    SCOPED_TRACE(hostile);
    EXPECT_EQ(d.client.placeholderAppPathForBundleIdentifier(hostile), std::nullopt);
  }
}

// A second creation succeeds too; the temporary directory was there before and is not ours to
// change, even when changing owners fails.
TEST(PlaceholderDirectoryTest, SucceedsAgainAndOnlyOwnsWhatItMade) {
  for (bool ownershipFails : {false, true}) {
    SCOPED_TRACE(ownershipFails);
    PlaceholderDevice d;
    if (ownershipFails) d.device.system().failOperation("setOwnerAndGroup");
    const std::string dir = d.placeholderDir("com.example.app");
    for (int attempt = 0; attempt < 2; ++attempt) {
      EXPECT_TRUE(d.client.createPlaceHolderPath(dir, "com.example.app", {"mobile", "mobile"}));
    }
    EXPECT_TRUE(directoryExists(dir));
    EXPECT_EQ(d.device.log().count(pluginLine("Created app directory for 'com.example.app' at " +
                                              dir + " with err=(null)")),
              2u);
    EXPECT_FALSE(d.device.system().ownership(d.tempDir()));
    EXPECT_TRUE(d.device.system().ownership(d.appsDir()));
    EXPECT_TRUE(d.device.system().ownership(dir));
    EXPECT_TRUE(d.scenarios().empty());
  }
}

// Success and a missing icon show on the restore road; here a write that fails.
TEST(PlaceholderIconTest, UnwritableIconLeavesTheSizeAsItWas) {
  PlaceholderDevice d;
  const std::string nowhere = d.placeholderDir("a") + "/missing/Icon.png";
  std::uint64_t size = 77;
  EXPECT_FALSE(d.client.writeIconData(plist::Bytes(3, 1), nowhere, &size, "a", {}));
  EXPECT_EQ(size, 77u);
  EXPECT_TRUE(d.device.log().contains(
      pluginLine("icon data for 'a' was writen to " + nowhere + " with status:0 fileSize:0")));
}

}  // namespace
}  // namespace appsync
