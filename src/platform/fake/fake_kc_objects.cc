// The fake install-coordination service's promises, placeholders, coordinators and observer
// registrations.
#include "platform/fake/fake_kc_objects.h"

#include <algorithm>
#include <cstdio>
#include <utility>

#include "platform/fake/fake_kc_errors.h"

namespace appsync {
namespace {

// Descriptions are single-line whatever names and paths contain.
std::string oneLine(std::string_view text) {
  std::string out;
  out.reserve(text.size());
  for (char c : text) {
    if (c == '\n') {
      out += "\\n";
    } else if (c == '\r') {
      out += "\\r";
    } else {
      out += c;
    }
  }
  return out;
}

const char* yesNo(bool b) { return b ? "YES" : "NO"; }

ErrorRef scripted(const std::weak_ptr<FakeKCServiceHooks>& service, std::string_view operation) {
  if (auto s = service.lock()) return s->scriptedFailure(operation);
  return nullptr;
}

bool fail(ErrorRef* out, ErrorRef error) {
  setError(out, std::move(error));
  return false;
}

}  // namespace

// --- Promises ----------------------------------------------------------------------------------

FakeKCPromiseBase::FakeKCPromiseBase(std::weak_ptr<FakeKCServiceHooks> service,
                                     std::string_view className, bool hasPath, std::string name,
                                     std::uint64_t client, std::optional<std::string> transferPath,
                                     std::uint64_t diskSpaceNeeded, std::uint64_t identifier)
    : name_(std::move(name)),
      client_(client),
      diskSpaceNeeded_(diskSpaceNeeded),
      service_(std::move(service)),
      className_(className),
      hasPath_(hasPath),
      identifier_(identifier),
      transferPath_(std::move(transferPath)) {}

ErrorRef FakeKCPromiseBase::cancelReason() const {
  std::lock_guard lock(mutex_);
  return cancelReason_;
}

bool FakeKCPromiseBase::isFulfilled() const {
  std::lock_guard lock(mutex_);
  return complete_ && !cancelled_;
}

void FakeKCPromiseBase::attachTo(std::weak_ptr<FakeKCAppInstallCoordinator> coordinator) {
  std::lock_guard lock(mutex_);
  owner_ = std::move(coordinator);
}

void FakeKCPromiseBase::cancelByService(const ErrorRef& reason) {
  std::lock_guard lock(mutex_);
  if (cancelled_) return;
  cancelled_ = true;
  cancelReason_ = reason;
}

double FakeKCPromiseBase::percent() const {
  std::lock_guard lock(mutex_);
  return percent_;
}

void FakeKCPromiseBase::setPercent(double fraction) {
  std::lock_guard lock(mutex_);
  percent_ = std::clamp(fraction, 0.0, 1.0);
}

bool FakeKCPromiseBase::complete() const {
  std::lock_guard lock(mutex_);
  return complete_;
}

void FakeKCPromiseBase::setCompleteFlag(bool complete) {
  std::weak_ptr<FakeKCAppInstallCoordinator> owner;
  {
    std::lock_guard lock(mutex_);
    if (cancelled_ || complete_ == complete) return;
    complete_ = complete;
    owner = owner_;
  }
  if (complete) reportChange(owner);
}

bool FakeKCPromiseBase::cancelled() const {
  std::lock_guard lock(mutex_);
  return cancelled_;
}

bool FakeKCPromiseBase::cancel(const ErrorRef& reason, ErrorRef* error) {
  if (ErrorRef e = scripted(service_, "KCPromise cancelForReason:client:error:")) {
    return fail(error, e);
  }
  std::lock_guard lock(mutex_);
  if (cancelled_) {
    return fail(error,
                makeKCError(kKCErrorInvalidState, "promise " + name_ + " is already cancelled"));
  }
  cancelled_ = true;
  cancelReason_ = reason;
  return true;
}

std::optional<std::string> FakeKCPromiseBase::path() const {
  std::lock_guard lock(mutex_);
  return transferPath_;
}

void FakeKCPromiseBase::setPath(std::string path) {
  std::weak_ptr<FakeKCAppInstallCoordinator> owner;
  bool wasComplete;
  {
    std::lock_guard lock(mutex_);
    transferPath_ = std::move(path);
    owner = owner_;
    wasComplete = complete_;
  }
  // A promise completed before its path was known becomes installable now.
  if (wasComplete) reportChange(owner);
}

void FakeKCPromiseBase::reportChange(const std::weak_ptr<FakeKCAppInstallCoordinator>& owner) {
  if (auto coordinator = owner.lock()) coordinator->reportChange();
}

std::string FakeKCPromiseBase::describeState() const {
  std::lock_guard lock(mutex_);
  char percent[32];
  std::snprintf(percent, sizeof percent, "%g", percent_);
  std::string text =
      "<" + className_ + " name=" + oneLine(name_) + " client=" + std::to_string(client_) +
      " diskSpaceNeeded=" + std::to_string(diskSpaceNeeded_) + " percentComplete=" + percent +
      " complete=" + yesNo(complete_) + " cancelled=" + yesNo(cancelled_);
  if (hasPath_) text += " transferPath=" + (transferPath_ ? oneLine(*transferPath_) : "(null)");
  return text + ">";
}

FakeKCPromisedTransferToPath::FakeKCPromisedTransferToPath(
    std::weak_ptr<FakeKCServiceHooks> service, std::string name, std::uint64_t client,
    std::optional<std::string> transferPath, std::uint64_t diskSpaceNeeded,
    std::uint64_t identifier)
    : FakeKCPromiseImpl(std::move(service), "KCPromisedTransferToPath", true, std::move(name),
                        client, std::move(transferPath), diskSpaceNeeded, identifier) {}

FakeKCPromisedOutOfBandTransfer::FakeKCPromisedOutOfBandTransfer(
    std::weak_ptr<FakeKCServiceHooks> service, std::string name, std::uint64_t client,
    std::uint64_t diskSpaceNeeded, std::uint64_t identifier)
    : FakeKCPromiseImpl(std::move(service), "KCPromisedOutOfBandTransfer", false, std::move(name),
                        client, std::nullopt, diskSpaceNeeded, identifier) {}

// --- Placeholder -------------------------------------------------------------------------------

FakeKCPlaceholder::FakeKCPlaceholder(std::weak_ptr<FakeKCServiceHooks> service,
                                     std::string bundleName, std::string bundleID,
                                     std::uint64_t installType, std::uint64_t client)
    : service_(std::move(service)),
      bundleName_(std::move(bundleName)),
      bundleID_(std::move(bundleID)),
      installType_(installType),
      client_(client) {}

bool FakeKCPlaceholder::checkSettable(std::string_view operation, ErrorRef* error) const {
  if (ErrorRef e = scripted(service_, operation)) return fail(error, e);
  if (cancelled_) {
    return fail(
        error, makeKCError(kKCErrorInvalidState, "placeholder for " + bundleID_ + " is cancelled"));
  }
  if (configurationComplete_) {
    return fail(error, makeKCError(kKCErrorInvalidState, "configuration of placeholder for " +
                                                             bundleID_ + " is already complete"));
  }
  return true;
}

bool FakeKCPlaceholder::setIconPromise(const std::shared_ptr<KCPromisedTransferToPath>& promise,
                                       ErrorRef* error) {
  std::lock_guard lock(mutex_);
  if (!checkSettable("setIconPromise:error:", error)) return false;
  if (!promise) return fail(error, makeKCError(kKCErrorInvalidArgument, "no icon promise"));
  if (iconPromise_) {
    return fail(error, makeKCError(kKCErrorAlreadySet, "placeholder for " + bundleID_ +
                                                           " already has an icon promise"));
  }
  iconPromise_ = promise;
  return true;
}

bool FakeKCPlaceholder::setPlaceholderAttributes(const KCPlaceholderAttributes& attributes,
                                                 ErrorRef* error) {
  std::lock_guard lock(mutex_);
  if (!checkSettable("setPlaceholderAttributes:error:", error)) return false;
  attributes_ = attributes;
  return true;
}

bool FakeKCPlaceholder::setMetadata(const std::shared_ptr<const EMStoreMetadata>& metadata,
                                    ErrorRef* error) {
  std::lock_guard lock(mutex_);
  if (!checkSettable("setMetadata:error:", error)) return false;
  metadata_ = metadata;
  return true;
}

bool FakeKCPlaceholder::setSinfData(const plist::Bytes& sinf, ErrorRef* error) {
  std::lock_guard lock(mutex_);
  if (!checkSettable("setSinfData:error:", error)) return false;
  sinf_ = sinf;
  return true;
}

bool FakeKCPlaceholder::setConfigurationCompleteWithError(ErrorRef* error) {
  std::lock_guard lock(mutex_);
  if (!checkSettable("setConfigurationCompleteWithError:", error)) return false;
  configurationComplete_ = true;
  return true;
}

bool FakeKCPlaceholder::cancelForReason(const ErrorRef& reason, std::uint64_t client,
                                        ErrorRef* error) {
  (void)client;
  if (ErrorRef e = scripted(service_, "KCPlaceholder cancelForReason:client:error:")) {
    return fail(error, e);
  }
  std::shared_ptr<KCPromisedTransferToPath> icon;
  {
    std::lock_guard lock(mutex_);
    if (cancelled_) {
      return fail(error, makeKCError(kKCErrorInvalidState,
                                     "placeholder for " + bundleID_ + " is already cancelled"));
    }
    cancelled_ = true;
    cancelReason_ = reason;
    icon = iconPromise_;
  }
  if (auto* fake = dynamic_cast<FakeKCPromiseBase*>(icon.get())) fake->cancelByService(reason);
  return true;
}

void FakeKCPlaceholder::cancelByService(const ErrorRef& reason) {
  std::shared_ptr<KCPromisedTransferToPath> icon;
  {
    std::lock_guard lock(mutex_);
    if (cancelled_) return;
    cancelled_ = true;
    cancelReason_ = reason;
    icon = iconPromise_;
  }
  if (auto* fake = dynamic_cast<FakeKCPromiseBase*>(icon.get())) fake->cancelByService(reason);
}

std::string FakeKCPlaceholder::describe() const {
  return "<KCPlaceholder bundleID=" + oneLine(bundleID_) + " name=\"" + oneLine(bundleName_) +
         "\" installType=" + std::to_string(installType_) + " client=" + std::to_string(client_) +
         ">";
}

std::shared_ptr<KCPromisedTransferToPath> FakeKCPlaceholder::iconPromise() const {
  std::lock_guard lock(mutex_);
  return iconPromise_;
}

std::optional<KCPlaceholderAttributes> FakeKCPlaceholder::attributes() const {
  std::lock_guard lock(mutex_);
  return attributes_;
}

std::shared_ptr<const EMStoreMetadata> FakeKCPlaceholder::metadata() const {
  std::lock_guard lock(mutex_);
  return metadata_;
}

std::optional<plist::Bytes> FakeKCPlaceholder::sinfData() const {
  std::lock_guard lock(mutex_);
  return sinf_;
}

bool FakeKCPlaceholder::isConfigurationComplete() const {
  std::lock_guard lock(mutex_);
  return configurationComplete_;
}

bool FakeKCPlaceholder::isCancelled() const {
  std::lock_guard lock(mutex_);
  return cancelled_;
}

ErrorRef FakeKCPlaceholder::cancelReason() const {
  std::lock_guard lock(mutex_);
  return cancelReason_;
}

bool FakeKCPlaceholder::isReadyToInstall() const {
  std::shared_ptr<KCPromisedTransferToPath> icon;
  {
    std::lock_guard lock(mutex_);
    if (!configurationComplete_ || cancelled_) return false;
    icon = iconPromise_;
  }
  return !icon || (icon->isComplete() && !icon->isCancelled());
}

bool FakeKCPlaceholder::handTo(const std::shared_ptr<FakeKCAppInstallCoordinator>& coordinator) {
  std::shared_ptr<KCPromisedTransferToPath> icon;
  {
    std::lock_guard lock(mutex_);
    if (handedOver_) return false;
    handedOver_ = true;
    icon = iconPromise_;
  }
  if (auto* fake = dynamic_cast<FakeKCPromiseBase*>(icon.get())) fake->attachTo(coordinator);
  return true;
}

// --- Coordinator -------------------------------------------------------------------------------

std::string_view coordinatorClassName(KCCoordinatorKind kind) {
  switch (kind) {
    case KCCoordinatorKind::Any:
      return "KCAppInstallCoordinator";
    case KCCoordinatorKind::Initiating:
      return "KCInitiatingAppInstallCoordinator";
    case KCCoordinatorKind::Updating:
      return "KCUpdatingAppInstallCoordinator";
    case KCCoordinatorKind::Restoring:
      return "KCRestoringAppInstallCoordinator";
    case KCCoordinatorKind::RestoringDemoted:
      return "KCRestoringDemotedAppInstallCoordinator";
  }
  return "KCAppInstallCoordinator";
}

FakeKCAppInstallCoordinator::FakeKCAppInstallCoordinator(std::weak_ptr<FakeKCServiceHooks> service,
                                                         KCCoordinatorKind kind,
                                                         std::string bundleID,
                                                         std::uint64_t creator)
    : service_(std::move(service)),
      kind_(kind),
      bundleID_(std::move(bundleID)),
      creator_(creator) {}

ErrorRef FakeKCAppInstallCoordinator::error() const {
  std::lock_guard lock(mutex_);
  return s_.error;
}

bool FakeKCAppInstallCoordinator::checkSettable(std::string_view operation, ErrorRef* error) const {
  if (ErrorRef e = scripted(service_, operation)) return fail(error, e);
  if (s_.state != State::Active) {
    return fail(error, makeKCError(kKCErrorInvalidState,
                                   "coordinator for " + bundleID_ + " is no longer active"));
  }
  return true;
}

bool FakeKCAppInstallCoordinator::cancelForReason(const ErrorRef& reason, std::uint64_t client,
                                                  ErrorRef* error) {
  if (ErrorRef e = scripted(service_, "KCAppInstallCoordinator cancelForReason:client:error:")) {
    return fail(error, e);
  }
  ErrorRef effective =
      reason ? reason
             : makeKCError(kKCErrorCanceled, "coordinator for " + bundleID_ + " cancelled");
  if (!markCancelled(effective)) {
    return fail(error, makeKCError(kKCErrorInvalidState,
                                   "coordinator for " + bundleID_ + " is no longer active"));
  }
  if (auto s = service_.lock()) s->coordinatorCancelled(shared_from_this(), effective, client);
  return true;
}

void FakeKCAppInstallCoordinator::setObserver(KCAppInstallObserverDelegate* observer) {
  scripted(service_, "setObserver:");
  KCAppInstallObserverDelegate* previous;
  {
    std::lock_guard lock(mutex_);
    previous = s_.observer;
    s_.observer = observer;
  }
  if (previous && previous != observer) {
    if (auto s = service_.lock()) s->observerReplaced();
  }
}

bool FakeKCAppInstallCoordinator::setPlaceholderPromise(
    const std::shared_ptr<KCPlaceholder>& placeholder, ErrorRef* error) {
  auto fake = std::dynamic_pointer_cast<FakeKCPlaceholder>(placeholder);
  {
    std::lock_guard lock(mutex_);
    if (!checkSettable("setPlaceholderPromise:error:", error)) return false;
    if (!fake) {
      return fail(error, makeKCError(kKCErrorInvalidArgument,
                                     "no placeholder of this service for " + bundleID_));
    }
    if (s_.placeholder) {
      return fail(error, makeKCError(kKCErrorAlreadySet, "coordinator for " + bundleID_ +
                                                             " already has a placeholder promise"));
    }
    if (fake->isCancelled()) {
      return fail(error, makeKCError(kKCErrorInvalidState,
                                     "placeholder for " + fake->bundleID() + " is cancelled"));
    }
    if (!fake->isConfigurationComplete()) {
      return fail(error, makeKCError(kKCErrorPlaceholderNotConfigured,
                                     "configuration of placeholder for " + fake->bundleID() +
                                         " is not complete"));
    }
    if (!fake->handTo(shared_from_this())) {
      return fail(error, makeKCError(kKCErrorInvalidState, "placeholder for " + fake->bundleID() +
                                                               " belongs to another coordinator"));
    }
    s_.placeholder = placeholder;
  }
  reportChange();
  return true;
}

bool FakeKCAppInstallCoordinator::hasPlaceholderPromise() const {
  std::lock_guard lock(mutex_);
  return s_.placeholder != nullptr;
}

void FakeKCAppInstallCoordinator::attachPromise(const std::shared_ptr<KCPromise>& promise) {
  if (auto* fake = dynamic_cast<FakeKCPromiseBase*>(promise.get())) {
    fake->attachTo(weak_from_this());
  }
}

bool FakeKCAppInstallCoordinator::setAppAssetPromise(
    const std::shared_ptr<KCPromisedTransferToPath>& promise, ErrorRef* error) {
  {
    std::lock_guard lock(mutex_);
    if (!checkSettable("setAppAssetPromise:error:", error)) return false;
    if (!promise) return fail(error, makeKCError(kKCErrorInvalidArgument, "no app asset promise"));
    if (s_.appAssetPromise) {
      return fail(error, makeKCError(kKCErrorAlreadySet, "coordinator for " + bundleID_ +
                                                             " already has an app asset promise"));
    }
    s_.appAssetPromise = promise;
  }
  attachPromise(promise);
  reportChange();
  return true;
}

std::shared_ptr<KCPromisedTransferToPath> FakeKCAppInstallCoordinator::appAssetPromiseWithError(
    ErrorRef* error) {
  if (ErrorRef e = scripted(service_, "appAssetPromiseWithError:")) {
    setError(error, e);
    return nullptr;
  }
  std::lock_guard lock(mutex_);
  return s_.appAssetPromise;
}

bool FakeKCAppInstallCoordinator::hasAppAssetPromise() const {
  std::lock_guard lock(mutex_);
  return s_.appAssetPromise != nullptr;
}

bool FakeKCAppInstallCoordinator::setUserDataPromise(const std::shared_ptr<KCPromise>& promise,
                                                     ErrorRef* error) {
  {
    std::lock_guard lock(mutex_);
    if (!checkSettable("setUserDataPromise:error:", error)) return false;
    if (!promise) return fail(error, makeKCError(kKCErrorInvalidArgument, "no user data promise"));
    if (s_.userDataPromise) {
      return fail(error, makeKCError(kKCErrorAlreadySet, "coordinator for " + bundleID_ +
                                                             " already has a user data promise"));
    }
    s_.userDataPromise = promise;
  }
  attachPromise(promise);
  reportChange();
  return true;
}

bool FakeKCAppInstallCoordinator::hasUserDataPromise() const {
  std::lock_guard lock(mutex_);
  return s_.userDataPromise != nullptr;
}

bool FakeKCAppInstallCoordinator::setInstallOptions(
    const std::shared_ptr<const EMInstallOptions>& options, ErrorRef* error) {
  std::lock_guard lock(mutex_);
  if (!checkSettable("setInstallOptions:error:", error)) return false;
  if (!options) return fail(error, makeKCError(kKCErrorInvalidArgument, "no install options"));
  if (s_.installOptions) {
    return fail(error, makeKCError(kKCErrorAlreadySet, "coordinator for " + bundleID_ +
                                                           " already has install options"));
  }
  s_.installOptions = options;
  return true;
}

bool FakeKCAppInstallCoordinator::hasInstallOptions() const {
  std::lock_guard lock(mutex_);
  return s_.installOptions != nullptr;
}

bool FakeKCAppInstallCoordinator::setInitialSPRAssetPromises(
    const std::vector<std::shared_ptr<KCPromise>>& promises, ErrorRef* error) {
  {
    std::lock_guard lock(mutex_);
    if (!checkSettable("setInitialSPRAssetPromises:error:", error)) return false;
    if (s_.hasSPRPromises) {
      return fail(error, makeKCError(kKCErrorAlreadySet, "coordinator for " + bundleID_ +
                                                             " already has SPR asset promises"));
    }
    s_.hasSPRPromises = true;
    s_.sprPromises = promises;
  }
  for (const auto& promise : promises) attachPromise(promise);
  reportChange();
  return true;
}

bool FakeKCAppInstallCoordinator::hasInitialSPRAssetPromises() const {
  std::lock_guard lock(mutex_);
  return s_.hasSPRPromises;
}

bool FakeKCAppInstallCoordinator::setAppAssetPromiseResponsibleClient(std::uint64_t client,
                                                                      ErrorRef* error) {
  std::lock_guard lock(mutex_);
  if (!checkSettable("setAppAssetPromiseResponsibleClient:error:", error)) return false;
  s_.responsibleClient = client;
  return true;
}

std::uint64_t FakeKCAppInstallCoordinator::appAssetPromiseResponsibleClientWithError(
    ErrorRef* error) {
  if (ErrorRef e = scripted(service_, "appAssetPromiseResponsibleClientWithError:")) {
    setError(error, e);
    return 0;
  }
  std::lock_guard lock(mutex_);
  return s_.responsibleClient;
}

std::string FakeKCAppInstallCoordinator::describe() const {
  return "<" + std::string(coordinatorClassName(kind_)) + " bundleID=" + oneLine(bundleID_) +
         " creator=" + std::to_string(creator_) + ">";
}

FakeKCAppInstallCoordinator::Snapshot FakeKCAppInstallCoordinator::snapshot() const {
  std::lock_guard lock(mutex_);
  return s_;
}

FakeKCAppInstallCoordinator::State FakeKCAppInstallCoordinator::state() const {
  std::lock_guard lock(mutex_);
  return s_.state;
}

KCAppInstallObserverDelegate* FakeKCAppInstallCoordinator::observer() const {
  std::lock_guard lock(mutex_);
  return s_.observer;
}

void FakeKCAppInstallCoordinator::notePlaceholderRecord() {
  std::lock_guard lock(mutex_);
  placedPlaceholderRecord_ = true;
}

bool FakeKCAppInstallCoordinator::placedPlaceholderRecord() const {
  std::lock_guard lock(mutex_);
  return placedPlaceholderRecord_;
}

bool FakeKCAppInstallCoordinator::markPlaceholderInstalled() {
  std::lock_guard lock(mutex_);
  if (s_.state != State::Active) return false;
  s_.placeholderInstalled = true;
  return true;
}

bool FakeKCAppInstallCoordinator::finish(const ErrorRef& error) {
  std::lock_guard lock(mutex_);
  if (s_.state != State::Active) return false;
  s_.state = State::Completed;
  s_.error = error;
  return true;
}

bool FakeKCAppInstallCoordinator::markCancelled(const ErrorRef& reason) {
  Snapshot s;
  {
    std::lock_guard lock(mutex_);
    if (s_.state != State::Active) return false;
    s_.state = State::Cancelled;
    s_.error = reason;
    s = s_;
  }
  std::vector<std::shared_ptr<KCPromise>> promises = s.sprPromises;
  promises.push_back(s.appAssetPromise);
  promises.push_back(s.userDataPromise);
  for (const auto& promise : promises) {
    if (auto* fake = dynamic_cast<FakeKCPromiseBase*>(promise.get())) fake->cancelByService(reason);
  }
  if (auto* fake = dynamic_cast<FakeKCPlaceholder*>(s.placeholder.get())) {
    fake->cancelByService(reason);
  }
  return true;
}

bool FakeKCAppInstallCoordinator::adoptAppAssetPromise(
    const std::shared_ptr<KCPromisedTransferToPath>& promise) {
  {
    std::lock_guard lock(mutex_);
    if (s_.state != State::Active || s_.appAssetPromise) return false;
    s_.appAssetPromise = promise;
  }
  attachPromise(promise);
  return true;
}

bool FakeKCAppInstallCoordinator::forgetObserver(const KCAppInstallObserverDelegate* observer) {
  std::lock_guard lock(mutex_);
  if (s_.observer != observer) return false;
  s_.observer = nullptr;
  return true;
}

void FakeKCAppInstallCoordinator::reportChange() {
  if (auto s = service_.lock()) s->coordinatorChanged(shared_from_this());
}

// --- Observer registration ---------------------------------------------------------------------

FakeKCAppInstallObserver::FakeKCAppInstallObserver(std::weak_ptr<FakeKCServiceHooks> service,
                                                   std::string machServiceName,
                                                   std::set<std::uint64_t> clients,
                                                   KCAppInstallObserverDelegate* delegate)
    : service_(std::move(service)),
      machServiceName_(std::move(machServiceName)),
      clients_(std::move(clients)),
      delegate_(delegate) {}

FakeKCAppInstallObserver::~FakeKCAppInstallObserver() {
  if (auto s = service_.lock()) s->registrationGone(this);
}

std::string FakeKCAppInstallObserver::describe() const {
  std::string clients;
  for (std::uint64_t c : clients_) clients += (clients.empty() ? "" : ",") + std::to_string(c);
  return "<KCAppInstallObserver machServiceName=" + oneLine(machServiceName_) + " clients={" +
         clients + "}>";
}

}  // namespace appsync
