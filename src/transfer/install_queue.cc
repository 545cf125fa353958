// The legacy road's install queue: every delivered package is installed by an operation of
// _installOperationQueue, under a termination assertion from the home screen. A denied
// assertion puts the install back on the queue later, as often as the home screen denies it.
#include <cerrno>

#include "client/apps_client.h"
#include "platform/bundle_keys.h"
#include "runtime/fs/files.h"
#include "state/todo_list.h"

namespace appsync {
namespace {

constexpr std::string_view kAssetInstallScenario = "Asset install";

}  // namespace

void AppsClient::_enqueueAssetInstall(const std::shared_ptr<TRAsset>& asset) {
  _installGroup->enter();
  // The operation holds the asset; the client outlives it because its teardown waits on the
  // group.
  auto operation = [this, asset] {
    // A client being torn down starts no install: the package, the todo state, the placeholder
    // and the restore state stay as they are for the next sync.
    if (tearingDown_.load()) {
      _installGroup->leave();
      return;
    }
    const std::string identifier = asset->identifier();
    logDefault("%s|Performing install for %{public}@", identifier);
    _performAssetInstall(asset);
    logDefault("%s|Finished install for %{public}@", identifier);
    cleanRestoreStateForIdentifier(identifier);
    _installGroup->leave();
  };
  logDefault("%s|Enqueue install request for %{public}@", asset->identifier());
  _installOperationQueue->addOperation(std::move(operation));
}

void AppsClient::_performAssetInstall(const std::shared_ptr<TRAsset>& asset) {
  const std::string identifier = asset->identifier();
  const std::string scenario(kAssetInstallScenario);
  logDefault("%s|Grabbing assertion for %{public}@", identifier);
  std::int32_t outcome = 0;
  std::shared_ptr<PVSAssertion> assertion =
      platform_.pv.PVSApplicationTerminationAssertionCreateWithError(identifier, 0, &outcome);

  switch (outcome) {
    case kPVSAssertionGranted:
      logDefault("%s|Assertion succeeded for %{public}@", identifier);
      platform_.transactionLog.logScenario(scenario, 0, true, identifier, "assertion succeeded");
      break;
    case kPVSAssertionApplicationNotFound:
      logDefault("%s|Assertion not found for %{public}@, installing anyway...", identifier);
      platform_.transactionLog.logScenario(scenario, 0, true, identifier, "assertion not found");
      break;
    case kPVSAssertionDenied: {
      logError("%s|Assertion denied for %{public}@", identifier);
      platform_.transactionLog.logScenario(scenario, 0, true, identifier, "assertion denied");
      assertion.reset();
      const int delaySeconds = static_cast<int>(kInstallRetryDelay.count());
      logError("%s|Will retry installation of %{public}@ in %d seconds", identifier, delaySeconds);
      platform_.transactionLog.logScenario(scenario, 0, true, identifier, "retrying asset install");
      // Entered before this install's operation leaves, so the group never empties between the
      // denial and the retry. The package stays for the retry. A teardown drops the retry unrun,
      // and its membership leaves with it.
      auto membership = std::make_shared<GroupMembership>(*_installGroup);
      globalQueue_->after(kInstallRetryDelay, [this, asset, membership] {
        logDefault("%s|Re-enqueue installation request for %{public}@", asset->identifier());
        _enqueueAssetInstall(asset);
      });
      return;
    }
    default:
      logError("%s|Unknown error %d getting assertion for %{public}@", outcome, identifier);
      platform_.transactionLog.logScenario(scenario, 0, false, identifier,
                                           "unknown error grabbing assertion");
      assetInstallFailed(asset, makeError(kPOSIXErrorDomain, EINVAL));
      assertion.reset();
      break;
  }

  const std::optional<std::string> path = asset->path();
  if (outcome == kPVSAssertionGranted || outcome == kPVSAssertionApplicationNotFound) {
    const plist::Dict options{{std::string(ARPackageTypeKey), std::string(ARPackageTypeCustomer)},
                              {std::string(kBNBundleIdentifierKey), identifier}};
    ErrorRef error;
    if (platform_.ar.installApplication(path.value_or(std::string()), options, &error)) {
      assetInstallSucceeded(asset);
    } else {
      assetInstallFailed(asset, error);
    }
    _countAppInstallAttempt();
    assertion.reset();
  }
  if (path) removeAll(*path);
}

void AppsClient::assetInstallSucceeded(const std::shared_ptr<TRAsset>& asset) {
  const std::string identifier = asset->identifier();
  logDefault("%s|%{public}@ install succeeded", identifier);
  changeAssetID(identifier, std::string(kTodoInstalled));
  cleanRestoreStateForIdentifier(identifier);
}

void AppsClient::assetInstallFailed(const std::shared_ptr<TRAsset>& asset,
                                    const ErrorRef& withError) {
  const std::string identifier = asset->identifier();
  const std::string scenario = "Halvard restore";
  if (_isRecoverableError(withError) || asset->isRestore()) {
    logDefault("%s|%{public}@ install failed but was recoverable: %{public}@", identifier,
               withError);
    platform_.transactionLog.logScenario(scenario, 0, false, identifier,
                                         "install failed recoverably");
  } else {
    logDefault("%s|%{public}@ install failed unrecoverably: %{public}@", identifier, withError);
    changeAssetID(identifier, std::string(kTodoFailed));
    if (_useInstallCoordinator) {
      uninstallAppUsingCoordination(identifier);
    } else if (platform_.ar.uninstallApplication(identifier, std::nullopt)) {
      platform_.transactionLog.logScenario(scenario, 0, true, identifier, "placeholder removed");
    } else {
      logError("%s|Uninstall of %{public}@ failed.", identifier);
      platform_.transactionLog.logScenario(scenario, 0, false, identifier,
                                           "failed to remove placeholder");
    }
  }
  cleanRestoreStateForIdentifier(identifier);
}

bool AppsClient::waitForRunnableInstalls() {
  // A retry that comes due queues an install, and an install may schedule a retry: go round
  // until neither queue has anything to do now.
  bool waited = false;
  for (;;) {
    globalQueue_->waitUntilIdle();
    if (_installOperationQueue->unfinishedCount() == 0) return waited;
    waited = true;
    _installOperationQueue->waitUntilAllOperationsAreFinished();
  }
}

bool AppsClient::_isRecoverableError(const ErrorRef& error) {
  if (_useInstallCoordinator) {
    logDefault("%s|InstallCoordination is enabled - treating error %{public}@ as non recoverable",
               error);
    return false;
  }
  if (!platform_.tr.TRIsRecoverableError(error)) return false;
  // Installer and registry errors are final whatever the sync framework thinks of them.
  return !error ||
         (error->domain != kEMInstallerErrorDomain && error->domain != kAppRegistryErrorDomain);
}

std::shared_ptr<ARInstallProgress> AppsClient::_progressForAssetIdentifier(
    const std::string& identifier) {
  if (_useInstallCoordinator) {
    logDefault("%s|Not returning TaskProgress * for %{public}@ as installcoordination is enabled",
               identifier);
    return nullptr;
  }
  std::shared_ptr<ARInstallProgress> progress;
  if (auto proxy = platform_.ar.applicationProxyForIdentifier(identifier, true)) {
    progress = platform_.ar.installProgressForApplication(*proxy, 0);
  }
  logError("%s|Returning %{public}@ progress for %{public}@", progress, identifier);
  return progress;
}

std::optional<std::string> AppsClient::_operationStateForIdentifier(const std::string& identifier) {
  const std::optional<plist::Array> toDoList =
      _loadPlist(platform_.tr, platform_.paths.todoList(), nullptr);
  if (!toDoList) return std::nullopt;
  const plist::Dict* record = findTodoRecord(*toDoList, identifier);
  const std::string* operation = record ? plist::stringAt(*record, kTodoOperationKey) : nullptr;
  if (!operation) return std::nullopt;
  return *operation;
}

}  // namespace appsync
