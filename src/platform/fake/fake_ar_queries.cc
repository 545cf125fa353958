// The fake application registry's queries: whether an application is installed, enumeration
// by bundle kind, and proxies by identifier.
#include "platform/fake/fake_ar.h"

namespace appsync {

bool FakeARWorkspace::applicationIsInstalled(const std::string& identifier) {
  if (beginCall(kIsInstalled)) return false;
  std::lock_guard lock(mutex_);
  const Entry* e = findLocked(identifier);
  return e && e->record.isApplication;
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

std::shared_ptr<const ARApplicationProxy> FakeARWorkspace::applicationProxyForIdentifier(
    const std::string& identifier, bool placeholder) {
  if (beginCall(kProxy)) return nullptr;
  std::lock_guard lock(mutex_);
  const Entry* e = findLocked(identifier);
  if (!e || !e->record.isApplication) return nullptr;
  if (e->record.isPlaceholder && !placeholder) return nullptr;
  return makeApplicationProxy(*e);
}

}  // namespace appsync
