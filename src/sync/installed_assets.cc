// The inventory of vanished applications: which apps the host is to treat as deleted.
#include <string_view>
#include <unordered_map>
#include <unordered_set>

#include "client/apps_client.h"
#include "platform/bundle_keys.h"

namespace appsync {

namespace {

// The first todo record of each identifier: candidates are judged by it, and a lookup per
// candidate must not scan the whole list again.
std::unordered_map<std::string_view, const plist::Dict*> firstRecordByIdentifier(
    const std::optional<plist::Array>& toDoList) {
  std::unordered_map<std::string_view, const plist::Dict*> first;
  if (!toDoList) return first;
  first.reserve(toDoList->size());
  for (const plist::Value& record : *toDoList) {
    const plist::Dict* dict = record.dict();
    const std::string* identifier = dict ? plist::stringAt(*dict, kTodoIdentifierKey) : nullptr;
    if (identifier) first.try_emplace(*identifier, dict);
  }
  return first;
}

}  // namespace

plist::Dict AppsClient::installedAssets() {
  logDefault("%s|getting installed assets");
  TRHostFramework& tr = platform_.tr;
  std::optional<plist::Array> toDoList = _loadPlist(tr, platform_.paths.todoList(), nullptr);
  std::optional<plist::Array> lastSyncedApps =
      _loadPlist(tr, platform_.paths.lastSyncAppState(), nullptr);

  // The candidate set, in the order its members were found.
  std::vector<std::string> candidates;
  std::unordered_set<std::string> seen;
  const auto addCandidate = [&](const std::string& identifier) {
    if (seen.insert(identifier).second) candidates.push_back(identifier);
  };

  if (std::unique_ptr<plist::Dict> uninstalled = platform_.em.EmplaceLookupUninstalled(nullptr)) {
    std::vector<std::string> identifiers;
    identifiers.reserve(uninstalled->size());
    for (const auto& entry : *uninstalled) identifiers.push_back(entry.key);
    for (const std::string& identifier : identifiers) addCandidate(identifier);
    _uninstalledApps = std::move(identifiers);
  } else {
    logError("%s|EmplaceLookupUninstalled returned NULL");
  }

  if (lastSyncedApps) {
    for (const plist::Value& item : *lastSyncedApps) {
      const std::string* identifier = item.string();
      if (!identifier || seen.count(*identifier)) continue;
      if (!platform_.ar.applicationIsInstalled(*identifier)) addCandidate(*identifier);
    }
  }

  const auto records = firstRecordByIdentifier(toDoList);
  plist::Array deleted;
  for (const std::string& candidate : candidates) {
    bool found = false, installed = false, failed = false;
    if (auto it = records.find(candidate); it != records.end()) {
      found = true;
      const std::string* operation = plist::stringAt(*it->second, kTodoOperationKey);
      failed = operation && *operation == kTodoFailed;
      installed = !failed && operation && *operation == kTodoInstalled;
    }
    if (failed || installed || !found) {
      logDefault(
          "%s|%{public}@ not installed, and no todo (found=%d pi=%d failed=%d) Marking as deleted",
          candidate, found ? 1 : 0, installed ? 1 : 0, failed ? 1 : 0);
      deleted.emplace_back(plist::Dict{{std::string(kBNBundleIdentifierKey), candidate}});
    } else {
      logDefault("%s|%{public}@ not installed, but is in our todo list. Not marking deleted",
                 candidate);
    }
  }

  plist::Dict result{{"_Deleted", std::move(deleted)}};
  const LogCategory& summary = tr.TRGetLogCategory(kSyncSummaryLogCategory);
  if (summary.enabled(LogLevel::Default)) {
    std::optional<plist::Array> uninstalledApps;
    if (_uninstalledApps)
      uninstalledApps.emplace(_uninstalledApps->begin(), _uninstalledApps->end());
    pluginLog(summary, LogLevel::Default,
              "%s|finished getting installed assets toDoList:%{public}@, uninstalled apps "
              "%{public}@, last synced apps%{public}@",
              toDoList, uninstalledApps, lastSyncedApps);
  }
  return result;
}

}  // namespace appsync
