// The promises the coordinated road hands the service: icon, application asset and user data.
#include "client/apps_client.h"
#include "coordination/coordination_support.h"

namespace appsync {

using namespace coordination;

namespace {

void markComplete(KCPromise& promise) {
  promise.setPercentComplete(1.0);
  promise.setComplete(true);
}

}  // namespace

std::shared_ptr<KCPromisedTransferToPath> AppsClient::_createIconPromiseForBundleIdentifier(
    const std::string& bundleID, const std::string& transferPath, std::uint64_t diskSpaceNeeded,
    const std::shared_ptr<KCPlaceholder>& andAddToPlaceHolder, bool forAppInstall) {
  if (!andAddToPlaceHolder) {
    logError("%s|Placeholder to add icon promise is nil for '%{public}@'", bundleID);
    return nullptr;
  }
  std::shared_ptr<KCPromisedTransferToPath> promise = platform_.kc.initPromisedTransferToPath(
      bundleID + "-Icon", kAppSyncCoordinationClient, fileURL(transferPath), diskSpaceNeeded);
  if (!promise) return nullptr;
  markComplete(*promise);

  ErrorRef error;
  if (andAddToPlaceHolder->setIconPromise(promise, &error)) {
    logDefault("%s|Added icon promise to placeholder for '%{public}@'", bundleID);
    return promise;
  }
  logError("%s|Error %{public}@ adding icon promise to placeholder for '%{public}@'", error,
           bundleID);
  promise->cancelForReason(reason(forAppInstall ? kInstallFailedReason : kRestoreFailedReason),
                           kAppSyncCoordinationClient, nullptr);
  return nullptr;
}

std::shared_ptr<KCPromisedTransferToPath> AppsClient::_createAppAssetPromiseForBundleIdentifier(
    const std::string& bundleID, const std::optional<std::string>& atPath,
    const std::shared_ptr<KCAppInstallCoordinator>& andAddToCoordinatinator) {
  if (!andAddToCoordinatinator) return nullptr;
  const std::optional<std::string> transferPath =
      atPath ? std::optional<std::string>(fileURL(*atPath)) : std::nullopt;
  std::shared_ptr<KCPromisedTransferToPath> promise = platform_.kc.initPromisedTransferToPath(
      bundleID + "-Asset", kAppSyncCoordinationClient, transferPath, 0);
  if (!promise) {
    logError("%s|Error creating asset promise for '%{public}@'", bundleID);
    return nullptr;
  }
  ErrorRef error;
  if (andAddToCoordinatinator->setAppAssetPromise(promise, &error)) {
    logDefault("%s|Added app asset promise to coordinator for '%{public}@'", bundleID);
    return promise;
  }
  logError("%s|Error %{public}@ adding app asset promise at %{public}@ to '%{public}@'", error,
           atPath, bundleID);
  logError("%s|Cancelling asset promise for '%{public}@'", bundleID);
  promise->cancelForReason(reason(kInstallFailedReason), kAppSyncCoordinationClient, nullptr);
  return nullptr;
}

std::shared_ptr<KCPromisedOutOfBandTransfer> AppsClient::_userDataPromiseForBundleIdentifier(
    const std::string& bundleID) {
  std::shared_ptr<KCPromisedOutOfBandTransfer> promise = platform_.kc.initPromisedOutOfBandTransfer(
      bundleID + "-UserData", kAppSyncCoordinationClient, 0);
  if (promise) markComplete(*promise);
  return promise;
}

}  // namespace appsync
