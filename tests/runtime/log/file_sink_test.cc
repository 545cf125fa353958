// The file sink: one tab-separated line per message, with a UTC timestamp.
#include <gtest/gtest.h>

#include <fstream>
#include <regex>
#include <sstream>

#include "runtime/log/log.h"
#include "support/temp_dir.h"

namespace appsync {
namespace {

TEST(FileLogSinkTest, WritesOneEscapedLinePerMessage) {
  testing::TempDir dir;
  std::string path = dir / "appsync.log";
  {
    FileLogSink sink(path);
    ASSERT_TRUE(sink.ok());
    sink.write(8, LogLevel::Default, "com.vantor.trc.AppSync|Nothing to do");
    sink.write(14, LogLevel::Error, "first\nsecond\\third\n");
  }
  FileLogSink(path).write(0, LogLevel::Default, "appended");
  std::stringstream text;
  text << std::ifstream(path).rdbuf();
  const std::string stamp = R"(\d{4}-\d\d-\d\dT\d\d:\d\d:\d\d\.\d{3}Z)";
  std::regex pattern(stamp + "\t8\tDefault\tcom\\.vantor\\.trc\\.AppSync\\|Nothing to do\n" +
                     stamp + "\t14\tError\tfirst\\\\nsecond\\\\third\\\\n\n" + stamp +
                     "\t0\tDefault\tappended\n");
  EXPECT_TRUE(std::regex_match(text.str(), pattern)) << text.str();
}

}  // namespace
}  // namespace appsync
