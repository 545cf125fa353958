// The end of a sync and the host's request to forget every sync: what both leave behind.
#include <system_error>

#include "client/apps_client.h"
#include "runtime/fs/files.h"

namespace appsync {

void AppsClient::syncEndedWithSuccess(bool success) {
  logDefault("%s|sync ended with success: %c", success ? 'y' : 'n');
  // After a failed sync the next inventory reports the same vanished apps again.
  if (!success) return;

  const Paths& paths = platform_.paths;
  const std::string workArea = paths.workArea();
  if (const int err = platform_.system.setFileTimesToNow(workArea); err != 0) {
    logError("%s|Failed to update utimes of \"%s\": %s", workArea,
             std::system_category().message(err));
  }

  if (_uninstalledApps) {
    logDefault("%s|clearing uninstalled apps: %{public}@",
               plist::Array(_uninstalledApps->begin(), _uninstalledApps->end()));
    if (platform_.em.EmplaceClearUninstalled(*_uninstalledApps, nullptr) != 0) {
      // Kept, so that a later successful sync end clears them.
      logError("%s|Failed to clear uninstalled apps from Emplace.");
    } else {
      _uninstalledApps.reset();
    }
  }
  removeFile(paths.lastSyncAppState());
}

void AppsClient::clearSyncData() {
  logDefault("%s|blasting work area");
  removeAll(platform_.paths.workArea());

  logDefault("%s|Uninstalling all placeholder apps");
  _enumeratePlaceholdersWithBlock([this](const std::shared_ptr<const ARApplicationProxy>& proxy,
                                         bool* /*stop*/) {
    const bool removed = platform_.ar.uninstallApplication(proxy->bundleIdentifier, std::nullopt);
    logDefault("%s|Uninstall %{public}@ = %c", proxy->bundleIdentifier, removed ? 'y' : 'n');
  });

  if (std::unique_ptr<plist::Dict> uninstalled = platform_.em.EmplaceLookupUninstalled(nullptr)) {
    std::vector<std::string> identifiers;
    identifiers.reserve(uninstalled->size());
    for (const auto& entry : *uninstalled) identifiers.push_back(entry.key);
    if (platform_.em.EmplaceClearUninstalled(identifiers, nullptr) != 0) {
      logError("%s|Failed to clear uninstalled apps list");
    }
  } else {
    logError("%s|Failed to fetch uninstalled apps list to clear it");
  }
}

}  // namespace appsync
