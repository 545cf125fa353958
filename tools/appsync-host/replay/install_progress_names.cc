// The names scripts give the registry's install states and phases.
#include "replay/install_progress_names.h"

#include "replay/action_table.h"

namespace appsync::host::replay {

const std::vector<std::string>& installStateNames() {
  static const std::vector<std::string> kStates = {"waiting",  "active", "paused",
                                                   "canceled", "failed", "finished"};
  return kStates;
}

const std::vector<std::string>& installPhaseNames() {
  static const std::vector<std::string> kPhases = {"loading", "installing", "restoring-data",
                                                   "installing-placeholder"};
  return kPhases;
}

std::uint64_t installCodeOf(const YamlField& field, const std::vector<std::string>& names) {
  const std::string text = field.string();
  for (std::size_t i = 0; i < names.size(); ++i) {
    if (names[i] == text) return static_cast<std::uint64_t>(i);
  }
  field.fail("unknown value \"" + text + "\" (expected one of: " + joinNames(names) + ")");
}

}  // namespace appsync::host::replay
