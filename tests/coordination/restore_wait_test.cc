// The restore's wait for placeholder installs: announcements, placeholder-installed events and
// cancellations from several threads against a running wait never let the awaited set, the
// count and the group disagree, and nothing is released after the wait has finished.
#include <gtest/gtest.h>

#include <atomic>
#include <random>
#include <string>
#include <thread>
#include <vector>

#include "client/apps_client.h"
#include "platform/fake/fake_platform.h"
#include "runtime/fs/files.h"
#include "support/temp_dir.h"

namespace appsync {
namespace {

// An empty restore list: processing it runs only the wait for what is counted already.
void writeEmptyRestoreList(FakePlatform& device) {
  ASSERT_TRUE(createDirectories(device.paths().restoreListDirectory()));
  ASSERT_TRUE(
      writePlistAtomically(device.paths().restoreList(), plist::Dict{}, plist::Format::Binary));
}

TEST(RestoreWait, ConcurrentEventsAgainstARunningWaitKeepSetCountAndGroupInStep) {
  constexpr int kRounds = 40;
  constexpr int kThreads = 4;
  constexpr int kEventsPerThread = 60;
  testing::TempDir root;
  FakePlatform device(root.path());
  ManualClock& clock = *device.manualClock();
  std::vector<std::string> apps;
  for (int i = 0; i < 6; ++i) apps.push_back("com.example.restore" + std::to_string(i));

  for (int round = 0; round < kRounds; ++round) {
    SCOPED_TRACE(round);
    AppsClient client(device.platform());
    // Some apps are counted before the wait starts, so that it has something to wait for.
    for (std::size_t i = 0; i < apps.size(); i += 2) {
      client.dataMigratorSetPlaceHolderPromiseForRestoreAppBundle(apps[i]);
    }
    writeEmptyRestoreList(device);
    std::atomic<bool> waited{false};
    std::thread wait([&] {
      client._processCaravelRestoreInfo();
      waited = true;
    });

    std::atomic<bool> inconsistent{false};
    std::vector<std::thread> events;
    for (int t = 0; t < kThreads; ++t) {
      events.emplace_back([&, seed = round * kThreads + t] {
        std::mt19937 random(seed);
        for (int e = 0; e < kEventsPerThread; ++e) {
          const std::string& app = apps[random() % apps.size()];
          switch (random() % 3) {
            case 0:
              client.dataMigratorSetPlaceHolderPromiseForRestoreAppBundle(app);
              break;
            case 1:
              client.icDidInstallPlaceHolderForAppBundle(app);
              break;
            default:
              client.dataMigratorCancelledCoordinatorForRestoreAppBundle(app);
              break;
          }
          if (!client.restoreWaitIsConsistent()) inconsistent = true;
        }
      });
    }
    for (auto& thread : events) thread.join();
    // Whatever is still counted is waited for until the bound: time moves until the wait ends.
    while (!waited) {
      clock.advance(std::chrono::seconds(5));
      std::this_thread::yield();
    }
    wait.join();
    EXPECT_FALSE(inconsistent);
    EXPECT_TRUE(client.finishedWaitingForPlaceHolderInstalls());

    // After the wait, placeholder-installed events release nothing; cancellations still do.
    const std::int64_t counted = client.restoringPlaceholderCount();
    for (const auto& app : apps) client.icDidInstallPlaceHolderForAppBundle(app);
    EXPECT_EQ(client.restoringPlaceholderCount(), counted);
    for (const auto& app : apps) client.dataMigratorCancelledCoordinatorForRestoreAppBundle(app);
    EXPECT_EQ(client.restoringPlaceholderCount(), 0);
    EXPECT_TRUE(client.restoreWaitIsConsistent());
  }
}

}  // namespace
}  // namespace appsync
