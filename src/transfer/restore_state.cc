// The client's access to the restore state store.
#include "client/apps_client.h"

namespace appsync {

std::optional<plist::Value> AppsClient::_restoreStatePropertyForKey(
    const std::string& key, const std::string& identifier,
    const std::optional<std::string>& version) {
  return restoreStateStore_.property(key, identifier, version);
}

void AppsClient::_setRestoreStatePropertyValue(const plist::Value& value,
                                               const std::string& forKey,
                                               const std::string& identifier,
                                               const std::optional<std::string>& version) {
  restoreStateStore_.setProperty(value, forKey, identifier, version);
}

void AppsClient::cleanRestoreStateForIdentifier(const std::string& identifier) {
  restoreStateStore_.clean(identifier);
}

}  // namespace appsync
