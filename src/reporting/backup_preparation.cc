// Backups and restrictions: whether the restrictions switch applications off, and bringing each
// installed application's store metadata up to date before the device is backed up.
#include "client/apps_client.h"
#include "reporting/store_metadata.h"

namespace appsync {

namespace {

constexpr std::string_view kDeviceBasedKey = "DeviceBasedBLK";
constexpr std::string_view kAutoDownloadKey = "is-auto-download";

}  // namespace

std::optional<std::set<std::string>> AppsClient::disabledAssetTypes() {
  if (_appInstallationAllowed()) return std::nullopt;
  if (_appRemovalAllowed()) return std::nullopt;
  return std::set<std::string>{std::string(kApplicationDataclass)};
}

void AppsClient::prepareForBackup() {
  logDefault("%s|preparing for backup");
  const std::optional<std::filesystem::path> deviceRoot =
      resolvedDeviceRoot(platform_.paths.root());
  platform_.ar.enumerateBundlesOfType(
      ARBundleTypeApplications,
      [&](const std::shared_ptr<const ARBundleProxy>& proxy, bool* /*stop*/) {
        const ARApplicationProxy* application = proxy->asApplicationProxy();
        if (!application) return;
        // Each application's file lives only for this call.
        const std::optional<std::string> path = storeMetadataPath(application->bundleContainerURL);
        if (!path || !deviceRoot) return;
        std::optional<StoreMetadata> metadata = loadStoreMetadata(*path, *deviceRoot);
        if (!metadata) return;
        plist::Dict& root = metadata->root;
        bool changed = false;

        const bool deviceBased = application->hasMIDBasedSINF;
        if (root.contains(kDeviceBasedKey) || deviceBased) {
          root.set(std::string(kDeviceBasedKey), deviceBased);
          logDefault("%s|Updated DeviceBasedBLK state for : %{public}@ to %d",
                     application->bundleIdentifier, deviceBased ? 1 : 0);
          changed = true;
        }
        const plist::Value* autoDownload = root.find(kAutoDownloadKey);
        if (autoDownload && autoDownload->truthValue().value_or(false)) {
          root.erase(kAutoDownloadKey);
          logDefault("%s|clearing is-auto-download value for %{public}@",
                     application->bundleIdentifier);
          changed = true;
        }
        // The backup goes ahead whether or not the write succeeds.
        if (changed) writeStoreMetadata(*path, *metadata, *deviceRoot);
      });
  logDefault("%s|finished preparing for backup");
}

}  // namespace appsync
