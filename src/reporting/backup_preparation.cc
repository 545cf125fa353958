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
  forEachApplicationMetadata(
      platform_.ar, platform_.paths.root(),
      [&](const ARApplicationProxy& application, const std::optional<std::string>& path,
          std::optional<StoreMetadata>& metadata) {
        if (!metadata) return;
        plist::Dict& root = metadata->root;
        bool changed = false;

        const bool deviceBased = application.hasMIDBasedSINF;
        if (root.contains(kDeviceBasedKey) || deviceBased) {
          root.set(std::string(kDeviceBasedKey), deviceBased);
          logDefault("%s|Updated DeviceBasedBLK state for : %{public}@ to %d",
                     application.bundleIdentifier, deviceBased ? 1 : 0);
          changed = true;
        }
        const plist::Value* autoDownload = root.find(kAutoDownloadKey);
        if (autoDownload && autoDownload->truthValue().value_or(false)) {
          root.erase(kAutoDownloadKey);
          logDefault("%s|clearing is-auto-download value for %{public}@",
                     application.bundleIdentifier);
          changed = true;
        }
        // The backup goes ahead whether or not the write succeeds.
        if (changed && deviceRoot) writeStoreMetadata(*path, *metadata, *deviceRoot);
      });
  logDefault("%s|finished preparing for backup");
}

}  // namespace appsync
