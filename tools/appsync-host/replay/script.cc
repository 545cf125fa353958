// Reading a replay script and checking every step's structure before the first one runs.
#include "replay/script.h"

#include <algorithm>
#include <set>

#include "replay/expectations.h"
#include "replay/step_context.h"

namespace appsync::host::replay {

namespace {

bool isActionSelector(std::string_view key) {
  return std::ranges::find(kActionSelectors, key) != std::end(kActionSelectors);
}

bool isSelector(std::string_view key) {
  return isActionSelector(key) ||
         std::ranges::find(kEngineSelectors, key) != std::end(kEngineSelectors);
}

std::string selectorList() {
  std::string out;
  for (auto key : kActionSelectors) out += std::string(key) + ", ";
  for (auto key : kEngineSelectors) out += std::string(key) + (key == "expect" ? "" : ", ");
  return out;
}

// Names started with `background` and not yet awaited, as the steps are read in order.
using Running = std::set<std::string>;

Step readStep(const YamlField& field, std::size_t index, Running& running) {
  if (!field.isMap()) field.fail("a step is a mapping with one action (" + selectorList() + ")");
  std::optional<std::pair<std::string, YamlField>> action;
  for (const auto& [key, value] : field.entries()) {
    if (!isSelector(key)) continue;
    if (action) {
      value.fail("a step has one action, and this one already has \"" + action->first + "\"");
    }
    action.emplace(key, value);
  }
  if (!action) {
    for (const auto& [key, value] : field.entries()) {
      if (std::ranges::find(kStepKeys, key) == std::end(kStepKeys)) {
        value.fail("unknown action \"" + key + "\" (expected one of: " + selectorList() + ")");
      }
    }
    field.fail("the step has no action (one of: " + selectorList() + ")");
  }
  Step step{.index = index,
            .line = field.line(),
            .selector = action->first,
            .field = field,
            .value = action->second,
            .background = {}};
  if (auto note = field.optional("note")) note->string();

  if (auto background = field.optional("background")) {
    if (step.isEngineAction()) {
      background->fail("only call, plugin, event, stage and platform run in the background");
    }
    step.background = background->string();
    if (step.background->empty()) background->fail("the name is empty");
    if (!running.insert(*step.background).second) {
      background->fail("\"" + *step.background + "\" is still running: await it first");
    }
    if (auto result = field.optional("result")) {
      result->fail("a background step's result is checked by the step that awaits it");
    }
  }
  if (auto result = field.optional("result")) result->plist();

  if (step.selector == "advance") {
    field.allowOnly({"advance", "note"});
    step.value.duration();
  } else if (step.selector == "await") {
    field.allowOnly({"await", "result", "note"});
    const std::string name = step.value.string();
    if (running.erase(name) == 0) {
      step.value.fail("no step started \"" + name +
                      "\" in the background before (or it was "
                      "awaited already)");
    }
  } else if (step.selector == "expect") {
    checkExpectation(field);
  }
  // The other actions check their own arguments when they run.
  return step;
}

}  // namespace

bool Step::isEngineAction() const {
  return std::ranges::find(kEngineSelectors, selector) != std::end(kEngineSelectors);
}

std::string Step::describe() const {
  if (!value.isScalar()) return selector;
  return selector + " " + value.node().Scalar();
}

void Step::fail(const std::string& message) const {
  throw InputError(field.file(), line, "steps[" + std::to_string(index) + "]", message);
}

Script readScript(const YamlField& document, const std::filesystem::path& directory) {
  if (!document.isMap()) document.fail("a script is a mapping with \"steps\" (and \"device\")");
  document.allowOnly({"device", "steps", "note"});
  Script script{.file = document.file(), .directory = directory, .device = {}, .steps = {}};
  if (auto device = document.optional("device")) {
    if (device->isMap()) {
      script.device = *device;
    } else {
      const std::filesystem::path path = directory / device->string();
      std::error_code ec;
      if (!std::filesystem::is_regular_file(path, ec)) {
        device->fail("no description file at " + path.string());
      }
      script.device = YamlField::loadFile(path.string());
    }
  }
  Running running;
  const auto steps = document["steps"].items();
  for (std::size_t i = 0; i < steps.size(); ++i) {
    script.steps.push_back(readStep(steps[i], i, running));
  }
  return script;
}

Script loadScript(const std::filesystem::path& file) {
  const YamlField document = YamlField::loadFile(file.string());
  return readScript(document, file.parent_path());
}

}  // namespace appsync::host::replay
