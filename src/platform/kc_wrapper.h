// A forwarding wrapper of the install-coordination service, for tests that change one
// operation and keep the rest.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <type_traits>
#include <utility>

#include "platform/kc.h"

namespace appsync {

// Forwards every call to `target` (not owned; it must outlive the wrapper). Derive and
// override the operations to change.
class KCInstallCoordinationWrapper : public KCInstallCoordination {
 public:
  explicit KCInstallCoordinationWrapper(KCInstallCoordination& target) : target_(target) {}

  KCInstallCoordination& target() const { return target_; }

  bool coordinationIsEnabled() override { return target_.coordinationIsEnabled(); }
  void uninstallAppWithBundleID(const std::string& bundleID, bool requestUserConfirmation,
                                std::function<void(ErrorRef)> completion) override {
    target_.uninstallAppWithBundleID(bundleID, requestUserConfirmation, std::move(completion));
  }
  std::shared_ptr<KCAppInstallCoordinator> coordinatorForAppWithBundleID(
      KCCoordinatorKind kind, const std::string& bundleID, std::uint64_t clientID,
      bool createIfNotExisting, bool* created, ErrorRef* error) override {
    return target_.coordinatorForAppWithBundleID(kind, bundleID, clientID, createIfNotExisting,
                                                 created, error);
  }
  std::shared_ptr<KCPlaceholder> initAppPlaceholder(const std::string& bundleName,
                                                    const std::string& bundleID,
                                                    std::uint64_t installType,
                                                    std::uint64_t client) override {
    return target_.initAppPlaceholder(bundleName, bundleID, installType, client);
  }
  std::shared_ptr<KCPromisedTransferToPath> initPromisedTransferToPath(
      const std::string& name, std::uint64_t client, const std::optional<std::string>& transferPath,
      std::uint64_t diskSpaceNeeded) override {
    return target_.initPromisedTransferToPath(name, client, transferPath, diskSpaceNeeded);
  }
  std::shared_ptr<KCPromisedOutOfBandTransfer> initPromisedOutOfBandTransfer(
      const std::string& name, std::uint64_t client, std::uint64_t diskSpaceNeeded) override {
    return target_.initPromisedOutOfBandTransfer(name, client, diskSpaceNeeded);
  }
  std::shared_ptr<KCAppInstallObserver> initAppInstallObserver(
      const std::string& machServiceName, const std::set<std::uint64_t>& clients,
      KCAppInstallObserverDelegate* delegate) override {
    return target_.initAppInstallObserver(machServiceName, clients, delegate);
  }
  void removeObserver(const KCAppInstallObserverDelegate* observer) override {
    target_.removeObserver(observer);
  }
  ErrorRef KCCreateUserPresentableError(std::int64_t code, std::int64_t detail,
                                        const ErrorRef& underlying) override {
    return target_.KCCreateUserPresentableError(code, detail, underlying);
  }

 private:
  KCInstallCoordination& target_;
};

static_assert(!std::is_abstract_v<KCInstallCoordinationWrapper>, "forward every operation");

}  // namespace appsync
