// The store metadata file that sits beside an installed application, "CaravelMetadata.plist" in
// the directory holding its bundle: where it is, reading it, and writing it back in place.
#pragma once

#include <filesystem>
#include <functional>
#include <optional>
#include <string>
#include <string_view>

#include "platform/ar.h"
#include "runtime/plist/codec.h"
#include "runtime/plist/value.h"

namespace appsync {

inline constexpr std::string_view kStoreMetadataFileName = "CaravelMetadata.plist";

// CONTAINER/CaravelMetadata.plist; absent when the registry gives no container.
std::optional<std::string> storeMetadataPath(const std::optional<std::string>& container);

// The device root with its links resolved, as the functions below take it: resolved once per
// walk, not once per file. Absent when the root cannot be resolved (then nothing is read).
std::optional<std::filesystem::path> resolvedDeviceRoot(const std::filesystem::path& deviceRoot);

// One parsed metadata file and the format it was stored in.
struct StoreMetadata {
  plist::Dict root;
  plist::Format format = plist::Format::Binary;
  plist::Bytes bytes;  // as read
};

// The file's root dictionary. Absent when the file is missing, unreadable, not a property list
// or not a dictionary, and when it is not a regular file of its own inside `deviceRoot`: a
// symbolic link (never followed), a directory, a pipe, or a file whose directory resolves
// outside the device root. `deviceRoot` is the resolved root (resolvedDeviceRoot).
std::optional<StoreMetadata> loadStoreMetadata(const std::string& path,
                                               const std::filesystem::path& deviceRoot);

// Replaces the file at `path` atomically with `metadata`, in the format it came in; when that
// would give the very bytes the file holds, it is left as it is (true). Refuses
// (false, nothing written) what loadStoreMetadata refuses, so nothing is ever written through a
// link or outside the device root. False also when the write fails.
bool writeStoreMetadata(const std::string& path, const StoreMetadata& metadata,
                        const std::filesystem::path& deviceRoot);

// Walks the applications of the registry (bundle kind 1), handing each to `visit` with the path
// of its metadata file (absent without a container) and the file as read (absent when it is
// missing or refused). Each file lives only for its own call: the walk holds one at a time.
using StoreMetadataVisitor = std::function<void(const ARApplicationProxy& application,
                                                const std::optional<std::string>& path,
                                                std::optional<StoreMetadata>& metadata)>;
void forEachApplicationMetadata(ARApplicationWorkspace& registry,
                                const std::filesystem::path& deviceRoot,
                                const StoreMetadataVisitor& visit);

}  // namespace appsync
