// What every family of replay actions shares: a table of named actions with the fields each
// takes, and the reading of the values that several families use (errors, typed numbers,
// property-list shapes).
#pragma once

#include <cstdint>
#include <filesystem>
#include <functional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "replay/step_context.h"
#include "runtime/error.h"
#include "runtime/plist/value.h"

namespace appsync::host::replay {

struct ActionEntry {
  std::string_view name;
  // The action's own fields; the action key and kStepKeys are always allowed.
  std::vector<std::string_view> fields;
  std::function<ActionResult(StepContext&)> run;
};

// Looks the action's name (the selector's value) up in `table`, checks the step's fields and
// runs the action. An unknown name is an InputError listing the known ones; a failure of the
// work itself (a file that cannot be written) becomes StepFailed.
ActionResult runFromTable(StepContext& context, std::span<const ActionEntry> table);

// "a, b, c": for messages that list what is allowed.
std::string joinNames(const std::vector<std::string>& names);

// An error written in a script: {domain, code, description, recoverable}. `domain` and `code`
// are required; `recoverable: true` puts "recoverable" into its userInfo, which the host's
// recoverable-error test honours.
ErrorRef readError(const YamlField& field);
// An error as a result: {domain, code, description?, underlying?}.
plist::Value errorValue(const ErrorRef& error);

// Typed readings that fail naming the field.
std::uint32_t readUInt32(const YamlField& field);
std::int32_t readInt32(const YamlField& field);
plist::Dict readDict(const YamlField& field);
// Data (`!data` base64) or, for anything else, the value written as a binary property list.
plist::Bytes readDataOrPlist(const YamlField& field);
plist::Bytes readData(const YamlField& field);

// A device path handed to the client as an argument (an asset's path): resolved under the root
// as the client's own paths are ("var/x" and "/var/x" both give ROOT/var/x) and otherwise passed
// as written, ".." included: confining what the host hands over is the client's job.
std::string clientPath(const std::filesystem::path& root, const std::string& text);
// A path the client handed out, shown relative to the device root when it lies under it.
std::string shownPath(const std::filesystem::path& root, const std::string& path);

}  // namespace appsync::host::replay
