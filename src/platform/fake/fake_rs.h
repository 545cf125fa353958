// The fake restriction service: a table of setting values.
#pragma once

#include <map>
#include <mutex>
#include <string>
#include <string_view>

#include "runtime/plist/value.h"
#include "platform/rs.h"

namespace appsync {

class StateFields;

// No operation fails; a setting without a value answers RSRestrictedBoolNoData.
class FakeRSProfileConnection final : public RSProfileConnection {
 public:
  void setValue(std::string_view setting, int value) {
    std::lock_guard lock(mutex_);
    values_[std::string(setting)] = value;
  }
  // The setting values as a property list, and back (replacing them; a missing field is
  // empty). loadState throws StateFormatError naming the bad field.
  plist::Dict saveState() const;
  void loadState(const StateFields& state);

  int effectiveBoolValueForSetting(std::string_view setting) override {
    std::lock_guard lock(mutex_);
    auto it = values_.find(setting);
    return it == values_.end() ? RSRestrictedBoolNoData : it->second;
  }

 private:
  mutable std::mutex mutex_;
  std::map<std::string, int, std::less<>> values_;
};

}  // namespace appsync
