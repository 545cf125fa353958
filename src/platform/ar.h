// The application registry: installed and placeholder applications, installs, uninstalls,
// install progress and change notifications.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "runtime/error.h"
#include "runtime/guarded.h"
#include "runtime/plist/value.h"

namespace appsync {

// Install-option keys and values.
inline constexpr std::string_view ARApplicationSINFKey = "ApplicationSINF";
inline constexpr std::string_view ARCaravelMetadataKey = "CaravelMetadata";
inline constexpr std::string_view ARPackageTypeKey = "PackageType";
inline constexpr std::string_view ARPackageTypeCustomer = "Customer";
inline constexpr std::string_view ARPackageTypePlaceholder = "Placeholder";
inline constexpr std::string_view ARInstallTypeKey = "ARInstallType";
// Uninstall option: remove the application only if it is a placeholder.
inline constexpr std::string_view ARUninstallPlaceholdersOnlyKey = "UninstallPlaceholdersOnly";

// Install types.
inline constexpr std::uint64_t ARInstallTypeNone = 0;
inline constexpr std::uint64_t ARInstallTypeStoreDownload = 1;
inline constexpr std::uint64_t ARInstallTypeRestore = 2;
inline constexpr std::uint64_t ARInstallTypeAutomaticDownload = 3;
inline constexpr std::uint64_t ARInstallTypeSync = 4;
inline constexpr std::uint64_t ARInstallTypeAutomaticUpdate = 5;
inline constexpr std::uint64_t ARInstallTypeMigration = 6;
inline constexpr std::uint64_t ARInstallTypeDowngrade = 7;
inline constexpr std::uint64_t ARInstallTypeIntentionalDemotion = 8;  // no name of its own

// Install states.
inline constexpr std::uint64_t ARInstallStateWaiting = 0;
inline constexpr std::uint64_t ARInstallStateActive = 1;
inline constexpr std::uint64_t ARInstallStatePaused = 2;
inline constexpr std::uint64_t ARInstallStateCanceled = 3;
inline constexpr std::uint64_t ARInstallStateFailed = 4;
inline constexpr std::uint64_t ARInstallStateFinished = 5;

// Install phases.
inline constexpr std::uint64_t ARInstallPhaseLoading = 0;
inline constexpr std::uint64_t ARInstallPhaseInstalling = 1;
inline constexpr std::uint64_t ARInstallPhaseRestoringData = 2;
inline constexpr std::uint64_t ARInstallPhaseInstallingPlaceholder = 3;

// Bundle kinds of enumerateBundlesOfType: every bundle the registry holds (applications and
// others), every application (user and system), system applications only.
inline constexpr int ARBundleTypeAll = 0;
inline constexpr int ARBundleTypeApplications = 1;
inline constexpr int ARBundleTypeSystemApplications = 7;

// Application types.
inline constexpr std::string_view ARApplicationTypeUser = "User";
inline constexpr std::string_view ARApplicationTypeSystem = "System";

// The progress of one running install. Shared between the registry and its readers;
// thread-safe.
class ARInstallProgress {
 public:
  explicit ARInstallProgress(std::string identifier) : identifier_(std::move(identifier)) {}

  const std::string& identifier() const { return identifier_; }
  std::uint64_t installState() const;
  void setInstallState(std::uint64_t state);
  std::uint64_t installPhase() const;
  void setInstallPhase(std::uint64_t phase);
  std::int64_t totalUnitCount() const;
  void setTotalUnitCount(std::int64_t units);
  std::int64_t completedUnitCount() const;
  void setCompletedUnitCount(std::int64_t units);
  void cancel();
  bool isCancelled() const;
  std::string describe() const;

 private:
  const std::string identifier_;
  Guarded<std::uint64_t> state_{ARInstallStateWaiting};
  Guarded<std::uint64_t> phase_{ARInstallPhaseLoading};
  Guarded<std::int64_t> total_;
  Guarded<std::int64_t> completed_;
  Guarded<bool> cancelled_;
};

struct ARAppState {
  bool isPlaceholder = false;
};

struct ARDiskUsage {
  std::optional<std::uint64_t> staticUsage;
};

class ARApplicationProxy;

// Any bundle the registry holds. Proxies are snapshots: they do not change after creation.
class ARBundleProxy {
 public:
  virtual ~ARBundleProxy() = default;
  std::string bundleIdentifier;
  // Null for bundles that are not applications.
  virtual const ARApplicationProxy* asApplicationProxy() const { return nullptr; }
  virtual std::string describe() const;
};

// The registry's read-only view of one installed or placeholder application.
class ARApplicationProxy : public ARBundleProxy {
 public:
  std::string applicationIdentifier;
  std::string applicationType;                    // "User", "System"
  std::optional<std::string> bundleContainerURL;  // directory holding the bundle and metadata
  std::optional<std::string> bundleURL;           // the bundle directory
  std::optional<std::string> bundleVersion;
  std::optional<std::string> localizedName;
  bool isInstalled = false;
  bool isPlaceholder = false;
  std::uint64_t installType = ARInstallTypeNone;
  std::shared_ptr<ARInstallProgress> installProgressSync;  // null when no install runs
  ARAppState appState;
  ARDiskUsage diskUsage;
  bool hasMIDBasedSINF = false;

