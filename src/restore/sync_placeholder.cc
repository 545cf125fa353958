// The sync road: a placeholder for an application the host has announced, so that its icon and
// name are on the home screen while the package is on its way.
#include "client/apps_client.h"
#include "platform/bundle_keys.h"
#include "restore/placeholder_info.h"
#include "runtime/fs/files.h"
#include "runtime/plist/codec.h"

namespace appsync {

void AppsClient::_createPlaceHolderApplication(const std::shared_ptr<TRAsset>& asset) {
  if (!asset) return;
  const std::optional<std::string> name = asset->prettyName();
  const std::string identifier = asset->identifier();
  const plist::Dict variantOptions = asset->variantOptions();
  // An asset without a version is not expected. It is treated as the restore road treats
  // metadata without "bundleVersion": the null marker cannot be written into Info.plist, so
  // the placeholder stops silently at that step.
  const plist::Value* storedVersion = variantOptions.find("Version");
  const plist::Value version = storedVersion ? *storedVersion : plist::Value::null();
  const std::optional<std::string> infoPlistPath = asset->infoPlist();
  logDefault("%s|plist %{public}@", infoPlistPath);

  const plist::Dict assetInfo =
      infoPlistPath ? readPlistDictionary(*infoPlistPath).value_or(plist::Dict{}) : plist::Dict{};
  const plist::Value* storedGazette = assetInfo.find(kGazetteAppKey);
  const plist::Value gazette = storedGazette ? *storedGazette : plist::Value(false);
  const plist::Value* prohibited = assetInfo.find(kLaunchProhibitedKey);
  const bool launchProhibited = prohibited && prohibited->truthValue().value_or(false);

  if (!name || name->empty() || identifier.empty()) return;

  const std::optional<std::string> directory = placeholderAppPathForBundleIdentifier(identifier);
  if (!directory) {
    reportUnusablePlaceholderPath(platform_, identifier);
    return;
  }
  if (!createPlaceHolderPath(*directory, identifier, mobileFileAttributes())) return;

  // The icon keeps the owner and group the copy gives it.
  if (const std::optional<std::string> iconSource = asset->icon()) {
    const std::string iconPath = placeholderFile(*directory, kPlaceholderIconFileName);
    ErrorRef copyError;
    if (!copyFile(*iconSource, iconPath, &copyError)) {
      logError("%s|Copying icon from %{public}@ to %{public}@ failed: %{public}@", *iconSource,
               iconPath, copyError);
    }
  }

  const plist::Dict info =
      placeholderInfoPlist(identifier, version, plist::Value(*name), gazette, launchProhibited);
  if (!writePlistAtomically(placeholderFile(*directory, kPlaceholderInfoFileName), info,
                            plist::Format::Binary)) {
    return;
  }
  logDefault("%s|creating placeholder for '%{public}@'. info.plist=%{public}@", identifier, info);

  plist::Dict options;
  options.set(std::string(ARPackageTypeKey), ARPackageTypePlaceholder);
  options.set(std::string(kBNBundleIdentifierKey), identifier);
  options.set(std::string(ARInstallTypeKey), ARInstallTypeSync);

  if (platform_.ar.installApplication(*directory, options)) {
    logDefault(
        "%s|Installed Placeholder app from path %{public}@: %{public}@ [%{public}@ "
        "%{public}@] [isGazette: %{public}@]",
        *directory, *name, identifier, logText(version), logText(gazette));
    platform_.transactionLog.logScenario(std::string(kInstallPlaceholderScenario), 0, true,
                                         identifier, "Installed placeholder");
  } else {
    logError(
        "%s|Placeholder app install failed from path %{public}@: %{public}@ [%{public}@ "
        "%{public}@] [isGazette: %{public}@]",
        *directory, *name, identifier, logText(version), logText(gazette));
    platform_.transactionLog.logScenario(std::string(kInstallPlaceholderScenario), 0, false,
                                         identifier, "Failed to install placeholder");
  }
}

}  // namespace appsync
