// Telling the home screen that a sync starts or is done, and handing it the host's icon layout.
#include "client/apps_client.h"
#include "runtime/fs/files.h"

namespace appsync {

namespace {

// The system-wide notification whose state the home screen reads when the post wakes it:
// 1 while a sync or restore runs, 0 when it has ended.
constexpr const char* kSyncNotification = "com.vantor.pavilion.trc.wsyncnotify";

}  // namespace

void AppsClient::_notifyPavilion(const Platform& platform, bool starting) {
  const LogCategory& log = platform.tr.TRGetLogCategory(kAppSyncLogCategory);
  int token = 0;
  const std::uint32_t status = platform.system.notifyRegisterCheck(kSyncNotification, &token);
  pluginLog(log, LogLevel::Default, "%s|Notifying PV we are %s syncing",
            starting ? "starting" : "done");
  // Only asked for so that the home screen's server is up before it is woken; the port itself
  // is not needed for a notification.
  platform.pv.PVSPavilionBlockableServerPort();
  if (status != 0) {
    pluginLog(log, LogLevel::Error, "%s|Uh Oh...can't send notification to PV:%d",
              static_cast<int>(status));
    return;
  }
  // The state goes first: an observer woken by the post reads it at once.
  platform.system.notifySetState(token, starting ? 1 : 0);
  platform.system.notifyPost(kSyncNotification);
}

void AppsClient::_sendIconLayoutToPavilion(const Platform& platform) {
  // The layout belongs to the home screen; it is passed on as bytes and never interpreted.
  std::optional<plist::Bytes> layout = readFile(platform.paths.iconLayout());
  if (!layout || layout->empty()) return;
  pluginLog(platform.tr.TRGetLogCategory(kAppSyncLogCategory), LogLevel::Default,
            "%s|Sending iconlayout to PV");
  const PVPort port = platform.pv.PVSPavilionBlockableServerPort();
  platform.pv.PVSetIconState(port, layout->data(), layout->size());
}

}  // namespace appsync