  const ARApplicationProxy* asApplicationProxy() const override { return this; }
  std::string describe() const override;
};

using ARProxyList = std::vector<std::shared_ptr<const ARApplicationProxy>>;

// Registry change notifications. Each is optional: the default ignores the event. Events come
// on a registry thread, never from within the call that made the change, one at a time and in
// the order the changes happened, with no registry lock held: a callback may call the
// registry. The proxy lists are shared snapshots.
class ARApplicationWorkspaceObserverProtocol {
 public:
  virtual ~ARApplicationWorkspaceObserverProtocol() = default;
  // The installs the registry runs now, and those it has paused.
  virtual void applicationInstallsArePrioritized(const ARProxyList& prioritized,
                                                 const ARProxyList& paused) {
    (void)prioritized, (void)paused;
  }
  virtual void applicationInstallsDidCancel(const ARProxyList& proxies) { (void)proxies; }
  // After a package or placeholder install succeeded.
  virtual void applicationsDidInstall(const ARProxyList& proxies) { (void)proxies; }
  // After an uninstall succeeded.
  virtual void applicationsDidUninstall(const ARProxyList& proxies) { (void)proxies; }
};

// The default workspace: the registry of installed and placeholder applications, keyed by
// application identifier (compared exactly). Every operation is safe from any thread. Proxies it
// hands out are snapshots shared with the caller; they may outlive the registry.
class ARApplicationWorkspace {
 public:
  using BundleBlock =
      std::function<void(const std::shared_ptr<const ARBundleProxy>& proxy, bool* stop)>;

  ARApplicationWorkspace() = default;
  virtual ~ARApplicationWorkspace() = default;
  ARApplicationWorkspace(const ARApplicationWorkspace&) = delete;
  ARApplicationWorkspace& operator=(const ARApplicationWorkspace&) = delete;

  // Registers `observer` (not owned; null is ignored). Cannot fail. Soon after, on a registry
  // thread, it receives applicationInstallsArePrioritized with the installs running now; later
  // events follow as they happen.
  virtual void addObserver(ARApplicationWorkspaceObserverProtocol* observer) = 0;
  // Removes every registration of `observer` (none: nothing happens). When this returns no
  // callback for it is running or will run, except that called from a registry callback it
  // does not wait for that callback, which is the caller's own.
  virtual void removeObserver(ARApplicationWorkspaceObserverProtocol* observer) = 0;

  // True for an application the registry holds, fully installed or a placeholder; false for an
  // unknown identifier, a bundle that is not an application, or a failed query.
  virtual bool applicationIsInstalled(const std::string& identifier) = 0;
  // Removes the application; applicationsDidUninstall follows. False, with nothing removed, for
  // an unknown identifier, a bundle that is not an application, or a refusal. `options` may be
  // absent.
  virtual bool uninstallApplication(const std::string& identifier,
                                    const std::optional<plist::Dict>& options) = 0;
  // Installs the placeholder bundle directory at `path` (its Info.plist names the application)
  // with `options` PackageType "Placeholder"; an installed application becomes a placeholder.
  // applicationsDidInstall follows. False, with nothing changed, when the directory or the
  // options do not make a placeholder.
  virtual bool installApplication(const std::string& path, const plist::Dict& options) = 0;
  // Installs the delivered bundle directory at `path`, whose identifier must equal `options`
  // BNBundleIdentifier, completing any install progress of the application;
  // applicationsDidInstall follows. False on failure, with *error (when given) set.
  virtual bool installApplication(const std::string& path, const plist::Dict& options,
                                  ErrorRef* error) = 0;
  // Calls `block` synchronously on the calling thread, once per bundle of `type` (an
  // ARBundleType; other kinds hold nothing), in the registry's order, until the block sets
  // *stop. No registry lock is held meanwhile. When the query fails the block is not called.
  virtual void enumerateBundlesOfType(int type, const BundleBlock& block) = 0;
  // The progress of the application's install in `phase`: created if needed, then the same
  // object until a package install completes; later proxies report the latest one handed out
  // as installProgressSync. Shared with the registry; null for an unknown application or a
  // failed query.
  virtual std::shared_ptr<ARInstallProgress> installProgressForApplication(
      const ARApplicationProxy& proxy, std::uint64_t phase) = 0;
  // Closes the phase of `progress`. Cannot fail.
  virtual void installPhaseFinishedForProgress(
      const std::shared_ptr<ARInstallProgress>& progress) = 0;
  // A fresh snapshot of the application; with `placeholder` false a placeholder is not found.
  // Null when no application has the identifier (non-application bundles never count) or the
  // query failed.
  virtual std::shared_ptr<const ARApplicationProxy> applicationProxyForIdentifier(
      const std::string& identifier, bool placeholder) = 0;
};

}  // namespace appsync
