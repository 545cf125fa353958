// A forwarding wrapper of the system facilities, for tests that change one operation and keep
// the rest.
#pragma once

#include <cstdint>
#include <string>
#include <type_traits>

#include "platform/system.h"

namespace appsync {

// Forwards every call to `target` (not owned; it must outlive the wrapper). Derive and
// override the operations to change.
class SystemServicesWrapper : public SystemServices {
 public:
  explicit SystemServicesWrapper(SystemServices& target) : target_(target) {}

  SystemServices& target() const { return target_; }

  std::uint32_t notifyRegisterCheck(const std::string& name, int* token) override {
    return target_.notifyRegisterCheck(name, token);
  }
  std::uint32_t notifySetState(int token, std::uint64_t state) override {
    return target_.notifySetState(token, state);
  }
  std::uint32_t notifyGetState(int token, std::uint64_t* state) override {
    return target_.notifyGetState(token, state);
  }
  std::uint32_t notifyPost(const std::string& name) override { return target_.notifyPost(name); }
  void addNotificationObserver(void* observer, NotificationCallback callback,
                               const std::string& name) override {
    target_.addNotificationObserver(observer, callback, name);
  }
  void removeNotificationObserver(void* observer, const std::string& name) override {
    target_.removeNotificationObserver(observer, name);
  }
  int setFileTimesToNow(const std::string& path) override {
    return target_.setFileTimesToNow(path);
  }
  std::string temporaryDirectory() override { return target_.temporaryDirectory(); }
  bool setOwnerAndGroup(const std::string& path, const std::string& owner, const std::string& group,
                        ErrorRef* error) override {
    return target_.setOwnerAndGroup(path, owner, group, error);
  }
  std::string mainBundleIdentifier() override { return target_.mainBundleIdentifier(); }
  Clock& clock() override { return target_.clock(); }

 private:
  SystemServices& target_;
};

static_assert(!std::is_abstract_v<SystemServicesWrapper>, "forward every operation");

}  // namespace appsync
