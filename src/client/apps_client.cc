// The client object's lifecycle: construction, the host's start-up hand-shake, teardown, and
// the small accessors the other concerns share.
#include "client/apps_client.h"

#include <cstdio>

#include "platform/rs.h"

namespace appsync {

namespace {

plist::Array toArray(const std::set<std::string>& items) {
  plist::Array out;
  out.reserve(items.size());
  for (const auto& item : items) out.emplace_back(item);
  return out;
}

}  // namespace

AppsClient::AppsClient(const Platform& platform)
    : platform_(platform),
      insideHostDaemon_(platform.system.mainBundleIdentifier() == kHostDaemonBundleIdentifier),
      todoList_(platform.paths.todoList(), platform.tr),
      restoreStateStore_(platform.paths.restoreState()) {
  _installGroup = std::make_unique<Group>();
  _restorePlaceHoldersWaitGroup = std::make_unique<Group>();
  _placeholdersForRestoringApps.clear();
  _installOperationQueue =
      std::make_unique<OperationQueue>("AppSync install queue", kMaxConcurrentInstalls);
  globalQueue_ =
      std::make_unique<DelayedWorkQueue>("global default queue", platform_.system.clock());
  _backupManager = platform_.sw.newManager();
  _accessQueue = std::make_unique<SerialQueue>(std::string(kAccessQueueLabel));
  _restoreQueue = std::make_unique<SerialQueue>(std::string(kRestoreQueueLabel));

  {
    auto log = std::make_shared<const OSLogObject>(
        OSLogObject{"com.vantor.appinstallation", "trc.appsync"});
    platform_.transactionLog.initializeWithLog(log);
  }  // the client keeps no reference to the log object

  _useInstallCoordinator = platform_.kc.coordinationIsEnabled();
  _restoringPlaceholderCount = 0;
  _updatingApps.clear();
  _userCancelledApps.clear();
  // Inside the host daemon nobody waits for placeholder installs.
  _finishedWaitingForPlaceHolderInstalls = insideHostDaemon_;

  // Registrations come last: from here on callbacks arrive on the services' threads, and each
  // must find every field built.
  platform_.ar.addObserver(this);
  if (insideHostDaemon_) {
    platform_.system.addNotificationObserver(this,
                                             &AppsClient::_handleTRCStartupCompletedNotification,
                                             std::string(kHostStartupNotification));
  }
}

AppsClient::~AppsClient() {
  if (const std::size_t outstanding = _outstandingPFTTransfers.get().size(); outstanding > 0) {
    logError("%s|%{public}@ getting dealloc'd with %lu outstanding PFT transfers!", *this,
             outstanding);
  }
  std::set<std::string> pendingPlaceholders;
  _restoreQueue->sync([&] { pendingPlaceholders = _placeholdersForRestoringApps; });
  if (!pendingPlaceholders.empty()) {
    logError(
        "%s|%{public}@ getting dealloc'd with %{public}@pending placeholder install complete "
        "notifications",
        *this, toArray(pendingPlaceholders));
  }
  _outstandingPFTTransfers.set({});
  _uninstalledApps.reset();

  // Every unregistration below returns only when no callback for the client is running or
  // will run; no client lock is held across them, so a callback in flight may still call in.
  platform_.ar.removeObserver(this);
  if (insideHostDaemon_) {
    platform_.system.removeNotificationObserver(this, std::string(kHostStartupNotification));
    std::shared_ptr<KCAppInstallObserver> observer;
    {
      std::lock_guard lock(observerMutex_);
      observer.swap(_appInstallObserver);
    }
    observer.reset();
  }
  // The coordination service holds the client as an observer of its coordinators.
  platform_.kc.removeObserver(this);

  // Installs hold the client. Retries still waiting are dropped and queued installs that have
  // not started skip their work; both stay as they are for the next sync. Installs already
  // running finish; then the queues go.
  tearingDown_.store(true);
  globalQueue_->stop();
  _installGroup->wait();
  _installOperationQueue.reset();
  globalQueue_.reset();
}

std::vector<std::string> AppsClient::supportedDataclasses() {
  return {std::string(kApplicationDataclass)};
}

bool AppsClient::respondsTo(TRClientOperation operation) const {
  // The optional operations this client implements; the others abort when called.
  static const std::set<TRClientOperation> kImplemented = {
      TRClientOperation::installedAssets,
      TRClientOperation::reconcileSync,
      TRClientOperation::syncEndedWithSuccess,
      TRClientOperation::clearSyncData,
      TRClientOperation::installedAssetMetrics,
      TRClientOperation::vantorIDsForAssets,
      TRClientOperation::accountsForAssets,
      TRClientOperation::disabledAssetTypes,
      TRClientOperation::prepareForBackup,
      TRClientOperation::outstandingAssetTransfers,
      TRClientOperation::assetInstallSucceeded,
      TRClientOperation::assetInstallFailed,
      TRClientOperation::assetTransferSucceeded,
      TRClientOperation::assetTransferUpdatedProgress,
      TRClientOperation::assetTransferEndedWithSuccess,
      TRClientOperation::currentSyncAnchor,
      TRClientOperation::prepareForSyncWithHostAnchor,
      TRClientOperation::reconcileRestoreOfType};
  return kImplemented.count(operation) > 0;
}

void AppsClient::_handleTRCStartupCompletedNotification(void* /*center*/, void* observer,
                                                        const std::string& /*name*/,
                                                        const void* /*object*/,
                                                        const plist::Dict* /*userInfo*/) {
  if (observer == nullptr) return;
  static_cast<AppsClient*>(observer)->setupInstallCoordinatorObserver();
}

void AppsClient::setupInstallCoordinatorObserver() {
  {
    std::lock_guard lock(observerMutex_);
    if (_appInstallObserver || creatingObserver_) return;
    creatingObserver_ = true;
  }
  // Created without the lock: the service may deliver events, which may ask about the
  // observer, before this call returns.
  std::shared_ptr<KCAppInstallObserver> observer = platform_.kc.initAppInstallObserver(
      std::string(kInstallObserverServiceName), {kAppSyncCoordinationClient}, this);
  std::lock_guard lock(observerMutex_);
  _appInstallObserver = std::move(observer);
  creatingObserver_ = false;
}

bool AppsClient::hasInstallCoordinatorObserver() const {
  std::lock_guard lock(observerMutex_);
  return _appInstallObserver != nullptr;
}

bool AppsClient::finishedWaitingForPlaceHolderInstalls() {
  bool finished = false;
  _restoreQueue->sync([&] { finished = _finishedWaitingForPlaceHolderInstalls; });
  return finished;
}

std::uint32_t AppsClient::_getAndResetNumAppInstallsAttempted() {
  std::uint32_t seen = _numAppInstallsAttempted.load(std::memory_order_relaxed);
  while (!_numAppInstallsAttempted.compare_exchange_weak(seen, 0, std::memory_order_relaxed)) {
  }
  return seen;
}

bool AppsClient::_appInstallationAllowed() {
  return platform_.rs.effectiveBoolValueForSetting(RSFeatureAppInstallationAllowed) !=
         RSRestrictedBoolExplicitNo;
}

bool AppsClient::_appRemovalAllowed() {
  return platform_.rs.effectiveBoolValueForSetting(RSFeatureAppRemovalAllowed) !=
         RSRestrictedBoolExplicitNo;
}

std::string AppsClient::describe() const {
  char buf[64];
  std::snprintf(buf, sizeof buf, "<AppsClient: %p>", static_cast<const void*>(this));
  return buf;
}

}  // namespace appsync
