// The objects of the fake install-coordination service (promises, placeholders, coordinators,
// observer registrations), with the inspection accessors that tests use.
//
// Ownership: a coordinator owns its promises and placeholder; a placeholder owns its icon
// promise. Back-references (promise or placeholder to coordinator, every object to the service)
// are weak, so nothing keeps itself alive and an object outliving its service still answers
// (it then simply stops reporting changes).
//
// Every object is safe to use from several threads. Each guards its own state with a mutex.
// Locks nest only one way: a coordinator's may be held while asking its placeholder, and any
// object's while counting a call with the service; the service never calls an object while
// holding its own lock, and nothing is held while calling an observer.
#pragma once

#include <cstdint>
#include <memory>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "runtime/error.h"
#include "runtime/plist/value.h"
#include "platform/em.h"
#include "platform/kc.h"

namespace appsync {

class FakeKCAppInstallCoordinator;
class FakeKCAppInstallObserver;

// What the objects need from the service that made them.
class FakeKCServiceHooks {
 public:
  // Counts a call of `operation` and returns its scripted failure, or null to go ahead.
  virtual ErrorRef scriptedFailure(std::string_view operation) = 0;
  // Something the coordinator waits for may have changed; the service re-examines it on its
  // own thread.
  virtual void coordinatorChanged(const std::shared_ptr<FakeKCAppInstallCoordinator>& c) = 0;
  // The coordinator has just been marked cancelled: the service forgets it and reports the
  // cancellation.
  virtual void coordinatorCancelled(const std::shared_ptr<FakeKCAppInstallCoordinator>& c,
                                    const ErrorRef& reason, std::uint64_t client) = 0;
  // Returns once no event delivery that may still use a replaced observer is running.
  virtual void observerReplaced() = 0;
  // The registration is being destroyed; after this returns no event reaches its delegate.
  virtual void registrationGone(const FakeKCAppInstallObserver* registration) = 0;

 protected:
  ~FakeKCServiceHooks() = default;
};

// The state and rules both promise kinds share.
class FakeKCPromiseBase {
 public:
  virtual ~FakeKCPromiseBase() = default;

  // The number promiseDidBeginFulfillmentWithIdentifier: reports for this promise.
  std::uint64_t uniqueIdentifier() const { return identifier_; }
  ErrorRef cancelReason() const;
  // Complete and not cancelled.
  bool isFulfilled() const;
  // Completion and path changes are reported to `coordinator` from now on.
  void attachTo(std::weak_ptr<FakeKCAppInstallCoordinator> coordinator);
  // Cancellation by the service itself: no scripted failure, quiet when already cancelled.
  void cancelByService(const ErrorRef& reason);

 protected:
  FakeKCPromiseBase(std::weak_ptr<FakeKCServiceHooks> service, std::string_view className,
                    bool hasPath, std::string name, std::uint64_t client,
                    std::optional<std::string> transferPath, std::uint64_t diskSpaceNeeded,
                    std::uint64_t identifier);

  double percent() const;
  void setPercent(double fraction);
  bool complete() const;
  void setCompleteFlag(bool complete);
  bool cancelled() const;
  bool cancel(const ErrorRef& reason, ErrorRef* error);
  std::optional<std::string> path() const;
  void setPath(std::string path);
  std::string describeState() const;

  const std::string name_;
  const std::uint64_t client_;
  const std::uint64_t diskSpaceNeeded_;

 private:
  void reportChange(const std::weak_ptr<FakeKCAppInstallCoordinator>& owner);

  const std::weak_ptr<FakeKCServiceHooks> service_;
  const std::string className_;
  const bool hasPath_;
  const std::uint64_t identifier_;

  mutable std::mutex mutex_;
  double percent_ = 0;
  bool complete_ = false;
  bool cancelled_ = false;
  ErrorRef cancelReason_;
  std::optional<std::string> transferPath_;
  std::weak_ptr<FakeKCAppInstallCoordinator> owner_;
};

// KCPromise on top of the shared state, for either promise interface.
template <class Interface>
class FakeKCPromiseImpl : public Interface, public FakeKCPromiseBase {
 public:
  std::string name() const override { return name_; }
  std::uint64_t client() const override { return client_; }
  std::uint64_t diskSpaceNeeded() const override { return diskSpaceNeeded_; }
  double percentComplete() const override { return percent(); }
  void setPercentComplete(double fraction) override { setPercent(fraction); }
  bool isComplete() const override { return complete(); }
  // Completing a cancelled promise changes nothing.
  void setComplete(bool complete) override { setCompleteFlag(complete); }
  bool isCancelled() const override { return cancelled(); }
  // Fails (kKCErrorInvalidState) when already cancelled.
  bool cancelForReason(const ErrorRef& reason, std::uint64_t client, ErrorRef* error) override {
    (void)client;
    return cancel(reason, error);
  }
  std::string describe() const override { return describeState(); }

