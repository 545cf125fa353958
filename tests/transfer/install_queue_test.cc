// The legacy install queue where the stress test and the scenarios do not look: the transactions
// of rarer endings, an unknown app's progress, the concurrency limit and teardown.
#include <gtest/gtest.h>

#include <condition_variable>
#include <filesystem>
#include <memory>
#include <mutex>
#include <thread>

#include "client/apps_client.h"
#include "platform/ar_wrapper.h"
#include "platform/fake/fake_platform.h"
#include "runtime/fs/files.h"
#include "support/temp_dir.h"
#include "transfer/install_fixture.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;
using testing::makeAsset;
using testing::TempDir;
using testing::writePackage;
using testing::writeTodoList;

std::string writeBadPackage(const fs::path& root, const std::string& identifier) {
  const std::string archive = (root / "staging" / (identifier + ".zip")).string();
  EXPECT_TRUE(createDirectories((root / "staging").string()));
  const plist::Bytes garbage{'n', 'o', 't', ' ', 'z', 'i', 'p'};
  EXPECT_TRUE(writeFileAtomically(archive, garbage));
  return archive;
}

std::vector<std::string> scenarioDescriptions(FakePlatform& device) {
  std::vector<std::string> out;
  for (const auto& entry : device.transactionLog().entries()) {
    if (entry.kind == TransactionLogEntry::Kind::Scenario)
      out.push_back(entry.scenario + ": " + entry.description);
  }
  return out;
}

// The stress test covers how each assertion outcome and install failure ends; here are the
// transaction-log entries of the endings no scenario reaches.
TEST(InstallQueue, EndingsTheScenariosDoNotReachLogTheirTransactions) {
  struct Case {
    const char* name;
    std::int32_t outcome;
    bool badPackageOfARestore;
    std::size_t installs;  // registry calls, each an attempt
    std::string todoState;
    std::vector<std::string> scenarios;
  };
  const std::string halvard = "Halvard restore: ";
  // clang-format off
  const Case cases[] = {
      {"not found installs anyway", kPVSAssertionApplicationNotFound, false, 1, "INSTALLED",
       {"Asset install: assertion not found"}},
      {"unknown outcome never installs", 7, false, 0, "FAILED",
       {"Asset install: unknown error grabbing assertion", halvard + "failed to remove placeholder"}},
      {"a restore always recovers", kPVSAssertionGranted, true, 1, "install",
       {"Asset install: assertion succeeded", halvard + "install failed recoverably"}},
  };
  // clang-format on
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    TempDir root;
    FakePlatform device(root.path());
    const std::string id = "com.example.app";
    writeTodoList(device, {id});
    const std::string package =
        c.badPackageOfARestore ? writeBadPackage(root.path(), id) : writePackage(root.path(), id);
    device.pv().scriptAssertionOutcomes(id, {c.outcome});
    AppsClient client(device.platform());
    client._enqueueAssetInstall(makeAsset(id, package, c.badPackageOfARestore));
    client.waitForInstalls();
    EXPECT_EQ(client._operationStateForIdentifier(id), c.todoState);
    EXPECT_EQ(device.ar().installCalls().size(), c.installs);
    EXPECT_EQ(client._getAndResetNumAppInstallsAttempted(), c.installs);
    EXPECT_FALSE(fs::exists(package));
    EXPECT_EQ(device.pv().liveAssertions(), 0u);
    EXPECT_EQ(scenarioDescriptions(device), c.scenarios);
    // A restore keeps its placeholder: no uninstall is asked for.
    EXPECT_EQ(device.ar().uninstallCalls().size(), c.todoState == "FAILED" ? 1u : 0u);
  }
}

// The stress test classifies errors on the legacy road and sync-installs-coordinated shows that
// none is recoverable on the coordinated one; an app the registry does not know has no progress.
TEST(InstallQueue, NoProgressForAnAppTheRegistryDoesNotKnow) {
  TempDir root;
  FakePlatform device(root.path());
  AppsClient client(device.platform());
  EXPECT_EQ(client._progressForAssetIdentifier("com.example.unknown"), nullptr);
}

