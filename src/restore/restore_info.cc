// The restore after a backup restore: every app of the host's restore list becomes a
// placeholder, through the coordination service or the registry, so the home screen shows it at
// once. On the coordinated road the client then waits a bounded time for the service to install
// the placeholders. The list is moved to its log copy afterwards, so it is processed once.
#include <algorithm>
#include <chrono>
#include <filesystem>

#include "client/apps_client.h"
#include "client/asset_path.h"
#include "runtime/fs/files.h"
#include "runtime/plist/codec.h"

namespace appsync {

namespace {

constexpr std::string_view kMetadataKey = "CaravelMetadata";
constexpr std::string_view kSINFKey = "ApplicationSINF";
constexpr std::string_view kIconKey = "PlaceholderIcon";
constexpr std::string_view kAutomaticDowngradesKey = "AutomaticDowngrades";
constexpr std::string_view kIntentionalDowngradesKey = "IntentionalDowngrades";
// Each awaited placeholder adds this much to the longest wait.
constexpr std::chrono::seconds kWaitPerPlaceholder{5};

enum DemotionStatus : std::uint64_t {
  kNotDemoted = 0,
  kIntentionallyDemoted = 1,
  kAutoDemoted = 2
};

bool lists(const plist::Array* identifiers, const std::string& bundleID) {
  if (!identifiers) return false;
  return std::ranges::any_of(*identifiers, [&](const plist::Value& item) {
    const std::string* text = item.string();
    return text && *text == bundleID;
  });
}

std::optional<plist::Bytes> bytesAt(const plist::Dict& record, std::string_view key) {
  const plist::Value* value = record.find(key);
  const plist::Bytes* bytes = value ? value->data() : nullptr;
  if (!bytes) return std::nullopt;
  return *bytes;
}

}  // namespace

void AppsClient::_processCaravelRestoreInfo() {
  const Paths& paths = platform_.paths;
  const std::string restoreList = paths.restoreList();
  // A list that is a link is the host's way out of the root: it is not ours to read or move.
  if (!fileExists(restoreList) || isSymbolicLink(restoreList)) {
    logDefault("%s|no caravel restore plist found - skipping processing of caravel restored apps");
    return;
  }
  ErrorRef error;
  if (const std::optional<plist::Bytes> bytes = readFile(restoreList, &error); !bytes) {
    logDefault("%s|failed to read caravel app restore info. err=%{public}@", error);
  } else {
    logDefault("%s|processing caravel restore info");
    plist::ParseError parseError;
    std::optional<plist::Value> root = plist::parse(*bytes, &parseError);
    if (root && !root->dict()) parseError.message = "the restore list is not a dictionary";
    if (!root || !root->dict()) {
      logDefault("%s|failed to parse caravel app restore info. err=%{public}@",
                 makeError(kPropertyListErrorDomain, 1, parseError.message, restoreList));
    } else {
      _restoreApplicationsOfRestoreList(*root->dict());
      _waitForRestorePlaceholderInstalls();
    }
  }

  // Kept for diagnosis, replacing the previous run's copy.
  const std::string logCopy = paths.restoreListLogCopy();
  const std::string logDirectory = std::filesystem::path(logCopy).parent_path().string();
  ErrorRef moveError;
  if (!resolvesInsideRoot(logDirectory, paths.root())) {
    moveError = makePOSIXError(EPERM, logDirectory);
  } else {
    removeFile(logCopy);
    if (createDirectories(logDirectory, &moveError)) moveItem(restoreList, logCopy, &moveError);
  }
  if (moveError) logDefault("%s|failed to copy caravel metadata. err=%{public}@", moveError);
}

void AppsClient::_restoreApplicationsOfRestoreList(const plist::Dict& restoreInfo) {
  const std::optional<plist::Dict> demoted =
      _loadDemotedAppsPlist(platform_.tr, platform_.paths.demotedApps(), nullptr);
  const plist::Array* automatic =
      demoted ? plist::arrayAt(*demoted, kAutomaticDowngradesKey) : nullptr;
  const plist::Array* intentional =
      demoted ? plist::arrayAt(*demoted, kIntentionalDowngradesKey) : nullptr;
  pluginLog(platform_.tr.TRGetLogCategory(kSyncSummaryLogCategory), LogLevel::Default,
            "%s|Demoted Apps: %{public}@", demoted);

  for (const auto& [bundleID, value] : restoreInfo) {
    const std::uint64_t status = lists(automatic, bundleID)     ? kAutoDemoted
                                 : lists(intentional, bundleID) ? kIntentionallyDemoted
                                                                : kNotDemoted;
    logDefault("%s|processing caravel restore info for '%{public}@' demotionStatus :%lu", bundleID,
               status);
    if (_placeholderExistsForApplication(bundleID)) {
      logDefault("%s|placeholder already exists for '%{public}@' - skiping'", bundleID);
      continue;
    }
    // A record of another type is one without metadata.
    const plist::Dict* record = value.dict();
    const std::optional<plist::Bytes> metadata =
        record ? bytesAt(*record, kMetadataKey) : std::nullopt;
    if (!metadata) {
      logDefault("%s|no CaravelMetadata for '%{public}@' - ignoring", bundleID);
      continue;
    }
    const std::optional<plist::Bytes> sinf = bytesAt(*record, kSINFKey);
    const std::optional<plist::Bytes> icon = bytesAt(*record, kIconKey);
    if (_useInstallCoordinator) {
      prepareAppForRestoreUsingCoordination(bundleID, *metadata, sinf, icon, status);
    } else {
      _processCaravelRestoreInfoForApp(bundleID, *metadata, sinf, icon);
    }
  }
}

void AppsClient::_waitForRestorePlaceholderInstalls() {
  const std::int64_t count = restoringPlaceholderCount();
  const auto bound = kWaitPerPlaceholder * count;
  logDefault("%s|Will wait for %lld seconds for %lld placeholders to install",
             static_cast<std::int64_t>(bound.count()), count);
  Clock& clock = platform_.system.clock();
  _restorePlaceHoldersWaitGroup->waitUntil(clock, clock.now() + bound);
  _restoreQueue->sync([&] {
    logDefault("%s|Finished waiting for placeholder installs");
    _finishedWaitingForPlaceHolderInstalls = true;
  });
}

}  // namespace appsync
