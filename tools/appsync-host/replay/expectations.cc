// Each kind of expectation: the fields it takes, how they are checked before the replay runs,
// and what it compares on the device.
#include "replay/expectations.h"

#include <algorithm>
#include <filesystem>
#include <functional>
#include <string_view>

#include "device_files.h"
#include "platform/fake/fake_kc_coordinator.h"
#include "platform/fake/fake_kc_history.h"
#include "replay/install_progress_names.h"
#include "replay/plist_difference.h"
#include "runtime/fs/files.h"
#include "runtime/plist/codec.h"
#include "state/loaders.h"
#include "state/todo_list.h"

namespace appsync::host::replay {

namespace {

namespace fs = std::filesystem;

// The named notification whose state tells the home screen a sync is running.
constexpr const char* kSyncNotification = "com.vantor.pavilion.trc.wsyncnotify";

std::string inQuotes(const std::string& text) { return "\"" + text + "\""; }

// A plain `none` (not quoted): the value was never set.
bool isNone(const YamlField& field) {
  return field.isScalar() && field.node().Tag() == "?" && field.node().Scalar() == "none";
}

void requireOneOf(const YamlField& step, std::initializer_list<std::string_view> keys,
                  bool exactlyOne) {
  std::size_t present = 0;
  std::string names;
  for (auto key : keys) {
    present += step.has(key) ? 1 : 0;
    names += (names.empty() ? "" : " or ") + std::string(key);
  }
  if (present == 0) step.fail("the expectation needs " + names);
  if (exactlyOne && present > 1) step.fail("the expectation takes only one of " + names);
}

void requireTrue(const YamlField& field) {
  if (!field.boolean()) field.fail("write absent: true, or leave the field out");
}

void checkChoice(const YamlField& field, std::initializer_list<std::string_view> choices) {
  const std::string text = field.string();
  std::string names;
  for (auto choice : choices) {
    if (text == choice) return;
    names += (names.empty() ? "" : ", ") + std::string(choice);
  }
  field.fail("expected one of " + names + ", found " + inQuotes(text));
}

// Where a device-relative path may lead is only known on the device; its form is checked now.
void checkRelativePath(const YamlField& field) {
  const std::string text = field.string();
  if (text.empty()) field.fail("the path is empty");
  const fs::path path(text);
  if (path.is_absolute())
    field.fail(inQuotes(text) + " is absolute: write it relative to the root");
  for (const auto& part : path) {
    if (part == "..") {
      field.fail(inQuotes(text) + " has a \"..\" component: paths on the device only go down");
    }
  }
}

bool sinceStep(const YamlField& step) {
  auto since = step.optional("since");
  return since && since->string() == "step";
}

// --- file ---

void checkFile(const YamlField& step) {
  checkRelativePath(step["path"]);
  if (auto exists = step.optional("exists")) {
    if (!exists->boolean() && step.has("plist")) exists->fail("a missing file has no contents");
  }
  if (auto contents = step.optional("plist")) contents->plist();
  if (auto format = step.optional("format")) {
    checkChoice(*format, {"binary", "xml"});
    if (step.has("exists") && !step["exists"].boolean())
      format->fail("a missing file has no format");
  }
}

std::optional<std::string> evaluateFile(DeviceSession& session, const YamlField& step,
                                        const ReplayOutput&) {
  const std::string relative = step["path"].string();
  const fs::path path = devicePath(session.root(), step["path"]);
  std::error_code ec;
  const bool exists = fs::exists(fs::symlink_status(path, ec));
  const bool wanted = !step.has("exists") || step["exists"].boolean();
  if (exists != wanted) return relative + (exists ? " exists" : " does not exist");
  if (!step.has("plist") && !step.has("format")) return std::nullopt;
  ErrorRef error;
  auto bytes = readFile(path.string(), &error);
  if (!bytes) return relative + ": cannot read: " + error->describe();
  plist::ParseError parseError;
  plist::Format format = plist::Format::Binary;
  auto found = plist::parse(*bytes, &parseError, &format);
  if (!found) return relative + " is not a property list: " + parseError.message;
  if (auto wanted = step.optional("format")) {
    const std::string written = format == plist::Format::Binary ? "binary" : "xml";
    if (wanted->string() != written) {
      return relative + ": expected a " + wanted->string() + " property list, found " + written;
    }
  }
  if (!step.has("plist")) return std::nullopt;
  if (auto difference = firstDifference(step["plist"].plist(), *found)) {
    return relative + ": " + *difference;
  }
  return std::nullopt;
}

// --- log ---

void checkLog(const YamlField& step) {
  requireOneOf(step, {"text", "contains"}, true);
  if (auto text = step.optional("text")) text->string();
  if (auto contains = step.optional("contains")) contains->string();
  if (auto category = step.optional("category")) category->integer();
  if (auto level = step.optional("level")) checkChoice(*level, {"Default", "Error"});
  if (auto present = step.optional("present")) present->boolean();
  if (auto since = step.optional("since")) checkChoice(*since, {"start", "step"});
}

// The text with every "{root}" replaced by the device root, so that a message naming a device
// path can be matched whole.
std::string withDeviceRoot(std::string text, const fs::path& root) {
  static constexpr std::string_view kRootMark = "{root}";
  std::string rootText = root.string();
  while (rootText.size() > 1 && rootText.back() == '/') rootText.pop_back();
  for (std::size_t at = text.find(kRootMark); at != std::string::npos;
       at = text.find(kRootMark, at + rootText.size())) {
    text.replace(at, kRootMark.size(), rootText);
  }
  return text;
}

std::optional<std::string> evaluateLog(DeviceSession& session, const YamlField& step,
                                       const ReplayOutput& output) {
  const auto& lines = sinceStep(step) ? output.lastStep.log : output.sinceStart.log;
  const bool exact = step.has("text");
  const std::string text =
      withDeviceRoot(exact ? step["text"].string() : step["contains"].string(), session.root());
  auto category = step.optional("category");
  auto level = step.optional("level");
  const auto matches = [&](const MemoryLogSink::Line& line) {
    if (category && line.category != category->integer()) return false;
    if (level && logLevelName(line.level) != level->string()) return false;
    return exact ? line.message == text : line.message.find(text) != std::string::npos;
  };
  const auto found = std::ranges::find_if(lines, matches);
  const bool present = !step.has("present") || step["present"].boolean();
  const std::string what = std::string(exact ? "log line " : "log line containing ") +
                           inQuotes(text) + (sinceStep(step) ? " in the last step" : "");
  if (present && found == lines.end()) {
    return std::string("expected ") + (exact ? "the " : "a ") + what + ", found none";
  }
  if (!present && found != lines.end()) {
    return "expected no " + what + ", found " + inQuotes(found->message);
  }
  return std::nullopt;
}

// --- todo ---

void checkTodo(const YamlField& step) {
  step["app"].string();
  requireOneOf(step, {"state", "absent"}, true);
  if (auto state = step.optional("state")) state->string();
  if (auto absent = step.optional("absent")) requireTrue(*absent);
}

std::optional<std::string> evaluateTodo(DeviceSession& session, const YamlField& step,
                                        const ReplayOutput&) {
  const std::string app = step["app"].string();
  auto list = loadTodoList(session.device().tr(), session.paths().todoList(), nullptr);
  const plist::Dict* record = list ? findTodoRecord(*list, app) : nullptr;
  const plist::Value* operation = record ? record->find(kTodoOperationKey) : nullptr;
  if (step.has("absent")) {
    if (!record) return std::nullopt;
    return "expected no record of " + app + " in the todo list, found one (operation " +
           (operation ? operation->describe() : "none") + ")";
  }
  const std::string state = step["state"].string();
  if (!list) return "expected " + app + " " + state + ", found no todo list";
  if (!record) return "expected " + app + " " + state + ", found no record of it";
  if (!operation || !operation->string() || *operation->string() != state) {
    return app + ": expected operation " + inQuotes(state) + ", found " +
           (operation ? operation->describe() : "none");
  }
  return std::nullopt;
}

// --- registry ---

constexpr std::string_view kRegistryFields[] = {"placeholder",     "version", "name",
                                                "installType",     "type",    "diskUsage",
                                                "hasMIDBasedSINF", "bundle",  "container"};

void checkRegistry(const YamlField& step) {
  step["app"].string();
  if (auto absent = step.optional("absent")) {
    requireTrue(*absent);
    for (auto key : kRegistryFields) {
      if (auto field = step.optional(key)) field->fail("an absent application has no fields");
    }
    return;
  }
  for (auto key : {"placeholder", "hasMIDBasedSINF"}) {
    if (auto field = step.optional(key)) field->boolean();
  }
  for (auto key : {"version", "name"}) {
    if (auto field = step.optional(key)) field->string();
  }
  for (auto key : {"installType", "diskUsage"}) {
    if (auto field = step.optional(key)) field->unsignedInteger();
  }
  if (auto type = step.optional("type")) checkChoice(*type, {"User", "System"});
  for (auto key : {"bundle", "container"}) {
    if (auto field = step.optional(key)) checkRelativePath(*field);
  }
}

// A registry path as the script writes it: relative to the device root.
std::optional<plist::Value> underRoot(const fs::path& root,
                                      const std::optional<std::string>& path) {
  if (!path) return std::nullopt;
  const fs::path full(*path);
  const fs::path relative = full.lexically_relative(root);
  if (full.is_absolute() && !relative.empty() && *relative.begin() != "..") {
    return plist::Value(relative.string());
  }
  return plist::Value(*path);
}

template <typename T>
std::optional<plist::Value> present(const std::optional<T>& value) {
  if (!value) return std::nullopt;
  return plist::Value(*value);
}

std::optional<std::string> evaluateRegistry(DeviceSession& session, const YamlField& step,
                                            const ReplayOutput&) {
  const std::string app = step["app"].string();
  auto record = session.device().ar().application(app);
  if (step.has("absent")) {
    if (!record) return std::nullopt;
    return "expected no " + app + " in the registry, found " +
           (record->isPlaceholder ? "a placeholder" : "an application");
  }
  if (!record) return "expected " + app + " in the registry, found none";
  const std::pair<std::string_view, std::optional<plist::Value>> found[] = {
      {"placeholder", plist::Value(record->isPlaceholder)},
      {"version", present(record->version)},
      {"name", present(record->name)},
      {"installType", plist::Value(record->installType)},
      {"type", plist::Value(record->applicationType)},
      {"diskUsage", present(record->staticDiskUsage)},
      {"hasMIDBasedSINF", plist::Value(record->hasMIDBasedSINF)},
      {"bundle", underRoot(session.root(), record->bundleDirectory)},
      {"container", underRoot(session.root(), record->containerDirectory)},
  };
  for (const auto& [key, value] : found) {
    auto expected = step.optional(key);
    if (!expected) continue;
    // Texts stay texts however they are written (version: 2 means "2").
    const bool text =
        key == "version" || key == "name" || key == "type" || key == "bundle" || key == "container";
    const plist::Value want = text ? plist::Value(expected->string()) : expected->plist();
    if (!value)
      return app + ": " + std::string(key) + ": expected " + want.describe() + ", found nothing";
    if (auto difference = firstDifference(want, *value, std::string(key))) {
      return app + ": " + *difference;
    }
  }
  return std::nullopt;
}

// --- progress ---

constexpr std::string_view kProgressFields[] = {"state", "phase",     "completed",
                                                "total", "cancelled", "phaseFinished"};

void checkProgress(const YamlField& step) {
  step["app"].string();
  if (auto none = step.optional("none")) {
    if (!none->boolean()) none->fail("write none: true, or leave the field out");
    for (auto key : kProgressFields) {
      if (auto field = step.optional(key)) field->fail("an install without progress has no fields");
    }
    return;
  }
  if (auto state = step.optional("state")) installCodeOf(*state, installStateNames());
  if (auto phase = step.optional("phase")) installCodeOf(*phase, installPhaseNames());
  for (auto key : {"completed", "total"}) {
    if (auto field = step.optional(key)) field->integer();
  }
  for (auto key : {"cancelled", "phaseFinished"}) {
    if (auto field = step.optional(key)) field->boolean();
  }
}

std::optional<std::string> evaluateProgress(DeviceSession& session, const YamlField& step,
                                            const ReplayOutput&) {
  const std::string app = step["app"].string();
  FakeARWorkspace& registry = session.device().ar();
  const std::shared_ptr<ARInstallProgress> progress = registry.currentInstallProgress(app);
  if (step.has("none")) {
    if (!progress) return std::nullopt;
    return app + ": expected no install progress, found " + progress->describe();
  }
  if (!progress) return app + ": expected install progress, found none";
  const auto finished = registry.finishedPhases();
  const bool phaseFinished =
      std::find(finished.begin(), finished.end(), progress) != finished.end();
  const auto nameOf = [](const std::vector<std::string>& names, std::uint64_t code) {
    return code < names.size() ? names[code] : std::to_string(code);
  };
  const std::pair<std::string_view, plist::Value> found[] = {
      {"state", plist::Value(nameOf(installStateNames(), progress->installState()))},
      {"phase", plist::Value(nameOf(installPhaseNames(), progress->installPhase()))},
      {"completed", plist::Value(progress->completedUnitCount())},
      {"total", plist::Value(progress->totalUnitCount())},
      {"cancelled", plist::Value(progress->isCancelled())},
      {"phaseFinished", plist::Value(phaseFinished)},
  };
  for (const auto& [key, value] : found) {
    auto expected = step.optional(key);
    if (!expected) continue;
    if (auto difference = firstDifference(expected->plist(), value, std::string(key))) {
      return app + ": " + *difference;
    }
  }
  return std::nullopt;
}

// --- homescreen ---

void checkHomescreen(const YamlField& step) {
  requireOneOf(step, {"syncState", "iconLayout"}, false);
  if (auto state = step.optional("syncState"); state && !isNone(*state)) state->unsignedInteger();
  if (auto layout = step.optional("iconLayout"); layout && !isNone(*layout)) layout->plist();
}

std::optional<std::string> evaluateHomescreen(DeviceSession& session, const YamlField& step,
                                              const ReplayOutput&) {
  if (auto state = step.optional("syncState")) {
    auto found = session.device().system().notificationState(kSyncNotification);
    const auto shown = [](std::optional<std::uint64_t> value) {
      return value ? std::to_string(*value) : std::string("none");
    };
    std::optional<std::uint64_t> wanted;
    if (!isNone(*state)) wanted = state->unsignedInteger();
    if (found != wanted) {
      return "syncState: expected " + shown(wanted) + ", found " + shown(found);
    }
  }
  if (auto layout = step.optional("iconLayout")) {
    auto bytes = session.device().pv().lastIconState();
    if (isNone(*layout)) {
      if (bytes) return "iconLayout: expected none, found a layout";
      return std::nullopt;
    }
    if (!bytes) return "iconLayout: expected a layout, found none";
    plist::ParseError parseError;
    auto found = plist::parse(*bytes, &parseError);
    if (!found) return "iconLayout: not a property list: " + parseError.message;
    if (auto difference = firstDifference(layout->plist(), *found, "iconLayout")) {
      return difference;
    }
  }
  return std::nullopt;
}

// --- transactions ---

void checkTransactions(const YamlField& step) {
  step["entries"].strings();
  if (auto since = step.optional("since")) checkChoice(*since, {"start", "step"});
}

// The entries must appear in this order; others may come between them (parties interleave).
std::optional<std::string> evaluateTransactions(DeviceSession&, const YamlField& step,
                                                const ReplayOutput& output) {
  const auto& entries =
      sinceStep(step) ? output.lastStep.transactions : output.sinceStart.transactions;
  std::size_t next = 0;
  for (const std::string& wanted : step["entries"].strings()) {
    while (next < entries.size() && entries[next].describe() != wanted) ++next;
    if (next == entries.size()) {
      return "expected the transaction " + inQuotes(wanted) + " (in order), found none";
    }
    ++next;
  }
  return std::nullopt;
}

// --- coordinator ---

constexpr std::pair<std::string_view, KCCoordinatorKind> kKinds[] = {
    {"Initiating", KCCoordinatorKind::Initiating},
    {"Updating", KCCoordinatorKind::Updating},
    {"Restoring", KCCoordinatorKind::Restoring},
    {"RestoringDemoted", KCCoordinatorKind::RestoringDemoted}};
constexpr std::pair<std::string_view, FakeKCAppInstallCoordinator::State> kStates[] = {
    {"Active", FakeKCAppInstallCoordinator::State::Active},
    {"Completed", FakeKCAppInstallCoordinator::State::Completed},
    {"Cancelled", FakeKCAppInstallCoordinator::State::Cancelled}};

template <typename T, std::size_t N>
std::string nameOf(const std::pair<std::string_view, T> (&names)[N], T value) {
  for (const auto& [name, v] : names) {
    if (v == value) return std::string(name);
  }
  return "Any";
}

void checkCoordinator(const YamlField& step) {
  step["app"].string();
  if (auto absent = step.optional("absent")) {
    requireTrue(*absent);
    for (auto key : {"kind", "state", "placeholderInstalled", "errorDomain", "errorCode"}) {
      if (auto field = step.optional(key)) field->fail("an absent coordinator has no fields");
    }
    return;
  }
  if (auto kind = step.optional("kind")) {
    checkChoice(*kind, {"Initiating", "Updating", "Restoring", "RestoringDemoted"});
  }
  if (auto state = step.optional("state"))
    checkChoice(*state, {"Active", "Completed", "Cancelled"});
  if (auto installed = step.optional("placeholderInstalled")) installed->boolean();
  if (auto domain = step.optional("errorDomain")) domain->string();
  if (auto code = step.optional("errorCode")) code->integer();
}

// The first field of `step` whose expected text differs from what was `found`.
std::optional<std::string> firstDifference(
    const std::string& app, const YamlField& step,
    std::initializer_list<std::pair<std::string_view, std::string>> found) {
  for (const auto& [key, value] : found) {
    auto expected = step.optional(key);
    if (!expected) continue;
    const std::string wanted =
        key == "errorCode" ? std::to_string(expected->integer()) : expected->node().Scalar();
    if (wanted != value) {
      return app + ": " + std::string(key) + ": expected " + wanted + ", found " + value;
    }
  }
  return std::nullopt;
}

// A finished coordinator (no current one), for a script that asks for Completed or Cancelled.
std::optional<std::string> evaluateFinishedCoordinator(DeviceSession& session,
                                                       const YamlField& step,
                                                       const std::string& app) {
  const std::string state = step["state"].string();
  std::optional<FinishedCoordinator> finished = session.device().kc().finishedCoordinator(app);
  if (!finished) {
    return "expected a coordinator for " + app + " (" + state +
           "), found none, current or finished";
  }
  if (step.has("placeholderInstalled")) {
    return "expected a current coordinator for " + app + ", found only a finished one (" +
           nameOf(kStates, finished->state) + ")";
  }
  return firstDifference(
      app, step,
      {{"kind", nameOf(kKinds, finished->kind)},
       {"state", nameOf(kStates, finished->state)},
       {"errorDomain", finished->errorDomain.value_or("none")},
       {"errorCode", finished->errorCode ? std::to_string(*finished->errorCode) : "none"}});
}

std::optional<std::string> evaluateCoordinator(DeviceSession& session, const YamlField& step,
                                               const ReplayOutput&) {
  const std::string app = step["app"].string();
  auto coordinator = session.device().kc().coordinator(app);
  if (step.has("absent")) {
    if (!coordinator) return std::nullopt;
    return "expected no coordinator for " + app + ", found one (" +
           nameOf(kKinds, coordinator->kind()) + ")";
  }
  if (!coordinator) {
    auto state = step.optional("state");
    if (state && state->string() != "Active")
      return evaluateFinishedCoordinator(session, step, app);
    return "expected a coordinator for " + app + ", found none";
  }
  const auto snapshot = coordinator->snapshot();
  return firstDifference(
      app, step,
      {{"kind", nameOf(kKinds, coordinator->kind())},
       {"state", nameOf(kStates, snapshot.state)},
       {"placeholderInstalled", snapshot.placeholderInstalled ? "true" : "false"},
       {"errorDomain", snapshot.error ? snapshot.error->domain : "none"},
       {"errorCode", snapshot.error ? std::to_string(snapshot.error->code) : "none"}});
}

// --- the table ---

struct Kind {
  std::string_view name;
  std::vector<std::string> fields;  // besides expect and note
  std::function<void(const YamlField&)> check;
  std::function<std::optional<std::string>(DeviceSession&, const YamlField&, const ReplayOutput&)>
      evaluate;
};

const std::vector<Kind>& kinds() {
  static const std::vector<Kind> table = {
      {"file", {"path", "exists", "plist", "format"}, checkFile, evaluateFile},
      {"log", {"category", "level", "text", "contains", "present", "since"}, checkLog, evaluateLog},
      {"todo", {"app", "state", "absent"}, checkTodo, evaluateTodo},
      {"registry",
       {"app", "absent", "placeholder", "version", "name", "installType", "type", "diskUsage",
        "hasMIDBasedSINF", "bundle", "container"},
       checkRegistry,
       evaluateRegistry},
      {"progress",
       {"app", "none", "state", "phase", "completed", "total", "cancelled", "phaseFinished"},
       checkProgress,
       evaluateProgress},
      {"homescreen", {"syncState", "iconLayout"}, checkHomescreen, evaluateHomescreen},
      {"transactions", {"entries", "since"}, checkTransactions, evaluateTransactions},
      {"coordinator",
       {"app", "absent", "kind", "state", "placeholderInstalled", "errorDomain", "errorCode"},
       checkCoordinator,
       evaluateCoordinator},
  };
  return table;
}

const Kind& kindOf(const YamlField& step) {
  const YamlField expect = step["expect"];
  const std::string name = expect.string();
  std::string names;
  for (const Kind& kind : kinds()) {
    if (kind.name == name) return kind;
    names += (names.empty() ? "" : ", ") + std::string(kind.name);
  }
  expect.fail("unknown expectation " + inQuotes(name) + " (expected one of: " + names + ")");
}

}  // namespace

void checkExpectation(const YamlField& step) {
  const Kind& kind = kindOf(step);
  std::vector<std::string> allowed = kind.fields;
  allowed.insert(allowed.end(), {"expect", "note"});
  step.allowOnly(allowed);
  kind.check(step);
}

std::optional<std::string> evaluateExpectation(DeviceSession& session, const YamlField& step,
                                               const ReplayOutput& output) {
  return kindOf(step).evaluate(session, step, output);
}

}  // namespace appsync::host::replay
