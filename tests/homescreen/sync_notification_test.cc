// The sync notification the home screen reads, and the hand-off of the host's icon layout.
#include <gtest/gtest.h>

#include <filesystem>
#include <string>
#include <vector>

#include "client/apps_client.h"
#include "runtime/fs/files.h"
#include "platform/fake/fake_platform.h"
#include "support/temp_dir.h"

namespace appsync {
namespace {

constexpr const char* kSyncNotification = "com.vantor.pavilion.trc.wsyncnotify";

using Levels = std::vector<LogLevel>;

Levels levelsOf(MemoryLogSink& log) {
  Levels levels;
  for (const auto& line : log.lines()) {
    EXPECT_EQ(line.category, 8) << line.message;
    levels.push_back(line.level);
  }
  return levels;
}

TEST(SyncNotificationTest, StateIsSetBeforeEachPost) {
  testing::TempDir root;
  FakePlatform device(root.path());
  AppsClient::_notifyPavilion(device.platform(), true);
  AppsClient::_notifyPavilion(device.platform(), false);

  EXPECT_EQ(device.system().notificationState(kSyncNotification), 0u);
  EXPECT_EQ(device.system().postCount(kSyncNotification), 2u);
  EXPECT_EQ(device.system().statesAtPosts(kSyncNotification),
            (std::vector<std::optional<std::uint64_t>>{1u, 0u}));
  EXPECT_EQ(device.log().messages(),
            (std::vector<std::string>{"com.vantor.trc.AppSync|Notifying PV we are starting syncing",
                                      "com.vantor.trc.AppSync|Notifying PV we are done syncing"}));
  EXPECT_EQ(levelsOf(device.log()), (Levels{LogLevel::Default, LogLevel::Default}));
}

TEST(SyncNotificationTest, RegistrationFailureLogsTheStatusAndPostsNothing) {
  testing::TempDir root;
  FakePlatform device(root.path());
  device.system().failOperation("notifyRegisterCheck", makeError("NotifyError", 1000000));
  AppsClient::_notifyPavilion(device.platform(), true);

  EXPECT_EQ(device.system().postCount(kSyncNotification), 0u);
  EXPECT_EQ(device.system().callCount("notifySetState"), 0u);
  EXPECT_FALSE(device.system().notificationState(kSyncNotification));
  EXPECT_EQ(device.log().messages(),
            (std::vector<std::string>{
                "com.vantor.trc.AppSync|Notifying PV we are starting syncing",
                "com.vantor.trc.AppSync|Uh Oh...can't send notification to PV:1000000"}));
  EXPECT_EQ(levelsOf(device.log()), (Levels{LogLevel::Default, LogLevel::Error}));
}

TEST(IconLayoutTest, HandsOverTheLayoutByteExactUnlessMissingOrEmpty) {
  struct Case {
    const char* name;
    std::optional<plist::Bytes> file;  // absent: no layout file
  };
  // Arbitrary bytes, NUL and high bytes included: the layout is never interpreted.
  const plist::Bytes layout = {'b', 'p', 'l', 'i', 's', 't', 0, 0xff, 0x80, '\n', 0};
  for (const Case& c : std::initializer_list<Case>{
           {"missing", std::nullopt}, {"empty", plist::Bytes{}}, {"layout", layout}}) {
    SCOPED_TRACE(c.name);
    testing::TempDir root;
    FakePlatform device(root.path());
    const std::string path = device.paths().iconLayout();
    ASSERT_TRUE(createDirectories(device.paths().syncFolder()));
    if (c.file) {
      ASSERT_TRUE(writeFileAtomically(path, *c.file));
    }

    AppsClient::_sendIconLayoutToPavilion(device.platform());

    if (c.file && !c.file->empty()) {
      EXPECT_EQ(device.pv().setIconStateCount(), 1u);
      EXPECT_EQ(device.pv().lastIconState(), *c.file);
      EXPECT_EQ(device.log().messages(),
                std::vector<std::string>{"com.vantor.trc.AppSync|Sending iconlayout to PV"});
      EXPECT_EQ(levelsOf(device.log()), Levels{LogLevel::Default});
    } else {
      EXPECT_EQ(device.pv().setIconStateCount(), 0u);
      EXPECT_TRUE(device.log().messages().empty());
    }
    // The layout stays where the host put it.
    EXPECT_EQ(readFile(path), c.file);
  }
}

}  // namespace
}  // namespace appsync
