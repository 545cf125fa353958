// The logger: the plugin prefix, categories reaching the sink with their numbers, and levels
// that are switched off costing nothing.
#include <gtest/gtest.h>

#include <atomic>
#include <memory>

#include "runtime/log/log.h"

namespace appsync {
namespace {

class LoggerTest : public ::testing::Test {
 protected:
  LoggerTest() : sink_(std::make_shared<MemoryLogSink>()) { logger_.setSink(sink_); }
  Logger logger_;
  std::shared_ptr<MemoryLogSink> sink_;
};

TEST_F(LoggerTest, CategoriesKeepTheirNumbersAndPluginMessagesTheirPrefix) {
  logMessage(logger_.category(0), LogLevel::Error, "unexpected type for %{public}@",
             std::string("Key"));
  pluginLog(logger_.category(8), LogLevel::Default, "%s|Nothing to do");
  pluginLog(logger_.category(14), LogLevel::Error, "%s|performing %llu deletions", 3ULL);
  std::vector<MemoryLogSink::Line> lines = sink_->lines();
  ASSERT_EQ(lines.size(), 3u);
  EXPECT_EQ(lines[0].category, 0);
  EXPECT_EQ(lines[0].level, LogLevel::Error);
  EXPECT_EQ(lines[0].message, "unexpected type for Key");
  EXPECT_EQ(lines[1].category, 8);
  EXPECT_EQ(lines[1].level, LogLevel::Default);
  EXPECT_EQ(lines[1].message, "com.vantor.trc.AppSync|Nothing to do");
  EXPECT_EQ(lines[2].category, 14);
  EXPECT_EQ(lines[2].message, "com.vantor.trc.AppSync|performing 3 deletions");
  EXPECT_EQ(&logger_.category(8), &logger_.category(8));
}

// An argument that counts how often it was asked to describe itself.
struct CountingObject {
  std::atomic<int>* describes;
  std::string describe() const {
    ++*describes;
    return "counted";
  }
};

TEST_F(LoggerTest, DisabledLevelsFormatNothing) {
  std::atomic<int> describes{0};
  CountingObject object{&describes};
  LogCategory& category = logger_.category(8);
  logger_.setLevelEnabled(LogLevel::Default, false);
  pluginLog(category, LogLevel::Default, "%s|%{public}@", object);
  EXPECT_EQ(describes.load(), 0);
  pluginLog(category, LogLevel::Error, "%s|%{public}@", object);
  EXPECT_EQ(describes.load(), 1);

  logger_.setLevelEnabled(LogLevel::Error, false);
  logger_.setLevelEnabled(LogLevel::Default, true);
  logMessage(category, LogLevel::Error, "%{public}@", object);
  category.write(LogLevel::Error, "preformatted");
  EXPECT_EQ(describes.load(), 1);
  EXPECT_EQ(sink_->messages(), std::vector<std::string>{"com.vantor.trc.AppSync|counted"});
}

}  // namespace
}  // namespace appsync
