// What the fake registry reads from a bundle directory (its Info.plist, icon and size) and
// writes into an application's container (the store metadata of the install options).
#pragma once

#include <cstdint>
#include <filesystem>
#include <optional>
#include <string>
#include <string_view>

#include "runtime/plist/value.h"

namespace appsync::fake_ar {

// The Info.plist dictionary of a bundle directory, or absent with *why set.
std::optional<plist::Dict> readInfoPlist(const std::string& bundle, std::string* why);

std::optional<std::string> stringValue(const plist::Dict& dict, std::string_view key);

// The icon file the bundle's Info.plist names (default "Icon.png"), when it exists.
std::optional<std::string> iconIn(const std::string& bundle, const plist::Dict& info);

// The bytes of the regular files below `dir`.
std::uint64_t treeSize(const std::filesystem::path& dir);

// Writes the store metadata of the install options into the container; false when the options
// carry none. Bytes are written as they are, a dictionary as a binary property list.
bool writeMetadata(const std::string& container, const plist::Dict& options);

}  // namespace appsync::fake_ar
