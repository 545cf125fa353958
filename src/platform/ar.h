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
  std::string applicationType;  // "User", "System"
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

// Registry change notifications. Each is optional: the default ignores the event.
class ARApplicationWorkspaceObserverProtocol {
 public:
  virtual ~ARApplicationWorkspaceObserverProtocol() = default;
  virtual void applicationInstallsArePrioritized(const ARProxyList& prioritized,
                                                 const ARProxyList& paused) {
    (void)prioritized, (void)paused;
  }
  virtual void applicationInstallsDidCancel(const ARProxyList& proxies) { (void)proxies; }
  virtual void applicationsDidInstall(const ARProxyList& proxies) { (void)proxies; }
  virtual void applicationsDidUninstall(const ARProxyList& proxies) { (void)proxies; }
};

// The default workspace. Every operation is safe from any thread.
class ARApplicationWorkspace {
 public:
  using BundleBlock =
      std::function<void(const std::shared_ptr<const ARBundleProxy>& proxy, bool* stop)>;

  virtual ~ARApplicationWorkspace() = default;

  // Registers `observer` (not owned). Soon after, on a registry thread, the registry delivers
  // applicationInstallsArePrioritized:arePaused: with the installs it currently runs; later
  // events follow as they happen, on registry threads.
  virtual void addObserver(ARApplicationWorkspaceObserverProtocol* observer) = 0;
  // After this returns no callback for `observer` is running or will run.
  virtual void removeObserver(ARApplicationWorkspaceObserverProtocol* observer) = 0;

  virtual bool applicationIsInstalled(const std::string& identifier) = 0;
  // True on success. `options` may be absent.
  virtual bool uninstallApplication(const std::string& identifier,
                                    const std::optional<plist::Dict>& options) = 0;
  // Installs the bundle directory (a placeholder package) at `path`. True on success.
  virtual bool installApplication(const std::string& path, const plist::Dict& options) = 0;
  // Installs a delivered package; on failure *error (when given) receives the reason.
  virtual bool installApplication(const std::string& path, const plist::Dict& options,
                                  ErrorRef* error) = 0;
  // Calls `block` synchronously on the calling thread, once per bundle of `type`, in the
  // registry's order, until the block sets *stop.
  virtual void enumerateBundlesOfType(int type, const BundleBlock& block) = 0;
  // The progress object of the application's install in `phase`, created if needed; null when
  // the registry does not know the application.
  virtual std::shared_ptr<ARInstallProgress> installProgressForApplication(
      const ARApplicationProxy& proxy, std::uint64_t phase) = 0;
  virtual void installPhaseFinishedForProgress(
      const std::shared_ptr<ARInstallProgress>& progress) = 0;
  // The application with this identifier; with `placeholder` true a placeholder also counts.
  virtual std::shared_ptr<const ARApplicationProxy> applicationProxyForIdentifier(
      const std::string& identifier, bool placeholder) = 0;
};

}  // namespace appsync
