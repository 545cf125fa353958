// The device session: one command at a time holds a device, and a device stays where it was
// made (its saved state names paths under its root).
#include <gtest/gtest.h>

#include <filesystem>
#include <string>

#include "device_session.h"
#include "input_error.h"
#include "support/temp_dir.h"

namespace appsync {
namespace {

TEST(DeviceSessionTest, ASecondHolderIsRefusedUntilTheFirstHasClosed) {
  testing::TempDir dir;
  const auto root = dir.path() / "device";
  host::DeviceSession::create(root, {})->close();
  auto first = host::DeviceSession::open(root);
  try {
    host::DeviceSession::open(root);
    FAIL() << "a second session opened a device in use";
  } catch (const host::DeviceBusy& busy) {
    EXPECT_NE(std::string(busy.what()).find("in use by another appsync-host command"),
              std::string::npos)
        << busy.what();
  }
  first->close();
  first.reset();
  EXPECT_NO_THROW(host::DeviceSession::open(root)->close());
}

TEST(DeviceSessionTest, AMovedDeviceIsRefusedWithWhereItWasMade) {
  testing::TempDir dir;
  const auto made = dir.path() / "made";
  host::DeviceSession::create(made, {})->close();
  const auto moved = dir.path() / "moved";
  std::filesystem::rename(made, moved);
  try {
    host::DeviceSession::open(moved);
    FAIL() << "a moved device was opened";
  } catch (const host::InputError& error) {
    EXPECT_NE(std::string(error.what()).find("was made at " + made.string()), std::string::npos)
        << error.what();
  }
  std::filesystem::rename(moved, made);
  EXPECT_NO_THROW(host::DeviceSession::open(made)->close());
}

}  // namespace
}  // namespace appsync