 protected:
  using FakeKCPromiseBase::FakeKCPromiseBase;
};

class FakeKCPromisedTransferToPath final : public FakeKCPromiseImpl<KCPromisedTransferToPath> {
 public:
  FakeKCPromisedTransferToPath(std::weak_ptr<FakeKCServiceHooks> service, std::string name,
                               std::uint64_t client, std::optional<std::string> transferPath,
                               std::uint64_t diskSpaceNeeded, std::uint64_t identifier);
  std::optional<std::string> transferPath() const override { return path(); }
  void setTransferPath(std::string path) override { setPath(std::move(path)); }
};

class FakeKCPromisedOutOfBandTransfer final
    : public FakeKCPromiseImpl<KCPromisedOutOfBandTransfer> {
 public:
  FakeKCPromisedOutOfBandTransfer(std::weak_ptr<FakeKCServiceHooks> service, std::string name,
                                  std::uint64_t client, std::uint64_t diskSpaceNeeded,
                                  std::uint64_t identifier);
};

// A placeholder being configured. Every setter fails with kKCErrorInvalidState once the
// configuration is complete or the placeholder is cancelled.
class FakeKCPlaceholder final : public KCPlaceholder {
 public:
  FakeKCPlaceholder(std::weak_ptr<FakeKCServiceHooks> service, std::string bundleName,
                    std::string bundleID, std::uint64_t installType, std::uint64_t client);

  std::string bundleID() const override { return bundleID_; }
  // A null promise is kKCErrorInvalidArgument; an icon promise is set once.
  bool setIconPromise(const std::shared_ptr<KCPromisedTransferToPath>& promise,
                      ErrorRef* error) override;
  bool setPlaceholderAttributes(const KCPlaceholderAttributes& attributes,
                                ErrorRef* error) override;
  // Null metadata is accepted (and recorded as none).
  bool setMetadata(const std::shared_ptr<const EMStoreMetadata>& metadata,
                   ErrorRef* error) override;
  bool setSinfData(const plist::Bytes& sinf, ErrorRef* error) override;
  bool setConfigurationCompleteWithError(ErrorRef* error) override;
  // Also cancels the icon promise. Fails when already cancelled.
  bool cancelForReason(const ErrorRef& reason, std::uint64_t client, ErrorRef* error) override;
  std::string describe() const override;

  const std::string& bundleName() const { return bundleName_; }
  std::uint64_t installType() const { return installType_; }
  std::uint64_t client() const { return client_; }
  std::shared_ptr<KCPromisedTransferToPath> iconPromise() const;
  std::optional<KCPlaceholderAttributes> attributes() const;
  std::shared_ptr<const EMStoreMetadata> metadata() const;
  std::optional<plist::Bytes> sinfData() const;
  bool isConfigurationComplete() const;
  bool isCancelled() const;
  ErrorRef cancelReason() const;

  // Configured, not cancelled, and its icon promise (if any) fulfilled.
  bool isReadyToInstall() const;
  // Hands the placeholder to `coordinator`; false when it already belongs to one.
  bool handTo(const std::shared_ptr<FakeKCAppInstallCoordinator>& coordinator);
  void cancelByService(const ErrorRef& reason);

 private:
  // The scripted failure of `operation`, or the state error of a finished configuration.
  bool checkSettable(std::string_view operation, ErrorRef* error) const;

  const std::weak_ptr<FakeKCServiceHooks> service_;
  const std::string bundleName_;
  const std::string bundleID_;
  const std::uint64_t installType_;
  const std::uint64_t client_;

