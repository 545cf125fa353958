#include "device_view.h"

#include <algorithm>
#include <cerrno>
#include <fstream>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/fake/fake_kc_objects.h"
#include "platform/fake/fake_tr.h"
#include "platform/rs.h"
#include "plist_json.h"
#include "runtime/fs/files.h"
#include "runtime/plist/codec.h"
#include "state/loaders.h"
#include "state/todo_list.h"

namespace appsync::host {

namespace {

using json = nlohmann::ordered_json;

template <class T>
json optionalJson(const std::optional<T>& value) {
  return value ? json(*value) : json(nullptr);
}

json errorJson(const ErrorRef& error) {
  if (!error) return nullptr;
  const std::string* description = plist::stringAt(error->userInfo, kErrorDescriptionKey);
  return {{"domain", error->domain},
          {"code", error->code},
          {"description", description ? json(*description) : json(nullptr)}};
}

json registryJson(const FakeARWorkspace& registry) {
  json records = json::array();
  for (const FakeARWorkspace::AppRecord& app : registry.applications()) {
    records.push_back({
        {"identifier", app.identifier},
        {"kind", !app.isApplication  ? "bundle"
                 : app.isPlaceholder ? "placeholder"
                                     : "installed"},
        {"type", app.applicationType},
        {"version", optionalJson(app.version)},
        {"name", optionalJson(app.name)},
        {"installType", app.installType},
        {"bundleDirectory", optionalJson(app.bundleDirectory)},
        {"containerDirectory", optionalJson(app.containerDirectory)},
        {"iconPath", optionalJson(app.iconPath)},
        {"staticDiskUsage", optionalJson(app.staticDiskUsage)},
        {"hasMIDBasedSINF", app.hasMIDBasedSINF},
    });
  }
  return records;
}

std::string_view coordinatorKindName(KCCoordinatorKind kind) {
  switch (kind) {
    case KCCoordinatorKind::Any:
      return "Any";
    case KCCoordinatorKind::Initiating:
      return "Initiating";
    case KCCoordinatorKind::Updating:
      return "Updating";
    case KCCoordinatorKind::Restoring:
      return "Restoring";
    case KCCoordinatorKind::RestoringDemoted:
      return "RestoringDemoted";
  }
  return "Any";
}

std::string_view coordinatorStateName(FakeKCAppInstallCoordinator::State state) {
  switch (state) {
    case FakeKCAppInstallCoordinator::State::Active:
      return "active";
    case FakeKCAppInstallCoordinator::State::Completed:
      return "completed";
    case FakeKCAppInstallCoordinator::State::Cancelled:
      return "cancelled";
  }
  return "active";
}

// One promise of a coordinator (or its placeholder's icon), named by the part it plays.
json promiseJson(std::string_view role, const KCPromise& promise) {
  json out = {{"role", role},
              {"name", promise.name()},
              {"client", promise.client()},
              {"diskSpaceNeeded", promise.diskSpaceNeeded()},
              {"percentComplete", promise.percentComplete()},
              {"complete", promise.isComplete()},
              {"cancelled", promise.isCancelled()},
              {"transferPath", nullptr}};
  if (const auto* toPath = dynamic_cast<const KCPromisedTransferToPath*>(&promise)) {
    out["transferPath"] = optionalJson(toPath->transferPath());
  }
  return out;
}

json placeholderJson(const std::shared_ptr<KCPlaceholder>& held, json& promises) {
  const auto placeholder = std::dynamic_pointer_cast<FakeKCPlaceholder>(held);
  if (!placeholder) return nullptr;
  if (const auto icon = placeholder->iconPromise()) promises.push_back(promiseJson("icon", *icon));
  const auto attributes = placeholder->attributes();
  return {{"name", placeholder->bundleName()},
          {"installType", placeholder->installType()},
          {"client", placeholder->client()},
          {"bundleVersion", attributes ? optionalJson(attributes->bundleVersion()) : json(nullptr)},
          {"configurationComplete", placeholder->isConfigurationComplete()},
          {"cancelled", placeholder->isCancelled()}};
}

json coordinatorsJson(const FakeKCInstallCoordination& coordination) {
  json coordinators = json::array();
  for (const auto& coordinator : coordination.coordinators()) {
    const FakeKCAppInstallCoordinator::Snapshot s = coordinator->snapshot();
    json promises = json::array();
    json placeholder = s.placeholder ? placeholderJson(s.placeholder, promises) : json(nullptr);
    if (s.appAssetPromise) promises.push_back(promiseJson("asset", *s.appAssetPromise));
    if (s.userDataPromise) promises.push_back(promiseJson("userData", *s.userDataPromise));
    for (const auto& spr : s.sprPromises) promises.push_back(promiseJson("spr", *spr));
    json options = nullptr;
    if (s.installOptions) {
      options = {{"arInstallType", s.installOptions->arInstallType()},
                 {"installTargetType", s.installOptions->installTargetType()},
                 {"hasMetadata", s.installOptions->caravelMetadata() != nullptr}};
    }
    coordinators.push_back({{"bundleID", coordinator->bundleID()},
                            {"kind", coordinatorKindName(coordinator->kind())},
                            {"creator", coordinator->creatorIdentifier()},
                            {"state", coordinatorStateName(s.state)},
                            {"error", errorJson(s.error)},
                            {"placeholderInstalled", s.placeholderInstalled},
                            {"responsibleClient", s.responsibleClient},
                            {"installOptions", options},
                            {"placeholder", placeholder},
                            {"promises", promises}});
  }
  return coordinators;
}

// What became of the coordinators the service has finished, oldest first.
json finishedCoordinatorsJson(const FakeKCInstallCoordination& coordination) {
  json finished = json::array();
  for (const FinishedCoordinator& f : coordination.finishedCoordinators()) {
    finished.push_back({{"bundleID", f.bundleID},
                        {"kind", coordinatorKindName(f.kind)},
                        {"state", coordinatorStateName(f.state)},
                        {"errorDomain", optionalJson(f.errorDomain)},
                        {"errorCode", optionalJson(f.errorCode)},
                        {"cancellingClient", optionalJson(f.cancellingClient)}});
  }
  return finished;
}

bool isMissingFile(const ErrorRef& error) {
  return error && error->domain == kPOSIXErrorDomain && error->code == ENOENT;
}

// An error worth showing: absent for none and for a file that is simply not there.
json fileErrorJson(const ErrorRef& error) {
  return !error || isMissingFile(error) ? json(nullptr) : json(error->describe());
}

json todoFieldJson(const plist::Dict& record, std::string_view key) {
  const plist::Value* value = record.find(key);
  return value ? plistToJson(*value) : json(nullptr);
}

json todoListJson(const std::string& path) {
  // A host of its own, so that a list that does not parse is reported here and not logged
  // into the device's log.
  FakeTRHost quietHost;
  ErrorRef error;
  const std::optional<plist::Array> list = loadTodoList(quietHost, path, &error);
  json records = json::array();
  for (const plist::Value& item : list.value_or(plist::Array{})) {
    const plist::Dict* record = item.dict();
    if (!record) {
      records.push_back({{"identifier", nullptr},
                         {"operation", nullptr},
                         {"version", nullptr},
                         {"name", nullptr},
                         {"record", plistToJson(item)}});
      continue;
    }
    records.push_back({{"identifier", todoFieldJson(*record, kTodoIdentifierKey)},
                       {"operation", todoFieldJson(*record, kTodoOperationKey)},
                       {"version", todoFieldJson(*record, kTodoVersionKey)},
                       {"name", todoFieldJson(*record, kTodoNameKey)}});
  }
  // A list of the wrong shape sets no error; the message the loader gave says why.
  json why = fileErrorJson(error);
  const std::vector<std::string> said = quietHost.logSink()->messages();
  if (why.is_null() && !said.empty()) why = said.back();
  return {{"present", list.has_value()}, {"error", why}, {"records", records}};
}

// A property-list file as JSON: {"value": ..., "error": ...}, both null when it is missing.
json plistFileJson(const std::string& path) {
  ErrorRef readError;
  const std::optional<plist::Bytes> bytes = readFile(path, &readError);
  if (!bytes) return {{"value", nullptr}, {"error", fileErrorJson(readError)}};
  plist::ParseError parseError;
  const std::optional<plist::Value> value = plist::parse(*bytes, &parseError);
  if (!value) return {{"value", nullptr}, {"error", parseError.message}};
  return {{"value", plistToJson(*value)}, {"error", nullptr}};
}

json restoreJson(const Paths& paths) {
  std::error_code ec;
  const json state = plistFileJson(paths.restoreState());
  return {{"state", state["value"]},
          {"stateError", state["error"]},
          {"listWaiting", std::filesystem::exists(paths.restoreList(), ec)}};
}

json homeScreenJson(FakePlatform& device) {
  json iconState = nullptr;
  json iconStateError = nullptr;
  if (const std::optional<plist::Bytes> bytes = device.pv().lastIconState()) {
    plist::ParseError parseError;
    if (const auto value = plist::parse(*bytes, &parseError)) {
      iconState = plistToJson(*value);
    } else {
      iconState = plistToJson(plist::Value(*bytes));
      iconStateError = parseError.message;
    }
  }
  return {{"syncNotification", kSyncNotificationName},
          {"syncNotificationState",
           optionalJson(device.system().notificationState(kSyncNotificationName))},
          {"syncNotificationPosts", device.system().postCount(kSyncNotificationName)},
          {"iconState", iconState},
          {"iconStateError", iconStateError}};
}

json restrictionsJson(RSProfileConnection& restrictions) {
  json out = json::object();
  for (std::string_view setting : {RSFeatureAppInstallationAllowed, RSFeatureAppRemovalAllowed}) {
    const int value = restrictions.effectiveBoolValueForSetting(setting);
    out[std::string(setting)] = value == RSRestrictedBoolExplicitYes  ? "yes"
                                : value == RSRestrictedBoolExplicitNo ? "no"
                                                                      : "unset";
  }
  return out;
}

json transactionsJson(const FakeTransactionLog& log, std::size_t count) {
  const std::vector<TransactionLogEntry> entries = log.entries();
  json out = json::array();
  for (std::size_t i = entries.size() - std::min(count, entries.size()); i < entries.size(); ++i) {
    const TransactionLogEntry& entry = entries[i];
    const bool step = entry.kind == TransactionLogEntry::Kind::Step;
    out.push_back({{"kind", step ? "step" : "scenario"},
                   {"scenario", step ? json(nullptr) : json(entry.scenario)},
                   {"step", entry.step},
                   {"party", step ? json(entry.party) : json(nullptr)},
                   {"phase", step ? json(entry.phase) : json(nullptr)},
                   {"success", entry.success},
                   {"bundleID", entry.bundleID},
                   {"description", entry.description},
                   {"line", entry.describe()}});
  }
  return out;
}

}  // namespace

std::vector<std::string> lastLinesOfFile(const std::filesystem::path& path, std::size_t count) {
  std::ifstream in(path, std::ios::binary);
  if (!in || count == 0) return {};
  // Reads backwards in blocks until `count` line breaks precede the last line.
  in.seekg(0, std::ios::end);
  const std::streamoff size = in.tellg();
  std::string tail;
  std::streamoff start = size;
  constexpr std::streamoff kBlock = 64 * 1024;
  while (start > 0 &&
         static_cast<std::size_t>(std::count(tail.begin(), tail.end(), '\n')) <= count) {
    const std::streamoff length = std::min(kBlock, start);
    start -= length;
    std::string block(static_cast<std::size_t>(length), '\0');
    in.seekg(start);
    in.read(block.data(), length);
    tail.insert(0, block);
  }
  std::vector<std::string> lines;
  std::size_t begin = 0;
  while (begin < tail.size()) {
    std::size_t end = tail.find('\n', begin);
    if (end == std::string::npos) end = tail.size();
    lines.push_back(tail.substr(begin, end - begin));
    begin = end + 1;
  }
  // The first line is cut when reading stopped inside the file; it is never among the last.
  if (lines.size() > count) lines.erase(lines.begin(), lines.end() - static_cast<long>(count));
  return lines;
}

nlohmann::ordered_json collectDevice(FakePlatform& device, const std::filesystem::path& logFile,
                                     std::size_t logLines) {
  std::error_code ec;
  const std::filesystem::path root = std::filesystem::absolute(device.paths().root(), ec);
  return {{"root", root.lexically_normal().string()},
          {"registry", registryJson(device.ar())},
          {"coordinators", coordinatorsJson(device.kc())},
          {"finishedCoordinators", finishedCoordinatorsJson(device.kc())},
          {"todoList", todoListJson(device.paths().todoList())},
          {"restore", restoreJson(device.paths())},
          {"homeScreen", homeScreenJson(device)},
          {"installer", {{"uninstalled", device.em().uninstalled()}}},
          {"restrictions", restrictionsJson(device.rs())},
          {"log", {{"file", logFile.string()}, {"lines", lastLinesOfFile(logFile, logLines)}}},
          {"transactions", transactionsJson(device.transactionLog(), logLines)}};
}

}  // namespace appsync::host
