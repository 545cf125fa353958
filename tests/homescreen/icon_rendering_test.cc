// Rendering an installed bundle's icon to a PNG file: every failure step with its message and
// no file damage, and a successful rendering that decodes to the device's icon.
#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <filesystem>
#include <functional>
#include <string>
#include <vector>

#include "client/apps_client.h"
#include "platform/fake/fake_platform.h"
#include "platform/icon/png_codec.h"
#include "runtime/fs/files.h"
#include "support/temp_dir.h"
#include "support/text_file.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;

using testing::writeText;

// An application bundle whose Info.plist names one side x side icon of a single colour.
std::string makeBundle(const fs::path& bundle, int side = 180) {
  fs::create_directories(bundle);
  writeText(bundle / "Info.plist",
            "<plist><dict><key>BNBundleIconFiles</key><array><string>AppIcon</string></array>"
            "</dict></plist>");
  icon::Image image(side, side);
  for (std::size_t i = 0; i < image.rgba.size(); i += 4) {
    std::copy_n(std::array<std::uint8_t, 4>{30, 144, 255, 255}.begin(), 4, &image.rgba[i]);
  }
  const auto png = icon::encodePng(image).value_or(plist::Bytes{});
  EXPECT_TRUE(writeFileAtomically((bundle / "AppIcon.png").string(), png));
  return bundle.string();
}

TEST(IconRenderingTest, EachFailingStepHasItsMessageAndWritesNothing) {
  const plist::Bytes previous = {'o', 'l', 'd'};
  struct Case {
    const char* name;
    std::function<std::optional<std::string>(const std::string& bundle, const fs::path& dir)>
        bundlePath;
    std::optional<QIStep> fault;
    bool destinationDirectoryExists;
    std::string message;  // after the prefix; the destination is appended when empty
  };
  const Case cases[] = {
      {"absent path", [](auto&, auto&) { return std::nullopt; }, std::nullopt, true,
       "missing bundlePath"},
      {"empty path", [](auto&, auto&) { return std::string(); }, std::nullopt, true,
       "couldn't create URL"},
      {"no such directory", [](auto&, const fs::path& dir) { return (dir / "Gone.app").string(); },
       std::nullopt, true, "couldn't create bundle from URL"},
      {"bundle cannot be opened", [](const std::string& b, auto&) { return b; }, QIStep::OpenBundle,
       true, "couldn't create bundle from URL"},
      {"directory that is no application", [](auto&, const fs::path& dir) { return dir.string(); },
       std::nullopt, true, "couldn't create PV icon from bundle"},
      {"icon cannot be rendered", [](const std::string& b, auto&) { return b; }, QIStep::RenderIcon,
       true, "couldn't create PV icon from bundle"},
      {"no encoder", [](const std::string& b, auto&) { return b; }, QIStep::CreateImageDestination,
       true, "couldn't create image"},
      {"encoder fails", [](const std::string& b, auto&) { return b; }, QIStep::Finalize, true,
       "Couldn't finalize image"},
      {"destination directory missing", [](const std::string& b, auto&) { return b; }, std::nullopt,
       false, ""},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    testing::TempDir root;
    FakePlatform device(root.path());
    const std::string bundle = makeBundle(root.path() / "Apps" / "Example.app");
    const fs::path outDir = root.path() / (c.destinationDirectoryExists ? "out" : "missing");
    const std::string saveTo = (outDir / "com.example.app.png").string();
    if (c.destinationDirectoryExists) {
      fs::create_directories(outDir);
      ASSERT_TRUE(writeFileAtomically(saveTo, previous));
    }
    if (c.fault) device.qi().failNext(*c.fault);

    EXPECT_FALSE(AppsClient::_makeIconFromBundlePath(device.platform(),
                                                     c.bundlePath(bundle, root.path()), saveTo));

    const std::string message =
        c.message.empty() ? "Couldn't save image file to " + saveTo : c.message;
    EXPECT_EQ(device.log().messages(),
              std::vector<std::string>{"com.vantor.trc.AppSync|" + message});
    for (const auto& line : device.log().lines()) EXPECT_EQ(line.level, LogLevel::Error);
    if (c.destinationDirectoryExists) {
      EXPECT_EQ(readFile(saveTo), previous);
      EXPECT_EQ(std::distance(fs::directory_iterator(outDir), fs::directory_iterator()), 1);
    } else {
      EXPECT_FALSE(fs::exists(outDir));
    }
  }
}

// Larger and smaller sources alike become one 120 x 120 PNG with antialiased cut corners.
TEST(IconRenderingTest, WritesTheDeviceIconAsOnePng) {
  for (int side : {180, 1024, 60}) {
    SCOPED_TRACE(side);
    testing::TempDir root;
    FakePlatform device(root.path());
    const std::string bundle = makeBundle(root.path() / "Example.app", side);
    const std::string saveTo = root / "icon.png";
    ASSERT_TRUE(writeFileAtomically(saveTo, plist::Bytes{'o', 'l', 'd'}));

    ASSERT_TRUE(AppsClient::_makeIconFromBundlePath(device.platform(), bundle, saveTo));

    EXPECT_TRUE(device.log().messages().empty());
    std::string why;
    const auto image = icon::decodePng(readFile(saveTo).value_or(plist::Bytes{}), &why);
    ASSERT_TRUE(image) << why;
    EXPECT_EQ(image->width, 120);
    EXPECT_EQ(image->height, 120);
    for (auto [x, y] : {std::pair{0, 0}, {119, 0}, {0, 119}, {119, 119}}) {
      EXPECT_EQ(image->pixel(x, y)[3], 0) << x << "," << y;
    }
    const std::uint8_t* centre = image->pixel(60, 60);
    EXPECT_EQ(std::vector<int>(centre, centre + 4), (std::vector<int>{30, 144, 255, 255}));
  }
}

}  // namespace
}  // namespace appsync
