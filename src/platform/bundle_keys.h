// The platform's application-bundle keys, as they appear in Info.plist files and records.
#pragma once

#include <string_view>

namespace appsync {

inline constexpr std::string_view kBNBundleIdentifierKey = "BNBundleIdentifier";
inline constexpr std::string_view kBNBundleVersionKey = "BNBundleVersion";
inline constexpr std::string_view kBNBundleExecutableKey = "BNBundleExecutable";
inline constexpr std::string_view _kBNBundleDisplayNameKey = "BNBundleDisplayName";
inline constexpr std::string_view _kBNBundleIconFileKey = "BNBundleIconFile";

}  // namespace appsync
