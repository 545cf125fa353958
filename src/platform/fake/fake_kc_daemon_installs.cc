// The fake install-coordination daemon's installs: a coordinator's placeholder and then its
// package go into the registry as its promises are fulfilled, unless its placeholder install is
// held back; a cancelled coordinator's placeholder record comes out again; uninstalls.
#include "platform/fake/fake_kc_daemon.h"

#include <optional>
#include <string>
#include <utility>

#include "platform/ar.h"
#include "platform/bundle_keys.h"
#include "platform/fake/fake_ar.h"
#include "platform/fake/fake_kc_errors.h"

namespace appsync {
namespace {

// The client number the service itself reports for cancellations it makes.
constexpr std::uint64_t kServiceClient = 0;

std::string pathFromTransferPath(const std::string& path) {
  constexpr std::string_view kScheme = "file://";
  if (path.compare(0, kScheme.size(), kScheme) == 0) return path.substr(kScheme.size());
  return path;
}

// A promise that gates an install: present means it must be complete and not cancelled.
bool settled(const std::shared_ptr<KCPromise>& promise) {
  return !promise || (promise->isComplete() && !promise->isCancelled());
}

}  // namespace

void FakeKCDaemon::evaluate(const CoordinatorRef& c) {
  Coordinator::Snapshot s = c->snapshot();
  if (s.state != Coordinator::State::Active) return;
  auto* placeholder = dynamic_cast<FakeKCPlaceholder*>(s.placeholder.get());
  if (!placeholder) return;
  if (!s.placeholderInstalled) {
    if (!placeholder->isReadyToInstall() || placeholderInstallHeld(c->bundleID())) return;
    if (ErrorRef failure = scriptedFailure(kInstallPlaceholderOp)) {
      if (c->markCancelled(failure)) {
        retire(c, kServiceClient);
        reportCancellation(c, failure, kServiceClient);
      }
      return;
    }
    putPlaceholderRecord(*c, *placeholder);
    if (!c->markPlaceholderInstalled()) return;
    deliver(*c, [&](KCAppInstallObserverDelegate& d) { d.coordinatorDidInstallPlaceholder(c); });
    s = c->snapshot();
    if (s.state != Coordinator::State::Active) return;
  }

  if (!s.appAssetPromise || !settled(s.appAssetPromise) || !settled(s.userDataPromise)) return;
  for (const auto& promise : s.sprPromises) {
    if (!settled(promise)) return;
  }
  std::optional<std::string> transferPath = s.appAssetPromise->transferPath();
  if (!transferPath || transferPath->empty()) return;

  std::uint64_t installType =
      s.installOptions ? s.installOptions->arInstallType() : placeholder->installType();
  plist::Dict options{{std::string(ARPackageTypeKey), std::string(ARPackageTypeCustomer)},
                      {std::string(kBNBundleIdentifierKey), c->bundleID()},
                      {std::string(ARInstallTypeKey), installType}};
  std::shared_ptr<const EMStoreMetadata> metadata =
      s.installOptions && s.installOptions->caravelMetadata() ? s.installOptions->caravelMetadata()
                                                              : placeholder->metadata();
  if (metadata) options.set(std::string(ARCaravelMetadataKey), metadata->dictionary());
  if (std::optional<plist::Bytes> sinf = placeholder->sinfData()) {
    options.set(std::string(ARApplicationSINFKey), std::move(*sinf));
  }
  ErrorRef failure = scriptedFailure(kInstallPackageOp);
  if (!failure) {
    ErrorRef registryError;
    if (!registry_.installApplication(pathFromTransferPath(*transferPath), options,
                                      &registryError)) {
      auto error = std::make_shared<Error>(*makeKCError(
          kKCErrorInstallFailed, "the package of " + c->bundleID() + " could not be installed"));
      error->underlying = registryError;
      failure = error;
    }
  }
  if (!c->finish(failure)) return;
  retire(c, std::nullopt);
  deliver(*c, [&](KCAppInstallObserverDelegate& d) { d.coordinatorDidCompleteSuccessfully(c); });
}

void FakeKCDaemon::holdPlaceholderInstall(const std::string& bundleID) {
  std::lock_guard lock(mutex_);
  heldPlaceholderInstalls_.insert(bundleID);
}

bool FakeKCDaemon::releasePlaceholderInstall(const std::string& bundleID) {
  {
    std::lock_guard lock(mutex_);
    if (heldPlaceholderInstalls_.erase(bundleID) == 0) return false;
  }
  if (CoordinatorRef c = find(bundleID)) coordinatorChanged(c);
  return true;
}

bool FakeKCDaemon::placeholderInstallHeld(const std::string& bundleID) const {
  std::lock_guard lock(mutex_);
  return heldPlaceholderInstalls_.count(bundleID) > 0;
}

void FakeKCDaemon::putPlaceholderRecord(Coordinator& c, const FakeKCPlaceholder& placeholder) {
  std::optional<FakeARWorkspace::AppRecord> existing = registry_.application(c.bundleID());
  if (existing && !existing->isPlaceholder) return;  // an update: the app stays as it is

  FakeARWorkspace::AppRecord record;
  record.identifier = c.bundleID();
  record.name = placeholder.bundleName();
  record.installType = placeholder.installType();
  record.isPlaceholder = true;
  std::optional<plist::Bytes> sinf = placeholder.sinfData();
  record.hasMIDBasedSINF = sinf && !sinf->empty();
  if (std::optional<KCPlaceholderAttributes> attributes = placeholder.attributes()) {
    record.version = attributes->bundleVersion();
    if (!record.version) {
      if (const std::string* v = plist::stringAt(attributes->infoPlist(), kBNBundleVersionKey)) {
        record.version = *v;
      }
    }
  }
  if (auto icon = placeholder.iconPromise()) {
    if (std::optional<std::string> path = icon->transferPath()) {
      record.iconPath = pathFromTransferPath(*path);
    }
  }
  registry_.putApplication(std::move(record));
  c.notePlaceholderRecord();
}

void FakeKCDaemon::reportCancellation(const CoordinatorRef& c, const ErrorRef& reason,
                                      std::uint64_t client) {
  if (c->placedPlaceholderRecord()) {
    std::optional<FakeARWorkspace::AppRecord> record = registry_.application(c->bundleID());
    if (record && record->isPlaceholder)
      registry_.uninstallApplication(c->bundleID(), std::nullopt);
  }
  deliver(*c, [&](KCAppInstallObserverDelegate& d) { d.coordinator(c, reason, client); });
}

ErrorRef FakeKCDaemon::uninstall(const std::string& bundleID) {
  if (!registry_.application(bundleID)) {
    return makeKCError(kKCErrorUnknownApplication, "no application " + bundleID);
  }
  if (!registry_.uninstallApplication(bundleID, std::nullopt)) {
    return makeKCError(kKCErrorUninstallFailed, "the registry did not remove " + bundleID);
  }
  return nullptr;
}

}  // namespace appsync
