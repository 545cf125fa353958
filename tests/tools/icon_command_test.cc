// appsync-host icon, run as a process: rendered files at the asked size, and failures that say
// why and write nothing.
#include <gtest/gtest.h>
#include <sys/wait.h>

#include <cstdlib>
#include <filesystem>
#include <string>

#include "platform/icon/png_codec.h"
#include "runtime/fs/files.h"
#include "support/host_process.h"
#include "support/temp_dir.h"
#include "support/text_file.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;

using testing::HostRun;
using testing::runHost;
using testing::writeText;

// A bundle as a developer would lay it out: a name without ".png" whose file is the @2x variant.
void makeBundle(const fs::path& bundle) {
  fs::create_directories(bundle);
  writeText(bundle / "Info.plist",
            "<plist><dict><key>BNBundleIconFiles</key><array><string>AppIcon60x60</string>"
            "</array></dict></plist>");
  icon::Image image(120, 120);
  for (std::size_t i = 0; i < image.rgba.size(); i += 4)
    image.rgba[i] = 250, image.rgba[i + 3] = 255;
  ASSERT_TRUE(writeFileAtomically((bundle / "AppIcon60x60@2x.png").string(),
                                  icon::encodePng(image).value_or(plist::Bytes{})));
}

TEST(IconCommandTest, RendersAtTheAskedSizeOrSaysWhyNot) {
  // Set by the build for this test binary.
  const char* host = std::getenv("APPSYNC_HOST");
  ASSERT_NE(host, nullptr) << "APPSYNC_HOST is not set";
  testing::TempDir dir;
  makeBundle(dir.path() / "Example.app");
  fs::create_directories(dir.path() / "not-an-app");
  struct Case {
    std::string bundle, options, output;
    int size;            // 0: the command fails
    const char* reason;  // part of its message
  };
  const Case cases[] = {
      {"Example.app", "", "a.png", 120, ""},
      {"Example.app", "--size 57", "b.png", 57, ""},
      {"Gone.app", "", "c.png", 0, "no icon: no bundle directory at"},
      {"not-an-app", "", "d.png", 0, "no icon: no Info.plist"},
      {"Example.app", "", "nowhere/e.png", 0, "cannot write"},
      {"Example.app", "--size 0", "f.png", 0, "--size"},
  };
  for (const Case& c : cases) {
    const std::string output = dir / c.output;
    SCOPED_TRACE(c.bundle + " " + c.options + " -o " + c.output);
    const HostRun run = runHost(
        host, "icon '" + (dir / c.bundle) + "' " + c.options + " -o '" + output + "'", dir.path());
    if (c.size == 0) {
      EXPECT_NE(run.status, 0);
      EXPECT_NE(run.stderrText.find(c.reason), std::string::npos) << run.stderrText;
      EXPECT_FALSE(fs::exists(output));
      continue;
    }
    EXPECT_EQ(run.status, 0) << run.stderrText;
    std::string why;
    const auto image = icon::decodePng(readFile(output).value_or(plist::Bytes{}), &why);
    ASSERT_TRUE(image) << why;
    EXPECT_EQ(image->width, c.size);
    EXPECT_EQ(image->height, c.size);
    EXPECT_EQ(image->pixel(0, 0)[3], 0);
    EXPECT_EQ(image->pixel(c.size / 2, c.size / 2)[0], 250);
    EXPECT_EQ(image->pixel(c.size / 2, c.size / 2)[3], 255);
  }
}

}  // namespace
}  // namespace appsync
