// Finding the icon file of a bundle from its Info.plist, for every key layout and size choice.
#include "platform/icon/icon_lookup.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <sstream>

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

// Writes "NAME:SIDE NAME=>TARGET ..." into the bundle: SIDE x SIDE files, a damaged 180 x 180
// file for side 0, a -SIDE x -SIDE/2 file for a negative side, and links to TARGET.
void writeFiles(const fs::path& bundle, const std::string& files) {
  std::istringstream in(files);
  for (std::string item; in >> item;) {
    if (const std::size_t arrow = item.find("=>"); arrow != std::string::npos) {
      fs::create_symlink(item.substr(arrow + 2), bundle / item.substr(0, arrow));
      continue;
    }
    const std::size_t colon = item.find(':');
    const int side = std::stoi(item.substr(colon + 1));
    testing::writeBytes(bundle / item.substr(0, colon), side == 0 ? undecodable180()
                                                        : side < 0
                                                            ? testing::solidPng(-side, -side / 2)
                                                            : testing::solidPng(side, side));
  }
}

TEST(IconLookupTest, ChoosesTheFileForEveryLayout) {
  const std::string appIcon = primaryIcons("BNBundleIcons", strings({"AppIcon"}));
  const std::string withPad = appIcon + primaryIcons("BNBundleIcons~tablet", strings({"Pad"}));
  const char* scales = "AppIcon.png:60 AppIcon@2x.png:120 AppIcon@3x.png:180";
  constexpr DeviceIdiom kPhone = DeviceIdiom::Phone, kTablet = DeviceIdiom::Tablet;
  struct Case {
    const char* name;
    std::string plist;
    const char* files;
    DeviceIdiom idiom;
    int target;
    const char* chosen;            // file name, or null when there is none
    const char* reason = nullptr;  // part of the reason when there is none
  };
  const Case cases[] = {
      {"exact size", appIcon, scales, kPhone, 120, "AppIcon@2x.png"},
      {"next larger", appIcon, scales, kPhone, 150, "AppIcon@3x.png"},
      {"largest when all smaller", appIcon, scales, kPhone, 200, "AppIcon@3x.png"},
      {"top-level file list",
       "<key>BNBundleIconFiles</key><array>" + strings({"Icon-57.png", "Icon-114"}) + "</array>",
       "Icon-57.png:57 Icon-114.png:114", kPhone, 100, "Icon-114.png"},
      {"single file key", "<key>BNBundleIconFile</key><string>icon</string>", "icon.png:90", kPhone,
       120, "icon.png"},
      {"keys pooled", appIcon + "<key>BNBundleIconFile</key><string>Big</string>",
       "AppIcon.png:60 Big.png:180", kPhone, 120, "Big.png"},
      {"tablet prefers tablet key", withPad,
       "AppIcon@2x.png:120 Pad~tablet.png:76 Pad@2x~tablet.png:152", kTablet, 152,
       "Pad@2x~tablet.png"},
      {"phone prefers phone keys", withPad, "AppIcon@2x.png:120 Pad@2x~tablet.png:152", kPhone, 152,
       "AppIcon@2x.png"},
      {"phone falls back to tablet key", withPad, "Pad~tablet.png:76", kPhone, 120,
       "Pad~tablet.png"},
      {"tablet falls back to phone keys", appIcon, scales, kTablet, 152, "AppIcon@3x.png"},
      {"damaged file passed over", appIcon, "AppIcon@2x.png:120 AppIcon@3x.png:0", kPhone, 150,
       "AppIcon@2x.png"},
      {"shorter side decides", appIcon, "AppIcon.png:-200 AppIcon@2x.png:120", kPhone, 120,
       "AppIcon@2x.png"},
      {"links out of the bundle are not followed",
       "<key>BNBundleIconFile</key><string>Icon</string>",
       "Inner.png:60 Icon.png=>Inner.png Icon@2x.png=>../outside.png", kPhone, 120, "Icon.png"},
      {"no Info.plist", "", "", kPhone, 120, nullptr, "no Info.plist"},
      {"no icon keys", "<key>BNBundleName</key><string>x</string>", "AppIcon.png:60", kPhone, 120,
       nullptr, "names no icon files"},
      {"named files missing", appIcon, "Other.png:60", kPhone, 120, nullptr,
       "none of the icon files named in Info.plist (AppIcon)"},
      {"name escaping the bundle", primaryIcons("BNBundleIcons", strings({"../outside", "/etc/x"})),
       "", kPhone, 120, nullptr, "none of the icon files"},
      {"nothing decodes", appIcon, "AppIcon@3x.png:0", kPhone, 120, nullptr,
       "AppIcon@3x.png: PNG decode failed"},
      {"Info.plist not a property list", "<key>unclosed", "", kPhone, 120, nullptr, "Info.plist: "},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    testing::TempDir dir;
    const fs::path bundle = dir.path() / "App.app";
    fs::create_directories(bundle);
    if (!c.plist.empty()) testing::writeInfoPlist(bundle, c.plist);
    // A decodable file just outside the bundle, for the names that try to reach it.
    testing::writeBytes(dir.path() / "outside.png", testing::solidPng(120, 120));
    writeFiles(bundle, c.files);
    std::string why;
    const std::optional<BundleIcon> icon = findBundleIcon(bundle.string(), c.target, c.idiom, &why);
    if (c.chosen) {
      ASSERT_TRUE(icon) << why;
      EXPECT_EQ(fs::path(icon->path), bundle / c.chosen);
      EXPECT_FALSE(icon->image.empty());
    } else {
      EXPECT_FALSE(icon);
      EXPECT_NE(why.find(c.reason), std::string::npos) << why;
    }
  }
}

}  // namespace
}  // namespace appsync::icon
