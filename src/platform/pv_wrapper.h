// A forwarding wrapper of the home screen, for tests that change one operation and keep the
// rest.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <type_traits>

#include "platform/pv.h"

namespace appsync {

// Forwards every call to `target` (not owned; it must outlive the wrapper). Derive and
// override the operations to change.
class PVHomeScreenWrapper : public PVHomeScreen {
 public:
  explicit PVHomeScreenWrapper(PVHomeScreen& target) : target_(target) {}

  PVHomeScreen& target() const { return target_; }

  PVPort PVSPavilionBlockableServerPort() override {
    return target_.PVSPavilionBlockableServerPort();
  }
  int PVSetIconState(PVPort port, const std::uint8_t* bytes, std::size_t length) override {
    return target_.PVSetIconState(port, bytes, length);
  }
  int PVGetFlattenedIconState(PVPort port, int flags, PVBuffer* buffer,
                              std::uint32_t* length) override {
    return target_.PVGetFlattenedIconState(port, flags, buffer, length);
  }
  std::shared_ptr<PVSAssertion> PVSApplicationTerminationAssertionCreateWithError(
      const std::string& bundleID, int reason, std::int32_t* outcome) override {
    return target_.PVSApplicationTerminationAssertionCreateWithError(bundleID, reason, outcome);
  }

 private:
  PVHomeScreen& target_;
};

static_assert(!std::is_abstract_v<PVHomeScreenWrapper>, "forward every operation");

}  // namespace appsync
