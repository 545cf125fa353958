// The path table, resolved under the device root.
#include "runtime/fs/paths.h"

namespace appsync {

namespace {
constexpr std::string_view kWorkArea = "/var/mobile/Library/ApplicationSync";
constexpr std::string_view kSyncFolder = "/var/mobile/Library/ApplicationSync/CaravelStuff";
constexpr std::string_view kStagingArea = "/var/mobile/Media/PublicStaging/ApplicationSync";
constexpr std::string_view kPublicStaging = "/var/mobile/Media/PublicStaging";
constexpr std::string_view kIcons = "/var/mobile/Library/ApplicationSync/Icons";
constexpr std::string_view kRestoreListDir = "/var/mobile/Media/CaravelRestore";
constexpr std::string_view kDiagnosticsDir = "/var/mobile/Library/Logs/MediaServices";
constexpr std::string_view kPreferencesDir = "/var/mobile/Library/Preferences";

std::string join(std::string_view dir, std::string_view name) {
  std::string out(dir);
  out += '/';
  out += name;
  return out;
}
}  // namespace

Paths::Paths(std::filesystem::path root) : root_(std::move(root)) {}

std::string Paths::resolve(std::string_view devicePath) const {
  std::string base = root_.string();
  while (base.size() > 1 && base.back() == '/') base.pop_back();
  if (base == "/") return std::string(devicePath);
  return base + std::string(devicePath);
}

std::string Paths::workArea() const { return resolve(kWorkArea); }
std::string Paths::syncFolder() const { return resolve(kSyncFolder); }
std::string Paths::stagingArea() const { return resolve(kStagingArea); }
std::string Paths::publicStaging() const { return resolve(kPublicStaging); }
std::string Paths::iconsDirectory() const { return resolve(kIcons); }
std::string Paths::restoreListDirectory() const { return resolve(kRestoreListDir); }
std::string Paths::diagnosticsDirectory() const { return resolve(kDiagnosticsDir); }
std::string Paths::preferencesDirectory() const { return resolve(kPreferencesDir); }

std::string Paths::todoList() const { return join(syncFolder(), "ApplicationsSync.plist"); }
std::string Paths::todoListDebugCopy() const {
  return join(syncFolder(), "ApplicationsSync.plist-debug.plist");
}
std::string Paths::iconLayout() const { return join(syncFolder(), "PavilionIconState.plist"); }
std::string Paths::lastSyncAppState() const { return join(workArea(), "LastSyncAppState.plist"); }
std::string Paths::assetSortOrder() const { return join(workArea(), "AssetSortOrder.plist"); }
std::string Paths::restoreState() const { return join(workArea(), "RestoreState.plist"); }
std::string Paths::restoreList() const {
  return join(restoreListDirectory(), "RestoreApplications.plist");
}
std::string Paths::restoreListLogCopy() const {
  return join(diagnosticsDirectory(), "RestoreApplications.plist");
}
std::string Paths::demotedApps() const {
  return join(preferencesDirectory(), "com.vantor.Stowage.DemotedApps.plist");
}

std::optional<std::string> Paths::iconFile(std::string_view identifier) const {
  auto dir = confined(iconsDirectory(), identifier);
  if (!dir) return std::nullopt;
  return *dir + ".png";
}

std::optional<std::string> Paths::packageDirectory(std::string_view identifier) const {
  return confined(syncFolder(), identifier);
}

std::optional<std::string> Paths::stagedFile(std::string_view relativePath) const {
  return confined(publicStaging(), relativePath);
}

std::string Paths::packageArtwork(std::string_view dir) { return join(dir, "CaravelArtwork"); }
std::string Paths::packageMetadata(std::string_view dir) {
  return join(dir, "CaravelMetadata.plist");
}
std::string Paths::packageInfoPlist(std::string_view dir) { return join(dir, "Info.plist"); }

std::optional<std::string> Paths::placeholderDirectory(std::string_view temporaryDirectory,
                                                       std::string_view identifier) {
  auto dir = confined(join(temporaryDirectory, "com.vantor.trc.Apps"), identifier);
  if (!dir) return std::nullopt;
  return *dir + ".app";
}

std::optional<std::string> Paths::confined(std::string_view base, std::string_view name) {
  if (name.empty() || name.front() == '/' || name.find('\0') != std::string_view::npos) {
    return std::nullopt;
  }
  // Walk the components: ".." may never climb above the base.
  int depth = 0;
  std::size_t start = 0;
  while (start <= name.size()) {
    std::size_t end = name.find('/', start);
    if (end == std::string_view::npos) end = name.size();
    std::string_view part = name.substr(start, end - start);
    if (part == "..") {
      if (--depth < 0) return std::nullopt;
    } else if (!part.empty() && part != ".") {
      ++depth;
    }
    start = end + 1;
  }
  if (depth <= 0) return std::nullopt;  // names the base itself
  return join(base, name);
}

}  // namespace appsync