// Holds every package install until `release`, counting how many run at once.
class GatedRegistry final : public ARApplicationWorkspaceWrapper {
 public:
  using ARApplicationWorkspaceWrapper::ARApplicationWorkspaceWrapper;
  using ARApplicationWorkspaceWrapper::installApplication;

  bool installApplication(const std::string& path, const plist::Dict& options,
                          ErrorRef* error) override {
    {
      std::unique_lock lock(mutex_);
      ++inFlight_;
      peak_ = std::max(peak_, inFlight_);
      changed_.notify_all();
      changed_.wait(lock, [&] { return open_; });
    }
    const bool ok = target().installApplication(path, options, error);
    std::lock_guard lock(mutex_);
    --inFlight_;
    return ok;
  }
  void waitForInFlight(std::size_t n) {
    std::unique_lock lock(mutex_);
    changed_.wait(lock, [&] { return inFlight_ >= n; });
  }
  void release() {
    std::lock_guard lock(mutex_);
    open_ = true;
    changed_.notify_all();
  }
  std::size_t peak() const {
    std::lock_guard lock(mutex_);
    return peak_;
  }

 private:
  mutable std::mutex mutex_;
  std::condition_variable changed_;
  std::size_t inFlight_ = 0, peak_ = 0;
  bool open_ = false;
};

TEST(InstallQueue, RunsAtMostTenInstallsAndLosesNoTodoChangeWhenTheyFinishTogether) {
  TempDir root;
  FakePlatform device(root.path());
  GatedRegistry registry(device.ar());
  std::vector<std::string> ids;
  for (int i = 0; i < 25; ++i) ids.push_back("com.example.app" + std::to_string(i));
  writeTodoList(device, ids);
  AppsClient client(device.platform().with(registry));
  for (const auto& id : ids) {
    client._enqueueAssetInstall(makeAsset(id, writePackage(root.path(), id)));
  }
  registry.waitForInFlight(kMaxConcurrentInstalls);
  registry.release();
  client.waitForInstalls();
  EXPECT_EQ(registry.peak(), kMaxConcurrentInstalls);
  EXPECT_EQ(client._getAndResetNumAppInstallsAttempted(), ids.size());
  for (const auto& id : ids) EXPECT_EQ(client._operationStateForIdentifier(id), "INSTALLED") << id;
}

TEST(InstallQueue, TeardownFinishesRunningInstallsAndLeavesAWaitingRetryForTheNextSync) {
  TempDir root;
  FakePlatform device(root.path());
  ManualClock& clock = *device.manualClock();
  GatedRegistry registry(device.ar());
  std::vector<std::string> running;
  for (int i = 0; i < 10; ++i) running.push_back("com.example.app" + std::to_string(i));
  const std::string denied = "com.example.denied";
  std::vector<std::string> all = running;
  all.push_back(denied);
  writeTodoList(device, all);
  const std::string deniedPackage = writePackage(root.path(), denied);
  device.pv().scriptAssertionOutcomes(denied, {1});

  auto client = std::make_unique<AppsClient>(device.platform().with(registry));
  client->_enqueueAssetInstall(makeAsset(denied, deniedPackage));
  clock.waitForWaiters(1);  // the retry waits for its 30 seconds
  for (const auto& id : running) {
    client->_enqueueAssetInstall(makeAsset(id, writePackage(root.path(), id)));
  }
  registry.waitForInFlight(running.size());
  std::thread teardown([&] { client.reset(); });
  registry.release();
  teardown.join();  // without the clock moving: the retry is not waited for

  EXPECT_EQ(device.ar().installCalls().size(), running.size());
  EXPECT_TRUE(fs::exists(deniedPackage));
  AppsClient next(device.platform());
  EXPECT_EQ(next._operationStateForIdentifier(denied), "install");
  for (const auto& id : running) EXPECT_EQ(next._operationStateForIdentifier(id), "INSTALLED");
}

}  // namespace
}  // namespace appsync
