// Which packages the host is to transfer: the todo list's installs and the placeholders on the
// device become candidates, the registry's running installs and the skip rules take some away,
// and each survivor becomes a download asset readied on the client's installation road.
#include <set>
#include <string>
#include <vector>

#include "client/apps_client.h"
#include "client/asset_path.h"
#include "platform/bundle_keys.h"
#include "reporting/in_progress_asset_query.h"
#include "runtime/fs/files.h"
#include "state/todo_list.h"

namespace appsync {

namespace {

// Keys of a candidate record.
constexpr std::string_view kCandidatePath = "Path";
constexpr std::string_view kCandidateContainer = "Container";
constexpr std::string_view kCandidateNameFromCaravel = "NameFromCaravel";
constexpr std::string_view kCandidateIsRestore = "IsRestore";
constexpr std::string_view kCandidateAutoDemoted = "auto_demoted_app";
constexpr std::string_view kCandidateIntentionalDemoted = "intentional_demoted_app";
constexpr std::string_view kCandidateSystemApp = "system_app";

// Asset-part codes of the sync framework.
constexpr std::int64_t kAssetPartApplication = 1;
constexpr std::int64_t kAssetPartApplicationData = 2;
constexpr std::int64_t kAssetPartsBoth = 3;

std::optional<std::string> candidateString(const plist::Dict& candidate, std::string_view key) {
  const std::string* value = plist::stringAt(candidate, key);
  return value ? std::optional<std::string>(*value) : std::nullopt;
}

// Absent, or not answering to a boolean value, reads as false.
bool candidateFlag(const plist::Dict& candidate, std::string_view key) {
  const plist::Value* value = candidate.find(key);
  return value && value->truthValue().value_or(false);
}

void setIfPresent(plist::Dict& dict, std::string_view key,
                  const std::optional<std::string>& value) {
  if (value && !value->empty()) dict.set(std::string(key), *value);
}

plist::Dict placeholderCandidate(const ARApplicationProxy& proxy) {
  plist::Dict candidate;
  if (!proxy.bundleIdentifier.empty()) {
    candidate.set(std::string(kBNBundleIdentifierKey), proxy.bundleIdentifier);
  }
  setIfPresent(candidate, kBNBundleVersionKey, proxy.bundleVersion);
  setIfPresent(candidate, kCandidatePath, proxy.bundleURL);
  setIfPresent(candidate, kCandidateContainer, proxy.bundleContainerURL);
  auto flag = [](bool on) { return plist::Value(std::int64_t{on ? 1 : 0}); };
  candidate.set(std::string(kCandidateIsRestore), flag(proxy.installType == ARInstallTypeRestore));
  candidate.set(std::string(kCandidateAutoDemoted),
                flag(proxy.installType == ARInstallTypeDowngrade));
  candidate.set(std::string(kCandidateIntentionalDemoted),
                flag(proxy.installType == ARInstallTypeIntentionalDemotion));
  candidate.set(std::string(kCandidateSystemApp), proxy.applicationType == ARApplicationTypeSystem);
  return candidate;
}

plist::Dict todoCandidate(const plist::Dict& record, const std::string& identifier,
                          const std::string& packageDirectory) {
  plist::Dict candidate;
  candidate.set(std::string(kBNBundleIdentifierKey), identifier);
  if (const std::string* version = plist::stringAt(record, "version")) {
    candidate.set(std::string(kBNBundleVersionKey), *version);
  }
  candidate.set(std::string(kCandidatePath), packageDirectory);
  candidate.set(std::string(kCandidateContainer), packageDirectory);
  if (const std::string* name = plist::stringAt(record, "name")) {
    candidate.set(std::string(kCandidateNameFromCaravel), *name);
  }
  return candidate;
}

plist::Array stringsAsArray(const std::vector<std::string>& strings) {
  plist::Array out;
  out.reserve(strings.size());
  for (const std::string& s : strings) out.emplace_back(s);
  return out;
}

// The display name in the Info.plist of the bundle at `bundlePath`; absent without one.
std::optional<std::string> bundleDisplayName(const std::optional<std::string>& bundlePath) {
  if (!bundlePath) return std::nullopt;
  std::optional<plist::Dict> info = readPlistDictionary(Paths::packageInfoPlist(*bundlePath));
  if (!info) return std::nullopt;
  return candidateString(*info, _kBNBundleDisplayNameKey);
}

}  // namespace

std::vector<std::shared_ptr<TRAsset>> AppsClient::outstandingAssetTransfers() {
  const Paths& paths = platform_.paths;
  const LogCategory& summaryLog = platform_.tr.TRGetLogCategory(kSyncSummaryLogCategory);

  // 1. The inputs.
  std::vector<std::shared_ptr<TRAsset>> result;
  result.reserve(16);
  const bool installationAllowed = _appInstallationAllowed();
  const std::optional<plist::Array> todoList = _loadPlist(platform_.tr, paths.todoList(), nullptr);
  pluginLog(summaryLog, LogLevel::Default,
            "%s|outstandingAssetTransfers starting with todoList %{public}@", todoList);

  // 2. Every placeholder on the device is a candidate to begin with.
  plist::Dict idsWeWant;
  idsWeWant.reserve(todoList ? todoList->size() : 0);
  plist::Dict preExistingPlaceHolders;
  const std::set<std::string> systemAppPlaceholders = _getSystemAppPlaceholders();
  _enumeratePlaceholdersWithBlock(
      [&](const std::shared_ptr<const ARApplicationProxy>& proxy, bool* /*stop*/) {
        preExistingPlaceHolders.set(proxy->applicationIdentifier, placeholderCandidate(*proxy));
      });
  for (const plist::Dict::Entry& entry : preExistingPlaceHolders) {
    idsWeWant.set(entry.key, entry.value);
  }
  pluginLog(summaryLog, LogLevel::Default,
            "%s|outstandingAssetTransfers preExistingPlaceHolders %{public}@, idsWeWant %{public}@",
            preExistingPlaceHolders, idsWeWant);

  // 3. The todo list's installs.
  std::set<std::string> requested;
  const std::string syncFolder = paths.syncFolder();
  // Identifiers whose folder was found to stay inside the sync folder: a list may name one
  // many times.
  std::set<std::string> confinedIdentifiers;
  for (const plist::Value& item : todoList.value_or(plist::Array{})) {
    const plist::Dict* record = item.dict();
    if (!record) continue;
    const std::string* operation = plist::stringAt(*record, kTodoOperationKey);
    if (!operation || *operation != kTodoInstall) continue;
    const plist::Value* identifierValue = record->find(kTodoIdentifierKey);
    // Beyond the documented test, the identifier names a folder of the sync folder: one that
    // would leave it, directly or through a link, is refused the same way.
    std::optional<std::string> packageDirectory;
    if (isValidAssetPath(identifierValue)) {
      const std::string& name = *identifierValue->string();
      packageDirectory = paths.packageDirectory(name);
      if (packageDirectory && confinedIdentifiers.count(name) == 0) {
        if (resolvesInside(syncFolder, name)) {
          confinedIdentifiers.insert(name);
        } else {
          packageDirectory.reset();
        }
      }
    }
    if (!packageDirectory) {
      logDefault("%s|Ignoring invalid path: %{public}@", identifierValue);
      continue;
    }
    const std::string& identifier = *identifierValue->string();
    requested.insert(identifier);
    if (idsWeWant.contains(identifier)) {
      logDefault("%s|%{public}@ already has a placeholder - skipping", identifier);
      continue;
    }
    idsWeWant.set(identifier, todoCandidate(*record, identifier, *packageDirectory));
  }

  // 4. What the registry installs already is not asked for again.
  std::optional<std::vector<std::string>> inProgress, restoring;
  InProgressAssetQuery::currentInProgressAssetIDs(platform_, &inProgress, &restoring);
  if (inProgress) {
    logDefault("%s|Assets already in progress (not returning these): %{public}@",
               stringsAsArray(*inProgress));
    for (const std::string& identifier : *inProgress) idsWeWant.erase(identifier);
  } else {
    logError("%s|Failed to get list of assets already in progress!");
  }
  if (restoring) {
    logDefault("%s|Assets currently restoring: %{public}@", stringsAsArray(*restoring));
  } else {
    logError("%s|Failed to get list of assets currently restoring!");
  }

  // 5, 6. Download order, and an empty icon scratch directory.
  const plist::Array ordered = _orderTheItems(platform_, idsWeWant);
  const std::string iconsDirectory = paths.iconsDirectory();
  removeAll(iconsDirectory);
  ErrorRef iconsError;
  if (!createDirectory(iconsDirectory, &iconsError)) {
    logError("%s|Can't create icon scratch dir! %{public}@", iconsError);
  }

  for (const plist::Value& item : ordered) {
    // 7. The candidate's facts.
    const plist::Dict* candidate = item.dict();
    if (!candidate) continue;
    const std::optional<std::string> identifier =
        candidateString(*candidate, kBNBundleIdentifierKey);
    if (!identifier) continue;  // a placeholder the registry names without an identifier
    const std::optional<std::string> path = candidateString(*candidate, kCandidatePath);
    const std::optional<std::string> container = candidateString(*candidate, kCandidateContainer);
    const std::optional<std::string> iconPath = paths.iconFile(*identifier);
    const std::optional<std::string> displayName = bundleDisplayName(path);
    const std::optional<std::string> version = candidateString(*candidate, kBNBundleVersionKey);
    const bool isRestore = candidateFlag(*candidate, kCandidateIsRestore);
    const bool autoDemoted = candidateFlag(*candidate, kCandidateAutoDemoted);
    const bool manualDemoted = candidateFlag(*candidate, kCandidateIntentionalDemoted);
    const bool systemApp = candidateFlag(*candidate, kCandidateSystemApp);

    // 8. The skip rules, first match wins.
    if (!installationAllowed && !isRestore) {
      logDefault("%s|skipping %{public}@ - its not a restore and app installation is disabled",
                 *identifier);
      continue;
    }
    if (isRestore && _useInstallCoordinator) {
      logDefault(
          "%s|%{public}@ is currenlty marked to be restored and will be handled by bazaard - "
          "skipping",
          *identifier);
      continue;
    }
    if (systemApp && _useInstallCoordinator) {
      logDefault("%s|%{public}@ is auto demoted: %d, manual demoted: %d, system app:%d - skipping",
                 *identifier, autoDemoted, manualDemoted, 1);
      continue;
    }
    if (systemAppPlaceholders.count(*identifier) > 0) {
      logDefault("%s|%{public}@ is system app placeholder - skipping", *identifier);
      continue;
    }
    if ((autoDemoted || manualDemoted) && _useInstallCoordinator) {
      if (requested.count(*identifier) == 0) {
        logDefault("%s|%{public}@ is currenlty demoted (manual:%d, auto:%d) - skipping",
                   *identifier, manualDemoted, autoDemoted);
        continue;
      }
      logDefault(
          "%s|%{public}@ is currenlty demoted (manual:%d, auto:%d) - but will be installed as "
          "it's requested by client",
          *identifier, manualDemoted, autoDemoted);
    }

    // 9, 10. Pretty name; the icon, rendered into the scratch directory or else the host's
    // artwork beside the bundle.
    std::string prettyName = *identifier;
    if (displayName) {
      prettyName = *displayName;
    } else if (auto fromCaravel = candidateString(*candidate, kCandidateNameFromCaravel)) {
      prettyName = *fromCaravel;
    }
    std::optional<std::string> icon;
    if (iconPath && _makeIconFromBundlePath(platform_, path, *iconPath)) {
      icon = iconPath;
    } else if (container) {
      icon = Paths::packageArtwork(*container);
    }

    // 11. The asset.
    std::shared_ptr<TRAsset> asset = TRAsset::downloadAssetWithIdentifier(
        *identifier, std::string(kApplicationDataclass), prettyName);
    asset->setIcon(icon);
    asset->setIsRestore(isRestore);

    // 12. A package an earlier transfer left on the device.
    bool recoveredPackageExists = false;
    const std::optional<plist::Value> recorded =
        _restoreStatePropertyForKey(std::string(kRestoreStatePathKey), *identifier, version);
    if (const std::string* recoveredPath = recorded ? recorded->string() : nullptr) {
      recoveredPackageExists = fileExists(*recoveredPath);
      if (recoveredPackageExists) {
        logDefault("%s|Recovered download path for %{public}@ at %{public}@", *identifier,
                   *recoveredPath);
      } else {
        logDefault("%s|Download path recovered for %{public}@ but the file is missing: %{public}@",
                   *identifier, *recoveredPath);
      }
    }

    // 13. Variant options and the metadata paths.
    std::int64_t assetParts = kAssetPartApplication;
    if (isRestore)
      assetParts = recoveredPackageExists ? kAssetPartApplicationData : kAssetPartsBoth;
    plist::Dict variantOptions{{"AssetParts", assetParts}};
    if (version) variantOptions.set("Version", *version);
    asset->setVariantOptions(std::move(variantOptions));
    const std::optional<std::string> storePlist =
        container ? std::optional<std::string>(Paths::packageMetadata(*container)) : std::nullopt;
    const std::optional<std::string> infoPlist =
        path ? std::optional<std::string>(Paths::packageInfoPlist(*path)) : std::nullopt;
    asset->setStorePlist(storePlist);
    asset->setInfoPlist(infoPlist);

    // 14.
    logDefault(
        "%s|Asset %{public}@ (pretty=%{public}@, version=%{public}@) prepped with icon "
        "%{public}@, at %{public}@, meta at %{public}@, info at %{public}@, storePid=%lld, "
        "isRestore=%c",
        *identifier, prettyName, version, icon, path, storePlist, infoPlist, asset->storePID(),
        isRestore ? 'y' : 'n');

    if (_useInstallCoordinator) {
      // 15. Coordinated road: an installed app is updated, anything else installed afresh.
      const std::shared_ptr<const ARApplicationProxy> installed =
          platform_.ar.applicationProxyForIdentifier(*identifier, false);
      const bool existingApp = installed && installed->isInstalled && !installed->isPlaceholder;
      if (existingApp) {
        logDefault("%s|App %{public}@ is already installed and will be updated.", *identifier);
      }
      if (prepareAppForInstallUsingCoordination(asset, existingApp)) {
        result.push_back(asset);
        _accessQueue->sync([&] {
          if (existingApp) _updatingApps.insert(*identifier);
        });
      } else {
        logError("%s|Not requesting app asset for %{public}@", *identifier);
        changeAssetID(*identifier, std::string(kTodoFailed));
      }
      continue;
    }

    // 16. Legacy road: a placeholder shows the app while its package travels.
    if (preExistingPlaceHolders.contains(*identifier)) {
      logDefault("%s|Not creating a placeholder app for %{public}@ because we already have one",
                 *identifier);
    } else {
      _createPlaceHolderApplication(asset);
    }
    result.push_back(asset);
  }
  return result;
}

}  // namespace appsync
