// The check every host-supplied name passes before it becomes part of a path: a todo record's
// identifier, a delivered package's path.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "runtime/plist/value.h"

namespace appsync {

// True exactly when `object` is present, is a string and does not contain "/..". This is the
// documented test only; a name such as "../x" passes it, so whoever joins the name to a base
// directory confines it there too (Paths::confined).
bool isValidAssetPath(const plist::Value* object);
bool isValidAssetPath(const std::optional<std::string>& object);
bool isValidAssetPath(std::string_view object);

// True when `base`/`name`, with every symbolic link on it that exists resolved, lies inside
// `base` (also resolved). A folder of the host's staging area that is a link leading elsewhere
// fails. `name` is relative. Links are resolved only when `name` passes through one, so the
// common case costs one lstat per component of `name`.
bool resolvesInside(const std::string& base, std::string_view name);

}  // namespace appsync
