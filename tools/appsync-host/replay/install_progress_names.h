// The names scripts give the registry's install states and phases, in code order.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "yaml_input.h"

namespace appsync::host::replay {

// waiting, active, paused, canceled, failed, finished.
const std::vector<std::string>& installStateNames();
// loading, installing, restoring-data, installing-placeholder.
const std::vector<std::string>& installPhaseNames();
// The code of the name `field` holds among `names`; bad input (naming the choices) otherwise.
std::uint64_t installCodeOf(const YamlField& field, const std::vector<std::string>& names);

}  // namespace appsync::host::replay
