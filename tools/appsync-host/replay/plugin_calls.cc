// `plugin: NAME`: the plugin's own operations that no host operation reaches yet, called
// directly so that scripts can exercise them. The list is kept short and shrinks as the host
// operations that use them land; docs/replay-actions.md lists each with its fields:
//   changeAssetID (app, state), processCaravelRestoreInfoForApp (app,
//   metadata, sinf, icon) -> bool, setRestoreStateProperty (app, version, key, value),
//   restoreStateProperty (app, version, key) -> the value (no result when absent),
//   cleanRestoreState (app), placeholderExists (app) -> bool,
//   createPlaceHolderApplication (asset), prepareAppForInstallUsingCoordination (asset,
//   existingApp) -> bool, updateTransferProgressForApp (asset, existingApp) -> bool,
//   transferCompleteForApp (asset, error, existingApp), assetSyncFinishedWithStatus (status,
//   outstanding), uninstallAppUsingCoordination (app).
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "client/apps_client.h"
#include "replay/action_table.h"
#include "replay/actions.h"
#include "replay/asset_spec.h"

namespace appsync::host::replay {

namespace {

std::string appOf(const StepContext& c) { return c.step["app"].string(); }

std::optional<std::string> versionOf(const StepContext& c) {
  auto field = c.step.optional("version");
  return field ? std::optional<std::string>(field->string()) : std::nullopt;
}

bool existingAppOf(const StepContext& c) {
  auto field = c.step.optional("existingApp");
  return field && field->boolean();
}

std::optional<plist::Bytes> optionalData(const StepContext& c, std::string_view key) {
  auto field = c.step.optional(key);
  return field ? std::optional<plist::Bytes>(readData(*field)) : std::nullopt;
}

const std::vector<ActionEntry>& pluginTable() {
  static const std::vector<ActionEntry> table = {
      {"changeAssetID",
       {"app", "state"},
       [](StepContext& s) -> ActionResult {
         s.session.client().changeAssetID(appOf(s), s.step["state"].string());
         return std::nullopt;
       }},
      {"processCaravelRestoreInfoForApp",
       {"app", "metadata", "sinf", "icon"},
       [](StepContext& s) -> ActionResult {
         std::string bundleID = appOf(s);
         plist::Bytes metadata = readDataOrPlist(s.step["metadata"]);
         auto sinf = optionalData(s, "sinf");
         auto icon = optionalData(s, "icon");
         return plist::Value(
             s.session.client()._processCaravelRestoreInfoForApp(bundleID, metadata, sinf, icon));
       }},
      {"setRestoreStateProperty",
       {"app", "version", "key", "value"},
       [](StepContext& s) -> ActionResult {
         std::string bundleID = appOf(s);
         plist::Value value = s.step["value"].plist();
         // A recorded download path is a path handed to the client: resolved under the root.
         if (s.step["key"].string() == "path" && value.string()) {
           value = plist::Value(clientPath(s.session.root(), *value.string()));
         }
         s.session.client()._setRestoreStatePropertyValue(value, s.step["key"].string(), bundleID,
                                                          versionOf(s));
         return std::nullopt;
       }},
      {"restoreStateProperty",
       {"app", "version", "key"},
       [](StepContext& s) -> ActionResult {
         std::string bundleID = appOf(s);
         std::optional<plist::Value> value = s.session.client()._restoreStatePropertyForKey(
             s.step["key"].string(), bundleID, versionOf(s));
         if (value && value->string() && s.step["key"].string() == "path") {
           value = plist::Value(shownPath(s.session.root(), *value->string()));
         }
         return value;
       }},
      {"cleanRestoreState",
       {"app"},
       [](StepContext& s) -> ActionResult {
         s.session.client().cleanRestoreStateForIdentifier(appOf(s));
         return std::nullopt;
       }},
      {"placeholderExists",
       {"app"},
       [](StepContext& s) -> ActionResult {
         return plist::Value(s.session.client()._placeholderExistsForApplication(appOf(s)));
       }},
      {"createPlaceHolderApplication",
       {"asset"},
       [](StepContext& s) -> ActionResult {
         auto asset = readAsset(s.step["asset"], s.session.root());
         s.session.client()._createPlaceHolderApplication(asset);
         return std::nullopt;
       }},
      {"prepareAppForInstallUsingCoordination",
       {"asset", "existingApp"},
       [](StepContext& s) -> ActionResult {
         auto asset = readAsset(s.step["asset"], s.session.root());
         return plist::Value(
             s.session.client().prepareAppForInstallUsingCoordination(asset, existingAppOf(s)));
       }},
      {"updateTransferProgressForApp",
       {"asset", "existingApp"},
       [](StepContext& s) -> ActionResult {
         auto asset = readAsset(s.step["asset"], s.session.root());
         return plist::Value(
             s.session.client().updateTransferProgressForApp(asset, existingAppOf(s)));
       }},
      {"transferCompleteForApp",
       {"asset", "error", "existingApp"},
       [](StepContext& s) -> ActionResult {
         auto asset = readAsset(s.step["asset"], s.session.root());
         auto errorField = s.step.optional("error");
         s.session.client().transferCompleteForApp(
             asset, errorField ? readError(*errorField) : nullptr, existingAppOf(s));
         return std::nullopt;
       }},
      {"assetSyncFinishedWithStatus",
       {"status", "outstanding"},
       [](StepContext& s) -> ActionResult {
         auto outstanding = s.step["outstanding"].strings();
         s.session.client().assetSyncFinishedWithStatus(
             s.step["status"].boolean(),
             std::set<std::string>(outstanding.begin(), outstanding.end()));
         return std::nullopt;
       }},
      {"uninstallAppUsingCoordination",
       {"app"},
       [](StepContext& s) -> ActionResult {
         s.session.client().uninstallAppUsingCoordination(appOf(s));
         return std::nullopt;
       }},
  };
  return table;
}

}  // namespace

ActionResult runPluginCall(StepContext& context) { return runFromTable(context, pluginTable()); }

}  // namespace appsync::host::replay
