// Application bundles made from a few facts, for devices and scripts: a folder NAME.app with an
// Info.plist and an icon that renders, and the same bundle as a zip archive NAME.zip.
#pragma once

#include <filesystem>
#include <optional>
#include <string>

#include "runtime/plist/value.h"

namespace appsync::host {

struct BundleFacts {
  std::string identifier;
  std::string name;     // the bundle's display name; also NAME of NAME.app
  std::string version;  // BNBundleVersion
  // Entries added to (or replacing those of) the generated Info.plist.
  plist::Dict extraInfo{};
  bool withIcon = true;
};

// Writes DIRECTORY/NAME.app with Info.plist ("BNBundleIdentifier", "BNBundleVersion",
// "BNBundleDisplayName", "BNBundleIconFile") and a PNG icon of a colour derived from the
// identifier. Returns the bundle's path. `root` is the device root: nothing is written outside.
std::filesystem::path makeBundle(const std::filesystem::path& root,
                                 const std::filesystem::path& directory, const BundleFacts& facts);
// Packs a bundle folder into the zip archive `zipPath` (the folder NAME.app at the archive's top).
void zipBundle(const std::filesystem::path& root, const std::filesystem::path& bundle,
               const std::filesystem::path& zipPath);

}  // namespace appsync::host
