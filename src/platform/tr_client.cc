// The optional operations of the client protocol: calling one that a client does not
// implement is the host's programming error.
#include "platform/tr_client.h"

#include <cstdio>
#include <cstdlib>

namespace appsync {

const char* operationName(TRClientOperation operation) {
  switch (operation) {
    case TRClientOperation::currentSyncAnchor: return "currentSyncAnchor";
    case TRClientOperation::prepareForSyncWithHostAnchor:
      return "prepareForSyncWithHostAnchor:progressCallback:error:";
    case TRClientOperation::prepareForSyncWithHostAnchorHostAuthIdentifierHostVersion:
      return "prepareForSyncWithHostAnchor:hostAuthIdentifier:hostVersion:progressCallback:error:";
    case TRClientOperation::reconcileSync:
      return "reconcileSync:withNewAnchor:progressCallback:error:";
    case TRClientOperation::syncEndedWithSuccess: return "syncEndedWithSuccess:";
    case TRClientOperation::reconcileRestoreOfType: return "reconcileRestoreOfType:withError:";
    case TRClientOperation::reconcileRestoreWithError: return "reconcileRestoreWithError:";
    case TRClientOperation::restoreEndedWithError: return "restoreEndedWithError:";
    case TRClientOperation::cancelSyncOperations: return "cancelSyncOperations";
    case TRClientOperation::registerMessageHandlersWithLink:
      return "registerMessageHandlersWithLink:";
    case TRClientOperation::installedAssets: return "installedAssets";
    case TRClientOperation::outstandingAssetTransfers: return "outstandingAssetTransfers";
    case TRClientOperation::outstandingAssetTransfersWithDownloadManager:
      return "outstandingAssetTransfersWithDownloadManager:";
    case TRClientOperation::assetTransferSucceeded: return "assetTransfer:succeeded:withError:";
    case TRClientOperation::assetTransferUpdatedProgress: return "assetTransfer:updatedProgress:";
    case TRClientOperation::assetTransferEndedWithSuccess: return "assetTransferEndedWithSuccess:";
    case TRClientOperation::assetInstallSucceeded: return "assetInstallSucceeded:";
    case TRClientOperation::assetInstallFailed: return "assetInstallFailed:withError:";
    case TRClientOperation::metadataUpdate: return "metadataUpdate:forAsset:withNewAnchor:";
    case TRClientOperation::prioritizeAsset: return "prioritizeAsset:";
    case TRClientOperation::initiateAssetDownloadsWithCompletion:
      return "initiateAssetDownloadsWithCompletion:";
    case TRClientOperation::clearSyncData: return "clearSyncData";
    case TRClientOperation::installedAssetMetrics: return "installedAssetMetrics";
    case TRClientOperation::vantorIDsForAssets: return "vantorIDsForAssets";
    case TRClientOperation::accountsForAssets: return "accountsForAssets";
    case TRClientOperation::disabledAssetTypes: return "disabledAssetTypes";
    case TRClientOperation::prepareForBackup: return "prepareForBackup";
    case TRClientOperation::backupEnded: return "backupEnded";
    case TRClientOperation::pathsToBackup: return "pathsToBackup:pathsNotToBackup:";
    case TRClientOperation::shouldRestoreFile: return "shouldRestoreFile:backupManager:";
    case TRClientOperation::shouldBackgroundRestorePath:
      return "shouldBackgroundRestorePath:backupManager:";
    case TRClientOperation::shouldBackgroundRestoreFile:
      return "shouldBackgroundRestoreFile:backupManager:";
  }
  return "unknown";
}

void TRClient::notImplemented(TRClientOperation operation) {
  std::fprintf(stderr, "TRClient: %s is not implemented by this client (ask respondsTo first)\n",
               operationName(operation));
  std::abort();
}

using Op = TRClientOperation;

std::string TRClient::currentSyncAnchor() { notImplemented(Op::currentSyncAnchor); }
bool TRClient::prepareForSyncWithHostAnchor(const std::string&, ProgressCallback, ErrorRef*) {
  notImplemented(Op::prepareForSyncWithHostAnchor);
}
bool TRClient::prepareForSyncWithHostAnchor(const std::string&, std::uint32_t, const std::string&,
                                            ProgressCallback, ErrorRef*) {
  notImplemented(Op::prepareForSyncWithHostAnchorHostAuthIdentifierHostVersion);
}
bool TRClient::reconcileSync(std::uint32_t, const std::string&, ProgressCallback, ErrorRef*) {
  notImplemented(Op::reconcileSync);
}
void TRClient::syncEndedWithSuccess(bool) { notImplemented(Op::syncEndedWithSuccess); }
bool TRClient::reconcileRestoreOfType(std::int32_t, ErrorRef*) {
  notImplemented(Op::reconcileRestoreOfType);
}
bool TRClient::reconcileRestoreWithError(ErrorRef*) {
  notImplemented(Op::reconcileRestoreWithError);
}
void TRClient::restoreEndedWithError(const ErrorRef&) { notImplemented(Op::restoreEndedWithError); }
void TRClient::cancelSyncOperations() { notImplemented(Op::cancelSyncOperations); }
void TRClient::registerMessageHandlersWithLink(const std::shared_ptr<TRLink>&) {
  notImplemented(Op::registerMessageHandlersWithLink);
}
plist::Dict TRClient::installedAssets() { notImplemented(Op::installedAssets); }
std::vector<std::shared_ptr<TRAsset>> TRClient::outstandingAssetTransfers() {
  notImplemented(Op::outstandingAssetTransfers);
}
std::vector<std::shared_ptr<TRAsset>> TRClient::outstandingAssetTransfersWithDownloadManager(
    const std::shared_ptr<TRDownloadManager>&) {
  notImplemented(Op::outstandingAssetTransfersWithDownloadManager);
}
void TRClient::assetTransfer(const std::shared_ptr<TRAsset>&, bool, const ErrorRef&) {
  notImplemented(Op::assetTransferSucceeded);
}
void TRClient::assetTransfer(const std::shared_ptr<TRAsset>&, double) {
  notImplemented(Op::assetTransferUpdatedProgress);
}
void TRClient::assetTransferEndedWithSuccess(bool) {
  notImplemented(Op::assetTransferEndedWithSuccess);
}
void TRClient::assetInstallSucceeded(const std::shared_ptr<TRAsset>&) {
  notImplemented(Op::assetInstallSucceeded);
}
void TRClient::assetInstallFailed(const std::shared_ptr<TRAsset>&, const ErrorRef&) {
  notImplemented(Op::assetInstallFailed);
}
void TRClient::metadataUpdate(const plist::Dict&, const std::shared_ptr<TRAsset>&,
                              const std::string&) {
  notImplemented(Op::metadataUpdate);
}
void TRClient::prioritizeAsset(const std::shared_ptr<TRAsset>&) {
  notImplemented(Op::prioritizeAsset);
}
void TRClient::initiateAssetDownloadsWithCompletion(std::function<void(ErrorRef)>) {
  notImplemented(Op::initiateAssetDownloadsWithCompletion);
}
void TRClient::clearSyncData() { notImplemented(Op::clearSyncData); }
plist::Dict TRClient::installedAssetMetrics() { notImplemented(Op::installedAssetMetrics); }
std::set<std::string> TRClient::vantorIDsForAssets() { notImplemented(Op::vantorIDsForAssets); }
std::vector<TRMutableAccountInfo> TRClient::accountsForAssets() {
  notImplemented(Op::accountsForAssets);
}
std::optional<std::set<std::string>> TRClient::disabledAssetTypes() {
  notImplemented(Op::disabledAssetTypes);
}
void TRClient::prepareForBackup() { notImplemented(Op::prepareForBackup); }
void TRClient::backupEnded() { notImplemented(Op::backupEnded); }
void TRClient::pathsToBackup(std::vector<std::string>*, std::vector<std::string>*) {
  notImplemented(Op::pathsToBackup);
}
bool TRClient::shouldRestoreFile(const std::string&, SWManager*) {
  notImplemented(Op::shouldRestoreFile);
}
bool TRClient::shouldBackgroundRestorePath(const std::string&, SWManager*) {
  notImplemented(Op::shouldBackgroundRestorePath);
}
bool TRClient::shouldBackgroundRestoreFile(const std::string&, SWManager*) {
  notImplemented(Op::shouldBackgroundRestoreFile);
}

}  // namespace appsync
