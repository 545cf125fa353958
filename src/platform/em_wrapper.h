// A forwarding wrapper of the low-level installer, for tests that change one operation and
// keep the rest.
#pragma once

#include <memory>
#include <string>
#include <type_traits>
#include <vector>

#include "platform/em.h"

namespace appsync {

// Forwards every call to `target` (not owned; it must outlive the wrapper). Derive and
// override the operations to change.
class EMInstallerWrapper : public EMInstaller {
 public:
  explicit EMInstallerWrapper(EMInstaller& target) : target_(target) {}

  EMInstaller& target() const { return target_; }

  std::unique_ptr<plist::Dict> EmplaceLookupUninstalled(const plist::Dict* options) override {
    return target_.EmplaceLookupUninstalled(options);
  }
  int EmplaceClearUninstalled(const std::vector<std::string>& identifiers,
                              const plist::Dict* options) override {
    return target_.EmplaceClearUninstalled(identifiers, options);
  }

 private:
  EMInstaller& target_;
};

static_assert(!std::is_abstract_v<EMInstallerWrapper>, "forward every operation");

}  // namespace appsync
