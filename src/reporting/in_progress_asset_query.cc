// The in-progress query: observes the registry for its first report of prioritized installs and
// sorts the placeholders being installed into running installs and running restores.
#include "reporting/in_progress_asset_query.h"

#include <string_view>

#include "runtime/log/log.h"

namespace appsync {

namespace {

std::string debugName(std::uint64_t code, const std::vector<std::string_view>& names,
                      std::string_view unknownPrefix) {
  if (code < names.size()) return std::string(names[code]);
  return std::string(unknownPrefix) + std::to_string(code);
}

std::string describeProxies(const ARProxyList& proxies) {
  std::string out = "(";
  for (std::size_t i = 0; i < proxies.size(); ++i) {
    if (i > 0) out += ", ";
    out += proxies[i] ? proxies[i]->describe() : std::string("(null)");
  }
  return out + ")";
}

enum class InstallKind { Running, Restoring, Neither };

// First matching row wins.
InstallKind sortInstall(std::uint64_t type, std::uint64_t state, std::uint64_t phase) {
  if (state != ARInstallStateActive) return InstallKind::Neither;
  if (type != ARInstallTypeRestore && phase == ARInstallPhaseInstalling)
    return InstallKind::Running;
  if (type == ARInstallTypeStoreDownload && phase == ARInstallPhaseLoading) {
    return InstallKind::Running;
  }
  if (type == ARInstallTypeRestore &&
      (phase == ARInstallPhaseLoading || phase == ARInstallPhaseInstalling)) {
    return InstallKind::Restoring;
  }
  return InstallKind::Neither;
}

}  // namespace

std::string installTypeDebugName(std::uint64_t installType) {
  static const std::vector<std::string_view> kNames = {
      "ARInstallTypeNone",      "ARInstallTypeStoreDownload",
      "ARInstallTypeRestore",   "ARInstallTypeAutomaticDownload",
      "ARInstallTypeSync",      "ARInstallTypeAutomaticUpdate",
      "ARInstallTypeMigration", "ARInstallTypeDowngrade"};
  return debugName(installType, kNames, "Unknown Install Type: ");
}

std::string installStateDebugName(std::uint64_t installState) {
  static const std::vector<std::string_view> kNames = {
      "ARInstallStateWaiting",  "ARInstallStateActive", "ARInstallStatePaused",
      "ARInstallStateCanceled", "ARInstallStateFailed", "ARInstallStateFinished"};
  return debugName(installState, kNames, "Unknown Install State: ");
}

std::string installPhaseDebugName(std::uint64_t installPhase) {
  static const std::vector<std::string_view> kNames = {
      "ARInstallPhaseLoading", "ARInstallPhaseInstalling", "ARInstallPhaseRestoringData",
      "ARInstallPhaseInstallingPlaceholder"};
  return debugName(installPhase, kNames, "Unknown Install Phase: ");
}

InProgressAssetQuery::InProgressAssetQuery(const Platform& platform) : platform_(platform) {}

void InProgressAssetQuery::currentInProgressAssetIDs(
    const Platform& platform, std::optional<std::vector<std::string>>* inProgressAssetIDs,
    std::optional<std::vector<std::string>>* restoringAssetIDs) {
  if (inProgressAssetIDs) inProgressAssetIDs->reset();
  if (restoringAssetIDs) restoringAssetIDs->reset();
  InProgressAssetQuery query(platform);
  platform.ar.addObserver(&query);
  if (query._fetchResults()) {
    if (inProgressAssetIDs) *inProgressAssetIDs = query.inProgressAssetIDs_;
    if (restoringAssetIDs) *restoringAssetIDs = query.restoringAssetIDs_;
  }
  // Returns once no report for the query runs or will run, so the query may go.
  platform.ar.removeObserver(&query);
}

bool InProgressAssetQuery::_fetchResults(std::chrono::nanoseconds bound) {
  const LogCategory& log = platform_.tr.TRGetLogCategory(kAppSyncLogCategory);
  pluginLog(log, LogLevel::Default,
            "%s|Waiting for -applicationInstallsArePrioritized:arePaused: to complete...");
  Clock& clock = platform_.system.clock();
  if (!_waitForInitialObservationData.waitUntil(clock, clock.now() + bound)) {
    pluginLog(log, LogLevel::Error, "%s|Query for in progress assets timed out");
    return false;
  }
  pluginLog(log, LogLevel::Default, "%s|Wait completed");
  return true;
}

void InProgressAssetQuery::applicationInstallsArePrioritized(const ARProxyList& prioritized,
                                                             const ARProxyList& paused) {
  pluginLog(platform_.tr.TRGetLogCategory(kSyncSummaryLogCategory), LogLevel::Default,
            "%s|prioritized proxies %{public}@ paused proxies %{public}@",
            describeProxies(prioritized), describeProxies(paused));
  if (inProgressAssetIDs_) return;  // only the first report counts

  const LogCategory& log = platform_.tr.TRGetLogCategory(kAppSyncLogCategory);
  inProgressAssetIDs_.emplace();
  restoringAssetIDs_.emplace();
  if (prioritized.empty()) pluginLog(log, LogLevel::Default, "%s|No assets currently in progress.");
  for (const auto& proxy : prioritized) {
    if (!proxy) continue;
    const std::string& identifier = proxy->applicationIdentifier;
    if (!proxy->isPlaceholder) {
      pluginLog(log, LogLevel::Default, "%s|No placeholder for asset identifier %{public}@",
                identifier);
      continue;
    }
    const std::shared_ptr<ARInstallProgress>& progress = proxy->installProgressSync;
    if (!progress) {
      pluginLog(log, LogLevel::Default,
                "%s|No install progress found for asset identifier %{public}@", identifier);
      continue;
    }
    const std::uint64_t type = proxy->installType;
    const std::uint64_t state = progress->installState();
    const std::uint64_t phase = progress->installPhase();
    pluginLog(log, LogLevel::Default,
              "%s|Got install type=%{public}@ state=%{public}@ phase=%{public}@ for %{public}@",
              installTypeDebugName(type), installStateDebugName(state),
              installPhaseDebugName(phase), identifier);
    switch (sortInstall(type, state, phase)) {
      case InstallKind::Running:
        inProgressAssetIDs_->push_back(identifier);
        break;
      case InstallKind::Restoring:
        restoringAssetIDs_->push_back(identifier);
        break;
      case InstallKind::Neither:
        break;
    }
  }
  pluginLog(log, LogLevel::Default, "%s|signaling semaphore");
  _waitForInitialObservationData.signal();
}

}  // namespace appsync
