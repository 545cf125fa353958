// Saved state of the fake low-level installer: the uninstalled list and the calls that cleared it.
#include "platform/fake/fake_em.h"
#include "platform/fake/state_fields.h"

namespace appsync {

plist::Dict FakeEMInstaller::saveState() const {
  std::lock_guard lock(mutex_);
  plist::Array clears;
  for (const auto& identifiers : clearCalls_) {
    clears.emplace_back(plist::Dict{{"identifiers", stringsState(identifiers)}});
  }
  return {{"uninstalled", stringsState(uninstalled_)}, {"clearCalls", std::move(clears)}};
}

void FakeEMInstaller::loadState(const StateFields& state) {
  std::vector<std::string> uninstalled = state.strings("uninstalled");
  std::vector<std::vector<std::string>> clearCalls;
  for (const StateFields& call : state.records("clearCalls")) {
    clearCalls.push_back(call.strings("identifiers"));
  }
  std::lock_guard lock(mutex_);
  uninstalled_ = std::move(uninstalled);
  clearCalls_ = std::move(clearCalls);
}

}  // namespace appsync
