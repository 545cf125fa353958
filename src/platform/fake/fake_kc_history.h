// What became of the coordinators the fake install-coordination service has finished: the last
// outcome per bundle identifier, kept after the service has forgotten the coordinator itself.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "platform/fake/fake_kc_coordinator.h"

namespace appsync {

struct FinishedCoordinator {
  std::string bundleID{};
  KCCoordinatorKind kind = KCCoordinatorKind::Any;
  FakeKCAppInstallCoordinator::State state = FakeKCAppInstallCoordinator::State::Completed;
  // The coordinator's error; absent for a successful completion.
  std::optional<std::string> errorDomain{};
  std::optional<std::int64_t> errorCode{};
  // Who cancelled it (0: the service itself); absent for a completion.
  std::optional<std::uint64_t> cancellingClient{};
  bool operator==(const FinishedCoordinator&) const = default;

  // The outcome of `c`, which has just completed or been cancelled.
  static FinishedCoordinator of(const FakeKCAppInstallCoordinator& c,
                                std::optional<std::uint64_t> cancellingClient);
};

// The last outcome per bundle identifier, oldest first. Bounded: beyond kCapacity bundles the
// oldest record is dropped, so a long-lived device does not grow without end. Not thread-safe;
// the service keeps it under its lock.
class CoordinatorHistory {
 public:
  static constexpr std::size_t kCapacity = 1000;

  // Replaces the bundle's record, which becomes the newest.
  void record(FinishedCoordinator finished);
  std::optional<FinishedCoordinator> find(const std::string& bundleID) const;
  const std::vector<FinishedCoordinator>& all() const { return records_; }
  // Replaces every record with `records` (oldest first), as if recorded in that order.
  void replace(std::vector<FinishedCoordinator> records);

 private:
  std::vector<FinishedCoordinator> records_;
};

}  // namespace appsync
