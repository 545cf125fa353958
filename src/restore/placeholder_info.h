// What both placeholder roads share: the names of a placeholder's files and transaction-log
// entries, the "mobile" file attributes, the seven-key Info.plist, and the report of the
// placeholder directory operation.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "platform/platform.h"
#include "runtime/error.h"
#include "runtime/plist/value.h"

namespace appsync {

inline constexpr std::string_view kPlaceholderIconFileName = "Icon.png";
inline constexpr std::string_view kPlaceholderInfoFileName = "Info.plist";
inline constexpr std::string_view kGazetteAppKey = "UIGazetteApp";
inline constexpr std::string_view kLaunchProhibitedKey = "ARApplicationLaunchProhibited";

// Transaction-log scenarios: the restore road (and the directory operation of both roads), and
// the install of a placeholder on the sync road.
inline constexpr std::string_view kCaravelAppRestoreScenario = "Caravel App Restore";
inline constexpr std::string_view kInstallPlaceholderScenario = "Install placeholder";

// Owner account "mobile", group owner account "mobile".
FileAttributes mobileFileAttributes();

// `directory`/`name`.
std::string placeholderFile(const std::string& directory, std::string_view name);

// The placeholder's Info.plist. `version` and `name` may be plist::Value::null(): no
// property-list writer accepts the null marker, so such a dictionary cannot be written, which is
// how a placeholder without a version or a name fails.
plist::Dict placeholderInfoPlist(const std::string& identifier, const plist::Value& version,
                                 const plist::Value& name, const plist::Value& gazette,
                                 bool launchProhibited);

// The store metadata dictionary a restore record carries as bytes; absent, with *error saying
// why, when they are not a property list or its root is not a dictionary.
std::optional<plist::Dict> parseStoreMetadata(const plist::Bytes& bytes, ErrorRef* error);

// A value as a message argument: a string as it is (no quotes), anything else described.
std::string logText(const plist::Value& value);

// Gives `path` the owner and group of `attributes` when both are named. A failure is not
// reported: the placeholder works without them.
void applyFileAttributes(const Platform& platform, const std::string& path,
                         const FileAttributes& attributes);

// The outcome of making a placeholder directory: when it was not made, the "Failed to create
// app directory" entry; in every case the "Created app directory" message. `path` is absent
// when none could be formed for the identifier.
void reportPlaceholderDirectory(const Platform& platform, const std::string& bundleID,
                                const std::optional<std::string>& path, bool created,
                                const ErrorRef& error);

// Reports, as a failed directory operation, an identifier from which no placeholder path can
// be formed (one that would leave the placeholder base directory, such as "../x").
void reportUnusablePlaceholderPath(const Platform& platform, const std::string& bundleID);

}  // namespace appsync
