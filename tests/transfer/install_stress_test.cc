// A thousand legacy transfers reported by the host, each installed with its own random script
// of assertion denials, assertion outcome, install failure and restore flag: every app ends as
// its script says and nothing is lost between the host thread, the ten install threads, the
// retries, the registry's callbacks and the todo list.
#include <gtest/gtest.h>

#include <condition_variable>
#include <filesystem>
#include <map>
#include <memory>
#include <mutex>
#include <ostream>
#include <random>
#include <string>
#include <string_view>
#include <vector>

#include "client/apps_client.h"
#include "platform/ar_wrapper.h"
#include "platform/bundle_keys.h"
#include "platform/fake/fake_platform.h"
#include "runtime/fs/files.h"
#include "runtime/plist/codec.h"
#include "state/todo_list.h"
#include "support/temp_dir.h"
#include "transfer/install_fixture.h"

namespace appsync {
namespace {

// Package installs of the apps named in `failures` report their error without reaching the
// registry; every package install is counted per app.
class FailingAppsRegistry final : public ARApplicationWorkspaceWrapper {
 public:
  FailingAppsRegistry(ARApplicationWorkspace& target, std::map<std::string, ErrorRef> failures)
      : ARApplicationWorkspaceWrapper(target), failures_(std::move(failures)) {}
  using ARApplicationWorkspaceWrapper::installApplication;

  bool installApplication(const std::string& path, const plist::Dict& options,
                          ErrorRef* error) override {
    const std::string* identifier = plist::stringAt(options, kBNBundleIdentifierKey);
    const std::string app = identifier ? *identifier : std::string();
    {
      std::lock_guard lock(mutex_);
      ++calls_[app];
    }
    if (auto failure = failures_.find(app); failure != failures_.end()) {
      if (error) *error = failure->second;
      return false;
    }
    return target().installApplication(path, options, error);
  }
  std::map<std::string, std::size_t> calls() const {
    std::lock_guard lock(mutex_);
    return calls_;
  }

 private:
  const std::map<std::string, ErrorRef> failures_;
  mutable std::mutex mutex_;
  std::map<std::string, std::size_t> calls_;
};

// Follows the queue through the client's log: how many retries were scheduled and re-enqueued,
// and how many installs finished (a denied one finishes once its retry is scheduled).
class InstallQueueActivity final : public LogSink {
 public:
  void write(int, LogLevel, std::string_view message) override {
    const std::string_view text = message.substr(message.find('|') + 1);
    std::lock_guard lock(mutex_);
    if (text.starts_with("Will retry installation of ")) ++scheduled_;
    if (text.starts_with("Re-enqueue installation request for ")) ++reenqueued_;
    if (text.starts_with("Finished install for ")) ++finished_;
    changed_.notify_all();
  }
  std::size_t retriesScheduled() const {
    std::lock_guard lock(mutex_);
    return scheduled_;
  }
  // Blocks until `retries` retries have been re-enqueued and every install enqueued so far
  // (`installs` first ones and the retries) has finished.
  void waitUntilSettled(std::size_t installs, std::size_t retries) {
    std::unique_lock lock(mutex_);
    changed_.wait(lock, [&] { return reenqueued_ == retries && finished_ == installs + retries; });
  }

