// The fake install-coordination service's bounded record of finished coordinators.
#include "platform/fake/fake_kc_history.h"

#include <algorithm>
#include <utility>

namespace appsync {

FinishedCoordinator FinishedCoordinator::of(const FakeKCAppInstallCoordinator& c,
                                            std::optional<std::uint64_t> cancellingClient) {
  const FakeKCAppInstallCoordinator::Snapshot s = c.snapshot();
  FinishedCoordinator finished{.bundleID = c.bundleID(),
                               .kind = c.kind(),
                               .state = s.state,
                               .cancellingClient = cancellingClient};
  if (s.error) {
    finished.errorDomain = s.error->domain;
    finished.errorCode = s.error->code;
  }
  return finished;
}

void CoordinatorHistory::record(FinishedCoordinator finished) {
  std::erase_if(records_,
                [&](const FinishedCoordinator& r) { return r.bundleID == finished.bundleID; });
  records_.push_back(std::move(finished));
  if (records_.size() > kCapacity) {
    records_.erase(records_.begin(), records_.end() - static_cast<std::ptrdiff_t>(kCapacity));
  }
}

std::optional<FinishedCoordinator> CoordinatorHistory::find(const std::string& bundleID) const {
  auto it = std::find_if(records_.begin(), records_.end(),
                         [&](const FinishedCoordinator& r) { return r.bundleID == bundleID; });
  if (it == records_.end()) return std::nullopt;
  return *it;
}

void CoordinatorHistory::replace(std::vector<FinishedCoordinator> records) {
  records_.clear();
  for (FinishedCoordinator& r : records) record(std::move(r));
}

}  // namespace appsync
