// The host's client protocol: what the host sync daemon calls on a client of a dataclass.
// Only supportedDataclasses is required. Every other operation is optional: a host asks
// respondsTo() first, and calling an operation the client does not implement aborts, as
// sending an unimplemented message would.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "runtime/error.h"
#include "runtime/plist/value.h"
#include "platform/sw.h"
#include "platform/tr.h"

namespace appsync {

using ProgressCallback = std::function<void(double)>;
class TRLink;             // the host's message link (opaque here)
class TRDownloadManager;  // the host's download manager (opaque here)

enum class TRClientOperation {
  currentSyncAnchor,
  prepareForSyncWithHostAnchor,
  prepareForSyncWithHostAnchorHostAuthIdentifierHostVersion,
  reconcileSync,
  syncEndedWithSuccess,
  reconcileRestoreOfType,
  reconcileRestoreWithError,
  restoreEndedWithError,
  cancelSyncOperations,
  registerMessageHandlersWithLink,
  installedAssets,
  outstandingAssetTransfers,
  outstandingAssetTransfersWithDownloadManager,
  assetTransferSucceeded,        // assetTransfer:succeeded:withError:
  assetTransferUpdatedProgress,  // assetTransfer:updatedProgress:
  assetTransferEndedWithSuccess,
  assetInstallSucceeded,
  assetInstallFailed,
  metadataUpdate,
  prioritizeAsset,
  initiateAssetDownloadsWithCompletion,
  clearSyncData,
  installedAssetMetrics,
  vantorIDsForAssets,
  accountsForAssets,
  disabledAssetTypes,
  prepareForBackup,
  backupEnded,
  pathsToBackup,
  shouldRestoreFile,
  shouldBackgroundRestorePath,
  shouldBackgroundRestoreFile,
};

const char* operationName(TRClientOperation operation);

// What the plugin implements; the host calls it on threads of the host's choosing.
class TRClient {
 public:
  TRClient() = default;
  virtual ~TRClient() = default;
  TRClient(const TRClient&) = delete;
  TRClient& operator=(const TRClient&) = delete;

  // Required: the dataclasses the client serves, a copy for the host. Cannot fail.
  virtual std::vector<std::string> supportedDataclasses() = 0;
  // Whether the client implements an optional operation. Cannot fail.
  virtual bool respondsTo(TRClientOperation operation) const = 0;

  // Optional operations.
  virtual std::string currentSyncAnchor();
  virtual bool prepareForSyncWithHostAnchor(const std::string& hostAnchor,
                                            ProgressCallback progressCallback, ErrorRef* error);
  virtual bool prepareForSyncWithHostAnchor(const std::string& hostAnchor,
                                            std::uint32_t hostAuthIdentifier,
                                            const std::string& hostVersion,
                                            ProgressCallback progressCallback, ErrorRef* error);
  virtual bool reconcileSync(std::uint32_t syncType, const std::string& newAnchor,
                             ProgressCallback progressCallback, ErrorRef* error);
  virtual void syncEndedWithSuccess(bool success);
  virtual bool reconcileRestoreOfType(std::int32_t restoreType, ErrorRef* error);
  virtual bool reconcileRestoreWithError(ErrorRef* error);
  virtual void restoreEndedWithError(const ErrorRef& error);
  virtual void cancelSyncOperations();
  virtual void registerMessageHandlersWithLink(const std::shared_ptr<TRLink>& link);
  virtual plist::Dict installedAssets();
  virtual std::vector<std::shared_ptr<TRAsset>> outstandingAssetTransfers();
  virtual std::vector<std::shared_ptr<TRAsset>> outstandingAssetTransfersWithDownloadManager(
      const std::shared_ptr<TRDownloadManager>& downloadManager);
  virtual void assetTransfer(const std::shared_ptr<TRAsset>& asset, bool succeeded,
                             const ErrorRef& withError);
  virtual void assetTransfer(const std::shared_ptr<TRAsset>& asset, double updatedProgress);
  virtual void assetTransferEndedWithSuccess(bool success);
  virtual void assetInstallSucceeded(const std::shared_ptr<TRAsset>& asset);
  virtual void assetInstallFailed(const std::shared_ptr<TRAsset>& asset, const ErrorRef& withError);
  virtual void metadataUpdate(const plist::Dict& metadata, const std::shared_ptr<TRAsset>& forAsset,
                              const std::string& withNewAnchor);
  virtual void prioritizeAsset(const std::shared_ptr<TRAsset>& asset);
  virtual void initiateAssetDownloadsWithCompletion(std::function<void(ErrorRef)> completion);
  virtual void clearSyncData();
  virtual plist::Dict installedAssetMetrics();
  virtual std::set<std::string> vantorIDsForAssets();
  virtual std::vector<TRMutableAccountInfo> accountsForAssets();
  virtual std::optional<std::set<std::string>> disabledAssetTypes();
  virtual void prepareForBackup();
  virtual void backupEnded();
  virtual void pathsToBackup(std::vector<std::string>* pathsToBackup,
                             std::vector<std::string>* pathsNotToBackup);
  virtual bool shouldRestoreFile(const std::string& path, SWManager* backupManager);
  virtual bool shouldBackgroundRestorePath(const std::string& path, SWManager* backupManager);
  virtual bool shouldBackgroundRestoreFile(const std::string& path, SWManager* backupManager);

 protected:
  // What an optional operation that the client does not implement does when called anyway.
  [[noreturn]] static void notImplemented(TRClientOperation operation);
};

}  // namespace appsync
