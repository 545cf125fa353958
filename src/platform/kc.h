// The install-coordination service: coordinators, promises, placeholders and their events.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "runtime/error.h"
#include "runtime/plist/value.h"
#include "platform/em.h"

namespace appsync {

// The coordination client number of this plugin: every coordinator, placeholder and promise it
// creates, looks up or cancels is under this number.
inline constexpr std::uint64_t kAppSyncCoordinationClient = 3;
// The store daemon's client number.
inline constexpr std::uint64_t KCClientBazaar = 1;

class KCAppInstallCoordinator;

// Events about coordinators. Each is optional: the default ignores the event. Delivered on
// threads of the service's choosing, possibly several at once, never from within the call that
// caused them and with no service lock held: a handler may call the service. A coordinator's
// observer gets each event first, then every delegate registered for its creator client.
class KCAppInstallObserverDelegate {
 public:
  virtual ~KCAppInstallObserverDelegate() = default;
  // The coordinator's placeholder is now in the application registry.
  virtual void coordinatorDidInstallPlaceholder(
      const std::shared_ptr<KCAppInstallCoordinator>& coordinator) {
    (void)coordinator;
  }
  // The coordinator has finished and the service has forgotten it. Also sent when the package
  // install failed: error() is then already set.
  virtual void coordinatorDidCompleteSuccessfully(
      const std::shared_ptr<KCAppInstallCoordinator>& coordinator) {
    (void)coordinator;
  }
  virtual void coordinatorShouldPrioritize(
      const std::shared_ptr<KCAppInstallCoordinator>& coordinator) {
    (void)coordinator;
  }
  // Cancelled by `client` (0: the service itself). A placeholder the service put into the
  // registry for it, if still a placeholder, has been removed.
  virtual void coordinator(const std::shared_ptr<KCAppInstallCoordinator>& coordinator,
                           const ErrorRef& canceledWithReason, std::uint64_t client) {
    (void)coordinator, (void)canceledWithReason, (void)client;
  }
  virtual void promiseDidBeginFulfillmentWithIdentifier(std::uint64_t identifier) {
    (void)identifier;
  }
};

// A promise of data that some client will deliver. Shared by its maker and whatever holds it (a
// coordinator or placeholder). Safe from any thread. The accessors cannot fail.
class KCPromise {
 public:
  KCPromise() = default;
  virtual ~KCPromise() = default;
  KCPromise(const KCPromise&) = delete;
  KCPromise& operator=(const KCPromise&) = delete;

  virtual std::string name() const = 0;
  virtual std::uint64_t client() const = 0;
  virtual std::uint64_t diskSpaceNeeded() const = 0;
  virtual double percentComplete() const = 0;
  // Clamped to [0, 1]. Cannot fail.
  virtual void setPercentComplete(double fraction) = 0;
  virtual bool isComplete() const = 0;
  // Lets whatever waits for the promise go on. Changes nothing once the promise is cancelled.
  virtual void setComplete(bool complete) = 0;
  virtual bool isCancelled() const = 0;
  // True when the promise was cancelled. False, with *error (when given) set, when it already
  // was or the service refused.
  virtual bool cancelForReason(const ErrorRef& reason, std::uint64_t client, ErrorRef* error) = 0;
  // One line, for messages.
  virtual std::string describe() const = 0;
};

// A promise of a file at a path.
class KCPromisedTransferToPath : public KCPromise {
 public:
  // Absent until the path is known. Cannot fail.
  virtual std::optional<std::string> transferPath() const = 0;
  // A path, or a "file://" URL of one. Cannot fail.
  virtual void setTransferPath(std::string path) = 0;
};

// A promise of data delivered outside the service (restored user data).
class KCPromisedOutOfBandTransfer : public KCPromise {};

class KCPlaceholderAttributes {
 public:
  KCPlaceholderAttributes() = default;
  explicit KCPlaceholderAttributes(plist::Dict infoPlist) : infoPlist_(std::move(infoPlist)) {}
  void setBundleVersion(std::optional<std::string> version) { bundleVersion_ = std::move(version); }
  void setLaunchProhibited(bool prohibited) { launchProhibited_ = prohibited; }
  const plist::Dict& infoPlist() const { return infoPlist_; }
  const std::optional<std::string>& bundleVersion() const { return bundleVersion_; }
  bool launchProhibited() const { return launchProhibited_; }
  std::string describe() const;

