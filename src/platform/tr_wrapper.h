// Forwarding wrappers of the host sync framework and its device service, for tests that
// change one operation and keep the rest.
#pragma once

#include <functional>
#include <memory>
#include <type_traits>
#include <utility>

#include "platform/tr.h"

namespace appsync {

// Forwards every call to `target` (not owned; it must outlive the wrapper). Derive and
// override the operations to change.
class TRHostFrameworkWrapper : public TRHostFramework {
 public:
  explicit TRHostFrameworkWrapper(TRHostFramework& target) : target_(target) {}

  TRHostFramework& target() const { return target_; }

  LogCategory& TRGetLogCategory(int category) override {
    return target_.TRGetLogCategory(category);
  }
  bool TRIsRecoverableError(const ErrorRef& error) override {
    return target_.TRIsRecoverableError(error);
  }
  std::shared_ptr<TRDeviceService> TRDeviceServiceSharedInstance() override {
    return target_.TRDeviceServiceSharedInstance();
  }

 private:
  TRHostFramework& target_;
};

// Forwards every call to `target` (not owned). A test hands one out by overriding
// TRHostFrameworkWrapper::TRDeviceServiceSharedInstance.
class TRDeviceServiceWrapper : public TRDeviceService {
 public:
  explicit TRDeviceServiceWrapper(TRDeviceService& target) : target_(target) {}

  TRDeviceService& target() const { return target_; }

  bool respondsTo(Operation operation) const override { return target_.respondsTo(operation); }
  void prioritizeAsset(std::shared_ptr<TRAsset> asset,
                       std::function<void(ErrorRef)> completion) override {
    target_.prioritizeAsset(std::move(asset), std::move(completion));
  }
  void cancelAssetTransferForFailedAsset(std::shared_ptr<TRAsset> asset) override {
    target_.cancelAssetTransferForFailedAsset(std::move(asset));
  }

 private:
  TRDeviceService& target_;
};

static_assert(!std::is_abstract_v<TRHostFrameworkWrapper>, "forward every operation");
static_assert(!std::is_abstract_v<TRDeviceServiceWrapper>, "forward every operation");

}  // namespace appsync
