// The fake restriction service: a table of setting values.
#pragma once

#include <map>
#include <mutex>
#include <string>
#include <string_view>

#include "platform/rs.h"

namespace appsync {

// No operation fails; a setting without a value answers RSRestrictedBoolNoData.
class FakeRSProfileConnection final : public RSProfileConnection {
 public:
  void setValue(std::string_view setting, int value) {
    std::lock_guard lock(mutex_);
    values_[std::string(setting)] = value;
  }
  int effectiveBoolValueForSetting(std::string_view setting) override {
    std::lock_guard lock(mutex_);
    auto it = values_.find(setting);
    return it == values_.end() ? RSRestrictedBoolNoData : it->second;
  }

 private:
  std::mutex mutex_;
  std::map<std::string, int, std::less<>> values_;
};

}  // namespace appsync
