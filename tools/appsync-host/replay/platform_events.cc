// `event: NAME`: something the platform tells the client, produced by the fakes as the device
// would: the host daemon's start-up notification, the registry's reports about installs, the
// install-coordination service's coordinator events, and holding back or releasing a service's
// deliveries. Events are queued on the service's own thread (none is waited for, except the
// start-up notification), so a held service keeps them until `event: release`.
#include <memory>
#include <string>
#include <vector>

#include "client/apps_client.h"
#include "device_files.h"
#include "platform/fake/fake_kc_objects.h"
#include "replay/action_table.h"
#include "replay/actions.h"

namespace appsync::host::replay {

namespace {

std::shared_ptr<FakeKCAppInstallCoordinator> coordinatorOf(StepContext& s) {
  const std::string app = s.step["app"].string();
  auto coordinator = s.session.device().kc().coordinator(app);
  if (!coordinator) throw StepFailed("the coordination service has no coordinator for " + app);
  return coordinator;
}

// The promise `which` (asset, user-data, icon, spr: the first SPR promise) of the coordinator.
std::shared_ptr<KCPromise> promiseOf(StepContext& s) {
  const YamlField field = s.step["promise"];
  const std::string which = field.string();
  if (which != "asset" && which != "user-data" && which != "icon" && which != "spr") {
    field.fail("unknown promise \"" + which + "\" (expected one of: asset, user-data, icon, spr)");
  }
  auto coordinator = coordinatorOf(s);
  FakeKCAppInstallCoordinator::Snapshot state = coordinator->snapshot();
  std::shared_ptr<KCPromise> promise;
  if (which == "asset") promise = state.appAssetPromise;
  if (which == "user-data") promise = state.userDataPromise;
  if (which == "icon") {
    if (auto* placeholder = dynamic_cast<FakeKCPlaceholder*>(state.placeholder.get())) {
      promise = placeholder->iconPromise();
    }
  }
  if (which == "spr" && !state.sprPromises.empty()) promise = state.sprPromises.front();
  if (!promise) {
    throw StepFailed("the coordinator of " + coordinator->bundleID() + " holds no " + which +
                     " promise");
  }
  return promise;
}

void holdOrRelease(StepContext& s, bool hold) {
  const YamlField field = s.step["service"];
  const std::string name = field.string();
  if (!s.session.holdService(name, hold)) {
    field.fail("unknown service \"" + name +
               "\" (expected one of: registry, coordination, notifications, store, host)");
  }
}

ActionResult postStartup(StepContext& s) {
  FakePlatform& device = s.session.device();
  // Posting waits for the delivery, which a held notification center never makes; only a step
  // running in the background may wait for a later release.
  if (device.system().callbackThread().isHeld() && !s.step.has("background")) {
    throw StepFailed(
        "the notifications service is held: the start-up notification would wait for ever "
        "(release it first, or run this step with `background:`)");
  }
  AppsClient& client = s.session.client();  // the daemon has loaded the plugin by then
  device.system().postNotification(std::string(kHostStartupNotification));
  return plist::Value(
      plist::Dict{{"coordinationObserver", client.hasInstallCoordinatorObserver()}});
}

const std::vector<ActionEntry>& eventTable() {
  static const std::vector<ActionEntry> table = {
      {"startup", {}, postStartup},
      {"installs-prioritized",
       {"prioritized", "paused"},
       [](StepContext& s) -> ActionResult {
         auto paused = s.step.optional("paused");
         s.session.device().ar().setInstallsInProgress(
             s.step["prioritized"].strings(),
             paused ? paused->strings() : std::vector<std::string>{});
         s.session.device().ar().notifyInstallsArePrioritized();
         return std::nullopt;
       }},
      {"installs-cancelled",
       {"apps"},
       [](StepContext& s) -> ActionResult {
         s.session.device().ar().notifyInstallsDidCancel(s.step["apps"].strings());
         return std::nullopt;
       }},
      {"coordinator-prioritize",
       {"app"},
       [](StepContext& s) -> ActionResult {
         coordinatorOf(s);
         s.session.device().kc().requestPrioritize(s.step["app"].string());
         return std::nullopt;
       }},
      {"promise-began",
       {"app", "promise"},
       [](StepContext& s) -> ActionResult {
         auto promise = promiseOf(s);
         auto identifier = FakeKCInstallCoordination::promiseIdentifier(*promise);
         if (!identifier ||
             !s.session.device().kc().notifyPromiseDidBeginFulfillment(*identifier)) {
           throw StepFailed("no coordinator holds that promise any more");
         }
         return std::nullopt;
       }},
      {"store-download",
       {"app", "package"},
       [](StepContext& s) -> ActionResult {
         const std::string app = s.step["app"].string();
         const std::string package = devicePath(s.session.root(), s.step["package"]).string();
         if (!s.session.device().kc().completeStoreDownload(app, package)) {
           throw StepFailed("the store has no download for " + app +
                            " (no active coordinator whose asset the store delivers)");
         }
         return std::nullopt;
       }},
      {"coordinator-cancelled",
       {"app", "client", "reason"},
       [](StepContext& s) -> ActionResult {
         auto coordinator = coordinatorOf(s);
         const std::uint64_t client = s.step["client"].unsignedInteger();
         auto reasonField = s.step.optional("reason");
         ErrorRef reason = reasonField ? readError(*reasonField) : nullptr;
         ErrorRef error;
         if (!coordinator->cancelForReason(reason, client, &error)) {
           throw StepFailed("the coordinator of " + coordinator->bundleID() +
                            " could not be cancelled: " +
                            (error ? error->describe() : std::string("no reason given")));
         }
         return std::nullopt;
       }},
      {"hold",
       {"service"},
       [](StepContext& s) -> ActionResult {
         holdOrRelease(s, true);
         return std::nullopt;
       }},
      {"release",
       {"service"},
       [](StepContext& s) -> ActionResult {
         holdOrRelease(s, false);
         return std::nullopt;
       }},
  };
  return table;
}

}  // namespace

ActionResult runPlatformEvent(StepContext& context) { return runFromTable(context, eventTable()); }

}  // namespace appsync::host::replay
