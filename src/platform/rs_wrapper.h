// A forwarding wrapper of the restriction service, for tests that change its answers and
// keep the rest.
#pragma once

#include <string_view>
#include <type_traits>

#include "platform/rs.h"

namespace appsync {

// Forwards every call to `target` (not owned; it must outlive the wrapper). Derive and
// override the operations to change.
class RSProfileConnectionWrapper : public RSProfileConnection {
 public:
  explicit RSProfileConnectionWrapper(RSProfileConnection& target) : target_(target) {}

  RSProfileConnection& target() const { return target_; }

  int effectiveBoolValueForSetting(std::string_view setting) override {
    return target_.effectiveBoolValueForSetting(setting);
  }

 private:
  RSProfileConnection& target_;
};

static_assert(!std::is_abstract_v<RSProfileConnectionWrapper>, "forward every operation");

}  // namespace appsync
