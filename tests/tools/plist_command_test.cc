// appsync-host plist lint|convert, run as a process.
#include <gtest/gtest.h>

#include <string>

#include "runtime/fs/files.h"
#include "runtime/plist/codec.h"
#include "support/host_process.h"
#include "support/temp_dir.h"
#include "support/text_file.h"

namespace appsync {
namespace {

using testing::writeText;

TEST(PlistCommandTest, ConvertRoundTripsAndLintNamesTheBadFileAndThePlace) {
  const char* host = std::getenv("APPSYNC_HOST");
  ASSERT_NE(host, nullptr) << "APPSYNC_HOST is not set";
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

  writeText(dir / "bad.plist",
            "<?xml version=\"1.0\"?>\n<plist><dict><key>a</key><integer>12abc</integer></dict>"
            "</plist>");
  const auto lint = run("lint '" + (dir / "in.plist") + "' '" + (dir / "bad.plist") + "'");
  EXPECT_EQ(lint.status, 1);
  EXPECT_NE(lint.stderrText.find("bad.plist: XML property list, line 2"), std::string::npos)
      << lint.stderrText;
}

}  // namespace
}  // namespace appsync
