// A forwarding wrapper of the icon-rendering service, for tests that change one operation and
// keep the rest.
#pragma once

#include <cstddef>
#include <memory>
#include <string>
#include <string_view>
#include <type_traits>

#include "platform/qi_icon_service.h"

namespace appsync {

// Forwards every call to `target` (not owned; it must outlive the wrapper). Derive and
// override the operations to change.
class QIIconServiceWrapper : public QIIconService {
 public:
  explicit QIIconServiceWrapper(QIIconService& target) : target_(target) {}

  QIIconService& target() const { return target_; }

  std::shared_ptr<QIBundle> openBundle(const std::string& path) override {
    return target_.openBundle(path);
  }
  std::shared_ptr<QIImage> QICreateDeviceAppropriateHomeScreenIconImageFromBundle(
      const QIBundle& bundle) override {
    return target_.QICreateDeviceAppropriateHomeScreenIconImageFromBundle(bundle);
  }
  std::unique_ptr<QIImageDestination> createImageDestination(std::string_view typeIdentifier,
                                                             std::size_t capacity) override {
    return target_.createImageDestination(typeIdentifier, capacity);
  }

 private:
  QIIconService& target_;
};

static_assert(!std::is_abstract_v<QIIconServiceWrapper>, "forward every operation");

}  // namespace appsync
