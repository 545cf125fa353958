// The fake install-coordination service's placeholder: its configuration, cancellation and
// hand-over to a coordinator.
#include "platform/fake/fake_kc_placeholder.h"

#include <utility>

#include "platform/fake/fake_kc_errors.h"
#include "platform/fake/fake_kc_object_support.h"
#include "platform/fake/fake_kc_promise.h"

namespace appsync {

using fake_kc::fail;

FakeKCPlaceholder::FakeKCPlaceholder(std::weak_ptr<FakeKCServiceHooks> service,
                                     std::string bundleName, std::string bundleID,
                                     std::uint64_t installType, std::uint64_t client)
    : service_(std::move(service)),
      bundleName_(std::move(bundleName)),
      bundleID_(std::move(bundleID)),
      installType_(installType),
      client_(client) {}

bool FakeKCPlaceholder::checkSettable(const State& s, std::string_view operation,
                                      ErrorRef* error) const {
  if (ErrorRef e = fake_kc::scripted(service_, operation)) return fail(error, e);
  if (s.cancelled) {
    return fail(
        error, makeKCError(kKCErrorInvalidState, "placeholder for " + bundleID_ + " is cancelled"));
  }
  if (s.configurationComplete) {
    return fail(error, makeKCError(kKCErrorInvalidState, "configuration of placeholder for " +
                                                             bundleID_ + " is already complete"));
  }
  return true;
}

bool FakeKCPlaceholder::configure(std::string_view operation, ErrorRef* error,
                                  const std::function<void(State&)>& change) {
  return state_.with([&](State& s) {
    if (!checkSettable(s, operation, error)) return false;
    change(s);
    return true;
  });
}

bool FakeKCPlaceholder::setIconPromise(const std::shared_ptr<KCPromisedTransferToPath>& promise,
                                       ErrorRef* error) {
  return state_.with([&](State& s) {
    if (!checkSettable(s, "setIconPromise:error:", error)) return false;
    if (!promise) return fail(error, makeKCError(kKCErrorInvalidArgument, "no icon promise"));
    if (s.iconPromise) {
      return fail(error, makeKCError(kKCErrorAlreadySet, "placeholder for " + bundleID_ +
                                                             " already has an icon promise"));
    }
    s.iconPromise = promise;
    return true;
  });
}

bool FakeKCPlaceholder::setPlaceholderAttributes(const KCPlaceholderAttributes& attributes,
                                                 ErrorRef* error) {
  return configure("setPlaceholderAttributes:error:", error,
                   [&](State& s) { s.attributes = attributes; });
}

bool FakeKCPlaceholder::setMetadata(const std::shared_ptr<const EMStoreMetadata>& metadata,
                                    ErrorRef* error) {
  return configure("setMetadata:error:", error, [&](State& s) { s.metadata = metadata; });
}

bool FakeKCPlaceholder::setSinfData(const plist::Bytes& sinf, ErrorRef* error) {
  return configure("setSinfData:error:", error, [&](State& s) { s.sinf = sinf; });
}

bool FakeKCPlaceholder::setConfigurationCompleteWithError(ErrorRef* error) {
  return configure("setConfigurationCompleteWithError:", error,
                   [](State& s) { s.configurationComplete = true; });
}

bool FakeKCPlaceholder::cancelOnce(const ErrorRef& reason) {
  std::shared_ptr<KCPromisedTransferToPath> icon;
  bool cancelled = state_.with([&](State& s) {
    if (s.cancelled) return false;
    s.cancelled = true;
    s.cancelReason = reason;
    icon = s.iconPromise;
    return true;
  });
  if (auto* fake = dynamic_cast<FakeKCPromiseBase*>(icon.get())) fake->cancelByService(reason);
  return cancelled;
}

void FakeKCPlaceholder::cancelByService(const ErrorRef& reason) { cancelOnce(reason); }

void FakeKCPlaceholder::restoreConfiguration(std::shared_ptr<KCPromisedTransferToPath> iconPromise,
                                             std::optional<KCPlaceholderAttributes> attributes,
                                             std::shared_ptr<const EMStoreMetadata> metadata,
                                             std::optional<plist::Bytes> sinf,
                                             bool configurationComplete) {
  state_.with([&](State& s) {
    s.iconPromise = std::move(iconPromise);
    s.attributes = std::move(attributes);
    s.metadata = std::move(metadata);
    s.sinf = std::move(sinf);
    s.configurationComplete = configurationComplete;
  });
}

bool FakeKCPlaceholder::cancelForReason(const ErrorRef& reason, std::uint64_t client,
                                        ErrorRef* error) {
  (void)client;
  if (ErrorRef e = fake_kc::scripted(service_, "KCPlaceholder cancelForReason:client:error:")) {
    return fail(error, e);
  }
  if (cancelOnce(reason)) return true;
  return fail(error, makeKCError(kKCErrorInvalidState,
                                 "placeholder for " + bundleID_ + " is already cancelled"));
}

std::string FakeKCPlaceholder::describe() const {
  using fake_kc::oneLine;
  return "<KCPlaceholder bundleID=" + oneLine(bundleID_) + " name=\"" + oneLine(bundleName_) +
         "\" installType=" + std::to_string(installType_) + " client=" + std::to_string(client_) +
         ">";
}

bool FakeKCPlaceholder::isReadyToInstall() const {
  State s = state_.get();
  if (!s.configurationComplete || s.cancelled) return false;
  return !s.iconPromise || (s.iconPromise->isComplete() && !s.iconPromise->isCancelled());
}

bool FakeKCPlaceholder::handTo(const std::shared_ptr<FakeKCAppInstallCoordinator>& coordinator) {
  std::shared_ptr<KCPromisedTransferToPath> icon;
  bool handed = state_.with([&](State& s) {
    if (s.handedOver) return false;
    s.handedOver = true;
    icon = s.iconPromise;
    return true;
  });
  if (!handed) return false;
  if (auto* fake = dynamic_cast<FakeKCPromiseBase*>(icon.get())) fake->attachTo(coordinator);
  return true;
}

}  // namespace appsync
