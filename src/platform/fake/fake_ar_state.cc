// The fake application registry's saved state: records, install progress, the prioritized and
// paused lists and the installs and uninstalls asked for, as a property list and back.
#include <utility>

#include "platform/fake/fake_ar.h"
#include "platform/fake/state_null_marker.h"

namespace appsync {
namespace {

void setIfPresent(plist::Dict& dict, std::string key, const std::optional<std::string>& value) {
  if (value) dict.set(std::move(key), *value);
}

// `forPhase`: the phase the registry keeps it under, for the objects it hands out.
plist::Dict progressState(const ARInstallProgress& progress,
                          std::optional<std::uint64_t> forPhase = std::nullopt) {
  plist::Dict state{{"application", progress.identifier()}};
  if (forPhase) state.set("forPhase", *forPhase);
  state.set("installPhase", progress.installPhase());
  state.set("installState", progress.installState());
  state.set("totalUnitCount", plist::Integer::fromSigned(progress.totalUnitCount()));
  state.set("completedUnitCount", plist::Integer::fromSigned(progress.completedUnitCount()));
  state.set("cancelled", progress.isCancelled());
  return state;
}

std::shared_ptr<ARInstallProgress> loadProgress(const StateFields& fields) {
  auto progress = std::make_shared<ARInstallProgress>(fields.string("application"));
  progress->setInstallPhase(fields.unsignedInteger("installPhase"));
  progress->setInstallState(fields.unsignedInteger("installState"));
  progress->setTotalUnitCount(fields.integer("totalUnitCount"));
  progress->setCompletedUnitCount(fields.integer("completedUnitCount"));
  if (fields.boolean("cancelled", false)) progress->cancel();
  return progress;
}

plist::Dict recordState(const FakeARWorkspace::AppRecord& r) {
  plist::Dict state{{"identifier", r.identifier}, {"applicationType", r.applicationType}};
  setIfPresent(state, "version", r.version);
  setIfPresent(state, "name", r.name);
  state.set("installType", r.installType);
  state.set("isPlaceholder", r.isPlaceholder);
  state.set("isApplication", r.isApplication);
  setIfPresent(state, "bundleDirectory", r.bundleDirectory);
  setIfPresent(state, "containerDirectory", r.containerDirectory);
  setIfPresent(state, "iconPath", r.iconPath);
  if (r.staticDiskUsage) state.set("staticDiskUsage", *r.staticDiskUsage);
  state.set("hasMIDBasedSINF", r.hasMIDBasedSINF);
  state.set("lastInstallOptions", nullsMarked(r.lastInstallOptions));
  return state;
}

FakeARWorkspace::AppRecord loadRecord(const StateFields& fields) {
  return {.identifier = fields.string("identifier"),
          .applicationType = fields.string("applicationType"),
          .version = fields.optionalString("version"),
          .name = fields.optionalString("name"),
          .installType = fields.unsignedInteger("installType"),
          .isPlaceholder = fields.boolean("isPlaceholder", false),
          .isApplication = fields.boolean("isApplication", true),
          .bundleDirectory = fields.optionalString("bundleDirectory"),
          .containerDirectory = fields.optionalString("containerDirectory"),
          .iconPath = fields.optionalString("iconPath"),
          .staticDiskUsage = fields.optionalUnsigned("staticDiskUsage"),
          .hasMIDBasedSINF = fields.boolean("hasMIDBasedSINF", false),
          .lastInstallOptions = nullsRestored(fields.dictionary("lastInstallOptions"))};
}

}  // namespace

plist::Dict FakeARWorkspace::saveState() const {
  std::lock_guard lock(mutex_);
  plist::Array applications;
  for (const Entry& e : entries_) {
    plist::Dict record = recordState(e.record);
    // The current progress is always one of progress_: the one handed out last.
    for (const auto& [key, object] : progress_) {
      if (e.currentProgress && object == e.currentProgress) {
        record.set("currentProgressPhase", key.second);
      }
    }
    applications.push_back(std::move(record));
  }
  plist::Array progress;
  for (const auto& [key, object] : progress_) {
    progress.push_back(progressState(*object, key.second));
  }
  plist::Array finished;
  for (const auto& object : finishedPhases_) finished.push_back(progressState(*object));
  plist::Array installs;
  for (const InstallCall& call : installCalls_) {
    installs.push_back(plist::Dict{{"path", call.path},
                                   {"options", nullsMarked(call.options)},
                                   {"placeholder", call.placeholder},
                                   {"succeeded", call.succeeded}});
  }
  plist::Array uninstalls;
  for (const UninstallCall& call : uninstallCalls_) {
    plist::Dict state{{"identifier", call.identifier}};
    if (call.options) state.set("options", nullsMarked(*call.options));
    state.set("succeeded", call.succeeded);
    uninstalls.push_back(std::move(state));
  }
  return {{"applications", std::move(applications)},   {"installProgress", std::move(progress)},
          {"prioritized", stringsState(prioritized_)}, {"paused", stringsState(paused_)},
          {"installCalls", std::move(installs)},       {"uninstallCalls", std::move(uninstalls)},
          {"finishedPhases", std::move(finished)}};
}

void FakeARWorkspace::loadState(const StateFields& state) {
  // Everything is read before anything is replaced: a refused state changes nothing.
  decltype(progress_) progress;
  for (const StateFields& fields : state.records("installProgress")) {
    std::shared_ptr<ARInstallProgress> object = loadProgress(fields);
    progress[{object->identifier(), fields.unsignedInteger("forPhase")}] = std::move(object);
  }
  std::vector<Entry> entries;
  for (const StateFields& fields : state.records("applications")) {
    Entry entry{.record = loadRecord(fields), .currentProgress = nullptr};
    const std::string& id = entry.record.identifier;
    for (const Entry& earlier : entries) {
      if (earlier.record.identifier == id) fields.fail("identifier", "a second record for " + id);
    }
    if (std::optional<std::uint64_t> phase = fields.optionalUnsigned("currentProgressPhase")) {
      auto it = progress.find({id, *phase});
      if (it == progress.end()) {
        fields.fail("currentProgressPhase", "no install progress of " + id + " for that phase");
      }
      entry.currentProgress = it->second;
    }
    entries.push_back(std::move(entry));
  }
  std::vector<std::shared_ptr<ARInstallProgress>> finished;
  for (const StateFields& fields : state.records("finishedPhases")) {
    finished.push_back(loadProgress(fields));
  }
  std::vector<InstallCall> installs;
  for (const StateFields& fields : state.records("installCalls")) {
    installs.push_back({fields.string("path"), nullsRestored(fields.dictionary("options")),
                        fields.boolean("placeholder", false), fields.boolean("succeeded", false)});
  }
  std::vector<UninstallCall> uninstalls;
  for (const StateFields& fields : state.records("uninstallCalls")) {
    std::optional<plist::Dict> options;
    if (fields.has("options")) options = nullsRestored(fields.dictionary("options"));
    uninstalls.push_back(
        {fields.string("identifier"), std::move(options), fields.boolean("succeeded", false)});
  }
  std::vector<std::string> prioritized = state.strings("prioritized");
  std::vector<std::string> paused = state.strings("paused");

  std::lock_guard lock(mutex_);
  entries_ = std::move(entries);
  progress_ = std::move(progress);
  finishedPhases_ = std::move(finished);
  installCalls_ = std::move(installs);
  uninstallCalls_ = std::move(uninstalls);
  prioritized_ = std::move(prioritized);
  paused_ = std::move(paused);
}

}  // namespace appsync
