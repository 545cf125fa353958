// A host-sync asset written in a replay script, and an asset shown as a result.
#pragma once

#include <filesystem>
#include <memory>

#include "platform/tr.h"
#include "runtime/plist/value.h"
#include "yaml_input.h"

namespace appsync::host::replay {

// A TRAsset from a mapping:
//   identifier (required), dataclass (default "Application"), prettyName,
//   path, infoPlist, storePlist, icon   (device paths, resolved under the root and otherwise
//                                         handed over as written: see clientPath),
//   relativePath (instead of path: the host's path relative to its public staging folder,
//                 handed over exactly as written),
//   download, restore (booleans, default false), completedParts (unsigned), storePID (integer),
//   variantOptions (a mapping, as a property list), downloadProgress, installProgress (numbers).
// Throws InputError naming the field.
std::shared_ptr<TRAsset> readAsset(const YamlField& field, const std::filesystem::path& root);

// The asset as a dictionary of the same fields (paths relative to the root when under it;
// absent optional fields left out).
plist::Dict assetValue(const TRAsset& asset, const std::filesystem::path& root);

}  // namespace appsync::host::replay
