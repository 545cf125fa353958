// Which placeholder applications the registry holds: one application's, all of them, and the
// system applications that are still placeholders.
#include "client/apps_client.h"

namespace appsync {

namespace {

// The proxy as an application placeholder, or null when it is not one.
const ARApplicationProxy* placeholderApplication(const ARBundleProxy& proxy) {
  const ARApplicationProxy* application = proxy.asApplicationProxy();
  return application && application->appState.isPlaceholder ? application : nullptr;
}

}  // namespace

// Any application with this identifier counts, placeholder or not: the restore must not
// create it again. On the coordinated road the coordinator decides, so the answer is no.
bool AppsClient::_placeholderExistsForApplication(const std::string& bundleID) {
  if (_useInstallCoordinator) return false;
  bool found = false;
  platform_.ar.enumerateBundlesOfType(
      ARBundleTypeApplications, [&](const std::shared_ptr<const ARBundleProxy>& proxy, bool* stop) {
        if (proxy->bundleIdentifier != bundleID) return;
        found = true;
        logDefault("%s|Found placeholder for bundle %{public}@", bundleID);
        *stop = true;
      });
  return found;
}

void AppsClient::_enumeratePlaceholdersWithBlock(const ProxyBlock& block) {
  platform_.ar.enumerateBundlesOfType(
      ARBundleTypeAll, [&](const std::shared_ptr<const ARBundleProxy>& proxy, bool* stop) {
        if (!placeholderApplication(*proxy)) return;
        // Shares ownership of the registry's proxy as the application proxy it is.
        std::shared_ptr<const ARApplicationProxy> application(proxy, proxy->asApplicationProxy());
        block(application, stop);
      });
}

std::set<std::string> AppsClient::_getSystemAppPlaceholders() {
  std::set<std::string> placeholders;
  platform_.ar.enumerateBundlesOfType(
      ARBundleTypeSystemApplications,
      [&](const std::shared_ptr<const ARBundleProxy>& proxy, bool* /*stop*/) {
        if (const ARApplicationProxy* application = placeholderApplication(*proxy)) {
          placeholders.insert(application->bundleIdentifier);
        }
      });
  plist::Array described(placeholders.begin(), placeholders.end());
  logDefault("%s|SystemAppPlaceholders %{public}@", described);
  return placeholders;
}

}  // namespace appsync
