// Reconciliation of a sync: the host's staging area becomes the sync folder, the todo list's
// removals are performed, and the home screen learns that a sync starts.
#include <sys/stat.h>

#include <cerrno>
#include <filesystem>
#include <system_error>

#include "client/apps_client.h"
#include "client/asset_path.h"
#include "runtime/fs/files.h"

namespace appsync {

namespace {

constexpr const char* kCaravelSyncScenario = "Caravel Sync";

}  // namespace

bool AppsClient::reconcileSync(std::uint32_t /*syncType*/, const std::string& newAnchor,
                               ProgressCallback /*progressCallback*/, ErrorRef* error) {
  logDefault("%s|starting to reconcile sync with new anchor %{public}@", newAnchor);
  const Paths& paths = platform_.paths;
  bool nothingStaged = false;
  const bool tookOver = _replaceSyncFolderWithStagingArea(error, &nothingStaged);
  if (tookOver && !nothingStaged) {
    const bool removalAllowed = _appRemovalAllowed();
    std::optional<plist::Array> toDoList;
    // The sync folder's files come from another computer: a link there may point anywhere, so
    // none is followed.
    if (isSymbolicLink(paths.todoList())) {
      setError(error, makePOSIXError(ELOOP, paths.todoList()));
    } else {
      toDoList = _loadPlist(platform_.tr, paths.todoList(), error);
    }
    if (!toDoList) {
      logDefault("%s|Nothing to do from Caravel");
    } else if (!removalAllowed) {
      logDefault("%s|Not processing deletes because app removal is restricted");
    } else {
      _performDeletions(*toDoList);
    }

    _notifyPavilion(platform_, true);
    if (!isSymbolicLink(paths.iconLayout())) _sendIconLayoutToPavilion(platform_);
    if (toDoList) {
      writePlistAtomically(paths.todoListDebugCopy(), plist::Value(std::move(*toDoList)),
                           plist::Format::Binary);
    }
  }
  logDefault("%s|finished reconcile sync");
  return tookOver;
}

bool AppsClient::_replaceSyncFolderWithStagingArea(ErrorRef* error, bool* nothingStaged) {
  const Paths& paths = platform_.paths;
  const std::string workArea = paths.workArea();
  const bool workAreaInsideRoot = resolvesInsideRoot(workArea, paths.root());
  // The previous sync's files go first, whatever happens next.
  if (workAreaInsideRoot) removeAll(paths.syncFolder());
  if (!workAreaInsideRoot) setError(error, makePOSIXError(EPERM, workArea));
  if (!workAreaInsideRoot || !createDirectories(workArea, error)) {
    logDefault("%s|can't create work area");
    return false;
  }

  const std::string stagingArea = paths.stagingArea();
  struct stat status {};
  if (::lstat(stagingArea.c_str(), &status) != 0) {
    logDefault("%s|Nothing to do");
    *nothingStaged = true;
    return true;
  }
  // A staging area that is a link, or that is reached through one out of the root, stays
  // where it is: moving it would bring the outside into the sync folder, or move it.
  const std::string stagingParent = std::filesystem::path(stagingArea).parent_path().string();
  if (S_ISLNK(status.st_mode)) {
    setError(error, makePOSIXError(ELOOP, stagingArea));
  } else if (!resolvesInsideRoot(stagingParent, paths.root())) {
    setError(error, makePOSIXError(EPERM, stagingArea));
  } else if (moveItem(stagingArea, paths.syncFolder(), error)) {
    return true;
  }
  logDefault("%s|Can't move staging area");
  return false;
}

void AppsClient::_performDeletions(const plist::Array& toDoList) {
  std::vector<std::string> deletions;
  deletions.reserve(8);
  for (const plist::Value& record : toDoList) {
    const plist::Dict* dict = record.dict();
    if (!dict) continue;
    const plist::Value* identifier = dict->find(kTodoIdentifierKey);
    const std::string* operation = plist::stringAt(*dict, kTodoOperationKey);
    if (!isValidApplicationIdentifier(identifier) || !operation || *operation != kTodoRemove) {
      continue;
    }
    logDefault("%s|%{public}@ targeted for termination", *identifier);
    deletions.push_back(*identifier->string());
  }
  if (deletions.empty()) return;

  logDefault("%s|performing %llu deletions", static_cast<unsigned long long>(deletions.size()));
  for (const std::string& identifier : deletions) {
    if (_useInstallCoordinator) {
      uninstallAppUsingCoordination(identifier);
    } else if (platform_.ar.uninstallApplication(identifier, std::nullopt)) {
      platform_.transactionLog.logScenario(kCaravelSyncScenario, 0, true, identifier,
                                           "Uninstall succeeded");
    } else {
      logError("%s|Uninstall of %{public}@ failed.", identifier);
      platform_.transactionLog.logScenario(kCaravelSyncScenario, 0, false, identifier,
                                           "Uninstall failed");
    }
  }
}

}  // namespace appsync
