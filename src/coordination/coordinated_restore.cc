// Restoring an application through a restoring coordinator: its user data promised as already
// delivered, a placeholder handed over and counted for the restore's wait, and the package left
// to the store daemon. A demoted app gets a coordinator of its own kind and its package is left
// alone entirely.
#include "client/apps_client.h"
#include "coordination/coordination_support.h"
#include "restore/placeholder_info.h"
#include "runtime/plist/codec.h"

namespace appsync {

using namespace coordination;

namespace {

// Transaction-log step of one application's restore.
constexpr std::uint64_t kRestoreStep = 2;

// One application's restore: what it obtained from the service, the most recent error any of
// its calls reported, and what a failure gives back. Each step logs its outcome; false ends the
// run.
class RestoreRun {
 public:
  RestoreRun(AppsClient& client, const Platform& platform, const std::string& bundleID)
      : client_(client),
        platform_(platform),
        log_(platform.tr.TRGetLogCategory(kAppSyncLogCategory)),
        bundleID_(bundleID) {}

  bool parse(const plist::Bytes& caravelMetadata) {
    ErrorRef error;
    metadata_ = parseStoreMetadata(caravelMetadata, &error);
    if (metadata_) return true;
    noteError(error);
    logError("%s|failed to parse caravel metadata for '%{public}@'. err=%{public}@", bundleID_,
             error);
    return false;
  }

  // Whoever made an existing coordinator of the kind, it is used.
  bool obtainCoordinator(KCCoordinatorKind kind) {
    ErrorRef error;
    bool created = false;  // received, not consulted: an existing coordinator serves as well
    coordinator_ = platform_.kc.coordinatorForAppWithBundleID(
        kind, bundleID_, kAppSyncCoordinationClient, true, &created, &error);
    noteError(error);
    if (coordinator_) return true;
    logError("%s|Error %{public}@ creating restore coordinator for %{public}@", error, bundleID_);
    return false;
  }
  KCAppInstallCoordinator& coordinator() { return *coordinator_; }

  // A user-data promise that cannot be made is no failure: the coordinator goes without one.
  bool promiseUserData() {
    if (coordinator_->hasUserDataPromise()) {
      logDefault("%s|Coordinator for %{public}@ has a valid user data promise", bundleID_);
      return true;
    }
    std::shared_ptr<KCPromisedOutOfBandTransfer> promise =
        client_._userDataPromiseForBundleIdentifier(bundleID_);
    if (!promise) return true;
    ErrorRef error;
    if (!coordinator_->setUserDataPromise(promise, &error)) {
      noteError(error);
      logError("%s|Error %{public}@ adding out of band data promise for '%{public}@'", error,
               bundleID_);
      return false;
    }
    logDefault("%s|Added out of band user data promise for for %{public}@", bundleID_);
    return true;
  }

  // True when the coordinator already holds a placeholder; that one is not counted for the wait.
  bool hasPlaceholder() {
    if (!coordinator_->hasPlaceholderPromise()) return false;
    logDefault("%s|Coordinator for %{public}@ has a valid placeholder promise", bundleID_);
    return true;
  }

  bool handOverPlaceholder(const std::optional<plist::Bytes>& sinfData,
                           const std::optional<plist::Bytes>& iconData,
                           std::uint64_t demotionStatus) {
    placeholder_ = client_._placeHolderForBundleIdentifier(bundleID_, *metadata_, sinfData,
                                                           iconData, demotionStatus);
    if (!placeholder_) return false;
    // Counted before the hand-over: the service may install the placeholder, and say so, before
    // the hand-over returns. A refused hand-over is withdrawn with the rest in giveBack().
    client_.dataMigratorSetPlaceHolderPromiseForRestoreAppBundle(bundleID_);
    ErrorRef error;
    if (!coordinator_->setPlaceholderPromise(placeholder_, &error)) {
      noteError(error);
      logError("%s|Error %{public}@ setting placeholder promise for '%{public}@'", error,
               bundleID_);
      return false;
    }
    placeholder_.reset();  // the coordinator's now: cancelled with it, not on its own
    logDefault("%s|added placeholder promise for %{public}@", bundleID_);
    return true;
  }

  void noteError(const ErrorRef& error) {
    if (error) lastError_ = error;
  }
  const ErrorRef& lastError() const { return lastError_; }

  // After a failure: cancels the coordinator and a placeholder not handed over, and releases
  // the app's count for the wait (nothing when it has none).
  void giveBack() {
    const ErrorRef cancelReason = reason(kRestoreFailedReason);
    if (coordinator_) {
      logDefault("%s|Cancelling coordinator for appBundleIdentifier:%{public}@", bundleID_);
      coordinator_->cancelForReason(cancelReason, kAppSyncCoordinationClient, nullptr);
    }
    if (placeholder_) {
      logDefault("%s|Cancelling placeholder for appBundleIdentifier:%{public}@", bundleID_);
      placeholder_->cancelForReason(cancelReason, kAppSyncCoordinationClient, nullptr);
    }
    client_.dataMigratorCancelledCoordinatorForRestoreAppBundle(bundleID_);
  }

