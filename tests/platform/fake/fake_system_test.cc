// The fake system facilities: named notifications with state, the notification center, file
// times, the temporary directory and owner/group records.
#include "platform/fake/fake_system.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <atomic>
#include <future>
#include <thread>

#include "runtime/dispatch/clock.h"
#include "runtime/fs/files.h"
#include "support/temp_dir.h"

namespace appsync {
namespace {

constexpr const char* kSyncNotification = "com.vantor.pavilion.trc.wsyncnotify";

class FakeSystemTest : public ::testing::Test {
 protected:
  testing::TempDir root_;
  ManualClock clock_;
  FakeSystemServices system_{root_.path(), clock_};
};

TEST_F(FakeSystemTest, PostsRecordTheStateSetBeforeThem) {
  int token = 0;
  ASSERT_EQ(system_.notifyRegisterCheck(kSyncNotification, &token), 0u);
  int again = 0;
  ASSERT_EQ(system_.notifyRegisterCheck(kSyncNotification, &again), 0u);
  EXPECT_EQ(again, token);

  EXPECT_EQ(system_.notifyPost(kSyncNotification), 0u);  // before any state
  EXPECT_EQ(system_.notifySetState(token, 1), 0u);
  EXPECT_EQ(system_.notifyPost(kSyncNotification), 0u);
  EXPECT_EQ(system_.notifySetState(token, 0), 0u);
  EXPECT_EQ(system_.notifyPost(kSyncNotification), 0u);

  EXPECT_EQ(system_.postCount(kSyncNotification), 3u);
  EXPECT_EQ(system_.statesAtPosts(kSyncNotification),
            (std::vector<std::optional<std::uint64_t>>{std::nullopt, 1u, 0u}));
  EXPECT_EQ(system_.notificationState(kSyncNotification), 0u);
  std::uint64_t state = 7;
  EXPECT_EQ(system_.notifyGetState(token, &state), 0u);
  EXPECT_EQ(state, 0u);
  EXPECT_EQ(system_.notifySetState(token + 100, 1), FakeSystemServices::kNotifyStatusInvalidToken);
  EXPECT_EQ(system_.postCount("other"), 0u);
}

TEST_F(FakeSystemTest, ScriptedNotificationFailures) {
  system_.failOperation("notifyRegisterCheck", makeError(kPOSIXErrorDomain, 1000000));
  int token = -1;
  EXPECT_EQ(system_.notifyRegisterCheck(kSyncNotification, &token), 1000000u);
  EXPECT_EQ(token, -1);
  system_.succeedOperation("notifyRegisterCheck");
  ASSERT_EQ(system_.notifyRegisterCheck(kSyncNotification, &token), 0u);
  system_.failOperation("notifyPost", nullptr, 1);
  EXPECT_EQ(system_.notifyPost(kSyncNotification), 1u);
  EXPECT_EQ(system_.postCount(kSyncNotification), 0u);
  EXPECT_EQ(system_.callCount("notifyPost"), 1u);
}

struct Delivery {
  std::atomic<int> count{0};
  std::thread::id thread;
  std::string name;
  bool hadUserInfo = false;
};

void recordDelivery(void* center, void* observer, const std::string& name, const void* object,
                    const plist::Dict* userInfo) {
  auto* d = static_cast<Delivery*>(observer);
  EXPECT_NE(center, nullptr);
  EXPECT_EQ(object, nullptr);
  d->thread = std::this_thread::get_id();
  d->name = name;
  d->hadUserInfo = userInfo && userInfo->contains("k");
  ++d->count;
}

TEST_F(FakeSystemTest, NotificationCenterDeliveryAndRemoval) {
  Delivery startup, other;
  system_.addNotificationObserver(&startup, recordDelivery,
                                  "com.vantor.trc.TRStartupCompleteNotification");
  system_.addNotificationObserver(&other, recordDelivery, "other");
  const plist::Dict info{{"k", 1}};
  system_.postNotification("com.vantor.trc.TRStartupCompleteNotification", &info);
  EXPECT_EQ(startup.count.load(), 1);  // delivered before postNotification returned
  EXPECT_NE(startup.thread, std::this_thread::get_id());
  EXPECT_EQ(startup.name, "com.vantor.trc.TRStartupCompleteNotification");
  EXPECT_TRUE(startup.hadUserInfo);
  EXPECT_EQ(other.count.load(), 0);

  // A named notification reaches the center too.
  EXPECT_EQ(system_.notifyPost("other"), 0u);
  system_.drain();
  EXPECT_EQ(other.count.load(), 1);

  // Removed while a delivery is held: it never arrives.
  system_.callbackThread().hold();
  std::thread poster(
      [&] { system_.postNotification("com.vantor.trc.TRStartupCompleteNotification"); });
  while (system_.callbackThread().pendingCount() == 0) std::this_thread::yield();
  system_.removeNotificationObserver(&startup, "com.vantor.trc.TRStartupCompleteNotification");
  system_.callbackThread().release();
  poster.join();
  EXPECT_EQ(startup.count.load(), 1);
  system_.removeNotificationObserver(&other, "");
  EXPECT_EQ(system_.notificationObserverCount(), 0u);
}

TEST_F(FakeSystemTest, FilesTemporaryDirectoryOwnershipAndIdentity) {
  const std::string tmp = system_.temporaryDirectory();
  EXPECT_EQ(tmp, root_ / "tmp");
  EXPECT_TRUE(directoryExists(tmp));

  const std::string file = tmp + "/stamp";
  ASSERT_TRUE(writeFileAtomically(file, plist::Bytes{1}));
  struct timespec old[2] = {{1000, 0}, {1000, 0}};
  ASSERT_EQ(::utimensat(AT_FDCWD, file.c_str(), old, 0), 0);
  EXPECT_EQ(system_.setFileTimesToNow(file), 0);
  struct stat st {};
  ASSERT_EQ(::stat(file.c_str(), &st), 0);
  EXPECT_GT(st.st_mtim.tv_sec, 1000);
  EXPECT_EQ(system_.setFileTimesToNow(tmp + "/missing"), ENOENT);
  system_.failOperation("setFileTimesToNow", makeError(kPOSIXErrorDomain, EACCES));
  EXPECT_EQ(system_.setFileTimesToNow(file), EACCES);

  // Accounts that do not exist here are recorded, not applied.
  ErrorRef error;
  EXPECT_TRUE(system_.setOwnerAndGroup(file, "no-such-user-xyz", "no-such-group-xyz", &error));
  EXPECT_EQ(error, nullptr);
  auto recorded = system_.ownership(file);
  ASSERT_TRUE(recorded);
  EXPECT_EQ(recorded->owner, "no-such-user-xyz");
  EXPECT_EQ(recorded->group, "no-such-group-xyz");
  EXPECT_FALSE(recorded->applied);
  system_.failOperation("setOwnerAndGroup", nullptr, 1);
  EXPECT_FALSE(system_.setOwnerAndGroup(file, "mobile", "mobile", &error));
  ASSERT_TRUE(error);
  EXPECT_EQ(error->domain, kPOSIXErrorDomain);
  EXPECT_EQ(system_.ownership(file)->owner, "mobile");

  EXPECT_EQ(system_.mainBundleIdentifier(), "com.vantor.appsync.tests");
  system_.setMainBundleIdentifier("com.vantor.trc");
  EXPECT_EQ(system_.mainBundleIdentifier(), "com.vantor.trc");
  EXPECT_EQ(&system_.clock(), &clock_);
}

}  // namespace
}  // namespace appsync
