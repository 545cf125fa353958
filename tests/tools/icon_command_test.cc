// appsync-host icon, run as a process: a rendered file at the asked size, and a failure that
// says why and writes nothing.
#include <gtest/gtest.h>

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
  image.rgba.assign(image.rgba.size(), 255);
  ASSERT_TRUE(writeFileAtomically((bundle / "AppIcon60x60@2x.png").string(),
                                  icon::encodePng(image).value_or(plist::Bytes{})));
}

TEST(IconCommandTest, RendersAtTheAskedSizeOrSaysWhyNot) {
  // Set by the build for this test binary.
  const char* host = std::getenv("APPSYNC_HOST");
  ASSERT_NE(host, nullptr) << "APPSYNC_HOST is not set";
  testing::TempDir dir;
  makeBundle(dir.path() / "Example.app");
  const auto run = [&](const std::string& bundle, const std::string& output) {
    return runHost(host, "icon '" + (dir / bundle) + "' --size 57 -o '" + (dir / output) + "'",
                   dir.path());
  };

  const HostRun rendered = run("Example.app", "a.png");
  EXPECT_EQ(rendered.status, 0) << rendered.stderrText;
  std::string why;
  const auto image = icon::decodePng(readFile(dir / "a.png").value_or(plist::Bytes{}), &why);
  ASSERT_TRUE(image) << why;
  EXPECT_EQ(image->width, 57);
  EXPECT_EQ(image->height, 57);

  const HostRun failed = run("Gone.app", "b.png");
  EXPECT_NE(failed.status, 0);
  EXPECT_NE(failed.stderrText.find("no icon: no bundle directory at"), std::string::npos)
      << failed.stderrText;
  EXPECT_FALSE(fs::exists(dir / "b.png"));
}

}  // namespace
}  // namespace appsync
