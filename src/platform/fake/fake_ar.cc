// The fake application registry: records, installs and uninstalls, enumeration, progress and
// observer events.
#include "platform/fake/fake_ar.h"

#include <algorithm>
#include <system_error>

#include "runtime/fs/files.h"
#include "runtime/fs/paths.h"
#include "runtime/plist/codec.h"
#include "platform/bundle_keys.h"

namespace appsync {

namespace fs = std::filesystem;

namespace {

constexpr std::string_view kIsInstalled = "applicationIsInstalled:";
constexpr std::string_view kUninstall = "uninstallApplication:withOptions:";
constexpr std::string_view kInstallPlaceholder = "installApplication:withOptions:";
constexpr std::string_view kInstallPackage = "installApplication:withOptions:error:";
constexpr std::string_view kEnumerate = "enumerateBundlesOfType:block:";
constexpr std::string_view kProgress = "installProgressForApplication:withPhase:";
constexpr std::string_view kProxy = "applicationProxyForIdentifier:placeholder:";
constexpr std::string_view kAddObserver = "addObserver:";
constexpr std::string_view kRemoveObserver = "removeObserver:";
constexpr std::string_view kPhaseFinished = "installPhaseFinishedForProgress:";

constexpr std::string_view kContainersBase = "/private/var/containers/Bundle/Application";
constexpr std::string_view kMetadataFileName = "CaravelMetadata.plist";
constexpr std::string_view kDefaultIconFile = "Icon.png";

// Error codes of the registry's domain.
constexpr std::int64_t kErrorBadPackage = 2;
constexpr std::int64_t kErrorIdentifierMismatch = 3;
constexpr std::int64_t kErrorFileOperation = 4;

// The Info.plist dictionary of a bundle directory, or absent with *why set.
std::optional<plist::Dict> readInfoPlist(const std::string& bundle, std::string* why) {
  const std::string path = (fs::path(bundle) / "Info.plist").string();
  ErrorRef readError;
  std::optional<plist::Bytes> bytes = readFile(path, &readError);
  if (!bytes) {
    *why = "cannot read " + path + (readError ? ": " + readError->describe() : std::string());
    return std::nullopt;
  }
  plist::ParseError parseError;
  std::optional<plist::Value> root = plist::parse(*bytes, &parseError);
  if (!root) {
    *why = "cannot parse " + path + ": " + parseError.message;
    return std::nullopt;
  }
  if (!root->dict()) {
    *why = path + " is not a dictionary";
    return std::nullopt;
  }
  return std::move(*root->dict());
}

std::optional<std::string> stringValue(const plist::Dict& dict, std::string_view key) {
  const std::string* s = plist::stringAt(dict, key);
  return s ? std::optional<std::string>(*s) : std::nullopt;
}

// The icon file the bundle's Info.plist names (default "Icon.png"), when it exists.
std::optional<std::string> iconIn(const std::string& bundle, const plist::Dict& info) {
  std::string name =
      stringValue(info, _kBNBundleIconFileKey).value_or(std::string(kDefaultIconFile));
  std::optional<std::string> path = Paths::confined(bundle, name);
  if (path && !fileExists(*path) && fs::path(name).extension().empty()) {
    path = Paths::confined(bundle, name + ".png");
  }
  if (path && fileExists(*path)) return path;
  return std::nullopt;
}

std::uint64_t treeSize(const fs::path& dir) {
  std::uint64_t total = 0;
  std::error_code ec;
  for (fs::recursive_directory_iterator it(dir, ec), end; !ec && it != end; it.increment(ec)) {
    std::error_code sizeError;
    if (it->is_regular_file(sizeError)) {
      std::uintmax_t size = it->file_size(sizeError);
      if (!sizeError) total += size;
    }
  }
  return total;
}

// Writes the store metadata of the install options into the container; false when the options
// carry none. Bytes are written as they are, a dictionary as a binary property list.
bool writeMetadata(const std::string& container, const plist::Dict& options) {
  const plist::Value* metadata = options.find(ARCaravelMetadataKey);
  if (!metadata) return false;
  const std::string path = (fs::path(container) / kMetadataFileName).string();
  if (const plist::Bytes* bytes = metadata->data()) {
    return createDirectories(container) && writeFileAtomically(path, *bytes);
  }
  if (metadata->dict()) {
    return createDirectories(container) &&
           writePlistAtomically(path, *metadata, plist::Format::Binary);
  }
  return false;
}

ErrorRef registryError(std::int64_t code, const std::string& description, const std::string& path) {
  return makeError(kAppRegistryErrorDomain, code, description, path);
}

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

// ---- Records ----------------------------------------------------------------------------------

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

void FakeARWorkspace::setUninstallHook(std::function<void(const std::string&)> hook) {
  std::lock_guard lock(mutex_);
  uninstallHook_ = std::move(hook);
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

// ---- Observers --------------------------------------------------------------------------------

std::vector<std::uint64_t> FakeARWorkspace::registrationsLocked() const {
  std::vector<std::uint64_t> out;
  for (const auto& [registration, observer] : observers_) out.push_back(registration);
  return out;
}

ARApplicationWorkspaceObserverProtocol* FakeARWorkspace::observerFor(
    std::uint64_t registration) const {
  std::lock_guard lock(mutex_);
  for (const auto& [r, observer] : observers_) {
    if (r == registration) return observer;
  }
  return nullptr;
}

void FakeARWorkspace::postEvent(std::vector<std::uint64_t> registrations, ProxyEvent event,
                                ARProxyList proxies) {
  if (registrations.empty()) return;
  callbacks_.post(
      [this, registrations = std::move(registrations), event, proxies = std::move(proxies)] {
        for (std::uint64_t registration : registrations) {
          if (auto* observer = observerFor(registration)) (observer->*event)(proxies);
        }
      });
}

void FakeARWorkspace::postPrioritized(std::vector<std::uint64_t> registrations,
                                      ARProxyList prioritized, ARProxyList paused) {
  if (registrations.empty()) return;
  callbacks_.post([this, registrations = std::move(registrations),
                   prioritized = std::move(prioritized), paused = std::move(paused)] {
    for (std::uint64_t registration : registrations) {
      if (auto* observer = observerFor(registration)) {
        observer->applicationInstallsArePrioritized(prioritized, paused);
      }
    }
  });
}

void FakeARWorkspace::addObserver(ARApplicationWorkspaceObserverProtocol* observer) {
  beginCall(kAddObserver);
  if (!observer) return;
  std::uint64_t registration;
  ARProxyList prioritized, paused;
  {
    std::lock_guard lock(mutex_);
    registration = nextRegistration_++;
    observers_.emplace_back(registration, observer);
    prioritized = proxiesLocked(prioritized_);
    paused = proxiesLocked(paused_);
  }
  postPrioritized({registration}, std::move(prioritized), std::move(paused));
}

void FakeARWorkspace::removeObserver(ARApplicationWorkspaceObserverProtocol* observer) {
  beginCall(kRemoveObserver);
  {
    std::lock_guard lock(mutex_);
    std::erase_if(observers_, [&](const auto& item) { return item.second == observer; });
  }
  // A delivery looks its observer up right before calling it, so once the callback that may
  // have looked it up already has finished, none will follow.
  callbacks_.waitUntilIdle();
}

std::size_t FakeARWorkspace::observerCount() const {
  std::lock_guard lock(mutex_);
  return observers_.size();
}

void FakeARWorkspace::setInstallsInProgress(std::vector<std::string> prioritized,
                                            std::vector<std::string> paused) {
  std::lock_guard lock(mutex_);
  prioritized_ = std::move(prioritized);
  paused_ = std::move(paused);
}

void FakeARWorkspace::notifyInstallsArePrioritized() {
  std::vector<std::uint64_t> registrations;
  ARProxyList prioritized, paused;
  {
    std::lock_guard lock(mutex_);
    registrations = registrationsLocked();
    prioritized = proxiesLocked(prioritized_);
    paused = proxiesLocked(paused_);
  }
  postPrioritized(std::move(registrations), std::move(prioritized), std::move(paused));
}

void FakeARWorkspace::notifyInstallsDidCancel(const std::vector<std::string>& identifiers) {
  std::vector<std::uint64_t> registrations;
  ARProxyList proxies;
  {
    std::lock_guard lock(mutex_);
    registrations = registrationsLocked();
    proxies = proxiesLocked(identifiers);
  }
  postEvent(std::move(registrations),
            &ARApplicationWorkspaceObserverProtocol::applicationInstallsDidCancel,
            std::move(proxies));
}

// ---- Queries ----------------------------------------------------------------------------------

bool FakeARWorkspace::applicationIsInstalled(const std::string& identifier) {
  if (beginCall(kIsInstalled)) return false;
  std::lock_guard lock(mutex_);
  const Entry* e = findLocked(identifier);
  return e && e->record.isApplication && !e->record.isPlaceholder;
}

void FakeARWorkspace::enumerateBundlesOfType(int type, const BundleBlock& block) {
  if (beginCall(kEnumerate)) return;
  std::vector<std::shared_ptr<const ARBundleProxy>> proxies;
  {
    std::lock_guard lock(mutex_);
    for (const Entry& e : entries_) {
      const AppRecord& r = e.record;
      bool wanted = false;
      switch (type) {
        case ARBundleTypeAll:
          wanted = true;
          break;
        case ARBundleTypeApplications:
          wanted = r.isApplication;
          break;
        case ARBundleTypeSystemApplications:
          wanted = r.isApplication && r.applicationType == ARApplicationTypeSystem;
          break;
        default:
          break;
      }
      if (wanted) proxies.push_back(makeProxy(e));
    }
  }
  // The block runs without the lock, so it may call back into the registry.
  bool stop = false;
  for (const auto& proxy : proxies) {
    block(proxy, &stop);
    if (stop) break;
  }
}

std::shared_ptr<ARInstallProgress> FakeARWorkspace::progressLocked(const std::string& identifier,
                                                                   std::uint64_t phase) {
  Entry* e = findLocked(identifier);
  if (!e || !e->record.isApplication) return nullptr;
  std::shared_ptr<ARInstallProgress>& progress = progress_[{identifier, phase}];
  if (!progress) {
    progress = std::make_shared<ARInstallProgress>(identifier);
    progress->setInstallPhase(phase);
  }
  e->currentProgress = progress;
  return progress;
}

std::shared_ptr<ARInstallProgress> FakeARWorkspace::installProgress(const std::string& identifier,
                                                                    std::uint64_t phase) {
  std::lock_guard lock(mutex_);
  return progressLocked(identifier, phase);
}

std::shared_ptr<ARInstallProgress> FakeARWorkspace::installProgressForApplication(
    const ARApplicationProxy& proxy, std::uint64_t phase) {
  if (beginCall(kProgress)) return nullptr;
  std::lock_guard lock(mutex_);
  return progressLocked(proxy.applicationIdentifier, phase);
}

void FakeARWorkspace::installPhaseFinishedForProgress(
    const std::shared_ptr<ARInstallProgress>& progress) {
  beginCall(kPhaseFinished);
  std::lock_guard lock(mutex_);
  finishedPhases_.push_back(progress);
}

std::vector<std::shared_ptr<ARInstallProgress>> FakeARWorkspace::finishedPhases() const {
  std::lock_guard lock(mutex_);
  return finishedPhases_;
}

std::shared_ptr<const ARApplicationProxy> FakeARWorkspace::applicationProxyForIdentifier(
    const std::string& identifier, bool placeholder) {
  if (beginCall(kProxy)) return nullptr;
  std::lock_guard lock(mutex_);
  const Entry* e = findLocked(identifier);
  if (!e || !e->record.isApplication) return nullptr;
  if (e->record.isPlaceholder && !placeholder) return nullptr;
  return makeApplicationProxy(*e);
}

// ---- Uninstall --------------------------------------------------------------------------------

bool FakeARWorkspace::uninstallApplication(const std::string& identifier,
                                           const std::optional<plist::Dict>& options) {
  const bool failed = beginCall(kUninstall) != nullptr;
  bool placeholdersOnly = false;
  if (options) {
    if (const plist::Value* v = options->find(kUninstallPlaceholdersOnlyKey)) {
      placeholdersOnly = v->truthValue().value_or(false);
    }
  }
  std::vector<std::uint64_t> registrations;
  ARProxyList removed;
  std::optional<std::string> container;
  std::function<void(const std::string&)> hook;
  bool succeeded = false;
  {
    std::lock_guard lock(mutex_);
    const Entry* e = findLocked(identifier);
    if (!failed && e && e->record.isApplication && (!placeholdersOnly || e->record.isPlaceholder)) {
      succeeded = true;
      removed.push_back(makeApplicationProxy(*e));
      container = e->record.containerDirectory;
      eraseLocked(identifier);
      registrations = registrationsLocked();
      hook = uninstallHook_;
    }
    uninstallCalls_.push_back({identifier, options, succeeded});
  }
  if (!succeeded) return false;
  // Only containers this registry made are removed; a placeholder's own directory is not ours.
  const std::optional<std::string> ours = containerDirectoryFor(identifier);
  if (container && ours && *container == *ours) removeAll(*container);
  if (hook) hook(identifier);
  postEvent(std::move(registrations),
            &ARApplicationWorkspaceObserverProtocol::applicationsDidUninstall, std::move(removed));
  return true;
}

// ---- Installs ---------------------------------------------------------------------------------

void FakeARWorkspace::recordInstall(const std::string& path, const plist::Dict& options,
                                    bool placeholder, bool succeeded) {
  std::lock_guard lock(mutex_);
  installCalls_.push_back({path, options, placeholder, succeeded});
}

bool FakeARWorkspace::installApplication(const std::string& path, const plist::Dict& options) {
  const bool ok = !beginCall(kInstallPlaceholder) && installPlaceholder(path, options);
  recordInstall(path, options, true, ok);
  return ok;
}

bool FakeARWorkspace::installApplication(const std::string& path, const plist::Dict& options,
                                         ErrorRef* error) {
  ErrorRef scripted = beginCall(kInstallPackage);
  bool ok = false;
  if (scripted) {
    setError(error, scripted);
  } else {
    ok = installPackage(path, options, error);
  }
  recordInstall(path, options, false, ok);
  return ok;
}

bool FakeARWorkspace::installPlaceholder(const std::string& path, const plist::Dict& options) {
  const std::string* packageType = plist::stringAt(options, ARPackageTypeKey);
  if (!packageType || *packageType != ARPackageTypePlaceholder) return false;
  std::string why;
  std::optional<plist::Dict> info = readInfoPlist(path, &why);
  if (!info) return false;
  std::optional<std::string> identifier = stringValue(*info, kBNBundleIdentifierKey);
  if (!identifier || identifier->empty()) return false;
  if (const plist::Value* requested = options.find(kBNBundleIdentifierKey)) {
    if (!requested->string() || *requested->string() != *identifier) return false;
  }
  std::optional<std::string> container = containerDirectoryFor(*identifier);
  if (!container) return false;

  Entry entry;
  {
    std::lock_guard lock(mutex_);
    if (const Entry* existing = findLocked(*identifier)) {
      if (!existing->record.isApplication) return false;
      entry = *existing;
    }
  }
  AppRecord& r = entry.record;
  r.identifier = *identifier;
  r.version = stringValue(*info, kBNBundleVersionKey);
  r.name = stringValue(*info, _kBNBundleDisplayNameKey);
  r.installType = 0;
  if (const plist::Value* type = options.find(ARInstallTypeKey)) {
    r.installType = type->uint64().value_or(0);
  }
  r.isPlaceholder = true;
  r.bundleDirectory = path;
  r.iconPath = iconIn(path, *info);
  r.lastInstallOptions = options;
  if (writeMetadata(*container, options)) r.containerDirectory = container;

  std::vector<std::uint64_t> registrations;
  ARProxyList installed;
  {
    std::lock_guard lock(mutex_);
    installed.push_back(makeApplicationProxy(entry));
    putLocked(std::move(entry));
    registrations = registrationsLocked();
  }
  postEvent(std::move(registrations),
            &ARApplicationWorkspaceObserverProtocol::applicationsDidInstall, std::move(installed));
  return true;
}

bool FakeARWorkspace::installPackage(const std::string& path, const plist::Dict& options,
                                     ErrorRef* error) {
  std::string bundlePath = path;
  while (bundlePath.size() > 1 && bundlePath.back() == '/') bundlePath.pop_back();
  const std::string bundleName = fs::path(bundlePath).filename().string();
  if (!directoryExists(bundlePath) || bundleName.empty()) {
    setError(error, registryError(kErrorBadPackage, "Package is not a bundle directory", path));
    return false;
  }
  std::string why;
  std::optional<plist::Dict> info = readInfoPlist(bundlePath, &why);
  if (!info) {
    setError(error,
             registryError(kErrorBadPackage, "Package has no usable Info.plist: " + why, path));
    return false;
  }
  std::optional<std::string> identifier = stringValue(*info, kBNBundleIdentifierKey);
  const std::string* requested = plist::stringAt(options, kBNBundleIdentifierKey);
  if (!identifier || identifier->empty() || !requested || *requested != *identifier) {
    setError(error, registryError(kErrorIdentifierMismatch,
                                  "Package identifier " + identifier.value_or("(null)") +
                                      " does not match the requested " +
                                      (requested ? *requested : std::string("(null)")),
                                  path));
    return false;
  }
  std::optional<std::string> container = containerDirectoryFor(*identifier);
  if (!container) {
    setError(error,
             registryError(kErrorBadPackage, "Invalid bundle identifier " + *identifier, path));
    return false;
  }

  // Replace whatever bundle the container held; keep its other files.
  ErrorRef fileError;
  if (!createDirectories(*container, &fileError)) {
    setError(error, registryError(kErrorFileOperation, "Cannot create the container", *container));
    return false;
  }
  std::error_code ec;
  for (fs::directory_iterator it(*container, ec), end; !ec && it != end; it.increment(ec)) {
    if (it->path().extension() == ".app") removeAll(it->path().string());
  }
  const std::string installed = (fs::path(*container) / bundleName).string();
  removeAll(installed);
  fs::copy(bundlePath, installed, fs::copy_options::recursive | fs::copy_options::copy_symlinks,
           ec);
  if (ec) {
    removeAll(installed);
    setError(error, registryError(kErrorFileOperation, "Cannot copy the bundle: " + ec.message(),
                                  installed));
    return false;
  }
  writeMetadata(*container, options);

  Entry entry;
  {
    std::lock_guard lock(mutex_);
    if (const Entry* existing = findLocked(*identifier)) entry.record = existing->record;
  }
  AppRecord& r = entry.record;
  r.identifier = *identifier;
  r.isApplication = true;
  r.version = stringValue(*info, kBNBundleVersionKey);
  if (auto name = stringValue(*info, _kBNBundleDisplayNameKey)) r.name = std::move(name);
  if (const plist::Value* type = options.find(ARInstallTypeKey)) {
    r.installType = type->uint64().value_or(r.installType);
  }
  r.isPlaceholder = false;
  r.bundleDirectory = installed;
  r.containerDirectory = container;
  r.iconPath = iconIn(installed, *info);
  r.staticDiskUsage = treeSize(installed);
  r.lastInstallOptions = options;
  // entry.currentProgress stays null: the install is complete.

  std::vector<std::uint64_t> registrations;
  ARProxyList proxies;
  {
    std::lock_guard lock(mutex_);
    std::erase_if(progress_, [&](const auto& item) { return item.first.first == *identifier; });
    proxies.push_back(makeApplicationProxy(entry));
    putLocked(std::move(entry));
    registrations = registrationsLocked();
  }
  postEvent(std::move(registrations),
            &ARApplicationWorkspaceObserverProtocol::applicationsDidInstall, std::move(proxies));
  return true;
}

}  // namespace appsync
