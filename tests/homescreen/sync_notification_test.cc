// The sync notification the home screen reads, and the hand-off of the host's icon layout.
#include <gtest/gtest.h>

#include <filesystem>
#include <string>
#include <vector>

#include "client/apps_client.h"
#include "platform/fake/fake_platform.h"
#include "runtime/fs/files.h"
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

TEST(SyncNotificationTest, StateIsSetBeforeEachPostAndARegistrationFailureIsLogged) {
  using States = std::vector<std::optional<std::uint64_t>>;
  const std::string start = "com.vantor.trc.AppSync|Notifying PV we are starting syncing",
                    done = "com.vantor.trc.AppSync|Notifying PV we are done syncing",
                    failed = "com.vantor.trc.AppSync|Uh Oh...can't send notification to PV:1000000";
  const auto [ok, error] = std::pair{LogLevel::Default, LogLevel::Error};
  for (bool registrationFails : {false, true}) {
    SCOPED_TRACE(registrationFails ? "registration fails" : "registered");
    testing::TempDir root;
    FakePlatform device(root.path());
    if (registrationFails) {
      device.system().failOperation("notifyRegisterCheck", makeError("NotifyError", 1000000));
    }
    AppsClient::_notifyPavilion(device.platform(), true);
    AppsClient::_notifyPavilion(device.platform(), false);

    EXPECT_EQ(device.system().statesAtPosts(kSyncNotification),
              (registrationFails ? States{} : States{1u, 0u}));
    EXPECT_EQ(device.system().callCount("notifySetState"), registrationFails ? 0u : 2u);
    EXPECT_EQ(device.log().messages(),
              (registrationFails ? std::vector<std::string>{start, failed, done, failed}
                                 : std::vector<std::string>{start, done}));
    EXPECT_EQ(levelsOf(device.log()),
              (registrationFails ? Levels{ok, error, ok, error} : Levels{ok, ok}));
  }
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
