// The placeholder of the fake install-coordination service: configured by its client, then
// handed to one coordinator, which installs it once its icon promise (if any) is fulfilled.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "runtime/error.h"
#include "runtime/guarded.h"
#include "runtime/plist/value.h"
#include "platform/em.h"
#include "platform/fake/fake_kc_service_hooks.h"
#include "platform/kc.h"

namespace appsync {

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
  std::shared_ptr<KCPromisedTransferToPath> iconPromise() const { return state_.get().iconPromise; }
  std::optional<KCPlaceholderAttributes> attributes() const { return state_.get().attributes; }
  std::shared_ptr<const EMStoreMetadata> metadata() const { return state_.get().metadata; }
  std::optional<plist::Bytes> sinfData() const { return state_.get().sinf; }
  bool isConfigurationComplete() const { return state_.get().configurationComplete; }
  bool isCancelled() const { return state_.get().cancelled; }
  ErrorRef cancelReason() const { return state_.get().cancelReason; }

  // Configured, not cancelled, and its icon promise (if any) fulfilled.
  bool isReadyToInstall() const;
  // Hands the placeholder to `coordinator`; false when it already belongs to one.
  bool handTo(const std::shared_ptr<FakeKCAppInstallCoordinator>& coordinator);
  void cancelByService(const ErrorRef& reason);
  // Loading saved state: the configuration as it was, taken as is without counting a call.
  void restoreConfiguration(std::shared_ptr<KCPromisedTransferToPath> iconPromise,
                            std::optional<KCPlaceholderAttributes> attributes,
                            std::shared_ptr<const EMStoreMetadata> metadata,
                            std::optional<plist::Bytes> sinf, bool configurationComplete);

 private:
  struct State {
    std::shared_ptr<KCPromisedTransferToPath> iconPromise;
    std::optional<KCPlaceholderAttributes> attributes;
    std::shared_ptr<const EMStoreMetadata> metadata;
    std::optional<plist::Bytes> sinf;
    bool configurationComplete = false;
    bool cancelled = false;
    ErrorRef cancelReason;
    bool handedOver = false;
  };

  // The scripted failure of `operation`, or the state error of a finished configuration.
  bool checkSettable(const State& s, std::string_view operation, ErrorRef* error) const;
  // Applies `change` when the configuration may still change (see checkSettable).
  bool configure(std::string_view operation, ErrorRef* error,
                 const std::function<void(State&)>& change);
  // Marks the placeholder and its icon promise cancelled; false when it already was.
  bool cancelOnce(const ErrorRef& reason);

  const std::weak_ptr<FakeKCServiceHooks> service_;
  const std::string bundleName_;
  const std::string bundleID_;
  const std::uint64_t installType_;
  const std::uint64_t client_;
  Guarded<State> state_;
};

}  // namespace appsync
