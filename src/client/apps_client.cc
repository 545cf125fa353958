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
      todoList_(platform.paths.todoList(), platform.tr),
      restoreStateStore_(platform.paths.restoreState()) {
  _installGroup = std::make_unique<Group>();
  _restorePlaceHoldersWaitGroup = std::make_unique<Group>();
  _outstandingPFTTransfers.clear();
  _placeholdersForRestoringApps.clear();
  _installOperationQueue =
      std::make_unique<OperationQueue>("AppSync install queue", kMaxConcurrentInstalls);
  _backupManager = platform_.sw.newManager();
  _accessQueue = std::make_unique<SerialQueue>(std::string(kAccessQueueLabel));
  _restoreQueue = std::make_unique<SerialQueue>(std::string(kRestoreQueueLabel));

  platform_.ar.addObserver(this);

  {
    auto log = std::make_shared<const OSLogObject>(
        OSLogObject{"com.vantor.appinstallation", "trc.appsync"});
    platform_.transactionLog.initializeWithLog(log);
  }  // the client keeps no reference to the log object

  _finishedWaitingForPlaceHolderInstalls = false;
  _useInstallCoordinator = platform_.kc.coordinationIsEnabled();
  _restoringPlaceholderCount = 0;

  _updatingApps.clear();
  _userCancelledApps.clear();

  insideHostDaemon_ = platform_.system.mainBundleIdentifier() == kHostDaemonBundleIdentifier;
  if (insideHostDaemon_) {
    _finishedWaitingForPlaceHolderInstalls = true;
    platform_.system.addNotificationObserver(this,
                                             &AppsClient::_handleTRCStartupCompletedNotification,
                                             std::string(kHostStartupNotification));
  }
}

AppsClient::~AppsClient() {
  if (!_outstandingPFTTransfers.empty()) {
    logError("%s|%{public}@ getting dealloc'd with %lu outstanding PFT transfers!", *this,
             _outstandingPFTTransfers.size());
  }
  std::set<std::string> pendingPlaceholders;
  _restoreQueue->sync([&] { pendingPlaceholders = _placeholdersForRestoringApps; });
  if (!pendingPlaceholders.empty()) {
    logError(
        "%s|%{public}@ getting dealloc'd with %{public}@pending placeholder install complete "
        "notifications",
        *this, toArray(pendingPlaceholders));
  }
  _outstandingPFTTransfers.clear();
  _uninstalledApps.reset();

  platform_.ar.removeObserver(this);

  if (insideHostDaemon_) {
    platform_.system.removeNotificationObserver(this, std::string(kHostStartupNotification));
    std::lock_guard lock(observerMutex_);
    _appInstallObserver.reset();
  }

  // The coordination service holds the client as an observer of its coordinators.
  platform_.kc.removeObserver(this);

  // Install operations hold the client; none may outlive it.
  _installOperationQueue.reset();
}

std::vector<std::string> AppsClient::supportedDataclasses() {
  return {std::string(kApplicationDataclass)};
}

bool AppsClient::respondsTo(TRClientOperation operation) const {
  // The optional operations this client implements; the others abort when called.
  static const std::set<TRClientOperation> kImplemented = {};
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
  std::lock_guard lock(observerMutex_);
  if (_appInstallObserver) return;
  _appInstallObserver = platform_.kc.initAppInstallObserver(
      std::string(kInstallObserverServiceName), {kAppSyncCoordinationClient}, this);
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
