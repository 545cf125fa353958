// The fake install-coordination service's observer registration: its description, and telling
// the service when it goes away.
#include "platform/fake/fake_kc_observer.h"

#include <utility>

#include "platform/fake/fake_kc_object_support.h"

namespace appsync {

FakeKCAppInstallObserver::FakeKCAppInstallObserver(std::weak_ptr<FakeKCServiceHooks> service,
                                                   std::string machServiceName,
                                                   std::set<std::uint64_t> clients,
                                                   KCAppInstallObserverDelegate* delegate)
    : service_(std::move(service)),
      machServiceName_(std::move(machServiceName)),
      clients_(std::move(clients)),
      delegate_(delegate) {}

FakeKCAppInstallObserver::~FakeKCAppInstallObserver() {
  if (auto s = service_.lock()) s->registrationGone(this);
}

std::string FakeKCAppInstallObserver::describe() const {
  std::string clients;
  for (std::uint64_t c : clients_) clients += (clients.empty() ? "" : ",") + std::to_string(c);
  return "<KCAppInstallObserver machServiceName=" + fake_kc::oneLine(machServiceName_) +
         " clients={" + clients + "}>";
}

}  // namespace appsync
