// Saved state of the fake home screen: icon state and layout, flags, assertion outcomes and
// requests.
#include "platform/fake/fake_pv.h"
#include "platform/fake/state_fields.h"

namespace appsync {

plist::Dict FakePVHomeScreen::saveState() const {
  std::lock_guard lock(mutex_);
  plist::Dict state;
  if (flattened_) state.set("flattenedIconState", *flattened_);
  if (lastIconState_) state.set("lastIconState", *lastIconState_);
  if (lastFlags_) state.set("lastFlattenedIconStateFlags", *lastFlags_);
  plist::Dict outcomes;
  for (const auto& [bundleID, queue] : outcomes_) {
    if (!queue.empty()) outcomes.set(bundleID, plist::Array(queue.begin(), queue.end()));
  }
  state.set("assertionOutcomes", std::move(outcomes));
  plist::Dict requests;
  for (const auto& [bundleID, count] : assertionRequests_) {
    requests.set(bundleID, plist::Integer::fromUnsigned(count));
  }
  state.set("assertionRequests", std::move(requests));
  return state;
}

void FakePVHomeScreen::loadState(const StateFields& state) {
  std::optional<plist::Bytes> flattened = state.optionalData("flattenedIconState");
  std::optional<plist::Bytes> lastIconState = state.optionalData("lastIconState");
  std::optional<int> lastFlags = state.optionalInt32("lastFlattenedIconStateFlags");
  std::map<std::string, std::deque<std::int32_t>> outcomes;
  if (const std::optional<StateFields> saved = state.optionalChild("assertionOutcomes")) {
    for (const auto& entry : saved->dict()) {
      const std::vector<std::int32_t> codes = saved->int32s(entry.key);
      if (!codes.empty()) outcomes[entry.key].assign(codes.begin(), codes.end());
    }
  }
  std::map<std::string, std::size_t> requests;
  if (const std::optional<StateFields> saved = state.optionalChild("assertionRequests")) {
    for (const auto& entry : saved->dict()) requests[entry.key] = saved->unsignedInteger(entry.key);
  }
  std::lock_guard lock(mutex_);
  flattened_ = std::move(flattened);
  lastIconState_ = std::move(lastIconState);
  lastFlags_ = lastFlags;
  outcomes_ = std::move(outcomes);
  assertionRequests_ = std::move(requests);
}

}  // namespace appsync
