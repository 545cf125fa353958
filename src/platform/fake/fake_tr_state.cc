// Saved state of the fake host device service: prioritised and cancelled identifiers, and which
// operations the host offers.
#include "platform/fake/fake_tr.h"
#include "platform/fake/state_fields.h"

namespace appsync {

plist::Dict FakeTRDeviceService::saveState() const {
  std::lock_guard lock(mutex_);
  return {{"prioritizedIdentifiers", stringsState(prioritized_)},
          {"cancelledIdentifiers", stringsState(cancelled_)},
          {"respondsToPrioritizeAsset", respondsToPrioritize_},
          {"respondsToCancelAssetTransfer", respondsToCancel_}};
}

void FakeTRDeviceService::loadState(const StateFields& state) {
  std::vector<std::string> prioritized = state.strings("prioritizedIdentifiers");
  std::vector<std::string> cancelled = state.strings("cancelledIdentifiers");
  const bool respondsToPrioritize = state.boolean("respondsToPrioritizeAsset", true);
  const bool respondsToCancel = state.boolean("respondsToCancelAssetTransfer", true);
  std::lock_guard lock(mutex_);
  prioritized_ = std::move(prioritized);
  cancelled_ = std::move(cancelled);
  respondsToPrioritize_ = respondsToPrioritize;
  respondsToCancel_ = respondsToCancel;
}

}  // namespace appsync
