// The file sink: one tab-separated line per message, with a UTC timestamp.
#include <gtest/gtest.h>

#include <chrono>
#include <fstream>
#include <regex>
#include <sstream>

#include "core/log/log.h"
#include "support/temp_dir.h"

namespace appsync {
namespace {

std::string slurp(const std::string& path) {
  std::ifstream in(path, std::ios::binary);
  std::stringstream s;
  s << in.rdbuf();
  return s.str();
}

TEST(FileLogSinkTest, WritesOneEscapedLinePerMessage) {
  testing::TempDir dir;
  std::string path = dir / "appsync.log";
  {
    FileLogSink sink(path);
    ASSERT_TRUE(sink.ok());
    sink.write(8, LogLevel::Default, "com.vantor.trc.AppSync|Nothing to do");
    sink.write(14, LogLevel::Error, "first\nsecond\\third\n");
  }
  {
    FileLogSink again(path);  // appends
    again.write(0, LogLevel::Default, "");
  }
  std::string text = slurp(path);
  const std::string stamp = R"((\d{4})-(\d\d)-(\d\d)T(\d\d):(\d\d):(\d\d)\.(\d{3})Z)";
  std::regex pattern(stamp + "\t8\tDefault\tcom\\.vantor\\.trc\\.AppSync\\|Nothing to do\n" +
                     stamp + "\t14\tError\tfirst\\\\nsecond\\\\third\\\\n\n" + stamp +
                     "\t0\tDefault\t\n");
  std::smatch match;
  ASSERT_TRUE(std::regex_match(text, match, pattern)) << text;

  // The first timestamp is the current UTC time (to the minute, allowing for a slow run).
  std::tm tm{};
  tm.tm_year = std::stoi(match[1]) - 1900;
  tm.tm_mon = std::stoi(match[2]) - 1;
  tm.tm_mday = std::stoi(match[3]);
  tm.tm_hour = std::stoi(match[4]);
  tm.tm_min = std::stoi(match[5]);
  tm.tm_sec = std::stoi(match[6]);
  auto written = std::chrono::system_clock::from_time_t(timegm(&tm));
  auto now = std::chrono::system_clock::now();
  EXPECT_LE(written, now);
  EXPECT_GT(written, now - std::chrono::minutes(1));
}

TEST(FileLogSinkTest, UnwritablePathIsNotOk) {
  testing::TempDir dir;
  FileLogSink sink(dir / "missing/appsync.log");
  EXPECT_FALSE(sink.ok());
  sink.write(8, LogLevel::Default, "dropped");  // harmless
}

}  // namespace
}  // namespace appsync
