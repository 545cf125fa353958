// What the coordination service and the registry tell the client about installs: placeholders
// installed, installs completed or cancelled, apps to prioritize. Each event comes on a service
// thread; inside the host daemon the same event may come twice (the coordinator's observer and
// the observer delegate), which the already-cancelled set and the ignored placeholder notice
// make harmless.
#include "client/apps_client.h"
#include "coordination/coordination_support.h"

namespace appsync {

namespace {

// The host framework's code for a transfer given up because its install was cancelled.
constexpr std::int64_t kCancelledRestoreTransferCode = 2;

std::shared_ptr<TRAsset> downloadRequest(const std::string& bundleID) {
  return TRAsset::downloadAssetWithIdentifier(bundleID, std::string(kApplicationDataclass),
                                              std::nullopt);
}

}  // namespace

void AppsClient::promiseDidBeginFulfillmentWithIdentifier(std::uint64_t identifier) {
  logDefault("%s|promiseDidBeginFulfillmentWithIdentifier %lu", identifier);
}

void AppsClient::coordinatorDidInstallPlaceholder(
    const std::shared_ptr<KCAppInstallCoordinator>& coordinator) {
  const std::string bundleID = coordinator->bundleID();
  logDefault("%s|coordinatorDidInstallPlaceholder for %{public}@ with error %{public}@", bundleID,
             coordinator->error());
  icDidInstallPlaceHolderForAppBundle(bundleID);
}

void AppsClient::coordinatorDidCompleteSuccessfully(
    const std::shared_ptr<KCAppInstallCoordinator>& coordinator) {
  const std::string bundleID = coordinator->bundleID();
  const ErrorRef error = coordinator->error();
  logDefault("%s|coordinatorDidCompleteSuccessfully for %{public}@ with error %{public}@", bundleID,
             error);
  changeAssetID(bundleID, std::string(error ? kTodoFailed : kTodoInstalled));
  cleanRestoreStateForIdentifier(bundleID);
}

void AppsClient::coordinatorShouldPrioritize(
    const std::shared_ptr<KCAppInstallCoordinator>& coordinator) {
  const std::string bundleID = coordinator->bundleID();
  if (bundleID.empty()) return;
  logDefault("%s|Prioritize %{public}@", bundleID);
  const std::shared_ptr<TRDeviceService> host = platform_.tr.TRDeviceServiceSharedInstance();
  if (!host->respondsTo(TRDeviceService::Operation::prioritizeAsset)) {
    logError("%s|Cannot prioritize %{public}@ as it's not supported", bundleID);
    return;
  }
  // The completion comes on a host thread and may outlive the client: it holds only the log.
  LogCategory& log = platform_.tr.TRGetLogCategory(kAppSyncLogCategory);
  host->prioritizeAsset(downloadRequest(bundleID), [&log, bundleID](ErrorRef error) {
    pluginLog(log, LogLevel::Default, "%s|Prioritize %{public}@ finished with error %{public}@",
              bundleID, error);
  });
}

void AppsClient::coordinator(const std::shared_ptr<KCAppInstallCoordinator>& coordinator,
                             const ErrorRef& /*canceledWithReason*/, std::uint64_t /*client*/) {
  const std::string bundleID = coordinator->bundleID();
  if (bundleID.empty()) return;
  const std::shared_ptr<TRDeviceService> host = platform_.tr.TRDeviceServiceSharedInstance();
  bool alreadyCancelled = false;
  _accessQueue->sync([&] { alreadyCancelled = !_userCancelledApps.insert(bundleID).second; });
  if (!alreadyCancelled &&
      host->respondsTo(TRDeviceService::Operation::cancelAssetTransferForFailedAsset)) {
    logDefault("%s|Cancelling asset sync for %{public}@", bundleID);
    host->cancelAssetTransferForFailedAsset(downloadRequest(bundleID));
  } else {
    logError(
        "%s|Cannot cancel %{public}@ as it's already cancelled %d OR the call is not supported",
        bundleID, alreadyCancelled ? 1 : 0);
  }
}

void AppsClient::applicationInstallsDidCancel(const ARProxyList& proxies) {
  if (_useInstallCoordinator) {
    logDefault(
        "%s|not handling applicationInstallsDidCancel because install coordination is enabled.");
    return;
  }
  for (const auto& proxy : proxies) {
    if (!proxy || proxy->installType != ARInstallTypeRestore) continue;
    assetTransfer(downloadRequest(proxy->applicationIdentifier), false,
                  makeError(kTRErrorDomain, kCancelledRestoreTransferCode));
  }
}

}  // namespace appsync
