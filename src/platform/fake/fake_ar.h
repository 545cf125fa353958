// The fake application registry: a workspace that really holds applications and placeholders,
// installs placeholder and delivered packages under the device root, and tells its observers.
#pragma once

#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/ar.h"
#include "platform/fake/callback_thread.h"
#include "platform/fake/fake_ar_package_archive.h"
#include "platform/fake/fake_service.h"
#include "platform/fake/state_fields.h"

namespace appsync {

// Operations and how a scripted failure shows:
//   "applicationIsInstalled:"                     answers false
//   "uninstallApplication:withOptions:"           false, nothing removed
//   "installApplication:withOptions:"             false (placeholder install), nothing recorded
//   "installApplication:withOptions:error:"       false and the error (package install)
//   "enumerateBundlesOfType:block:"               the block is never called
//   "installProgressForApplication:withPhase:"    null
//   "applicationProxyForIdentifier:placeholder:"  null
//   "addObserver:", "removeObserver:", "installPhaseFinishedForProgress:"  cannot fail
//
// Rules of this registry:
// - Records are kept in insertion order; replacing a record keeps its place. Enumeration and
//   every list below follow that order.
// - Bundle kinds: 0 every record (non-application bundles too), 1 every application, 7 system
//   applications. Other kinds hold nothing.
// - applicationProxyForIdentifier(id, true) finds any application, placeholder or not;
//   (id, false) finds it only when it is not a placeholder. Non-application bundles are never
//   found.
// - A placeholder install over an installed application turns the record into a placeholder
//   (keeping its container) until a package install replaces it.
// - A package (a bundle folder, or the one in a zip archive) is copied into
//   ROOT/private/var/containers/Bundle/Application/ID/NAME.app, which
//   replaces any earlier bundle in that container and keeps the container's other files (the
//   store metadata). Uninstalling removes the container.
// - Install options carrying store metadata (ARCaravelMetadataKey, bytes of a property list)
//   are written to the container as "CaravelMetadata.plist", as the registry keeps them; a
//   placeholder install with metadata gets a container for it.
// - The installs reported as prioritized and paused follow what the registry holds (see
//   setInstallsInProgress).
// - A proxy's installProgressSync is the progress object most recently handed out for the
//   application (installProgressForApplication or installProgress below) until a package
//   install completes it, or the application is removed.
// - Events are delivered on the registry's callback thread; removeObserver returns when no
//   callback for that observer runs or will run. Called from within a callback it does not wait
//   (the current callback is the caller's own).
class FakeARWorkspace final : public ARApplicationWorkspace, public FakeService {
 public:
  // Every member has a default, so tests can name only what matters ({.identifier = "a"}).
  struct AppRecord {
    std::string identifier{};
    std::string applicationType = "User";  // "User" or "System"
    std::optional<std::string> version{};
    std::optional<std::string> name{};
    std::uint64_t installType = 0;                 // ARInstallType*
    bool isPlaceholder = false;                    // placeholder or fully installed
    bool isApplication = true;                     // false: a non-application bundle (kind 0 only)
    std::optional<std::string> bundleDirectory{};  // under the root
    std::optional<std::string> containerDirectory{};  // under the root
    std::optional<std::string> iconPath{};
    std::optional<std::uint64_t> staticDiskUsage{};
    bool hasMIDBasedSINF = false;
    plist::Dict lastInstallOptions{};  // options of the install that made it
    bool operator==(const AppRecord&) const = default;
  };

  struct InstallCall {
    std::string path;
    plist::Dict options;
    bool placeholder;  // installApplication:withOptions: (true) or ...:error: (false)
    bool succeeded;
    bool operator==(const InstallCall&) const = default;
  };
  struct UninstallCall {
    std::string identifier;
    std::optional<plist::Dict> options;
    bool succeeded;
    bool operator==(const UninstallCall&) const = default;
  };

  // `root`: the device root under which packages get their containers.
  explicit FakeARWorkspace(std::filesystem::path root);

  // ---- Test API ----

  // Adds or replaces a record (test setup; no events).
  void putApplication(AppRecord record);
  std::optional<AppRecord> application(const std::string& identifier) const;
  std::vector<AppRecord> applications() const;
  // Removes a record without events or files touched. False when there was none.
  bool removeApplication(const std::string& identifier);