 private:
  plist::Dict infoPlist_;
  std::optional<std::string> bundleVersion_;
  bool launchProhibited_ = false;
};

// A placeholder application being configured for a coordinator. Shared by its maker and the
// coordinator it is given to. Safe from any thread. Each setter returns success; it fails, with
// *error (when given) set, once the configuration is complete or the placeholder is cancelled.
class KCPlaceholder {
 public:
  KCPlaceholder() = default;
  virtual ~KCPlaceholder() = default;
  KCPlaceholder(const KCPlaceholder&) = delete;
  KCPlaceholder& operator=(const KCPlaceholder&) = delete;

  // Cannot fail.
  virtual std::string bundleID() const = 0;
  // The placeholder is installed only once the icon promise is complete. Null is refused; a
  // second icon promise is refused.
  virtual bool setIconPromise(const std::shared_ptr<KCPromisedTransferToPath>& promise,
                              ErrorRef* error) = 0;
  // Copies `attributes`.
  virtual bool setPlaceholderAttributes(const KCPlaceholderAttributes& attributes,
                                        ErrorRef* error) = 0;
  // Null means none.
  virtual bool setMetadata(const std::shared_ptr<const EMStoreMetadata>& metadata,
                           ErrorRef* error) = 0;
  // Copies `sinf`.
  virtual bool setSinfData(const plist::Bytes& sinf, ErrorRef* error) = 0;
  // Ends the configuration; only a configured placeholder may be given to a coordinator.
  virtual bool setConfigurationCompleteWithError(ErrorRef* error) = 0;
  // Also cancels the icon promise. Fails when already cancelled.
  virtual bool cancelForReason(const ErrorRef& reason, std::uint64_t client, ErrorRef* error) = 0;
  // One line, for messages.
  virtual std::string describe() const = 0;
};

enum class KCCoordinatorKind { Any, Initiating, Updating, Restoring, RestoringDemoted };

// One application's install, shared by the service and whoever looked it up. Safe from any thread.
// Setters return success; they fail, with *error (when given) set, once the coordinator has
// completed or been cancelled, for a null argument, and for what it already holds: placeholder,
// asset promise, user-data promise, install options and SPR promises are each set once. Queries
// (has..., bundleID, kind, creatorIdentifier) cannot fail.
class KCAppInstallCoordinator {
 public:
  KCAppInstallCoordinator() = default;
  virtual ~KCAppInstallCoordinator() = default;
  KCAppInstallCoordinator(const KCAppInstallCoordinator&) = delete;
  KCAppInstallCoordinator& operator=(const KCAppInstallCoordinator&) = delete;

  virtual std::string bundleID() const = 0;
  virtual KCCoordinatorKind kind() const = 0;
  // The error the coordinator failed or was cancelled with; null while all is well.
  virtual ErrorRef error() const = 0;
  virtual std::uint64_t creatorIdentifier() const = 0;
  // Sets error() to `reason` (a cancellation error of the service when null), cancels the
  // promises and placeholder, has the service forget the coordinator and report the
  // cancellation. Fails once the coordinator has completed or been cancelled.
  virtual bool cancelForReason(const ErrorRef& reason, std::uint64_t client, ErrorRef* error) = 0;
  // Cannot fail. `observer` is not owned; it must outlive the coordinator or be replaced first.
  // Replacing or clearing it returns once no delivery to the old one runs (at once inside one).
  virtual void setObserver(KCAppInstallObserverDelegate* observer) = 0;

  // Also refuses a placeholder not made by this service, one whose configuration is not
  // complete, a cancelled one, and one already given to a coordinator.
  virtual bool setPlaceholderPromise(const std::shared_ptr<KCPlaceholder>& placeholder,
                                     ErrorRef* error) = 0;
  virtual bool hasPlaceholderPromise() const = 0;
  // The package is installed once this promise is complete with a transfer path.
  virtual bool setAppAssetPromise(const std::shared_ptr<KCPromisedTransferToPath>& promise,
                                  ErrorRef* error) = 0;
  // Null with no error when there is none; null and *error on failure.
  virtual std::shared_ptr<KCPromisedTransferToPath> appAssetPromiseWithError(ErrorRef* error) = 0;
  virtual bool hasAppAssetPromise() const = 0;
  // The package install also waits for this promise.
  virtual bool setUserDataPromise(const std::shared_ptr<KCPromise>& promise, ErrorRef* error) = 0;
  virtual bool hasUserDataPromise() const = 0;
  // Their install type is the package install's.
  virtual bool setInstallOptions(const std::shared_ptr<const EMInstallOptions>& options,
                                 ErrorRef* error) = 0;
  virtual bool hasInstallOptions() const = 0;
  // The package install also waits for each of these; an empty list counts as set.
  virtual bool setInitialSPRAssetPromises(const std::vector<std::shared_ptr<KCPromise>>& promises,
                                          ErrorRef* error) = 0;
  virtual bool hasInitialSPRAssetPromises() const = 0;
  // May be changed at any time while the coordinator is active.
  virtual bool setAppAssetPromiseResponsibleClient(std::uint64_t client, ErrorRef* error) = 0;
  // 0 when no client was named; 0 and *error on failure.
  virtual std::uint64_t appAssetPromiseResponsibleClientWithError(ErrorRef* error) = 0;
  // One line, for messages.
  virtual std::string describe() const = 0;
};

// The registration that delivers coordinator events for a set of client numbers. Events stop when
// the last reference is dropped: once its destruction returns none is running (unless it runs
// inside a delivery) and none will come. Safe from any thread.
class KCAppInstallObserver {
 public:
  KCAppInstallObserver() = default;
  virtual ~KCAppInstallObserver() = default;
  KCAppInstallObserver(const KCAppInstallObserver&) = delete;
  KCAppInstallObserver& operator=(const KCAppInstallObserver&) = delete;

