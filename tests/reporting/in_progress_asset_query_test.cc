// The in-progress query's meeting with the registry's thread: a report before the wait, a
// second report, the bounded wait, and the sorting rows the scenarios do not reach.
#include "reporting/in_progress_asset_query.h"

#include <gtest/gtest.h>

#include <thread>

#include "platform/fake/fake_platform.h"
#include "support/temp_dir.h"

namespace appsync {
namespace {

using testing::TempDir;

std::shared_ptr<const ARApplicationProxy> installing(std::string id, std::uint64_t type,
                                                     std::uint64_t state, std::uint64_t phase) {
  auto proxy = std::make_shared<ARApplicationProxy>();
  proxy->applicationIdentifier = std::move(id);
  proxy->isPlaceholder = true;
  proxy->installType = type;
  proxy->installProgressSync = std::make_shared<ARInstallProgress>(proxy->applicationIdentifier);
  proxy->installProgressSync->setInstallState(state);
  proxy->installProgressSync->setInstallPhase(phase);
  return proxy;
}

TEST(InProgressAssetQuery, KeepsTheFirstReportEvenWhenItCameBeforeTheWait) {
  TempDir root;
  FakePlatform device(root.path());
  InProgressAssetQuery query(device.platform());
  query.applicationInstallsArePrioritized(
      {installing("a", ARInstallTypeSync, ARInstallStateActive, ARInstallPhaseInstalling),
       installing("r", ARInstallTypeRestore, ARInstallStateActive, ARInstallPhaseInstalling),
       installing("n", ARInstallTypeSync, ARInstallStateActive, ARInstallPhaseLoading),
       installing("d", ARInstallTypeRestore, ARInstallStateActive, ARInstallPhaseRestoringData),
       installing("p", ARInstallTypeRestore, ARInstallStatePaused, ARInstallPhaseLoading),
       installing("u", 9, 6, 4)},
      {});
  query.applicationInstallsArePrioritized(
      {installing("late", ARInstallTypeSync, ARInstallStateActive, ARInstallPhaseInstalling)}, {});

  EXPECT_TRUE(query._fetchResults());  // at once: the clock never moves
  EXPECT_EQ(query._inProgressAssetIDs(), std::vector<std::string>{"a"});
  EXPECT_EQ(query._restoringAssetIDs(), std::vector<std::string>{"r"});
  const MemoryLogSink& log = device.log();
  EXPECT_TRUE(
      log.contains("com.vantor.trc.AppSync|Got install type=Unknown Install Type: 9 "
                   "state=Unknown Install State: 6 phase=Unknown Install Phase: 4 for u"));
  std::size_t reports = 0;
  for (const auto& line : log.lines()) {
    if (line.category == 14 && line.message.find("|prioritized proxies (") != std::string::npos) {
      ++reports;
    }
  }
  EXPECT_EQ(reports, 2u);

  // The second report did not signal again: the next wait runs into its bound.
  bool received = true;
  std::thread waiter([&] { received = query._fetchResults(std::chrono::seconds(5)); });
  device.manualClock()->waitForWaiters(1);
  device.manualClock()->advance(std::chrono::seconds(5));
  waiter.join();
  EXPECT_FALSE(received);
}

TEST(InProgressAssetQuery, GivesNothingWhenTheRegistryDoesNotAnswerInTime) {
  TempDir root;
  FakePlatform device(root.path());
  device.ar().callbackThread().hold();
  std::optional<std::vector<std::string>> inProgress{{"stale"}}, restoring{{"stale"}};
  std::thread caller([&] {
    InProgressAssetQuery::currentInProgressAssetIDs(device.platform(), &inProgress, &restoring);
  });
  device.manualClock()->waitForWaiters(1);
  device.manualClock()->advance(kInProgressQueryWaitBound - std::chrono::nanoseconds(1));
  device.manualClock()->waitForDueWaiters();
  EXPECT_EQ(device.manualClock()->waiterCount(), 1u);  // still waiting just before the bound
  device.manualClock()->advance(std::chrono::nanoseconds(1));
  caller.join();
  device.ar().callbackThread().release();
  device.ar().drain();

  EXPECT_FALSE(inProgress);
  EXPECT_FALSE(restoring);
  EXPECT_EQ(device.ar().observerCount(), 0u);
  for (const auto& line : device.log().lines()) {
    if (line.message == "com.vantor.trc.AppSync|Query for in progress assets timed out") {
      EXPECT_EQ(line.level, LogLevel::Error);
      return;
    }
  }
  ADD_FAILURE() << "no time-out message";
}

}  // namespace
}  // namespace appsync
