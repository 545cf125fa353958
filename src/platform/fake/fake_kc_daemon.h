// The service side of the fake install coordination, what the daemon does on a device: it holds
// the coordinators and observer registrations, is what the service's objects report to, and
// installs placeholders and packages and delivers events on its own thread.
// FakeKCInstallCoordination is its face to clients and tests.
#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "runtime/error.h"
#include "runtime/guarded.h"
#include "platform/fake/callback_thread.h"
#include "platform/fake/fake_kc_history.h"
#include "platform/fake/fake_kc_objects.h"
#include "platform/kc.h"

namespace appsync {

class FakeARWorkspace;
class FakeKCInstallCoordination;

class FakeKCDaemon final : public FakeKCServiceHooks,
                           public std::enable_shared_from_this<FakeKCDaemon> {
 public:
  using Coordinator = FakeKCAppInstallCoordinator;
  using CoordinatorRef = std::shared_ptr<Coordinator>;
  using DelegateCall = std::function<void(KCAppInstallObserverDelegate&)>;

  // The daemon's own steps, scriptable like the service's operations.
  static constexpr std::string_view kInstallPlaceholderOp = "installPlaceholder";
  static constexpr std::string_view kInstallPackageOp = "installPackage";

  // `owner` counts the calls; `registry` receives the placeholders and applications.
  FakeKCDaemon(FakeKCInstallCoordination& owner, FakeARWorkspace& registry);
  ~FakeKCDaemon();

  // Stops counting calls and delivering anything; work still queued is dropped.
  void shutdown();

  std::weak_ptr<FakeKCServiceHooks> hooks() { return weak_from_this(); }

  // --- FakeKCServiceHooks ---
  ErrorRef scriptedFailure(std::string_view operation) override;
  void coordinatorChanged(const CoordinatorRef& c) override;
  void coordinatorCancelled(const CoordinatorRef& c, const ErrorRef& reason,
                            std::uint64_t client) override;
  void observerReplaced() override;
  void registrationGone(const FakeKCAppInstallObserver* registration) override;

  // --- Bookkeeping ---
  bool enabled() const { return enabled_.get(); }
  void setEnabled(bool enabled) { enabled_.set(enabled); }
  // The existing coordinator (kind permitting) or a new one; see coordinatorForAppWithBundleID.
  CoordinatorRef findOrCreate(KCCoordinatorKind kind, const std::string& bundleID,
                              std::uint64_t clientID, bool create, bool* created, ErrorRef* error);
  CoordinatorRef put(KCCoordinatorKind kind, const std::string& bundleID, std::uint64_t creator);
  CoordinatorRef find(const std::string& bundleID) const;
  std::vector<CoordinatorRef> all() const;
  // The last outcome of a finished coordinator of `bundleID`; see CoordinatorHistory.
  std::optional<FinishedCoordinator> finished(const std::string& bundleID) const;
  // Every kept outcome, oldest first.
  std::vector<FinishedCoordinator> allFinished() const;
  std::uint64_t nextPromiseIdentifier();
  void addRegistration(const FakeKCAppInstallObserver* registration);
  void removeObserverEverywhere(const KCAppInstallObserverDelegate* observer);

  // --- Placeholder installs kept back ---
  // While held, a coordinator of `bundleID` keeps its placeholder uninstalled (and so its
  // package), however ready; releasing has it re-examined. Release is false when not held.
  void holdPlaceholderInstall(const std::string& bundleID);
  bool releasePlaceholderInstall(const std::string& bundleID);

  // --- Saved state ---
  // The identifier the next promise will get.
  std::uint64_t upcomingPromiseIdentifier() const;
  // Replaces the coordinators and the next promise identifier with loaded ones, then has each
  // re-examined: whatever was still to do when the state was saved gets done.
  void replaceState(std::vector<CoordinatorRef> coordinators, std::uint64_t nextPromiseIdentifier,
                    std::vector<FinishedCoordinator> finished);

  // --- The event thread ---
  void post(std::function<void()> work);
  void drain();
  void hold();
  void release();
  bool isHeld() const;
  // Calls `call` on the coordinator's observer, then on the delegates registered for its
  // creator. Runs on the event thread, with no lock held during the calls.
  void deliver(const Coordinator& c, const DelegateCall& call);

  // --- Installs, on the event thread ---
  // Removes the application from the registry; the error for the uninstall completion.
  ErrorRef uninstall(const std::string& bundleID);

 private:
  CoordinatorRef makeLocked(KCCoordinatorKind kind, const std::string& bundleID,
                            std::uint64_t creator);
  // Forgets `c`, which has just completed (no `cancellingClient`) or been cancelled, and
  // records its outcome.
  void retire(const CoordinatorRef& c, std::optional<std::uint64_t> cancellingClient);
  bool stopped() const;
  bool placeholderInstallHeld(const std::string& bundleID) const;
  std::shared_ptr<CallbackThread> thread() const;
  // Returns once no delivery that may have read an old observer is running. Inside a delivery
  // the running one is the caller's own.
  void waitForRunningDelivery();

  // Moves the coordinator as far as its promises allow: placeholder, then package.
  void evaluate(const CoordinatorRef& c);
  void putPlaceholderRecord(Coordinator& c, const FakeKCPlaceholder& placeholder);
  void reportCancellation(const CoordinatorRef& c, const ErrorRef& reason, std::uint64_t client);

  FakeARWorkspace& registry_;
  static thread_local const FakeKCDaemon* current_;  // the daemon whose item this thread runs
  Guarded<bool> enabled_{true};

  mutable std::mutex mutex_;
  FakeKCInstallCoordination* owner_;  // null once shut down
  bool stopped_ = false;
  std::map<std::string, CoordinatorRef> coordinators_;
  CoordinatorHistory history_;
  std::vector<std::weak_ptr<Coordinator>> made_;  // every coordinator still alive
  std::vector<const FakeKCAppInstallObserver*> registrations_;
  std::uint64_t nextPromiseIdentifier_ = 1;
  std::set<std::string> heldPlaceholderInstalls_;
  std::shared_ptr<CallbackThread> events_;
};

}  // namespace appsync