  // Bounds of a zip package (defaults in ArchiveLimits: 1 GiB unpacked, 65,536 entries).
  void setArchiveLimits(fake_ar::ArchiveLimits limits);

  // Called with the removed record after every successful uninstall, outside the registry's
  // lock.
  using UninstallHook = std::function<void(const AppRecord& removed)>;
  void setUninstallHook(UninstallHook hook);

  // The container a package install uses for `identifier` (absent for one that would escape).
  std::optional<std::string> containerDirectoryFor(const std::string& identifier) const;

  // The progress object of the application's install in `phase` (created with that phase if
  // needed) made the application's current one; null for an unknown application. Tests set its
  // state and phase to shape what observers see.
  std::shared_ptr<ARInstallProgress> installProgress(const std::string& identifier,
                                                     std::uint64_t phase);
  // The application's current install progress (the one its proxies report), without making
  // one; null when there is none, as after a completed package install.
  std::shared_ptr<ARInstallProgress> currentInstallProgress(const std::string& identifier) const;
  // Progress objects passed to installPhaseFinishedForProgress, in call order.
  std::vector<std::shared_ptr<ARInstallProgress>> finishedPhases() const;

  std::vector<InstallCall> installCalls() const;
  std::vector<UninstallCall> uninstallCalls() const;

  // The registry reports as prioritized what it holds that is being installed: every
  // application whose current install progress is waiting or active, and every restore
  // placeholder (install type 2) without one, which awaits its data; as paused every application
  // whose current progress is paused. Finished, failed and cancelled installs are in neither.
  // These identifiers are reported as well, after those (identifiers without a record are left
  // out). Each report carries fresh proxies, in record order.
  void setInstallsInProgress(std::vector<std::string> prioritized, std::vector<std::string> paused);
  // Delivers applicationInstallsArePrioritized with the current lists to every observer.
  void notifyInstallsArePrioritized();
  // Delivers applicationInstallsDidCancel with the proxies of the known identifiers.
  void notifyInstallsDidCancel(const std::vector<std::string>& identifiers);

  // Saved state (the simulator's device directory): every record, install progress, the
  // prioritized and paused lists, the install and uninstall history. Observers are not state.
  plist::Dict saveState() const;
  // Replaces the whole state with a saved one, with no events. Throws StateFormatError.
  void loadState(const StateFields& state);

  std::size_t observerCount() const;
  // Waits until every event posted so far has been delivered.
  void drain() { callbacks_.drain(); }
  // Hold and release events.
  CallbackThread& callbackThread() { return callbacks_; }

  // ---- ARApplicationWorkspace ----

  void addObserver(ARApplicationWorkspaceObserverProtocol* observer) override;
  void removeObserver(ARApplicationWorkspaceObserverProtocol* observer) override;
  bool applicationIsInstalled(const std::string& identifier) override;
  bool uninstallApplication(const std::string& identifier,
                            const std::optional<plist::Dict>& options) override;
  // Placeholder install: PATH/Info.plist names the application ("BNBundleIdentifier",
  // "BNBundleVersion", "BNBundleDisplayName", "BNBundleIconFile"); options must have
  // PackageType "Placeholder", may have "BNBundleIdentifier" (must agree) and "ARInstallType".
  bool installApplication(const std::string& path, const plist::Dict& options) override;
  // Package install: PATH is a bundle folder NAME.app, or a zip archive NAME.zip holding exactly
  // one top-level bundle folder, with an Info.plist whose identifier agrees with options
  // "BNBundleIdentifier". An archive is unpacked into a scratch folder in the application's
  // container, which is removed again whatever happens; an archive that is unreadable, holds
  // links, names leading out of the scratch folder, no bundle or several, or exceeds the archive
  // limits is refused as a bad package with nothing written. Non-empty bytes under
  // "ApplicationSINF" mark the record hasMIDBasedSINF, empty ones clear it, and without them an
  // existing record keeps its mark. Errors are of the domain "AppRegistryError" (bad package: 2,
  // identifier mismatch: 3, file operation: 4).
  bool installApplication(const std::string& path, const plist::Dict& options,
                          ErrorRef* error) override;
  void enumerateBundlesOfType(int type, const BundleBlock& block) override;
  std::shared_ptr<ARInstallProgress> installProgressForApplication(const ARApplicationProxy& proxy,
                                                                   std::uint64_t phase) override;
  void installPhaseFinishedForProgress(const std::shared_ptr<ARInstallProgress>& progress) override;
  std::shared_ptr<const ARApplicationProxy> applicationProxyForIdentifier(
      const std::string& identifier, bool placeholder) override;

