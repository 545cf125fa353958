// The fake store service: receipt refreshes, counted, completed on the store's own thread.
#pragma once

#include <cstddef>
#include <functional>
#include <memory>

#include "platform/bz.h"
#include "platform/fake/callback_thread.h"
#include "platform/fake/fake_service.h"

namespace appsync {

// Operations: "newSoftwareLibrary", "refreshReceiptsWithCompletionBlock:" (can fail: the
// completion receives the error). Libraries share the service's script and counts; the service
// must outlive them.
class FakeBZStoreService final : public BZStoreService, public FakeService {
 public:
  FakeBZStoreService();

  std::size_t refreshCount() const { return callCount(kRefresh); }
  // Waits until every completion handed out so far has run.
  void drain() { callbacks_.drain(); }
  // Hold and release completions.
  CallbackThread& callbackThread() { return callbacks_; }

  std::shared_ptr<BZSoftwareLibrary> newSoftwareLibrary() override;

  static constexpr std::string_view kRefresh = "refreshReceiptsWithCompletionBlock:";

 private:
  friend class FakeBZSoftwareLibrary;
  void refresh(std::function<void(ErrorRef)> completion);

  CallbackThread callbacks_{"fake-bz-store"};
};

class FakeBZSoftwareLibrary final : public BZSoftwareLibrary {
 public:
  explicit FakeBZSoftwareLibrary(FakeBZStoreService& service) : service_(service) {}
  void refreshReceiptsWithCompletionBlock(std::function<void(ErrorRef)> completion) override {
    service_.refresh(std::move(completion));
  }

 private:
  FakeBZStoreService& service_;
};

}  // namespace appsync
