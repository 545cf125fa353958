// What the host reports while it transfers packages: progress, the end of each transfer and the
// end of the transfer phase. On the legacy road these feed the registry's install progress and
// the install queue; on the coordinated road they go to the coordinated install.
#include <set>
#include <string>

#include "client/apps_client.h"
#include "client/asset_path.h"
#include "reporting/in_progress_asset_query.h"
#include "runtime/dispatch/semaphore.h"
#include "state/todo_list.h"

namespace appsync {

namespace {

// The host's progress reports become this many units of the registry's install progress.
constexpr std::int64_t kTransferProgressUnits = 1000;

std::optional<std::string> assetVersion(const TRAsset& asset) {
  const plist::Dict options = asset.variantOptions();
  if (const std::string* version = plist::stringAt(options, "Version")) return *version;
  return std::nullopt;
}

}  // namespace

void AppsClient::assetTransfer(const std::shared_ptr<TRAsset>& asset, double updatedProgress) {
  const std::string identifier = asset->identifier();
  logDefault("%s|finished transferring %lf for %{public}@", updatedProgress, identifier);
  if (_useInstallCoordinator) {
    bool existingApp = false;
    _accessQueue->sync([&] { existingApp = _updatingApps.count(identifier) > 0; });
    updateTransferProgressForApp(asset, existingApp);
  } else if (auto progress = _progressForAssetIdentifier(identifier)) {
    const auto units =
        static_cast<std::int64_t>(updatedProgress * static_cast<double>(kTransferProgressUnits));
    progress->setInstallState(ARInstallStateActive);
    if (progress->totalUnitCount() != kTransferProgressUnits) {
      progress->setTotalUnitCount(kTransferProgressUnits);
    }
    progress->setCompletedUnitCount(units);
  }
  _outstandingPFTTransfers.with([&](auto& outstanding) { outstanding.insert(identifier); });
}

void AppsClient::assetTransfer(const std::shared_ptr<TRAsset>& asset, bool succeeded,
                               const ErrorRef& withError) {
  const std::string identifier = asset->identifier();
  bool existingApp = false;
  bool userCancelled = false;
  _accessQueue->sync([&] {
    existingApp = _updatingApps.erase(identifier) > 0;
    userCancelled = _userCancelledApps.erase(identifier) > 0;
  });
  _outstandingPFTTransfers.with([&](auto& outstanding) { outstanding.erase(identifier); });
  logDefault(
      "%s|transfer for asset %{public}@ ended with success %c error %{public}@ existingApp:%d",
      *asset, succeeded ? 'y' : 'n', withError, existingApp ? 1 : 0);
  const std::shared_ptr<ARInstallProgress> progress = _progressForAssetIdentifier(identifier);
  if (succeeded) {
    _transferSucceeded(asset, progress, existingApp);
  } else {
    _transferFailed(asset, withError, progress, existingApp, userCancelled);
  }
}

void AppsClient::_transferSucceeded(const std::shared_ptr<TRAsset>& asset,
                                    const std::shared_ptr<ARInstallProgress>& progress,
                                    bool existingApp) {
  const std::string identifier = asset->identifier();
  logDefault("%s|asset transfer succeeded for %{public}@", identifier);
  if (progress) platform_.ar.installPhaseFinishedForProgress(progress);

  const std::optional<std::string> version = assetVersion(*asset);
  std::optional<std::string> path = asset->path();
  bool confined = false;
  if (path && !path->starts_with('/')) {
    // A relative path names a file in the conduit's public staging folder and must stay in it.
    const std::string staging = platform_.paths.publicStaging();
    confined = resolvesInside(staging, *path);
    path = staging + "/" + *path;
    asset->setPath(path);
  } else {
    if (!path) {
      const std::optional<plist::Value> recorded =
          _restoreStatePropertyForKey(std::string(kRestoreStatePathKey), identifier, version);
      if (const std::string* text = recorded ? recorded->string() : nullptr) path = *text;
      asset->setPath(path);
    }
    confined = path && resolvesInsideRoot(*path, platform_.paths.root());
  }
  const std::optional<plist::Value> pathValue =
      path ? std::optional<plist::Value>(*path) : std::nullopt;
  if (!isValidAssetPath(pathValue ? &*pathValue : nullptr) || !confined) {
    logDefault("%s|Ignoring invalid path: %{public}@", path);
    return;
  }

  if (!asset->isDownload()) {
    changeAssetID(identifier, std::string(kTodoSent));
    return;
  }
  logDefault("%s|Received file at %{public}@", path);
  changeAssetID(identifier, std::string(kTodoDownloaded));

  if (!asset->isRestore()) {
    logDefault("%s|Installing synced asset %{public}@", *asset);
    if (_useInstallCoordinator) {
      transferCompleteForApp(asset, nullptr, existingApp);
    } else {
      _enqueueAssetInstall(asset);
    }
    return;
  }
  if (asset->completedAssetParts() == kTRAssetPartApplicationData) {
    // The data arrived for a package stored earlier.
    if (_useInstallCoordinator) {
      logDefault(
          "%s|Not processing kTRAssetPartApplicationData for restore asset %{public}@ as "
          "coordination is enabled",
          *asset);
    } else {
      _enqueueAssetInstall(asset);
    }
    return;
  }
  if (_useInstallCoordinator) {
    logDefault("%s|Not processing restore asset %{public}@ as coordination is enabled", *asset);
    return;
  }
  if (!_backupManager ||
      !_backupManager->restoreDataExistsForApplicationWithBundleID(identifier, nullptr)) {
    logDefault("%s|No restore data exists for %{public}@", asset->shortDescription());
    _enqueueAssetInstall(asset);
    return;
  }
  // The install waits for the data part, which comes as a restore transfer of its own.
  logDefault("%s|Restore data exists for %{public}@", identifier);
  if (progress) progress->setInstallPhase(ARInstallPhaseRestoringData);
  _setRestoreStatePropertyValue(plist::Value(*path), std::string(kRestoreStatePathKey), identifier,
                                version);
}

void AppsClient::_transferFailed(const std::shared_ptr<TRAsset>& asset, const ErrorRef& error,
                                 const std::shared_ptr<ARInstallProgress>& progress,
                                 bool existingApp, bool userCancelled) {
  const std::string identifier = asset->identifier();
  const bool recoverable = _isRecoverableError(error);
  logDefault("%s|failed to transfer asset %{public}@. err=%{public}@, recoverable=%d", identifier,
             error, recoverable ? 1 : 0);
  if (recoverable) {
    // The placeholder stays for a later attempt.
    if (progress) progress->setInstallState(ARInstallStateFailed);
    return;
  }
  if (!platform_.ar.applicationIsInstalled(identifier)) return;
  // A restoring application keeps its placeholder whatever became of its transfer.
  if (asset->isRestore()) return;
  if (progress && progress->installState() < ARInstallStateCanceled) progress->cancel();
  logDefault("%s|Uninstalling placeholder %{public}@", identifier);
  if (!_useInstallCoordinator) {
    const plist::Dict options{{std::string(ARUninstallPlaceholdersOnlyKey), true}};
    const bool removed = platform_.ar.uninstallApplication(identifier, options);
    logDefault("%s|Uninstalling app using AR %{public}@ %s", identifier,
               removed ? "secceeded" : "failed");
  } else if (!userCancelled) {
    transferCompleteForApp(asset, error, existingApp);
  }
}

void AppsClient::assetTransferEndedWithSuccess(bool success) {
  logDefault("%s|asset transfer ended withsuccess: %c", success ? 'y' : 'n');
  _installGroup->wait();
  _notifyPavilion(platform_, false);

  if (_getAndResetNumAppInstallsAttempted() >= 1) {
    std::shared_ptr<BZSoftwareLibrary> library = platform_.bz.newSoftwareLibrary();
    if (library) {
      Semaphore refreshed;
      library->refreshReceiptsWithCompletionBlock([this, &refreshed](ErrorRef error) {
        if (error) {
          logDefault("%s|refreshReceiptsWithCompletionBlock failed: %{public}@", error);
        } else {
          logDefault("%s|refreshReceiptsWithCompletionBlock succeeded");
        }
        refreshed.signal();
      });
      refreshed.wait();
    }
  }

  const std::set<std::string> outstanding = _outstandingPFTTransfers.get();
  if (outstanding.empty()) return;
  if (_useInstallCoordinator) {
    assetSyncFinishedWithStatus(success, outstanding);
  } else {
    const std::uint64_t state = success ? ARInstallStateFinished : ARInstallStateFailed;
    for (const std::string& identifier : outstanding) {
      logDefault(
          "%s|Setting state for outstanding PFT loading phase of asset %{public}@ to "
          "%{public}@",
          identifier, installStateDebugName(state));
      if (auto progress = _progressForAssetIdentifier(identifier)) {
        progress->setInstallState(state);
        platform_.ar.installPhaseFinishedForProgress(progress);
      }
    }
  }
  if (success) {
    logError("%s|Called with success == YES but with %lu outstanding PFT transfers!",
             outstanding.size());
  }
  // Only what was settled goes: a transfer reported meanwhile stays outstanding.
  _outstandingPFTTransfers.with([&](auto& current) {
    for (const std::string& identifier : outstanding) current.erase(identifier);
  });
  _accessQueue->sync([&] {
    _updatingApps.clear();
    _userCancelledApps.clear();
  });
}

}  // namespace appsync
