// The human view of `appsync-host show`: the JSON that collectDevice gathers, as headed sections
// of aligned tables.
#pragma once

#include <nlohmann/json.hpp>
#include <string>

namespace appsync::host {

// `styled`: headings in bold (for a terminal); otherwise plain text.
std::string renderDeviceTable(const nlohmann::ordered_json& view, bool styled);

}  // namespace appsync::host
