// The coordinated sync install: a coordinator readied before the package is sent, the host's
// transfer progress and completion handed to its asset promise, what is left cancelled when the
// asset sync ends badly, and uninstalls through the service.
#include "client/apps_client.h"
#include "coordination/coordination_support.h"
#include "restore/placeholder_info.h"

namespace appsync {

using namespace coordination;

namespace {

constexpr std::uint64_t kInstallTargetType = 1;
constexpr std::int64_t kUserPresentableTransferFailure = 1;

// The text of a value of the asset's variant options; another type counts as absent.
std::optional<std::string> variantText(const TRAsset& asset, std::string_view key) {
  const plist::Dict options = asset.variantOptions();
  const std::string* text = plist::stringAt(options, key);
  return text ? std::optional<std::string>(*text) : std::nullopt;
}

std::optional<plist::Dict> dictionaryAt(const std::optional<std::string>& path) {
  return path ? readPlistDictionary(*path) : std::nullopt;
}

bool isEmpty(const std::optional<std::string>& text) { return !text || text->empty(); }

}  // namespace

bool AppsClient::prepareAppForInstallUsingCoordination(const std::shared_ptr<TRAsset>& asset,
                                                       bool existingApp) {
  const std::optional<std::string> prettyName = asset->prettyName();
  const std::string bundleID = asset->identifier();
  const std::optional<std::string> version = variantText(*asset, "Version");
  const std::optional<plist::Dict> infoPlist = dictionaryAt(asset->infoPlist());
  const std::optional<plist::Dict> storePlist = dictionaryAt(asset->storePlist());
  const plist::Value* prohibited = infoPlist ? infoPlist->find(kLaunchProhibitedKey) : nullptr;
  const bool launchProhibited = prohibited && prohibited->truthValue().value_or(false);
  pluginLog(platform_.tr.TRGetLogCategory(kSyncSummaryLogCategory), LogLevel::Default,
            "%s|processing app install for bundle '%{public}@', title %{public}@ assetplist "
            "%{public}@, version %{public}@ with install coordination",
            bundleID, prettyName, infoPlist, version);
  beginStep(platform_, kInstallStep, bundleID, existingApp ? "Update app" : "Install App");

  bool result = false;
  ErrorRef lastError;  // the most recent error any service call of this run reported
  auto noteError = [&](const ErrorRef& error) {
    if (error) lastError = error;
  };
  std::shared_ptr<KCAppInstallCoordinator> coordinator;
  std::shared_ptr<KCPlaceholder> placeholder;

  // Hands a placeholder (possibly none, possibly not fully configured) to the coordinator: its
  // answer is the result.
  auto offerPlaceholder = [&] {
    ErrorRef error;
    result = coordinator->setPlaceholderPromise(placeholder, &error);
    noteError(error);
    if (result) {
      logDefault("%s|added placeholder promise to coordinator for %{public}@", bundleID);
    } else {
      logError("%s|Error %{public}@ adding placeholder promise to coordinator for '%{public}@'",
               error, bundleID);
    }
  };

  // Configures the placeholder; a failed step ends the configuration, not the preparation.
  auto configurePlaceholder = [&](const std::string& iconPath, std::uint64_t iconSize,
                                  const std::shared_ptr<const EMStoreMetadata>& storeMetadata) {
    if (iconSize != 0 &&
        !_createIconPromiseForBundleIdentifier(bundleID, iconPath, iconSize, placeholder, true)) {
      return;
    }
    ErrorRef error;
    KCPlaceholderAttributes attributes(infoPlist.value_or(plist::Dict{}));
    attributes.setLaunchProhibited(launchProhibited);
    attributes.setBundleVersion(version);
    if (!placeholder->setPlaceholderAttributes(attributes, &error)) {
      noteError(error);
      logError("%s|Error %{public}@ setting attributes on placeholder for '%{public}@'", error,
               bundleID);
      return;
    }
    logDefault("%s|set %{public}@ attributes on placeholder for %{public}@", attributes, bundleID);
    if (!placeholder->setMetadata(storeMetadata, &error)) {
      noteError(error);
      logError("%s|Error %{public}@ setting store metadata on placeholder for '%{public}@'", error,
               bundleID);
      return;
    }
    logDefault("%s|set store metadata on placeholder for %{public}@", bundleID);
    if (placeholder->setConfigurationCompleteWithError(&error)) {
      logDefault("%s|set placeholder configuration as complete for %{public}@", bundleID);
    } else {
      noteError(error);
      logError("%s|Error %{public}@ setting placeholder configuration as complete for '%{public}@'",
               error, bundleID);
    }
  };

  // The icon copied into the placeholder directory: its path there and its size (0 when there
  // is no directory, no icon or the copy failed).
  auto copyIcon = [&](std::string* iconPath) -> std::uint64_t {
    const std::optional<std::string> directory = placeholderAppPathForBundleIdentifier(bundleID);
    if (!directory) {
      reportUnusablePlaceholderPath(platform_, bundleID);
      return 0;
    }
    if (!createPlaceHolderPath(*directory, bundleID, mobileFileAttributes())) return 0;
    *iconPath = placeholderFile(*directory, kPlaceholderIconFileName);
    const std::optional<std::string> source = asset->icon();
    if (!source) return 0;
    beginStep(platform_, kIconCopyStep, bundleID, "Copying icon");
    std::uint64_t size = 0;
    ErrorRef error;
    if (copyFile(*source, *iconPath, &error)) {
      if (std::optional<std::uint64_t> onDisk = fileSize(*iconPath, &error)) {
        size = *onDisk;
        logDefault("%s|icon for %{public}@ at %{public}@ has a size of %llu", bundleID, *iconPath,
                   size);
      }
    }
    logDefault(
        "%s|Copied icon from %{public}@ to %{public}@ with error %{public}@ for '%{public}@', "
        "sizeOnDisk:%llu",
        *source, *iconPath, error, bundleID, size);
    endStep(platform_, kIconCopyStep, true, bundleID, "Copying icon");
    return size;
  };

  // Steps that stop the preparation return false.
  auto prepare = [&]() -> bool {
    if (isEmpty(prettyName) && bundleID.empty()) return false;
    ErrorRef error;
    coordinator = _initiatingOrUpdatingAppInstallCoordinatorForBundleIdentifier(
        bundleID, existingApp, true, &error);
    noteError(error);
    if (!coordinator) return false;
    coordinator->setObserver(this);

    std::shared_ptr<const EMStoreMetadata> storeMetadata;
    if (coordinator->hasInstallOptions()) {
      logDefault("%s|coordinator for %{public}@ has install options", bundleID);
    } else {
      storeMetadata = std::make_shared<const EMStoreMetadata>(storePlist.value_or(plist::Dict{}));
      auto options = std::make_shared<EMInstallOptions>();
      options->setCaravelMetadata(storeMetadata);
      options->setArInstallType(kSyncInstallType);
      options->setInstallTargetType(kInstallTargetType);
      if (!coordinator->setInstallOptions(options, &error)) {
        noteError(error);
        logError("%s|Error %{public}@ setting install options on coordinator for '%{public}@'",
                 error, bundleID);
        return false;
      }
      logDefault("%s|set install options on coordinator for %{public}@", bundleID);
    }

    if (coordinator->hasInitialSPRAssetPromises()) {
      logDefault("%s|coordinator for %{public}@ has an SPR app asset promise", bundleID);
    } else if (!coordinator->setInitialSPRAssetPromises({}, &error)) {
      noteError(error);
      logError("%s|Error %{public}@ setting SPR asset promise for '%{public}@'", error, bundleID);
      return false;
    } else {
      logDefault("%s|set SPR asset promise to install coordinator for %{public}@", bundleID);
    }

    if (coordinator->hasAppAssetPromise()) {
      logDefault("%s|coordinator for %{public}@ has an app asset promise", bundleID);
    } else if (!_createAppAssetPromiseForBundleIdentifier(bundleID, std::nullopt, coordinator)) {
      return false;
    }

    if (coordinator->hasPlaceholderPromise()) {
      logDefault("%s|coordinator for %{public}@ has a placeholder promise", bundleID);
      result = true;
      return true;
    }
    std::string iconPath;
    const std::uint64_t iconSize = copyIcon(&iconPath);
    placeholder = _placeHolderForBundleIdentifier(
        bundleID, isEmpty(prettyName) ? bundleID : *prettyName, kSyncInstallType);
    if (placeholder) configurePlaceholder(iconPath, iconSize, storeMetadata);
    offerPlaceholder();
    return result;
  };
  prepare();

  logDefault(
      "%s|processing app install for bundle %{public}@ finished with status %d error "
      "%{public}@",
      bundleID, result, lastError);
  endStep(platform_, kInstallStep, result, bundleID, "Install app");
  if (!result) {
    const ErrorRef cancelReason = reason(kPreparationFailedReason);
    if (placeholder) {
      logDefault("%s|Cancelling placeholder for appBundleIdentifier:%{public}@", bundleID);
      placeholder->cancelForReason(cancelReason, kAppSyncCoordinationClient, nullptr);
    }
    if (coordinator) {
      logDefault("%s|Cancelling coordinator for appBundleIdentifier:%{public}@", bundleID);
      coordinator->cancelForReason(cancelReason, kAppSyncCoordinationClient, nullptr);
    }
  }
  return result;
}

bool AppsClient::updateTransferProgressForApp(const std::shared_ptr<TRAsset>& asset,
                                              bool existingApp) {
  const std::string bundleID = asset->identifier();
  std::shared_ptr<KCAppInstallCoordinator> coordinator =
      _initiatingOrUpdatingAppInstallCoordinatorForBundleIdentifier(bundleID, existingApp, false,
                                                                    nullptr);
  if (!coordinator || coordinator->error()) return false;
  std::shared_ptr<KCPromisedTransferToPath> promise =
      coordinator->appAssetPromiseWithError(nullptr);
  if (promise && promise->isComplete()) {
    logDefault("%s|Asset promise is already satisfied for %{public}@", bundleID);
    return false;
  }
  if (!promise)
    promise = _createAppAssetPromiseForBundleIdentifier(bundleID, asset->path(), coordinator);
  const double downloadProgress = asset->downloadProgress();
  const double installProgress = asset->installProgress();
  logDefault("%s|Updating download progress: %f install progress:%f for %{public}@",
             downloadProgress, installProgress, bundleID);
  if (promise) promise->setPercentComplete(downloadProgress);
  return true;
}

void AppsClient::transferCompleteForApp(const std::shared_ptr<TRAsset>& asset,
                                        const ErrorRef& withError, bool isExistingApp) {
  const std::string bundleID = asset->identifier();
  std::shared_ptr<KCAppInstallCoordinator> coordinator =
      _initiatingOrUpdatingAppInstallCoordinatorForBundleIdentifier(bundleID, isExistingApp, false,
                                                                    nullptr);
  if (!coordinator || coordinator->error()) return;
  if (withError) {
    const ErrorRef presentable =
        platform_.kc.KCCreateUserPresentableError(kUserPresentableTransferFailure, 0, withError);
    coordinator->cancelForReason(presentable, kAppSyncCoordinationClient, nullptr);
    return;
  }
  std::shared_ptr<KCPromisedTransferToPath> promise =
      coordinator->appAssetPromiseWithError(nullptr);
  if (promise && promise->isComplete()) {
    logDefault("%s|Asset promise is already satisfied for %{public}@", bundleID);
    return;
  }
  const std::optional<std::string> path = asset->path();
  if (!promise) {
    promise = _createAppAssetPromiseForBundleIdentifier(bundleID, path, coordinator);
  } else if (path) {
    promise->setTransferPath(fileURL(*path));
  }
  logDefault("%s|Satisfying asset promise for %{public}@", bundleID);
  if (promise) {
    promise->setPercentComplete(1.0);
    promise->setComplete(true);
  }
}

void AppsClient::assetSyncFinishedWithStatus(bool status,
                                             const std::set<std::string>& outstandingItems) {
  if (status) return;
  const ErrorRef cancelReason = reason(kInstallFailedReason);
  for (const std::string& bundleID : outstandingItems) {
    std::shared_ptr<KCAppInstallCoordinator> coordinator =
        platform_.kc.coordinatorForAppWithBundleID(
            KCCoordinatorKind::Any, bundleID, kAppSyncCoordinationClient, false, nullptr, nullptr);
    if (!coordinator) continue;
    logDefault("%s|Cancelling coordinator with error %{public}@ for %{public}@", cancelReason,
               bundleID);
    coordinator->cancelForReason(cancelReason, kAppSyncCoordinationClient, nullptr);
  }
}

void AppsClient::uninstallAppUsingCoordination(const std::string& bundleID) {
  beginStep(platform_, kUninstallStep, bundleID, "Uninstall app");
  // The completion may run after the client is gone: it holds only the platform.
  const Platform platform = platform_;
  platform_.kc.uninstallAppWithBundleID(bundleID, false, [platform, bundleID](ErrorRef error) {
    pluginLog(
        platform.tr.TRGetLogCategory(kAppSyncLogCategory), LogLevel::Default,
        "%s|Uninstall of %{public}@ with install coordinator succeeded wiht error %{public}@.",
        bundleID, error);
    endStep(platform, kUninstallStep, !error, bundleID, "Uninstall app");
  });
}

}  // namespace appsync