  // Cannot fail; valid for the registration's lifetime.
  virtual const std::string& machServiceName() const = 0;
  virtual const std::set<std::uint64_t>& clients() const = 0;
};

// The service. Safe from any thread. Objects it hands out are shared with the caller and may
// outlive it (they then stop reporting changes). In the background, once a coordinator's
// placeholder is configured and its icon promise (if any) complete, the service installs the
// placeholder; once its asset promise is complete with a path and its user-data and SPR promises
// are complete, it installs the package and the coordinator completes.
class KCInstallCoordination {
 public:
  KCInstallCoordination() = default;
  virtual ~KCInstallCoordination() = default;
  KCInstallCoordination(const KCInstallCoordination&) = delete;
  KCInstallCoordination& operator=(const KCInstallCoordination&) = delete;

  // Cannot fail.
  virtual bool coordinationIsEnabled() = 0;
  // Removes the application, leaving coordinators alone. Returns at once; `completion` runs
  // once, on a service thread, with null, or an error for an unknown application or a refusal.
  virtual void uninstallAppWithBundleID(const std::string& bundleID, bool requestUserConfirmation,
                                        std::function<void(ErrorRef)> completion) = 0;
  // The coordinator of `bundleID` if one exists and `kind` is Any or its own (whoever made it).
  // Without one, a new one made by `clientID` when `createIfNotExisting` and `kind` is not Any
  // (*created true), else null with no error. Null and *error on failure (another kind exists).
  virtual std::shared_ptr<KCAppInstallCoordinator> coordinatorForAppWithBundleID(
      KCCoordinatorKind kind, const std::string& bundleID, std::uint64_t clientID,
      bool createIfNotExisting, bool* created, ErrorRef* error) = 0;

  // Constructors of the service's objects; null when the object cannot be made.
  virtual std::shared_ptr<KCPlaceholder> initAppPlaceholder(const std::string& bundleName,
                                                            const std::string& bundleID,
                                                            std::uint64_t installType,
                                                            std::uint64_t client) = 0;
  virtual std::shared_ptr<KCPromisedTransferToPath> initPromisedTransferToPath(
      const std::string& name, std::uint64_t client,
      const std::optional<std::string>& transferPath, std::uint64_t diskSpaceNeeded) = 0;
  virtual std::shared_ptr<KCPromisedOutOfBandTransfer> initPromisedOutOfBandTransfer(
      const std::string& name, std::uint64_t client, std::uint64_t diskSpaceNeeded) = 0;
  // Starts delivering events of coordinators created under `clients` to `delegate` (not
  // owned) until the returned registration is dropped. Null when it cannot be made.
  virtual std::shared_ptr<KCAppInstallObserver> initAppInstallObserver(
      const std::string& machServiceName, const std::set<std::uint64_t>& clients,
      KCAppInstallObserverDelegate* delegate) = 0;
  // Stops every event to `observer`, as a coordinator observer and as a delegate: after this
  // returns no event for it is running or will run (inside a delivery it does not wait for
  // that one). Observers call this before they go away. Cannot fail.
  virtual void removeObserver(const KCAppInstallObserverDelegate* observer) = 0;
  // A user-presentable error of the service wrapping `underlying`, carrying `code` and
  // `detail`. Never null.
  virtual ErrorRef KCCreateUserPresentableError(std::int64_t code, std::int64_t detail,
                                                const ErrorRef& underlying) = 0;
};

}  // namespace appsync
