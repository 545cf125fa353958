// The coordinator of the fake install-coordination service: one application's install, holding
// the promises and the placeholder its clients set, and moved along by the service.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <type_traits>
#include <vector>

#include "runtime/error.h"
#include "runtime/guarded.h"
#include "platform/em.h"
#include "platform/fake/fake_kc_service_hooks.h"
#include "platform/kc.h"

namespace appsync {

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
  ErrorRef error() const override { return snapshot().error; }
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
  bool hasPlaceholderPromise() const override { return snapshot().placeholder != nullptr; }
  bool setAppAssetPromise(const std::shared_ptr<KCPromisedTransferToPath>& promise,
                          ErrorRef* error) override;
  // Null, with no error, when the coordinator has no asset promise.
  std::shared_ptr<KCPromisedTransferToPath> appAssetPromiseWithError(ErrorRef* error) override;
  bool hasAppAssetPromise() const override { return snapshot().appAssetPromise != nullptr; }
  bool setUserDataPromise(const std::shared_ptr<KCPromise>& promise, ErrorRef* error) override;
  bool hasUserDataPromise() const override { return snapshot().userDataPromise != nullptr; }
  bool setInstallOptions(const std::shared_ptr<const EMInstallOptions>& options,
                         ErrorRef* error) override;
  bool hasInstallOptions() const override { return snapshot().installOptions != nullptr; }
  bool setInitialSPRAssetPromises(const std::vector<std::shared_ptr<KCPromise>>& promises,
                                  ErrorRef* error) override;
  bool hasInitialSPRAssetPromises() const override { return snapshot().hasSPRPromises; }
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
  Snapshot snapshot() const { return state_.get(); }
  State state() const { return snapshot().state; }
  KCAppInstallObserverDelegate* observer() const { return snapshot().observer; }

  // Service side.
  // Records that the service put a placeholder record for this coordinator into the registry.
  void notePlaceholderRecord() { placedPlaceholderRecord_.set(true); }
  bool placedPlaceholderRecord() const { return placedPlaceholderRecord_.get(); }
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
  // Loading saved state: takes `saved` as is, without its observer (observers are not state),
  // and becomes the holder of its promises and placeholder.
  void restore(Snapshot saved, bool placedPlaceholderRecord);

 private:
  // The scripted failure of `operation`, or the state error of an inactive coordinator.
  bool checkSettable(const Snapshot& s, std::string_view operation, ErrorRef* error) const;
  // Stores `value` in `slot`, which holds something once. Fails, in this order, with the
  // scripted failure of `operation`, when the coordinator is inactive, with `invalid` (why the
  // value cannot be taken; null when it can), and when the slot is filled (kKCErrorAlreadySet,
  // "already has `what`"). `accept`, run last under the lock, may still refuse the value with
  // an error, or store what goes with it.
  template <class V>
  bool setOnce(std::string_view operation, V Snapshot::*slot, std::type_identity_t<V> value,
               const ErrorRef& invalid, std::string_view what, ErrorRef* error,
               const std::function<ErrorRef(Snapshot&)>& accept = nullptr);
  // Attaches `promises`, just set, and asks the service to re-examine the coordinator. True.
  bool attachAndReport(const std::vector<std::shared_ptr<KCPromise>>& promises);
  void attachPromise(const std::shared_ptr<KCPromise>& promise);

  const std::weak_ptr<FakeKCServiceHooks> service_;
  const KCCoordinatorKind kind_;
  const std::string bundleID_;
  const std::uint64_t creator_;
  Guarded<Snapshot> state_;
  Guarded<bool> placedPlaceholderRecord_;
};

}  // namespace appsync
