// The bookkeeping that lets a restore wait for the placeholders it handed to the coordination
// service: one set member, one count and one group member per restoring app whose placeholder
// is awaited. All three change together, in one work item on _restoreQueue.
#include "client/apps_client.h"

namespace appsync {

void AppsClient::dataMigratorSetPlaceHolderPromiseForRestoreAppBundle(const std::string& bundleID) {
  _restoreQueue->sync([&] {
    if (!_placeholdersForRestoringApps.insert(bundleID).second) return;
    _restorePlaceHoldersWaitGroup->enter();
    ++_restoringPlaceholderCount;
    logDefault(
        "%s|DataMigrator will wait for IC to install placeholder for %{public}@, "
        "_restoringPlaceholderCount %lld",
        bundleID, _restoringPlaceholderCount);
  });
}

void AppsClient::icDidInstallPlaceHolderForAppBundle(const std::string& bundleID) {
  _restoreQueue->sync([&] {
    if (_finishedWaitingForPlaceHolderInstalls) return;
    if (_placeholdersForRestoringApps.erase(bundleID) == 0) {
      logError("%s|Ignoring notification from IC about installing placeholder for %{public}@",
               bundleID);
      return;
    }
    --_restoringPlaceholderCount;
    _restorePlaceHoldersWaitGroup->leave();
    logDefault(
        "%s|IC finished installing placeholder for %{public}@, _restoringPlaceholderCount %lld",
        bundleID, _restoringPlaceholderCount);
  });
}

void AppsClient::dataMigratorCancelledCoordinatorForRestoreAppBundle(const std::string& bundleID) {
  _restoreQueue->sync([&] {
    if (_placeholdersForRestoringApps.erase(bundleID) == 0) return;
    --_restoringPlaceholderCount;
    _restorePlaceHoldersWaitGroup->leave();
    logDefault(
        "%s|DataMigrator cancelled coordinator for restoring app bundle %{public}@ "
        "_restoringPlaceholderCount %lld",
        bundleID, _restoringPlaceholderCount);
  });
}

std::int64_t AppsClient::restoringPlaceholderCount() {
  std::int64_t count = 0;
  _restoreQueue->sync([&] { count = _restoringPlaceholderCount; });
  return count;
}

bool AppsClient::restoreWaitIsConsistent() {
  bool consistent = false;
  _restoreQueue->sync([&] {
    const auto members = static_cast<std::int64_t>(_placeholdersForRestoringApps.size());
    consistent =
        members == _restoringPlaceholderCount && members == _restorePlaceHoldersWaitGroup->count();
  });
  return consistent;
}

}  // namespace appsync
