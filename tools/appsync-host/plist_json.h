// Property-list values as JSON, for the simulator's output to scripts: containers and scalars as
// themselves, data as {"data": BASE64}, dates as {"date": "YYYY-MM-DDTHH:MM:SSZ"}.
#pragma once

#include <nlohmann/json.hpp>

#include "runtime/plist/value.h"

namespace appsync::host {

// Integers above INT64_MAX stay unsigned. A date outside years 0001-9999 is {"date": SECONDS}
// (seconds since 2001-01-01, as a number); a keyed-archive reference is {"uid": N}; the
// in-memory null is null.
nlohmann::ordered_json plistToJson(const plist::Value& value);

}  // namespace appsync::host
