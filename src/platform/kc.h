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
// threads of the service's choosing, possibly several at once.
class KCAppInstallObserverDelegate {
 public:
  virtual ~KCAppInstallObserverDelegate() = default;
  virtual void coordinatorDidInstallPlaceholder(
      const std::shared_ptr<KCAppInstallCoordinator>& coordinator) {
    (void)coordinator;
  }
  virtual void coordinatorDidCompleteSuccessfully(
      const std::shared_ptr<KCAppInstallCoordinator>& coordinator) {
    (void)coordinator;
  }
  virtual void coordinatorShouldPrioritize(
      const std::shared_ptr<KCAppInstallCoordinator>& coordinator) {
    (void)coordinator;
  }
  virtual void coordinator(const std::shared_ptr<KCAppInstallCoordinator>& coordinator,
                           const ErrorRef& canceledWithReason, std::uint64_t client) {
    (void)coordinator, (void)canceledWithReason, (void)client;
  }
  virtual void promiseDidBeginFulfillmentWithIdentifier(std::uint64_t identifier) {
    (void)identifier;
  }
};

// A promise of data that some client will deliver.
class KCPromise {
 public:
  virtual ~KCPromise() = default;
  virtual std::string name() const = 0;
  virtual std::uint64_t client() const = 0;
  virtual std::uint64_t diskSpaceNeeded() const = 0;
  virtual double percentComplete() const = 0;
  virtual void setPercentComplete(double fraction) = 0;
  virtual bool isComplete() const = 0;
  virtual void setComplete(bool complete) = 0;
  virtual bool isCancelled() const = 0;
  // True when the promise was cancelled; *error (when given) receives a failure.
  virtual bool cancelForReason(const ErrorRef& reason, std::uint64_t client, ErrorRef* error) = 0;
  virtual std::string describe() const = 0;
};

// A promise of a file at a path.
class KCPromisedTransferToPath : public KCPromise {
 public:
  virtual std::optional<std::string> transferPath() const = 0;
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

// A placeholder application being configured for a coordinator. Each setter returns success
// and reports failure through *error (when given).
class KCPlaceholder {
 public:
  virtual ~KCPlaceholder() = default;
  virtual std::string bundleID() const = 0;
  virtual bool setIconPromise(const std::shared_ptr<KCPromisedTransferToPath>& promise,
                              ErrorRef* error) = 0;
  virtual bool setPlaceholderAttributes(const KCPlaceholderAttributes& attributes,
                                        ErrorRef* error) = 0;
  virtual bool setMetadata(const std::shared_ptr<const EMStoreMetadata>& metadata,
                           ErrorRef* error) = 0;
  virtual bool setSinfData(const plist::Bytes& sinf, ErrorRef* error) = 0;
  virtual bool setConfigurationCompleteWithError(ErrorRef* error) = 0;
  virtual bool cancelForReason(const ErrorRef& reason, std::uint64_t client, ErrorRef* error) = 0;
  virtual std::string describe() const = 0;
};

enum class KCCoordinatorKind { Any, Initiating, Updating, Restoring, RestoringDemoted };

// One application's install, held by the service.
class KCAppInstallCoordinator {
 public:
  virtual ~KCAppInstallCoordinator() = default;
  virtual std::string bundleID() const = 0;
  virtual KCCoordinatorKind kind() const = 0;
  // The error the coordinator failed or was cancelled with; null while all is well.
  virtual ErrorRef error() const = 0;
  virtual std::uint64_t creatorIdentifier() const = 0;
  virtual bool cancelForReason(const ErrorRef& reason, std::uint64_t client, ErrorRef* error) = 0;
  // `observer` is not owned; it must outlive the coordinator or be replaced first.
  virtual void setObserver(KCAppInstallObserverDelegate* observer) = 0;

  virtual bool setPlaceholderPromise(const std::shared_ptr<KCPlaceholder>& placeholder,
                                     ErrorRef* error) = 0;
  virtual bool hasPlaceholderPromise() const = 0;
  virtual bool setAppAssetPromise(const std::shared_ptr<KCPromisedTransferToPath>& promise,
                                  ErrorRef* error) = 0;
  virtual std::shared_ptr<KCPromisedTransferToPath> appAssetPromiseWithError(ErrorRef* error) = 0;
  virtual bool hasAppAssetPromise() const = 0;
  virtual bool setUserDataPromise(const std::shared_ptr<KCPromise>& promise, ErrorRef* error) = 0;
  virtual bool hasUserDataPromise() const = 0;
  virtual bool setInstallOptions(const std::shared_ptr<const EMInstallOptions>& options,
                                 ErrorRef* error) = 0;
  virtual bool hasInstallOptions() const = 0;
  virtual bool setInitialSPRAssetPromises(const std::vector<std::shared_ptr<KCPromise>>& promises,
                                          ErrorRef* error) = 0;
  virtual bool hasInitialSPRAssetPromises() const = 0;
  virtual bool setAppAssetPromiseResponsibleClient(std::uint64_t client, ErrorRef* error) = 0;
  virtual std::uint64_t appAssetPromiseResponsibleClientWithError(ErrorRef* error) = 0;
  virtual std::string describe() const = 0;
};

// The registration that delivers coordinator events for a set of client numbers. Events stop
// when the last reference is dropped.
class KCAppInstallObserver {
 public:
  virtual ~KCAppInstallObserver() = default;
  virtual const std::string& machServiceName() const = 0;
  virtual const std::set<std::uint64_t>& clients() const = 0;
};

class KCInstallCoordination {
 public:
  virtual ~KCInstallCoordination() = default;

  virtual bool coordinationIsEnabled() = 0;
  // Removes the application; `completion` runs once, on a service thread, with the error or
  // null.
  virtual void uninstallAppWithBundleID(const std::string& bundleID, bool requestUserConfirmation,
                                        std::function<void(ErrorRef)> completion) = 0;
  // The coordinator of `bundleID` of `kind` (Any: whatever exists, never created). Null when
  // none exists and `createIfNotExisting` is false, or creation failed (*error then says why).
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
  // owned) until the returned registration is dropped.
  virtual std::shared_ptr<KCAppInstallObserver> initAppInstallObserver(
      const std::string& machServiceName, const std::set<std::uint64_t>& clients,
      KCAppInstallObserverDelegate* delegate) = 0;
  // Stops every event to `observer`, as a coordinator observer and as a delegate: after this
  // returns no event for it is running or will run. Observers call this before they go away
  // (the service holds them without owning them).
  virtual void removeObserver(const KCAppInstallObserverDelegate* observer) = 0;
  // A user-presentable error of the service wrapping `underlying`.
  virtual ErrorRef KCCreateUserPresentableError(std::int64_t code, std::int64_t detail,
                                                const ErrorRef& underlying) = 0;
};

}  // namespace appsync