 private:
  // Operation names (see above).
  static constexpr std::string_view kIsInstalled = "applicationIsInstalled:";
  static constexpr std::string_view kUninstall = "uninstallApplication:withOptions:";
  static constexpr std::string_view kInstallPlaceholder = "installApplication:withOptions:";
  static constexpr std::string_view kInstallPackage = "installApplication:withOptions:error:";
  static constexpr std::string_view kEnumerate = "enumerateBundlesOfType:block:";
  static constexpr std::string_view kProgress = "installProgressForApplication:withPhase:";
  static constexpr std::string_view kProxy = "applicationProxyForIdentifier:placeholder:";
  static constexpr std::string_view kAddObserver = "addObserver:";
  static constexpr std::string_view kRemoveObserver = "removeObserver:";
  static constexpr std::string_view kPhaseFinished = "installPhaseFinishedForProgress:";

  struct Entry {
    AppRecord record;
    std::shared_ptr<ARInstallProgress> currentProgress;
  };
  using ProxyEvent = void (ARApplicationWorkspaceObserverProtocol::*)(const ARProxyList&);

  // All with mutex_ held.
  Entry* findLocked(const std::string& identifier);
  const Entry* findLocked(const std::string& identifier) const;
  void putLocked(Entry entry);
  // Records an installed application (dropping its install progress objects when asked) and
  // tells the observers.
  void recordInstalled(Entry entry, bool dropProgress);
  void eraseLocked(const std::string& identifier);
  std::shared_ptr<ARInstallProgress> progressLocked(const std::string& identifier,
                                                    std::uint64_t phase);
  ARProxyList proxiesLocked(const std::vector<std::string>& identifiers) const;
  // The prioritized and paused installs as reported (see setInstallsInProgress).
  void installsInProgressLocked(ARProxyList* prioritized, ARProxyList* paused) const;
  std::vector<std::uint64_t> registrationsLocked() const;

  static std::shared_ptr<const ARBundleProxy> makeProxy(const Entry& entry);
  static std::shared_ptr<const ARApplicationProxy> makeApplicationProxy(const Entry& entry);

  // Posts `event` with `proxies` for each of `registrations` still registered at delivery.
  void postEvent(std::vector<std::uint64_t> registrations, ProxyEvent event, ARProxyList proxies);
  void postPrioritized(std::vector<std::uint64_t> registrations, ARProxyList prioritized,
                       ARProxyList paused);
  // The observer of a registration, or null once it has been removed.
  ARApplicationWorkspaceObserverProtocol* observerFor(std::uint64_t registration) const;

  bool installPlaceholder(const std::string& path, const plist::Dict& options);
  bool installPackage(const std::string& path, const plist::Dict& options, ErrorRef* error);
  // A zip package, unpacked into a scratch folder in the application's container.
  bool installArchive(const std::string& path, const plist::Dict& options, ErrorRef* error);
  // Installs the bundle folder `bundle`; errors name `path`, the package as given.
  bool installBundle(const std::string& bundle, const std::string& path, const plist::Dict& options,
                     ErrorRef* error);
  void recordInstall(const std::string& path, const plist::Dict& options, bool placeholder,
                     bool succeeded);

  const std::filesystem::path root_;
  mutable std::mutex mutex_;
  std::vector<Entry> entries_;
  std::map<std::pair<std::string, std::uint64_t>, std::shared_ptr<ARInstallProgress>> progress_;
  std::vector<std::shared_ptr<ARInstallProgress>> finishedPhases_;
  std::vector<InstallCall> installCalls_;
  std::vector<UninstallCall> uninstallCalls_;
  std::vector<std::string> prioritized_;
  std::vector<std::string> paused_;
  std::vector<std::pair<std::uint64_t, ARApplicationWorkspaceObserverProtocol*>> observers_;
  std::uint64_t nextRegistration_ = 1;
  UninstallHook uninstallHook_;
  fake_ar::ArchiveLimits archiveLimits_;
  CallbackThread callbacks_{"fake-ar-events"};  // last: stops first
};

}  // namespace appsync
