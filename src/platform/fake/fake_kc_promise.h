// The promises of the fake install-coordination service: a file at a path, or data delivered
// outside the service. Completing one, or giving it its path once complete, has the
// coordinator holding it re-examined.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "runtime/error.h"
#include "runtime/guarded.h"
#include "platform/fake/fake_kc_service_hooks.h"
#include "platform/kc.h"

namespace appsync {

// The state and rules both promise kinds share.
class FakeKCPromiseBase {
 public:
  virtual ~FakeKCPromiseBase() = default;

  // The number promiseDidBeginFulfillmentWithIdentifier: reports for this promise.
  std::uint64_t uniqueIdentifier() const { return identifier_; }
  ErrorRef cancelReason() const { return state_.get().cancelReason; }
  // Complete and not cancelled.
  bool isFulfilled() const;
  // Completion and path changes are reported to `coordinator` from now on.
  void attachTo(std::weak_ptr<FakeKCAppInstallCoordinator> coordinator);
  // Cancellation by the service itself: no scripted failure, quiet when already cancelled.
  void cancelByService(const ErrorRef& reason);

 protected:
  FakeKCPromiseBase(std::weak_ptr<FakeKCServiceHooks> service, std::string_view className,
                    bool hasPath, std::string name, std::uint64_t client,
                    std::optional<std::string> transferPath, std::uint64_t diskSpaceNeeded,
                    std::uint64_t identifier);

  double percent() const { return state_.get().percent; }
  void setPercent(double fraction);
  bool complete() const { return state_.get().complete; }
  void setCompleteFlag(bool complete);
  bool cancelled() const { return state_.get().cancelled; }
  bool cancel(const ErrorRef& reason, ErrorRef* error);
  std::optional<std::string> path() const { return state_.get().transferPath; }
  void setPath(std::string path);
  std::string describeState() const;

  const std::string name_;
  const std::uint64_t client_;
  const std::uint64_t diskSpaceNeeded_;

 private:
  struct State {
    double percent = 0;
    bool complete = false;
    bool cancelled = false;
    ErrorRef cancelReason{};
    std::optional<std::string> transferPath{};
    std::weak_ptr<FakeKCAppInstallCoordinator> owner{};
  };

  // Marks the promise cancelled for `reason`; false when it already was.
  bool cancelOnce(const ErrorRef& reason);
  void reportChange(const std::weak_ptr<FakeKCAppInstallCoordinator>& owner);

  const std::weak_ptr<FakeKCServiceHooks> service_;
  const std::string className_;
  const bool hasPath_;
  const std::uint64_t identifier_;
  Guarded<State> state_;
};

// KCPromise on top of the shared state, for either promise interface.
template <class Interface>
class FakeKCPromiseImpl : public Interface, public FakeKCPromiseBase {
 public:
  std::string name() const override { return name_; }
  std::uint64_t client() const override { return client_; }
  std::uint64_t diskSpaceNeeded() const override { return diskSpaceNeeded_; }
  double percentComplete() const override { return percent(); }
  void setPercentComplete(double fraction) override { setPercent(fraction); }
  bool isComplete() const override { return complete(); }
  // Completing a cancelled promise changes nothing.
  void setComplete(bool complete) override { setCompleteFlag(complete); }
  bool isCancelled() const override { return cancelled(); }
  // Fails (kKCErrorInvalidState) when already cancelled.
  bool cancelForReason(const ErrorRef& reason, std::uint64_t client, ErrorRef* error) override {
    (void)client;
    return cancel(reason, error);
  }
  std::string describe() const override { return describeState(); }

 protected:
  using FakeKCPromiseBase::FakeKCPromiseBase;
};

class FakeKCPromisedTransferToPath final : public FakeKCPromiseImpl<KCPromisedTransferToPath> {
 public:
  FakeKCPromisedTransferToPath(std::weak_ptr<FakeKCServiceHooks> service, std::string name,
                               std::uint64_t client, std::optional<std::string> transferPath,
                               std::uint64_t diskSpaceNeeded, std::uint64_t identifier);
  std::optional<std::string> transferPath() const override { return path(); }
  void setTransferPath(std::string path) override { setPath(std::move(path)); }
};

class FakeKCPromisedOutOfBandTransfer final
    : public FakeKCPromiseImpl<KCPromisedOutOfBandTransfer> {
 public:
  FakeKCPromisedOutOfBandTransfer(std::weak_ptr<FakeKCServiceHooks> service, std::string name,
                                  std::uint64_t client, std::uint64_t diskSpaceNeeded,
                                  std::uint64_t identifier);
};

}  // namespace appsync
