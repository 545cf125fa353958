// What both placeholder roads share: attributes, the Info.plist and the directory report.
#include "restore/placeholder_info.h"

#include <cerrno>

#include "platform/bundle_keys.h"
#include "runtime/log/log.h"
#include "runtime/plist/codec.h"

namespace appsync {

FileAttributes mobileFileAttributes() { return FileAttributes{"mobile", "mobile"}; }

std::string placeholderFile(const std::string& directory, std::string_view name) {
  std::string path = directory;
  path += '/';
  path += name;
  return path;
}

plist::Dict placeholderInfoPlist(const std::string& identifier, const plist::Value& version,
                                 const plist::Value& name, const plist::Value& gazette,
                                 bool launchProhibited) {
  plist::Dict info;
  info.set(std::string(kBNBundleIdentifierKey), identifier);
  info.set(std::string(kBNBundleVersionKey), version);
  info.set(std::string(kBNBundleExecutableKey), name);
  info.set(std::string(_kBNBundleDisplayNameKey), name);
  info.set(std::string(_kBNBundleIconFileKey), kPlaceholderIconFileName);
  info.set(std::string(kGazetteAppKey), gazette);
  info.set(std::string(kLaunchProhibitedKey), launchProhibited);
  return info;
}

std::string logText(const plist::Value& value) {
  if (const std::string* s = value.string()) return *s;
  return value.describe();
}

void applyFileAttributes(const Platform& platform, const std::string& path,
                         const FileAttributes& attributes) {
  if (!attributes.ownerAccountName || !attributes.groupOwnerAccountName) return;
  platform.system.setOwnerAndGroup(path, *attributes.ownerAccountName,
                                   *attributes.groupOwnerAccountName, nullptr);
}

void reportPlaceholderDirectory(const Platform& platform, const std::string& bundleID,
                                const std::optional<std::string>& path, bool created,
                                const ErrorRef& error) {
  if (!created || error) {
    platform.transactionLog.logScenario(std::string(kCaravelAppRestoreScenario), 0, false, bundleID,
                                        "Failed to create app directory");
  }
  pluginLog(platform.tr.TRGetLogCategory(kAppSyncLogCategory), LogLevel::Default,
            "%s|Created app directory for '%{public}@' at %{public}@ with err=%{public}@", bundleID,
            path, error);
}

void reportUnusablePlaceholderPath(const Platform& platform, const std::string& bundleID) {
  reportPlaceholderDirectory(
      platform, bundleID, std::nullopt, false,
      makeError(kPOSIXErrorDomain, EINVAL,
                "Bundle identifier would leave the placeholder directory", bundleID));
}

std::optional<plist::Dict> parseStoreMetadata(const plist::Bytes& bytes, ErrorRef* error) {
  plist::ParseError parseError;
  std::optional<plist::Value> root = plist::parse(bytes, &parseError);
  if (root && root->dict()) return std::move(*root->dict());
  if (root) {
    parseError.message =
        std::string("the root is ") + plist::typeName(root->type()) + ", not a dictionary";
  }
  setError(error, makeError(kPropertyListErrorDomain, 1, parseError.message));
  return std::nullopt;
}

}  // namespace appsync
