// Where two property lists first differ, said the way a script's reader finds it:
// "[2].operation: expected \"INSTALLED\", found \"SENT\"".
#pragma once

#include <optional>
#include <string>

#include "runtime/plist/value.h"

namespace appsync::host::replay {

// Absent when `found` equals `expected`. Dictionaries are compared by key (their order does not
// matter), arrays item by item. Paths start at `root` ("result" gives "result[2].name").
std::optional<std::string> firstDifference(const plist::Value& expected, const plist::Value& found,
                                           const std::string& root = "");

}  // namespace appsync::host::replay
