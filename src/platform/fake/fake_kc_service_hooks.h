// What the objects of the fake install-coordination service need from the service that made
// them.
#pragma once

#include <cstdint>
#include <memory>
#include <string_view>

#include "runtime/error.h"

namespace appsync {

class FakeKCAppInstallCoordinator;
class FakeKCAppInstallObserver;

class FakeKCServiceHooks {
 public:
  // Counts a call of `operation` and returns its scripted failure, or null to go ahead.
  virtual ErrorRef scriptedFailure(std::string_view operation) = 0;
  // Something the coordinator waits for may have changed; the service re-examines it on its
  // own thread.
  virtual void coordinatorChanged(const std::shared_ptr<FakeKCAppInstallCoordinator>& c) = 0;
  // The coordinator has just been marked cancelled: the service forgets it and reports the
  // cancellation.
  virtual void coordinatorCancelled(const std::shared_ptr<FakeKCAppInstallCoordinator>& c,
                                    const ErrorRef& reason, std::uint64_t client) = 0;
  // Returns once no event delivery that may still use a replaced observer is running.
  virtual void observerReplaced() = 0;
  // The registration is being destroyed; after this returns no event reaches its delegate.
  virtual void registrationGone(const FakeKCAppInstallObserver* registration) = 0;

 protected:
  ~FakeKCServiceHooks() = default;
};

}  // namespace appsync
