// The placeholder of an application being restored through a coordinator, configured from its
// store metadata, icon and SINF.
#include "client/apps_client.h"
#include "coordination/coordination_support.h"
#include "restore/placeholder_info.h"

namespace appsync {

using namespace coordination;

namespace {

// A text value of the metadata; a value of another type counts as absent.
std::optional<std::string> textAt(const plist::Dict& metadata, std::string_view key) {
  const std::string* text = plist::stringAt(metadata, key);
  return text ? std::optional<std::string>(*text) : std::nullopt;
}

std::uint64_t installTypeForDemotionStatus(std::uint64_t demotionStatus) {
  switch (demotionStatus) {
    case 1:
      return kIntentionallyDemotedInstallType;
    case 2:
      return kDowngradeInstallType;
    default:
      return kRestoreInstallType;
  }
}

}  // namespace

std::shared_ptr<KCPlaceholder> AppsClient::_placeHolderForBundleIdentifier(
    const std::string& bundleID, const plist::Dict& withCaravelMetadata,
    const std::optional<plist::Bytes>& sinfData, const std::optional<plist::Bytes>& iconData,
    std::uint64_t demotionStatus) {
  const plist::Dict& metadata = withCaravelMetadata;
  const std::string name =
      textAt(metadata, "title").value_or(textAt(metadata, "itemName").value_or(bundleID));
  const std::optional<std::string> bundleVersion = textAt(metadata, "bundleVersion");
  const plist::Value* prohibited = metadata.find(kLaunchProhibitedKey);
  if (!prohibited) prohibited = metadata.find("launchProhibited");
  const bool launchProhibited = prohibited && prohibited->truthValue().value_or(false);

  const FileAttributes attributes = mobileFileAttributes();
  const std::optional<std::string> directory = placeholderAppPathForBundleIdentifier(bundleID);
  if (!directory) {
    reportUnusablePlaceholderPath(platform_, bundleID);
    return nullptr;
  }
  if (!createPlaceHolderPath(*directory, bundleID, attributes)) return nullptr;
  const std::string iconPath = placeholderFile(*directory, kPlaceholderIconFileName);
  std::uint64_t iconSize = 0;
  writeIconData(iconData, iconPath, &iconSize, bundleID, attributes);

  std::shared_ptr<KCPlaceholder> placeholder =
      _placeHolderForBundleIdentifier(bundleID, name, installTypeForDemotionStatus(demotionStatus));
  if (!placeholder) return nullptr;

  // Each step either succeeds or gives the placeholder up; the files stay on disk.
  auto configured = [&] {
    if (iconSize != 0 &&
        !_createIconPromiseForBundleIdentifier(bundleID, iconPath, iconSize, placeholder, false)) {
      return false;
    }
    ErrorRef error;
    KCPlaceholderAttributes placeholderAttributes;
    placeholderAttributes.setLaunchProhibited(launchProhibited);
    placeholderAttributes.setBundleVersion(bundleVersion);
    if (!placeholder->setPlaceholderAttributes(placeholderAttributes, &error)) {
      logError("%s|Error %{public}@ setting placeholder attributes for '%{public}@'", error,
               bundleID);
      return false;
    }
    logDefault("%s|set %{public}@ placeholder attributes for %{public}@", placeholderAttributes,
               bundleID);
    if (!placeholder->setMetadata(std::make_shared<const EMStoreMetadata>(metadata), &error)) {
      logError("%s|Error %{public}@ setting store metadata for '%{public}@'", error, bundleID);
      return false;
    }
    logDefault("%s|set store metadata on placeholder for %{public}@", bundleID);
    if (sinfData) {
      if (!placeholder->setSinfData(*sinfData, &error)) {
        logError("%s|Error %{public}@ setting SINF data for '%{public}@'", error, bundleID);
        return false;
      }
      logDefault("%s|set SINF data on placeholder for %{public}@", bundleID);
    }
    if (!placeholder->setConfigurationCompleteWithError(&error)) {
      logError("%s|Error %{public}@ setting placeholder configuration as complete for '%{public}@'",
               error, bundleID);
      return false;
    }
    logDefault("%s|set placeholder configuration complete for %{public}@", bundleID);
    return true;
  };
  if (configured()) return placeholder;
  placeholder->cancelForReason(reason(kRestoreFailedReason), kAppSyncCoordinationClient, nullptr);
  return nullptr;
}

}  // namespace appsync
