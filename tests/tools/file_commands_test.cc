// appsync-host icon and plist, run as processes: an icon rendered at the asked size or a failure
// that says why and writes nothing; a conversion that round-trips and a lint that names the bad
// file and the place.
#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>
#include <string>

#include "bundle_maker.h"
#include "platform/icon/png_codec.h"
#include "runtime/fs/files.h"
#include "runtime/plist/codec.h"
#include "support/host_process.h"
#include "support/temp_dir.h"
#include "support/text_file.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;

TEST(IconCommandTest, RendersAtTheAskedSizeOrSaysWhyNot) {
  const char* host = std::getenv("APPSYNC_HOST");
  ASSERT_NE(host, nullptr) << "APPSYNC_HOST is set by the build";
  testing::TempDir dir;
  host::makeBundle(dir.path(), dir.path(), {.identifier = "com.a", .name = "A", .version = "1"});
  const auto run = [&](const std::string& bundle, const std::string& output) {
    return testing::runHost(
        host, "icon '" + (dir / bundle) + "' --size 57 -o '" + (dir / output) + "'", dir.path());
  };

  const testing::HostRun rendered = run("A.app", "a.png");
  EXPECT_EQ(rendered.status, 0) << rendered.stderrText;
  std::string why;
  const auto image = icon::decodePng(readFile(dir / "a.png").value_or(plist::Bytes{}), &why);
  ASSERT_TRUE(image) << why;
  EXPECT_EQ(std::pair(image->width, image->height), std::pair(57, 57));

  const testing::HostRun failed = run("Gone.app", "b.png");
  EXPECT_NE(failed.status, 0);
  EXPECT_NE(failed.stderrText.find("no icon: no bundle directory at"), std::string::npos)
      << failed.stderrText;
  EXPECT_FALSE(fs::exists(dir / "b.png"));
}

TEST(PlistCommandTest, ConvertRoundTripsAndLintNamesTheBadFileAndThePlace) {
  const char* host = std::getenv("APPSYNC_HOST");
  ASSERT_NE(host, nullptr) << "APPSYNC_HOST is set by the build";
  testing::TempDir dir;
  const auto run = [&](const std::string& arguments) {
    return testing::runHost(host, "plist " + arguments, dir.path());
  };
  const plist::Value list(plist::Array{plist::Dict{{"identifier", "com.example.é"}, {"n", 7}}});
  ASSERT_TRUE(writePlistAtomically(dir / "in.plist", list, plist::Format::Xml));
  const auto convert =
      run("convert --to binary '" + (dir / "in.plist") + "' -o '" + (dir / "out.plist") + "'");
  ASSERT_EQ(convert.status, 0) << convert.stderrText;
  plist::Format written;
  EXPECT_EQ(plist::parse(readFile(dir / "out.plist").value_or(plist::Bytes{}), nullptr, &written),
            list);
  EXPECT_EQ(written, plist::Format::Binary);

  testing::writeText(dir / "bad.plist",
                     "<?xml version=\"1.0\"?>\n<plist><dict><key>a</key><integer>12abc</integer>"
                     "</dict></plist>");
  const auto lint = run("lint '" + (dir / "in.plist") + "' '" + (dir / "bad.plist") + "'");
  EXPECT_EQ(lint.status, 1);
  EXPECT_NE(lint.stderrText.find("bad.plist: XML property list, line 2"), std::string::npos)
      << lint.stderrText;
}

}  // namespace
}  // namespace appsync
