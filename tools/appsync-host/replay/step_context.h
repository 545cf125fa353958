// What one step of a replay script is given, and what it gives back.
#pragma once

#include <filesystem>
#include <optional>
#include <stdexcept>
#include <string>
#include <string_view>

#include "device_session.h"
#include "runtime/plist/value.h"
#include "yaml_input.h"

namespace appsync::host::replay {

// Keys every step may carry besides its action: `result` (the value the action must give),
// `background` (run the action on its own thread under this name; a later `await` collects it)
// and `note` (free text for the reader).
inline constexpr std::string_view kStepKeys[] = {"result", "background", "note"};

// The work a step asked for could not be done (not bad input): the replay exits with status 1.
class StepFailed : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

struct StepContext {
  DeviceSession& session;
  // The whole step: a mapping whose action key selects the action.
  const YamlField& step;
  // The action key ("call", "plugin", "event", "stage", "platform") and its value.
  std::string selector;
  const YamlField& value;
  // Files a script names (a description, a package's source) are relative to this.
  std::filesystem::path scriptDirectory;
};

// What an action gives back: a property-list value, or none.
using ActionResult = std::optional<plist::Value>;

// Runs a step whose selector is "call" (a host-protocol operation), "plugin" (one of the
// plugin's own operations that no host operation reaches yet), "event" (a platform event),
// "stage" (a host-computer action) or "platform" (a change of the platform). Each action checks
// its own fields with allowOnly (kStepKeys included). Throws InputError for bad arguments and
// StepFailed for work that could not be done. A host-protocol operation the client does not
// implement gives the string "not implemented" without calling it.
ActionResult runAction(StepContext& context);

// The selectors runAction understands.
inline constexpr std::string_view kActionSelectors[] = {"call", "plugin", "event", "stage",
                                                        "platform"};

}  // namespace appsync::host::replay
