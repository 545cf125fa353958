// Per-application restore facts that must outlive a sync and a restart of the host daemon
// (where a restore's package waits for its data), kept in one XML property list:
// identifier -> version -> key -> value. The file is absent when no application has state.
#pragma once

#include <mutex>
#include <optional>
#include <string>

#include "runtime/plist/value.h"

namespace appsync {

// The property key under which a restore's downloaded package path is kept.
inline constexpr std::string_view kRestoreStatePathKey = "path";

class RestoreStateStore {
 public:
  explicit RestoreStateStore(std::string path);
  RestoreStateStore(const RestoreStateStore&) = delete;
  RestoreStateStore& operator=(const RestoreStateStore&) = delete;

  // root[identifier][version][key], or absent when the file cannot be read or parsed, its root
  // is not a dictionary, the version is absent or any level is missing.
  std::optional<plist::Value> property(std::string_view key, std::string_view identifier,
                                       const std::optional<std::string>& version);
  // Sets root[identifier][version][key] and rewrites the file atomically. Writes nothing when
  // the version is absent, or when an existing file does not parse or has another shape.
  void setProperty(plist::Value value, std::string_view key, std::string_view identifier,
                   const std::optional<std::string>& version);
  // Removes every version and property of `identifier`; deletes the file when nothing is left
  // or when its contents are unusable.
  void clean(std::string_view identifier);

 private:
  enum class Load { Missing, Unusable, Loaded };
  Load load(plist::Dict* root);

  const std::string path_;
  // Serialises the read-modify-write cycles of the three operations.
  std::mutex mutex_;
};

}  // namespace appsync
