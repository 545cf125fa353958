// A forwarding wrapper of the application registry, for tests that change one operation and
// keep the rest.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <type_traits>

#include "platform/ar.h"

namespace appsync {

// Forwards every call to `target` (not owned; it must outlive the wrapper). Derive and
// override the operations to change.
class ARApplicationWorkspaceWrapper : public ARApplicationWorkspace {
 public:
  explicit ARApplicationWorkspaceWrapper(ARApplicationWorkspace& target) : target_(target) {}

  ARApplicationWorkspace& target() const { return target_; }

  void addObserver(ARApplicationWorkspaceObserverProtocol* observer) override {
    target_.addObserver(observer);
  }
  void removeObserver(ARApplicationWorkspaceObserverProtocol* observer) override {
    target_.removeObserver(observer);
  }
  bool applicationIsInstalled(const std::string& identifier) override {
    return target_.applicationIsInstalled(identifier);
  }
  bool uninstallApplication(const std::string& identifier,
                            const std::optional<plist::Dict>& options) override {
    return target_.uninstallApplication(identifier, options);
  }
  bool installApplication(const std::string& path, const plist::Dict& options) override {
    return target_.installApplication(path, options);
  }
  bool installApplication(const std::string& path, const plist::Dict& options,
                          ErrorRef* error) override {
    return target_.installApplication(path, options, error);
  }
  void enumerateBundlesOfType(int type, const BundleBlock& block) override {
    target_.enumerateBundlesOfType(type, block);
  }
  std::shared_ptr<ARInstallProgress> installProgressForApplication(const ARApplicationProxy& proxy,
                                                                   std::uint64_t phase) override {
    return target_.installProgressForApplication(proxy, phase);
  }
  void installPhaseFinishedForProgress(
      const std::shared_ptr<ARInstallProgress>& progress) override {
    target_.installPhaseFinishedForProgress(progress);
  }
  std::shared_ptr<const ARApplicationProxy> applicationProxyForIdentifier(
      const std::string& identifier, bool placeholder) override {
    return target_.applicationProxyForIdentifier(identifier, placeholder);
  }

 private:
  ARApplicationWorkspace& target_;
};

static_assert(!std::is_abstract_v<ARApplicationWorkspaceWrapper>, "forward every operation");

}  // namespace appsync
