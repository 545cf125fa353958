// The fake install-coordination service: holds coordinators, placeholders and promises,
// installs the placeholder and then the application into the fake registry when the promises
// are fulfilled, and reports coordinator events on its own thread.
//
// What the service does in the background, always on its event thread and in this order:
//   - A coordinator holding a placeholder whose configuration is complete (and whose icon
//     promise, if any, is complete) gets its placeholder installed: a placeholder record goes
//     into the registry (name from the placeholder, version from the attributes' bundle version
//     or else the Info.plist's BNBundleVersion, install type from the placeholder, icon path from
//     the icon promise, hasMIDBasedSINF when the placeholder has non-empty SINF bytes). A registry
//     application that is not a placeholder (an update) is left as it is.
//     coordinatorDidInstallPlaceholder follows. A placeholder install held back by
//     holdPlaceholderInstall waits for its release.
//   - Once the placeholder is installed, the asset promise is complete with a transfer path and
//     any user-data and SPR promises are complete, the package is installed:
//     installApplication(path, {"PackageType": "Customer", "BNBundleIdentifier": ID,
//     "ARInstallType": the install options' type, else the placeholder's, "CaravelMetadata":
//     the install options' metadata dictionary, else the placeholder's (left out without
//     either), "ApplicationSINF": the placeholder's SINF bytes (left out without)}). A
//     "file://" prefix of the path is dropped. Either way the coordinator finishes, is forgotten by
//     the service, and coordinatorDidCompleteSuccessfully is delivered. A failed install leaves the
//     placeholder record in place and sets the coordinator's error (kKCErrorInstallFailed,
//     underlying the registry's error) before the event, so an observer that checks error()
//     sees the failure.
//   - A cancelled coordinator (by a client, or by the service when installing its placeholder
//     failed; the latter reports client 0) is forgotten at once; on the event thread the
//     placeholder record the service put is removed again if it is still a placeholder, then
//     coordinator:canceledWithReason:client: is delivered.
// Events go to the coordinator's observer first, then to the delegate of every
// KCAppInstallObserver registered for the coordinator's creator client, each read when the
// event is delivered (a delegate that is both gets the event twice).
//
// Scripted failures (FakeService): an operation is named by its selector; the three
// cancellations by class and selector. Those that can fail:
//   uninstallAppWithBundleID:requestUserConfirmation:completion:   (completion gets the error)
//   coordinatorForAppWithBundleID:withClientID:createIfNotExisting:created:error:
//   initAppPlaceholderWithBundleName:bundleID:installType:client:     (returns null)
//   KCPromisedTransferToPath initWithName:client:transferPath:diskSpaceNeeded:   (null)
//   KCPromisedTransferToPath initWithName:client:diskSpaceNeeded:     (without a path; null)
//   KCPromisedOutOfBandTransfer initWithName:client:diskSpaceNeeded:  (null)
//   initWithMachServiceName:forClients:delegate:                      (observer; null)
//   setPlaceholderPromise:error:  setAppAssetPromise:error:  appAssetPromiseWithError:
//   setUserDataPromise:error:  setInstallOptions:error:  setInitialSPRAssetPromises:error:
//   setAppAssetPromiseResponsibleClient:error:  appAssetPromiseResponsibleClientWithError:
//   setIconPromise:error:  setPlaceholderAttributes:error:  setMetadata:error:
//   setSinfData:error:  setConfigurationCompleteWithError:
//   KCAppInstallCoordinator cancelForReason:client:error:
//   KCPlaceholder cancelForReason:client:error:
//   KCPromise cancelForReason:client:error:
//   installPlaceholder   (the service's own step: the coordinator is cancelled with the error)
//   installPackage       (the service's own step: the install fails with the error)
// Counted only: coordinationIsEnabled, setObserver:, KCCreateUserPresentableError.
// A scripted failure is checked when the call is made, before anything else.
//
// Lifetime: the registry must outlive the service. When the service is destroyed, work still
// queued is dropped (no further events, no uninstall completion); its objects stay usable but
// no longer report changes. It must not be destroyed from one of its own callbacks.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "platform/fake/fake_kc_errors.h"
#include "platform/fake/fake_kc_history.h"
#include "platform/fake/fake_kc_objects.h"
#include "platform/fake/fake_service.h"
#include "platform/fake/state_fields.h"
#include "platform/kc.h"

namespace appsync {

class FakeARWorkspace;
class FakeKCDaemon;

class FakeKCInstallCoordination final : public KCInstallCoordination, public FakeService {
 public:
  // `registry` receives the placeholders and applications; it must outlive this service.
  explicit FakeKCInstallCoordination(FakeARWorkspace& registry);
  ~FakeKCInstallCoordination() override;
  FakeKCInstallCoordination(const FakeKCInstallCoordination&) = delete;
  FakeKCInstallCoordination& operator=(const FakeKCInstallCoordination&) = delete;

