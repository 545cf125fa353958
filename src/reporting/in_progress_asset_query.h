// Which applications the registry is installing right now, and which of them it is restoring:
// a short-lived registry observer that keeps the first report of prioritized installs.
#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "platform/ar.h"
#include "platform/platform.h"
#include "runtime/dispatch/semaphore.h"

namespace appsync {

// How long the query waits for the registry's first report. The registry reports to every new
// observer at once, so the wait normally ends in milliseconds; the bound only keeps a host that
// asks for its transfers from hanging for ever on a registry that never answers.
inline constexpr std::chrono::seconds kInProgressQueryWaitBound{30};

// The registry's debug names of its install types, states and phases, for the log.
std::string installTypeDebugName(std::uint64_t installType);
std::string installStateDebugName(std::uint64_t installState);
std::string installPhaseDebugName(std::uint64_t installPhase);

class InProgressAssetQuery final : public ARApplicationWorkspaceObserverProtocol {
 public:
  // Sets both outputs to absent, observes the registry until its first report (or the wait
  // bound), and hands out the two lists when the report came. Must not be called on the
  // registry's notification thread.
  static void currentInProgressAssetIDs(const Platform& platform,
                                        std::optional<std::vector<std::string>>* inProgressAssetIDs,
                                        std::optional<std::vector<std::string>>* restoringAssetIDs);

  explicit InProgressAssetQuery(const Platform& platform);
  InProgressAssetQuery(const InProgressAssetQuery&) = delete;
  InProgressAssetQuery& operator=(const InProgressAssetQuery&) = delete;

  // Waits for the first report until the platform clock has moved `bound` past now. True when
  // it came.
  bool _fetchResults(std::chrono::nanoseconds bound = kInProgressQueryWaitBound);

  // Filled by the first report; absent before it. Read only after _fetchResults said yes.
  const std::optional<std::vector<std::string>>& _inProgressAssetIDs() const {
    return inProgressAssetIDs_;
  }
  const std::optional<std::vector<std::string>>& _restoringAssetIDs() const {
    return restoringAssetIDs_;
  }

  // The registry's report, on its notification thread. Only the first one is sorted.
  void applicationInstallsArePrioritized(const ARProxyList& prioritized,
                                         const ARProxyList& paused) override;

 private:
  const Platform platform_;
  // Signalled once, after the first report has been sorted. The delivery thread finishes both
  // lists before it signals and the caller reads them only after its wait, so no lock guards
  // them; later reports only look at whether the first list exists.
  Semaphore _waitForInitialObservationData{0};
  std::optional<std::vector<std::string>> inProgressAssetIDs_;
  std::optional<std::vector<std::string>> restoringAssetIDs_;
};

}  // namespace appsync