 private:
  mutable std::mutex mutex_;
  std::condition_variable changed_;
  std::size_t scheduled_ = 0, reenqueued_ = 0, finished_ = 0;
};

// What an app's script leads to, and what is seen of it afterwards.
struct Ending {
  std::string todoState;
  std::size_t assertionRequests = 0, registryInstalls = 0, uninstalls = 0;
  bool packageLeft = false;
  bool operator==(const Ending&) const = default;
};
std::ostream& operator<<(std::ostream& out, const Ending& e) {
  return out << "{" << e.todoState << ", assertions " << e.assertionRequests << ", installs "
             << e.registryInstalls << ", uninstalls " << e.uninstalls
             << (e.packageLeft ? ", package left}" : "}");
}

TEST(InstallQueueStress, AThousandScriptedInstallsEachEndAsScripted) {
  constexpr std::size_t kApps = 1000;
  constexpr int kMaxDenials = 3;
  constexpr std::int32_t kUnknownOutcome = 7;  // none the home screen defines
  // The host framework calls errors of this code recoverable; installer and registry errors
  // stay final whatever it says.
  constexpr int kTransient = 4;
  struct Failure {
    std::string_view domain;
    int code;
    bool recoverable;
  };
  const Failure failures[] = {{kEMInstallerErrorDomain, kTransient, false},
                              {kAppRegistryErrorDomain, kTransient, false},
                              {kTRErrorDomain, kTransient + 1, false},
                              {kTRErrorDomain, kTransient, true}};

  testing::TempDir root;
  FakePlatform device(root.path());
  auto activity = std::make_shared<InstallQueueActivity>();
  device.tr().logger().setSink(activity);
  device.tr().setRecoverableErrorPredicate(
      [](const ErrorRef& e) { return e && e->code == kTransient; });

  std::mt19937 random(20240917);
  std::vector<std::string> ids;
  std::map<std::string, ErrorRef> registryFailures;
  std::map<std::string, Ending> expected;
  std::map<std::string, bool> restores;
  for (std::size_t i = 0; i < kApps; ++i) {
    const std::string id = "com.example.stress" + std::to_string(i);
    ids.push_back(id);
    const int denials = random() % 2 ? 0 : 1 + static_cast<int>(random() % kMaxDenials);
    const std::uint32_t last = random() % 20;
    const std::int32_t outcome = last < 17   ? kPVSAssertionGranted
                                 : last < 19 ? kPVSAssertionApplicationNotFound
                                             : kUnknownOutcome;
    const std::uint32_t failure = random() % 8;  // below 4 the install succeeds
    const bool restore = random() % 10 == 0;

    std::vector<std::int32_t> outcomes(denials, kPVSAssertionDenied);
    outcomes.push_back(outcome);
    device.pv().scriptAssertionOutcomes(id, outcomes);
    restores[id] = restore;
    bool failed = outcome == kUnknownOutcome, recoverable = false;
    if (!failed && failure >= 4) {
      const Failure& f = failures[failure - 4];
      registryFailures[id] = makeError(f.domain, f.code);
      failed = true;
      recoverable = f.recoverable;
    }
    // A delivered package is "DOWNLOADED" until its install decides.
    const std::string state = !failed                  ? "INSTALLED"
                              : recoverable || restore ? "DOWNLOADED"
                                                       : "FAILED";
    expected[id] = {state, static_cast<std::size_t>(denials) + 1,
                    outcome == kUnknownOutcome ? 0u : 1u, state == "FAILED" ? 1u : 0u, false};
  }
  testing::writeTodoList(device, ids);
  FailingAppsRegistry registry(device.ar(), registryFailures);
  ManualClock& clock = *device.manualClock();

  AppsClient client(device.platform().with(registry));
  // The host thread reports each transfer while the installs of earlier ones run.
  for (const auto& id : ids) {
    auto asset = testing::makeAsset(id, testing::writePackage(root.path(), id), restores[id]);
    asset->setCompletedAssetParts(kTRAssetPartApplication);
    client.assetTransfer(asset, 0.5);
    client.assetTransfer(asset, true, nullptr);
  }
  // Every round of retries is due 30 seconds after the round that scheduled it.
  activity->waitUntilSettled(kApps, 0);
  std::size_t due = 0;
  int rounds = 0;
  while (activity->retriesScheduled() > due) {
    due = activity->retriesScheduled();
    clock.advance(kInstallRetryDelay);
    activity->waitUntilSettled(kApps, due);
    ++rounds;
  }
  client.waitForInstalls();
  EXPECT_EQ(rounds, kMaxDenials);

  const auto bytes = readFile(device.paths().todoList());
  ASSERT_TRUE(bytes);
  const auto todoList = plist::parse(*bytes);
  ASSERT_TRUE(todoList && todoList->array());
  EXPECT_EQ(todoList->array()->size(), kApps);
  const std::map<std::string, std::size_t> registryCalls = registry.calls();
  std::map<std::string, std::size_t> uninstalls;
  for (const auto& call : device.ar().uninstallCalls()) ++uninstalls[call.identifier];
  std::map<std::string, std::size_t> endings;
  std::size_t installs = 0;
  for (const auto& id : ids) {
    const plist::Dict* record = findTodoRecord(*todoList->array(), id);
    const std::string* state = record ? plist::stringAt(*record, kTodoOperationKey) : nullptr;
    const auto calls = registryCalls.find(id);
    const Ending seen{state ? *state : "(no record)", device.pv().assertionRequests(id),
                      calls == registryCalls.end() ? 0 : calls->second, uninstalls[id],
                      std::filesystem::exists(root.path() / "staging" / (id + ".app"))};
    EXPECT_EQ(seen, expected[id]) << id;
    ++endings[expected[id].todoState];
    installs += seen.registryInstalls;
  }
  // The script reaches every ending, and the queue counted every install the registry saw.
  EXPECT_EQ(endings.size(), 3u);
  EXPECT_EQ(client._getAndResetNumAppInstallsAttempted(), installs);
  EXPECT_EQ(device.ar().installCalls().size(), endings["INSTALLED"]);
  EXPECT_EQ(device.pv().liveAssertions(), 0u);
}

}  // namespace
}  // namespace appsync
