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

TEST(PlistCommandTest, LintNamesTheBadFileAndThePlace) {
  const char* host = std::getenv("APPSYNC_HOST");
  ASSERT_NE(host, nullptr) << "APPSYNC_HOST is not set";
  testing::TempDir dir;
  writeText(dir / "good.plist", "<?xml version=\"1.0\"?><plist><array><true/></array></plist>");
  writeText(dir / "bad.plist",
            "<?xml version=\"1.0\"?>\n<plist><dict><key>a</key><integer>12abc</integer></dict>"
            "</plist>");

  auto run = testing::runHost(host, "plist lint '" + (dir / "good.plist") + "'", dir.path());
  EXPECT_EQ(run.status, 0) << run.stderrText;
  EXPECT_NE(run.stdoutText.find("good.plist: ok (xml)"), std::string::npos) << run.stdoutText;

  run = testing::runHost(host,
                         "plist lint '" + (dir / "good.plist") + "' '" + (dir / "bad.plist") +
                             "' '" + (dir / "missing.plist") + "'",
                         dir.path());
  EXPECT_EQ(run.status, 1);
  EXPECT_NE(run.stderrText.find("bad.plist: XML property list, line 2"), std::string::npos)
      << run.stderrText;
  EXPECT_NE(run.stderrText.find("12abc"), std::string::npos) << run.stderrText;
  EXPECT_NE(run.stderrText.find("missing.plist: cannot read"), std::string::npos)
      << run.stderrText;
}

TEST(PlistCommandTest, ConvertRoundTripsBetweenFormats) {
  const char* host = std::getenv("APPSYNC_HOST");
  ASSERT_NE(host, nullptr) << "APPSYNC_HOST is not set";
  testing::TempDir dir;
  plist::Dict record{{"identifier", "com.example.é"}, {"operation", "install"}, {"n", 7}};
  ASSERT_TRUE(writePlistAtomically(dir / "in.plist", plist::Value(plist::Array{record}),
                                   plist::Format::Xml));

  for (const char* to : {"binary", "xml"}) {
    SCOPED_TRACE(to);
    const std::string out = dir / (std::string("out.") + to);
    auto run = testing::runHost(host,
                                std::string("plist convert --to ") + to + " '" +
                                    (dir / "in.plist") + "' -o '" + out + "'",
                                dir.path());
    ASSERT_EQ(run.status, 0) << run.stderrText;
    plist::Format format;
    auto value = plist::parse(readFile(out).value_or(plist::Bytes{}), nullptr, &format);
    ASSERT_TRUE(value);
    EXPECT_EQ(format, std::string(to) == "xml" ? plist::Format::Xml : plist::Format::Binary);
    EXPECT_EQ(*value, plist::Value(plist::Array{record}));
  }
  auto run = testing::runHost(host, "plist convert --to yaml in -o out", dir.path());
  EXPECT_NE(run.status, 0);
}

}  // namespace
}  // namespace appsync
