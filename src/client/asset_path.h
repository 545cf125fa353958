// Where a host-supplied name joined to a base directory really leads, links included. (The
// host's own test of such names, isValidAssetPath, is in state/todo_list.h.)
#pragma once

#include <filesystem>
#include <string>
#include <string_view>

namespace appsync {

// True when `base`/`name`, with every symbolic link on it that exists resolved, lies inside
// `base` (also resolved). A folder of the host's staging area that is a link leading elsewhere
// fails. `name` is relative. Links are resolved only when `name` passes through one, so the
// common case costs one lstat per component of `name`.
bool resolvesInside(const std::string& base, std::string_view name);

// True when the absolute `path`, its links resolved (as far as it exists), lies inside the
// device root: a place reached through a link out of the root is not ours to remove, create,
// move from or move into.
bool resolvesInsideRoot(const std::string& path, const std::filesystem::path& root);

}  // namespace appsync
