// A device description read whole before anything is made (so bad input leaves no half-built
// device), then put into the fakes: each application as the registry records a package install
// into its container, and the files the host computer and the backup service left behind.
#include "device_description.h"

#include <cstdint>
#include <map>
#include <optional>
#include <set>
#include <stdexcept>
#include <string>
#include <vector>

#include "bundle_maker.h"
#include "device_files.h"
#include "platform/ar.h"
#include "platform/fake/fake_ar_bundle_files.h"
#include "platform/rs.h"
#include "runtime/fs/paths.h"

namespace appsync::host {

namespace fs = std::filesystem;

namespace {

constexpr std::string_view kHostDaemonBundleIdentifier = "com.vantor.trc";
constexpr std::string_view kStoreMetadataFileName = "CaravelMetadata.plist";

// The device `device init` makes without --from; docs/device-description.md shows it too.
constexpr std::string_view kDefaultDescription = R"(road: legacy
insideHostDaemon: false
apps:
  - identifier: com.example.notes
    name: Notes
    version: "2.1"
    installType: storeDownload
    storeMetadata:
      com.vantor.CaravelStore.downloadInfo:
        accountInfo: {VantorID: reader@example.com, PRPersonID: 1001}
  - identifier: com.example.maps
    name: Maps
    version: "1.4"
  - identifier: com.example.clock
    name: Clock
    version: "1.0"
    type: system
iconOrder: [com.example.clock, com.example.maps, com.example.notes]
)";

struct AppDescription {
  std::string identifier;
  std::string name;
  std::string version;
  bool system = false;
  bool placeholder = false;
  std::optional<std::uint64_t> diskUsage;
  bool hasMIDBasedSINF = false;
  std::uint64_t installType = ARInstallTypeNone;
  std::optional<plist::Value> storeMetadata;
  std::optional<std::uint64_t> restoreData;
};

struct DeviceDescription {
  FakePlatform::Options options;
  std::vector<AppDescription> apps;
  std::vector<std::pair<std::string, int>> restrictions;
  std::optional<std::vector<std::string>> iconOrder;
  std::optional<plist::Value> demotedApps;
  std::optional<plist::Value> lastSync;
  std::vector<std::string> uninstalled;
};

// A name that becomes one directory of its own (a container, NAME.app): no separators, no
// "." or "..", no control characters.
void requireDirectoryName(const YamlField& field, const std::string& name) {
  if (name.empty()) field.fail("must not be empty");
  bool control = false;
  for (unsigned char c : name) control = control || c < 0x20 || c == 0x7f;
  if (name == "." || name == ".." || control || name.find_first_of("/\\") != std::string::npos ||
      !Paths::confined("/base", name)) {
    field.fail("\"" + name +
               "\" cannot name a directory of its own (no /, \\, . or .., "
               "or control characters)");
  }
}

std::string choice(const YamlField& field, std::initializer_list<std::string_view> allowed) {
  const std::string text = field.string();
  std::string list;
  for (std::string_view option : allowed) {
    if (text == option) return text;
    list += (list.empty() ? "" : " or ") + std::string(option);
  }
  field.fail("expected " + list + ", found \"" + text + "\"");
}

std::uint64_t installType(const YamlField& field) {
  static const std::map<std::string, std::uint64_t, std::less<>> kNames = {
      {"none", ARInstallTypeNone},           {"storeDownload", ARInstallTypeStoreDownload},
      {"restore", ARInstallTypeRestore},     {"automaticDownload", ARInstallTypeAutomaticDownload},
      {"sync", ARInstallTypeSync},           {"automaticUpdate", ARInstallTypeAutomaticUpdate},
      {"migration", ARInstallTypeMigration}, {"downgrade", ARInstallTypeDowngrade}};
  const std::string text = field.string();
  if (auto it = kNames.find(text); it != kNames.end()) return it->second;
  if (!text.empty() && text.find_first_not_of("0123456789") == std::string::npos) {
    return field.unsignedInteger();
  }
  std::string names;
  for (const auto& [name, value] : kNames) names += (names.empty() ? "" : ", ") + name;
  field.fail("expected a number or one of " + names + ", found \"" + text + "\"");
}

AppDescription readApp(const YamlField& field) {
  field.allowOnly({"identifier", "name", "version", "type", "placeholder", "diskUsage",
                   "hasMIDBasedSINF", "installType", "storeMetadata", "restoreData"});
  AppDescription app;
  const YamlField identifier = field["identifier"];
  app.identifier = identifier.string();
  requireDirectoryName(identifier, app.identifier);
  if (auto name = field.optional("name")) {
    app.name = name->string();
    requireDirectoryName(*name, app.name);
  } else {
    // The last part of the identifier ("com.example.notes" -> "notes"), already a safe name.
    const auto dot = app.identifier.find_last_of('.');
    app.name = dot == std::string::npos || dot + 1 == app.identifier.size()
                   ? app.identifier
                   : app.identifier.substr(dot + 1);
  }
  if (auto version = field.optional("version"))
    app.version = version->string();
  else
    app.version = "1.0";
  if (auto type = field.optional("type"))
    app.system = choice(*type, {"user", "system"}) == "system";
  if (auto placeholder = field.optional("placeholder")) app.placeholder = placeholder->boolean();
  if (auto disk = field.optional("diskUsage")) app.diskUsage = disk->unsignedInteger();
  if (auto sinf = field.optional("hasMIDBasedSINF")) app.hasMIDBasedSINF = sinf->boolean();
  if (auto type = field.optional("installType")) app.installType = installType(*type);
  if (auto metadata = field.optional("storeMetadata")) app.storeMetadata = metadata->plist();
  if (auto restore = field.optional("restoreData")) app.restoreData = restore->unsignedInteger();
  return app;
}

DeviceDescription readDescription(const YamlField& field) {
  if (!field.isMap()) field.fail("a device description is a mapping (road:, apps:, ...)");
  field.allowOnly({"road", "insideHostDaemon", "apps", "restrictions", "iconOrder", "demotedApps",
                   "lastSync", "uninstalled"});
  DeviceDescription description;
  FakePlatform::Options& options = description.options;
  if (auto road = field.optional("road")) {
    options.coordination = choice(*road, {"coordination", "legacy"}) == "coordination";
  }
  if (auto inside = field.optional("insideHostDaemon"); inside && inside->boolean()) {
    options.mainBundleIdentifier = std::string(kHostDaemonBundleIdentifier);
  }
  std::set<std::string> seen;
  if (auto apps = field.optional("apps")) {
    for (const YamlField& item : apps->items()) {
      AppDescription app = readApp(item);
      if (!seen.insert(app.identifier).second) {
        item["identifier"].fail("\"" + app.identifier + "\" is described twice");
      }
      description.apps.push_back(std::move(app));
    }
  }
  if (auto restrictions = field.optional("restrictions")) {
    restrictions->allowOnly(
        {std::string(RSFeatureAppInstallationAllowed), std::string(RSFeatureAppRemovalAllowed)});
    for (const auto& [setting, value] : restrictions->entries()) {
      description.restrictions.emplace_back(
          setting, value.boolean() ? RSRestrictedBoolExplicitYes : RSRestrictedBoolExplicitNo);
    }
  }
  if (auto order = field.optional("iconOrder")) description.iconOrder = order->strings();
  if (auto demoted = field.optional("demotedApps")) description.demotedApps = demoted->plist();
  if (auto lastSync = field.optional("lastSync")) description.lastSync = lastSync->plist();
  if (auto uninstalled = field.optional("uninstalled")) {
    description.uninstalled = uninstalled->strings();
  }
  return description;
}

YamlField defaultDescription() {
  return YamlField::loadText(kDefaultDescription, "(default device)");
}

DeviceDescription read(const YamlField* description) {
  return readDescription(description ? *description : defaultDescription());
}

// The application as the registry records a package install (or, for a placeholder, a
// placeholder install) of its bundle: the bundle in the application's container, the store
// metadata beside it.
void putApp(DeviceSession& session, const AppDescription& app) {
  FakeARWorkspace& registry = session.device().ar();
  const std::optional<std::string> container = registry.containerDirectoryFor(app.identifier);
  if (!container) throw std::runtime_error("no container for " + app.identifier);
  const fs::path bundle =
      makeBundle(session.root(), *container,
                 {.identifier = app.identifier, .name = app.name, .version = app.version});
  if (app.storeMetadata) {
    writeDevicePlist(session.root(), fs::path(*container) / kStoreMetadataFileName,
                     *app.storeMetadata);
  }
  std::string why;
  const std::optional<plist::Dict> info = fake_ar::readInfoPlist(bundle.string(), &why);
  if (!info) throw std::runtime_error(why);

  FakeARWorkspace::AppRecord record;
  record.identifier = app.identifier;
  record.applicationType = app.system ? "System" : "User";
  record.version = app.version;
  record.name = app.name;
  record.installType = app.installType;
  record.isPlaceholder = app.placeholder;
  record.bundleDirectory = bundle.string();
  // A placeholder has a container only when its install brought store metadata.
  if (!app.placeholder || app.storeMetadata) record.containerDirectory = container;
  record.iconPath = fake_ar::iconIn(bundle.string(), *info);
  record.staticDiskUsage = app.diskUsage;
  if (!app.placeholder && !app.diskUsage) record.staticDiskUsage = fake_ar::treeSize(bundle);
  record.hasMIDBasedSINF = app.hasMIDBasedSINF;
  registry.putApplication(std::move(record));
  if (app.restoreData) session.device().sw().setRestoreData(app.identifier, *app.restoreData);
}

}  // namespace

FakePlatform::Options deviceOptions(const YamlField* description) {
  return read(description).options;
}

void applyDescription(DeviceSession& session, const YamlField* description) {
  const DeviceDescription device = read(description);
  for (const AppDescription& app : device.apps) putApp(session, app);
  for (const auto& [setting, value] : device.restrictions) {
    session.device().rs().setValue(setting, value);
  }
  if (device.iconOrder) session.device().pv().setIconOrder(*device.iconOrder);
  if (device.demotedApps) {
    writeDevicePlist(session.root(), session.paths().demotedApps(), *device.demotedApps);
  }
  if (device.lastSync) {
    writeDevicePlist(session.root(), session.paths().lastSyncAppState(), *device.lastSync);
  }
  for (const std::string& identifier : device.uninstalled) {
    session.device().em().addUninstalled(identifier);
  }
}

}  // namespace appsync::host
