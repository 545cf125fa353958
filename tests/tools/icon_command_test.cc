// appsync-host icon, run as a process: rendered files at the asked size, and failures that say
// why and write nothing.
#include <gtest/gtest.h>
#include <sys/wait.h>

#include <cstdlib>
#include <filesystem>
#include <string>

#include "runtime/fs/files.h"
#include "platform/icon/png_codec.h"
#include "support/host_process.h"
#include "support/temp_dir.h"
#include "support/text_file.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;

using testing::writeText;

// A bundle as a developer would lay it out: a name without ".png" whose file is the @2x variant.
void makeBundle(const fs::path& bundle) {
  fs::create_directories(bundle);
  writeText(bundle / "Info.plist",
            "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n"
            "<plist version=\"1.0\">\n<dict>\n"
            "  <key>BNBundleIconFiles</key>\n"
            "  <array>\n    <string>AppIcon60x60</string>\n  </array>\n"
            "</dict>\n</plist>\n");
  icon::Image image(120, 120);
  for (std::size_t i = 0; i < image.rgba.size(); i += 4) {
    image.rgba[i] = 250;
    image.rgba[i + 3] = 255;
  }
  auto png = icon::encodePng(image);
  ASSERT_TRUE(png);
  ASSERT_TRUE(writeFileAtomically((bundle / "AppIcon60x60@2x.png").string(), *png));
}

using testing::HostRun;
using testing::runHost;

TEST(IconCommandTest, RendersAtTheAskedSizeOrSaysWhyNot) {
  // Set by the build for this test binary.
  const char* host = std::getenv("APPSYNC_HOST");
  ASSERT_NE(host, nullptr) << "APPSYNC_HOST is not set";
  testing::TempDir dir;
  const fs::path bundle = dir.path() / "Example.app";
  makeBundle(bundle);
  fs::create_directories(dir.path() / "not-an-app");

  struct Case {
    const char* name;
    std::string arguments;
    std::string output;
    int size;  // 0: the command fails
  };
  const std::string b = "'" + bundle.string() + "'";
  const Case cases[] = {
      {"default size", "icon " + b + " -o '" + (dir / "a.png") + "'", dir / "a.png", 120},
      {"asked size", "icon " + b + " --size 57 -o '" + (dir / "b.png") + "'", dir / "b.png", 57},
      {"no such bundle", "icon '" + (dir / "Gone.app") + "' -o '" + (dir / "c.png") + "'",
       dir / "c.png", 0},
      {"no icon in it", "icon '" + (dir / "not-an-app") + "' -o '" + (dir / "d.png") + "'",
       dir / "d.png", 0},
      {"output directory missing", "icon " + b + " -o '" + (dir / "nowhere/e.png") + "'",
       dir / "nowhere/e.png", 0},
      {"size out of range", "icon " + b + " --size 0 -o '" + (dir / "f.png") + "'", dir / "f.png",
       0},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    const HostRun run = runHost(host, c.arguments, dir.path());
    if (c.size == 0) {
      EXPECT_NE(run.status, 0);
      EXPECT_FALSE(run.stderrText.empty());
      EXPECT_FALSE(fs::exists(c.output));
      continue;
    }
    EXPECT_EQ(run.status, 0) << run.stderrText;
    const auto png = readFile(c.output);
    ASSERT_TRUE(png);
    std::string why;
    const auto image = icon::decodePng(*png, &why);
    ASSERT_TRUE(image) << why;
    EXPECT_EQ(image->width, c.size);
    EXPECT_EQ(image->height, c.size);
    const int last = c.size - 1;
    for (auto [x, y] : {std::pair{0, 0}, {last, 0}, {0, last}, {last, last}}) {
      EXPECT_EQ(image->pixel(x, y)[3], 0) << x << "," << y;
    }
    EXPECT_EQ(image->pixel(c.size / 2, c.size / 2)[0], 250);
    EXPECT_EQ(image->pixel(c.size / 2, c.size / 2)[3], 255);
  }
}

}  // namespace
}  // namespace appsync
