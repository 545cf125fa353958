// Finding the icon file of a bundle from its Info.plist, for every key layout and size choice.
#include "platform/icon/icon_lookup.h"

#include <gtest/gtest.h>

#include <filesystem>

#include "platform/icon/png_fixtures.h"
#include "support/temp_dir.h"

namespace appsync::icon {
namespace {

namespace fs = std::filesystem;
using testing::Bytes;

std::string primaryIcons(const char* key, const std::string& names) {
  return std::string("<key>") + key +
         "</key><dict><key>BNBundlePrimaryIcon</key><dict><key>BNBundleIconFiles</key><array>" +
         names + "</array></dict></dict>";
}

std::string strings(std::initializer_list<const char*> names) {
  std::string out;
  for (const char* n : names) out += std::string("<string>") + n + "</string>";
  return out;
}

// A PNG whose header says 180 x 180 but whose image data is damaged.
Bytes undecodable180() {
  Bytes png = testing::solidPng(180, 180);
  const std::size_t idat = testing::findChunk(png, "IDAT");
  png[idat + 9] ^= 0xff;
  return png;
}

TEST(IconLookupTest, ChoosesTheFileForEveryLayout) {
  const std::string appIcon = primaryIcons("BNBundleIcons", strings({"AppIcon"}));
  const std::vector<std::pair<std::string, int>> threeScales = {
      {"AppIcon.png", 60}, {"AppIcon@2x.png", 120}, {"AppIcon@3x.png", 180}};
  struct Case {
    const char* name;
    std::string plist;
    std::vector<std::pair<std::string, int>> files;  // file name, side (0: damaged 180 px)
    DeviceIdiom idiom;
    int target;
    const char* chosen;  // file name, or null when there is none
    const char* reason;  // part of the reason when there is none
  };
  const Case cases[] = {
      {"exact size", appIcon, threeScales, DeviceIdiom::Phone, 120, "AppIcon@2x.png", nullptr},
      {"next larger", appIcon, threeScales, DeviceIdiom::Phone, 150, "AppIcon@3x.png", nullptr},
      {"largest when all smaller", appIcon, threeScales, DeviceIdiom::Phone, 200, "AppIcon@3x.png",
       nullptr},
      {"smallest when all larger", appIcon, threeScales, DeviceIdiom::Phone, 29, "AppIcon.png",
       nullptr},
      {"name with extension",
       primaryIcons("BNBundleIcons", strings({"Icon.png"})),
       {{"Icon.png", 57}, {"Icon@2x.png", 114}},
       DeviceIdiom::Phone,
       120,
       "Icon@2x.png",
       nullptr},
      {"top-level file list",
       "<key>BNBundleIconFiles</key><array>" + strings({"Icon-57.png", "Icon-114"}) + "</array>",
       {{"Icon-57.png", 57}, {"Icon-114.png", 114}},
       DeviceIdiom::Phone,
       100,
       "Icon-114.png",
       nullptr},
      {"single file key",
       "<key>BNBundleIconFile</key><string>icon</string>",
       {{"icon.png", 90}},
       DeviceIdiom::Phone,
       120,
       "icon.png",
       nullptr},
      {"keys pooled",
       appIcon + "<key>BNBundleIconFile</key><string>Big</string>",
       {{"AppIcon.png", 60}, {"Big.png", 180}},
       DeviceIdiom::Phone,
       120,
       "Big.png",
       nullptr},
      {"tablet prefers tablet key",
       appIcon + primaryIcons("BNBundleIcons~tablet", strings({"Pad"})),
       {{"AppIcon@2x.png", 120}, {"Pad~tablet.png", 76}, {"Pad@2x~tablet.png", 152}},
       DeviceIdiom::Tablet,
       152,
       "Pad@2x~tablet.png",
       nullptr},
      {"phone prefers phone keys",
       appIcon + primaryIcons("BNBundleIcons~tablet", strings({"Pad"})),
       {{"AppIcon@2x.png", 120}, {"Pad@2x~tablet.png", 152}},
       DeviceIdiom::Phone,
       152,
       "AppIcon@2x.png",
       nullptr},
      {"phone falls back to tablet key",
       appIcon + primaryIcons("BNBundleIcons~tablet", strings({"Pad"})),
       {{"Pad~tablet.png", 76}},
       DeviceIdiom::Phone,
       120,
       "Pad~tablet.png",
       nullptr},
      {"tablet falls back to phone keys", appIcon, threeScales, DeviceIdiom::Tablet, 152,
       "AppIcon@3x.png", nullptr},
      {"damaged file passed over",
       appIcon,
       {{"AppIcon@2x.png", 120}, {"AppIcon@3x.png", 0}},
       DeviceIdiom::Phone,
       150,
       "AppIcon@2x.png",
       nullptr},
      {"shorter side decides",
       appIcon,
       {{"AppIcon.png", -200}, {"AppIcon@2x.png", 120}},
       DeviceIdiom::Phone,
       120,
       "AppIcon@2x.png",
       nullptr},
      {"no Info.plist", "", {}, DeviceIdiom::Phone, 120, nullptr, "no Info.plist"},
      {"no icon keys",
       "<key>BNBundleName</key><string>x</string>",
       {{"AppIcon.png", 60}},
       DeviceIdiom::Phone,
       120,
       nullptr,
       "names no icon files"},
      {"named files missing",
       appIcon,
       {{"Other.png", 60}},
       DeviceIdiom::Phone,
       120,
       nullptr,
       "none of the icon files named in Info.plist (AppIcon)"},
      {"name escaping the bundle",
       primaryIcons("BNBundleIcons", strings({"../outside", "/etc/x"})),
       {},
       DeviceIdiom::Phone,
       120,
       nullptr,
       "none of the icon files"},
      {"nothing decodes",
       appIcon,
       {{"AppIcon@3x.png", 0}},
       DeviceIdiom::Phone,
       120,
       nullptr,
       "AppIcon@3x.png: PNG decode failed"},
      {"Info.plist not a property list",
       "<key>unclosed",
       {},
       DeviceIdiom::Phone,
       120,
       nullptr,
       "Info.plist: "},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    testing::TempDir dir;
    const fs::path bundle = dir.path() / "App.app";
    fs::create_directories(bundle);
    if (!c.plist.empty()) testing::writeInfoPlist(bundle, c.plist);
    // A decodable file just outside the bundle, for the names that try to reach it.
    testing::writeBytes(dir.path() / "outside.png", testing::solidPng(120, 120));
    for (const auto& [file, side] : c.files) {
      testing::writeBytes(bundle / file, side == 0  ? undecodable180()
                                         : side < 0 ? testing::solidPng(-side, -side / 2)
                                                    : testing::solidPng(side, side));
    }
    std::string why;
    const std::optional<BundleIcon> icon = findBundleIcon(bundle.string(), c.target, c.idiom, &why);
    if (c.chosen) {
      ASSERT_TRUE(icon) << why;
      EXPECT_EQ(fs::path(icon->path).filename(), c.chosen);
      EXPECT_EQ(fs::path(icon->path).parent_path(), bundle);
      EXPECT_FALSE(icon->image.empty());
    } else {
      EXPECT_FALSE(icon);
      EXPECT_NE(why.find(c.reason), std::string::npos) << why;
    }
  }
}

TEST(IconLookupTest, LinksLeadingOutOfTheBundleAreNotFollowed) {
  testing::TempDir dir;
  const fs::path bundle = dir.path() / "App.app";
  testing::writeInfoPlist(bundle, "<key>BNBundleIconFile</key><string>Icon</string>");
  testing::writeBytes(dir.path() / "secret.png", testing::solidPng(120, 120));
  testing::writeBytes(bundle / "Inner.png", testing::solidPng(60, 60));
  fs::create_symlink(dir.path() / "secret.png", bundle / "Icon@2x.png");
  fs::create_symlink(bundle / "Inner.png", bundle / "Icon.png");
  std::string why;
  const std::optional<BundleIcon> icon =
      findBundleIcon(bundle.string(), 120, DeviceIdiom::Phone, &why);
  ASSERT_TRUE(icon) << why;
  EXPECT_EQ(fs::path(icon->path).filename(), "Icon.png");
  EXPECT_EQ(icon->image.width, 60);
}

TEST(IconLookupTest, NameTiersFollowTheDevice) {
  plist::Dict info;
  info.set("BNBundleIconFile", "single");
  info.set("BNBundleIconFiles", plist::Array{"old", "single", 7});
  info.set("BNBundleIcons~tablet",
           plist::Dict{
               {"BNBundlePrimaryIcon", plist::Dict{{"BNBundleIconFiles", plist::Array{"pad"}}}}});
  const auto phone = iconNameTiers(info, DeviceIdiom::Phone);
  EXPECT_EQ(phone, (std::vector<std::vector<std::string>>{{"old", "single"}, {"pad"}}));
  const auto tablet = iconNameTiers(info, DeviceIdiom::Tablet);
  EXPECT_EQ(tablet, (std::vector<std::vector<std::string>>{{"pad"}, {"old", "single"}}));
}

}  // namespace
}  // namespace appsync::icon