  // --- KCInstallCoordination ---
  bool coordinationIsEnabled() override;
  // Completion on the event thread: null after registry.uninstallApplication succeeded;
  // kKCErrorUnknownApplication when the registry does not know the application;
  // kKCErrorUninstallFailed when it refused. Coordinators are left alone.
  void uninstallAppWithBundleID(const std::string& bundleID, bool requestUserConfirmation,
                                std::function<void(ErrorRef)> completion) override;
  // An existing coordinator is returned when `kind` is Any or its own kind (whatever
  // `clientID`; creatorIdentifier() tells who made it); one of another kind gives null and
  // kKCErrorCoordinatorKindMismatch. Without one, a coordinator created by `clientID` when
  // `createIfNotExisting` and kind is not Any (*created true), else null with no error.
  std::shared_ptr<KCAppInstallCoordinator> coordinatorForAppWithBundleID(
      KCCoordinatorKind kind, const std::string& bundleID, std::uint64_t clientID,
      bool createIfNotExisting, bool* created, ErrorRef* error) override;
  std::shared_ptr<KCPlaceholder> initAppPlaceholder(const std::string& bundleName,
                                                    const std::string& bundleID,
                                                    std::uint64_t installType,
                                                    std::uint64_t client) override;
  std::shared_ptr<KCPromisedTransferToPath> initPromisedTransferToPath(
      const std::string& name, std::uint64_t client, const std::optional<std::string>& transferPath,
      std::uint64_t diskSpaceNeeded) override;
  std::shared_ptr<KCPromisedOutOfBandTransfer> initPromisedOutOfBandTransfer(
      const std::string& name, std::uint64_t client, std::uint64_t diskSpaceNeeded) override;
  std::shared_ptr<KCAppInstallObserver> initAppInstallObserver(
      const std::string& machServiceName, const std::set<std::uint64_t>& clients,
      KCAppInstallObserverDelegate* delegate) override;
  // Domain "KCErrorDomain", the given code, userInfo {"description": text, "detail": detail},
  // `underlying` as the underlying error.
  ErrorRef KCCreateUserPresentableError(std::int64_t code, std::int64_t detail,
                                        const ErrorRef& underlying) override;

  // --- Test API ---
  void setCoordinationEnabled(bool enabled);

  // Saved state (the simulator's device directory): whether coordination is enabled, every
  // current coordinator with its promises and placeholder, the next promise identifier, so
  // that promises keep their identifiers, and the finished coordinators' outcomes. Observers and
  // observer registrations are not state.
  plist::Dict saveState() const;
  // Replaces the coordinators with saved ones, which a later client finds by bundle identifier
  // and carries on with; each is then re-examined on the event thread, as after any change.
  // Throws StateFormatError, with nothing replaced.
  void loadState(const StateFields& state);

  // Puts a coordinator as another client would have made it (replacing any for the bundle).
  std::shared_ptr<FakeKCAppInstallCoordinator> putCoordinator(KCCoordinatorKind kind,
                                                              const std::string& bundleID,
                                                              std::uint64_t creatorClient);
  // The service's current coordinator of `bundleID`, or null.
  std::shared_ptr<FakeKCAppInstallCoordinator> coordinator(const std::string& bundleID) const;
  // Every current coordinator, by bundle identifier.
  std::vector<std::shared_ptr<FakeKCAppInstallCoordinator>> coordinators() const;
  // What became of the last coordinator of `bundleID` that completed or was cancelled, recorded
  // as it finished (before its event). A newer coordinator of the bundle leaves the record in
  // place until it finishes itself. At most CoordinatorHistory::kCapacity bundles are kept, the
  // oldest outcome dropped first.
  std::optional<FinishedCoordinator> finishedCoordinator(const std::string& bundleID) const;
  // Every kept outcome, the oldest first.
  std::vector<FinishedCoordinator> finishedCoordinators() const;

  // The store daemon delivers the package of a coordinator whose asset is its business
  // (responsible client KCClientBazaar, or a restoring-demoted coordinator): its asset promise
  // (made if missing) gets the path and is completed. False when there is no such active
  // coordinator.
  bool completeStoreDownload(const std::string& bundleID, const std::string& packagePath);
  // Holds back the placeholder install of `bundleID`, as a service busy with it would: its
  // coordinators keep their placeholder uninstalled (no coordinatorDidInstallPlaceholder, no
  // package install) until releasePlaceholderInstall, which lets them go on as usual and is
  // false when the install was not held. Not saved state: a hold ends with the service.
  void holdPlaceholderInstall(const std::string& bundleID);
  bool releasePlaceholderInstall(const std::string& bundleID);
  // Delivers coordinatorShouldPrioritize; false when no coordinator exists for the bundle.
  bool requestPrioritize(const std::string& bundleID);
  // Delivers promiseDidBeginFulfillmentWithIdentifier to the observers of the coordinator that
  // holds the promise with that identifier (see promiseIdentifier); false when none does.
  bool notifyPromiseDidBeginFulfillment(std::uint64_t promiseIdentifier);
  // The identifier of a promise made by this service, absent for others.
  static std::optional<std::uint64_t> promiseIdentifier(const KCPromise& promise);

  // After this returns, no event for `observer` is running or will be delivered as a
  // coordinator observer (registrations are dropped with their KCAppInstallObserver).
  void removeObserver(const KCAppInstallObserverDelegate* observer) override;

  // Blocks until the event thread has nothing left to do (or is held and idle). Must not be
  // called from a callback.
  void drain();
  // While held, background work and events wait; release() lets them run in order.
  void hold();
  void release();
  bool isHeld() const;

 private:
  friend class FakeKCDaemon;  // counts the calls it makes on the service's behalf
  std::shared_ptr<FakeKCDaemon> daemon_;
};

}  // namespace appsync
