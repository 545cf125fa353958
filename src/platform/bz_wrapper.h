// A forwarding wrapper of the store service, for tests that change one operation and keep the
// rest.
#pragma once

#include <memory>
#include <type_traits>

#include "platform/bz.h"

namespace appsync {

// Forwards every call to `target` (not owned; it must outlive the wrapper). Derive and
// override the operations to change.
class BZStoreServiceWrapper : public BZStoreService {
 public:
  explicit BZStoreServiceWrapper(BZStoreService& target) : target_(target) {}

  BZStoreService& target() const { return target_; }

  std::shared_ptr<BZSoftwareLibrary> newSoftwareLibrary() override {
    return target_.newSoftwareLibrary();
  }

 private:
  BZStoreService& target_;
};

static_assert(!std::is_abstract_v<BZStoreServiceWrapper>, "forward every operation");

}  // namespace appsync
