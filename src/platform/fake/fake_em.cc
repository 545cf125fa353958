// The fake low-level installer.
#include "platform/fake/fake_em.h"

#include <algorithm>

namespace appsync {

namespace {
constexpr std::string_view kLookup = "EmplaceLookupUninstalled";
constexpr std::string_view kClear = "EmplaceClearUninstalled";
}  // namespace

FakeEMInstaller::FakeEMInstaller()
    : FakeService("FakeEMInstaller", std::string(kEMInstallerErrorDomain),
                  {{kLookup, true}, {kClear, true}}) {}

void FakeEMInstaller::addUninstalled(const std::string& identifier) {
  std::lock_guard lock(mutex_);
  if (std::find(uninstalled_.begin(), uninstalled_.end(), identifier) == uninstalled_.end()) {
    uninstalled_.push_back(identifier);
  }
}

std::vector<std::string> FakeEMInstaller::uninstalled() const {
  std::lock_guard lock(mutex_);
  return uninstalled_;
}

std::vector<std::vector<std::string>> FakeEMInstaller::clearCalls() const {
  std::lock_guard lock(mutex_);
  return clearCalls_;
}

std::unique_ptr<plist::Dict> FakeEMInstaller::EmplaceLookupUninstalled(const plist::Dict*) {
  if (beginCall(kLookup)) return nullptr;
  std::lock_guard lock(mutex_);
  auto out = std::make_unique<plist::Dict>();
  for (const std::string& id : uninstalled_) out->set(id, plist::Dict());
  return out;
}

int FakeEMInstaller::EmplaceClearUninstalled(const std::vector<std::string>& identifiers,
                                             const plist::Dict*) {
  ErrorRef failure = beginCall(kClear);
  std::lock_guard lock(mutex_);
  clearCalls_.push_back(identifiers);
  if (failure) return static_cast<int>(statusFor(failure));
  std::erase_if(uninstalled_, [&](const std::string& id) {
    return std::find(identifiers.begin(), identifiers.end(), id) != identifiers.end();
  });
  return 0;
}

}  // namespace appsync
