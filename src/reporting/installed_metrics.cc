// How many of the user's applications are installed and how much storage they take.
#include "client/apps_client.h"

namespace appsync {

plist::Dict AppsClient::installedAssetMetrics() {
  std::uint64_t count = 0;
  std::uint64_t physicalSize = 0;
  // The registry offers no purgeable figure; see docs/decisions.md, "Reporting".
  const std::uint64_t purgeableSize = 0;
  platform_.ar.enumerateBundlesOfType(
      ARBundleTypeApplications,
      [&](const std::shared_ptr<const ARBundleProxy>& proxy, bool* /*stop*/) {
        const ARApplicationProxy* application = proxy->asApplicationProxy();
        if (!application || application->applicationType != ARApplicationTypeUser) return;
        physicalSize += application->diskUsage.staticUsage.value_or(0);
        ++count;
      });
  logDefault("%s|found %ld apps using %lld bytes (%lld purgeable)", count, physicalSize,
             purgeableSize);
  return {{"_Count", count}, {"_PhysicalSize", physicalSize}, {"_PurgeableSize", purgeableSize}};
}

}  // namespace appsync
