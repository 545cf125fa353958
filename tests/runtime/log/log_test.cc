// Logging: the message formatter's specifiers and the file sink's lines.
#include "runtime/log/log.h"

#include <gtest/gtest.h>

#include <fstream>
#include <memory>
#include <optional>
#include <regex>
#include <sstream>
#include <string>
#include <vector>

#include "support/temp_dir.h"

namespace appsync {
namespace {

struct Thing {
  std::string describe() const { return "<Thing 7>"; }
};

struct FormatCase {
  std::string format;
  std::vector<LogArg> args;
  std::string expected;
};

// The scenarios' exact lines cover the common forms; these are the edges.
TEST(FormatLogMessageTest, EverySpecifier) {
  const char* noText = nullptr;
  std::optional<std::string> noString;
  std::shared_ptr<Thing> noThing;
  const std::vector<FormatCase> cases = {
      {"%s|hello", {kPluginBundleIdentifier}, "com.vantor.trc.AppSync|hello"},
      {"%s", {noText}, "(null)"},
      {"%d %i", {-42, 7}, "-42 7"},
      {"%u %zu", {42u, std::size_t{9}}, "42 9"},
      {"%lld %llu", {INT64_MIN, UINT64_MAX}, "-9223372036854775808 18446744073709551615"},
      {"%f|%lf", {0.5, 2.0f}, "0.500000|2.000000"},
      {"success: %c", {'y'}, "success: y"},
      {"%{public}@ / %@", {Thing{}, std::make_shared<Thing>()}, "<Thing 7> / <Thing 7>"},
      {"%{public}@", {plist::Value(plist::Array{})}, plist::Value(plist::Array{}).describe()},
      {"secret %{private}@!", {std::string("password")}, "secret <private>!"},
      {"%{public}@pending", {std::string("[]")}, "[]pending"},
      {"100%% done", {}, "100% done"},
      // Absent values of every kind print "(null)", as do arguments that were never passed.
      {"%@ %{public}@ %d %f",
       {LogArg(), noString, noThing, nullptr},
       "(null) (null) (null) (null)"},
      {"%s and %d and %@", {std::string("one")}, "one and (null) and (null)"},
      // A mismatch prints the argument as what it is.
      {"%d", {std::string("text")}, "text"},
      {"%@ %s", {12, 3.5}, "12 3.500000"},
      {"%d|%u|%c", {'a', -1, 200000}, "97|-1|200000"},
      {"%f %c", {3, 65}, "3.000000 A"},
      // Specifiers we do not know are copied and consume nothing.
      {"%x %5d %{public}s %ls %d", {8}, "%x %5d %{public}s %ls 8"},
      {"trailing %", {}, "trailing %"},
      {"%d extra", {1, 2, 3}, "1 extra"},
  };
  for (const FormatCase& c : cases) {
    EXPECT_EQ(formatLogMessage(c.format, c.args), c.expected) << "format: " << c.format;
  }
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
