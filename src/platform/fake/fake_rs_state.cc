// Saved state of the fake restriction service: the setting values.
#include "platform/fake/fake_rs.h"
#include "platform/fake/state_fields.h"

namespace appsync {

plist::Dict FakeRSProfileConnection::saveState() const {
  std::lock_guard lock(mutex_);
  plist::Dict values;
  for (const auto& [setting, value] : values_) values.set(setting, value);
  return {{"values", std::move(values)}};
}

void FakeRSProfileConnection::loadState(const StateFields& state) {
  std::map<std::string, int, std::less<>> values;
  if (const std::optional<StateFields> saved = state.optionalChild("values")) {
    for (const auto& entry : saved->dict()) values[entry.key] = saved->int32(entry.key);
  }
  std::lock_guard lock(mutex_);
  values_ = std::move(values);
}

}  // namespace appsync
