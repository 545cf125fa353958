// The fake application registry's installs and uninstalls: placeholder and package installs
// into containers under the device root, removal, the calls made, and the events they cause.
#include <system_error>
#include <utility>

#include "platform/bundle_keys.h"
#include "platform/fake/fake_ar.h"
#include "platform/fake/fake_ar_bundle_files.h"
#include "platform/fake/fake_ar_package_archive.h"
#include "runtime/fs/files.h"

namespace appsync {

namespace fs = std::filesystem;
using fake_ar::iconIn, fake_ar::readInfoPlist, fake_ar::stringValue, fake_ar::treeSize,
    fake_ar::writeMetadata;

namespace {

// Error codes of the registry's domain.
constexpr std::int64_t kErrorBadPackage = 2;
constexpr std::int64_t kErrorIdentifierMismatch = 3;
constexpr std::int64_t kErrorFileOperation = 4;

// Where a zip package is unpacked, inside the application's container, for the install only.
constexpr std::string_view kUnpackFolderName = ".package-unpack";

ErrorRef registryError(std::int64_t code, const std::string& description, const std::string& path) {
  return makeError(kAppRegistryErrorDomain, code, description, path);
}

}  // namespace

bool FakeARWorkspace::uninstallApplication(const std::string& identifier,
                                           const std::optional<plist::Dict>& options) {
  const bool failed = beginCall(kUninstall) != nullptr;
  bool placeholdersOnly = false;
  if (options) {
    if (const plist::Value* v = options->find(ARUninstallPlaceholdersOnlyKey)) {
      placeholdersOnly = v->truthValue().value_or(false);
    }
  }
  std::vector<std::uint64_t> registrations;
  ARProxyList removed;
  std::optional<AppRecord> removedRecord;
  UninstallHook hook;
  bool succeeded = false;
  {
    std::lock_guard lock(mutex_);
    const Entry* e = findLocked(identifier);
    if (!failed && e && e->record.isApplication && (!placeholdersOnly || e->record.isPlaceholder)) {
      succeeded = true;
      removed.push_back(makeApplicationProxy(*e));
      removedRecord = e->record;
      eraseLocked(identifier);
      registrations = registrationsLocked();
      hook = uninstallHook_;
    }
    uninstallCalls_.push_back({identifier, options, succeeded});
  }
  if (!succeeded) return false;
  // Only containers this registry made are removed; a placeholder's own directory is not ours.
  const std::optional<std::string>& container = removedRecord->containerDirectory;
  const std::optional<std::string> ours = containerDirectoryFor(identifier);
  if (container && ours && *container == *ours) removeAll(*container);
  if (hook) hook(*removedRecord);
  postEvent(std::move(registrations),
            &ARApplicationWorkspaceObserverProtocol::applicationsDidUninstall, std::move(removed));
  return true;
}

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

  recordInstalled(std::move(entry), false);
  return true;
}

bool FakeARWorkspace::installPackage(const std::string& path, const plist::Dict& options,
                                     ErrorRef* error) {
  if (fake_ar::isPackageArchive(path)) return installArchive(path, options, error);
  return installBundle(path, path, options, error);
}

bool FakeARWorkspace::installArchive(const std::string& path, const plist::Dict& options,
                                     ErrorRef* error) {
  const std::string* requested = plist::stringAt(options, kBNBundleIdentifierKey);
  if (!requested) {
    setError(error, registryError(kErrorIdentifierMismatch,
                                  "The install options name no bundle identifier", path));
    return false;
  }
  std::optional<std::string> container = containerDirectoryFor(*requested);
  if (!container) {
    setError(error,
             registryError(kErrorBadPackage, "Invalid bundle identifier " + *requested, path));
    return false;
  }
  const bool hadContainer = directoryExists(*container);
  const std::string scratch = (fs::path(*container) / kUnpackFolderName).string();
  removeAll(scratch);  // what an interrupted install left
  fake_ar::ArchiveLimits limits;
  {
    std::lock_guard lock(mutex_);
    limits = archiveLimits_;
  }
  std::string why;
  std::optional<std::string> bundle = fake_ar::unpackPackageArchive(path, scratch, limits, &why);
  bool ok = false;
  if (!bundle) {
    setError(error, registryError(kErrorBadPackage, "Package archive refused: " + why, path));
  } else {
    ok = installBundle(*bundle, path, options, error);
  }
  removeAll(scratch);
  if (!ok && !hadContainer) removeAll(*container);
  return ok;
}

bool FakeARWorkspace::installBundle(const std::string& bundle, const std::string& path,
                                    const plist::Dict& options, ErrorRef* error) {
  std::string bundlePath = bundle;
  while (bundlePath.size() > 1 && bundlePath.back() == '/') bundlePath.pop_back();
  const std::string bundleName = fs::path(bundlePath).filename().string();
  if (!directoryExists(bundlePath) || bundleName.empty()) {
    setError(error, registryError(kErrorBadPackage,
                                  "Package is neither a bundle folder nor a zip archive", path));
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
  // Options without SINF bytes keep what the record had (an update, or the placeholder's).
  if (const plist::Value* sinf = options.find(ARApplicationSINFKey); sinf && sinf->data()) {
    r.hasMIDBasedSINF = !sinf->data()->empty();
  }
  r.lastInstallOptions = options;
  // entry.currentProgress stays null: the install is complete.

  recordInstalled(std::move(entry), true);
  return true;
}

void FakeARWorkspace::recordInstalled(Entry entry, bool dropProgress) {
  std::vector<std::uint64_t> registrations;
  ARProxyList proxies;
  {
    std::lock_guard lock(mutex_);
    if (dropProgress) {
      const std::string& id = entry.record.identifier;
      std::erase_if(progress_, [&](const auto& item) { return item.first.first == id; });
    }
    proxies.push_back(makeApplicationProxy(entry));
    putLocked(std::move(entry));
    registrations = registrationsLocked();
  }
  postEvent(std::move(registrations),
            &ARApplicationWorkspaceObserverProtocol::applicationsDidInstall, std::move(proxies));
}

}  // namespace appsync
