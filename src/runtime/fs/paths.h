// Every fixed path of the plugin, resolved under the device root. No other code spells a path.
#pragma once

#include <filesystem>
#include <optional>
#include <string>
#include <string_view>

namespace appsync {

class Paths {
 public:
  // `root` is "/" on a device; a temporary directory in tests; --root in the simulator.
  explicit Paths(std::filesystem::path root);

  const std::filesystem::path& root() const { return root_; }

  // Resolves a device path ("/var/mobile/...") under the root.
  std::string resolve(std::string_view devicePath) const;

  // Directories.
  std::string workArea() const;             // /var/mobile/Library/ApplicationSync
  std::string syncFolder() const;           // .../ApplicationSync/CaravelStuff
  std::string stagingArea() const;          // /var/mobile/Media/PublicStaging/ApplicationSync
  std::string publicStaging() const;        // /var/mobile/Media/PublicStaging
  std::string iconsDirectory() const;       // .../ApplicationSync/Icons
  std::string restoreListDirectory() const; // /var/mobile/Media/CaravelRestore
  std::string diagnosticsDirectory() const; // /var/mobile/Library/Logs/MediaServices
  std::string preferencesDirectory() const; // /var/mobile/Library/Preferences

  // Files.
  std::string todoList() const;          // .../CaravelStuff/ApplicationsSync.plist
  std::string todoListDebugCopy() const; // .../CaravelStuff/ApplicationsSync.plist-debug.plist
  std::string iconLayout() const;        // .../CaravelStuff/PavilionIconState.plist
  std::string lastSyncAppState() const;  // .../ApplicationSync/LastSyncAppState.plist
  std::string assetSortOrder() const;    // .../ApplicationSync/AssetSortOrder.plist
  std::string restoreState() const;      // .../ApplicationSync/RestoreState.plist
  std::string restoreList() const;       // /var/mobile/Media/CaravelRestore/RestoreApplications.plist
  std::string restoreListLogCopy() const;  // .../Logs/MediaServices/RestoreApplications.plist
  std::string demotedApps() const;  // .../Preferences/com.vantor.Stowage.DemotedApps.plist

  // Patterns. Each joins a host-supplied name to a base directory and refuses (absent) a name
  // that would leave that directory ("..", "a/../../b", an absolute path, a NUL byte).
  std::optional<std::string> iconFile(std::string_view identifier) const;  // Icons/%@.png
  std::optional<std::string> packageDirectory(std::string_view identifier) const;  // CaravelStuff/%@
  std::optional<std::string> stagedFile(std::string_view relativePath) const;  // PublicStaging/%@

  // Files of a package directory ("%@/CaravelArtwork" and so on).
  static std::string packageArtwork(std::string_view packageDirectory);
  static std::string packageMetadata(std::string_view packageDirectory);
  static std::string packageInfoPlist(std::string_view packageDirectory);

  // The placeholder directory of an application: TEMP/com.vantor.trc.Apps/ID.app, where TEMP is
  // the process's temporary directory (a platform fact). Absent for a name that would escape.
  static std::optional<std::string> placeholderDirectory(std::string_view temporaryDirectory,
                                                         std::string_view identifier);

  // `base`/`name`, or absent when `name` would escape `base`.
  static std::optional<std::string> confined(std::string_view base, std::string_view name);

 private:
  std::filesystem::path root_;
};

}  // namespace appsync
