// The first calls of a session: the anchor (the client keeps none, so every sync is a full
// reconciliation from the host's todo list), the preparation, and the reconciliation of a restore,
// which restores the apps of the host's restore list.
#include "client/apps_client.h"
#include "client/asset_path.h"
#include "runtime/fs/files.h"

namespace appsync {

namespace {

constexpr std::string_view kNoSyncAnchor = "NO_APP_SYNC_ANCHOR";
// The restore type after which the apps of the host's restore list are restored.
constexpr std::int32_t kAppRestoreType = 2;

}  // namespace

std::string AppsClient::currentSyncAnchor() { return std::string(kNoSyncAnchor); }

bool AppsClient::prepareForSyncWithHostAnchor(const std::string& /*hostAnchor*/,
                                              ProgressCallback /*progressCallback*/,
                                              ErrorRef* /*error*/) {
  return true;
}

bool AppsClient::reconcileRestoreOfType(std::int32_t restoreType, ErrorRef* error) {
  logDefault("%s|reconcileRestoreOfType %d", restoreType);
  _notifyPavilion(platform_, true);
  // Whether the work area could be made is not this operation's concern; a work area that
  // leads out of the device root through a link is left alone.
  const std::string workArea = platform_.paths.workArea();
  if (resolvesInsideRoot(workArea, platform_.paths.root())) createDirectories(workArea, error);
  if (restoreType == kAppRestoreType) _processCaravelRestoreInfo();
  if (error) *error = nullptr;
  return true;
}

}  // namespace appsync
