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

TEST(PlaceholderDirectoryTest, MakesParentsWithOwnerAndSucceedsAgain) {
  PlaceholderDevice d;
  const std::string dir = d.placeholderDir("com.example.app");
  const FileAttributes mobile{"mobile", "mobile"};

  for (int attempt = 0; attempt < 2; ++attempt) {
    SCOPED_TRACE(attempt);
    EXPECT_TRUE(d.client.createPlaceHolderPath(dir, "com.example.app", mobile));
    EXPECT_TRUE(directoryExists(dir));
    EXPECT_EQ(d.device.log().count(pluginLine("Created app directory for 'com.example.app' at " +
                                              dir + " with err=(null)")),
              attempt + 1u);
  }
  for (const std::string& made : {dir, d.appsDir()}) {
    auto owner = d.device.system().ownership(made);
    ASSERT_TRUE(owner) << made;
    EXPECT_EQ(owner->owner, "mobile");
    EXPECT_EQ(owner->group, "mobile");
  }
  // The temporary directory existed before: not ours to change.
  EXPECT_FALSE(d.device.system().ownership(d.tempDir()));
  EXPECT_TRUE(d.scenarios().empty());
}

TEST(PlaceholderDirectoryTest, OwnershipFailureDoesNotFailTheCreation) {
  PlaceholderDevice d;
  d.device.system().failOperation("setOwnerAndGroup");
  EXPECT_TRUE(d.client.createPlaceHolderPath(d.placeholderDir("a"), "a", {"mobile", "mobile"}));
  EXPECT_TRUE(d.scenarios().empty());
}

TEST(PlaceholderIconTest, ReportsSizeOnlyWhenWritten) {
  PlaceholderDevice d;
  const std::string dir = d.placeholderDir("a");
  ASSERT_TRUE(createDirectories(dir));
  const std::string icon = dir + "/Icon.png";

  std::uint64_t size = 77;
  EXPECT_TRUE(
      d.client.writeIconData(plist::Bytes(5, 0xab), icon, &size, "a", {"mobile", "mobile"}));
  EXPECT_EQ(size, 5u);
  EXPECT_EQ(readFile(icon), plist::Bytes(5, 0xab));
  EXPECT_EQ(d.device.system().ownership(icon)->owner, "mobile");
  EXPECT_TRUE(d.device.log().contains(
      pluginLine("icon data for 'a' was writen to " + icon + " with status:1 fileSize:5")));

  // Written again in place, smaller.
  EXPECT_TRUE(d.client.writeIconData(plist::Bytes(2, 1), icon, &size, "a", {}));
  EXPECT_EQ(size, 2u);
  EXPECT_EQ(readFile(icon), plist::Bytes(2, 1));

  // A path inside a missing directory cannot be written: the size stays as it was.
  size = 77;
  const std::string nowhere = dir + "/missing/Icon.png";
  EXPECT_FALSE(d.client.writeIconData(plist::Bytes(3, 1), nowhere, &size, "a", {}));
  EXPECT_EQ(size, 77u);
  EXPECT_TRUE(d.device.log().contains(
      pluginLine("icon data for 'a' was writen to " + nowhere + " with status:0 fileSize:0")));

  EXPECT_FALSE(d.client.writeIconData(std::nullopt, icon, &size, "a", {}));
  EXPECT_EQ(size, 77u);
  std::size_t noIcon = 0;
  for (const auto& line : d.device.log().lines()) {
    if (line.message != pluginLine("no icon data for 'a'")) continue;
    ++noIcon;
    EXPECT_EQ(line.level, LogLevel::Error);
  }
  EXPECT_EQ(noIcon, 1u);
}

}  // namespace
}  // namespace appsync
