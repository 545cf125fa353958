// Saved state of the fake backup service: restore data per application and cancelled restores.
#include "platform/fake/fake_sw.h"
#include "platform/fake/state_fields.h"

namespace appsync {

plist::Dict FakeSWBackupService::saveState() const {
  std::lock_guard lock(mutex_);
  plist::Dict sizes;
  for (const auto& [bundleID, size] : restoreData_) {
    sizes.set(bundleID, plist::Integer::fromUnsigned(size));
  }
  return {{"restoreData", std::move(sizes)}, {"cancelledRestores", stringsState(cancelled_)}};
}

void FakeSWBackupService::loadState(const StateFields& state) {
  std::map<std::string, std::uint64_t> restoreData;
  if (const std::optional<StateFields> sizes = state.optionalChild("restoreData")) {
    for (const auto& entry : sizes->dict()) {
      restoreData[entry.key] = sizes->unsignedInteger(entry.key);
    }
  }
  std::vector<std::string> cancelled = state.strings("cancelledRestores");
  std::lock_guard lock(mutex_);
  restoreData_ = std::move(restoreData);
  cancelled_ = std::move(cancelled);
}

}  // namespace appsync
