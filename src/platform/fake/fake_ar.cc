// The fake application registry's records: the test API that puts and reads them, the
// containers packages go to, and the proxies made from records.
#include "platform/fake/fake_ar.h"

#include <algorithm>

#include "runtime/fs/paths.h"

namespace appsync {

namespace fs = std::filesystem;

namespace {

constexpr std::string_view kContainersBase = "/private/var/containers/Bundle/Application";

}  // namespace

FakeARWorkspace::FakeARWorkspace(fs::path root)
    : FakeService("FakeARWorkspace", std::string(kAppRegistryErrorDomain),
                  {{kIsInstalled, true},
                   {kUninstall, true},
                   {kInstallPlaceholder, true},
                   {kInstallPackage, true},
                   {kEnumerate, true},
                   {kProgress, true},
                   {kProxy, true},
                   {kAddObserver, false},
                   {kRemoveObserver, false},
                   {kPhaseFinished, false}}),
      root_(std::move(root)) {}

FakeARWorkspace::Entry* FakeARWorkspace::findLocked(const std::string& identifier) {
  for (Entry& e : entries_) {
    if (e.record.identifier == identifier) return &e;
  }
  return nullptr;
}

const FakeARWorkspace::Entry* FakeARWorkspace::findLocked(const std::string& identifier) const {
  for (const Entry& e : entries_) {
    if (e.record.identifier == identifier) return &e;
  }
  return nullptr;
}

void FakeARWorkspace::putLocked(Entry entry) {
  if (Entry* existing = findLocked(entry.record.identifier)) {
    *existing = std::move(entry);
  } else {
    entries_.push_back(std::move(entry));
  }
}

void FakeARWorkspace::eraseLocked(const std::string& identifier) {
  std::erase_if(entries_, [&](const Entry& e) { return e.record.identifier == identifier; });
  std::erase_if(progress_, [&](const auto& item) { return item.first.first == identifier; });
}

void FakeARWorkspace::putApplication(AppRecord record) {
  std::lock_guard lock(mutex_);
  Entry entry;
  if (Entry* existing = findLocked(record.identifier))
    entry.currentProgress = existing->currentProgress;
  entry.record = std::move(record);
  putLocked(std::move(entry));
}

std::optional<FakeARWorkspace::AppRecord> FakeARWorkspace::application(
    const std::string& identifier) const {
  std::lock_guard lock(mutex_);
  const Entry* e = findLocked(identifier);
  return e ? std::optional<AppRecord>(e->record) : std::nullopt;
}

std::vector<FakeARWorkspace::AppRecord> FakeARWorkspace::applications() const {
  std::lock_guard lock(mutex_);
  std::vector<AppRecord> out;
  out.reserve(entries_.size());
  for (const Entry& e : entries_) out.push_back(e.record);
  return out;
}

bool FakeARWorkspace::removeApplication(const std::string& identifier) {
  std::lock_guard lock(mutex_);
  if (!findLocked(identifier)) return false;
  eraseLocked(identifier);
  return true;
}

void FakeARWorkspace::setUninstallHook(UninstallHook hook) {
  std::lock_guard lock(mutex_);
  uninstallHook_ = std::move(hook);
}

void FakeARWorkspace::setArchiveLimits(fake_ar::ArchiveLimits limits) {
  std::lock_guard lock(mutex_);
  archiveLimits_ = limits;
}

std::optional<std::string> FakeARWorkspace::containerDirectoryFor(
    const std::string& identifier) const {
  // One directory per application, directly below the base.
  if (identifier.find('/') != std::string::npos || identifier == "." || identifier == "..") {
    return std::nullopt;
  }
  return Paths::confined((root_ / fs::path(kContainersBase).relative_path()).string(), identifier);
}

std::vector<FakeARWorkspace::InstallCall> FakeARWorkspace::installCalls() const {
  std::lock_guard lock(mutex_);
  return installCalls_;
}

std::vector<FakeARWorkspace::UninstallCall> FakeARWorkspace::uninstallCalls() const {
  std::lock_guard lock(mutex_);
  return uninstallCalls_;
}

// ---- Proxies ----------------------------------------------------------------------------------

std::shared_ptr<const ARApplicationProxy> FakeARWorkspace::makeApplicationProxy(
    const Entry& entry) {
  const AppRecord& r = entry.record;
  auto proxy = std::make_shared<ARApplicationProxy>();
  proxy->bundleIdentifier = r.identifier;
  proxy->applicationIdentifier = r.identifier;
  proxy->applicationType = r.applicationType;
  proxy->bundleContainerURL = r.containerDirectory;
  proxy->bundleURL = r.bundleDirectory;
  proxy->bundleVersion = r.version;
  proxy->localizedName = r.name;
  proxy->isInstalled = !r.isPlaceholder;
  proxy->isPlaceholder = r.isPlaceholder;
  proxy->installType = r.installType;
  proxy->installProgressSync = entry.currentProgress;
  proxy->appState.isPlaceholder = r.isPlaceholder;
  proxy->diskUsage.staticUsage = r.staticDiskUsage;
  proxy->hasMIDBasedSINF = r.hasMIDBasedSINF;
  return proxy;
}

std::shared_ptr<const ARBundleProxy> FakeARWorkspace::makeProxy(const Entry& entry) {
  if (entry.record.isApplication) return makeApplicationProxy(entry);
  auto proxy = std::make_shared<ARBundleProxy>();
  proxy->bundleIdentifier = entry.record.identifier;
  return proxy;
}

ARProxyList FakeARWorkspace::proxiesLocked(const std::vector<std::string>& identifiers) const {
  ARProxyList out;
  for (const std::string& id : identifiers) {
    const Entry* e = findLocked(id);
    if (e && e->record.isApplication) out.push_back(makeApplicationProxy(*e));
  }
  return out;
}

}  // namespace appsync
