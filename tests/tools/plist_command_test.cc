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

TEST(PlistCommandTest, LintNamesTheBadFileAndThePlaceAndConvertRoundTrips) {
  const char* host = std::getenv("APPSYNC_HOST");
  ASSERT_NE(host, nullptr) << "APPSYNC_HOST is not set";
  testing::TempDir dir;
  const auto run = [&](const std::string& arguments) {
    return testing::runHost(host, "plist " + arguments, dir.path());
  };
  writeText(dir / "good.plist", "<?xml version=\"1.0\"?><plist><array><true/></array></plist>");
  writeText(dir / "bad.plist",
            "<?xml version=\"1.0\"?>\n<plist><dict><key>a</key><integer>12abc</integer></dict>"
            "</plist>");
  auto lint = run("lint '" + (dir / "good.plist") + "'");
  EXPECT_EQ(lint.status, 0) << lint.stderrText;
  EXPECT_NE(lint.stdoutText.find("good.plist: ok (xml)"), std::string::npos) << lint.stdoutText;
  lint = run("lint '" + (dir / "good.plist") + "' '" + (dir / "bad.plist") + "' '" +
             (dir / "missing.plist") + "'");
  EXPECT_EQ(lint.status, 1);
  for (const char* part :
       {"bad.plist: XML property list, line 2", "12abc", "missing.plist: cannot read"}) {
    EXPECT_NE(lint.stderrText.find(part), std::string::npos) << lint.stderrText;
  }

  const plist::Value list(plist::Array{plist::Dict{{"identifier", "com.example.é"}, {"n", 7}}});
  ASSERT_TRUE(writePlistAtomically(dir / "in.plist", list, plist::Format::Xml));
  for (auto [to, format] :
       {std::pair{"binary", plist::Format::Binary}, {"xml", plist::Format::Xml}}) {
    SCOPED_TRACE(to);
    const std::string out = dir / (std::string("out.") + to);
    const auto convert =
        run(std::string("convert --to ") + to + " '" + (dir / "in.plist") + "' -o '" + out + "'");
    ASSERT_EQ(convert.status, 0) << convert.stderrText;
    plist::Format written;
    EXPECT_EQ(plist::parse(readFile(out).value_or(plist::Bytes{}), nullptr, &written), list);
    EXPECT_EQ(written, format);
  }
  EXPECT_NE(run("convert --to yaml in -o out").status, 0);
}

}  // namespace
}  // namespace appsync
