// A replay script as read from its file: the device it starts from and its steps, each checked
// for structure (one known action, the engine's own fields) before anything runs.
#pragma once

#include <cstddef>
#include <filesystem>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "yaml_input.h"

namespace appsync::host::replay {

// The actions the engine runs itself; the others go to runAction (step_context.h).
inline constexpr std::string_view kEngineSelectors[] = {"advance", "await", "expect"};

struct Step {
  std::size_t index = 0;  // steps[index]
  int line = 0;
  std::string selector;  // the action key: "call", ..., "advance", "await", "expect"
  YamlField field;       // the whole step
  YamlField value;       // the action key's value
  std::optional<std::string> background;  // `background: NAME`

  bool isEngineAction() const;
  // "call supportedDataclasses", "expect todo", "advance 30s": the selector and a scalar value.
  std::string describe() const;
  // InputError naming the script, the step's line, "steps[N]" and `message`.
  [[noreturn]] void fail(const std::string& message) const;
};

struct Script {
  std::filesystem::path file;
  std::filesystem::path directory;  // files the script names are relative to it
  std::optional<YamlField> device;  // the description: inline, or read from its file
  std::vector<Step> steps;
};

// Reads and checks a script. Throws InputError naming the file, the line, the step and the
// field of the first mistake.
Script loadScript(const std::filesystem::path& file);
// The same for a document already read (`directory` resolves a `device:` file).
Script readScript(const YamlField& document, const std::filesystem::path& directory);

}  // namespace appsync::host::replay