  mutable std::mutex mutex_;
  std::shared_ptr<KCPromisedTransferToPath> iconPromise_;
  std::optional<KCPlaceholderAttributes> attributes_;
  std::shared_ptr<const EMStoreMetadata> metadata_;
  std::optional<plist::Bytes> sinf_;
  bool configurationComplete_ = false;
  bool cancelled_ = false;
  ErrorRef cancelReason_;
  bool handedOver_ = false;
};

// The platform's class name of a coordinator kind ("KCInitiatingAppInstallCoordinator", ...).
std::string_view coordinatorClassName(KCCoordinatorKind kind);

// One application's install. Setters fail with kKCErrorInvalidState once the coordinator has
// completed or been cancelled, and with kKCErrorAlreadySet for what it already holds (install
// options, SPR promises, asset, user-data and placeholder promises are each set once).
class FakeKCAppInstallCoordinator final
    : public KCAppInstallCoordinator,
      public std::enable_shared_from_this<FakeKCAppInstallCoordinator> {
 public:
  enum class State { Active, Completed, Cancelled };

  FakeKCAppInstallCoordinator(std::weak_ptr<FakeKCServiceHooks> service, KCCoordinatorKind kind,
                              std::string bundleID, std::uint64_t creator);

  std::string bundleID() const override { return bundleID_; }
  KCCoordinatorKind kind() const override { return kind_; }
  ErrorRef error() const override;
  std::uint64_t creatorIdentifier() const override { return creator_; }
  // Sets error() to the reason (kKCErrorCanceled when none), cancels the promises and the
  // placeholder, and has the service forget the coordinator and report the cancellation.
  bool cancelForReason(const ErrorRef& reason, std::uint64_t client, ErrorRef* error) override;
  // Replacing or clearing an observer returns once no delivery to the old one is running
  // (unless called from an event delivery).
  void setObserver(KCAppInstallObserverDelegate* observer) override;

  // Fails with kKCErrorInvalidArgument for a null placeholder or one not made by this service,
  // kKCErrorPlaceholderNotConfigured when its configuration is not complete, and
  // kKCErrorInvalidState when it is cancelled or already belongs to a coordinator.
  bool setPlaceholderPromise(const std::shared_ptr<KCPlaceholder>& placeholder,
                             ErrorRef* error) override;
  bool hasPlaceholderPromise() const override;
  bool setAppAssetPromise(const std::shared_ptr<KCPromisedTransferToPath>& promise,
                          ErrorRef* error) override;
  // Null, with no error, when the coordinator has no asset promise.
  std::shared_ptr<KCPromisedTransferToPath> appAssetPromiseWithError(ErrorRef* error) override;
  bool hasAppAssetPromise() const override;
  bool setUserDataPromise(const std::shared_ptr<KCPromise>& promise, ErrorRef* error) override;
  bool hasUserDataPromise() const override;
  bool setInstallOptions(const std::shared_ptr<const EMInstallOptions>& options,
                         ErrorRef* error) override;
  bool hasInstallOptions() const override;
  bool setInitialSPRAssetPromises(const std::vector<std::shared_ptr<KCPromise>>& promises,
                                  ErrorRef* error) override;
  bool hasInitialSPRAssetPromises() const override;
  // May be changed at any time while the coordinator is active.
  bool setAppAssetPromiseResponsibleClient(std::uint64_t client, ErrorRef* error) override;
  // 0 when no client was named.
  std::uint64_t appAssetPromiseResponsibleClientWithError(ErrorRef* error) override;
  std::string describe() const override;

  // Inspection.
  struct Snapshot {
    State state = State::Active;
    ErrorRef error;
    KCAppInstallObserverDelegate* observer = nullptr;
    std::shared_ptr<KCPlaceholder> placeholder;
    std::shared_ptr<KCPromisedTransferToPath> appAssetPromise;
    std::shared_ptr<KCPromise> userDataPromise;
    std::shared_ptr<const EMInstallOptions> installOptions;
    bool hasSPRPromises = false;
    std::vector<std::shared_ptr<KCPromise>> sprPromises;
    std::uint64_t responsibleClient = 0;
    bool placeholderInstalled = false;
  };
  Snapshot snapshot() const;
  State state() const;
  KCAppInstallObserverDelegate* observer() const;

  // Service side.
  // Records that the service put a placeholder record for this coordinator into the registry.
  void notePlaceholderRecord();
  bool placedPlaceholderRecord() const;
  // Active → placeholder installed; false when no longer active.
  bool markPlaceholderInstalled();
  // Active → Completed with `error` (null on success); false when no longer active.
  bool finish(const ErrorRef& error);
  // Active → Cancelled and cancels the promises and placeholder; false when no longer active.
  bool markCancelled(const ErrorRef& reason);
  // Sets the asset promise on behalf of the store; false when one is set or not active.
  bool adoptAppAssetPromise(const std::shared_ptr<KCPromisedTransferToPath>& promise);
  // Clears the observer when it is `observer`.
  bool forgetObserver(const KCAppInstallObserverDelegate* observer);
  // Asks the service to re-examine the coordinator.
  void reportChange();

 private:
  // The scripted failure of `operation`, or the state error of an inactive coordinator.
  bool checkSettable(std::string_view operation, ErrorRef* error) const;
  void attachPromise(const std::shared_ptr<KCPromise>& promise);

  const std::weak_ptr<FakeKCServiceHooks> service_;
  const KCCoordinatorKind kind_;
  const std::string bundleID_;
  const std::uint64_t creator_;

  mutable std::mutex mutex_;
  Snapshot s_;
  bool placedPlaceholderRecord_ = false;
};

// The registration that delivers the events of coordinators created under its clients to its
// delegate. Dropping it stops the events: when its destructor returns, none is running (unless
// it runs inside an event delivery) and none will be delivered.
class FakeKCAppInstallObserver final : public KCAppInstallObserver {
 public:
  FakeKCAppInstallObserver(std::weak_ptr<FakeKCServiceHooks> service, std::string machServiceName,
                           std::set<std::uint64_t> clients, KCAppInstallObserverDelegate* delegate);
  ~FakeKCAppInstallObserver() override;
  FakeKCAppInstallObserver(const FakeKCAppInstallObserver&) = delete;
  FakeKCAppInstallObserver& operator=(const FakeKCAppInstallObserver&) = delete;

  const std::string& machServiceName() const override { return machServiceName_; }
  const std::set<std::uint64_t>& clients() const override { return clients_; }
  KCAppInstallObserverDelegate* delegate() const { return delegate_; }
  std::string describe() const;

 private:
  const std::weak_ptr<FakeKCServiceHooks> service_;
  const std::string machServiceName_;
  const std::set<std::uint64_t> clients_;
  KCAppInstallObserverDelegate* const delegate_;
};

}  // namespace appsync
