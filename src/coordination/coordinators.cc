// Finding or creating the coordinator of a sync install or update, and creating placeholders.
#include "client/apps_client.h"
#include "coordination/coordination_support.h"

namespace appsync {

using namespace coordination;

std::shared_ptr<KCAppInstallCoordinator>
AppsClient::_initiatingOrUpdatingAppInstallCoordinatorForBundleIdentifier(
    const std::string& bundleID, bool existingApp, bool createIfNotExisting, ErrorRef* error) {
  beginStep(platform_, kCoordinatorStep, bundleID, "Create coordinator");
  const KCCoordinatorKind kind =
      existingApp ? KCCoordinatorKind::Updating : KCCoordinatorKind::Initiating;
  const char* kindWord = existingApp ? "updating" : "initiating";
  ErrorRef serviceError;
  bool created = false;  // received, not consulted: an existing coordinator serves as well
  std::shared_ptr<KCAppInstallCoordinator> coordinator = platform_.kc.coordinatorForAppWithBundleID(
      kind, bundleID, kAppSyncCoordinationClient, createIfNotExisting, &created, &serviceError);
  if (coordinator) {
    const std::uint64_t creator = coordinator->creatorIdentifier();
    if (creator != kAppSyncCoordinationClient) {
      logDefault(
          "%s|IC returned %s coordinator %{public}@ (createIfNotExisting:%d, existingApp:%d, "
          "creatorIdentifier=%lu) for %{public}@ with error %{public}@ - Will not perform "
          "install/update for this bundle",
          kindWord, coordinator, createIfNotExisting, existingApp, creator, bundleID, serviceError);
      coordinator.reset();
    } else {
      logDefault(
          "%s|Created %s coordinator %{public}@ (createIfNotExisting:%d, existingApp:%d) for "
          "%{public}@ with error %{public}@",
          kindWord, coordinator, createIfNotExisting, existingApp, bundleID, serviceError);
    }
  }
  setError(error, serviceError);
  endStep(platform_, kCoordinatorStep, coordinator != nullptr, bundleID,
          "Finished creating coordinator");
  return coordinator;
}

std::shared_ptr<KCPlaceholder> AppsClient::_placeHolderForBundleIdentifier(
    const std::string& bundleID, const std::string& name, std::uint64_t installType) {
  beginStep(platform_, kPlaceholderStep, bundleID, "Create placeholder");
  std::shared_ptr<KCPlaceholder> placeholder =
      platform_.kc.initAppPlaceholder(name, bundleID, installType, kAppSyncCoordinationClient);
  endStep(platform_, kPlaceholderStep, placeholder != nullptr, bundleID,
          "Finished creating placeholder");
  logDefault("%s|Created placeholder %{public}@ for '%{public}@' of type %lu", placeholder,
             bundleID, installType);
  return placeholder;
}

}  // namespace appsync
