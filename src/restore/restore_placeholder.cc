// The restore road for one application of the restore list: a placeholder directory built from
// the application's store metadata, icon and SINF, installed through the registry.
#include "client/apps_client.h"
#include "platform/bundle_keys.h"
#include "restore/placeholder_info.h"
#include "runtime/fs/files.h"
#include "runtime/plist/codec.h"

namespace appsync {

namespace {

// The value of the first of the two keys that is present.
const plist::Value* firstPresent(const plist::Dict& dict, std::string_view key,
                                 std::string_view fallbackKey) {
  const plist::Value* value = dict.find(key);
  return value ? value : dict.find(fallbackKey);
}

}  // namespace

bool AppsClient::_processCaravelRestoreInfoForApp(const std::string& bundleID,
                                                  const plist::Bytes& caravelMetaData,
                                                  const std::optional<plist::Bytes>& sinfData,
                                                  const std::optional<plist::Bytes>& iconData) {
  logDefault("%s|processing app restore info for '%{public}@'", bundleID);

  // Only a dictionary can be store metadata; another root is refused like unreadable bytes.
  ErrorRef parseError;
  const std::optional<plist::Dict> parsed = parseStoreMetadata(caravelMetaData, &parseError);
  if (!parsed) {
    logDefault("%s|failed to parse caravel metadata for '%{public}@'. err=%{public}@", bundleID,
               parseError);
    platform_.transactionLog.logScenario(std::string(kCaravelAppRestoreScenario), 0, false,
                                         bundleID, "Failed to parse caravel metadata");
    return false;
  }
  const plist::Dict& metadata = *parsed;

  const plist::Value* storedGazette = metadata.find(kGazetteAppKey);
  const plist::Value gazette = storedGazette ? *storedGazette : plist::Value(false);

  auto fail = [&] {
    logDefault(
        "%s|failed to process app restore info for '%{public}@'. "
        "caravelMetadataDictionary=%{public}@",
        bundleID, metadata);
    return false;
  };

  const FileAttributes attributes = mobileFileAttributes();
  const std::optional<std::string> directory = placeholderAppPathForBundleIdentifier(bundleID);
  bool directoryCreated = false;
  if (directory) {
    directoryCreated = createPlaceHolderPath(*directory, bundleID, attributes);
  } else {
    reportUnusablePlaceholderPath(platform_, bundleID);
  }
  if (!directoryCreated) {
    // The directory operation returns no error object, so there is none to show here.
    logDefault("%s|failed to create app directory for '%{public}@'. err=%{public}@", bundleID,
               nullptr);
    platform_.transactionLog.logScenario(std::string(kCaravelAppRestoreScenario), 0, false,
                                         bundleID, "Failed to create app directory");
    return fail();
  }

  // A missing or unwritable icon does not stop the placeholder.
  writeIconData(iconData, placeholderFile(*directory, kPlaceholderIconFileName), nullptr, bundleID,
                attributes);

  const plist::Value* storedVersion = metadata.find("bundleVersion");
  const plist::Value* storedName = firstPresent(metadata, "title", "itemName");
  const plist::Value version = storedVersion ? *storedVersion : plist::Value::null();
  const plist::Value name = storedName ? *storedName : plist::Value::null();
  const plist::Value* prohibited = firstPresent(metadata, kLaunchProhibitedKey, "launchProhibited");
  const bool launchProhibited = prohibited && prohibited->truthValue().value_or(false);

  const plist::Dict info = placeholderInfoPlist(bundleID, version, name, gazette, launchProhibited);
  logDefault("%s|creating placeholder for '%{public}@'. info.plist=%{public}@", bundleID, info);

  const std::string infoPath = placeholderFile(*directory, kPlaceholderInfoFileName);
  if (!writePlistAtomically(infoPath, info, plist::Format::Binary)) {
    logDefault("%s|failed to create placeholder info at %{public}@ with info %{public}@", infoPath,
               info);
    platform_.transactionLog.logScenario(std::string(kCaravelAppRestoreScenario), 0, false,
                                         bundleID, "Failed to create placeholder info");
    return fail();
  }

  plist::Dict options;
  options.set(std::string(ARPackageTypeKey), ARPackageTypePlaceholder);
  options.set(std::string(kBNBundleIdentifierKey), bundleID);
  options.set(std::string(ARInstallTypeKey), ARInstallTypeRestore);
  options.set(std::string(ARCaravelMetadataKey), caravelMetaData);
  // What the registry makes of a placeholder without SINF is its own business.
  options.set(std::string(ARApplicationSINFKey),
              sinfData ? plist::Value(*sinfData) : plist::Value::null());

  if (platform_.ar.installApplication(*directory, options)) {
    logDefault(
        "%s|Installed Placeholder app from path %{public}@: %{public}@ [%{public}@ "
        "%{public}@] [isGazette: %{public}@]",
        *directory, logText(name), bundleID, logText(version), logText(gazette));
    platform_.transactionLog.logScenario(std::string(kCaravelAppRestoreScenario), 0, true, bundleID,
                                         "Installed placeholder");
    return true;
  }
  logError(
      "%s|Placeholder app install failed from path %{public}@: %{public}@ [%{public}@ "
      "%{public}@] [isGazette: %{public}@]",
      *directory, logText(name), bundleID, logText(version), logText(gazette));
  platform_.transactionLog.logScenario(std::string(kCaravelAppRestoreScenario), 0, false, bundleID,
                                       "Failed to install placeholder");
  return fail();
}

}  // namespace appsync
