// A forwarding wrapper of the backup service, for tests that change one operation and keep
// the rest.
#pragma once

#include <memory>
#include <type_traits>

#include "platform/sw.h"

namespace appsync {

// Forwards every call to `target` (not owned; it must outlive the wrapper). Derive and
// override the operations to change.
class SWBackupServiceWrapper : public SWBackupService {
 public:
  explicit SWBackupServiceWrapper(SWBackupService& target) : target_(target) {}

  SWBackupService& target() const { return target_; }

  std::shared_ptr<SWManager> newManager() override { return target_.newManager(); }

 private:
  SWBackupService& target_;
};

static_assert(!std::is_abstract_v<SWBackupServiceWrapper>, "forward every operation");

}  // namespace appsync
