// The fake install-coordination service's face: the calls of its clients and tests, each
// counted and scriptable, handed on to the daemon that does the work.
#include "platform/fake/fake_kc.h"

#include <string_view>
#include <utility>

#include "platform/fake/fake_kc_daemon.h"

namespace appsync {
namespace {

constexpr std::string_view kUninstallOp =
    "uninstallAppWithBundleID:requestUserConfirmation:completion:";
constexpr std::string_view kCoordinatorForAppOp =
    "coordinatorForAppWithBundleID:withClientID:createIfNotExisting:created:error:";
constexpr std::string_view kInitPlaceholderOp =
    "initAppPlaceholderWithBundleName:bundleID:installType:client:";
constexpr std::string_view kInitTransferWithPathOp =
    "KCPromisedTransferToPath initWithName:client:transferPath:diskSpaceNeeded:";
constexpr std::string_view kInitTransferOp =
    "KCPromisedTransferToPath initWithName:client:diskSpaceNeeded:";
constexpr std::string_view kInitOutOfBandOp =
    "KCPromisedOutOfBandTransfer initWithName:client:diskSpaceNeeded:";
constexpr std::string_view kInitObserverOp = "initWithMachServiceName:forClients:delegate:";

}  // namespace

FakeKCInstallCoordination::FakeKCInstallCoordination(FakeARWorkspace& registry)
    : FakeService("FakeKCInstallCoordination", std::string(kKCErrorDomain),
                  {
                      {"coordinationIsEnabled", false},
                      {kUninstallOp, true},
                      {kCoordinatorForAppOp, true},
                      {kInitPlaceholderOp, true},
                      {kInitTransferWithPathOp, true},
                      {kInitTransferOp, true},
                      {kInitOutOfBandOp, true},
                      {kInitObserverOp, true},
                      {"KCCreateUserPresentableError", false},
                      {"setObserver:", false},
                      {"setPlaceholderPromise:error:", true},
                      {"setAppAssetPromise:error:", true},
                      {"appAssetPromiseWithError:", true},
                      {"setUserDataPromise:error:", true},
                      {"setInstallOptions:error:", true},
                      {"setInitialSPRAssetPromises:error:", true},
                      {"setAppAssetPromiseResponsibleClient:error:", true},
                      {"appAssetPromiseResponsibleClientWithError:", true},
                      {"setIconPromise:error:", true},
                      {"setPlaceholderAttributes:error:", true},
                      {"setMetadata:error:", true},
                      {"setSinfData:error:", true},
                      {"setConfigurationCompleteWithError:", true},
                      {"KCAppInstallCoordinator cancelForReason:client:error:", true},
                      {"KCPlaceholder cancelForReason:client:error:", true},
                      {"KCPromise cancelForReason:client:error:", true},
                      {FakeKCDaemon::kInstallPlaceholderOp, true},
                      {FakeKCDaemon::kInstallPackageOp, true},
                  }),
      daemon_(std::make_shared<FakeKCDaemon>(*this, registry)) {}

FakeKCInstallCoordination::~FakeKCInstallCoordination() { daemon_->shutdown(); }

bool FakeKCInstallCoordination::coordinationIsEnabled() {
  beginCall("coordinationIsEnabled");
  return daemon_->enabled();
}

void FakeKCInstallCoordination::uninstallAppWithBundleID(const std::string& bundleID,
                                                         bool requestUserConfirmation,
                                                         std::function<void(ErrorRef)> completion) {
  (void)requestUserConfirmation;  // no user to ask
  ErrorRef failure = beginCall(kUninstallOp);
  FakeKCDaemon* daemon = daemon_.get();
  daemon_->post([daemon, bundleID, failure, completion = std::move(completion)] {
    ErrorRef result = failure ? failure : daemon->uninstall(bundleID);
    if (completion) completion(result);
  });
}

std::shared_ptr<KCAppInstallCoordinator> FakeKCInstallCoordination::coordinatorForAppWithBundleID(
    KCCoordinatorKind kind, const std::string& bundleID, std::uint64_t clientID,
    bool createIfNotExisting, bool* created, ErrorRef* error) {
  if (created) *created = false;
  if (ErrorRef failure = beginCall(kCoordinatorForAppOp)) {
    setError(error, failure);
    return nullptr;
  }
  return daemon_->findOrCreate(kind, bundleID, clientID, createIfNotExisting, created, error);
}

std::shared_ptr<KCPlaceholder> FakeKCInstallCoordination::initAppPlaceholder(
    const std::string& bundleName, const std::string& bundleID, std::uint64_t installType,
    std::uint64_t client) {
  if (beginCall(kInitPlaceholderOp)) return nullptr;
  return std::make_shared<FakeKCPlaceholder>(daemon_->hooks(), bundleName, bundleID, installType,
                                             client);
}

std::shared_ptr<KCPromisedTransferToPath> FakeKCInstallCoordination::initPromisedTransferToPath(
    const std::string& name, std::uint64_t client, const std::optional<std::string>& transferPath,
    std::uint64_t diskSpaceNeeded) {
  if (beginCall(transferPath ? kInitTransferWithPathOp : kInitTransferOp)) return nullptr;
  return std::make_shared<FakeKCPromisedTransferToPath>(daemon_->hooks(), name, client,
                                                        transferPath, diskSpaceNeeded,
                                                        daemon_->nextPromiseIdentifier());
}

std::shared_ptr<KCPromisedOutOfBandTransfer>
FakeKCInstallCoordination::initPromisedOutOfBandTransfer(const std::string& name,
                                                         std::uint64_t client,
                                                         std::uint64_t diskSpaceNeeded) {
  if (beginCall(kInitOutOfBandOp)) return nullptr;
  return std::make_shared<FakeKCPromisedOutOfBandTransfer>(
      daemon_->hooks(), name, client, diskSpaceNeeded, daemon_->nextPromiseIdentifier());
}

std::shared_ptr<KCAppInstallObserver> FakeKCInstallCoordination::initAppInstallObserver(
    const std::string& machServiceName, const std::set<std::uint64_t>& clients,
    KCAppInstallObserverDelegate* delegate) {
  if (beginCall(kInitObserverOp)) return nullptr;
  auto registration = std::make_shared<FakeKCAppInstallObserver>(daemon_->hooks(), machServiceName,
                                                                 clients, delegate);
  daemon_->addRegistration(registration.get());
  return registration;
}

ErrorRef FakeKCInstallCoordination::KCCreateUserPresentableError(std::int64_t code,
                                                                 std::int64_t detail,
                                                                 const ErrorRef& underlying) {
  beginCall("KCCreateUserPresentableError");
  std::string description = "The app could not be installed";
  if (underlying) {
    if (const std::string* text = plist::stringAt(underlying->userInfo, kErrorDescriptionKey)) {
      description += ": " + *text;
    }
  }
  auto error = std::make_shared<Error>();
  error->domain = std::string(kKCErrorDomain);
  error->code = code;
  error->userInfo.set(std::string(kErrorDescriptionKey), description);
  error->userInfo.set(std::string(kKCErrorDetailKey), detail);
  error->underlying = underlying;
  return error;
}

void FakeKCInstallCoordination::setCoordinationEnabled(bool enabled) {
  daemon_->setEnabled(enabled);
}

std::shared_ptr<FakeKCAppInstallCoordinator> FakeKCInstallCoordination::putCoordinator(
    KCCoordinatorKind kind, const std::string& bundleID, std::uint64_t creatorClient) {
  return daemon_->put(kind, bundleID, creatorClient);
}

std::shared_ptr<FakeKCAppInstallCoordinator> FakeKCInstallCoordination::coordinator(
    const std::string& bundleID) const {
  return daemon_->find(bundleID);
}

std::vector<std::shared_ptr<FakeKCAppInstallCoordinator>> FakeKCInstallCoordination::coordinators()
    const {
  return daemon_->all();
}

std::optional<FinishedCoordinator> FakeKCInstallCoordination::finishedCoordinator(
    const std::string& bundleID) const {
  return daemon_->finished(bundleID);
}

std::vector<FinishedCoordinator> FakeKCInstallCoordination::finishedCoordinators() const {
  return daemon_->allFinished();
}

bool FakeKCInstallCoordination::completeStoreDownload(const std::string& bundleID,
                                                      const std::string& packagePath) {
  std::shared_ptr<FakeKCAppInstallCoordinator> c = daemon_->find(bundleID);
  if (!c) return false;
  FakeKCAppInstallCoordinator::Snapshot s = c->snapshot();
  if (s.state != FakeKCAppInstallCoordinator::State::Active) return false;
  if (s.responsibleClient != KCClientBazaar && c->kind() != KCCoordinatorKind::RestoringDemoted) {
    return false;
  }
  std::shared_ptr<KCPromisedTransferToPath> promise = s.appAssetPromise;
  if (!promise) {
    promise = std::make_shared<FakeKCPromisedTransferToPath>(daemon_->hooks(), bundleID + "-Asset",
                                                             KCClientBazaar, std::nullopt, 0,
                                                             daemon_->nextPromiseIdentifier());
    if (!c->adoptAppAssetPromise(promise)) return false;
  }
  promise->setTransferPath(packagePath);
  promise->setPercentComplete(1.0);
  promise->setComplete(true);
  c->reportChange();  // a promise of another maker reports nothing itself
  return true;
}

void FakeKCInstallCoordination::holdPlaceholderInstall(const std::string& bundleID) {
  daemon_->holdPlaceholderInstall(bundleID);
}

bool FakeKCInstallCoordination::releasePlaceholderInstall(const std::string& bundleID) {
  return daemon_->releasePlaceholderInstall(bundleID);
}

bool FakeKCInstallCoordination::requestPrioritize(const std::string& bundleID) {
  std::shared_ptr<FakeKCAppInstallCoordinator> c = daemon_->find(bundleID);
  if (!c) return false;
  FakeKCDaemon* daemon = daemon_.get();
  daemon_->post([daemon, c] {
    daemon->deliver(*c, [&](KCAppInstallObserverDelegate& d) { d.coordinatorShouldPrioritize(c); });
  });
  return true;
}

bool FakeKCInstallCoordination::notifyPromiseDidBeginFulfillment(std::uint64_t identifier) {
  auto holds = [identifier](const std::shared_ptr<KCPromise>& promise) {
    return promise && promiseIdentifier(*promise) == identifier;
  };
  for (const auto& c : daemon_->all()) {
    FakeKCAppInstallCoordinator::Snapshot s = c->snapshot();
    bool found = holds(s.appAssetPromise) || holds(s.userDataPromise);
    for (const auto& promise : s.sprPromises) found = found || holds(promise);
    if (auto* placeholder = dynamic_cast<FakeKCPlaceholder*>(s.placeholder.get())) {
      found = found || holds(placeholder->iconPromise());
    }
    if (!found) continue;
    FakeKCDaemon* daemon = daemon_.get();
    daemon_->post([daemon, c, identifier] {
      daemon->deliver(*c, [&](KCAppInstallObserverDelegate& d) {
        d.promiseDidBeginFulfillmentWithIdentifier(identifier);
      });
    });
    return true;
  }
  return false;
}

std::optional<std::uint64_t> FakeKCInstallCoordination::promiseIdentifier(
    const KCPromise& promise) {
  if (auto* fake = dynamic_cast<const FakeKCPromiseBase*>(&promise)) {
    return fake->uniqueIdentifier();
  }
  return std::nullopt;
}

void FakeKCInstallCoordination::removeObserver(const KCAppInstallObserverDelegate* observer) {
  daemon_->removeObserverEverywhere(observer);
}

void FakeKCInstallCoordination::drain() { daemon_->drain(); }
void FakeKCInstallCoordination::hold() { daemon_->hold(); }
void FakeKCInstallCoordination::release() { daemon_->release(); }

bool FakeKCInstallCoordination::isHeld() const { return daemon_->isHeld(); }

}  // namespace appsync
