// The observer registration of the fake install-coordination service: while it lives, the
// events of coordinators created under its clients reach its delegate.
#pragma once

#include <cstdint>
#include <memory>
#include <set>
#include <string>

#include "platform/fake/fake_kc_service_hooks.h"
#include "platform/kc.h"

namespace appsync {

// Dropping the registration stops the events: when its destructor returns, none is running
// (unless it runs inside an event delivery) and none will be delivered.
class FakeKCAppInstallObserver final : public KCAppInstallObserver {
 public:
  FakeKCAppInstallObserver(std::weak_ptr<FakeKCServiceHooks> service, std::string machServiceName,
                           std::set<std::uint64_t> clients, KCAppInstallObserverDelegate* delegate);
  ~FakeKCAppInstallObserver() override;
  FakeKCAppInstallObserver(const FakeKCAppInstallObserver&) = delete;
  FakeKCAppInstallObserver& operator=(const FakeKCAppInstallObserver&) = delete;

  const std::string& machServiceName() const override { return machServiceName_; }
  const std::set<std::uint64_t>& clients() const override { return clients_; }
  KCAppInstallObserverDelegate* delegate() const { return delegate_; }
  std::string describe() const;

 private:
  const std::weak_ptr<FakeKCServiceHooks> service_;
  const std::string machServiceName_;
  const std::set<std::uint64_t> clients_;
  KCAppInstallObserverDelegate* const delegate_;
};

}  // namespace appsync
