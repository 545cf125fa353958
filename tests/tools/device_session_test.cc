// The device session: one command at a time holds a device, a device stays where it was made
// (its saved state names paths under its root), and what it logs is taken step by step.
#include "device_session.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>
#include <string>
#include <vector>

#include "input_error.h"
#include "support/temp_dir.h"

namespace appsync::host {
namespace {

using ::testing::HasSubstr;
using ::testing::ThrowsMessage;

TEST(DeviceSessionTest, OneHolderAtATimeAndOnlyWhereTheDeviceWasMade) {
  testing::TempDir dir;
  const auto made = dir.path() / "made", moved = dir.path() / "moved";
  DeviceSession::create(made, {})->close();
  auto first = DeviceSession::open(made);
  EXPECT_THAT([&] { DeviceSession::open(made); },
              ThrowsMessage<DeviceBusy>(HasSubstr("in use by another appsync-host command")));
  first->close();
  first.reset();
  EXPECT_NO_THROW(DeviceSession::open(made)->close());

  std::filesystem::rename(made, moved);
  EXPECT_THAT([&] { DeviceSession::open(moved); },
              ThrowsMessage<InputError>(HasSubstr("was made at " + made.string())));
  std::filesystem::rename(moved, made);
  EXPECT_NO_THROW(DeviceSession::open(made)->close());
}

// Each take holds what was logged and recorded since the one before, once and in order, while
// the device's own log keeps every line.
TEST(DeviceSessionTest, EachTakeHoldsOnlyWhatCameSinceTheLastOne) {
  testing::TempDir dir;
  auto session = DeviceSession::create(dir.path() / "device", {});
  session->takeProduced();
  const LogCategory& log = session->device().tr().TRGetLogCategory(1);
  auto messages = [](const DeviceSession::Produced& produced) {
    std::vector<std::string> texts;
    for (const auto& line : produced.log) texts.push_back(line.message);
    return texts;
  };

  log.write(LogLevel::Default, "one");
  session->device().transactionLog().logStep(1, 2, 3, true, "com.example.kite", "first");
  auto produced = session->takeProduced();
  EXPECT_EQ(messages(produced), std::vector<std::string>{"one"});
  ASSERT_EQ(produced.transactions.size(), 1u);
  EXPECT_EQ(produced.transactions[0].bundleID, "com.example.kite");

  log.write(LogLevel::Default, "two");
  log.write(LogLevel::Error, "three");
  produced = session->takeProduced();
  EXPECT_EQ(messages(produced), (std::vector<std::string>{"two", "three"}));
  EXPECT_TRUE(produced.transactions.empty());

  produced = session->takeProduced();
  EXPECT_TRUE(produced.log.empty());
  EXPECT_TRUE(produced.transactions.empty());
  const auto kept = session->device().log().messages();
  EXPECT_EQ(std::vector<std::string>(kept.end() - 3, kept.end()),
            (std::vector<std::string>{"one", "two", "three"}));
  session->close();
}

}  // namespace
}  // namespace appsync::host
