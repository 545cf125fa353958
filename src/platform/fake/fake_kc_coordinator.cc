// The fake install-coordination service's coordinator: what its clients set once, its
// cancellation, and the state changes the service makes.
#include "platform/fake/fake_kc_coordinator.h"

#include <optional>
#include <utility>

#include "platform/fake/fake_kc_errors.h"
#include "platform/fake/fake_kc_object_support.h"
#include "platform/fake/fake_kc_placeholder.h"
#include "platform/fake/fake_kc_promise.h"

namespace appsync {

using fake_kc::fail;

namespace {

// The error of a required value that is absent.
ErrorRef missing(const std::string& what) {
  return makeKCError(kKCErrorInvalidArgument, "no " + what);
}

}  // namespace

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

bool FakeKCAppInstallCoordinator::checkSettable(const Snapshot& s, std::string_view operation,
                                                ErrorRef* error) const {
  if (ErrorRef e = fake_kc::scripted(service_, operation)) return fail(error, e);
  if (s.state != State::Active) {
    return fail(error, makeKCError(kKCErrorInvalidState,
                                   "coordinator for " + bundleID_ + " is no longer active"));
  }
  return true;
}

bool FakeKCAppInstallCoordinator::cancelForReason(const ErrorRef& reason, std::uint64_t client,
                                                  ErrorRef* error) {
  if (ErrorRef e =
          fake_kc::scripted(service_, "KCAppInstallCoordinator cancelForReason:client:error:")) {
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
  fake_kc::scripted(service_, "setObserver:");
  KCAppInstallObserverDelegate* previous =
      state_.with([&](Snapshot& s) { return std::exchange(s.observer, observer); });
  if (previous && previous != observer) {
    if (auto s = service_.lock()) s->observerReplaced();
  }
}

// --- What the coordinator holds once -----------------------------------------------------------

template <class V>
bool FakeKCAppInstallCoordinator::setOnce(std::string_view operation, V Snapshot::*slot,
                                          std::type_identity_t<V> value, const ErrorRef& invalid,
                                          std::string_view what, ErrorRef* error,
                                          const std::function<ErrorRef(Snapshot&)>& accept) {
  return state_.with([&](Snapshot& s) {
    if (!checkSettable(s, operation, error)) return false;
    if (invalid) return fail(error, invalid);
    if (s.*slot) {
      return fail(error, makeKCError(kKCErrorAlreadySet, "coordinator for " + bundleID_ +
                                                             " already has " + std::string(what)));
    }
    if (accept) {
      if (ErrorRef refused = accept(s)) return fail(error, refused);
    }
    s.*slot = std::move(value);
    return true;
  });
}

void FakeKCAppInstallCoordinator::attachPromise(const std::shared_ptr<KCPromise>& promise) {
  if (auto* fake = dynamic_cast<FakeKCPromiseBase*>(promise.get())) {
    fake->attachTo(weak_from_this());
  }
}

bool FakeKCAppInstallCoordinator::attachAndReport(
    const std::vector<std::shared_ptr<KCPromise>>& promises) {
  for (const auto& promise : promises) attachPromise(promise);
  reportChange();
  return true;
}

bool FakeKCAppInstallCoordinator::setPlaceholderPromise(
    const std::shared_ptr<KCPlaceholder>& placeholder, ErrorRef* error) {
  auto fake = std::dynamic_pointer_cast<FakeKCPlaceholder>(placeholder);
  auto accept = [&](Snapshot&) -> ErrorRef {
    if (fake->isCancelled()) {
      return makeKCError(kKCErrorInvalidState,
                         "placeholder for " + fake->bundleID() + " is cancelled");
    }
    if (!fake->isConfigurationComplete()) {
      return makeKCError(
          kKCErrorPlaceholderNotConfigured,
          "configuration of placeholder for " + fake->bundleID() + " is not complete");
    }
    if (!fake->handTo(shared_from_this())) {
      return makeKCError(kKCErrorInvalidState,
                         "placeholder for " + fake->bundleID() + " belongs to another coordinator");
    }
    return nullptr;
  };
  ErrorRef invalid = fake ? nullptr : missing("placeholder of this service for " + bundleID_);
  return setOnce("setPlaceholderPromise:error:", &Snapshot::placeholder, placeholder, invalid,
                 "a placeholder promise", error, accept) &&
         attachAndReport({});
}

bool FakeKCAppInstallCoordinator::setAppAssetPromise(
    const std::shared_ptr<KCPromisedTransferToPath>& promise, ErrorRef* error) {
  return setOnce("setAppAssetPromise:error:", &Snapshot::appAssetPromise, promise,
                 promise ? nullptr : missing("app asset promise"), "an app asset promise", error) &&
         attachAndReport({promise});
}

bool FakeKCAppInstallCoordinator::setUserDataPromise(const std::shared_ptr<KCPromise>& promise,
                                                     ErrorRef* error) {
  return setOnce("setUserDataPromise:error:", &Snapshot::userDataPromise, promise,
                 promise ? nullptr : missing("user data promise"), "a user data promise", error) &&
         attachAndReport({promise});
}

bool FakeKCAppInstallCoordinator::setInstallOptions(
    const std::shared_ptr<const EMInstallOptions>& options, ErrorRef* error) {
  return setOnce("setInstallOptions:error:", &Snapshot::installOptions, options,
                 options ? nullptr : missing("install options"), "install options", error);
}

bool FakeKCAppInstallCoordinator::setInitialSPRAssetPromises(
    const std::vector<std::shared_ptr<KCPromise>>& promises, ErrorRef* error) {
  auto storePromises = [&](Snapshot& s) {
    s.sprPromises = promises;
    return ErrorRef();
  };
  return setOnce("setInitialSPRAssetPromises:error:", &Snapshot::hasSPRPromises, true, nullptr,
                 "SPR asset promises", error, storePromises) &&
         attachAndReport(promises);
}

bool FakeKCAppInstallCoordinator::setAppAssetPromiseResponsibleClient(std::uint64_t client,
                                                                      ErrorRef* error) {
  return state_.with([&](Snapshot& s) {
    if (!checkSettable(s, "setAppAssetPromiseResponsibleClient:error:", error)) return false;
    s.responsibleClient = client;
    return true;
  });
}

// --- Reading -----------------------------------------------------------------------------------

std::shared_ptr<KCPromisedTransferToPath> FakeKCAppInstallCoordinator::appAssetPromiseWithError(
    ErrorRef* error) {
  if (ErrorRef e = fake_kc::scripted(service_, "appAssetPromiseWithError:")) {
    setError(error, e);
    return nullptr;
  }
  return snapshot().appAssetPromise;
}

std::uint64_t FakeKCAppInstallCoordinator::appAssetPromiseResponsibleClientWithError(
    ErrorRef* error) {
  if (ErrorRef e = fake_kc::scripted(service_, "appAssetPromiseResponsibleClientWithError:")) {
    setError(error, e);
    return 0;
  }
  return snapshot().responsibleClient;
}

std::string FakeKCAppInstallCoordinator::describe() const {
  return "<" + std::string(coordinatorClassName(kind_)) +
         " bundleID=" + fake_kc::oneLine(bundleID_) + " creator=" + std::to_string(creator_) + ">";
}

// --- Service side ------------------------------------------------------------------------------

bool FakeKCAppInstallCoordinator::markPlaceholderInstalled() {
  return state_.with([](Snapshot& s) {
    if (s.state != State::Active) return false;
    s.placeholderInstalled = true;
    return true;
  });
}

bool FakeKCAppInstallCoordinator::finish(const ErrorRef& error) {
  return state_.with([&](Snapshot& s) {
    if (s.state != State::Active) return false;
    s.state = State::Completed;
    s.error = error;
    return true;
  });
}

bool FakeKCAppInstallCoordinator::markCancelled(const ErrorRef& reason) {
  std::optional<Snapshot> cancelled = state_.with([&](Snapshot& s) -> std::optional<Snapshot> {
    if (s.state != State::Active) return std::nullopt;
    s.state = State::Cancelled;
    s.error = reason;
    return s;
  });
  if (!cancelled) return false;
  std::vector<std::shared_ptr<KCPromise>> promises = cancelled->sprPromises;
  promises.push_back(cancelled->appAssetPromise);
  promises.push_back(cancelled->userDataPromise);
  for (const auto& promise : promises) {
    if (auto* fake = dynamic_cast<FakeKCPromiseBase*>(promise.get())) fake->cancelByService(reason);
  }
  if (auto* fake = dynamic_cast<FakeKCPlaceholder*>(cancelled->placeholder.get())) {
    fake->cancelByService(reason);
  }
  return true;
}

bool FakeKCAppInstallCoordinator::adoptAppAssetPromise(
    const std::shared_ptr<KCPromisedTransferToPath>& promise) {
  bool adopted = state_.with([&](Snapshot& s) {
    if (s.state != State::Active || s.appAssetPromise) return false;
    s.appAssetPromise = promise;
    return true;
  });
  if (adopted) attachPromise(promise);
  return adopted;
}

bool FakeKCAppInstallCoordinator::forgetObserver(const KCAppInstallObserverDelegate* observer) {
  return state_.with([&](Snapshot& s) {
    if (s.observer != observer) return false;
    s.observer = nullptr;
    return true;
  });
}

void FakeKCAppInstallCoordinator::restore(Snapshot saved, bool placedPlaceholderRecord) {
  saved.observer = nullptr;
  state_.set(saved);
  placedPlaceholderRecord_.set(placedPlaceholderRecord);
  for (const auto& promise : saved.sprPromises) attachPromise(promise);
  attachPromise(saved.appAssetPromise);
  attachPromise(saved.userDataPromise);
  if (auto* placeholder = dynamic_cast<FakeKCPlaceholder*>(saved.placeholder.get())) {
    placeholder->handTo(shared_from_this());
  }
}

void FakeKCAppInstallCoordinator::reportChange() {
  if (auto s = service_.lock()) s->coordinatorChanged(shared_from_this());
}

}  // namespace appsync