 private:
  template <typename... Args>
  void logDefault(std::string_view format, const Args&... args) const {
    pluginLog(log_, LogLevel::Default, format, args...);
  }
  template <typename... Args>
  void logError(std::string_view format, const Args&... args) const {
    pluginLog(log_, LogLevel::Error, format, args...);
  }

  AppsClient& client_;
  const Platform& platform_;
  const LogCategory& log_;
  const std::string& bundleID_;
  std::optional<plist::Dict> metadata_;
  std::shared_ptr<KCAppInstallCoordinator> coordinator_;
  std::shared_ptr<KCPlaceholder> placeholder_;  // made by this run and not handed over
  ErrorRef lastError_;
};

}  // namespace

bool AppsClient::prepareAppForRestoreUsingCoordination(const std::string& bundleID,
                                                       const plist::Bytes& caravelMetadata,
                                                       const std::optional<plist::Bytes>& sinfData,
                                                       const std::optional<plist::Bytes>& iconData,
                                                       std::uint64_t demotionStatus) {
  if (demotionStatus != 0) {
    return _prepareDemotedAppForRestoreWithBundleId(bundleID, caravelMetadata, sinfData, iconData,
                                                    demotionStatus);
  }
  return _prepareNonDemotedAppForRestoreWithBundleId(bundleID, caravelMetadata, sinfData, iconData);
}

bool AppsClient::_prepareDemotedAppForRestoreWithBundleId(
    const std::string& bundleID, const plist::Bytes& caravelMetadata,
    const std::optional<plist::Bytes>& sinfData, const std::optional<plist::Bytes>& iconData,
    std::uint64_t demotionStatus) {
  logDefault("%s|processing app restore for demoted bundle '%{public}@' with install coordination",
             bundleID);
  beginStep(platform_, kRestoreStep, bundleID, "Restore demoted app");
  RestoreRun run(*this, platform_, bundleID);
  auto prepare = [&] {
    if (!run.parse(caravelMetadata) ||
        !run.obtainCoordinator(KCCoordinatorKind::RestoringDemoted)) {
      return false;
    }
    run.coordinator().setObserver(this);
    // The asset promise is not the client's business for a demoted app.
    return run.promiseUserData() &&
           (run.hasPlaceholder() || run.handOverPlaceholder(sinfData, iconData, demotionStatus));
  };
  const bool result = prepare();

  logDefault(
      "%s|processing app restore for demoted app %{public}@ finished with status %d error "
      "%{public}@",
      bundleID, result, run.lastError());
  endStep(platform_, kRestoreStep, result, bundleID, "Restore demoted app");
  if (!result) run.giveBack();
  return result;
}

bool AppsClient::_prepareNonDemotedAppForRestoreWithBundleId(
    const std::string& bundleID, const plist::Bytes& caravelMetadata,
    const std::optional<plist::Bytes>& sinfData, const std::optional<plist::Bytes>& iconData) {
  logDefault(
      "%s|processing app restore for non demoted bundle '%{public}@' with install coordination",
      bundleID);
  beginStep(platform_, kRestoreStep, bundleID, "Restore app");
  RestoreRun run(*this, platform_, bundleID);
  bool storeDaemonHasIt = false;
  auto prepare = [&] {
    if (!run.parse(caravelMetadata) || !run.obtainCoordinator(KCCoordinatorKind::Restoring)) {
      return false;
    }
    KCAppInstallCoordinator& coordinator = run.coordinator();
    if (coordinator.appAssetPromiseResponsibleClientWithError(nullptr) == KCClientBazaar) {
      logDefault("%s|App asset DRI for %{public}@ is set to %lu - nothing more for trc to do",
                 bundleID, KCClientBazaar);
      storeDaemonHasIt = true;
      return true;
    }
    coordinator.setObserver(this);
    if (!run.promiseUserData()) return false;
    if (!run.hasPlaceholder() && !run.handOverPlaceholder(sinfData, iconData, 0)) return false;
    ErrorRef error;
    if (!coordinator.setAppAssetPromiseResponsibleClient(KCClientBazaar, &error)) {
      run.noteError(error);
      logError(
          "%s|Error %{public}@ setting KCClientBazaar to satisfy app data promise for "
          "'%{public}@'",
          error, bundleID);
      return false;
    }
    logDefault("%s|set KCClientBazaar to satisfy app asset promise for %{public}@", bundleID);
    return true;
  };
  const bool result = prepare();

  // A coordinator whose package is already the store daemon's is left entirely alone.
  if (storeDaemonHasIt) {
    endStep(platform_, kRestoreStep, true, bundleID, "Restore app");
    return true;
  }
  logDefault("%s|processing app restore for %{public}@ finished with status %d error %{public}@",
             bundleID, result, run.lastError());
  endStep(platform_, kRestoreStep, result, bundleID, "Restore app");
  if (!result) run.giveBack();
  return result;
}

}  // namespace appsync
